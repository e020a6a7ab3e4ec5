/* Runs the three plug-ins of this folder: prints the numbers 0 to 7, none above 5. */
#include <brenixcoder/coder.h>
#include <stdio.h>

static int fail(void* channel)
{
    char id[CODER_ERROR_SIZE] = "";
    char message[CODER_ERROR_SIZE] = "";
    (void)coderChannelGetLastError(channel, id, message);
    fprintf(stderr, "%s: %s\n", id, message);
    coderChannelClose(channel); /* these two do nothing if there is nothing to do */
    coderChannelTerm(channel);
    coderChannelDestroy(channel);
    return 1;
}

int main(void)
{
    char id[CODER_ERROR_SIZE];
    char message[CODER_ERROR_SIZE];
    const double highest = 5.0;
    uint32_t values[4];
    void* const channel = coderChannelCreate("./counter.so", "./rename.so", id, message, 8.0, 0.0);
    if (channel == NULL) {
        fprintf(stderr, "%s: %s\n", id, message);
        return 1;
    }
    if (!coderChannelInit(channel, 0)) {
        return fail(channel);
    }
    void* const input = coderChannelGetInputStream(channel);
    if (!coderStreamAddFilter(input, "./clip.so", 1,
                              CODER_OPTION("Highest", "double", 1, &highest)) ||
        !coderChannelOpen(channel, 0) || !coderInputStreamReadBuffers(input, 8.0, 2.0)) {
        return fail(channel);
    }
    for (int32_t buffer = 1; buffer <= 2; ++buffer) {
        if (!coderInputStreamReadBufferData(input, buffer, 0, "Values", "uint32", 4, values)) {
            return fail(channel);
        }
        for (int i = 0; i < 4; ++i) {
            printf("%u ", (unsigned)values[i]);
        }
    }
    printf("\n");
    if (!coderChannelClose(channel) || !coderChannelTerm(channel)) {
        return fail(channel);
    }
    coderChannelDestroy(channel);
    return 0;
}
