#include "EmitC.hpp"

#include "CheckText.hpp"
#include "Commands.hpp"

#include <array>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <limits>
#include <map>
#include <string_view>

namespace brenix
{

namespace
{

using Values = std::map<std::string, std::string>;

/// Puts values in the place of @NAMES@.
std::string fill(std::string_view text, const Values& values)
{
    std::string filled;
    for (;;) {
        const std::size_t begin = text.find('@');
        filled += text.substr(0, begin);
        if (begin == std::string_view::npos) {
            return filled;
        }
        const std::size_t end = text.find('@', begin + 1);
        filled += values.at(std::string(text.substr(begin + 1, end - begin - 1)));
        text.remove_prefix(end + 1);
    }
}

/// A string literal.
std::string quote(std::string_view text)
{
    std::string literal = "\"";
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        if (std::isalnum(byte) != 0 ||
            std::string_view(" !#$&()*+,-./:;<=>[]^_{|}~").find(character) !=
                std::string_view::npos) {
            literal += character;
        } else {
            std::array<char, 8> octal{};
            std::snprintf(octal.data(), octal.size(), "\\%03o", static_cast<unsigned>(byte));
            literal += octal.data();
        }
    }
    return literal + '"';
}

/// A double constant.
std::string constant(double value)
{
    if (std::isnan(value)) {
        return "NAN";
    }
    if (std::isinf(value)) {
        return value > 0 ? "INFINITY" : "-INFINITY";
    }
    std::string text;
    elementType("double").print(reinterpret_cast<const unsigned char*>(&value), text);
    return text.find_first_of(".e") == std::string::npos ? text + ".0" : text;
}

bool isFloating(const ElementType& type)
{
    return type.cFormat[1] == '.';
}

/// The elements of an array.
std::string initialiser(const ElementType& type, const Bytes& elements)
{
    std::string list;
    for (std::size_t i = 0; i < elements.size(); i += type.size) {
        std::string element;
        type.print(&elements[i], element);
        if (isFloating(type)) {
            element = constant(type.toDouble(&elements[i]));
        } else if (element == std::to_string(std::numeric_limits<long>::min())) {
            element = "INT64_MIN";
        }
        list += (i == 0 ? "" : ", ") + element + (type.name == std::string("uint64") ? "U" : "");
    }
    return list;
}

/// Number and list of the options of a call. Their data go to `declarations`.
std::string optionList(const std::vector<Option>& options, const std::string& prefix,
                       std::string& declarations)
{
    std::string list = std::to_string(options.size());
    int number = 0; // names may be the same, or once they are identifiers
    for (const Option& option : options) {
        std::string data;
        ++number;
        if (option.type->isText) {
            data = quote(std::string_view(reinterpret_cast<const char*>(option.elements.data()),
                                          option.elements.size()));
        } else {
            data = prefix + std::to_string(number) + "_" + option.name;
            for (char& character : data) {
                character =
                    std::isalnum(static_cast<unsigned char>(character)) != 0 ? character : '_';
            }
            declarations += "    static const " + std::string(option.type->cName) + " " + data +
                            "[] = {" + initialiser(*option.type, option.elements) + "};\n";
        }
        list += ",\n                CODER_OPTION(" + quote(option.name) + ", " +
                quote(option.type->name) + ", " + std::to_string(option.count) + ", " + data + ")";
    }
    return list;
}

constexpr std::string_view start = R"(/*
 * Made by: @COMMAND@
 *
 *     cc -std=c99 program.c @LIBRARIES@ -o program
 *
@USAGE@ */
#define _POSIX_C_SOURCE 199309L

#include <brenixcoder/coder.h>

#include <math.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
@INCLUDE@
@CHECK@

/* Initialises the channel and adds its filters. */
static int setUp(void* channel)
{
@SETUP_DATA@    return check(channel, "coderChannelInit",
            coderChannelInit(channel, @INIT@))@FILTERS@;
}
)";

constexpr std::string_view openFunction = R"(
static int openChannel(void* channel)
{
@OPEN_DATA@    return check(channel, "coderChannelOpen",
            coderChannelOpen(channel, @OPEN@));
}
)";

constexpr std::string_view filter = R"( &&
           check(channel, "coderStreamAddFilter",
            coderStreamAddFilter(coderChannelGet@STREAM@Stream(channel), @NAME@, @LIST@)))";

constexpr std::string_view clockFunction = R"(
static double now(void)
{
    struct timespec time;
    clock_gettime(CLOCK_MONOTONIC, &time);
    return (double)time.tv_sec + 1e-9 * (double)time.tv_nsec;
}
)";

constexpr std::string_view readProgram = R"(
enum { MOST = 4096 }; /* counts of one buffer */
@FIELDS@@PRINT@
static int writeCounts(@FILE@* file, int counts)
{
@WRITE@}
@CLOCK@
static int transfer(void* channel, @FILE@* file)
{
    const struct timespec pause = {0, 1000000};
    void* const input = coderChannelGetInputStream(channel);
    double left = @COUNTS@;
@START@    while (left > 0.0@TIME@) {
        uint8_t done = 0;
        double total = 0.0;
        double counts = 0.0;
        double buffers = 1.0;
        /* Asked before the peek: a device that is done adds nothing to what the peek then sees. */
        if (!check(channel, "coderStreamIsDeviceDone", coderStreamIsDeviceDone(input, &done)) ||
            !check(channel, "coderInputStreamPeek",
                   coderInputStreamPeek(input, &total, &counts, &buffers,
                                        left < MOST ? left : MOST))) {
            return 0;
        }
        if (buffers > 0.0) {
            if (!check(channel, "coderInputStreamReadBuffers",
                       coderInputStreamReadBuffers(input, counts, 1.0))@READ@) {
                return 0;
            }
            if (!writeCounts(file, (int)counts)) {
                fputs("The samples could not be written.\n", stderr);
                return 0;
            }
            left -= counts;
        } else if (done) {
            break;
        } else {
            (void)nanosleep(&pause, NULL);
        }
        if (!checkDevice(channel)) {
            return 0;
        }
    }
    return 1;
}
)";

constexpr std::string_view readField = R"( ||
                !check(channel, "coderInputStreamReadBufferData",
                       coderInputStreamReadBufferData(input, 1, 0, @NAME@, @TYPE@,
                                                      (int)counts * @PERCOUNT@, @ARRAY@)))";

constexpr std::string_view printFunction = R"(
/* With as few digits as tell the value. */
static void printNumber(FILE* file, double value, int isFloat)
{
    char text[32];
    int digits = isFloat ? 6 : 15;
    const int most = isFloat ? 9 : 17;
    do {
        (void)snprintf(text, sizeof(text), "%.*g", digits, value);
    } while (digits++ < most && (isFloat ? (double)(float)strtod(text, NULL) : strtod(text, NULL)) != value);
    fputs(text, file);
}
)";

constexpr std::string_view writeProgram = R"(
enum { ROWS = @ROWS@, COLUMNS = @COLUMNS@ }; /* of one buffer */

static @CTYPE@ elements[ROWS * COLUMNS];

/* Reads up to `most` rows. Returns how many, 0 at the end, -1 on an error. */
static int readRows(@FILE@* file, int most)
{
@READ@}
@CLOCK@
static int transfer(void* channel, @FILE@* file)
{
    void* const output = coderChannelGetOutputStream(channel);
    double left = @COUNTS@;
@START@    while (left > 0.0@TIME@) {
        uint8_t done = 0;
        double written = 0.0;
        const int rows = readRows(file, left < ROWS ? (int)left : ROWS);
        if (rows == 0) {
            break;
        }
        if (rows < 0) {
            fputs("The samples could not be read.\n", stderr);
            return 0;
        }
        if (!check(channel, "coderStreamIsDeviceDone", coderStreamIsDeviceDone(output, &done))) {
            return 0;
        }
        if (done) {
            fputs("The device takes no more.\n", stderr);
            return 0;
        }
        if (!check(channel, "coderOutputStreamWriteTypedDataOld",
                   coderOutputStreamWriteTypedDataOld(output, &written, 1, @TYPE@,
                                                      CODER_BUFFER(rows * COLUMNS, elements)))@FLUSH@ ||
            !checkDevice(channel)) {
            return 0;
        }
        left -= rows;
    }
    return 1;
}
)";

constexpr std::string_view flushInput = R"( ||
            !check(channel, "coderStreamFlush",
                   coderStreamFlush(coderChannelGetInputStream(channel))))";

constexpr std::string_view fileMain = R"(
int main(int argc, char** argv)
{
    const char* const name = argc > 1 ? argv[1] : @NAME@;
    void* channel;
    int ok;
@INFO@    @FILE@* const file = @OPENFILE@;
    if (file == NULL) {
        fprintf(stderr, "%s cannot be opened.\n", name);
        return EXIT_FAILURE;
    }
    channel = createChannel(@DEVICE@, @CONVERTER@, @INLIMIT@, @OUTLIMIT@);
    ok = channel != NULL && setUp(channel) && openChannel(channel) && transfer(channel, file);
    ok = finishChannel(channel) && ok;
    if (@CLOSE@(file) != 0) {
        fprintf(stderr, "%s cannot be closed.\n", name);
        ok = 0;
    }
    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
)";

constexpr std::string_view infoProgram = R"(
static int printStream(void* channel, const char* name, void* stream)
{
    uint8_t supported = 0;
    double dimension = 0.0;
    if (!check(channel, "coderStreamIsSupported", coderStreamIsSupported(stream, &supported))) {
        return 0;
    }
    if (!supported) {
        printf("%s: none\n", name);
        return 1;
    }
    if (!check(channel, "coderStreamGetCountDimension",
               coderStreamGetCountDimension(stream, &dimension))) {
        return 0;
    }
    printf("%s: counts along dimension %.0f\n", name, dimension);
    return 1;
}

static int printProperties(void* channel)
{
@PROPERTIES@    return 1;
}

int main(void)
{
    void* const channel = createChannel(@DEVICE@, @CONVERTER@, @INLIMIT@, @OUTLIMIT@);
    int ok = channel != NULL && setUp(channel) &&@OPENCALL@
             printStream(channel, "input", coderChannelGetInputStream(channel)) &&
             printStream(channel, "output", coderChannelGetOutputStream(channel)) &&
             printProperties(channel);
    ok = finishChannel(channel) && ok;
    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
)";

constexpr std::string_view propertyBlock = R"(    {
        @CTYPE@ value[@COUNT@];
        if (!check(channel, "coderChannelGetPropertyValue",
                   coderChannelGetPropertyValue(channel, @NAME@, @TYPE@, @COUNT@, value))) {
            return 0;
        }
        printf("%s: ", @NAME@);
@PRINT@        printf("%s\n", @UNIT@);
    }
)";

/// A statement that prints an element.
std::string printElement(const ElementType& type, const std::string& file,
                         const std::string& element)
{
    if (isFloating(type)) {
        return "printNumber(" + file + ", " + element + ", " +
               (type.name == std::string("float") ? "1" : "0") + ");\n";
    }
    return "fprintf(" + file + ", " + quote(type.cFormat) + ", " + element + ");\n";
}

/// What all programs have.
Values commonValues(const Settings& settings, bool output)
{
    const ChannelSettings& channel = settings.channel;
    Values values;
    std::string command = settings.commandLine;
    for (const char* const mark : {"*/", "/*"}) {
        for (std::size_t begin = 0; (begin = command.find(mark, begin)) != std::string::npos;) {
            command.insert(begin + 1, 1, ' ');
        }
    }
    values["COMMAND"] = command;
    values["LIBRARIES"] = "-lbrenixcoder";
    values["CHECK"] = checkText;
    values["INIT"] = optionList(parseOptions(channel.options), "init", values["SETUP_DATA"]);
    values["OPEN"] = optionList(parseOptions(channel.openOptions), "open", values["OPEN_DATA"]);
    for (std::size_t i = 0; i < channel.filters.size(); ++i) {
        const FilterSettings parsed = parseFilter(channel.filters[i]);
        values["FILTERS"] += fill(
            filter, {{"STREAM", output ? "Output" : "Input"},
                     {"NAME", quote(parsed.name)},
                     {"LIST", optionList(parsed.options, "filter" + std::to_string(i + 1) + "_",
                                         values["SETUP_DATA"])}});
    }
    values["DEVICE"] = quote(channel.device);
    values["CONVERTER"] = quote(channel.converter);
    values["INLIMIT"] = constant(channel.inputLimit);
    values["OUTLIMIT"] = constant(channel.outputLimit);
    values["NAME"] = quote(settings.file.name);
    for (const char* const empty : {"USAGE", "INCLUDE", "SETUP_DATA", "OPEN_DATA", "FILTERS",
                                    "CLOCK", "START", "TIME", "INFO", "PRINT", "FLUSH"}) {
        values[empty]; // makes it
    }
    return values;
}

/// How a program opens its file, and when it ends.
void addFile(const Settings& settings, bool writes, const std::string& wavFormat, double mostCounts,
             double mostSeconds, Values& values)
{
    const bool wav = settings.file.format == "wav";
    values["USAGE"] = std::string(" * usage: program [FILE], ") +
                      (writes ? "to which it writes samples\n" : "from which it takes samples\n");
    values["FILE"] = wav ? "SNDFILE" : "FILE";
    values["CLOSE"] = wav ? "sf_close" : "fclose";
    if (wav) {
        values["LIBRARIES"] += " -lsndfile";
        values["INCLUDE"] = "\n#include <sndfile.h>\n";
        values["INFO"] = "    SF_INFO info = {" + wavFormat + "};\n";
        values["OPENFILE"] =
            std::string("sf_open(name, ") + (writes ? "SFM_WRITE" : "SFM_READ") + ", &info)";
    } else {
        values["OPENFILE"] = std::string("strcmp(name, \"-\") == 0 ? ") +
                             (writes ? "stdout" : "stdin") + " : fopen(name, " +
                             (writes ? "\"wb\")" : "\"rb\")");
    }
    values["COUNTS"] = constant(mostCounts);
    if (std::isfinite(mostSeconds)) {
        values["CLOCK"] = clockFunction;
        values["START"] = "    const double started = now();\n";
        values["TIME"] = " && now() - started < " + constant(mostSeconds);
    }
}

void save(const Settings& settings, const std::string& program)
{
    std::ofstream file(settings.emitC);
    if (!(file << program).flush()) {
        throw Failure("", settings.emitC + ": cannot be written");
    }
}

} // namespace

void emitInfo(const Settings& settings, const std::vector<PropertyValue>& properties)
{
    Values values = commonValues(settings, false);
    values["OPENCALL"] = settings.open ? " openChannel(channel) &&" : "";
    for (const PropertyValue& property : properties) {
        const ElementType& type = *property.type;
        const std::size_t count = property.elements.size() / type.size;
        std::string print;
        if (type.isText) {
            print = "        printf(\"%s\", value);\n";
        } else {
            for (std::size_t i = 0; i < count; ++i) {
                print += i == 0 ? "" : "        putchar(',');\n";
                print +=
                    "        " + printElement(type, "stdout", "value[" + std::to_string(i) + "]");
            }
        }
        values["PROPERTIES"] += fill(
            propertyBlock, {{"CTYPE", type.cName},
                            {"COUNT", std::to_string(count)},
                            {"NAME", quote(property.name)},
                            {"TYPE", quote(type.name)},
                            {"UNIT", quote((property.unit.empty() ? "" : " ") + property.unit)},
                            {"PRINT", print}});
    }
    values["PROPERTIES"]; // makes it
    std::string program = fill(start, values) + (settings.open ? fill(openFunction, values) : "");
    if (values["PROPERTIES"].find("printNumber") != std::string::npos) {
        program += printFunction;
    }
    save(settings, program + fill(infoProgram, values));
}

void emitRead(const Settings& settings, const std::vector<Field>& fields, double mostCounts,
              double mostSeconds)
{
    Values values = commonValues(settings, false);
    std::string wavFormat;
    if (settings.file.format == "wav") {
        wavFormat = ".samplerate = " + std::to_string(static_cast<int>(settings.file.rate)) +
                    ", .channels = " + std::to_string(columnNames(fields).size()) +
                    ", .format = SF_FORMAT_WAV | " + wavEncoding(*fields[0].type);
    }
    addFile(settings, true, wavFormat, mostCounts, mostSeconds, values);
    const bool csv = settings.file.format == "csv";
    std::string header;
    for (const std::string& column : columnNames(fields)) {
        header += (header.empty() ? "" : ",") + column;
    }
    std::string write = "    for (int row = 0; row < counts; ++row) {\n";
    std::size_t inFrame = 0; // elements of a frame of WAV, which is written at once
    if (settings.file.format == "wav") {
        write += std::string("        ") + fields[0].type->cName + " frame[" +
                 std::to_string(columnNames(fields).size()) + "];\n";
    }
    for (std::size_t f = 0; f < fields.size(); ++f) {
        const ElementType& type = *fields[f].type;
        const std::string array = "field" + std::to_string(f + 1);
        const std::string perCount = std::to_string(fields[f].perCount);
        values["FIELDS"] +=
            "\nstatic " + std::string(type.cName) + " " + array + "[MOST * " + perCount + "];";
        values["READ"] += fill(readField, {{"NAME", quote(fields[f].name)},
                                           {"TYPE", quote(type.name)},
                                           {"PERCOUNT", perCount},
                                           {"ARRAY", array}});
        const std::string row = array + " + row * " + perCount;
        const std::string size = "sizeof(" + array + "[0])";
        if (csv) {
            write += "        for (int i = 0; i < " + perCount + "; ++i) {\n";
            write +=
                f == 0
                    ? "            if (i > 0) {\n                putc(',', file);\n            }\n"
                    : "            putc(',', file);\n";
            write += "            " +
                     printElement(type, "file", array + "[row * " + perCount + " + i]") +
                     "        }\n";
        } else if (settings.file.format == "wav") {
            write += "        memcpy(frame + " + std::to_string(inFrame) + ", " + row + ", " +
                     perCount + " * " + size + ");\n";
            inFrame += fields[f].perCount;
        } else {
            write += "        if (fwrite(" + row + ", " + size + ", " + perCount +
                     ", file) != " + perCount + ") {\n            return 0;\n        }\n";
        }
    }
    if (inFrame > 0) {
        write += "        if (sf_write_raw(file, frame, sizeof(frame)) != sizeof(frame)) {\n"
                 "            return 0;\n        }\n";
    }
    write += csv ? "        putc('\\n', file);\n    }\n    return !ferror(file);\n"
                 : "    }\n    return 1;\n";
    if (inFrame > 0) {
        values["START"] +=
            "    (void)sf_command(file, SFC_SET_ADD_PEAK_CHUNK, NULL, SF_FALSE); /* raw writes "
            "have none */\n";
    }
    if (csv) {
        values["START"] += "    fputs(" + quote(header) + " \"\\n\", file);\n";
    }
    values["FIELDS"] += "\n";
    values["WRITE"] = write;
    if (write.find("printNumber") != std::string::npos) {
        values["PRINT"] = printFunction;
    }
    save(settings, fill(start, values) + fill(openFunction, values) + fill(readProgram, values) +
                       fill(fileMain, values));
}

void emitWrite(const Settings& settings, const SampleReader& reader, bool hasInput,
               double mostCounts, double mostSeconds)
{
    const ElementType& type = elementType(settings.type);
    Values values = commonValues(settings, true);
    addFile(settings, false, "0", mostCounts, mostSeconds, values);
    values["ROWS"] = std::to_string(settings.block);
    values["COLUMNS"] = std::to_string(reader.getColumns());
    values["CTYPE"] = type.cName;
    values["TYPE"] = quote(type.name);
    if (hasInput) {
        values["FLUSH"] = flushInput;
    }
    if (settings.file.format == "wav") {
        values["READ"] = std::string("    return (int)sf_readf_") + soundFunctions(type) +
                         "(file, elements, most);\n";
    } else if (settings.file.format == "raw") {
        values["READ"] =
            "    const size_t count = fread(elements, sizeof(elements[0]), (size_t)most, file);\n"
            "    return ferror(file) ? -1 : (int)count;\n";
    } else {
        const std::string conversion = type.name == std::string("double")  ? "%lf"
                                       : type.name == std::string("float") ? "%f"
                                                                           : type.cFormat;
        if (reader.hasHeader()) {
            values["START"] += "    (void)fscanf(file, \"%*[^\\n]\");\n";
        }
        values["READ"] = "    int count = 0;\n"
                         "    while (count < most * COLUMNS && fscanf(file, \"" +
                         conversion +
                         "%*[, \\r\\n\\t]\", &elements[count]) == 1) {\n"
                         "        ++count;\n"
                         "    }\n"
                         "    return count % COLUMNS == 0 && (count > 0 || feof(file)) ? count / "
                         "COLUMNS : -1;\n";
    }
    save(settings, fill(start, values) + fill(openFunction, values) + fill(writeProgram, values) +
                       fill(fileMain, values));
}

} // namespace brenix
