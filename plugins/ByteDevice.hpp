// What the devices have in common that move bytes through a port of Asio's.
#ifndef BRENIX_PLUGINS_BYTEDEVICE_HPP
#define BRENIX_PLUGINS_BYTEDEVICE_HPP

#include "Elements.hpp"
#include "Transfer.hpp"

#include <asio.hpp>

#include <sys/eventfd.h>

#include <algorithm>
#include <bit>
#include <cstdint>
#include <string>

namespace bytes
{

/// A device on a port of Asio's with async_read_some(), async_write_some(), cancel(error) and
/// native_handle(). A count is an element.
template <typename Port>
class ByteDevice : public Device
{
public:
    void run(DeviceStreams& streams) override { Transfer<ByteDevice>(*this, streams).run(); }

    void wake() noexcept override { ::eventfd_write(wakeUp.native_handle(), 1); }

protected:
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
    friend class Transfer<ByteDevice>;

    const Framing framing;
    const ElementType* type = nullptr;
    bool reverses = false;
    std::size_t blockBytes = 0;
    asio::posix::stream_descriptor wakeUp; ///< an eventfd: it can be told without waiting
};

} // namespace bytes

#endif
