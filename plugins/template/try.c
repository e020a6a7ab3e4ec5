/* Runs the three plug-ins of this folder: prints the numbers 0 to 7, none above 5. Exits with 0, or with
   1 after an error of a call or of the device. */
#include <brenixcoder/coder.h>
#include <stdio.h>

static int show(void* input)
{
    uint32_t values[4];
    if (!coderInputStreamReadBuffers(input, 8.0, 2.0)) {
        return 0;
    }
    for (int32_t buffer = 1; buffer <= 2; ++buffer) {
        if (!coderInputStreamReadBufferData(input, buffer, 0, "Values", "uint32", 4, values)) {
            return 0;
        }
        for (int i = 0; i < 4; ++i) {
            printf("%u ", (unsigned)values[i]);
        }
    }
    printf("\n");
    return 1;
}

static int run(void* channel)
{
    const double highest = 5.0;
    if (!coderChannelInit(channel, 0)) {
        return 0;
    }
    void* const input = coderChannelGetInputStream(channel);
    return coderStreamAddFilter(input, "./clip.so", 1,
                                CODER_OPTION("Highest", "double", 1, &highest)) &&
           coderChannelOpen(channel, 0) && show(input) && coderChannelClose(channel) &&
           coderChannelTerm(channel);
}

int main(void)
{
    char id[CODER_ERROR_SIZE];
    char message[CODER_ERROR_SIZE];
    void* const channel = coderChannelCreate("./counter.so", "./rename.so", id, message, 8.0, 0.0);
    if (channel == NULL) {
        fprintf(stderr, "%s: %s\n", id, message);
        return 1;
    }
    int ok = run(channel);
    if (!ok) {
        coderChannelGetLastError(channel, id, message);
        if (id[0] == '\0') { /* then a plug-in raised an error inside the call */
            coderChannelGetLastSyncError(channel, id, message);
        }
        if (message[0] == '\0') { /* then the core may know why */
            coderChannelGetPropertyValue(channel, "Reason", "char", CODER_ERROR_SIZE, message);
        }
        fprintf(stderr, "%s: %s\n", id, message);
        coderChannelClose(channel); /* these two do nothing if there is nothing to do */
        coderChannelTerm(channel);
    }
    coderChannelGetLastAsyncError(channel, id, message);
    if (id[0] != '\0') {
        fprintf(stderr, "device: %s: %s\n", id, message);
        ok = 0;
    }
    coderChannelDestroy(channel);
    return ok ? 0 : 1;
}
