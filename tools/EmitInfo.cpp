// Writes the C program of the command info.

#include "EmitC.hpp"

#include <sstream>

namespace brenix
{

namespace
{

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

} // namespace brenix
