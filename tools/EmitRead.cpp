// Writes the C program of the command read.

#include "EmitC.hpp"

#include <algorithm>

namespace brenix
{

namespace
{

constexpr std::string_view readProgram = R"(
static const char* name; /* of the file */
@INFO@enum { MOST = @MOST@, BUFFERS = 4096 }; /* counts of a buffer, and buffers, at most, of one peek */
@FIELDS@@DISK@@PRINT@@ITEM@
static int writeCounts(@FILE@* file, int counts)
{
@REPEAT@@WRITE@}
@CLOCK@
static int transfer(void* channel, @FILE@* file)
{
    const struct timespec pause = {0, 1000000};
    void* const input = coderChannelGetInputStream(channel);
    double left = @COUNTS@;
    int ok = 1;
@START@    while (left > 0.0@TIME@) {
        uint8_t done = 0;
        double total = 0.0;
        static double counts[BUFFERS];
        double buffers = BUFFERS;
        /* Asked before the peek: a device that is done adds nothing to what the peek then sees. */
        if (!check(channel, "coderStreamIsDeviceDone", coderStreamIsDeviceDone(input, &done)) ||
            !check(channel, "coderInputStreamPeek",
                   coderInputStreamPeek(input, &total, counts, &buffers,
                                        left < MOST ? left : MOST))) {
            return 0;
        }
        for (int buffer = 0; buffer < (int)buffers; ++buffer) {
            const int count = (int)counts[buffer];
            if (!check(channel, "coderInputStreamReadBuffers",
                       coderInputStreamReadBuffers(input, count, 1.0)) ||
                @READ@!writeCounts(file, count)) {
                return 0;
            }
            left -= count;
        }
        if (buffers == 0.0 && done) {
            break;
        }
        if (buffers == 0.0) {
            (void)nanosleep(&pause, NULL);
        }
        if (ok && !checkDevice(channel)) { /* then take what came before the error */
            ok = 0;
            if (!check(channel, "coderStreamGetDataAvailable",
                       coderStreamGetDataAvailable(input, &total))) {
                return 0;
            }
            left = total < left ? total : left;
        }
    }
    return ok;
}
)";

constexpr std::string_view readField = R"(!check(channel, "coderInputStreamReadBufferData",
                       coderInputStreamReadBufferData(input, 1, 0, @NAME@, @TYPE@, count@TIMES@,
                                                      @ARRAY@)) ||
                )";

constexpr std::string_view repeatField = R"(    for (int row = 1; row < counts; ++row) {
        @ARRAY@[row] = @ARRAY@[0]@STEP@;
    }
)";

constexpr std::string_view clipItem = R"(
static long clipped; /* samples */

/* Full scale for what is beyond it, and 0 for what is no number. */
static @CTYPE@ toItem(@CTYPE@ sample)
{
    if (fabs(sample) <= 1.0) {
        return sample;
    }
    ++clipped;
    return isnan(sample) ? 0 : (@CTYPE@)copysign(1.0, sample);
}
)";

constexpr std::string_view tellClipped = R"(    if (clipped > 0) {
        fprintf(stderr, "%s: %ld samples beyond full scale were cut off\n", name, clipped);
        ok = 0;
    }
)";

constexpr std::string_view writeSound = R"(    static @ITEMTYPE@ frames[MOST * @COLUMNS@];
    int item = 0;
    for (int row = 0; row < counts; ++row) {
@ROW@    }
@LIMIT@    return sf_writef_@ITEMTYPE@(file, frames, counts) == counts && !ferror(disk);
)";

constexpr std::string_view limitSound = R"(    if ((double)ftello(disk) > @BYTES@) {
        fprintf(stderr, "%s: a file of format @FORMAT@ ends at 4 GiB\n", name);
        return 0;
    }
)";

/// How a row goes to the file: statements for each field.
std::string rowStatements(const std::vector<Field>& fields, const std::string& format,
                          const std::string& toItem)
{
    std::string statements;
    for (std::size_t f = 0; f < fields.size(); ++f) {
        const ElementType& type = *fields[f].type;
        const bool isScalar = fields[f].perCount == 1;
        const std::string perCount = std::to_string(fields[f].perCount);
        const std::string array = "field" + std::to_string(f + 1);
        const std::string element = array + "[row" + (isScalar ? "]" : " * " + perCount + " + i]");
        if (format == "raw") {
            statements += "        if (fwrite(&" + array + "[row * " + perCount + "], sizeof(" +
                          array + "[0]), " + perCount + ", file) != " + perCount +
                          ") {\n            return 0;\n        }\n";
            continue;
        }
        std::string statement;
        if (format == "csv") {
            if (f > 0) {
                statement = "putc(',', file);\n";
            } else if (!isScalar) {
                statement = "fputs(i == 0 ? \"\" : \",\", file);\n";
            }
            statement += (statement.empty() ? ""
                          : isScalar        ? "        "
                                            : "            ") +
                         printElement(type, "file", element);
        } else {
            statement = "frames[item++] = " + fill(toItem, {{"ELEMENT", element}}) + ";\n";
        }
        statements += isScalar ? "        " + statement
                               : "        for (int i = 0; i < " + perCount +
                                     "; ++i) {\n            " + statement + "        }\n";
    }
    return statements;
}

void addSound(const Settings& settings, const std::vector<Field>& fields, const SF_INFO& info,
              Values& values)
{
    const ElementType& type = *fields[0].type;
    std::string toItem = "@ELEMENT@";
    if (isFloating(type) && hasFullScale(info)) {
        values["ITEM"] = fill(clipItem, {{"CTYPE", type.cName}});
        values["CLOSED"] = tellClipped;
        toItem = "toItem(@ELEMENT@)";
    } else if (type.size == 1) {
        toItem = type.name == std::string_view("int8") ? "(short)(@ELEMENT@ * 256)"
                                                       : "(short)((@ELEMENT@ - 128) * 256)";
    }
    const SoundFormat& format = *findSoundFormat(settings.file.format);
    if (!format.isLarge) {
        const auto most = std::stod(values["MOST"]) * static_cast<double>(rowSize(fields));
        values["LIMIT"] = fill(limitSound, {{"BYTES", constant(mostBytes(format, most))},
                                            {"FORMAT", std::string(format.name)}});
    }
    values["WRITE"] = fill(writeSound, {{"ITEMTYPE", soundType(type).item},
                                        {"COLUMNS", std::to_string(info.channels)},
                                        {"ROW", rowStatements(fields, "sound", toItem)},
                                        {"LIMIT", values["LIMIT"]}});
    values["START"] = "    (void)sf_command(file, SFC_SET_CLIPPING, NULL, SF_TRUE);\n"
                      "    (void)sf_command(file, SFC_SET_ADD_PEAK_CHUNK, NULL, SF_FALSE);\n";
    if (startsWithHeader(format)) {
        values["START"] += "    (void)sf_command(file, SFC_UPDATE_HEADER_NOW, NULL, 0);\n";
    }
}

} // namespace

void emitRead(const Settings& settings, const std::vector<Field>& fields, double mostCounts,
              double mostSeconds, double mostListed)
{
    Values values = commonValues(settings, true, false);
    const std::string& format = settings.file.format;
    const std::size_t columns = columnNames(fields).size();
    values["MOST"] = std::to_string(std::clamp<std::size_t>(
        (1 << 24) / columns, 1, static_cast<std::size_t>(std::min(mostListed, 65536.0))));
    for (std::size_t f = 0; f < fields.size(); ++f) {
        const ElementType& type = *fields[f].type;
        const std::string array = "field" + std::to_string(f + 1);
        const std::string times =
            fields[f].perCount == 1 ? "" : " * " + std::to_string(fields[f].perCount);
        values["FIELDS"] +=
            "\nstatic " + std::string(type.cName) + " " + array + "[MOST" + times + "];";
        values["READ"] += fill(readField, {{"NAME", quote(fields[f].name)},
                                           {"TYPE", quote(type.name)},
                                           {"TIMES", times},
                                           {"ARRAY", array}});
        if (fields[f].isRepeated) { // a buffer has one for all its counts
            std::string step;
            if (fields[f].step > 0) { // as the command has it; 0 is no time
                step = std::string(" + (") + type.cName + ")(" +
                       (fields[f].name == "Time" ? "(" + array + "[0] != 0) * " : "") + "row * " +
                       constant(fields[f].step) + " + 0.5)";
            }
            values["REPEAT"] += fill(repeatField, {{"ARRAY", array}, {"STEP", step}});
        }
    }
    values["FIELDS"] += "\n";
    std::string soundFormat;
    if (findSoundFormat(format) != nullptr) {
        const SF_INFO info = soundInfo(settings.file, fields, soundFormat);
        soundFormat = ".samplerate = " + std::to_string(info.samplerate) +
                      ", .channels = " + std::to_string(info.channels) +
                      ", .format = " + soundFormat;
        addSound(settings, fields, info, values);
    } else {
        const std::string newline = format == "csv" ? "        putc('\\n', file);\n" : "";
        values["WRITE"] = "    for (int row = 0; row < counts; ++row) {\n" +
                          rowStatements(fields, format, "") + newline +
                          "    }\n    return !ferror(file);\n";
        if (format == "csv") {
            values["START"] = "    fputs(" + quote(csvHeader(fields)) + " \"\\n\", file);\n";
        }
    }
    if (!settings.failOnLoss) {
        values["START"] += "    lossIsFailure = 0; /* it is told, and the rest is read */\n";
    }
    addFile(settings, true, soundFormat, values);
    saveTransfer(settings, readProgram, mostCounts, mostSeconds, std::move(values));
}

} // namespace brenix
