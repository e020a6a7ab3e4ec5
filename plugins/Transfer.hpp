// The transfer of a device that moves bytes, both ways.
#ifndef BRENIX_PLUGINS_TRANSFER_HPP
#define BRENIX_PLUGINS_TRANSFER_HPP

#include "Elements.hpp"
#include "Losses.hpp"
#include "Waits.hpp"

#include <asio.hpp>

#include <chrono>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>

namespace bytes
{

/// One run of a ByteDevice. Whatever has happened, advance() then does all that is possible.
template <typename Owner>
class Transfer
{
public:
    Transfer(Owner& byteDevice, DeviceStreams& deviceStreams)
        : device(byteDevice), streams(deviceStreams), assembler(device.format, device.blockBytes),
          losses(*device.host, device.peer, device.source, device.format.type->name)
    {
        if (!device.isDatagrams) {
            device.waiting.reset(); // of another connection
        }
    }
    ~Transfer() { stop(); }

    void run()
    {
        device.context.restart();
        awaitWakeUp();
        tellLossesSoon();
        advance();
        device.context.run();
        stop();
        finish();
    }

private:
    void awaitWakeUp()
    {
        device.wakeUp.await([this] {
            if (!over) {
                awaitWakeUp();
                advance();
            }
        });
    }

    void advance()
    {
        closing = streams.isClosing(); // before the last look at the output
        deliver();
        const bool inputDone = inputEnded && !device.waiting;
        if (inputDone && !std::exchange(inputDoneTold, true)) {
            streams.endInput();
            device.awaitRefusal([this] { lookForFailure(); });
        }
        const bool ends = inputDone && (failure || device.endsWithInput);
        if (device.sends && (failure || ends)) {
            streams.refuseOutput(); // before the last look at it
        }
        if (device.sends && !failure && !outputEnded) {
            sendNext();
        }
        if (closing || ends) {
            end();
        }
        if (!device.context.stopped() && !receiving && !device.waiting && !inputEnded) {
            receive();
        }
    }

    // --- Input ---

    void receive()
    {
        receiving = true;
        const auto handler = [this](const asio::error_code& error, std::size_t length) {
            receiving = false;
            if (over) {
                late = length; // finish() looks at it
                return;
            }
            if (!error) {
                device.waiting = assembler.take(length);
            } else {
                inputEnded = true;
                fail(error == asio::error::eof ? asio::error_code() : error);
            }
            if (device.isDatagrams || inputEnded) {
                losses.partial += assembler.dropRest();
            }
            inputEnded ? tellLosses() : tellLossesSoon();
            advance();
        };
        device.port.async_read_some(assembler.space(), handler);
    }

    void deliver()
    {
        if (!device.waiting) {
            return;
        }
        const std::uint64_t counts = device.waiting->counts;
        if (streams.tryPush(*device.waiting)) {
            device.waiting.reset();
        } else if (closing && !device.isDatagrams) {
            // Nobody makes room now, but the other side may have to send in order to receive.
            noRoom += counts;
            device.waiting.reset();
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
            const auto found = device.format.toBytes(outgoing.get());
            if (!found) {
                losses.wrongType += packet->counts;
                losses.raise("brenix:Device:wrongType", "Data to send must be " +
                                                            std::string(losses.type) + ", but is " +
                                                            describe(outgoing.get()) + ".");
                continue;
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
        const auto handler = [this](const asio::error_code& error, std::size_t length) {
            sending = false;
            unsent += length;
            sent += length;
            if (over) {
                return;
            }
            if (error && device.isDatagrams) {
                losses.addUnsent(std::exchange(unsent, {}).size(), error.message());
                tellLossesSoon();
            } else if (error) {
                fail(error);
            } else if (unsent.size() > 0) {
                send();
            }
            advance();
        };
        device.port.async_write_some(unsent, handler);
    }

    // --- Failures and losses ---

    /// The first failure counts.
    void fail(const asio::error_code& error)
    {
        if (!failure) {
            failure = error;
        }
    }

    void lookForFailure()
    {
        if (!over) {
            fail(device.takeError());
            advance();
        }
    }

    void tellLosses()
    {
        losses.before = device.lostBefore();
        losses.tell();
    }

    /// Waits a little, so that many are told as one; and again while more may come unseen.
    void tellLossesSoon()
    {
        lossTicker.start(std::chrono::milliseconds(100), [this] {
            if (!over) {
                tellLosses();
                if (device.waiting || device.losesUnseen) {
                    tellLossesSoon();
                }
            }
        });
    }

    // --- The end ---

    /// Stops once nothing is left to send, or to wait for.
    void end()
    {
        fail(device.takeError());
        const std::size_t queued = device.queuedBySystem();
        if (!failure && !sending && queued == 0 && !outputEnded) {
            outputEnded = true;
            awaitsEnd = device.endOutput() && sent > 0;
            patience.reset();
        }
        const bool isOver = outputEnded && (!awaitsEnd || inputEnded);
        if (failure || isOver || patience.isOver(sent - queued)) {
            device.context.stop();
        } else {
            endTicker.start(std::chrono::milliseconds(5), [this] { lookForFailure(); });
        }
    }

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
            device.wakeUp.cancel();
            endTicker.cancel();
            lossTicker.cancel();
            device.context.restart();
            device.context.run();
        } catch (...) { // none of these does: what is cancelled here returns at once
        }
    }

    /// After all has stopped: says what failed, and what is lost.
    void finish()
    {
        if (late > 0) {
            device.waiting = assembler.take(late);
        }
        deliver();
        losses.partial += assembler.dropRest();
        if (sent > 0) { // it may be the answer; who only reads has seen enough
            losses.noRoom = noRoom;
            streams.tellLost(noRoom, nullptr);
        }
        if (!outputEnded) {
            const std::uint64_t left = failure || !device.sends ? 0 : discardOutput(streams);
            losses.addUnsent(unsent.size() + device.queuedBySystem() +
                                 left * device.format.type->size,
                             failure ? "" : "the other side does not take them");
            device.abandonOutput();
        }
        if (failure) {
            losses.before = device.lostBefore();
            throw std::runtime_error(losses.with("Transfer with " + device.peer +
                                                 " failed: " + failure.message() + "."));
        }
        streams.endInput(); // what the core tells of it would hide the error below
        tellLosses();
    }

    Owner& device;
    DeviceStreams& streams;
    asio::error_code failure;
    Assembler assembler;
    std::uint64_t noRoom = 0; ///< elements that arrived while the channel closed
    std::size_t late = 0;     ///< bytes that arrived when all was over
    OwnedProperty outgoing;
    asio::const_buffer unsent; ///< of `outgoing`
    std::size_t sent = 0;      ///< bytes, of all packets
    Losses losses;
    Ticker endTicker{device.context};
    Patience patience; ///< with the other side, while the device waits to end
    Ticker lossTicker{device.context};

    bool receiving = false, sending = false; ///< under way
    bool closing = false;
    bool inputEnded = false;
    bool inputDoneTold = false;
    bool outputEnded = false;
    bool awaitsEnd = false; ///< of the other side
    bool over = false;
};

} // namespace bytes

#endif
