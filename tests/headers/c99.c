/* The public header in C99: it compiles without a warning, and the list macros yield exact types.
 */
#include "brenixcoder/coder.h"

int useCoder(void* channel, const char* text);

int useCoder(void* channel, const char* text)
{
    long count = 1;
    double value = 0;
    return coderChannelOpen(channel, 2, CODER_OPTION("a", "char", count, text),
                            CODER_OPTION("b", "double", 1, &value)) == 1 &&
           coderOutputStreamWriteTypedDataOld(channel, &value, 1, "double",
                                              CODER_BUFFER(count, &value)) == 1;
}
