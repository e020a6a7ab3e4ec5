// The public header in C++98.
#include "brenixcoder/coder.h"

int useCoder98(void* channel);

int useCoder98(void* channel)
{
    return coderChannelClose(channel);
}
