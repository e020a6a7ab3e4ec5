// The commands. Each returns an exit code or throws a Failure, std::invalid_argument for wrong usage.
#ifndef BRENIX_TOOLS_COMMANDS_HPP
#define BRENIX_TOOLS_COMMANDS_HPP

#include "Channel.hpp"
#include "files/Samples.hpp"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <limits>
#include <optional>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

namespace brenix
{

enum ExitCode { Success = 0, Failed = 1, WrongUsage = 2, Interrupted = 130 };

/// All that the command line can say; each command has its part of it.
struct Settings {
    std::string commandLine; ///< as a shell takes it
    bool json = false;
    bool quiet = false;

    std::vector<std::string> plugins;
    bool namesOnly = false;

    ChannelSettings channel;
    std::vector<std::string> properties; ///< Name:type
    bool open = false;

    SampleFile file;
    std::vector<std::string> fields;
    std::string type; ///< empty: as the plug-ins or the file tell
    double counts = std::numeric_limits<double>::infinity();
    double seconds = std::numeric_limits<double>::infinity();
    std::size_t block = 1024;

    bool time = false;       ///< columns of the number and the time of each count
    bool failOnLoss = false; ///< lost data is an error

    std::size_t window = 1024; ///< counts that the scope shows
    std::string png;
    std::string emitC;
    std::string keyFile;
};

using Json = nlohmann::ordered_json;

/// Text that is not UTF-8 is printed with replacements. Without an indent it is one line.
void printJson(std::ostream& stream, const Json& value, int indent = -1);

/// Prints an error on the standard error.
void report(const Settings& settings, const Failure& failure);

ExitCode listPlugins(const Settings& settings);
ExitCode checkPlugins(const Settings& settings);
ExitCode findDevices(const Settings& settings);
ExitCode showInfo(const Settings& settings);
ExitCode readSamples(const Settings& given);
ExitCode writeSamples(const Settings& given);
ExitCode showScope(const Settings& settings);
ExitCode makeKeys(const Settings& settings);

struct PropertyValue {
    std::string name;
    std::string unit;
    const ElementType* type;
    Bytes elements;
};

// Each writes settings.emitC, the C program that does what the command did. Throws a Failure when it
// cannot.
void emitInfo(const Settings& settings, const std::vector<PropertyValue>& properties,
              const std::string& fields);
void emitRead(const Settings& settings, const std::vector<Field>& fields, double mostCounts,
              double mostSeconds, double mostListed);
void emitWrite(const Settings& settings, const SampleReader& reader, bool hasInput,
               double mostCounts, double mostSeconds);

/// From here on SIGINT or SIGTERM ends what is under way in good order, the third one at once.
void catchInterrupts();
bool isInterrupted();

/// Puts the end of a file in the place of the standard input, also for a read that waits.
void endInput();

double secondsSince(std::chrono::steady_clock::time_point start);

/// A line on a terminal's standard error: how far it is, the rate and the time that remains.
class Progress
{
public:
    /// A total that is not known is 0 or infinity.
    Progress(double totalCounts, bool quiet);
    void update(double counts);

    /// Clears the line.
    void finish() const;

private:
    double total;
    bool shown;
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    std::chrono::steady_clock::time_point drawn = start;
};

/// Waits for counts and hands them over, one buffer after another, until the settings, the device or
/// an interruption end it.
class Reading
{
public:
    Reading(Channel& openChannel, const Settings& settings, double signalRate);

    /// Reads the next buffer into `fields`. Returns its counts; 0 when none has come and, with
    /// isOver(), none will.
    std::size_t next();
    bool isOver() const;

    /// Ends with what the stream has now.
    void endWithAvailable()
    {
        mostCounts = std::min(mostCounts, counts + channel.inputAvailable());
    }

    const std::vector<Field>& getFields() const { return fields; }
    double getCounts() const { return counts; }
    double getMostCounts() const { return mostCounts; } ///< infinity when there is no limit
    double getMostSeconds() const { return mostSeconds; }
    double getListed() const { return listed; }
    double getSeconds() const { return secondsSince(start); }

private:
    void findFields(double ready);

    Channel& channel;
    const std::vector<std::string>& fieldNames;
    const bool hasTime;
    const double rate;
    double mostCounts;
    double mostSeconds;
    double counts = 0;
    /// What a peek lists at most: so few that little is kept from being dropped, so many that packets are
    /// seldom divided.
    double listed = 4096;
    bool done = false;
    std::vector<Field> fields;
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
};

/// The port at which the device receives, when the system has chosen it.
std::optional<long> chosenPort(Channel& channel, const ChannelSettings& settings);

/// Prints it on the standard error: the other side has to know it.
void tellPort(Channel& channel, const Settings& settings);

/// The rate that is given or that the device tells; 0 when neither is.
double countRate(Channel& channel, const SampleFile& file);

/// What of the two limits is there: counts if the rate tells how many, or else seconds.
std::pair<double, double> extent(const Settings& settings, double rate);

} // namespace brenix

#endif
