// What the devices share that move bytes: element types and byte order, and the transfer both ways.
#ifndef BRENIX_PLUGINS_BYTEDEVICE_HPP
#define BRENIX_PLUGINS_BYTEDEVICE_HPP

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <asio.hpp>

#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <bit>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace bytes
{

using namespace brenixcore::plugin;
using brenixplugin::OwnedProperty;
using brenixplugin::PropertyMap;
using brenixplugin::interfaces::IPropertyInfo;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;

struct ElementType {
    std::string_view name;
    std::size_t size; ///< in bytes
    OwnedProperty (*make)(const unsigned char* data, std::size_t count);
    /// The elements of an array of this type; nothing for any other property.
    std::optional<asio::mutable_buffer> (*find)(IPropertyInfo* property);
};

template <typename T>
constexpr ElementType elementType(std::string_view name)
{
    return {name, sizeof(T),
            [](const unsigned char* data, std::size_t count) {
                std::unique_ptr<T[]> elements(new T[count]);
                std::memcpy(elements.get(), data, count * sizeof(T));
                return makeArray(dataField, std::move(elements), count);
            },
            [](IPropertyInfo* property) {
                auto* const array = dynamic_cast<TPointerProperty<T>*>(property);
                return array == nullptr ? std::nullopt
                                        : std::optional(asio::mutable_buffer(
                                              array->data, array->count * sizeof(T)));
            }};
}

constexpr std::array elementTypes = {
    elementType<double>("double"),       elementType<float>("float"),
    elementType<signed char>("int8"),    elementType<short>("int16"),
    elementType<int>("int32"),           elementType<long>("int64"),
    elementType<unsigned char>("uint8"), elementType<unsigned short>("uint16"),
    elementType<unsigned int>("uint32"), elementType<unsigned long>("uint64"),
};

/// The options that readFormat() reads.
constexpr OptionInfo elementTypeOption = {"ElementType", "text", "", "uint8",
                                          "double, float, int8 to int64 or uint8 to uint64"};
constexpr OptionInfo byteOrderOption = {"ByteOrder", "text", "", "little",
                                        "little or big: of the elements on their way"};
constexpr OptionInfo blockSizeOption = {"BlockSize", "whole number", "elements", "16384",
                                        "of the largest packet that arrives"};

/// What a property holds that is not what it should be.
inline std::string describe(IPropertyInfo* property)
{
    for (const ElementType& type : elementTypes) {
        if (type.find(property)) {
            return std::string(type.name);
        }
    }
    if (dynamic_cast<TPointerProperty<bool>*>(property) != nullptr) {
        return "logical";
    }
    if (dynamic_cast<TScalarProperty<std::u16string>*>(property) != nullptr) {
        return "char";
    }
    return property == nullptr ? "missing" : "not an array of numbers";
}

inline void reverseEach(unsigned char* data, std::size_t length, std::size_t size)
{
    for (unsigned char* element = data; element < data + length; element += size) {
        std::reverse(element, element + size);
    }
}

/// One of the texts that an option may have; its index.
template <std::size_t N>
std::size_t readChoice(Options& options, const std::string& name,
                       const std::array<std::string_view, N>& choices)
{
    const std::string given = options.text(name).value_or(std::string(choices[0]));
    const auto* const found = std::find(choices.begin(), choices.end(), given);
    if (found == choices.end()) {
        std::string list(choices[0]);
        for (std::size_t i = 1; i < N; ++i) {
            list += (i + 1 < N ? ", " : " or ") + std::string(choices[i]);
        }
        Options::fail(name, "must be " + list + ", not " + given);
    }
    return static_cast<std::size_t>(found - choices.begin());
}

/// A device on a port of Asio's with async_read_some(), async_write_some(), cancel(error) and
/// native_handle(). A count is an element.
template <typename Port>
class ByteDevice : public Device
{
public:
    void run(DeviceStreams& streams) override { Transfer(*this, streams).run(); }

    void wake() noexcept override { ::eventfd_write(wakeUp.native_handle(), 1); }

protected:
    enum class Framing {
        None,     ///< bytes arrive in pieces of any size
        Datagrams ///< what arrives or is sent at once belongs together
    };

    explicit ByteDevice(Framing portFraming)
        : framing(portFraming), wakeUp(context, ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
    {
    }

    void readFormat(Options& options)
    {
        const std::string name = options.text("ElementType").value_or("uint8");
        const auto* const found =
            std::find_if(elementTypes.begin(), elementTypes.end(),
                         [&](const ElementType& candidate) { return candidate.name == name; });
        if (found == elementTypes.end()) {
            Options::fail("ElementType", "is not a numeric type: " + name);
        }
        type = found;
        const bool big = readChoice<2>(options, "ByteOrder", {"little", "big"}) == 1;
        reverses = big != (std::endian::native == std::endian::big);
        if (framing == Framing::Datagrams) {
            blockBytes = 1U << 16U; // more than the largest datagram
        } else {
            const long elements = options.wholeNumber("BlockSize", 1, 1L << 24).value_or(16384);
            blockBytes = static_cast<std::size_t>(elements) * type->size;
        }
    }

    /// All that was sent has reached the other side. Returns whether that will end, too, which is
    /// then waited for.
    virtual bool endOutput() { return false; }

    /// The other side will not take what the system still holds.
    virtual void abandonOutput() {}

    asio::io_context context;
    Port port{context};
    DeviceHost* host = nullptr;
    std::string peer; ///< its name, for messages
    bool sends = true;

private:
    class Transfer;

    const Framing framing;
    const ElementType* type = nullptr;
    bool reverses = false;
    std::size_t blockBytes = 0;
    asio::posix::stream_descriptor wakeUp; ///< an eventfd: it can be told without waiting
};

/// One run of the device. Whatever has happened, advance() then does all that is possible.
template <typename Port>
class ByteDevice<Port>::Transfer
{
public:
    Transfer(ByteDevice& byteDevice, DeviceStreams& deviceStreams)
        : device(byteDevice), streams(deviceStreams), timer(byteDevice.context),
          buffer(byteDevice.blockBytes)
    {
    }
    Transfer(const Transfer&) = delete;
    Transfer& operator=(const Transfer&) = delete;
    ~Transfer() { stop(); }

    void run()
    {
        device.context.restart();
        awaitWakeUp();
        advance();
        device.context.run();
        stop();
        report();
    }

private:
    /// How long the other side may take nothing while the device waits to end.
    static constexpr std::chrono::seconds patience{3};

    /// Ends every operation that is under way.
    void stop() noexcept
    {
        if (over) {
            return;
        }
        over = true;
        try {
            asio::error_code ignored;
            device.port.cancel(ignored);
            device.wakeUp.cancel(ignored);
            timer.cancel();
            device.context.restart();
            device.context.run();
        } catch (...) { // none of these does: what is cancelled here returns at once
        }
    }

    void awaitWakeUp()
    {
        device.wakeUp.async_wait(asio::posix::descriptor_base::wait_read,
                                 [this](const asio::error_code& /*error*/) {
                                     if (!over) {
                                         eventfd_t times = 0;
                                         ::eventfd_read(device.wakeUp.native_handle(), &times);
                                         awaitWakeUp();
                                         advance();
                                     }
                                 });
    }

    void advance()
    {
        closing = streams.isClosing(); // before the last look at the output
        // While the channel closes, nobody makes room; but the other side may have to send in order
        // to receive.
        if (waiting && (streams.tryPush(*waiting) || closing)) {
            waiting.reset();
        }
        if (!receiving && !waiting && !inputEnded) {
            receive();
        }
        if (device.sends && (failure || (inputEnded && !waiting))) {
            streams.refuseOutput(); // before the last look at it
        }
        if (device.sends && !failure && !outputEnded) {
            sendNext();
        }
        if (closing || (inputEnded && !waiting)) {
            end();
        }
    }

    /// Stops once nothing is left to send, or to wait for.
    void end()
    {
        const std::size_t queued = queuedBySystem();
        if (!failure && !sending && queued == 0 && !outputEnded) {
            outputEnded = true;
            awaitsEnd = device.endOutput() && sent > 0;
            deadline.reset();
        }
        if (outputEnded && (!awaitsEnd || inputEnded)) {
            device.context.stop();
            return;
        }
        if (const std::size_t taken = sent - queued; !deadline || taken != takenBefore) {
            takenBefore = taken;
            deadline = std::chrono::steady_clock::now() + patience;
        }
        if (failure || std::chrono::steady_clock::now() >= *deadline) {
            if (!outputEnded) {
                lost = unsent.size() + queued;
                device.abandonOutput();
            }
            device.context.stop();
        } else if (!ticking) {
            ticking = true;
            timer.expires_after(std::chrono::milliseconds(5));
            timer.async_wait([this](const asio::error_code& /*error*/) {
                ticking = false;
                if (!over) {
                    advance();
                }
            });
        }
    }

    /// Bytes sent that the other side, or the line, has not taken yet. Finds out about a failure,
    /// which nobody else does once the other side has ended its input.
    std::size_t queuedBySystem()
    {
        const int handle = device.port.native_handle();
        int error = 0;
        socklen_t size = sizeof error;
        if (::getsockopt(handle, SOL_SOCKET, SO_ERROR, &error, &size) == 0 && error != 0) {
            fail({error, asio::system_category()});
        }
        int queued = 0;
        ::ioctl(handle, TIOCOUTQ, &queued); // also the one of sockets
        return static_cast<std::size_t>(std::max(queued, 0));
    }

    void fail(const asio::error_code& error)
    {
        if (!failure) {
            failure = error;
        }
    }

    void raise(const char* identifier, const std::string& message)
    {
        device.host->raise("error", identifier, message.c_str());
    }

    // --- Input ---

    void receive()
    {
        receiving = true;
        device.port.async_read_some(asio::buffer(buffer) + held,
                                    [this](const asio::error_code& error, std::size_t length) {
                                        receiving = false;
                                        if (over) {
                                            return;
                                        }
                                        if (!error) {
                                            accept(held + length);
                                        } else {
                                            inputEnded = true;
                                            if (error != asio::error::eof) {
                                                fail(error);
                                            }
                                        }
                                        advance();
                                    });
    }

    /// Makes a packet of the whole elements in the buffer.
    void accept(std::size_t length)
    {
        const std::size_t size = device.type->size;
        const std::size_t whole = length / size * size;
        held = length - whole;
        if (whole > 0) {
            if (device.reverses) {
                reverseEach(buffer.data(), whole, size);
            }
            waiting.emplace();
            waiting->counts = whole / size;
            setField(*waiting, device.type->make(buffer.data(), waiting->counts));
        }
        if (device.framing == Framing::Datagrams) {
            reportHeld("a datagram");
            held = 0;
        } else {
            std::copy_n(buffer.data() + whole, held, buffer.data());
        }
    }

    void reportHeld(const std::string& where)
    {
        if (held > 0) {
            raise("brenix:Device:dataLost", "The last " + std::to_string(held) + " bytes of " +
                                                where + " are no whole " +
                                                std::string(device.type->name) + ".");
        }
    }

    // --- Output ---

    void sendNext()
    {
        while (!sending) {
            auto packet = streams.tryPull();
            if (!packet) {
                return;
            }
            outgoing = takeField(*packet, dataField);
            const auto found = device.type->find(outgoing.get());
            if (!found) {
                raise("brenix:Device:wrongType", "Data to send must be " +
                                                     std::string(device.type->name) + ", but is " +
                                                     describe(outgoing.get()) + ".");
                continue;
            }
            if (device.reverses) {
                reverseEach(static_cast<unsigned char*>(found->data()), found->size(),
                            device.type->size);
            }
            unsent = *found;
            if (unsent.size() > 0) {
                send();
            }
        }
    }

    void send()
    {
        sending = true;
        device.port.async_write_some(
            unsent, [this](const asio::error_code& error, std::size_t length) {
                sending = false;
                unsent += length;
                sent += length;
                if (over) {
                    return;
                }
                if (error && device.framing == Framing::Datagrams) {
                    reportUnsent(std::exchange(unsent, {}).size(), error.message());
                } else if (error) {
                    fail(error);
                } else if (unsent.size() > 0) {
                    send();
                }
                advance();
            });
    }

    void reportUnsent(std::size_t length, const std::string& why)
    {
        raise("brenix:Device:dataLost",
              std::to_string(length) + " bytes were not sent to " + device.peer + ": " + why + ".");
    }

    // --- The end ---

    void report()
    {
        if (inputEnded) {
            reportHeld("the data from " + device.peer);
        }
        if (failure && (!closing || lost == 0)) {
            throw std::runtime_error("Transfer with " + device.peer +
                                     " failed: " + failure.message() + ".");
        }
        if (lost > 0) {
            while (auto packet = closing ? streams.tryPull() : std::nullopt) {
                lost += packet->counts * device.type->size;
            }
            reportUnsent(lost, failure ? failure.message() : "it is not taken");
        }
    }

    ByteDevice& device;
    DeviceStreams& streams;
    asio::steady_timer timer;
    asio::error_code failure; ///< the first

    std::vector<unsigned char> buffer;
    std::size_t held = 0;          ///< bytes at its beginning, of an element without its end
    std::optional<Packet> waiting; ///< for room in the input stream

    OwnedProperty outgoing;
    asio::const_buffer unsent; ///< of `outgoing`
    std::size_t sent = 0;      ///< bytes, of all packets
    std::size_t lost = 0;      ///< bytes

    std::optional<std::chrono::steady_clock::time_point> deadline; ///< while it waits to end
    std::size_t takenBefore = 0;

    // Under way:
    bool receiving = false;
    bool sending = false;
    bool ticking = false;

    bool closing = false;
    bool inputEnded = false;
    bool outputEnded = false;
    bool awaitsEnd = false; ///< of the other side
    bool over = false;
};

} // namespace bytes

#endif
