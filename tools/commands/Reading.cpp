// Reading from a channel, buffer by buffer, for the commands read and scope.

#include "commands/Commands.hpp"

#include <algorithm>
#include <cmath>
#include <iostream>
#include <thread>
#include <tuple>

namespace brenix
{

std::pair<double, double> extent(const Settings& settings, double rate)
{
    if (rate > 0 && std::isfinite(settings.seconds)) {
        return {std::min(settings.counts, std::max(std::round(settings.seconds * rate), 1.0)),
                INFINITY};
    }
    return {settings.counts, settings.seconds};
}

double countRate(Channel& channel, const SampleFile& file)
{
    return file.rate > 0 ? file.rate : channel.number("SampleRate", "double").value_or(0);
}

std::optional<long> chosenPort(Channel& channel, const ChannelSettings& settings)
{
    const auto port = channel.number("LocalPort", "uint16");
    const bool isGiven = std::any_of(
        settings.options.begin(), settings.options.end(), [](const std::string& option) {
            return option.rfind("LocalPort", 0) == 0 && option.substr(option.find('=')) != "=0";
        });
    return port && !isGiven ? std::optional(std::lround(*port)) : std::nullopt;
}

void tellPort(Channel& channel, const Settings& settings)
{
    const auto port = chosenPort(channel, settings.channel);
    if (port && settings.json) {
        printJson(std::cerr, {{"LocalPort", *port}});
    } else if (port && !settings.quiet) {
        std::cerr << settings.channel.device << ": LocalPort " << *port << '\n';
    }
}

Reading::Reading(Channel& openChannel, const Settings& settings, double signalRate)
    : channel(openChannel), fieldNames(settings.fields), hasTime(settings.time), rate(signalRate)
{
    std::tie(mostCounts, mostSeconds) = extent(settings, rate);
}

bool Reading::isOver() const
{
    return done || counts >= mostCounts || getSeconds() >= mostSeconds || isInterrupted();
}

std::size_t Reading::next()
{
    // Asked before: a device that is done adds nothing to what is then there.
    const bool deviceDone = channel.isDone(channel.inputStream());
    const double ready = channel.nextBuffer(std::min(mostCounts - counts, listed));
    if (ready == 0) {
        done = deviceDone;
        if (!done) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        return 0;
    }
    if (fields.empty()) {
        findFields(ready);
    }
    for (Field& field : fields) {
        channel.readField(field, ready);
    }
    counts += ready;
    listed = std::max(listed, std::min(2 * ready, 524288.0));
    return static_cast<std::size_t>(ready);
}

void Reading::findFields(double ready)
{
    if (hasTime) {
        fields = channel.findFields({"Index", "Time"}, ready);
        fields[0].step = 1;
        fields[1].step = rate > 0 ? 1e9 / rate : 0;
        for (Field& field : fields) {
            field.isRepeated = true; // also if the first buffer has one count
        }
    }
    const std::vector<Field> others = channel.findFields(fieldNames, ready);
    fields.insert(fields.end(), others.begin(), others.end());
}

} // namespace brenix
