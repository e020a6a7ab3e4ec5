/*
 * One reader of many writers: counts what comes from each of them until they have ended. The first argument is
 * a device, the others are its options, such as
 *
 *     collect zmq Endpoint=tcp://127.0.0.1:5000 Pattern=pull Bind=1 Writers=2
 *
 * Once a second and at the end it prints for each source how many counts came, how many a second, and how many
 * are missing. The exit code is 1 on an error, 2 on wrong usage.
 */
#define _POSIX_C_SOURCE 199309L

#include "check.h"

#include <stdint.h>
#include <stdlib.h>
#include <time.h>

enum { MOST_OPTIONS = 8, MOST_SOURCES = 64 };

struct Option {
    char name[64];
    const char* type;
    int count;
    const void* value;
    double number;
};

struct Source {
    char name[256];
    double counts;
    uint64_t next; /* the number of the count that should come next */
    uint64_t missing;
};

static struct Source sources[MOST_SOURCES];
static int sourceCount;

/* From Name=value; a value that is a number is given as one. */
static int parseOption(const char* text, struct Option* option)
{
    const char* const equals = strchr(text, '=');
    char* end = NULL;
    if (equals == NULL || equals - text >= (int)sizeof option->name) {
        return 0;
    }
    memcpy(option->name, text, (size_t)(equals - text));
    option->number = strtod(equals + 1, &end);
    if (end != equals + 1 && *end == '\0') {
        option->type = "double";
        option->count = 1;
        option->value = &option->number;
    } else {
        option->type = "char";
        option->count = (int)strlen(equals + 1);
        option->value = equals + 1;
    }
    return 1;
}

/* A list of options has as many as are told; it does not look at those behind. */
static int setUp(void* channel, uint64_t count, struct Option* options)
{
    static const uint8_t stamps = 1;
    struct Option* const last = &options[count];
    memcpy(last->name, "Stamps", sizeof "Stamps");
    last->type = "logical";
    last->count = 1;
    last->value = &stamps;
#define OPTION(i) CODER_OPTION(options[i].name, options[i].type, options[i].count, options[i].value)
    return check(channel, "coderChannelInit",
                 coderChannelInit(channel, count + 1, OPTION(0), OPTION(1), OPTION(2), OPTION(3),
                                  OPTION(4), OPTION(5), OPTION(6), OPTION(7), OPTION(8))) &&
           check(channel, "coderChannelOpen", coderChannelOpen(channel, 0));
}

static struct Source* findSource(const char* name)
{
    struct Source* source = sources;
    while (source < sources + sourceCount && strcmp(source->name, name) != 0) {
        ++source;
    }
    if (source == sources + MOST_SOURCES) {
        fprintf(stderr, "More than %d sources.\n", MOST_SOURCES);
        return NULL;
    }
    if (source == sources + sourceCount) {
        ++sourceCount;
        memcpy(source->name, name, sizeof source->name);
    }
    return source;
}

/* Counts a buffer that was read. */
static int add(void* channel, void* input, double counts)
{
    char name[sizeof sources[0].name] = "";
    uint64_t index = 0;
    struct Source* source;
    if (!check(channel, "coderInputStreamReadBufferData",
               coderInputStreamReadBufferData(input, 1, 0, "Source", "char", sizeof name, name)) ||
        !check(channel, "coderInputStreamReadBufferData",
               coderInputStreamReadBufferData(input, 1, 0, "Index", "uint64", 1, &index))) {
        return 0;
    }
    source = findSource(name);
    if (source == NULL) {
        return 0;
    }
    if (source->counts > 0.0) { /* one that comes late has missed nothing */
        source->missing += index - source->next;
    }
    source->next = index + (uint64_t)counts;
    source->counts += counts;
    return 1;
}

static void print(double seconds)
{
    for (int i = 0; i < sourceCount; ++i) {
        printf("%s: %.0f counts, %.0f a second, %lu missing\n", sources[i].name, sources[i].counts,
               sources[i].counts / seconds, (unsigned long)sources[i].missing);
    }
    (void)fflush(stdout);
}

static double now(void)
{
    struct timespec time;
    (void)clock_gettime(CLOCK_MONOTONIC, &time);
    return (double)time.tv_sec + 1e-9 * (double)time.tv_nsec;
}

static int collect(void* channel)
{
    const struct timespec pause = {0, 1000000};
    void* const input = coderChannelGetInputStream(channel);
    const double start = now();
    double printed = start;
    for (;;) {
        uint8_t done = 0;
        double total = 0.0;
        double counts = 0.0;
        double buffers = 1.0;
        if (!checkDevice(channel) ||
            !check(channel, "coderStreamIsDeviceDone", coderStreamIsDeviceDone(input, &done)) ||
            !check(channel, "coderInputStreamPeek",
                   coderInputStreamPeek(input, &total, &counts, &buffers, 1e9))) {
            return 0;
        }
        if (buffers > 0.0) {
            if (!check(channel, "coderInputStreamReadBuffers",
                       coderInputStreamReadBuffers(input, counts, 1.0)) ||
                !add(channel, input, counts)) {
                return 0;
            }
        } else if (done) {
            print(now() - start);
            return 1;
        } else {
            (void)nanosleep(&pause, NULL);
        }
        if (now() - printed >= 1.0) {
            printed = now();
            print(printed - start);
        }
    }
}

int main(int argc, char** argv)
{
    struct Option options[MOST_OPTIONS + 1] = {{"", NULL, 0, NULL, 0.0}};
    uint64_t lost = 0;
    void* channel;
    int ok = argc >= 2 && argc - 2 <= MOST_OPTIONS;
    for (int i = 2; ok && i < argc; ++i) {
        ok = parseOption(argv[i], &options[i - 2]);
    }
    if (!ok) {
        fputs("usage: collect DEVICE NAME=VALUE...\n", stderr);
        return 2;
    }
    lossIsFailure = 0; /* it is told, and the others go on */
    channel = createChannel(argv[1], "identity", 1e6, 0.0);
    ok = channel != NULL && setUp(channel, (uint64_t)(argc - 2), options) && collect(channel) &&
         check(channel, "coderChannelGetPropertyValue",
               coderChannelGetPropertyValue(channel, "LostCounts", "uint64", 1, &lost));
    if (ok) {
        printf("%d sources, %lu counts lost\n", sourceCount, (unsigned long)lost);
    }
    return finishChannel(channel) && ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
