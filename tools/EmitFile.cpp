// What the C programs of read and write have in common: a file, and an end.

#include "EmitC.hpp"

#include <cmath>

namespace brenix
{

namespace
{

constexpr std::string_view clockFunction = R"(
static double now(void)
{
    struct timespec time;
    clock_gettime(CLOCK_MONOTONIC, &time);
    return (double)time.tv_sec + 1e-9 * (double)time.tv_nsec;
}
)";

constexpr std::string_view soundDisk = R"(
/* The file under the sound file: libsndfile does not tell of a write that fails while it closes a file. */
static FILE* disk;

static sf_count_t diskTell(void* user)
{
    (void)user;
    return ftello(disk);
}

static sf_count_t diskSeek(sf_count_t offset, int whence, void* user)
{
    return fseeko(disk, offset, whence) == 0 ? diskTell(user) : -1;
}

static sf_count_t diskLength(void* user)
{
    const sf_count_t position = diskTell(user);
    const sf_count_t end = diskSeek(0, SEEK_END, user);
    (void)diskSeek(position, SEEK_SET, user);
    return end;
}

static sf_count_t diskRead(void* data, sf_count_t size, void* user)
{
    (void)user;
    return (sf_count_t)fread(data, 1, (size_t)size, disk);
}

static sf_count_t diskWrite(const void* data, sf_count_t size, void* user)
{
    (void)user;
    return (sf_count_t)fwrite(data, 1, (size_t)size, disk);
}

static SNDFILE* createSound(void)
{
    SF_VIRTUAL_IO calls = {diskLength, diskSeek, diskRead, diskWrite, diskTell};
    disk = fopen(name, "wb");
    if (disk != NULL && fseeko(disk, 0, SEEK_SET) != 0) { /* a pipe */
        (void)fclose(disk);
        disk = NULL;
        errno = ESPIPE;
    }
    return disk == NULL ? NULL : sf_open_virtual(&calls, SFM_WRITE, &info, NULL);
}

static int closeSound(SNDFILE* file)
{
    const int failed = sf_close(file) != 0 || ferror(disk) != 0;
    return fclose(disk) != 0 || failed;
}
)";

constexpr std::string_view fileMain = R"(
int main(int argc, char** argv)
{
    @FILE@* file;
    void* channel;
    int ok;
    name = argc > 1 ? argv[1] : @NAME@;
    file = @OPENFILE@;
    if (file == NULL) {
        fprintf(stderr, "%s: %s\n", name, @WHY@);
        return EXIT_FAILURE;
    }
@OPENED@    channel = createChannel(@DEVICE@, @CONVERTER@, @INLIMIT@, @OUTLIMIT@);
    ok = channel != NULL && setUp(channel) && transfer(channel, file);
    ok = finishChannel(channel) && ok;
    if (@FAILED@) {
        fprintf(stderr, "%s: cannot be @VERB@\n", name);
        ok = 0;
    }
    if (@CLOSE@(file) != 0) {
        fprintf(stderr, "%s: cannot be closed\n", name);
        ok = 0;
    }
@CLOSED@    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
)";

} // namespace

void addFile(const Settings& settings, bool writes, const std::string& info, Values& values)
{
    const bool isSound = findSoundFormat(settings.file.format) != nullptr;
    values["USAGE"] = std::string(" * usage: program [FILE], ") +
                      (writes ? "to which it writes samples\n" : "from which it takes samples\n") +
                      (writes && isSound ? " * The file is not a pipe.\n" : "");
    values["VERB"] = writes ? "written" : "read";
    values["INCLUDE"] = "#include <errno.h>\n#include <unistd.h>\n";
    values["WHY"] = "strerror(errno)";
    if (!isSound) {
        values["FILE"] = "FILE";
        values["OPENFILE"] = std::string(R"(strcmp(name, "-") == 0 ? )") +
                             (writes ? R"(fdopen(dup(STDOUT_FILENO), "wb") : fopen(name, "wb"))"
                                     : R"(fdopen(dup(STDIN_FILENO), "rb") : fopen(name, "rb"))");
        values["FAILED"] = "ferror(file) != 0";
        values["CLOSE"] = "fclose";
        return;
    }
    values["INCLUDE"] += "\n#include <sndfile.h>\n";
    values["LIBRARIES"] += " -lsndfile -lm";
    values["FILE"] = "SNDFILE";
    values["INFO"] = "static SF_INFO info = {" + info + "}; /* of the file */\n";
    if (writes) {
        values["DISK"] = soundDisk;
        values["OPENFILE"] = "createSound()";
        values["WHY"] = "disk == NULL ? strerror(errno) : sf_strerror(NULL)";
        values["FAILED"] = "sf_error(file) != 0 || ferror(disk) != 0";
        values["CLOSE"] = "closeSound";
    } else {
        values["OPENFILE"] = "sf_open(name, SFM_READ, &info)";
        values["WHY"] = "sf_strerror(NULL)";
        values["FAILED"] = "sf_error(file) != 0";
        values["CLOSE"] = "sf_close";
    }
}

void saveTransfer(const Settings& settings, std::string_view program, double mostCounts,
                  double mostSeconds, Values values)
{
    values["COUNTS"] = constant(mostCounts);
    if (std::isfinite(mostSeconds)) {
        values["CLOCK"] = clockFunction;
        values["START"].insert(0, "    const double started = now();\n");
        values["TIME"] = " && now() - started < " + constant(mostSeconds);
    }
    save(settings, std::string(program).append(fileMain), std::move(values));
}

} // namespace brenix
