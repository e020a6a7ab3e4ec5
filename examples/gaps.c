/*
 * Reads a signal that does not wait, is busy for a while, and says what it has missed: where, how many
 * counts, and for how long. Half a second of a tone at 48 kHz, of which the stream buffers 30 ms.
 *
 * Prints a line a gap and a summary. The exit code is 0 when every count was read or told as lost, else 1.
 */
#define _POSIX_C_SOURCE 200809L

#include "check.h"

#include <stdint.h>
#include <stdlib.h>
#include <time.h>

enum { BLOCK = 480, BUFFERED = 3 * BLOCK, TOTAL = 24000 };

struct Position {
    uint64_t next; /* the number of the count that should come next */
    int64_t time;  /* and when, in nanoseconds since 1970 */
    uint64_t missed;
};

static int setUp(void* channel)
{
    const int32_t block = BLOCK;
    const int32_t total = TOTAL;
    const uint8_t stamps = 1;
    return check(channel, "coderChannelInit",
                 coderChannelInit(channel, 5, CODER_OPTION("Pace", "char", 4, "live"),
                                  CODER_OPTION("BlockSize", "int32", 1, &block),
                                  CODER_OPTION("Frames", "int32", 1, &total),
                                  CODER_OPTION("Stamps", "logical", 1, &stamps),
                                  CODER_OPTION("Overflow", "char", 10, "dropOldest"))) &&
           check(channel, "coderChannelOpen", coderChannelOpen(channel, 0));
}

/* Compares the stamps of the buffer that was read with what should have come. */
static int compare(void* channel, void* input, double counts, struct Position* position)
{
    uint64_t index = 0;
    int64_t time = 0;
    if (!check(channel, "coderInputStreamReadBufferData",
               coderInputStreamReadBufferData(input, 1, 0, "Index", "uint64", 1, &index)) ||
        !check(channel, "coderInputStreamReadBufferData",
               coderInputStreamReadBufferData(input, 1, 0, "Time", "int64", 1, &time))) {
        return 0;
    }
    if (index != position->next) {
        const uint64_t gap = index - position->next;
        printf("gap: %lu counts from %lu on", (unsigned long)gap, (unsigned long)position->next);
        if (position->next > 0) { /* then it is known when it began */
            printf(", %.1f ms", 1e-6 * (double)(time - position->time));
        }
        printf("\n");
        position->missed += gap;
    }
    position->next = index + (uint64_t)counts;
    position->time = time + (int64_t)(counts / 48000.0 * 1e9);
    return 1;
}

static int readAll(void* channel, struct Position* position)
{
    const struct timespec pause = {0, 1000000};
    const struct timespec busy = {0, 200000000};
    void* const input = coderChannelGetInputStream(channel);
    int buffer = 0;
    for (;;) {
        uint8_t done = 0;
        double total = 0.0;
        double counts = 0.0;
        double buffers = 1.0;
        if (!check(channel, "coderStreamIsDeviceDone", coderStreamIsDeviceDone(input, &done)) ||
            !check(channel, "coderInputStreamPeek",
                   coderInputStreamPeek(input, &total, &counts, &buffers, BLOCK))) {
            return 0;
        }
        if (buffers > 0.0) {
            if (!check(channel, "coderInputStreamReadBuffers",
                       coderInputStreamReadBuffers(input, counts, 1.0)) ||
                !compare(channel, input, counts, position)) {
                return 0;
            }
            if (++buffer == 5) {
                (void)nanosleep(&busy, NULL); /* the program has something else to do */
            }
        } else if (done) {
            return 1;
        } else {
            (void)nanosleep(&pause, NULL);
        }
    }
}

int main(void)
{
    struct Position position = {0, 0, 0};
    uint64_t lost = 0;
    void* const channel = createChannel("signal", "identity", BUFFERED, 0.0);
    int ok = channel != NULL && setUp(channel) && readAll(channel, &position) &&
             check(channel, "coderChannelGetPropertyValue",
                   coderChannelGetPropertyValue(channel, "LostCounts", "uint64", 1, &lost));
    if (ok) {
        printf("read %lu counts, missed %lu, the core says %lu\n",
               (unsigned long)(position.next - position.missed), (unsigned long)position.missed,
               (unsigned long)lost);
        ok = position.next == TOTAL && position.missed == lost;
        (void)checkDevice(channel); /* prints the last gap as the core tells it */
    }
    return finishChannel(channel) && ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
