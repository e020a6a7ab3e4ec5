// Every exported function of a channel or a stream, as a call on a handle.
#ifndef BRENIXCODER_TESTS_CALLS_HPP
#define BRENIXCODER_TESTS_CALLS_HPP

#include "brenixcoder/coder.h"

#include <functional>
#include <string>
#include <vector>

enum Target { Channels, Streams, Inputs, Outputs };

struct Call {
    Target target;
    int clears;            ///< whether it clears the last error
    std::string operation; ///< the core's operation, if any
    std::string argument;  ///< the argument that takes the answer, if any
    std::function<bool(void* handle, void* answer)> run;

    /// Whether the answer is 0 at once.
    bool resets() const { return argument == "totalCounts" || argument == "written"; }

    std::vector<void*> handles(void* channel, void* input, void* output) const
    {
        const std::vector<void*> all[] = {{channel}, {input, output}, {input}, {output}};
        return all[target];
    }
};

// The answer is a flag, a number or an array.
#define CALL(function, ...)                                                                        \
    [&](void* handle, void* array) {                                                               \
        [[maybe_unused]] auto* const flag = static_cast<uint8_t*>(array);                          \
        [[maybe_unused]] auto* const number = static_cast<double*>(array);                         \
        return coder##function(handle __VA_OPT__(, ) __VA_ARGS__);                                 \
    }

struct Calls {
    /// The names of what a call needs: a scalar property, a scalar field of the first buffer stored,
    /// a filter, and an option of that.
    const char *property, *field, *filter, *option;

    static constexpr const char* text = "a text that needs memory of its own";
    char id[CODER_ERROR_SIZE] = "", message[CODER_ERROR_SIZE] = "";
    double counts = 1, buffers = 1;

    const std::vector<Call> rows = {
        {Channels, 1, "init", "", CALL(ChannelInit, 1, text, "char", 9, text)},
        {Channels, 1, "open", "", CALL(ChannelOpen, 1, text, "int8", 9, text)},
        {Channels, 1, "execute", "",
         CALL(ChannelExecute, "updateFromThread", 1, text, "int8", 1, text)},
        {Channels, 1, "close", "", CALL(ChannelClose)},
        {Channels, 1, "term", "", CALL(ChannelTerm)},
        {Channels, 1, "isOpen", "open", CALL(ChannelIsOpen, flag)},
        {Channels, 1, "", "", CALL(ChannelGetInputStream)},
        {Channels, 1, "", "", CALL(ChannelGetOutputStream)},
        {Channels, 1, "", "destination",
         CALL(ChannelGetPropertyValue, property, "double", 1, array)},
        {Channels, 0, "", "", CALL(ChannelGetLastError, id, message)},
        {Channels, 0, "", "hasError", CALL(ChannelHasSyncError, flag)},
        {Channels, 0, "", "", CALL(ChannelGetLastSyncError, id, message)},
        {Channels, 1, "", "hasError", CALL(ChannelHasAsyncError, flag)},
        {Channels, 0, "", "", CALL(ChannelGetLastAsyncError, id, message)},
        {Streams, 0, "", "", CALL(StreamGetChannel)},
        {Streams, 1, "", "supported", CALL(StreamIsSupported, flag)},
        {Streams, 1, "isDeviceDone", "done", CALL(StreamIsDeviceDone, flag)},
        {Streams, 1, "isOpen", "open", CALL(StreamIsOpen, flag)},
        {Streams, 1, "getCountDimension", "dimension", CALL(StreamGetCountDimension, number)},
        {Streams, 1, "getDataAvailable", "available", CALL(StreamGetDataAvailable, number)},
        {Streams, 1, "getSpaceAvailable", "space", CALL(StreamGetSpaceAvailable, number)},
        {Streams, 1, "flush", "", CALL(StreamFlush)},
        {Streams, 1, "addFilter", "", CALL(StreamAddFilter, filter, 1, option, "int8", 1, text)},
        {Streams, 1, "tuneFilters", "", CALL(StreamTuneFilters, 1, option, "int8", 1, text)},
        {Inputs, 1, "peekCounts", "totalCounts",
         CALL(InputStreamPeek, number, &counts, &buffers, 1)},
        {Inputs, 1, "read", "", CALL(InputStreamReadBuffers, 1, 1)},
        {Inputs, 1, "", "destination",
         CALL(InputStreamReadBufferData, 1, 0, field, "double", 1, array)},
        {Outputs, 1, "write", "written",
         CALL(OutputStreamWriteTypedDataOld, number, 1, "int8", 9, text)},
    };
};

#endif
