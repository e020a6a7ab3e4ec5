#include "scripted/ScriptedCore.hpp"

#include <limits>
#include <mutex>
#include <ostream>
#include <sstream>
#include <type_traits>

using namespace scripted;
using brenixplugin::PropertyMap;
using brenixplugin::interfaces::IPropertyInfo;

void scripted::log(std::string entry)
{
    static std::mutex mutex;
    const std::lock_guard lock(mutex);
    core.log.push_back(std::move(entry));
}

namespace
{

template <typename Elements>
void printList(std::ostream& out, const Elements& elements, std::size_t count)
{
    for (std::size_t i = 0; i < count; ++i) {
        out << (i > 0 ? "," : "[") << +elements[i];
    }
    out << ']';
}

void print(std::ostream& out, const IPropertyInfo* property)
{
    using namespace brenixplugin::kit;
    forEachType([&](const char* type, auto zero) {
        using T = decltype(zero);
        // Logical bytes are kept as they came, so they may not be read as bool.
        using Byte = std::conditional_t<std::is_same_v<T, bool>, unsigned char, T>;
        if (const auto* scalar = dynamic_cast<const device::TScalarProperty<T>*>(property)) {
            out << type << ' ' << +scalar->value;
        } else if (const auto* vector = dynamic_cast<const device::TVectorProperty<T>*>(property)) {
            printList(out << type, vector->values, vector->values.size());
        } else if (const auto* array =
                       dynamic_cast<const coderconverter::TPointerProperty<T>*>(property)) {
            printList(out << type << '*', reinterpret_cast<const Byte*>(array->data), array->count);
        }
    });
    if (const auto* text = dynamic_cast<const device::TScalarProperty<std::u16string>*>(property)) {
        out << "char ";
        for (const char16_t unit : text->value) {
            unit < 0x80 ? out << static_cast<char>(unit) : out << '\\' << +unit;
        }
    }
}

/// Options, which an operation takes over. Printed as name=type value for a scalar,
/// name=type[values] for a vector and name=type*[values] for an array.
struct Options {
    explicit Options(const PropertyMap& options) : map(options) {}
    ~Options() { brenixplugin::releaseProperties(map); }
    const PropertyMap& map;
};

std::ostream& operator<<(std::ostream& out, const PropertyMap& map)
{
    const char* separator = "";
    for (const auto& [name, value] : map) {
        const IPropertyInfo* const property = brenixplugin::asProperty(value);
        out << std::exchange(separator, ", ") << (name == property->getName() ? name : "?") << '=';
        print(out, property);
    }
    return out;
}

std::ostream& operator<<(std::ostream& out, const Options& options)
{
    return out << options.map;
}

std::ostream& operator<<(std::ostream& out, const std::vector<void*>& dataList)
{
    for (void* buffer : dataList) {
        out << ';' << *static_cast<PropertyMap*>(buffer);
    }
    return out;
}

/// "" for a channel.
template <typename Owner>
const char* side(const Owner* owner)
{
    if constexpr (std::is_base_of_v<brenixcore::Stream, Owner>) {
        return owner->isInput() ? "input." : "output.";
    }
    return "";
}

/// Logs "side.operation(arguments)" and runs the operation's hook.
template <typename... Arguments>
void called(const char* side, const char* operation, const Arguments&... arguments)
{
    {
        const AllocationsAllowed allowed;
        std::ostringstream text;
        text.precision(std::numeric_limits<double>::max_digits10);
        text << side << operation << '(';
        [[maybe_unused]] const char* separator = "";
        ((text << std::exchange(separator, ", ") << arguments), ...);
        log(text.str() + ')');
    }
    if (const auto hook = core.on.find(operation); hook != core.on.end()) {
        hook->second();
    }
}

} // namespace

// A function of one statement, and one that is logged with its trailing arguments before it
// answers.
#define FUNCTION(signature, statement)                                                             \
    signature                                                                                      \
    {                                                                                              \
        statement;                                                                                 \
    }
#define OPERATION(Result, Class, name, parameters, answer, ...)                                    \
    Result Class::name parameters                                                                  \
    {                                                                                              \
        called(side(this), #name __VA_OPT__(, ) __VA_ARGS__);                                      \
        return answer;                                                                             \
    }

namespace brenixcore
{

struct Converter::Impl {
};
struct Channel::Impl {
    std::unique_ptr<InputStream> input;
    std::unique_ptr<OutputStream> output;
};
struct Stream::Impl {
};

FUNCTION(Converter::Converter(const std::string& path), called("", "Converter", path))
FUNCTION(Converter::~Converter(), called("", "~Converter"))

Channel::Channel(const std::string& devicePath, Converter&, IEventHandler& handler,
                 unsigned long firstLimit, unsigned long secondLimit)
    : impl(std::make_unique<Impl>())
{
    core.handler = &handler;
    called("", "Channel", devicePath, firstLimit, secondLimit);
}

FUNCTION(Channel::~Channel(), called("", "~Channel"))

void Channel::init(const PropertyMap& options, PropertyMap& properties)
{
    core.properties = &properties;
    called("", "init", Options(options));
    // The streams of the last init end here, so that any later use of them shows.
    impl->input = core.hasInput ? std::make_unique<InputStream>(nullptr) : nullptr;
    impl->output = core.hasOutput ? std::make_unique<OutputStream>(nullptr) : nullptr;
}

using Name = const std::string&;
using Map = const PropertyMap&;
OPERATION(void, Channel, open, (Map options), void(), Options(options))
OPERATION(void, Channel, execute, (const char* command, Map options), void(), command,
          Options(options))
OPERATION(void, Channel, close, (), void())
OPERATION(void, Channel, term, (), void())
OPERATION(bool, Channel, isOpen, () const, core.flag)
OPERATION(InputStream*, Channel, getInputStream, () const, impl->input.get())
OPERATION(OutputStream*, Channel, getOutputStream, () const, impl->output.get())

Stream::Stream(std::unique_ptr<Impl> state) : impl(std::move(state)) {}
Stream::~Stream() = default;
FUNCTION(bool Stream::isInput() const, return dynamic_cast<const InputStream*>(this) != nullptr)
OPERATION(void, Stream, addFilter, (Name name, Map options), void(), name, Options(options))
OPERATION(void, Stream, tuneFilters, (Map options), void(), Options(options))
OPERATION(void, Stream, flush, (), void())
OPERATION(bool, Stream, isOpen, () const, core.flag)
OPERATION(bool, Stream, isUnlimited, () const, core.unlimited)
OPERATION(unsigned long, Stream, getDataAvailable, () const, core.number)
OPERATION(unsigned long, Stream, getSpaceAvailable, () const, core.number)

InputStream::InputStream(std::unique_ptr<Impl> state) : Stream(std::move(state)) {}
InputStream::~InputStream() = default;
FUNCTION(bool InputStream::isInput() const, return Stream::isInput())
OPERATION(bool, InputStream, isDeviceDone, () const, core.flag)
OPERATION(unsigned long, InputStream, getCountDimension, () const, core.number)

// NOLINTBEGIN(readability-make-member-function-const): the core's headers fix them.
void InputStream::peekCounts(unsigned long limit, unsigned long& total,
                             std::vector<unsigned long>& counts)
{
    called(side(this), "peekCounts", limit);
    total = core.number;
    counts = core.counts;
}

void InputStream::read(unsigned long count, std::vector<void*>& buffers, unsigned long&)
{
    called(side(this), "read", count);
    buffers.swap(core.delivery);
}
// NOLINTEND(readability-make-member-function-const)

OutputStream::OutputStream(std::unique_ptr<Impl> state) : Stream(std::move(state)) {}
OutputStream::~OutputStream() = default;
FUNCTION(bool OutputStream::isInput() const, return Stream::isInput())
OPERATION(bool, OutputStream, isDeviceDone, () const, core.flag)
OPERATION(unsigned long, OutputStream, getCountDimension, () const, core.number)
OPERATION(unsigned long, OutputStream, write, (const std::vector<void*>& list), core.number, list)

} // namespace brenixcore
