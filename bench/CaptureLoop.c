/* Captures sound by the device alsa and writes it to the standard output, as generated code would:
 *
 *     capture-loop CARD CHANNELS RATE BLOCK BUFFER SECONDS
 *
 * Samples are int32; BLOCK and BUFFER are frames. */

#include <brenixcoder/coder.h>

#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

static int copy(void* input, int channels, int block, int blocks)
{
    const size_t size = (size_t)channels * (size_t)block;
    int32_t* const samples = malloc(size * sizeof *samples);
    int ok = samples != NULL;
    while (ok && blocks-- > 0) {
        ok = coderInputStreamReadBuffers(input, block, 1.0) &&
             coderInputStreamReadBufferData(input, 1, 0, "data", "int32", (int32_t)size, samples) &&
             write(STDOUT_FILENO, samples, size * sizeof *samples) ==
                 (ssize_t)(size * sizeof *samples);
    }
    free(samples);
    return ok;
}

int main(int argc, char** argv)
{
    char id[CODER_ERROR_SIZE] = "", message[CODER_ERROR_SIZE] = "";
    if (argc != 7)
        return fprintf(stderr, "usage: capture-loop CARD CHANNELS RATE BLOCK BUFFER SECONDS\n"), 2;
    const int32_t channels = atoi(argv[2]), rate = atoi(argv[3]), block = atoi(argv[4]);
    const double buffer = atof(argv[5]) / rate;
    void* const channel = coderChannelCreate("alsa", "identity", id, message, 65536.0, 0.0);
    if (channel == NULL)
        return fprintf(stderr, "%s: %s\n", id, message), 1;
    const int ok =
        coderChannelInit(channel, 6, CODER_OPTION("Card", "char", strlen(argv[1]), argv[1]),
                         CODER_OPTION("Channels", "int32", 1, &channels),
                         CODER_OPTION("SampleRate", "int32", 1, &rate),
                         CODER_OPTION("SampleFormat", "char", 5, "int32"),
                         CODER_OPTION("BlockSize", "int32", 1, &block),
                         CODER_OPTION("BufferTime", "double", 1, &buffer)) &&
        coderChannelOpen(channel, 0) &&
        copy(coderChannelGetInputStream(channel), channels, block,
             (int)(atof(argv[6]) * rate / block)) &&
        coderChannelClose(channel) && coderChannelTerm(channel);
    if (!ok) {
        coderChannelGetLastError(channel, id, message);
        fprintf(stderr, "%s: %s\n", id, message);
    }
    coderChannelDestroy(channel);
    return ok ? 0 : 1;
}
