// brenix: lists and checks plug-ins, and reads and writes samples through a channel.

#include "Screen.hpp"
#include "commands/Commands.hpp"

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include <malloc.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <iostream>
#include <stdexcept>
#include <string_view>

namespace
{

using namespace brenix;

/// The arguments as a shell takes them.
std::string commandLine(int count, char** arguments)
{
    std::string line = "brenix";
    for (int i = 1; i < count; ++i) {
        line += ' ' + shellWord(arguments[i]);
    }
    return line;
}

void addList(CLI::App& command, const char* name, std::vector<std::string>& list, const char* help,
             const char* value)
{
    command.add_option(name, list, help)->type_name(value)->allow_extra_args(false);
}

/// A number above 0, as parseQuantity() takes it; of counts, which cannot be divided, a whole one.
template <typename Number>
CLI::Option* addNumber(CLI::App& command, const char* name, Number& number, const char* help,
                       const char* unit, int most = 0)
{
    const bool whole = unit == std::string_view("COUNTS");
    const std::string wanted = !whole ? " is not a number above 0"
                               : most > 0
                                   ? " is not a whole number from 1 to " + std::to_string(most)
                                   : " is not a whole number of at least 1";
    const auto settle = [whole, most, wanted](std::string& text) {
        double value = 0;
        if (!parseQuantity(text, value) || !std::isfinite(value) || !(value > 0) ||
            (most > 0 && value > most) || (whole && value != std::floor(value))) {
            return text + wanted;
        }
        std::array<char, 32> digits{};
        std::snprintf(digits.data(), digits.size(), "%.17g", value);
        text = digits.data();
        return std::string();
    };
    return command.add_option(name, number, help)
        ->type_name(unit)
        ->transform(CLI::Validator(settle, ""));
}

void addChannel(CLI::App& command, ChannelSettings& channel, double& limit)
{
    command.add_option("device", channel.device, "Device plug-in: a name or a path")
        ->type_name("PLUGIN")
        ->required();
    command.add_option("-c,--converter", channel.converter, "Converter plug-in")
        ->type_name("PLUGIN")
        ->capture_default_str();
    addList(command, "-o,--option", channel.options,
            "Option of the device: Name=value or Name:type=value,value...", "OPTION");
    addList(command, "--open-option", channel.openOptions, "Option at open, such as Timeout",
            "OPTION");
    addList(command, "-f,--filter", channel.filters,
            "Filter plug-in and its options, such as \"scale Gain=0.5\"", "FILTER");
    addNumber(command, "--limit", limit, "Counts that a stream buffers at most (default 65536)",
              "COUNTS");
}

void addExtent(CLI::App& command, Settings& settings)
{
    addNumber(command, "-n,--counts", settings.counts, "End after so many counts", "COUNTS");
    addNumber(command, "-s,--seconds", settings.seconds,
              "End after so many seconds: of the signal if its rate is known, or else of time",
              "SECONDS");
    addNumber(command, "-r,--rate", settings.file.rate,
              "Counts a second, if the device has no property SampleRate", "HZ");
}

void addFields(CLI::App& command, Settings& settings)
{
    addList(command, "--field", settings.fields,
            "Field to read (default: those that the plug-ins describe)", "NAME");
}

void addFile(CLI::App& command, Settings& settings, const char* name, const char* help)
{
    command.add_option(name, settings.file.name, help)->type_name("FILE");
    command
        .add_option(
            "--format", settings.file.format,
            "csv, raw, or wav, flac and so on for sound files (default: as the file's ending "
            "has it)")
        ->type_name("FORMAT")
        ->check(CLI::IsMember(formatNames()));
    command.add_flag("-q,--quiet", settings.quiet, "No progress and no summary");
}

void addEmit(CLI::App& command, Settings& settings)
{
    command
        .add_option("--emit-c", settings.emitC,
                    "Write the C program that does the same, - to the standard output")
        ->type_name("FILE");
}

ExitCode run(Settings& settings, int count, char** arguments)
{
    ExitCode result = Success;
    CLI::App app("Lists and checks plug-ins, finds what they open, and reads and writes samples "
                 "through a channel.",
                 "brenix");
    app.set_version_flag("--version", "brenix " BRENIX_VERSION);
    app.footer("Exit codes: 0 done, 1 an error or a plug-in that does not load, 2 wrong usage, 130 "
               "interrupted.\nSee brenix(1).");
    const auto add = [&](const char* name, const char* help, ExitCode (*command)(const Settings&)) {
        CLI::App* const subcommand = app.add_subcommand(name, help);
        subcommand->add_flag("--json", settings.json, "Results and errors as JSON");
        subcommand->callback([&, command] { result = command(settings); });
        return subcommand;
    };
    double& inputLimit = settings.channel.inputLimit;

    CLI::App* command = add("plugins", "List plug-ins and their options", listPlugins);
    command->add_option("plugin", settings.plugins, "Plug-ins (default: all that are installed)");
    command->add_flag("--names", settings.namesOnly, "Names alone")->excludes("--json");

    command = add("check", "Tell why plug-ins do not load", checkPlugins);
    command->add_option("plugin", settings.plugins, "Plug-ins: names or paths")->required();

    command = add("find", "List what is there that devices can be opened on", findDevices);
    command->add_option("device", settings.plugins,
                        "Device plug-ins (default: all that are installed)");

    command = add("info", "Show the properties and streams of a device", showInfo);
    addChannel(*command, settings.channel, inputLimit);
    addList(*command, "-p,--property", settings.properties,
            "Property that the plug-in does not describe: Name:type", "PROPERTY");
    command->add_flag("--open", settings.open, "Open the channel, too");
    addEmit(*command, settings);

    command = add("read", "Read samples from a device", readSamples);
    addChannel(*command, settings.channel, inputLimit);
    addExtent(*command, settings);
    addFields(*command, settings);
    addFile(*command, settings, "-w,--to", "File for the samples (default: standard output)");
    command->add_flag("--time", settings.time,
                      "Columns with the number of each count since open and its time, in "
                      "nanoseconds since 1970 or 0");
    command->add_flag("--fail-on-loss", settings.failOnLoss,
                      "End with exit code 1 when the device or the stream loses data");
    addEmit(*command, settings);

    command = add("write", "Write samples to a device", writeSamples);
    addChannel(*command, settings.channel, settings.channel.outputLimit);
    addExtent(*command, settings);
    addFile(*command, settings, "-i,--from", "File of the samples (default: standard input)");
    command->add_option("-t,--type", settings.type,
                        "Element type to write (default: as the plug-ins or the file tell)");
    addNumber(*command, "-b,--block", settings.block, "Counts of one buffer", "COUNTS", 1 << 20)
        ->capture_default_str();
    addEmit(*command, settings);

    command = add("scope", "Show a live signal", showScope);
    addChannel(*command, settings.channel, inputLimit);
    addExtent(*command, settings);
    addFields(*command, settings);
    addNumber(*command, "--window", settings.window, "Counts across the screen", "COUNTS", 1 << 24)
        ->capture_default_str();
    command
        ->add_option("--png", settings.png, "Write a picture of all that was read (needs gnuplot)")
        ->type_name("FILE");

    command = add("keys", "Make a pair of keys for the device zmq", makeKeys);
    command
        ->add_option("file", settings.keyFile,
                     "New file of the secret key; FILE.pub is that of the public one")
        ->type_name("FILE")
        ->required();

    std::vector<std::string> words(arguments + 1, arguments + count);
    if (!words.empty() && words[0] == "help") { // as many programs have it
        words.erase(words.begin());
        words.emplace_back("--help");
    }
    std::string known;
    for (const CLI::App* const subcommand : app.get_subcommands({})) {
        known += (known.empty() ? "" : ", ") + subcommand->get_name();
    }
    const std::string word = words.empty() ? "" : words[0];
    if (word.rfind('-', 0) != 0 &&
        (", " + known + ", ").find(", " + word + ", ") == std::string::npos) {
        throw std::invalid_argument(
            (word.empty() ? "a command is missing" : word + " is no command") + ": there are " +
            known);
    }
    try {
        std::reverse(words.begin(), words.end()); // as parse() wants them
        app.parse(words);
    } catch (const CLI::Success& help) {
        app.exit(help);
    } catch (const CLI::ParseError& error) {
        const auto given = app.get_subcommands();
        throw std::invalid_argument(error.what() + std::string("; see brenix ") +
                                    (given.empty() ? "" : given[0]->get_name() + ' ') + "--help");
    }
    if (!std::cout.flush()) {
        throw Failure("", "standard output: cannot be written");
    }
    return result;
}

} // namespace

void brenix::printJson(std::ostream& stream, const nlohmann::ordered_json& value, int indent)
{
    stream << value.dump(indent, ' ', false, nlohmann::ordered_json::error_handler_t::replace)
           << '\n';
}

void brenix::report(const Settings& settings, const Failure& failure)
{
    if (settings.json) {
        printJson(std::cerr, {{"error", {{"id", failure.getId()}, {"message", failure.what()}}}});
    } else {
        const std::string text = printable(failure.text());
        const bool isNamed = text.rfind("brenix:", 0) == 0; // the library's identifiers are
        std::cerr << (isNamed ? "" : "brenix: ") << text << '\n';
    }
}

int main(int count, char** arguments)
{
    Settings settings;
    settings.commandLine = commandLine(count, arguments);
    settings.json =
        std::find(arguments, arguments + count, std::string_view("--json")) != arguments + count;
    try {
        catchInterrupts();
        // Blocks are allocated in one thread and freed in another: what is free stays at hand.
        // NOLINTBEGIN(concurrency-mt-unsafe): there is one thread yet
        mallopt(M_MMAP_THRESHOLD, 32 << 20);
        mallopt(M_TRIM_THRESHOLD, 64 << 20);
        // NOLINTEND(concurrency-mt-unsafe)
        std::ios::sync_with_stdio(false);
        return run(settings, count, arguments);
    } catch (const std::invalid_argument& error) {
        report(settings, {"", error.what()});
        return WrongUsage;
    } catch (const Failure& failure) {
        report(settings, failure);
    } catch (const std::exception& error) {
        report(settings, {"", error.what()});
    }
    return Failed;
}
