#include "Channel.hpp"

#include "Described.hpp"
#include "brenixcoder/coder.h"
#include "brenixcore/plugin/Inspect.hpp"

#include <array>
#include <tuple>
#include <utility>

namespace brenix
{

namespace
{

/// Calls a function that ends with an option list. The list always has maxOptions options: what is
/// behind the number that is told is not looked at.
template <typename Call>
int callWithOptions(const std::vector<Option>& options, const Call& call)
{
    std::array<std::tuple<const char*, const char*, int, const void*>, maxOptions> list;
    for (std::size_t i = 0; i < options.size(); ++i) {
        list.at(i) = {options[i].name.c_str(), options[i].type->name, options[i].count,
                      options[i].elements.data()};
    }
    return std::apply([&](auto... arguments) { return call(options.size(), arguments...); },
                      std::apply([](auto... option) { return std::tuple_cat(option...); }, list));
}

/// Where plug-ins of a kind are given.
std::string placeOf(const std::string& kind)
{
    return kind == "Device"      ? "devices are given first"
           : kind == "Converter" ? "converters are given with -c"
                                 : "filters are given with -f";
}

/// Adds to the error of a channel that could not be made, and so tells no reason, which plug-in did not load,
/// and why.
Failure explained(const std::string& id, std::string message, const ChannelSettings& settings)
{
    for (const auto& [name, kind] :
         {std::pair(settings.converter, "Converter"), std::pair(settings.device, "Device")}) {
        if (!message.empty()) {
            break;
        }
        const auto report = brenixcore::plugin::inspectPlugin(name, kind);
        message = report.message;
        if (!message.empty() && message.rfind(report.path, 0) != 0) {
            message.insert(0, name + ": ");
        }
        if (report.problem == "otherKind") {
            message += "; " + placeOf(report.kind);
        }
    }
    return {id, message};
}

} // namespace

std::optional<Failure> caught(const std::function<void()>& work)
{
    try {
        work();
    } catch (const Failure& failure) {
        return failure;
    }
    return std::nullopt;
}

Channel::Channel(const ChannelSettings& settings, Use use)
{
    std::array<char, CODER_ERROR_SIZE> id{};
    std::array<char, CODER_ERROR_SIZE> message{};
    handle = coderChannelCreate(settings.device.c_str(), settings.converter.c_str(), id.data(),
                                message.data(), settings.inputLimit, settings.outputLimit);
    if (handle == nullptr) {
        throw explained(id.data(), message.data(), settings);
    }
    try {
        initialise(settings, use);
    } catch (...) {
        release();
        throw;
    }
}

void Channel::initialise(const ChannelSettings& settings, Use use)
{
    check(callWithOptions(parseOptions(settings.options, settings.device),
                          [&](auto... list) { return coderChannelInit(handle, list...); }));
    input = coderChannelGetInputStream(handle);
    output = coderChannelGetOutputStream(handle);
    void* const used = use == Use::Write ? output : input;
    if (use == Use::Read) {
        for (const auto& field : describe(settings).inputFields) {
            inputFields.push_back(field.name);
        }
    }
    if (use != Use::Look && !isSupported(used)) {
        throw Failure("", settings.device + " has no " + (used == output ? "output" : "input") +
                              " stream with these options: it cannot be " +
                              (used == output ? "written to" : "read"));
    }
    for (const std::string& text : settings.filters) {
        const FilterSettings filter = parseFilter(text);
        check(callWithOptions(filter.options, [&](auto... list) {
            return coderStreamAddFilter(used, filter.name.c_str(), list...);
        }));
    }
}

Channel::~Channel()
{
    release();
}

void Channel::release() noexcept
{
    coderChannelClose(handle); // these two do nothing when there is nothing to do
    coderChannelTerm(handle);
    coderChannelDestroy(handle);
}

void Channel::open(const ChannelSettings& settings)
{
    check(callWithOptions(parseOptions(settings.openOptions, ""),
                          [&](auto... list) { return coderChannelOpen(handle, list...); }));
}

void Channel::execute(const std::string& command, const std::vector<std::string>& options)
{
    check(callWithOptions(parseOptions(options, ""), [&](auto... list) {
        return coderChannelExecute(handle, command.c_str(), list...);
    }));
}

void Channel::finish(const std::optional<Failure>& failure, std::vector<Failure>* passing)
{
    std::vector<Failure> failures;
    const auto add = [&](const std::optional<Failure>& one) {
        if (one) {
            (passing != nullptr && one->isPassing() ? *passing : failures).push_back(*one);
        }
    };
    add(left);
    add(deviceError());
    const auto ended = failure ? failure : caught([&] {
        std::uint8_t isOpen = 0;
        check(coderChannelIsOpen(handle, &isOpen));
        if (isOpen != 0) {
            check(coderChannelClose(handle));
        }
    });
    coderChannelClose(handle);
    add(deviceError()); // some are told only now
    add(ended);
    if (!failures.empty()) {
        std::string message = failures[0].what();
        for (std::size_t i = 1; i < failures.size(); ++i) {
            message += "; also: " + failures[i].text();
        }
        throw Failure(failures[0].getId(), message);
    }
    check(coderChannelTerm(handle));
}

Failure Channel::lastError() const
{
    std::array<char, CODER_ERROR_SIZE> id{};
    std::array<char, CODER_ERROR_SIZE> message{};
    coderChannelGetLastError(handle, id.data(), message.data());
    if (id[0] == '\0') { // then a plug-in raised an error inside the call
        coderChannelGetLastSyncError(handle, id.data(), message.data());
    }
    if (message[0] == '\0') { // then the core may know why
        coderChannelGetPropertyValue(handle, "Reason", "char", CODER_ERROR_SIZE, message.data());
    }
    return {id.data(), message.data()};
}

void Channel::check(int result)
{
    if (result == 0) {
        throw lastError();
    }
}

bool Channel::hasDeviceError()
{
    std::uint8_t hasError = 0;
    check(coderChannelHasAsyncError(handle, &hasError));
    return hasError != 0;
}

std::optional<Failure> Channel::deviceError()
{
    if (!hasDeviceError()) {
        return std::nullopt;
    }
    std::array<char, CODER_ERROR_SIZE> id{};
    std::array<char, CODER_ERROR_SIZE> message{};
    coderChannelGetLastAsyncError(handle, id.data(), message.data());
    return Failure(id.data(), message.data());
}

double Channel::inputAvailable()
{
    double available = 0;
    check(coderStreamGetDataAvailable(input, &available));
    return available;
}

bool Channel::isSupported(void* stream)
{
    std::uint8_t supported = 0;
    check(coderStreamIsSupported(stream, &supported));
    return supported != 0;
}

bool Channel::isDone(void* stream)
{
    std::uint8_t done = 0;
    check(coderStreamIsDeviceDone(stream, &done));
    return done != 0;
}

double Channel::nextBuffer(double most)
{
    if (buffer == bufferCounts.size()) {
        double total = 0;
        double buffers = 4096;
        bufferCounts.resize(4096);
        buffer = 0;
        const int peeked = coderInputStreamPeek(input, &total, bufferCounts.data(), &buffers, most);
        bufferCounts.resize(peeked == 0 ? 0 : static_cast<std::size_t>(buffers));
        check(peeked);
        if (bufferCounts.empty()) {
            return 0;
        }
    }
    const double counts = bufferCounts[buffer++];
    check(coderInputStreamReadBuffers(input, counts, 1));
    return counts;
}

} // namespace brenix
