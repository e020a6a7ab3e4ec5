/**
 * @file
 * Drives an asynchronous input/output channel from C: the whole interface of libbrenixcoder.
 *
 * A channel joins a device plug-in and a converter plug-in. It has a device's typed options and
 * properties, and up to one stream in each direction. The order of calls is
 *
 *     create, init, open, (execute, peek, read, write, query)..., close, term, destroy
 *
 * ### Results
 *
 * A function that returns `int` returns 1 when it did its work and 0 when it failed. A failed call
 * writes none of its out-values (where one is reset first, its description says so). No function
 * lets a C++ exception out, also when memory runs out.
 *
 * A null channel or stream handle makes every function return its failure value (0, NULL or
 * nothing) and do nothing else, but for the out-values that are reset first; so does a stream
 * handle in place of a channel handle, and a channel handle in place of a stream handle. A null
 * pointer for an out-value or a destination is an error ("Argument <name> must not be null.") and
 * nothing is done. A handle is not checked further: it must be one that the library gave out, of a
 * channel that is not destroyed.
 *
 * ### Three error records
 *
 * Each channel keeps three, and each is an identifier and a message of at most 1023 bytes; a record
 * holds an error when its identifier is not empty.
 *
 * - The last error: why the last call on this channel or one of its streams failed. The next call
 *   clears it. Failures of the core have an identifier of their own and an empty message; the
 *   included core tells the reason in the channel's property Reason ("char"), which is asked for
 *   after the error:
 *
 *   | identifier | meaning |
 *   |---|---|
 *   | brenix:Channel:couldNotLoadDevice | device plug-in not found or not loadable |
 *   | brenix:Channel:couldNotLoadConverter | the same for the converter |
 *   | brenix:Channel:couldNotCreateDevice | plug-in loaded, but its device not made |
 *   | brenix:Channel:couldNotCreateConverter | the same for the converter |
 *   | brenix:Stream:couldNotLoadFilter | filter plug-in not found or not loadable |
 *   | brenix:Stream:couldNotCreateFilter | plug-in loaded, but its filter not made |
 *   | brenix:Stream:cannotAddFilterWhileOpen | filters are added before the channel opens |
 *   | brenix:InputStream:notSupported | the channel has no input stream |
 *   | brenix:OutputStream:notSupported | the channel has no output stream |
 *   | brenix:InputStream:synchronousInputNotPossible | the counts cannot be had (in time) |
 *   | brenix:OutputStream:synchronousOutputNotPossible | the data cannot be taken (in time) |
 *   | brenix:InputStream:couldNotConvertInputData | the converter failed on data read |
 *   | brenix:OutputStream:couldNotConvertOutputData | the converter failed on data written |
 *   | brenix:Channel:unexpectedException | everything else; the message says what |
 *
 * - The synchronous error: raised by a plug-in inside a call. The call returns 0 and the last error
 *   stays empty. Kept until it is read.
 * - The asynchronous error: raised by a plug-in on another thread. It interrupts nothing; poll for
 *   it. Kept until it is read; a newer one replaces it.
 *
 * ### Typed values
 *
 * | type name | C type of an element |
 * |---|---|
 * | "double", "float" | double, float |
 * | "int8", "int16", "int32", "int64" | int8_t, int16_t, int32_t, int64_t |
 * | "uint8", "uint16", "uint32", "uint64" | uint8_t, uint16_t, uint32_t, uint64_t |
 * | "logical" | one byte, 0 or 1 |
 * | "char" | char; text, one byte a character |
 *
 * Texts leave the library as they are, or, where the device holds them as UTF-16, with the low
 * seven bits of each code unit. So a text that is written and read back is the same only if it is
 * ASCII.
 *
 * Element types are never converted: a value is read only under the type name of its own type.
 *
 * ### Option lists
 *
 * An option count, then four arguments an option, best written with #CODER_OPTION:
 *
 *     coderChannelOpen(channel, 2, CODER_OPTION("Rate", "double", 1, &rate),
 *                                  CODER_OPTION("Name", "char", 5, "input"));
 *
 * Elements are copied during the call. A count of 1 gives the device a scalar, more a vector. For
 * "char" the count is the most characters to take; the text also ends at a NUL, and a count of 0 or
 * less is an empty text. Of two options of one name the later counts. The errors of a list are
 * brenix:Channel:unexpectedException with one of
 *
 * - "Unsupported type: <type name> for option <name>."
 * - "Unsupported length for data <name>. Length must be 1 or greater."
 * - "No data for <name>." (a null data pointer)
 * - the standard library's text for a null name or type name
 *
 * and the device is then not called.
 *
 * ### Threads
 *
 * A channel and its streams are used from the thread that created the channel. Different channels
 * may live on different threads.
 */
#ifndef BRENIXCODER_CODER_H
#define BRENIXCODER_CODER_H

#include <stdint.h>

/** An exported function. */
#define CODER_API __attribute__((visibility("default")))

/** noexcept, in the words of the language. */
#if !defined(__cplusplus)
#define CODER_NOEXCEPT
#elif __cplusplus >= 201103L
#define CODER_NOEXCEPT noexcept
#else
#define CODER_NOEXCEPT throw()
#endif

/** Bytes of an identifier or message buffer, the final NUL included. */
#define CODER_ERROR_SIZE 1024

/** Bytes of the buffer of coderComputeAbsolutePath(), the final NUL included. */
#define CODER_PATH_SIZE 4096

/**
 * One option of an option list. Casts its arguments to the exact types that a variadic list needs:
 * name and type name (NUL-terminated), element count, pointer to the first element.
 */
#define CODER_OPTION(name, typeName, count, data)                                                  \
    (const char*)(name), (const char*)(typeName), (int)(count), (const void*)(data)

/** One buffer of coderOutputStreamWriteTypedDataOld(): element count, pointer to the elements. */
#define CODER_BUFFER(count, data) (int)(count), (const void*)(data)

#ifdef __cplusplus
extern "C" {
#endif

/**
 * @name Channel
 * @{
 */

/**
 * Creates a channel: loads the converter, then the device.
 *
 * The embedded core takes a path with a slash as it stands and looks for a bare name, such as
 * "loopback", in its own plug-in folder.
 *
 * @param devicePath    device plug-in, NUL-terminated
 * @param converterPath converter plug-in, NUL-terminated
 * @param errorId       buffer of #CODER_ERROR_SIZE bytes; written on failure only
 * @param errorMessage  buffer of #CODER_ERROR_SIZE bytes; written on failure only
 * @param firstLimit    most counts that the input stream buffers; below 0 is 0, INFINITY or NaN is
 *                      unlimited, fractions are cut
 * @param secondLimit   the same for the output stream
 * @return a channel handle, to be released with coderChannelDestroy(); NULL on failure
 *
 * Errors, in the two buffers: the four load and create failures with an empty message, whose reason
 * `brenix check PLUGIN` finds, since there is no channel that could tell it;
 * brenix:Channel:unexpectedException for anything else, such as a null path.
 */
CODER_API void* coderChannelCreate(const char* devicePath, const char* converterPath, char* errorId,
                                   char* errorMessage, double firstLimit,
                                   double secondLimit) CODER_NOEXCEPT;

/**
 * Initialises the device with options, fills the property store and makes new stream handles.
 *
 * Whatever the result, ask for both stream handles again: a call that succeeds replaces both and
 * releases the buffers that the old input stream held. The old handles then answer as those of a
 * channel without streams; the channel keeps some 150 bytes for the two until it is destroyed. A
 * call that fails before the device is initialised leaves the handles as they are; one that fails
 * after it (memory runs out while the handles are made) may have replaced the input handle, and a
 * handle that it has not replaced reports that it is not supported.
 *
 * @param channel     channel handle
 * @param optionCount number of options that follow, each a #CODER_OPTION
 * @return 1, or 0 with the last error: those of option lists, and what the core or the device
 *         refuses
 */
CODER_API int coderChannelInit(void* channel, uint64_t optionCount, ...) CODER_NOEXCEPT;

/**
 * Opens the channel: the device starts to work.
 * Arguments, result and errors as for coderChannelInit(); the stream handles stay.
 */
CODER_API int coderChannelOpen(void* channel, uint64_t optionCount, ...) CODER_NOEXCEPT;

/**
 * Runs a command of the device.
 *
 * @param channel     channel handle
 * @param command     the device's command, NUL-terminated, passed on unchanged
 * @param optionCount number of options that follow, each a #CODER_OPTION
 * @return 1, or 0 with the last error: those of option lists, and what the core or the device
 *         refuses
 */
CODER_API int coderChannelExecute(void* channel, const char* command, uint64_t optionCount,
                                  ...) CODER_NOEXCEPT;

/**
 * Closes the channel: what is queued for output goes to the device, then the device stops. Unread
 * input stays readable.
 * @return 1, or 0 with the last error (the core refuses, or the device failed)
 */
CODER_API int coderChannelClose(void* channel) CODER_NOEXCEPT;

/**
 * Terminates the channel: the device releases its resources. It can be initialised again.
 * @return 1, or 0 with the last error (the core refuses, or the device failed)
 */
CODER_API int coderChannelTerm(void* channel) CODER_NOEXCEPT;

/**
 * Asks whether the channel is open.
 * @param channel channel handle
 * @param open    receives 1 or 0
 * @return 1, or 0 with the last error
 */
CODER_API int coderChannelIsOpen(void* channel, uint8_t* open) CODER_NOEXCEPT;

/**
 * Releases the channel, its streams with the buffers they hold, and its plug-ins. A null handle is
 * allowed. Close and terminate the channel first: events of an open device must not meet a channel
 * that is going away. The handle and all its stream handles are invalid afterwards.
 */
CODER_API void coderChannelDestroy(void* channel) CODER_NOEXCEPT;

/**
 * The channel's input stream.
 * @return a stream handle owned by the channel and valid until coderChannelDestroy(), but from the
 *         next coderChannelInit() on without a stream; NULL before the first successful
 *         coderChannelInit(). A channel without input has a handle all the same:
 *         coderStreamIsSupported() tells. Clears the last error and records none.
 */
CODER_API void* coderChannelGetInputStream(void* channel) CODER_NOEXCEPT;

/** The channel's output stream; all as for coderChannelGetInputStream(). */
CODER_API void* coderChannelGetOutputStream(void* channel) CODER_NOEXCEPT;

/**
 * Copies the value of one of the device's properties. Safe while the device updates it.
 *
 * @param channel  channel handle
 * @param name     property name, NUL-terminated
 * @param typeName type of the elements, NUL-terminated
 * @param capacity number of elements (for "char": bytes, the final NUL included) that fit
 * @param ...      one pointer: the destination, an array of `capacity` elements. How many were
 *                 written is not reported; elements beyond them stay as they were. A list of texts
 *                 is joined with commas.
 * @return 1, or 0 with brenix:Channel:unexpectedException and one of
 *         - "Custom property: <name> not found."
 *         - "Custom property: <name> is not a supported type: <type name>"
 *         - "Property: <name> is not of the expected type: <type name>" (for "char" the end is
 *           "string or ustring scalar or vector.")
 *         - "Property value: <name> is too large for allocated space."; nothing is written
 *         - the standard library's text for a null name or type name
 */
CODER_API int coderChannelGetPropertyValue(void* channel, const char* name, const char* typeName,
                                           int capacity, ...) CODER_NOEXCEPT;

/** @} */

/**
 * @name Errors
 * Each identifier and message buffer has #CODER_ERROR_SIZE bytes and receives a NUL-terminated
 * text; an empty record gives two empty texts. These functions return 1; they return 0 for a null
 * handle and for a null out-pointer. The latter is recorded as the last error, except by
 * coderChannelGetLastError(), which never changes it; nothing is read and no record is emptied.
 * @{
 */

/** Copies the last error, which stays. */
CODER_API int coderChannelGetLastError(void* channel, char* errorId,
                                       char* errorMessage) CODER_NOEXCEPT;

/** Writes 1 if there is a synchronous error, else 0. Leaves the last error alone. */
CODER_API int coderChannelHasSyncError(void* channel, uint8_t* hasError) CODER_NOEXCEPT;

/** Copies the synchronous error and empties its record. Leaves the last error alone. */
CODER_API int coderChannelGetLastSyncError(void* channel, char* errorId,
                                           char* errorMessage) CODER_NOEXCEPT;

/** Clears the last error, then writes 1 if there is an asynchronous error, else 0. */
CODER_API int coderChannelHasAsyncError(void* channel, uint8_t* hasError) CODER_NOEXCEPT;

/** Copies the asynchronous error and empties its record. Leaves the last error alone. */
CODER_API int coderChannelGetLastAsyncError(void* channel, char* errorId,
                                            char* errorMessage) CODER_NOEXCEPT;

/** @} */

/**
 * @name Streams
 * The stream is one of the two handles of a channel. On a channel without a stream of this
 * direction, and with a handle of before the last coderChannelInit(), everything but
 * coderStreamGetChannel() and coderStreamIsSupported() fails with brenix:InputStream:notSupported or
 * brenix:OutputStream:notSupported; no buffers are stored there. Errors are recorded as the
 * channel's last error.
 * @{
 */

/** The handle of the channel that owns the stream. Leaves the last error alone. */
CODER_API void* coderStreamGetChannel(void* stream) CODER_NOEXCEPT;

/** Writes 1 to `supported` if there is a stream behind the handle, else 0. */
CODER_API int coderStreamIsSupported(void* stream, uint8_t* supported) CODER_NOEXCEPT;

/** Writes 1 to `done` if the device will deliver or take no more, else 0. */
CODER_API int coderStreamIsDeviceDone(void* stream, uint8_t* done) CODER_NOEXCEPT;

/** Writes 1 to `open` if the stream is open, else 0. */
CODER_API int coderStreamIsOpen(void* stream, uint8_t* open) CODER_NOEXCEPT;

/** Writes the dimension of the data along which the device counts. */
CODER_API int coderStreamGetCountDimension(void* stream, double* dimension) CODER_NOEXCEPT;

/** Writes the number of counts in the stream: input yet to be read, output yet to be taken. */
CODER_API int coderStreamGetDataAvailable(void* stream, double* available) CODER_NOEXCEPT;

/** Writes the number of counts that the stream has room for; INFINITY when it is unlimited. */
CODER_API int coderStreamGetSpaceAvailable(void* stream, double* space) CODER_NOEXCEPT;

/** Discards what the stream has buffered. */
CODER_API int coderStreamFlush(void* stream) CODER_NOEXCEPT;

/**
 * Adds a filter behind those already there. Only while the channel is not open.
 * @param stream      stream handle
 * @param filterName  filter plug-in, NUL-terminated, as the paths of coderChannelCreate()
 * @param optionCount number of options that follow, each a #CODER_OPTION
 * @return 1, or 0 with the last error: brenix:Stream:couldNotLoadFilter, ...:couldNotCreateFilter,
 *         ...:cannotAddFilterWhileOpen, or those of option lists
 */
CODER_API int coderStreamAddFilter(void* stream, const char* filterName, uint64_t optionCount,
                                   ...) CODER_NOEXCEPT;

/**
 * Passes options to the stream's filters, also while data flows.
 * @return 1, or 0 with the last error: those of option lists, and what a filter refuses
 */
CODER_API int coderStreamTuneFilters(void* stream, uint64_t optionCount, ...) CODER_NOEXCEPT;

/** @} */

/**
 * @name Input
 * Data arrives in buffers, each a set of named fields. A read moves buffers into the stream
 * handle's store, where they are numbered from 1 until the next read replaces them.
 * @{
 */

/**
 * Asks how many counts each waiting buffer holds, taking nothing.
 *
 * @param stream       input stream handle
 * @param totalCounts  receives the sum of the counts reported; 0.0 at once, so also on failure
 * @param bufferCounts receives one count for each reported buffer, oldest first; an array of at
 *                     least `*numBuffers` elements. With room for none it may be NULL.
 * @param numBuffers   in: how many elements `bufferCounts` has (below 0 or NaN is 0, fractions are
 *                     cut); out: how many were written
 * @param maxCounts    list no more counts than this; below 0 is 0, INFINITY lists all. A read of
 *                     that many counts delivers just these buffers.
 * @return 1, or 0 with the last error
 */
CODER_API int coderInputStreamPeek(void* stream, double* totalCounts, double* bufferCounts,
                                   double* numBuffers, double maxCounts) CODER_NOEXCEPT;

/**
 * Takes counts from the stream into the store, waiting for them if need be. The buffers of the
 * previous read are released, also those not read; on failure they stay.
 *
 * @param stream          input stream handle
 * @param countsToRead    how many counts; below 0 is 0, fractions are cut
 * @param expectedBuffers in how many buffers they must arrive, as coderInputStreamPeek() told
 * @return 1, or 0 with the last error: brenix:InputStream:synchronousInputNotPossible,
 *         ...:couldNotConvertInputData, or brenix:Channel:unexpectedException with "The number of
 *         buffers read did not match the expected number." (the data read is then lost)
 */
CODER_API int coderInputStreamReadBuffers(void* stream, double countsToRead,
                                          double expectedBuffers) CODER_NOEXCEPT;

/**
 * Copies one field of a stored buffer. The buffer stays; any field can be read any number of times.
 *
 * @param stream      input stream handle
 * @param bufferIndex number of the buffer, from 1
 * @param fieldIndex  when there is no field of the name itself, the field is named by the name and
 *                    this number in decimal: "Data" and 2 find Data2
 * @param fieldName   field, NUL-terminated; "" is the first field in byte order of the names
 * @param typeName    type of the elements, NUL-terminated
 * @param capacity    number of elements (for "char": bytes, the final NUL included) that fit
 * @param destination receives the elements, from the first
 * @return 1, or 0 with brenix:Channel:unexpectedException and one of
 *         - "Data buffer index: <index> not found."
 *         - "Data buffer field: <field> not found for index: <field index>"
 *         - "No data found in the data buffer."
 *         - "Data buffer field: <field> is not a supported type: <type name>"
 *         - "Property: ..." and "Property value: ..." as for coderChannelGetPropertyValue()
 *         - the standard library's text for a null field name or type name
 */
CODER_API int coderInputStreamReadBufferData(void* stream, int32_t bufferIndex, int32_t fieldIndex,
                                             const char* fieldName, const char* typeName,
                                             int32_t capacity, void* destination) CODER_NOEXCEPT;

/**
 * Releases one stored buffer; the others keep their numbers. A number without a buffer is nothing.
 * Clears the last error and records none.
 */
CODER_API void coderInputStreamFreeBuffer(void* stream, int32_t bufferIndex) CODER_NOEXCEPT;

/** @} */

/**
 * @name Output
 * @{
 */

/**
 * Writes buffers of one type, waiting for room if need be. All of them are taken or none.
 *
 * @param stream     output stream handle
 * @param written    receives the number of counts written; 0.0 at once, so also on failure
 * @param numBuffers number of buffers that follow, each a #CODER_BUFFER. Their elements are copied
 *                   during the call. For "char" the count is the most characters to take.
 * @param typeName   type of the elements of all buffers, NUL-terminated
 * @return 1, or 0 with the last error: brenix:OutputStream:synchronousOutputNotPossible,
 *         ...:couldNotConvertOutputData, or brenix:Channel:unexpectedException with one of
 *         - "Unsupported type: <type name> for data being written."
 *         - "Unsupported length for data data. Length must be 1 or greater."
 *         - "No data for data." (a null pointer for one element or more)
 *         - the standard library's text for a null type name
 */
CODER_API int coderOutputStreamWriteTypedDataOld(void* stream, double* written, uint64_t numBuffers,
                                                 const char* typeName, ...) CODER_NOEXCEPT;

/** @} */

/**
 * The canonical absolute form of a path: no ".", no "..", no symbolic links.
 *
 * @param path         UTF-8, NUL-terminated; relative paths start at the current directory
 * @param absolutePath buffer of #CODER_PATH_SIZE bytes; receives the path, cut to 4095 bytes, or
 *                     the empty text when there is no such file, the text is not UTF-8, or anything
 *                     fails
 */
CODER_API void coderComputeAbsolutePath(const char* path, char* absolutePath) CODER_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif
