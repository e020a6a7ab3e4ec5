/*
 * Writes buffers of each element type through the loopback device and compares what comes back.
 *
 * Prints one line a type. The exit code is 0 when everything came back as it was written, else 1.
 */
#include "check.h"

#include <float.h>
#include <math.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>

enum { CAPACITY = 64 };

/* One buffer to write: `count` elements of `size` bytes. */
struct Buffer {
    const char* typeName;
    int count;
    size_t size;
    const void* data;
};

#define BUFFER(typeName, array)                                                                    \
    {                                                                                              \
        typeName, (int)(sizeof(array) / sizeof((array)[0])), sizeof((array)[0]), array             \
    }

static const double doubles[] = {0.0, -0.0, 1.0 / 3.0, -DBL_MAX, DBL_MIN, (double)INFINITY};
static const float floats[] = {0.0F, -0.0F, 1.0F / 3.0F, -FLT_MAX, FLT_MIN, INFINITY};
static const int8_t int8s[] = {0, 1, -1, INT8_MIN, INT8_MAX};
static const int16_t int16s[] = {0, 1, -1, INT16_MIN, INT16_MAX};
static const int32_t int32s[] = {0, 1, -1, INT32_MIN, INT32_MAX};
static const int64_t int64s[] = {0, 1, -1, INT64_MIN, INT64_MAX};
static const uint8_t uint8s[] = {0, 1, 2, UINT8_MAX};
static const uint16_t uint16s[] = {0, 1, 2, UINT16_MAX};
static const uint32_t uint32s[] = {0, 1, 2, UINT32_MAX};
static const uint64_t uint64s[] = {0, 1, 2, UINT64_MAX};
static const uint8_t logicals[] = {1, 0, 0, 1, 1, 0};
static const char text[] = "Text is ASCII.";

static const struct Buffer buffers[] = {
    BUFFER("double", doubles), BUFFER("float", floats),     BUFFER("int8", int8s),
    BUFFER("int16", int16s),   BUFFER("int32", int32s),     BUFFER("int64", int64s),
    BUFFER("uint8", uint8s),   BUFFER("uint16", uint16s),   BUFFER("uint32", uint32s),
    BUFFER("uint64", uint64s), BUFFER("logical", logicals), BUFFER("char", text),
};

/* Reads a buffer back and compares it with what was written, element for element. */
static int isSame(void* channel, void* input, int index, const struct Buffer* written)
{
    const unsigned char* const expected = (const unsigned char*)written->data;
    unsigned char read[CAPACITY * sizeof(double)];
    int same = 1;
    /* No element written begins like this, so an element that was not copied out shows. */
    memset(read, 0xA5, sizeof(read));
    if (!check(channel, "coderInputStreamReadBufferData",
               coderInputStreamReadBufferData(input, index, 0, "data", written->typeName, CAPACITY,
                                              read))) {
        return 0;
    }
    for (int i = 0; i < written->count; ++i) {
        const size_t offset = (size_t)i * written->size;
        if (memcmp(expected + offset, read + offset, written->size) != 0) {
            fprintf(stderr, "%s: element %d of buffer %d came back different\n", written->typeName,
                    i + 1, index);
            same = 0;
        }
    }
    return same;
}

/* Writes the elements as one buffer, and the first of them as another, with one call. */
static int echo(void* channel, void* output, void* input, const struct Buffer* all)
{
    struct Buffer first = *all;
    double written = 0.0;
    int same;
    first.count = 1;

    if (!check(channel, "coderOutputStreamWriteTypedDataOld",
               coderOutputStreamWriteTypedDataOld(output, &written, 2, all->typeName,
                                                  CODER_BUFFER(all->count, all->data),
                                                  CODER_BUFFER(first.count, first.data)))) {
        return 0;
    }
    /* Waits until the device has sent both back. */
    if (!check(channel, "coderInputStreamReadBuffers",
               coderInputStreamReadBuffers(input, written, 2.0))) {
        return 0;
    }
    same = isSame(channel, input, 1, all);
    same = isSame(channel, input, 2, &first) && same;
    coderInputStreamFreeBuffer(input, 1);
    coderInputStreamFreeBuffer(input, 2);

    printf("%-8s %2d elements and 1, counted as %2.0f: %s\n", all->typeName, all->count, written,
           same ? "the same" : "DIFFERENT");
    return same && checkDevice(channel);
}

static int echoAll(void* channel)
{
    void* const output = coderChannelGetOutputStream(channel);
    void* const input = coderChannelGetInputStream(channel);
    int ok = 1;
    if (!check(channel, "coderChannelOpen", coderChannelOpen(channel, 0))) {
        return 0;
    }
    for (size_t i = 0; i < sizeof(buffers) / sizeof(buffers[0]); ++i) {
        ok = echo(channel, output, input, &buffers[i]) && ok;
    }
    return ok;
}

int main(void)
{
    int ok;
    void* const channel = createChannel("loopback", "identity", (double)INFINITY, (double)INFINITY);
    if (channel == NULL) {
        return EXIT_FAILURE;
    }
    ok = check(channel, "coderChannelInit", coderChannelInit(channel, 0)) && echoAll(channel);
    ok = finishChannel(channel) && ok;
    return ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
