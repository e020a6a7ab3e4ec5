// The commands read and write.

#include "Commands.hpp"
#include "brenixcoder/coder.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <iostream>
#include <thread>
#include <tuple>

namespace brenix
{

namespace
{

/// What of the two limits is there: counts if the rate tells how many, or else time.
std::pair<double, double> extent(const Settings& settings, double rate)
{
    if (rate > 0 && std::isfinite(settings.seconds)) {
        return {std::min(settings.counts, std::max(std::round(settings.seconds * rate), 1.0)),
                INFINITY};
    }
    return {settings.counts, settings.seconds};
}

void summarise(const Settings& settings, const char* verb, double counts, double seconds)
{
    if (settings.json) {
        printJson(std::cerr, {{"counts", static_cast<std::int64_t>(counts)},
                              {"seconds", seconds},
                              {"interrupted", isInterrupted()}});
    } else if (!settings.quiet) {
        std::fprintf(stderr, "%s %.0f counts in %.3g s%s\n", verb, counts, seconds,
                     isInterrupted() ? ", interrupted" : "");
    }
}

} // namespace

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

Reading::Reading(Channel& openChannel, const Settings& settings, double rate)
    : channel(openChannel), fieldNames(settings.fields)
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
    const double ready = channel.nextBuffer(std::min(mostCounts - counts, 65536.0));
    if (ready == 0) {
        done = deviceDone;
        if (!done) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        return 0;
    }
    if (fields.empty()) {
        fields = channel.findFields(fieldNames, ready);
    }
    for (Field& field : fields) {
        channel.readField(field, ready);
    }
    counts += ready;
    return static_cast<std::size_t>(ready);
}

ExitCode readSamples(const Settings& given)
{
    Settings settings = given;
    settleFormat(settings.file);
    Channel channel(settings.channel, Use::Read);
    settings.file.rate = countRate(channel, settings.file);
    channel.open(settings.channel);
    tellPort(channel, settings);
    Reading reading(channel, settings, settings.file.rate);
    const double most = reading.getMostCounts();
    Progress progress(std::min(most, channel.number("Frames", "int64").value_or(INFINITY)),
                      settings.quiet);
    std::unique_ptr<SampleWriter> writer;
    const auto failure = caught([&] {
        while (!reading.isOver()) {
            if (const std::size_t counts = reading.next(); counts > 0) {
                if (!writer) {
                    writer = openWriter(settings.file, reading.getFields());
                }
                writer->write(reading.getFields(), counts);
                progress.update(reading.getCounts());
            }
            if (channel.hasDeviceError()) { // finish() throws it
                reading.endWithAvailable();
            }
        }
    });
    progress.finish();
    const double seconds = reading.getSeconds();
    const auto unwritten = caught([&] {
        if (writer) {
            writer->finish(); // what came before a failure is kept
        }
    });
    channel.finish(failure ? failure : unwritten);
    if (!writer && !isInterrupted()) {
        throw Failure("", "the device delivered nothing");
    }
    if (writer && !settings.emitC.empty()) {
        emitRead(settings, reading.getFields(), most, reading.getMostSeconds());
    }
    summarise(settings, "read", reading.getCounts(), seconds);
    return isInterrupted() ? Interrupted : Success;
}

ExitCode writeSamples(const Settings& given)
{
    Settings settings = given;
    settleFormat(settings.file);
    const ElementType& type = elementType(settings.type);
    const auto reader = openReader(settings.file, type);
    const std::size_t columns = reader->getColumns();
    // What the device delivers is thrown away: it must not wait for room.
    settings.channel.inputLimit = INFINITY;
    settings.channel.outputLimit =
        std::max(settings.channel.outputLimit, static_cast<double>(settings.block * columns));
    Channel channel(settings.channel, Use::Write);
    void* const output = channel.outputStream();
    const bool hasInput = channel.isSupported(channel.inputStream());
    double rate = settings.file.rate > 0 ? settings.file.rate : reader->getRate();
    rate = rate > 0 ? rate : countRate(channel, settings.file);
    double most = 0;
    double mostSeconds = 0;
    std::tie(most, mostSeconds) = extent(settings, rate);
    channel.open(settings.channel);

    const auto start = std::chrono::steady_clock::now();
    const double total = reader->getTotalRows();
    Progress progress(std::min(most, total > 0 ? total : INFINITY), settings.quiet);
    double rows = 0;
    Bytes elements;
    const auto failure = caught([&] {
        while (rows < most && secondsSince(start) < mostSeconds && !isInterrupted()) {
            elements.clear();
            const double room = std::min(most - rows, static_cast<double>(settings.block));
            const auto bad =
                caught([&] { reader->read(static_cast<std::size_t>(room), elements); });
            const std::size_t count = elements.size() / (columns * type.size);
            if (bad && count == 0) {
                throw Failure(*bad);
            }
            if (count == 0) {
                break;
            }
            if (channel.isDone(output)) {
                throw Failure("", "the device takes no more, after " +
                                      std::to_string(static_cast<long>(rows)) + " counts");
            }
            double written = 0;
            channel.check(coderOutputStreamWriteTypedDataOld(
                output, &written, 1, type.name,
                CODER_BUFFER(elements.size() / type.size, elements.data())));
            if (hasInput) {
                channel.check(coderStreamFlush(channel.inputStream()));
            }
            rows += static_cast<double>(count);
            progress.update(rows);
            if (bad) { // after the rows before it
                throw Failure(*bad);
            }
            if (channel.hasDeviceError()) { // finish() throws it
                break;
            }
        }
    });
    progress.finish();
    channel.finish(failure);
    if (!settings.emitC.empty()) {
        emitWrite(settings, *reader, hasInput, most, mostSeconds);
    }
    summarise(settings, "wrote", rows, secondsSince(start));
    return isInterrupted() ? Interrupted : Success;
}

} // namespace brenix
