// The commands read and write.

#include "Described.hpp"
#include "brenixcoder/coder.h"
#include "commands/Commands.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <iostream>
#include <tuple>

namespace brenix
{

namespace
{

/// Of a buffer, which has them in one piece.
constexpr std::size_t mostBlockElements = 1 << 27;

/// Losses are those of an input stream.
void summarise(const Settings& settings, const char* verb, double counts, double seconds,
               std::optional<double> lost = {})
{
    if (settings.json) {
        Json summary = {{"counts", static_cast<std::int64_t>(counts)}};
        if (lost) {
            summary["lost"] = static_cast<std::int64_t>(*lost);
        }
        summary["seconds"] = seconds;
        summary["interrupted"] = isInterrupted();
        printJson(std::cerr, summary);
    } else if (!settings.quiet) {
        std::fprintf(stderr, "%s %.0f counts in %.3g s", verb, counts, seconds);
        if (lost.value_or(0) > 0) {
            std::fprintf(stderr, ", lost %.0f", *lost);
        }
        std::fputs(isInterrupted() ? ", interrupted\n" : "\n", stderr);
    }
}

/// Null for a name that is none.
const ElementType* typeNamed(const std::string& name)
{
    const auto& types = elementTypes();
    const auto type = std::find_if(types.begin(), types.end(),
                                   [&](const ElementType& known) { return known.name == name; });
    return type == types.end() ? nullptr : &*type;
}

/// The element type that is asked for or that the plug-ins take; null when nobody tells one.
const ElementType* typeToWrite(const Settings& settings)
{
    if (!settings.type.empty()) {
        return &elementType(settings.type);
    }
    for (const DescribedValue& field : describe(settings.channel).outputFields) {
        if (field.name == "data") {
            return typeNamed(field.type);
        }
    }
    return nullptr;
}

/// The fields of a device that was done before it delivered any, as far as it tells.
std::vector<Field> describedFields(Channel& channel, const Settings& settings)
{
    const auto channels =
        static_cast<std::size_t>(channel.number("Channels", "uint32").value_or(1));
    std::vector<Field> fields;
    const auto add = [&](const std::string& name, const ElementType* type, std::size_t perCount) {
        Field& field = fields.emplace_back();
        field.name = name;
        field.type = type != nullptr ? type : &elementType("double");
        field.perCount = perCount;
    };
    if (settings.time) {
        add("Index", &elementType("uint64"), 1);
        add("Time", &elementType("int64"), 1);
    }
    if (!settings.fields.empty()) {
        for (const std::string& name : settings.fields) {
            add(name, nullptr, 1);
        }
        return fields;
    }
    for (const DescribedValue& described : describe(settings.channel).inputFields) {
        const ElementType* const type = typeNamed(described.type);
        const std::size_t mark = described.name.find('#');
        if (mark == std::string::npos) {
            add(described.name, type, described.name == "data" ? channels : 1);
            continue;
        }
        for (std::size_t i = 1; i <= channels; ++i) {
            add(std::string(described.name).replace(mark, 1, std::to_string(i)), type, 1);
        }
    }
    if (fields.empty()) {
        add("data", nullptr, channels);
    }
    return fields;
}

} // namespace

ExitCode readSamples(const Settings& given)
{
    Settings settings = given;
    if (settings.time) {
        settings.channel.options.emplace_back("Stamps:logical=1");
    }
    settleFormat(settings.file);
    if (settings.time && settings.file.format != "csv") { // it has columns of several types
        throw std::invalid_argument("--time needs csv, not " + settings.file.format);
    }
    if (settings.emitC == "-" && settings.file.isPipe()) {
        throw std::invalid_argument(
            "samples and --emit-c - cannot both go to the standard output: give --to FILE");
    }
    Channel channel(settings.channel, Use::Read);
    settings.file.rate = countRate(channel, settings.file);
    channel.open(settings.channel);
    tellPort(channel, settings);
    Reading reading(channel, settings, settings.file.rate);
    const double most = reading.getMostCounts();
    Progress progress(std::min(most, channel.number("Frames", "int64").value_or(INFINITY)),
                      settings.quiet);
    std::unique_ptr<SampleWriter> writer;
    double written = 0;
    bool isLossTold = false;
    std::optional<Failure> ended; // the device's error, after which what came before it is read
    const auto failure = caught([&] {
        while (!reading.isOver()) {
            if (const std::size_t counts = reading.next(); counts > 0) {
                if (!writer) {
                    writer = openWriter(settings.file, reading.getFields());
                }
                if (!writer) {
                    break; // an interruption, before somebody read the FIFO
                }
                writer->write(reading.getFields(), counts);
                written = reading.getCounts();
                progress.update(written);
            }
            if (const auto error = channel.deviceError(); error && error->isPassing()) {
                progress.finish();
                report(settings, *error);
                isLossTold = isLossTold || error->isLoss();
            } else if (error) {
                ended = error;
                reading.endWithAvailable();
            }
        }
        if (ended) {
            throw Failure(*ended);
        }
    });
    progress.finish();
    const double seconds = reading.getSeconds();
    std::vector<Field> fields = reading.getFields();
    const auto unwritten = caught([&] {
        if (!writer && !failure && !isInterrupted() && !channel.hasDeviceError()) {
            fields = describedFields(channel, settings);
            writer = openWriter(settings.file, fields); // it is empty, and a file
        }
        if (writer) {
            writer->finish(); // what came before a failure is kept
        }
    });
    std::vector<Failure> passing;
    channel.finish(failure ? failure : unwritten, &passing);
    for (const Failure& one : passing) {
        report(settings, one);
        isLossTold = isLossTold || one.isLoss();
    }
    const double lost = channel.number("LostCounts", "uint64").value_or(0);
    if (writer && !settings.emitC.empty()) {
        emitRead(settings, fields, most, reading.getMostSeconds(), reading.getListed());
    }
    summarise(settings, "read", written, seconds, lost);
    if (settings.failOnLoss && (isLossTold || lost > 0)) {
        return Failed;
    }
    return isInterrupted() ? Interrupted : Success;
}

ExitCode writeSamples(const Settings& given)
{
    Settings settings = given;
    settleFormat(settings.file);
    const auto reader = openReader(settings.file, typeToWrite(settings));
    const ElementType& type = reader->getType();
    const std::size_t columns = reader->getColumns();
    if (settings.block * columns > mostBlockElements) {
        throw std::invalid_argument("--block: " + std::to_string(settings.block) + " counts of " +
                                    std::to_string(columns) + " columns are more than " +
                                    std::to_string(mostBlockElements) + " elements");
    }
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
            if (const auto error = channel.deviceError()) {
                if (error->isLoss() || !error->isPassing()) {
                    channel.leave(*error);
                    break;
                }
                progress.finish();
                report(settings, *error); // somebody was not let in
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
