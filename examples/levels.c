/*
 * Shows the levels of a sound file: a waveform of each channel, a meter, peak and RMS.
 *
 *     levels FILE
 *
 * The device delivers the file in blocks of interleaved samples, the converter makes one field of
 * each channel: Data1, Data2 and so on. On a terminal the picture grows as the file is read;
 * otherwise only the final picture is printed. The exit code is 1 on an error, 2 on wrong usage.
 */
#define _POSIX_C_SOURCE 200112L

#include "check.h"

#include <math.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

enum {
    BLOCK_FRAMES = 1024,
    BUFFERED_BLOCKS = 16,
    MAX_CHANNELS = 8,
    COLUMNS = 72,  /* of a waveform */
    ROWS = 9,      /* of a waveform; each shows two levels */
    METER = 60,    /* columns of a meter, and the decibels that it spans */
    REDRAW_MS = 40 /* least time between two pictures on a terminal */
};

#define RED "\033[31m"
#define YELLOW "\033[33m"
#define GREEN "\033[32m"
#define PLAIN "\033[0m"

/* What is kept of one channel of sound. */
struct Levels {
    double peak;
    double sumOfSquares;
    double lowest[COLUMNS];
    double highest[COLUMNS];
};

struct Sound {
    unsigned channels;
    double sampleRate;
    int64_t expectedFrames; /* as the file's header has it */
    int64_t frames;         /* read so far */
    struct Levels levels[MAX_CHANNELS];
};

static struct Sound sound;
static int onTerminal;

/* --- Measuring --- */

static void measure(struct Levels* levels, const double* samples, int count)
{
    for (int i = 0; i < count; ++i) {
        const double sample = samples[i];
        const int64_t frame = sound.frames + i;
        /* A file may hold other than its header says. */
        const int column = frame < sound.expectedFrames
                               ? (int)(frame * COLUMNS / sound.expectedFrames)
                               : COLUMNS - 1;
        levels->peak = fmax(levels->peak, fabs(sample));
        levels->sumOfSquares += sample * sample;
        levels->lowest[column] = fmin(levels->lowest[column], sample);
        levels->highest[column] = fmax(levels->highest[column], sample);
    }
}

/* The root of the mean square of the channels from `first` up to `last`. */
static double rms(unsigned first, unsigned last)
{
    double sum = 0.0;
    for (unsigned i = first; i < last; ++i) {
        sum += sound.levels[i].sumOfSquares;
    }
    return sound.frames == 0 ? 0.0 : sqrt(sum / ((double)sound.frames * (last - first)));
}

static double overallPeak(void)
{
    double peak = 0.0;
    for (unsigned i = 0; i < sound.channels; ++i) {
        peak = fmax(peak, sound.levels[i].peak);
    }
    return peak;
}

static double decibels(double level)
{
    return 20.0 * log10(level);
}

/* --- Drawing --- */

static const char* channelName(unsigned channel)
{
    static char name[24];
    if (sound.channels == 1) {
        return "Mono";
    }
    if (sound.channels == 2) {
        return channel == 0 ? "Left" : "Right";
    }
    (void)snprintf(name, sizeof(name), "Channel %u", channel + 1);
    return name;
}

/* The waveform, its largest level at the upper and lower edge. Prints ROWS lines. */
static void drawWaveform(const struct Levels* levels, double scale)
{
    for (int row = 0; row < ROWS; ++row) {
        /* The middles of the upper and the lower half of the row. */
        const double upper = scale * (1.0 - (4 * row + 1) / (2.0 * ROWS));
        const double lower = scale * (1.0 - (4 * row + 3) / (2.0 * ROWS));
        if (row == 0) {
            printf("%+6.3f ", scale);
        } else if (row == ROWS / 2) {
            printf("%6s ", "0");
        } else if (row == ROWS - 1) {
            printf("%+6.3f ", -scale);
        } else {
            printf("%7s", "");
        }
        for (int column = 0; column < COLUMNS; ++column) {
            const double low = levels->lowest[column];
            const double high = levels->highest[column];
            const int hasUpper = low <= upper && upper <= high;
            const int hasLower = low <= lower && lower <= high;
            const char* const blank = row == ROWS / 2 ? "─" : " ";
            fputs(hasUpper ? (hasLower ? "█" : "▀") : (hasLower ? "▄" : blank), stdout);
        }
        putchar('\n');
    }
}

/* A bar up to the RMS and a mark at the peak, from -METER dB to 0 dB. Prints one line. */
static void drawMeter(unsigned channel)
{
    const double bar = decibels(rms(channel, channel + 1)) + METER;
    const double mark = decibels(sound.levels[channel].peak) + METER;
    printf("%-10s ", channelName(channel));
    for (int column = 0; column < METER; ++column) {
        const int hasMark = column <= mark && (mark < column + 1 || column == METER - 1);
        if (onTerminal && column == 0) {
            fputs(GREEN, stdout);
        } else if (onTerminal && column == METER - 12) {
            fputs(YELLOW, stdout);
        } else if (onTerminal && column == METER - 3) {
            fputs(RED, stdout);
        }
        fputs(hasMark ? "┃" : column + 0.5 < bar ? "█" : "·", stdout);
    }
    printf("%s\n", onTerminal ? PLAIN : "");
}

/* Draws the picture, over the previous one if told so. */
static void draw(int again)
{
    const int lines = (int)sound.channels * (ROWS + 2) + 1;
    const double scale = fmax(overallPeak(), 0.001);
    if (again) {
        printf("\033[%dA", lines);
    }
    for (unsigned i = 0; i < sound.channels; ++i) {
        printf("%s\n", channelName(i));
        drawWaveform(&sound.levels[i], scale);
    }
    for (unsigned i = 0; i < sound.channels; ++i) {
        drawMeter(i);
    }
    printf("%-11s", "dB");
    for (int level = -METER; level < 0; level += 10) {
        printf("%-10d", level);
    }
    puts("0");
    (void)fflush(stdout);
}

static void printNumbers(void)
{
    printf("\n%-10s %10s %9s %10s %9s\n", "", "peak", "dB", "RMS", "dB");
    for (unsigned i = 0; i <= sound.channels; ++i) {
        const int all = i == sound.channels;
        const double peak = all ? overallPeak() : sound.levels[i].peak;
        const double mean = all ? rms(0, sound.channels) : rms(i, i + 1);
        printf("%-10s %10.6f %9.2f %10.6f %9.2f\n", all ? "Overall" : channelName(i), peak,
               decibels(peak), mean, decibels(mean));
    }
}

/* --- Reading --- */

/* Milliseconds of a clock that runs evenly. */
static int64_t now(void)
{
    struct timespec time;
    (void)clock_gettime(CLOCK_MONOTONIC, &time);
    return (int64_t)time.tv_sec * 1000 + time.tv_nsec / 1000000;
}

/* Takes the oldest block out of the stream and measures it, channel by channel. */
static int readBlock(void* channel, void* input, double frames)
{
    double samples[BLOCK_FRAMES];
    if (!check(channel, "coderInputStreamReadBuffers",
               coderInputStreamReadBuffers(input, frames, 1.0))) {
        return 0;
    }
    for (unsigned i = 0; i < sound.channels; ++i) {
        if (!check(channel, "coderInputStreamReadBufferData",
                   coderInputStreamReadBufferData(input, 1, (int32_t)(i + 1), "Data", "double",
                                                  BLOCK_FRAMES, samples))) {
            return 0;
        }
        measure(&sound.levels[i], samples, (int)frames);
    }
    coderInputStreamFreeBuffer(input, 1);
    sound.frames += (int64_t)frames;
    return 1;
}

/* Reads the file to its end. */
static int readSound(void* channel)
{
    void* const input = coderChannelGetInputStream(channel);
    const struct timespec pause = {0, 1000000};
    /* While the file is read only where the whole picture fits a common screen. */
    const int growing = onTerminal && sound.channels <= 2;
    int64_t drawn = 0;

    printf("%.3f s, %.0f Hz\n\n", (double)sound.expectedFrames / sound.sampleRate,
           sound.sampleRate);
    if (!check(channel, "coderChannelOpen", coderChannelOpen(channel, 0))) {
        return 0;
    }
    for (;;) {
        uint8_t done = 0;
        double total = 0.0;
        double frames = 0.0;
        double blocks = 1.0;
        /* Asked before the peek: a device that is done adds nothing to what the peek then sees. */
        if (!check(channel, "coderStreamIsDeviceDone", coderStreamIsDeviceDone(input, &done)) ||
            !check(channel, "coderInputStreamPeek",
                   coderInputStreamPeek(input, &total, &frames, &blocks, INFINITY))) {
            return 0;
        }
        if (blocks > 0.0) {
            if (!readBlock(channel, input, frames)) {
                return 0;
            }
            if (growing && now() - drawn >= REDRAW_MS) {
                draw(drawn != 0);
                drawn = now();
            }
        } else if (done) {
            break;
        } else {
            (void)nanosleep(&pause, NULL);
        }
        if (!checkDevice(channel)) {
            return 0;
        }
    }
    draw(drawn != 0);
    printNumbers();
    return checkDevice(channel);
}

/* Learns what is in the file. */
static int readProperties(void* channel)
{
    uint32_t channels = 0;
    if (!check(
            channel, "coderChannelGetPropertyValue",
            coderChannelGetPropertyValue(channel, "SampleRate", "double", 1, &sound.sampleRate)) ||
        !check(
            channel, "coderChannelGetPropertyValue",
            coderChannelGetPropertyValue(channel, "Frames", "int64", 1, &sound.expectedFrames)) ||
        !check(channel, "coderChannelGetPropertyValue",
               coderChannelGetPropertyValue(channel, "Channels", "uint32", 1, &channels))) {
        return 0;
    }
    if (channels > MAX_CHANNELS) {
        fprintf(stderr, "The file has %u channels; levels shows up to %d.\n", (unsigned)channels,
                (int)MAX_CHANNELS);
        return 0;
    }
    sound.channels = channels;
    return 1;
}

int main(int argc, char** argv)
{
    const uint32_t blockFrames = BLOCK_FRAMES;
    void* channel;
    int ok;
    if (argc != 2) {
        fputs("usage: levels FILE\n", stderr);
        return 2;
    }
    onTerminal = isatty(STDOUT_FILENO);
    channel = createChannel("audiofile", "columns", (double)BLOCK_FRAMES * BUFFERED_BLOCKS, 0.0);
    if (channel == NULL) {
        return EXIT_FAILURE;
    }
    ok = check(channel, "coderChannelInit",
               coderChannelInit(channel, 2,
                                CODER_OPTION("FileName", "char", strlen(argv[1]), argv[1]),
                                CODER_OPTION("BlockSize", "uint32", 1, &blockFrames))) &&
         readProperties(channel) && readSound(channel);
    ok = finishChannel(channel) && ok;
    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
