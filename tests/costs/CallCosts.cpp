// Makes every exported call a hundred times on the null core. Prints the allocations of one call, and
// under callgrind has it dump the instructions of the hundred under the name of the call.

#include "Allocations.hpp"
#include "NullCore.hpp"
#include "brenixcoder/coder.h"

#include <valgrind/callgrind.h>

#include <cstdio>
#include <functional>
#include <string>

#define CALL(function, ...)                                                                        \
    {                                                                                              \
        "coder" #function, [&] { coder##function(__VA_ARGS__); }                                   \
    }

int main()
{
    constexpr std::size_t repetitions = 100;
    char id[CODER_PATH_SIZE];
    char message[CODER_ERROR_SIZE];
    uint8_t flag = 0;
    double number = 0;
    double count = 0;
    double size = 1;
    int32_t freed = 0;
    void* const channel = coderChannelCreate("d", "c", id, message, 1, 1);
    coderChannelInit(channel, 0);
    void* const input = coderChannelGetInputStream(channel);
    void* const output = coderChannelGetOutputStream(channel);
    nullCore().waiting = {1};
    for (std::size_t i = 0; i < 3 * repetitions; ++i) {
        nullCore().stock.push_back(makeDataBuffer(1, 1));
    }
    coderInputStreamReadBuffers(input, repetitions + 1, repetitions + 1);

    const struct {
        const char* name;
        std::function<void()> run;
    } calls[] = {
        CALL(ChannelOpen, channel, 1, CODER_OPTION("Rate", "double", 1, &size)),
        CALL(ChannelExecute, channel, "c", 1, CODER_OPTION("Name", "char", 2, "n")),
        CALL(ChannelClose, channel),
        CALL(ChannelTerm, channel),
        CALL(ChannelIsOpen, channel, &flag),
        CALL(ChannelGetInputStream, channel),
        CALL(ChannelGetOutputStream, channel),
        CALL(ChannelGetPropertyValue, channel, "p0", "double", 1, &number),
        CALL(ChannelGetLastError, channel, id, message),
        CALL(ChannelHasSyncError, channel, &flag),
        CALL(ChannelGetLastSyncError, channel, id, message),
        CALL(ChannelHasAsyncError, channel, &flag),
        CALL(ChannelGetLastAsyncError, channel, id, message),
        CALL(StreamGetChannel, input),
        CALL(StreamIsSupported, input, &flag),
        CALL(StreamIsDeviceDone, input, &flag),
        CALL(StreamIsOpen, input, &flag),
        CALL(StreamGetCountDimension, input, &number),
        CALL(StreamGetDataAvailable, input, &number),
        CALL(StreamGetSpaceAvailable, input, &number),
        CALL(StreamFlush, input),
        CALL(StreamAddFilter, input, "f", 1, CODER_OPTION("Factor", "int32", 1, &number)),
        CALL(StreamTuneFilters, input, 1, CODER_OPTION("Factor", "int32", 1, &number)),
        CALL(InputStreamFreeBuffer, input, ++freed),
        CALL(InputStreamPeek, input, &number, &count, &size, 1),
        CALL(InputStreamReadBuffers, input, 1, 1),
        CALL(InputStreamReadBufferData, input, 1, 0, "data0", "double", 1, &number),
        CALL(OutputStreamWriteTypedDataOld, output, &number, 1, "double", CODER_BUFFER(1, &count)),
        CALL(ComputeAbsolutePath, "/", id),
        // Last: it replaces the streams.
        CALL(ChannelInit, channel, 0),
        {"coderChannelCreate,coderChannelDestroy",
         [&] { coderChannelDestroy(coderChannelCreate("d", "c", id, message, 1, 1)); }},
    };
    for (const auto& call : calls) {
        call.run(); // the linker has its turn
        CALLGRIND_ZERO_STATS;
        const std::size_t before = allocations;
        for (std::size_t i = 0; i < repetitions; ++i) {
            call.run();
        }
        std::printf("%s %zu\n", call.name, (allocations - before) / repetitions);
        CALLGRIND_DUMP_STATS_AT(call.name);
    }
    coderChannelDestroy(channel);
    return 0;
}
