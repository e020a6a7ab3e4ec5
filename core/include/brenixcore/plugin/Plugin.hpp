/// @file
/// What a plug-in implements. A plug-in is one shared library that defines one device, converter or
/// filter and exports it with one of the macros at the end:
///
///     class Silence : public brenixcore::plugin::Device { ... };
///     BRENIXCORE_EXPORT_DEVICE(Silence)
///
/// It is built with hidden visibility, C++17 or later, and links neither brenixcore nor
/// brenixcoder. Any operation may throw a std::exception; its text reaches the caller, as the message of the
/// error or as the channel's property Reason, or, from a thread of the core, becomes an "error" event.
#ifndef BRENIXCORE_PLUGIN_PLUGIN_HPP
#define BRENIXCORE_PLUGIN_PLUGIN_HPP

#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Packet.hpp"
#include "brenixplugin/Property.hpp"

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>

/// Classes that pass between the modules of a process.
#define BRENIXCORE_PLUGIN_SHARED __attribute__((visibility("default")))

namespace brenixcore::plugin
{

/// The version of everything in this file. A plug-in made for another version is not loaded.
constexpr std::uint32_t abiVersion = 3;

/// How a device reports to its channel, from any thread, from its init() to its term().
class BRENIXCORE_PLUGIN_SHARED DeviceHost
{
public:
    /// Raises an event. `name` is "error", "warning" or "trace"; the last two are seen only where the
    /// environment's BRENIX_TRACE says. An event without an identifier has brenix:Device:failed. On the
    /// thread that is inside an operation of the channel, an error throws, and the exception must pass
    /// through the device.
    virtual void raise(const char* name, const char* identifier, const char* message) = 0;

    /// Gives a property that init() delivered a new value.
    virtual void updateProperty(brenixplugin::OwnedProperty property) = 0;

protected:
    ~DeviceHost() = default;
};

/// The streams as a device's worker thread sees them. After run() they take and give nothing, and from
/// the next init() on they are not to be used.
class BRENIXCORE_PLUGIN_SHARED DeviceStreams
{
public:
    /// Puts a packet of at least one count into the input stream, waiting while there is no room, unless the
    /// option Overflow says that counts are then lost. Its fields must be property objects of the classes of
    /// Visit.hpp. Returns false when the channel is closing and the packet was dropped: there is no room, or
    /// no output left that it could answer. What was lost before it is told all the same.
    virtual bool push(Packet packet) = 0;

    /// Takes the next packet from the output stream, waiting for one. Returns nothing when the
    /// channel is closing and all output was taken: run() must return.
    virtual std::optional<Packet> pull() = 0;

    // For a device that waits elsewhere, for a socket say, and is told by wake() to ask again:

    /// As push(), but when there is no room at once returns false and leaves the packet as it is.
    virtual bool tryPush(Packet& packet) = 0;

    /// As pull(), but returns nothing when there is nothing at once.
    virtual std::optional<Packet> tryPull() = 0;

    /// Whether the channel is closing: run() must return once tryPull() returns nothing and no answer to
    /// the output is to be expected.
    virtual bool isClosing() const = 0;

    /// Says that the device takes no more output than what is queued, while it may go on with its
    /// input: further writes are refused, and one that waits ends. What run() then leaves in the output
    /// stream is discarded at close, and told.
    virtual void refuseOutput() = 0;

    /// Says that the device pushes nothing more, while it may go on with its output: what was lost is told,
    /// and its reader that the device is done; one that waits ends.
    virtual void endInput() = 0;

    /// Says that the device lost counts behind those that it pushed last, and why, in a few words: where no
    /// packet follows that could tell by its `lost`, or to give the reason. With a null reason they are only
    /// counted, since an error of the device's own tells of them.
    virtual void tellLost(std::uint64_t counts, const char* reason) = 0;

    /// How far the caller has come with the input stream: all counts before this number, from open and lost
    /// ones included, were read, flushed or lost. wake() tells when the caller has changed it since; a push() that
    /// drops what has waited longest changes it, too. For a device that keeps its place elsewhere.
    virtual std::uint64_t takenCounts() const = 0;

    /// The number of the next count, by which takenCounts() goes: what was pushed or told lost so far is before it,
    /// as the stream's filters have left it.
    virtual std::uint64_t pushedCounts() const = 0;

protected:
    ~DeviceStreams() = default;
};

/// Refuses output from here on and takes what is left of it, for a device that tells itself what it did not
/// take. Returns its counts.
inline std::uint64_t discardOutput(DeviceStreams& streams)
{
    streams.refuseOutput();
    std::uint64_t counts = 0;
    while (const auto packet = streams.tryPull()) {
        counts += packet->counts;
    }
    return counts;
}

/// What a device has in one direction.
struct StreamInfo {
    std::uint64_t countDimension = 1; ///< the dimension of the data along which it counts
    double rate = 0;                  ///< counts a second of an input stream; 0: not known
};

/// The streams that a device has.
struct DeviceInfo {
    std::optional<StreamInfo> input;  ///< to the caller
    std::optional<StreamInfo> output; ///< from the caller
};

/// A device. All operations but run() are called on the thread that uses the channel.
class BRENIXCORE_PLUGIN_SHARED Device
{
public:
    virtual ~Device() = default;

    /// Prepares the device and tells which streams it has. Puts its properties, one object under
    /// each name, into `properties`, which takes them over. The options are to be read during the
    /// call, as everywhere; `host` is valid until term() returns.
    virtual DeviceInfo init(const brenixplugin::PropertyMap& options,
                            brenixplugin::PropertyMap& properties, DeviceHost& host) = 0;

    /// Before run().
    virtual void open(const brenixplugin::PropertyMap& /*options*/) {}

    /// Moves the data, on a thread of the core. When it returns or throws, the device is done. The
    /// channel's close waits for it: a device with an output stream goes on with pull() until that
    /// returns nothing, any other device returns when push() is false.
    virtual void run(DeviceStreams& streams) = 0;

    /// Called on the channel's thread, while run() may be busy, when the channel closes, and when one of these may
    /// have a new answer that the device has asked for since the last time: tryPush() that was refused, tryPull()
    /// that found nothing, takenCounts(). So a device that is woken asks again before it waits. Must neither wait nor
    /// throw.
    virtual void wake() noexcept {}

    /// Runs a command, possibly while run() is busy.
    virtual void execute(const std::string& command, const brenixplugin::PropertyMap& /*options*/)
    {
        throw std::invalid_argument("Unknown command: " + command);
    }

    /// After run() has returned. Not called when open() has thrown.
    virtual void close() {}

    /// Releases what init() prepared; may be followed by another init(). Not called when init() has
    /// thrown.
    virtual void term() {}
};

/// Converts between the device's packets and the caller's fields, on the thread that uses the
/// channel.
class BRENIXCORE_PLUGIN_SHARED Converter
{
public:
    virtual ~Converter() = default;

    /// Changes the fields, not the number of counts. The fields must stay of the classes of Visit.hpp.
    virtual void convertInput(Packet& packet) = 0;

    /// The same on the way to the device.
    virtual void convertOutput(Packet& packet) = 0;
};

/// Changes packets on their way: of an input stream on the device's thread, of an output stream on
/// the thread that uses the channel. Its operations are never called at the same time.
class BRENIXCORE_PLUGIN_SHARED Filter
{
public:
    virtual ~Filter() = default;

    /// Called with the options that the filter is added with, and again whenever it is tuned. An option
    /// that no filter of the stream asks for is refused.
    virtual void tune(Options& options) = 0;

    /// May change fields, within the classes of Visit.hpp, and counts; a packet that is left without
    /// counts is dropped.
    virtual void apply(Packet& packet) = 0;
};

} // namespace brenixcore::plugin

/// Exports the plug-in's class, which has a default constructor: a Device...
#define BRENIXCORE_EXPORT_DEVICE(Class) BRENIXCORE_EXPORT_PLUGIN(Device, Class)
/// ... or a Converter...
#define BRENIXCORE_EXPORT_CONVERTER(Class) BRENIXCORE_EXPORT_PLUGIN(Converter, Class)
/// ... or a Filter.
#define BRENIXCORE_EXPORT_FILTER(Class) BRENIXCORE_EXPORT_PLUGIN(Filter, Class)

/// What the three have in common.
#define BRENIXCORE_EXPORT_PLUGIN(Kind, Class)                                                      \
    extern "C" BRENIXCORE_PLUGIN_SHARED std::uint32_t brenixcorePluginAbiVersion()                 \
    {                                                                                              \
        return brenixcore::plugin::abiVersion;                                                     \
    }                                                                                              \
    extern "C" BRENIXCORE_PLUGIN_SHARED brenixcore::plugin::Kind* brenixcoreCreate##Kind()         \
    {                                                                                              \
        return new Class;                                                                          \
    }

#endif
