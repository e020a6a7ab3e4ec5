// The transfer of a device that moves bytes, both ways.
#ifndef BRENIX_PLUGINS_TRANSFER_HPP
#define BRENIX_PLUGINS_TRANSFER_HPP

#include "Elements.hpp"

#include <asio.hpp>

#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace bytes
{

enum class Framing {
    None,     ///< bytes arrive in pieces of any size
    Datagrams ///< what arrives or is sent at once belongs together
};

/// One run of a ByteDevice. Whatever has happened, advance() then does all that is possible.
template <typename Owner>
class Transfer
{
public:
    Transfer(Owner& byteDevice, DeviceStreams& deviceStreams)
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

    Owner& device;
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
