// Device `hdf5`: records the output stream in an HDF5 file, or replays a recording into the input stream. When
// reading, a count is a row of the dataset: an element of each channel, in the field "data".

#include "hdf5/Description.hpp"
#include "hdf5/Playback.hpp"
#include "hdf5/Recorder.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>

namespace
{

using namespace brenixcore::plugin;
using namespace hdf5;
using bytes::PropertyMap;
using std::chrono::steady_clock;

constexpr long latestTime = 1L << 62; ///< of the year 2116

class Hdf5 : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        const Quiet quiet;
        hbool_t isSafe = false;
        H5is_library_threadsafe(&isSafe);
        if (!isSafe) { // channels have threads
            throw std::runtime_error("The HDF5 library of this system cannot be used by threads.");
        }
        Options options(optionMap);
        fileName = options.text("FileName").value_or("");
        if (fileName.empty()) {
            Options::fail("FileName", "must name an HDF5 file");
        }
        writes = bytes::readChoice<2>(options, "Mode", {"read", "write"}) == 1;
        format = {};
        notes = {};
        format.dataset = options.text("Dataset").value_or("data");
        if (format.dataset.empty() || format.dataset.back() == '/') {
            Options::fail("Dataset", "must name a dataset, such as data or run1/force");
        }
        notes.rate = options.number("SampleRate").value_or(0);
        if (!(notes.rate >= 0 && std::isfinite(notes.rate))) {
            Options::fail("SampleRate", "must be more than 0 Hz, or 0 where it is not known");
        }
        host = &deviceHost;
        std::uint64_t counts = 0;
        std::size_t gapCount = 0;
        if (writes) {
            readFormat(options);
            options.requireAllKnown();
        } else {
            blockSize = static_cast<std::uint64_t>(
                options.wholeNumber("BlockSize", 1, 1L << 24).value_or(1024));
            first =
                static_cast<std::uint64_t>(options.wholeNumber("First", 0, latestTime).value_or(0));
            isPaced = bytes::readChoice<2>(options, "Pace", {"fast", "realtime"}) == 1;
            options.requireAllKnown();
            const Replay recording(fileName, format.dataset);
            const double ownRate = notes.rate;
            notes = recording.notes();
            notes.rate = ownRate > 0 ? ownRate : notes.rate;
            format.type = &recording.type();
            format.channels = recording.channels();
            counts = recording.counts();
            gapCount = recording.gaps().size();
            checkFirst(recording);
            if (isPaced && !(notes.rate > 0)) {
                Options::fail("Pace", "needs SampleRate: " + fileName + " does not tell it");
            }
        }
        publish(properties, "SampleRate", notes.rate);
        publish(properties, "Channels", static_cast<unsigned int>(format.channels));
        publish(properties, "ElementType", std::string(format.type->name));
        publish(properties, "Frames", static_cast<long>(counts));
        publish(properties, "Gaps", static_cast<unsigned long>(gapCount));
        publish(properties, "Unit", notes.unit);
        publish(properties, "Start", static_cast<long>(notes.start));
        publish(properties, "Names", formatNames(notes.names));
        publish(properties, "Origin", notes.origin);
        publish(properties, "Attributes", formatAttributes(notes.others));
        return writes ? DeviceInfo{std::nullopt, StreamInfo{}}
                      : DeviceInfo{StreamInfo{1, notes.rate}, std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        const Quiet quiet;
        Options(options).requireAllKnown();
        if (writes) {
            recorder.emplace(fileName, format, notes);
            gap.reset();
            gaps = 0;
            host->updateProperty(makeScalar("Gaps", static_cast<unsigned long>(gaps)));
            isRecording = true;
        } else {
            Replay recording(fileName, format.dataset);
            if (&recording.type() != format.type || recording.channels() != format.channels) {
                throw std::runtime_error("Could not open " + fileName + ": its dataset " +
                                         format.dataset + " has changed since init");
            }
            checkFirst(recording);
            replay.emplace(std::move(recording));
        }
    }

    void run(DeviceStreams& streams) override
    {
        const Quiet quiet;
        if (!writes) {
            const Wait wait = [&](steady_clock::time_point due) {
                std::unique_lock lock(mutex);
                changed.wait_until(lock, due, [&] { return streams.isClosing(); });
            };
            play(*replay, notes, {first, blockSize}, isPaced ? wait : Wait(), streams);
            return;
        }
        struct End { // whatever happens, nobody waits for a gap to be noted
            Hdf5& device;
            ~End() { device.answerGap("The recording has ended.", false); }
        } const end{*this};
        std::uint64_t elements = 0;
        std::string besides;
        try {
            record(streams, elements, besides);
        } catch (const std::exception& failure) {
            streams.refuseOutput();
            std::uint64_t lost = elements - recorder->giveUp() * format.channels;
            lost += discardOutput(streams);
            throw std::runtime_error(
                failure.what() +
                (lost > 0 ? ' ' + std::to_string(lost) + " elements were not taken." : "") +
                besides);
        }
        if (const std::uint64_t partial = recorder->partial(); partial > 0) {
            throw std::runtime_error(
                "The last count for " + fileName + " has " + std::to_string(partial) + " of " +
                std::to_string(format.channels) + " elements and was not written." + besides);
        }
    }

    void wake() noexcept override
    {
        const std::lock_guard lock(mutex);
        isWoken = true;
        changed.notify_all();
    }

    /// Command `gap`: counts are missing behind those that were written before it.
    void execute(const std::string& command, const PropertyMap& optionMap) override
    {
        if (command != "gap" || !writes) {
            Device::execute(command, optionMap);
        }
        Options options(optionMap);
        const auto lost = options.wholeNumber("Counts", 0, latestTime);
        if (!lost) {
            Options::fail("Counts", "must be given, 0 where it is not known");
        }
        const long time = options.wholeNumber("Time", 1, latestTime)
                              .value_or(std::chrono::duration_cast<std::chrono::nanoseconds>(
                                            std::chrono::system_clock::now().time_since_epoch())
                                            .count());
        options.requireAllKnown();
        std::unique_lock lock(mutex);
        if (!isRecording) {
            throw std::runtime_error("A gap can only be noted while the channel is open.");
        }
        gap = Gap{0, time, static_cast<std::uint64_t>(*lost)};
        isWoken = true;
        changed.notify_all();
        changed.wait(lock, [&] { return !gap; });
        if (!gapProblem.empty()) {
            throw std::runtime_error(gapProblem);
        }
    }

    void close() override
    {
        const Quiet quiet;
        recorder.reset();
        replay.reset();
    }

private:
    void checkFirst(const Replay& recording) const
    {
        if (first > recording.counts()) {
            Options::fail("First", "must be at most " + std::to_string(recording.counts()) +
                                       ", the counts of " + fileName);
        }
    }

    void readFormat(Options& options)
    {
        format.type = &bytes::readElementType(options, "double");
        format.channels =
            static_cast<std::uint64_t>(options.wholeNumber("Channels", 1, 65536).value_or(1));
        format.compression =
            static_cast<unsigned>(options.wholeNumber("Compression", 0, 9).value_or(0));
        notes.unit = options.text("Unit").value_or("");
        notes.start = options.wholeNumber("Start", 0, latestTime).value_or(0);
        notes.origin = options.text("Origin").value_or("");
        if (const std::string names = options.text("Names").value_or(""); !names.empty()) {
            notes.names = parseNames(names);
            if (notes.names.size() != format.channels) {
                Options::fail("Names", "must be " + std::to_string(format.channels) +
                                           ", one for each of the Channels, not " +
                                           std::to_string(notes.names.size()));
            }
        }
        if (const std::string texts = options.text("Attributes").value_or(""); !texts.empty()) {
            try {
                notes.others = parseAttributes(texts);
            } catch (const std::invalid_argument& problem) {
                Options::fail("Attributes", problem.what());
            }
        }
    }

    /// Adds up the elements that came, and tells in `besides` what else was lost.
    void record(DeviceStreams& streams, std::uint64_t& elements, std::string& besides)
    {
        constexpr auto often = std::chrono::milliseconds(300); // what waits twice is no second old
        auto due = steady_clock::now() + often;
        std::uint64_t refused = 0;
        for (bool isClosing = false; !isClosing;) {
            {
                const std::lock_guard lock(mutex);
                isWoken = false;
            }
            const bool isLast = streams.isClosing(); // before the last look at the output
            auto packet = streams.tryPull();
            if (packet) {
                const auto data = takeField(*packet, dataField);
                if (const auto found = format.type->find(data.get())) {
                    elements += found->size() / format.type->size;
                    recorder->append(*found);
                } else {
                    refused += packet->counts;
                    besides = ' ' + std::to_string(refused) + " counts were not written to " +
                              fileName + ": elements must be " + std::string(format.type->name) +
                              ", not " + bytes::describe(data.get()) + ".";
                    host->raise("error", "brenix:Device:wrongType", besides.c_str() + 1);
                }
            } else {
                noteGap();
                isClosing = isLast;
            }
            if (steady_clock::now() >= due) {
                recorder->flush();
                updateCounts();
                due = steady_clock::now() + often;
            }
            if (!packet && !isClosing) {
                std::unique_lock lock(mutex);
                changed.wait_until(lock, due, [this] { return isWoken; });
            }
        }
        recorder->finish();
        updateCounts();
    }

    void updateCounts()
    {
        host->updateProperty(makeScalar("Frames", static_cast<long>(recorder->counts())));
    }

    /// Everything that was written before the command has been taken.
    void noteGap()
    {
        std::unique_lock lock(mutex);
        if (!gap) {
            return;
        }
        const Gap noted = *gap;
        lock.unlock();
        const std::uint64_t partial = recorder->partial();
        if (partial == 0) {
            recorder->addGap(noted);
            host->updateProperty(makeScalar("Gaps", static_cast<unsigned long>(++gaps)));
        }
        answerGap(partial == 0 ? ""
                               : "The last count before the gap has " + std::to_string(partial) +
                                     " of " + std::to_string(format.channels) + " elements.",
                  true);
    }

    void answerGap(const std::string& problem, bool goesOn)
    {
        const std::lock_guard lock(mutex);
        isRecording = goesOn;
        gapProblem = problem;
        gap.reset();
        changed.notify_all();
    }

    DeviceHost* host = nullptr;
    std::string fileName;
    bool writes = false;
    RecordingFormat format;
    Notes notes;

    std::uint64_t blockSize = 0;
    std::uint64_t first = 0;
    bool isPaced = false;
    std::optional<Replay> replay;

    std::optional<Recorder> recorder;
    std::uint64_t gaps = 0;

    std::mutex mutex; ///< guards the rest
    std::condition_variable changed;
    bool isWoken = false;
    bool isRecording = false;
    std::optional<Gap> gap; ///< to be noted
    std::string gapProblem; ///< why it was not
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Hdf5)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, outputFields)
BRENIXCORE_DESCRIBE_COMMANDS(commandTable)
