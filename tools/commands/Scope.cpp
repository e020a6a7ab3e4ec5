// The command scope.

#include "Screen.hpp"
#include "brenixcoder/coder.h"
#include "commands/Commands.hpp"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <deque>
#include <iostream>
#include <limits>
#include <optional>

namespace brenix
{

namespace
{

struct Range {
    double low = std::numeric_limits<double>::infinity();
    double high = -std::numeric_limits<double>::infinity();

    bool isEmpty() const { return low > high; }

    void add(const Range& other)
    {
        low = std::min(low, other.low);
        high = std::max(high, other.high);
    }
};

/// A whole signal in a bounded number of ranges, each over the same number of samples.
class Envelope
{
public:
    void add(double sample)
    {
        if (inLast == samplesOfEach) {
            if (ranges.size() == most) { // halve their number
                for (std::size_t i = 0; i < most / 2; ++i) {
                    ranges[i] = ranges[2 * i];
                    ranges[i].add(ranges[2 * i + 1]);
                }
                ranges.resize(most / 2);
                samplesOfEach *= 2;
            }
            inLast = 0;
            ranges.emplace_back();
        }
        ranges.back().add({sample, sample});
        ++inLast;
    }

    const std::vector<Range>& getRanges() const { return ranges; }
    double getSamplesOfEach() const { return samplesOfEach; }

private:
    static constexpr std::size_t most = 2048;
    std::vector<Range> ranges;
    double samplesOfEach = 1;
    double inLast = 1; ///< so that the first sample makes a range
};

/// What is kept of one channel.
struct Trace {
    std::string name;
    std::deque<double> latest;
    double peak = 0;
    double sumOfSquares = 0;
    double count = 0;
    Envelope envelope;

    void add(double sample, std::size_t window)
    {
        latest.push_back(sample);
        if (latest.size() > window) {
            latest.pop_front();
        }
        peak = std::max(peak, std::fabs(sample));
        sumOfSquares += sample * sample;
        ++count;
        envelope.add(sample);
    }

    double rms() const { return std::sqrt(sumOfSquares / count); }
};

/// A trace as lines of half blocks, its largest value at the upper and the lower edge.
std::string drawTrace(const Trace& trace, int columns, int rows)
{
    double scale = 0;
    for (const double sample : trace.latest) {
        scale = std::isfinite(sample) ? std::max(scale, std::fabs(sample)) : scale;
    }
    std::vector<Range> ranges(static_cast<std::size_t>(columns));
    const std::size_t count = trace.latest.size();
    for (std::size_t i = 0; i < ranges.size(); ++i) {
        // Samples that are fewer than the columns stay over several.
        const std::size_t first = i * count / ranges.size();
        const std::size_t end = std::max((i + 1) * count / ranges.size(), first + 1);
        for (std::size_t sample = first; sample < end; ++sample) {
            const double level = std::clamp(trace.latest[sample], -scale, scale);
            ranges[i].add({level, level});
        }
        // Joins neighbours, but for what is not a number.
        if (i > 0 && !ranges[i].isEmpty() && !ranges[i - 1].isEmpty()) {
            ranges[i].low = std::min(ranges[i].low, ranges[i - 1].high);
            ranges[i].high = std::max(ranges[i].high, ranges[i - 1].low);
        }
    }
    scale = scale > 0 ? scale : 1;
    std::string text;
    for (int row = 0; row < rows; ++row) {
        // The upper and the lower half of the row.
        const double step = scale / rows;
        const double middle = scale - (2 * row + 1) * step;
        for (const Range& range : ranges) {
            const bool upper = range.high >= middle && range.low <= middle + step;
            const bool lower = range.low <= middle && range.high >= middle - step;
            text += upper ? (lower ? "█" : "▀") : (lower ? "▄" : " ");
        }
        text += '\n';
    }
    return text;
}

std::string printed(const char* format, double value)
{
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), format, value);
    return text.data();
}

/// The whole picture, lines that end with a newline. A screen has as many channels as there is room for.
std::string draw(const std::string& title, const std::vector<Trace>& traces, double seconds,
                 double fill, const std::string& error, bool onScreen)
{
    const Size size = terminalSize();
    const int room = size.rows - (error.empty() ? 2 : 3);
    const int all = static_cast<int>(traces.size());
    const int shown = onScreen ? std::clamp(room / 2, 0, all) : all;
    const int height = std::clamp(room / std::max(shown, 1) - 1, 1, 12);
    const double counts = traces.empty() ? 0 : traces[0].count;
    std::string text =
        title + (shown < all ? printed("  %.0f of ", shown) + printed("%.0f channels", all) : "") +
        printed("  %.1f s", seconds) + printed("  %.0f counts", counts) +
        printed("  %.4g counts/s", counts / seconds) + printed("  buffer %.0f%%\n", 100 * fill);
    for (int i = 0; i < shown; ++i) {
        const Trace& trace = traces[static_cast<std::size_t>(i)];
        text += trace.name + printed("  peak %.4g", trace.peak) +
                printed("  RMS %.4g\n", trace.rms()) + drawTrace(trace, size.columns - 1, height);
    }
    return text + (error.empty() ? "" : error + '\n');
}

/// Has gnuplot draw everything that was read, one plot for each channel.
void savePicture(const Settings& settings, const std::vector<Trace>& traces, double rate)
{
    auto* const onPipe = std::signal(SIGPIPE, SIG_IGN); // a gnuplot that ends early is told below
    // NOLINTNEXTLINE(cert-env33-c): nothing of the command comes from outside
    std::FILE* const plot = ::popen(settings.json ? "gnuplot 2>/dev/null" : "gnuplot", "w");
    if (plot == nullptr) {
        throw Failure("", "gnuplot cannot be started");
    }
    const double unit = rate > 0 ? 1 / rate : 1;
    std::fprintf(plot,
                 "set terminal png size 1000,%zu\nset output %s\nset multiplot layout %zu,1\n"
                 "set xlabel '%s'\nset grid\nunset key\n",
                 100 + 200 * traces.size(), quoted(settings.png, "''").c_str(), traces.size(),
                 rate > 0 ? "seconds" : "counts");
    for (const Trace& trace : traces) {
        const double step = trace.envelope.getSamplesOfEach() * unit;
        std::fprintf(plot,
                     "set title %s noenhanced\nplot '-' with filledcurves, '-' with lines lc 1\n",
                     quoted(trace.name, "''").c_str());
        for (int twice = 0; twice < 2; ++twice) { // the area between, and its upper edge
            double x = 0;
            for (const Range& range : trace.envelope.getRanges()) {
                std::fprintf(plot, twice == 0 ? "%.9g %.9g %.9g\n" : "%.9g %.9g\n", x, range.high,
                             range.low);
                x += step;
            }
            std::fputs("e\n", plot);
        }
    }
    std::fputs("unset multiplot\n", plot);
    const int result = ::pclose(plot);
    std::signal(SIGPIPE, onPipe);
    if (result != 0) {
        throw Failure("", "gnuplot could not write " + settings.png + "; is it installed?");
    }
}

/// Adds the samples of a buffer.
void add(std::vector<Trace>& traces, const Reading& reading, std::size_t counts, std::size_t window)
{
    if (traces.empty()) {
        for (const std::string& name : columnNames(reading.getFields())) {
            traces.emplace_back().name = name;
        }
    }
    std::size_t trace = 0;
    for (const Field& field : reading.getFields()) {
        for (std::size_t channel = 0; channel < field.perCount; ++channel, ++trace) {
            for (std::size_t row = 0; row < counts; ++row) {
                traces[trace].add(
                    field.type->toDouble(
                        &field.elements[(row * field.perCount + channel) * field.type->size]),
                    window);
            }
        }
    }
}

double bufferFill(Channel& channel)
{
    const double available = channel.inputAvailable();
    double space = 0;
    channel.check(coderStreamGetSpaceAvailable(channel.inputStream(), &space));
    return available > 0 ? available / (available + space) : 0;
}

} // namespace

ExitCode showScope(const Settings& settings)
{
    Channel channel(settings.channel, Use::Read);
    const double rate = countRate(channel, settings.file);
    channel.open(settings.channel);
    Reading reading(channel, settings, rate);
    const bool live = !settings.json && isatty(STDOUT_FILENO) != 0;
    std::vector<Trace> traces;
    std::string error;
    double drawn = -1;
    double fill = 0;
    std::string title = settings.channel.device;
    std::optional<Screen> screen;
    if (live) {
        const auto port = chosenPort(channel, settings.channel);
        title += port ? "  LocalPort " + std::to_string(*port) : "";
        screen.emplace();
    } else {
        tellPort(channel, settings);
    }
    const auto failure = caught([&] {
        while (!reading.isOver() && !(live && Screen::isTyped('q'))) {
            fill = bufferFill(channel);
            if (const std::size_t counts = reading.next(); counts > 0) {
                add(traces, reading, counts, settings.window);
            }
            if (const auto raised = channel.deviceError()) {
                error = printable(raised->text());
                if (!live) {
                    report(settings, *raised);
                }
            }
            if (live && reading.getSeconds() - drawn > 0.04) {
                Screen::show(draw(title, traces, reading.getSeconds(), fill, error, true));
                drawn = reading.getSeconds();
            }
        }
    });
    screen.reset();
    const double seconds = reading.getSeconds();
    if (settings.json) {
        Json list = Json::array();
        for (const Trace& trace : traces) {
            list.push_back({{"name", trace.name}, {"peak", trace.peak}, {"rms", trace.rms()}});
        }
        printJson(std::cout,
                  {{"counts", static_cast<std::int64_t>(reading.getCounts())},
                   {"seconds", seconds},
                   {"channels", list}},
                  2);
    } else {
        std::cout << draw(title, traces, seconds, fill, error, false);
    }
    const auto noPicture = caught([&] {
        if (!settings.png.empty() && !traces.empty()) {
            savePicture(settings, traces, rate);
        }
    });
    channel.finish(failure ? failure : noPicture);
    return error.empty() ? Success : Failed;
}

} // namespace brenix
