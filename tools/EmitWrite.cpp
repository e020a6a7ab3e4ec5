// Writes the C program of the command write.

#include "EmitC.hpp"

namespace brenix
{

namespace
{

constexpr std::string_view writeProgram = R"(
enum { ROWS = @ROWS@, COLUMNS = @COLUMNS@ }; /* of one buffer */

static @CTYPE@ elements[ROWS * COLUMNS];

static const char* name; /* of the file */
@INFO@static int inputOk = 1; /* 0 once readRows has printed what is wrong */

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

constexpr std::string_view checkSound = R"(    if (info.channels != COLUMNS) {
        fprintf(stderr, "%s: %d channels instead of %d\n", name, info.channels, COLUMNS);
        (void)sf_close(file);
        return EXIT_FAILURE;
    }
)";

constexpr std::string_view hasAll =
    R"(/* At the end: whether it is that of the last frame. A huge length stands for one that is not known. */
static int hasAll(SNDFILE* file, sf_count_t frames)
{
    static const int sizes[] = {0, 1, 2, 3, 4, 1, 4, 8}; /* of a sample in the encodings from 1 on */
    const int container = info.format & SF_FORMAT_TYPEMASK;
    const int encoding = info.format & SF_FORMAT_SUBMASK;
    int isComplete = frames >= info.frames || info.frames >= (sf_count_t)1 << 40 ||
                     container == SF_FORMAT_AIFF; /* an empty one has some frames for libsndfile */
    if (container == SF_FORMAT_WAV || container == SF_FORMAT_WAVEX) {
        /* Of a file that was cut, libsndfile counts what is there. */
        SF_CHUNK_INFO data = {"data", 4, 0, NULL};
        SF_CHUNK_ITERATOR* const chunk = sf_get_chunk_iterator(file, &data);
        isComplete = encoding > SF_FORMAT_DOUBLE || chunk == NULL ||
                     sf_get_chunk_size(chunk, &data) != SF_ERR_NO_ERROR ||
                     data.datalen >= 0x7FFFF000 ||
                     frames * COLUMNS * sizes[encoding] >= data.datalen;
    }
    if (!isComplete) {
        fprintf(stderr, "%s: it ends after %ld frames and should have more\n", name, (long)frames);
    }
    return isComplete;
}

)";

constexpr std::string_view readSound = R"(    static sf_count_t frames = 0;
@READROWS@    frames += rows;
    inputOk = rows == most || hasAll(file, frames);
    return rows;
)";

constexpr std::string_view readScaled = R"(    static double samples[ROWS * COLUMNS];
    const int rows = (int)sf_readf_double(file, samples, most);
    for (int i = 0; i < rows * COLUMNS; ++i) {
        const double level = isnan(samples[i]) ? 0.0 : samples[i] * -(@LOW@.0);
        elements[i] = (@CTYPE@)lrint(fmax(@LOW@.0, fmin(@HIGH@.0, level)));
    }
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
            fprintf(stderr, "%s: line %ld: not %d values of type @TYPENAME@: ", name, line, COLUMNS);
            for (next = begin; strchr("\r\n", *next) == NULL; ++next) {
                fprintf(stderr, *next >= ' ' && *next <= '~' ? "%c" : "\\x%02x", (unsigned char)*next);
            }
            fputs("\n", stderr);
            inputOk = 0;
            break;
        }
        ++rows;
    }
    return rows;
)";

constexpr std::string_view logicalWords = R"(    for (int word = 0; word < 2; ++word) {
        const char* const name = word ? "true" : "false";
        if (strncmp(*text, name, strlen(name)) == 0) {
            value = word;
            end = *text + strlen(name);
        }
    }
)";

constexpr std::string_view takeElement = R"(static char* skipSpace(char* text)
{
    return text + strspn(text, " \t\r\n");
}

/* Takes an element, which may stand in quotes, from the front of a text. Returns 0 when it has none of
   the type. */
static int takeElement(char** text, @CTYPE@* element)
{
    char* end;
    @WIDE@ value;
    int isQuoted;
    *text = skipSpace(*text);
    isQuoted = **text == '"';
    *text = skipSpace(*text + isQuoted);
    errno = 0;
    value = @CONVERT@;
@WORDS@    *element = (@CTYPE@)value;
    if (end == *text || @WRONG@) {
        return 0;
    }
    end = skipSpace(end);
    if (isQuoted && *end++ != '"') {
        return 0;
    }
    *text = skipSpace(end);
    return 1;
}

/* Whether something between the commas of a line is a number or begins like one. */
static int hasNumber(char* text)
{
    int isStart = 1; /* of what is between commas */
    int isQuoted = 0;
    for (; *text != '\0'; ++text) {
        if (isStart && strchr(" \t\r\n\"", *text) == NULL) {
            char* end;
            (void)strtod(text, &end); /* it may be inf or nan, too */
            if (strchr("+-.0123456789", *text) != NULL ||
                (end != text && strchr(",", end[strspn(end, " \t\r\n\"")]) != NULL)) {
                return 1;
            }
            isStart = 0;
        }
        isQuoted ^= *text == '"';
        isStart |= *text == ',' && !isQuoted;
    }
    return 0;
}

)";

constexpr std::string_view flushInput = R"( ||
            !check(channel, "coderStreamFlush",
                   coderStreamFlush(coderChannelGetInputStream(channel))))";

/// How the text of an element becomes one, as in parseNumber().
void addConversion(const ElementType& type, Values& values)
{
    const std::string_view name = type.name;
    values["WIDE"] = "long long";
    values["CONVERT"] = "strtoll(*text, &end, 10)";
    values["WRONG"] = "errno != 0 || *element != value";
    if (isFloating(type)) {
        values["WIDE"] = type.cName;
        values["CONVERT"] = name == "float" ? "strtof(*text, &end)" : "strtod(*text, &end)";
        values["WRONG"] = "(errno != 0 && isinf(value)) ||\n"
                          "        memchr(\"xX\", (*text)[strspn(*text, \"+-0\")], 2) != NULL";
    } else if (name == "uint64") {
        values["WIDE"] = "unsigned long long";
        values["CONVERT"] = "strtoull(*text, &end, 10)";
        values["WRONG"] = "errno != 0 || (**text == '-' && value != 0)";
    } else if (name == "logical") {
        values["WORDS"] = logicalWords;
        values["WRONG"] = "errno != 0 || value < 0 || value > 1";
    }
}

} // namespace

void emitWrite(const Settings& settings, const SampleReader& reader, bool hasInput,
               double mostCounts, double mostSeconds)
{
    const ElementType& type = reader.getType();
    Values values = commonValues(settings, true, true);
    addFile(settings, false, "0", values);
    values["ROWS"] = std::to_string(settings.block);
    values["COLUMNS"] = std::to_string(reader.getColumns());
    values["CTYPE"] = type.cName;
    values["TYPE"] = quote(type.name);
    if (hasInput) {
        values["FLUSH"] = flushInput;
    }
    if (findSoundFormat(settings.file.format) != nullptr) {
        const long high = (1L << (8 * type.size - 1)) - 1;
        values["LOW"] = std::to_string(-high - 1);
        values["HIGH"] = std::to_string(high);
        values["READROWS"] = isFloating(type) ? std::string("    const int rows = (int)sf_readf_") +
                                                    type.name + "(file, elements, most);\n"
                                              : fill(readScaled, values);
        values["READ"] = fill(readSound, values);
        values["OPENED"] = checkSound;
        values["TAKE"] = hasAll;
    } else if (settings.file.format == "raw") {
        values["READ"] = readRaw;
    } else {
        addConversion(type, values);
        values["TAKE"] = fill(takeElement, values);
        values["TYPENAME"] = type.name;
        values["READ"] = fill(readCsv, values);
    }
    saveTransfer(settings, writeProgram, mostCounts, mostSeconds, std::move(values));
}

} // namespace brenix
