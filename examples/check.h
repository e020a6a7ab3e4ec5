/* What the example programs share: every call is checked, every failure is printed. */
#ifndef BRENIXCODER_EXAMPLES_CHECK_H
#define BRENIXCODER_EXAMPLES_CHECK_H

#include "brenixcoder/coder.h"

#include <stdio.h>
#include <string.h>

/*
 * Returns the result of a call. When that is 0, prints why: the last error or, when it is empty,
 * the error that a plug-in raised inside the call; behind an identifier alone, the core's reason.
 */
static int check(void* channel, const char* call, int result)
{
    char id[CODER_ERROR_SIZE] = "";
    char message[CODER_ERROR_SIZE] = "";
    if (result) {
        return 1;
    }
    (void)coderChannelGetLastError(channel, id, message);
    if (id[0] == '\0') {
        (void)coderChannelGetLastSyncError(channel, id, message);
    }
    if (message[0] == '\0') { /* stays empty when the core tells no reason */
        (void)coderChannelGetPropertyValue(channel, "Reason", "char", CODER_ERROR_SIZE, message);
    }
    fprintf(stderr, "%s: %s: %s\n", call, id, message);
    return 0;
}

/* Whether data that was lost, or a stranger who was refused, is a failure like any other error, or is only printed. */
static int lossIsFailure = 1;

/* Returns 0, after printing it, if a plug-in has raised an error between the calls. */
static int checkDevice(void* channel)
{
    char id[CODER_ERROR_SIZE];
    char message[CODER_ERROR_SIZE];
    uint8_t hasError = 0;
    if (!check(channel, "coderChannelHasAsyncError",
               coderChannelHasAsyncError(channel, &hasError))) {
        return 0;
    }
    if (!hasError) {
        return 1;
    }
    (void)coderChannelGetLastAsyncError(channel, id, message);
    fprintf(stderr, "device: %s: %s\n", id, message);
    return !lossIsFailure &&
           (strstr(id, ":dataLost") != NULL || strstr(id, ":badMessage") != NULL ||
            strstr(id, ":peerRefused") != NULL);
}

/* Makes a channel; prints why when it returns NULL. */
static void* createChannel(const char* device, const char* converter, double inputLimit,
                           double outputLimit)
{
    char id[CODER_ERROR_SIZE] = "";
    char message[CODER_ERROR_SIZE] = "";
    void* const channel =
        coderChannelCreate(device, converter, id, message, inputLimit, outputLimit);
    if (channel == NULL) {
        fprintf(stderr, "coderChannelCreate: %s: %s\n", id, message);
    }
    return channel;
}

/*
 * Closes and terminates a channel, if there is one, as far as it was opened and initialised, and
 * destroys it. Returns 0, after printing why, if one of the steps or the device fails.
 */
static int finishChannel(void* channel)
{
    uint8_t open = 0;
    int initialised;
    int ok;
    if (channel == NULL) {
        return 1;
    }
    initialised = coderChannelGetInputStream(channel) != NULL;
    ok = check(channel, "coderChannelIsOpen", coderChannelIsOpen(channel, &open));
    if (open && !check(channel, "coderChannelClose", coderChannelClose(channel))) {
        ok = 0;
    }
    ok = checkDevice(channel) && ok;
    if (initialised && !check(channel, "coderChannelTerm", coderChannelTerm(channel))) {
        ok = 0;
    }
    coderChannelDestroy(channel);
    return ok;
}

#endif
