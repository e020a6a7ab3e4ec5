// A sound file that is being written, with an eye on the system: libsndfile tells nothing of what fails while
// it finishes a file, and some encoders write everything only then.
#ifndef BRENIX_PLUGINS_SOUND_FILE_HPP
#define BRENIX_PLUGINS_SOUND_FILE_HPP

#include <sndfile.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <memory>
#include <string>
#include <system_error>

namespace brenix
{

/// Every function of libsndfile may be used on get(), but for sf_close(). Nothing is kept back in memory but
/// what the encoder has. Throws only when memory runs out.
class SoundFile
{
public:
    /// Takes over what fopen() returned for writing ("wb"), also null, and begins a sound file of this format
    /// in it. error() tells whether that failed.
    SoundFile(std::FILE* opened, SF_INFO& format) : file(opened)
    {
        if (!file) {
            note(false);
            return;
        }
        std::setvbuf(file.get(), nullptr, _IONBF, 0);
        if (std::fseek(file.get(), 0, SEEK_SET) == 0) {
            SF_VIRTUAL_IO functions{length, seek, read, write, tell};
            sound.reset(sf_open_virtual(&functions, SFM_WRITE, &format, this));
        } else { // a pipe, for which libsndfile has formats of its own
            sound.reset(sf_open_fd(::fileno(file.get()), SFM_WRITE, &format, SF_FALSE));
        }
    }
    SoundFile(const SoundFile&) = delete;
    SoundFile& operator=(const SoundFile&) = delete;
    ~SoundFile() = default;

    /// The file for libsndfile; null when it did not open or was closed.
    SNDFILE* get() const { return sound.get(); }

    /// Why the file is not what was written: the first failure of the system or else the last one of
    /// libsndfile. Empty when nothing failed.
    std::string error() const { return reason(sf_error(sound.get())); }

    /// Finishes the file, once. Returns the error as above.
    std::string close()
    {
        const int failed = sf_close(sound.release());
        note(std::fclose(file.release()) == 0);
        return reason(failed);
    }

private:
    struct Close {
        void operator()(std::FILE* open) const noexcept { std::fclose(open); }
        void operator()(SNDFILE* open) const noexcept { sf_close(open); }
    };

    std::string reason(int failed) const
    {
        if (systemError != 0) {
            return std::generic_category().message(systemError);
        }
        return failed == SF_ERR_NO_ERROR ? "" : sf_error_number(failed);
    }

    /// Remembers the first failure.
    void note(bool succeeded) noexcept
    {
        if (!succeeded && systemError == 0) {
            systemError = errno;
        }
    }

    static SoundFile& of(void* soundFile) { return *static_cast<SoundFile*>(soundFile); }

    static sf_count_t length(void* soundFile)
    {
        struct stat status {
        };
        const bool known = ::fstat(::fileno(of(soundFile).file.get()), &status) == 0;
        of(soundFile).note(known);
        return known ? status.st_size : -1;
    }

    static sf_count_t seek(sf_count_t offset, int whence, void* soundFile)
    {
        of(soundFile).note(std::fseek(of(soundFile).file.get(), offset, whence) == 0);
        return tell(soundFile);
    }

    /// Nothing: the file is open for writing.
    static sf_count_t read(void* /*data*/, sf_count_t /*size*/, void* /*soundFile*/) { return 0; }

    static sf_count_t write(const void* data, sf_count_t size, void* soundFile)
    {
        const auto whole = static_cast<std::size_t>(size);
        const std::size_t written = std::fwrite(data, 1, whole, of(soundFile).file.get());
        of(soundFile).note(written == whole);
        return static_cast<sf_count_t>(written);
    }

    static sf_count_t tell(void* soundFile) { return std::ftell(of(soundFile).file.get()); }

    std::unique_ptr<std::FILE, Close> file; // outlives what libsndfile writes at its end
    std::unique_ptr<SNDFILE, Close> sound;
    int systemError = 0;
};

} // namespace brenix

#endif
