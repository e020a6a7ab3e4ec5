// What the devices have in common that move bytes through a port of Asio's.
#ifndef BRENIX_PLUGINS_BYTEDEVICE_HPP
#define BRENIX_PLUGINS_BYTEDEVICE_HPP

#include "Elements.hpp"
#include "Transfer.hpp"
#include "Waits.hpp"

#include <asio.hpp>

#include <sys/ioctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <optional>
#include <string>

namespace bytes
{

constexpr OptionInfo blockSizeOption = {"BlockSize", "whole number", "elements", "16384",
                                        "of the largest packet that arrives"};

enum class Framing {
    None,     ///< bytes arrive in pieces of any size
    Datagrams ///< what arrives or is sent at once belongs together
};

/// A device on a port of Asio's with async_read_some(), async_write_some(), cancel(error) and
/// native_handle(). A count is an element.
template <typename Port>
class ByteDevice : public Device
{
public:
    void run(DeviceStreams& streams) override { Transfer<ByteDevice>(*this, streams).run(); }

    void wake() noexcept override { wakeUp.signal(); }

protected:
    explicit ByteDevice(Framing framing) : isDatagrams(framing == Framing::Datagrams) {}

    /// Reads the options of the elements and, for a port without datagrams, BlockSize.
    void readOptions(Options& options)
    {
        format = readFormat(options);
        blockBytes = 1U << 16U; // more than the largest datagram
        if (!isDatagrams) {
            const long elements = options.wholeNumber("BlockSize", 1, 1L << 24).value_or(16384);
            blockBytes = static_cast<std::size_t>(elements) * format.type->size;
        }
    }

    /// All that was sent has reached the other side. Returns whether that will end, too, which is
    /// then waited for.
    virtual bool endOutput() { return false; }

    /// The other side will not take what the system still holds.
    virtual void abandonOutput() {}

    /// What was lost before the device could take it, since init or open: a sentence, or empty.
    virtual std::string lostBefore() { return {}; }

    asio::io_context context;
    Port port{context};
    DeviceHost* host = nullptr;
    std::string peer;   ///< where output goes, for messages
    std::string source; ///< where input comes from, for messages
    bool sends = true;
    bool losesUnseen = false;  ///< also while nothing arrives
    bool endsWithInput = true; ///< or else output goes on when the other side has ended its own

    /// For room in the input stream. A datagram waits for the next run, if there is none.
    std::optional<Packet> waiting;

private:
    friend class Transfer<ByteDevice>;

    /// Calls the handler once the other side refuses output, where a port can tell without sending.
    template <typename Handler>
    void awaitRefusal(const Handler& handler)
    {
        if constexpr (requires { Port::wait_error; }) {
            port.async_wait(Port::wait_error,
                            [handler](const asio::error_code& /*error*/) { handler(); });
        }
    }

    /// Bytes sent that the other side, or the line, has not taken yet. Datagrams may stay behind.
    std::size_t queuedBySystem()
    {
        int queued = 0;
        if (!isDatagrams) {
            ::ioctl(port.native_handle(), TIOCOUTQ, &queued); // also the one of sockets
        }
        return static_cast<std::size_t>(std::max(queued, 0));
    }

    /// A failure of a socket of which no operation told.
    asio::error_code takeError()
    {
        int error = 0;
        socklen_t size = sizeof error;
        ::getsockopt(port.native_handle(), SOL_SOCKET, SO_ERROR, &error, &size);
        return {error, asio::system_category()};
    }

    const bool isDatagrams;
    Format format;
    std::size_t blockBytes = 0;
    WakeUp wakeUp{context};
};

} // namespace bytes

#endif
