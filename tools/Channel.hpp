// A channel as the commands use it: the functions of coder.h, with exceptions for errors.
#ifndef BRENIX_TOOLS_CHANNEL_HPP
#define BRENIX_TOOLS_CHANNEL_HPP

#include "Options.hpp"

#include <cstddef>
#include <functional>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace brenix
{

/// A failed call of the library, an error of the device, or what else ends a command with exit code 1.
class Failure : public std::runtime_error
{
public:
    Failure(std::string errorId, const std::string& message)
        : std::runtime_error(message), id(std::move(errorId))
    {
    }
    const std::string& getId() const { return id; }

    /// Whether it tells that data was lost and nothing else is wrong.
    bool isLoss() const { return has(":dataLost") || has(":badMessage"); }

    /// The same, or that somebody was not let in.
    bool isPassing() const { return isLoss() || has(":peerRefused"); }

    /// Identifier and message, as far as there are both.
    std::string text() const
    {
        const std::string message = what();
        return id + (id.empty() || message.empty() ? "" : ": ") + message;
    }

private:
    bool has(const char* part) const { return id.find(part) != std::string::npos; }

    std::string id;
};

/// Does the work. Returns the failure that ends it.
std::optional<Failure> caught(const std::function<void()>& work);

/// What the command line says of a channel.
struct ChannelSettings {
    std::string device;
    std::string converter = "identity";
    std::vector<std::string> options;     ///< of init, as parseOptions() takes them
    std::vector<std::string> openOptions; ///< of open
    std::vector<std::string> filters;     ///< each a plug-in and its options, with spaces
    double inputLimit = 65536;
    double outputLimit = 65536;
};

/// What a command does with a channel.
enum class Use { Look, Read, Write };

/// One field of the buffers of an input stream.
struct Field {
    std::string name; ///< empty for the first field
    const ElementType* type = nullptr;
    std::size_t perCount = 0; ///< elements of each count
    Bytes elements;           ///< of the buffer that was read last
    bool isRepeated = false;  ///< a buffer had one element, which is now in each row
    double step = 0;          ///< by which an integer that is repeated grows from row to row
};

class Channel
{
public:
    /// Creates and initialises a channel, with the filters for the stream that is used: the input, but
    /// when writing. Throws when there is no stream to read or to write.
    Channel(const ChannelSettings& settings, Use use);
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;
    ~Channel();

    void open(const ChannelSettings& settings);
    void execute(const std::string& command, const std::vector<std::string>& options);

    /// Closes, when it is open, and terminates. Throws what fails, or the failure that ended a
    /// transfer, behind the device's errors if there are any: mostly they are the reason.
    /// What is passing is no failure where a list takes it.
    void finish(const std::optional<Failure>& failure = {},
                std::vector<Failure>* passing = nullptr);

    /// Throws the error of a call that returned 0.
    void check(int result);

    bool hasDeviceError();

    /// Takes the device's asynchronous error, if there is one.
    std::optional<Failure> deviceError();

    /// Leaves an error that was taken for finish().
    void leave(const Failure& error) { left = error; }

    /// The value of a property; nothing when there is none of that name and type.
    std::optional<Bytes> property(const std::string& name, const ElementType& type);
    std::optional<double> number(const std::string& name, const char* type);

    void* inputStream() const { return input; }
    void* outputStream() const { return output; }
    bool isSupported(void* stream);
    bool isDone(void* stream);

    double inputAvailable(); ///< counts that the input stream has

    /// Takes the next buffer, or as much of it as `most` counts, if one is there. Returns its counts.
    double nextBuffer(double most);

    /// The fields of the buffer that was taken: those of the names given, or else those that the plug-ins
    /// describe, or else Data1, Data2..., or data, or the first.
    std::vector<Field> findFields(const std::vector<std::string>& names, double counts);

    /// Copies out a field of the buffer that was taken.
    void readField(Field& field, double counts);

private:
    void initialise(const ChannelSettings& settings, Use use);
    void release() noexcept;

    using Copy = std::function<int(std::size_t capacity, void* destination)>;

    bool readAll(const ElementType& type, const Copy& copy, std::size_t guess, Bytes& elements);
    Copy fieldCopier(const Field& field) const;
    Failure lastError() const;
    std::string fieldsThere(double counts);
    std::optional<Field> findField(const std::string& name, double counts);

    std::optional<Failure> left;
    void* handle = nullptr;
    void* input = nullptr;
    void* output = nullptr;
    std::vector<double> bufferCounts;     ///< that the last peek told
    std::size_t buffer = 0;               ///< so many of them were taken
    std::vector<std::string> inputFields; ///< that the plug-ins describe; "#" is any number from 1
};

} // namespace brenix

#endif
