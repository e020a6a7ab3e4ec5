#include "NullCore.hpp"

#include "brenixcore/Converter.hpp"
#include "brenixcore/plugin/Make.hpp"

using namespace brenixplugin;
using namespace brenixcore::plugin;

NullCore& nullCore()
{
    static NullCore core;
    return core;
}

// Not by operator+, of which GCC 12 warns.
std::string numbered(const std::string& name, std::size_t number)
{
    return std::string(name).append(std::to_string(number));
}

void* makeDataBuffer(std::size_t fields, std::size_t elements)
{
    brenixplugin::OwnedDataBuffer buffer(new PropertyMap);
    for (std::size_t i = 0; i < fields; ++i) {
        const std::string name = numbered("data", i);
        auto data = std::make_unique<double[]>(elements);
        nullCore().lastElements = data.get();
        storeProperty(*buffer, name, makeArray(name, std::move(data), elements));
    }
    return buffer.release();
}

// NOLINTBEGIN(readability-convert-member-functions-to-static): the contract says what they are
namespace brenixcore
{

struct Converter::Impl {
};
struct Channel::Impl {
};
struct Stream::Impl {
};

Converter::Converter(const std::string& /*path*/) {}
Converter::~Converter() = default;

Channel::Channel(const std::string& /*device*/, Converter& /*converter*/,
                 IEventHandler& /*handler*/, unsigned long /*first*/, unsigned long /*second*/)
{
}
Channel::~Channel() = default;

void Channel::init(const PropertyMap& options, PropertyMap& properties)
{
    releaseProperties(options);
    for (std::size_t i = 0; i < nullCore().properties; ++i) {
        publish(properties, numbered("p", i), 1.0);
    }
    nullCore().input = std::make_unique<InputStream>(nullptr);
    nullCore().output = std::make_unique<OutputStream>(nullptr);
}

void Channel::open(const PropertyMap& options)
{
    releaseProperties(options);
}
void Channel::execute(const char* /*command*/, const PropertyMap& options)
{
    releaseProperties(options);
}
void Channel::close() {}
void Channel::term() {}
bool Channel::isOpen() const
{
    return true;
}
InputStream* Channel::getInputStream() const
{
    return nullCore().input.get();
}
OutputStream* Channel::getOutputStream() const
{
    return nullCore().output.get();
}

Stream::Stream(std::unique_ptr<Impl> /*state*/) {}
Stream::~Stream() = default;
bool Stream::isInput() const
{
    return false;
}
void Stream::addFilter(const std::string& /*name*/, const PropertyMap& options)
{
    releaseProperties(options);
}
void Stream::tuneFilters(const PropertyMap& options)
{
    releaseProperties(options);
}
void Stream::flush()
{
    if (nullCore().fails) {
        throw SynchronousInputNotPossible("Cannot read 3 counts: the time is over.");
    }
}
bool Stream::isOpen() const
{
    return true;
}
bool Stream::isUnlimited() const
{
    return false;
}
unsigned long Stream::getDataAvailable() const
{
    return 3;
}
unsigned long Stream::getSpaceAvailable() const
{
    return 4;
}

InputStream::InputStream(std::unique_ptr<Impl> /*state*/) : Stream(nullptr) {}
InputStream::~InputStream() = default;
bool InputStream::isInput() const
{
    return true;
}
bool InputStream::isDeviceDone() const
{
    return false;
}
unsigned long InputStream::getCountDimension() const
{
    return 1;
}
void InputStream::peekCounts(unsigned long /*limit*/, unsigned long& total,
                             std::vector<unsigned long>& counts)
{
    counts = nullCore().waiting;
    total = counts.size();
}
void InputStream::read(unsigned long count, std::vector<void*>& buffers, unsigned long& countRead)
{
    auto& stock = nullCore().stock;
    const auto first = stock.end() - static_cast<std::ptrdiff_t>(count);
    buffers.assign(first, stock.end());
    stock.erase(first, stock.end());
    countRead = count;
}

OutputStream::OutputStream(std::unique_ptr<Impl> /*state*/) : Stream(nullptr) {}
OutputStream::~OutputStream() = default;
bool OutputStream::isInput() const
{
    return false;
}
bool OutputStream::isDeviceDone() const
{
    return false;
}
unsigned long OutputStream::getCountDimension() const
{
    return 1;
}
unsigned long OutputStream::write(const std::vector<void*>& dataList)
{
    return dataList.size();
}

} // namespace brenixcore
// NOLINTEND(readability-convert-member-functions-to-static)
