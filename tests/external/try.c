/* Prints what the stand-in answers. */
#include <brenixcoder/coder.h>
#include <stdio.h>

int main(void)
{
    char id[CODER_ERROR_SIZE];
    char message[CODER_ERROR_SIZE];
    double available = 0.0;
    void* channel = coderChannelCreate("missing", "converter", id, message, 1.0, 1.0);
    if (channel == NULL) {
        printf("create: %s, %s\n", id, message);
    }
    channel = coderChannelCreate("device", "converter", id, message, 1.0, 1.0);
    if (coderChannelInit(channel, 0) &&
        coderStreamGetDataAvailable(coderChannelGetInputStream(channel), &available)) {
        printf("available: %g\n", available);
    }
    if (!coderChannelOpen(channel, 0) && coderChannelGetLastError(channel, id, message)) {
        printf("open: %s, %s\n", id, message);
    }
    coderChannelDestroy(channel);
    return 0;
}
