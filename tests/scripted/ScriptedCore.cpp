#include "scripted/ChannelFixture.hpp"

#include <sstream>

using namespace scripted;

namespace
{

/// Options, which an operation takes over. Their names are printed in brackets.
std::ostream& operator<<(std::ostream& out, const PropertyMap& options)
{
    core.options.reset(new PropertyMap(options));
    for (const auto& [name, value] : options) {
        out << '[' << name << ']';
    }
    return out;
}

/// Keeps the fields of the buffers written; the buffers stay.
unsigned long takeFields(const std::vector<void*>& buffers)
{
    const allocations::Allowed allowed;
    core.written.clear();
    for (void* buffer : buffers) {
        core.written.emplace_back(new PropertyMap)->swap(*static_cast<PropertyMap*>(buffer));
    }
    return core.number;
}

/// Logs "side.operation(arguments)" and runs the operation's hook.
template <typename... Types>
void called(const void* object, const std::string_view operation, const Types&... arguments)
{
    {
        const allocations::Allowed allowed;
        const bool isInput = object == core.input.get();
        const char* side = isInput ? "input." : object == core.output.get() ? "output." : "";
        std::ostringstream text;
        [[maybe_unused]] const char* separator = "";
        ((text << std::exchange(separator, ", ") << arguments), ...);
        log(side + std::string(operation), text.str());
    }
    if (const auto hook = core.on.find(operation); hook != core.on.end()) {
        hook->second();
    }
}

} // namespace

// Defines a function that is logged with the trailing arguments before it does its statement.
#define OPERATION(signature, statement, ...)                                                       \
    signature                                                                                      \
    {                                                                                              \
        called(this, static_cast<const char*>(__func__) __VA_OPT__(, ) __VA_ARGS__);               \
        statement;                                                                                 \
    }

namespace brenixcore
{

struct Converter::Impl {
};
struct Channel::Impl {
};
struct Stream::Impl {
};
using Text = const std::string&;
using Map = const PropertyMap&;
using Count = unsigned long;
using Buffers = std::vector<void*>;

OPERATION(Converter::Converter(Text path), , path)
OPERATION(Converter::~Converter(), )
OPERATION(Channel::Channel(Text devicePath, Converter&, IEventHandler& handler, Count firstLimit,
                           Count secondLimit),
          core.handler = &handler, devicePath, firstLimit, secondLimit)
OPERATION(Channel::~Channel(), )

void Channel::init(Map options, PropertyMap& properties)
{
    core.properties = &properties;
    called(this, "init", options);
    // The streams of the last init end here, so that any later use of them shows.
    core.input = core.hasStreams ? std::make_unique<InputStream>(nullptr) : nullptr;
    core.output = core.hasStreams ? std::make_unique<OutputStream>(nullptr) : nullptr;
}

OPERATION(void Channel::open(Map options), , options)
OPERATION(void Channel::execute(const char* command, Map options), , command, options)
OPERATION(void Channel::close(), )
OPERATION(void Channel::term(), )
OPERATION(bool Channel::isOpen() const, return core.flag)
OPERATION(InputStream* Channel::getInputStream() const, return core.input.get())
OPERATION(OutputStream* Channel::getOutputStream() const, return core.output.get())

Stream::Stream(std::unique_ptr<Impl>) {}
Stream::~Stream() = default;
OPERATION(bool Stream::isInput() const, return false)
OPERATION(void Stream::addFilter(Text name, Map options), , name, options)
OPERATION(void Stream::tuneFilters(Map options), , options)
OPERATION(void Stream::flush(), )
OPERATION(bool Stream::isOpen() const, return core.flag)
OPERATION(bool Stream::isUnlimited() const, return core.unlimited)
OPERATION(Count Stream::getDataAvailable() const, return core.number)
OPERATION(Count Stream::getSpaceAvailable() const, return core.number)

InputStream::InputStream(std::unique_ptr<Impl>) : Stream(nullptr) {}
InputStream::~InputStream() = default;
OPERATION(bool InputStream::isInput() const, return true)
OPERATION(bool InputStream::isDeviceDone() const, return core.flag)
OPERATION(Count InputStream::getCountDimension() const, return core.number)
OPERATION(void InputStream::peekCounts(Count limit, Count& total, std::vector<Count>& counts),
          (total = core.number, counts = core.counts), limit)
OPERATION(void InputStream::read(Count count, Buffers& buffers, Count&),
          buffers.swap(core.delivery), count)

OutputStream::OutputStream(std::unique_ptr<Impl>) : Stream(nullptr) {}
OutputStream::~OutputStream() = default;
OPERATION(bool OutputStream::isInput() const, return false)
OPERATION(bool OutputStream::isDeviceDone() const, return core.flag)
OPERATION(Count OutputStream::getCountDimension() const, return core.number)
OPERATION(Count OutputStream::write(const Buffers& list), return takeFields(list), list.size())

} // namespace brenixcore
