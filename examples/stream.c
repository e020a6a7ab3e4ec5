/*
 * Two channels at once: sends a test signal to a TCP peer that returns it, such as
 *
 *     socat TCP-LISTEN:5000,bind=127.0.0.1 EXEC:cat
 *     stream 127.0.0.1 5000
 *
 * and compares what comes back. Half-way it doubles the signal's frequency with a command, and
 * halves what comes back with a filter that it tunes while data flows. Asynchronous errors are
 * polled. The exit code is 1 on an error or a difference, 2 on wrong usage.
 */
#define _POSIX_C_SOURCE 199309L

#include "check.h"

#include <stdlib.h>
#include <string.h>
#include <time.h>

enum {
    BLOCK_FRAMES = 480, /* a hundredth of a second */
    FRAMES = 100 * BLOCK_FRAMES,
    PATIENCE_MS = 10000
};

/* Everything sent, and how much of it has come back. */
static double sent[FRAMES];
static int sentCount;
static int returnedCount;
static int halvedFrom = -1; /* the first sample that came back halved */

/* Compares samples that came back: each is as it was sent, or, from some sample on, halved. */
static int compare(const double* samples, int count)
{
    for (int i = 0; i < count; ++i, ++returnedCount) {
        const double expected = sent[returnedCount];
        if (halvedFrom < 0 && samples[i] != expected) {
            halvedFrom = returnedCount;
        }
        if (samples[i] != (halvedFrom < 0 ? expected : 0.5 * expected)) {
            fprintf(stderr, "Sample %d was sent as %g and came back as %g.\n", returnedCount,
                    expected, samples[i]);
            return 0;
        }
    }
    return 1;
}

/* Takes one waiting buffer of at most `most` samples out of a channel; -1 on an error. */
static int readBuffer(void* channel, double* samples, int most)
{
    void* const input = coderChannelGetInputStream(channel);
    double total = 0.0;
    double counts = 0.0;
    double buffers = 1.0;
    if (!check(channel, "coderInputStreamPeek",
               coderInputStreamPeek(input, &total, &counts, &buffers, most))) {
        return -1;
    }
    if (buffers == 0.0) {
        return 0;
    }
    if (!check(channel, "coderInputStreamReadBuffers",
               coderInputStreamReadBuffers(input, counts, 1.0)) ||
        !check(
            channel, "coderInputStreamReadBufferData",
            coderInputStreamReadBufferData(input, 1, 0, "data", "double", (int)counts, samples))) {
        return -1;
    }
    return (int)counts;
}

/* Sends a block of the signal, if one is ready. Returns its length, -1 on an error. */
static int sendBlock(void* signal, void* peer)
{
    double written = 0.0;
    const int count = readBuffer(signal, sent + sentCount, FRAMES - sentCount);
    if (count <= 0) {
        return count;
    }
    if (!check(peer, "coderOutputStreamWriteTypedDataOld",
               coderOutputStreamWriteTypedDataOld(coderChannelGetOutputStream(peer), &written, 1,
                                                  "double",
                                                  CODER_BUFFER(count, sent + sentCount)))) {
        return -1;
    }
    sentCount += count;
    return count;
}

/* Takes a block that came back, if there is one. Returns its length, -1 on an error. */
static int receiveBlock(void* peer)
{
    double samples[BLOCK_FRAMES];
    const int count = readBuffer(peer, samples, BLOCK_FRAMES);
    return count > 0 && !compare(samples, count) ? -1 : count;
}

/* Changes the signal by a command and what comes back by a filter, both while data flows. */
static int change(void* signal, void* peer)
{
    double frequency = 0.0;
    const double gain = 0.5;
    if (!check(signal, "coderChannelGetPropertyValue",
               coderChannelGetPropertyValue(signal, "Frequency", "double", 1, &frequency))) {
        return 0;
    }
    frequency *= 2.0;
    if (!check(signal, "coderChannelExecute",
               coderChannelExecute(signal, "set", 1,
                                   CODER_OPTION("Frequency", "double", 1, &frequency))) ||
        !check(signal, "coderChannelGetPropertyValue",
               coderChannelGetPropertyValue(signal, "Frequency", "double", 1, &frequency)) ||
        !check(peer, "coderStreamTuneFilters",
               coderStreamTuneFilters(coderChannelGetInputStream(peer), 1,
                                      CODER_OPTION("Gain", "double", 1, &gain)))) {
        return 0;
    }
    printf("after %d samples: %g Hz, and what comes back is halved\n", sentCount, frequency);
    return 1;
}

/* Moves data both ways until all has come back. */
static int exchange(void* signal, void* peer)
{
    const struct timespec pause = {0, 1000000};
    int changed = 0;
    int idle = 0;
    while (returnedCount < FRAMES) {
        const int out = sentCount < FRAMES ? sendBlock(signal, peer) : 0;
        const int in = out < 0 ? -1 : receiveBlock(peer);
        if (in < 0 || !checkDevice(signal) || !checkDevice(peer)) {
            return 0;
        }
        if (!changed && sentCount >= FRAMES / 2) {
            if (!change(signal, peer)) {
                return 0;
            }
            changed = 1;
        }
        idle = out > 0 || in > 0 ? 0 : idle + 1;
        if (idle == PATIENCE_MS) {
            fprintf(stderr, "Of %d samples %d came back.\n", sentCount, returnedCount);
            return 0;
        }
        if (idle > 0) {
            (void)nanosleep(&pause, NULL);
        }
    }
    printf("sent %d samples, all came back, halved from sample %d on\n", sentCount, halvedFrom);
    return 1;
}

static int openSignal(void* signal)
{
    const int block = BLOCK_FRAMES;
    return check(signal, "coderChannelInit",
                 coderChannelInit(signal, 1, CODER_OPTION("BlockSize", "int32", 1, &block))) &&
           check(signal, "coderChannelOpen", coderChannelOpen(signal, 0));
}

static int openPeer(void* peer, const char* host, int port)
{
    return check(peer, "coderChannelInit",
                 coderChannelInit(peer, 3, CODER_OPTION("Host", "char", strlen(host), host),
                                  CODER_OPTION("Port", "int32", 1, &port),
                                  CODER_OPTION("ElementType", "char", 6, "double"))) &&
           check(peer, "coderStreamAddFilter",
                 coderStreamAddFilter(coderChannelGetInputStream(peer), "scale", 0)) &&
           check(peer, "coderChannelOpen", coderChannelOpen(peer, 0));
}

int main(int argc, char** argv)
{
    void* signal;
    void* peer;
    int ok;
    char* end = NULL;
    const int port = argc == 3 ? (int)strtol(argv[2], &end, 10) : 0;
    if (argc != 3 || end == argv[2] || *end != '\0') {
        fputs("usage: stream HOST PORT\n", stderr);
        return 2;
    }
    signal = createChannel("signal", "identity", 16.0 * BLOCK_FRAMES, 0.0);
    peer = createChannel("tcp", "identity", 16.0 * BLOCK_FRAMES, 16.0 * BLOCK_FRAMES);
    ok = signal != NULL && peer != NULL && openPeer(peer, argv[1], port) && openSignal(signal) &&
         exchange(signal, peer);
    ok = finishChannel(signal) && ok;
    ok = finishChannel(peer) && ok;
    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
