// Writes C programs that do what a command just did.

#include "CheckText.hpp"
#include "Commands.hpp"

#include <array>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <limits>
#include <map>
#include <sstream>
#include <string_view>

namespace brenix
{

namespace
{

using Values = std::map<std::string, std::string>;

/// Puts values in the place of @NAMES@, nothing where there is none.
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
        const auto value = values.find(std::string(text.substr(begin + 1, end - begin - 1)));
        filled += value == values.end() ? "" : value->second;
        text.remove_prefix(end + 1);
    }
}

/// A string literal.
std::string quote(std::string_view text)
{
    std::string literal = "\"";
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        if (std::isprint(byte) != 0 && character != '"' && character != '\\' && character != '?') {
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
#define _POSIX_C_SOURCE 200809L

#include <brenixcoder/coder.h>

#include <math.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
@INCLUDE@
@CHECK@
static int setUp(void* channel)
{
@SETUP_DATA@    return check(channel, "coderChannelInit",
            coderChannelInit(channel, @INIT@))@CALLS@;
}
)";

constexpr std::string_view furtherCall = R"( &&
           check(channel, "@CALL@",
            @CALL@(@ARGUMENTS@)))";

constexpr std::string_view clockFunction = R"(
static double now(void)
{
    struct timespec time;
    clock_gettime(CLOCK_MONOTONIC, &time);
    return (double)time.tv_sec + 1e-9 * (double)time.tv_nsec;
}
)";

constexpr std::string_view readProgram = R"(
static const char* name; /* of the file */
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
    int ok = 1;
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
                       coderInputStreamReadBuffers(input, counts, 1.0))@READ@ ||
                !writeCounts(file, (int)counts)) {
                return 0;
            }
            left -= counts;
        } else if (done) {
            break;
        } else {
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

constexpr std::string_view readField = R"( ||
                !check(channel, "coderInputStreamReadBufferData",
                       coderInputStreamReadBufferData(input, 1, 0, @NAME@, @TYPE@,
                                                      (int)counts@TIMES@, @ARRAY@)))";

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

static const char* name; /* of the file */
static int inputOk = 1;  /* 0 once readRows has printed what is wrong */

@TAKE@/* Reads up to `most` rows. Returns how many, 0 at the end. */
static int readRows(@FILE@* file, int most)
{
@READ@}
@CLOCK@
static int transfer(void* channel, @FILE@* file)
{
    void* const output = coderChannelGetOutputStream(channel);
    double left = @COUNTS@;
@START@    while (inputOk && left > 0.0@TIME@) {
        uint8_t done = 0;
        double written = 0.0;
        const int rows = readRows(file, left < ROWS ? (int)left : ROWS);
        if (rows == 0) {
            break;
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
    return inputOk;
}
)";

constexpr std::string_view checkWav = R"(    if (info.channels != COLUMNS) {
        fprintf(stderr, "%s: %d channels instead of %d\n", name, info.channels, COLUMNS);
        (void)sf_close(file);
        return EXIT_FAILURE;
    }
)";

constexpr std::string_view readScaled = R"(    static double samples[ROWS * COLUMNS];
    const int count = (int)sf_read_double(file, samples, most * COLUMNS);
    for (int i = 0; i < count; ++i) {
        const double level = isnan(samples[i]) ? 0.0 : samples[i] * -(@LOW@.0);
        elements[i] = (@CTYPE@)lrint(fmax(@LOW@.0, fmin(@HIGH@.0, level)));
    }
    return count / COLUMNS;
)";

constexpr std::string_view readRaw =
    R"(    const size_t size = fread(elements, 1, (size_t)most * sizeof(elements[0]), file);
    if (size % sizeof(elements[0]) != 0) {
        fprintf(stderr, "%s: the last element is not complete\n", name);
        inputOk = 0;
    }
    return (int)(size / sizeof(elements[0]));
)";

constexpr std::string_view readCsv = R"(    static char* text = NULL;
    static size_t size = 0;
    static long line = 0;
    static int isFirst = 1;
    ssize_t length;
    int rows = 0;
    while (rows < most && (length = getline(&text, &size, file)) > 0) {
        char* const begin = text + (++line == 1 && strncmp(text, "\xEF\xBB\xBF", 3) == 0 ? 3 : 0);
        char* next = skipSpace(begin);
        const int mayBeNames = isFirst;
        if (next == text + length) {
            continue; /* an empty line */
        }
        isFirst = 0;
        for (int column = 0; column < COLUMNS; ++column) {
            if ((column > 0 && *next++ != ',') ||
                !takeElement(&next, &elements[rows * COLUMNS + column])) {
                next = NULL;
                break;
            }
        }
        if (next != text + length && mayBeNames && !hasNumber(begin)) {
            continue; /* the names of the columns */
        }
        if (next != text + length) {
            fprintf(stderr, "%s: line %ld: not %d values of type @TYPENAME@: %.*s\n", name, line, COLUMNS,
                    (int)strcspn(begin, "\r\n"), begin);
            inputOk = 0;
            break;
        }
        ++rows;
    }
    return rows;
)";

constexpr std::string_view logicalWords =
    R"(    for (int word = 0; word < 2; ++word) {
        const char* const name = word ? "true" : "false";
        if (strncmp(*text, name, strlen(name)) == 0) {
            *text = skipSpace(*text + strlen(name));
            *element = (uint8_t)word;
            return 1;
        }
    }
)";

constexpr std::string_view takeElement = R"(static char* skipSpace(char* text)
{
    return text + strspn(text, " \t\r\n");
}

/* Takes an element from the front of a text. Returns 0 when it has none of the type. */
static int takeElement(char** text, @CTYPE@* element)
{
    char* end;
    @WIDE@ value;
    errno = 0;
    *text = skipSpace(*text);
@WORDS@    value = @CONVERT@;
    *element = (@CTYPE@)value;
    if (end == *text || @WRONG@) {
        return 0;
    }
    *text = skipSpace(end);
    return 1;
}

/* Whether something between the commas of a line is a number or begins like one. */
static int hasNumber(char* cell)
{
    for (; cell != NULL; cell = strchr(cell, ',')) {
        char* end;
        cell = skipSpace(cell + (*cell == ','));
        (void)strtod(cell, &end); /* it may be inf or nan, too */
        if (strspn(cell, "+-.0123456789") > 0 || (end != cell && strchr(",", *skipSpace(end)) != NULL)) {
            return 1;
        }
    }
    return 0;
}

)";

constexpr std::string_view flushInput = R"( ||
            !check(channel, "coderStreamFlush",
                   coderStreamFlush(coderChannelGetInputStream(channel))))";

constexpr std::string_view fileMain = R"(
int main(int argc, char** argv)
{
@INFO@    @FILE@* file;
    void* channel;
    int ok;
    name = argc > 1 ? argv[1] : @NAME@;
    file = @OPENFILE@;
    if (file == NULL) {
        fprintf(stderr, "%s: %s\n", name, @WHY@);
        return EXIT_FAILURE;
    }
@OPENED@    channel = createChannel(@DEVICE@, @CONVERTER@, @INLIMIT@, @OUTLIMIT@);
    ok = channel != NULL && setUp(channel) && transfer(channel, file);
    ok = finishChannel(channel) && ok;
    if (@ERROR@(file) != 0) {
        fprintf(stderr, "%s: cannot be @VERB@\n", name);
        ok = 0;
    }
    if (@CLOSE@(file) != 0) {
        fprintf(stderr, "%s: cannot be closed\n", name);
        ok = 0;
    }
    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
)";

constexpr std::string_view infoProgram = R"(@PRINT@
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
    int ok = channel != NULL && setUp(channel) &&
             printStream(channel, "input", coderChannelGetInputStream(channel)) &&
             printStream(channel, "output", coderChannelGetOutputStream(channel)) &&
             printProperties(channel);
    ok = finishChannel(channel) && ok;
    return ok && fflush(stdout) == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
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
Values commonValues(const Settings& settings, bool opens, bool output)
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
    values["INIT"] =
        optionList(parseOptions(channel.options, channel.device), "init", values["SETUP_DATA"]);
    const auto add = [&](const char* call, const std::string& arguments) {
        values["CALLS"] += fill(furtherCall, {{"CALL", call}, {"ARGUMENTS", arguments}});
    };
    for (std::size_t i = 0; i < channel.filters.size(); ++i) {
        const FilterSettings filter = parseFilter(channel.filters[i]);
        add("coderStreamAddFilter",
            (output ? "coderChannelGetOutputStream(channel), "
                    : "coderChannelGetInputStream(channel), ") +
                quote(filter.name) + ", " +
                optionList(filter.options, "filter" + std::to_string(i + 1) + "_",
                           values["SETUP_DATA"]));
    }
    if (opens) {
        add("coderChannelOpen", "channel, " + optionList(parseOptions(channel.openOptions, ""),
                                                         "open", values["SETUP_DATA"]));
    }
    values["DEVICE"] = quote(channel.device);
    values["CONVERTER"] = quote(channel.converter);
    values["INLIMIT"] = constant(channel.inputLimit);
    values["OUTLIMIT"] = constant(channel.outputLimit);
    values["NAME"] = quote(settings.file.name);
    return values;
}

/// How a program opens its file, and when it ends.
void addFile(const Settings& settings, bool writes, const std::string& wavFormat, double mostCounts,
             double mostSeconds, Values& values)
{
    const bool wav = settings.file.format == "wav";
    values["USAGE"] = std::string(" * usage: program [FILE], ") +
                      (writes ? "to which it writes samples\n" : "from which it takes samples\n") +
                      (writes && wav ? " * The file is not a pipe.\n" : "");
    values["FILE"] = wav ? "SNDFILE" : "FILE";
    values["ERROR"] = wav ? "sf_error" : "ferror";
    values["CLOSE"] = wav ? "sf_close" : "fclose";
    values["VERB"] = writes ? "written" : "read";
    if (wav) {
        values["LIBRARIES"] += " -lsndfile";
        values["INCLUDE"] = "\n#include <sndfile.h>\n";
        values["WHY"] = "sf_strerror(NULL)";
        values["INFO"] = "    SF_INFO info = {" + wavFormat + "};\n";
        values["OPENFILE"] =
            std::string("sf_open(name, ") + (writes ? "SFM_WRITE" : "SFM_READ") + ", &info)";
    } else {
        values["INCLUDE"] = "#include <errno.h>\n";
        values["WHY"] = "strerror(errno)";
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

void save(const Settings& settings, std::string_view program, Values values)
{
    if ((values["WRITE"] + values["PROPERTIES"]).find("printNumber") != std::string::npos) {
        values["PRINT"] = printFunction;
    }
    std::ofstream file(settings.emitC);
    if (!(file << fill(start, values) << fill(program, values)).flush()) {
        throw Failure("", settings.emitC + ": cannot be written");
    }
}

} // namespace

void emitInfo(const Settings& settings, const std::vector<PropertyValue>& properties,
              const std::string& fields)
{
    Values values = commonValues(settings, settings.open, false);
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
    if (properties.empty()) {
        values["PROPERTIES"] = "    (void)channel; /* it describes none */\n";
    }
    std::istringstream lines(fields);
    for (std::string line; std::getline(lines, line);) {
        values["PROPERTIES"] += "    puts(" + quote(line) + ");\n";
    }
    save(settings, infoProgram, values);
}

void emitRead(const Settings& settings, const std::vector<Field>& fields, double mostCounts,
              double mostSeconds)
{
    Values values = commonValues(settings, true, false);
    std::string wavFormat;
    if (settings.file.format == "wav") {
        wavFormat = ".samplerate = " + std::to_string(static_cast<int>(settings.file.rate)) +
                    ", .channels = " + std::to_string(columnNames(fields).size()) +
                    ", .format = SF_FORMAT_WAV | " + wavEncoding(*fields[0].type).formatName;
    }
    addFile(settings, true, wavFormat, mostCounts, mostSeconds, values);
    const bool csv = settings.file.format == "csv";
    const bool wav = settings.file.format == "wav";
    std::string printRow;
    std::string frame; // the elements of a row
    for (std::size_t f = 0; f < fields.size(); ++f) {
        const ElementType& type = *fields[f].type;
        const std::string array = "field" + std::to_string(f + 1);
        const std::string perCount = std::to_string(fields[f].perCount);
        const std::string times = fields[f].perCount == 1 ? "" : " * " + perCount;
        values["FIELDS"] +=
            "\nstatic " + std::string(type.cName) + " " + array + "[MOST" + times + "];";
        values["READ"] += fill(readField, {{"NAME", quote(fields[f].name)},
                                           {"TYPE", quote(type.name)},
                                           {"TIMES", times},
                                           {"ARRAY", array}});
        const std::string row = array + "[row" + times;
        if (times.empty()) {
            printRow += f == 0 ? "" : "        putc(',', file);\n";
            printRow += "        " + printElement(type, "file", row + "]");
        } else {
            printRow += "        for (int i = 0; i < " + perCount + "; ++i) {\n            fputs(" +
                        (f == 0 ? "i == 0 ? \"\" : " : "") + "\",\", file);\n            " +
                        printElement(type, "file", row + " + i]") + "        }\n";
        }
        for (std::size_t i = 0; i < fields[f].perCount; ++i) {
            frame +=
                (frame.empty() ? "" : ", ") + row + (i == 0 ? "" : " + " + std::to_string(i)) + "]";
        }
    }
    std::string repeat; // what is there once for a buffer
    for (std::size_t f = 0; f < fields.size(); ++f) {
        const std::string array = "field" + std::to_string(f + 1);
        if (fields[f].isRepeated) {
            repeat += "    for (int row = 1; row < counts; ++row) {\n        " + array +
                      "[row] = " + array + "[0];\n    }\n";
        }
    }
    if (csv) {
        values["WRITE"] = "    for (int row = 0; row < counts; ++row) {\n" + printRow +
                          "        putc('\\n', file);\n    }\n    return !ferror(file);\n";
    } else if (fields.size() == 1) {
        const std::string size = "sizeof(field1[0]) * " + std::to_string(fields[0].perCount);
        values["WRITE"] = wav ? "    const sf_count_t size = counts * (sf_count_t)(" + size +
                                    ");\n    return sf_write_raw(file, field1, size) == size;\n"
                              : "    return fwrite(field1, " + size +
                                    ", (size_t)counts, file) == (size_t)counts;\n";
    } else {
        values["WRITE"] = "    for (int row = 0; row < counts; ++row) {\n        const " +
                          std::string(fields[0].type->cName) + " frame[] = {" + frame +
                          "};\n        if (" +
                          (wav ? "sf_write_raw(file, frame, sizeof(frame)) != sizeof(frame)"
                               : "fwrite(frame, sizeof(frame), 1, file) != 1") +
                          ") {\n            return 0;\n        }\n    }\n    return 1;\n";
    }
    if (wav) {
        values["START"] +=
            "    (void)sf_command(file, SFC_SET_ADD_PEAK_CHUNK, NULL, SF_FALSE); /* raw writes "
            "have none */\n";
    }
    if (csv) {
        values["START"] += "    fputs(" + quote(csvHeader(fields)) + " \"\\n\", file);\n";
    }
    values["WRITE"].insert(0, repeat);
    values["FIELDS"] += "\n";
    save(settings, std::string(readProgram).append(fileMain), values);
}

void emitWrite(const Settings& settings, const SampleReader& reader, bool hasInput,
               double mostCounts, double mostSeconds)
{
    const ElementType& type = elementType(settings.type);
    Values values = commonValues(settings, true, true);
    addFile(settings, false, "0", mostCounts, mostSeconds, values);
    values["ROWS"] = std::to_string(settings.block);
    values["COLUMNS"] = std::to_string(reader.getColumns());
    values["CTYPE"] = type.cName;
    values["TYPE"] = quote(type.name);
    if (hasInput) {
        values["FLUSH"] = flushInput;
    }
    if (settings.file.format == "wav") {
        values["LIBRARIES"] += isFloating(type) ? "" : " -lm";
        const long high = (1L << (8 * type.size - 1)) - 1;
        values["LOW"] = std::to_string(-high - 1);
        values["HIGH"] = std::to_string(high);
        values["READ"] = isFloating(type) ? std::string("    return (int)sf_readf_") + type.name +
                                                "(file, elements, most);\n"
                                          : fill(readScaled, values);
        values["OPENED"] = checkWav;
    } else if (settings.file.format == "raw") {
        values["READ"] = readRaw;
    } else {
        values["WIDE"] = isFloating(type) ? type.cName : "long long";
        values["CONVERT"] = isFloating(type) ? "strtod(*text, &end)" : "strtoll(*text, &end, 10)";
        values["WRONG"] =
            isFloating(type) ? "(errno != 0 && isinf(value))" : "errno != 0 || *element != value";
        if (type.name == std::string_view("float")) {
            values["CONVERT"] = "strtof(*text, &end)";
        } else if (type.name == std::string_view("uint64")) {
            values["WIDE"] = "unsigned long long";
            values["CONVERT"] = "strtoull(*text, &end, 10)";
            values["WRONG"] = "errno != 0 || **text == '-'";
        } else if (type.name == std::string_view("logical")) {
            values["WORDS"] = logicalWords;
            values["WRONG"] = "value < 0 || value > 1";
        }
        values["TAKE"] = fill(takeElement, values);
        values["TYPENAME"] = type.name;
        values["READ"] = fill(readCsv, values);
    }
    save(settings, std::string(writeProgram).append(fileMain), values);
}

} // namespace brenix
