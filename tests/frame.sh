#!/usr/bin/env bash
# Holds every function that a built libbrenixcoder exports against a row that says by which helper of
# api/CallFrame.hpp it keeps exceptions in; "none" calls nothing that throws.
# Usage: frame.sh LIBRARY SOURCES
set -euo pipefail
library=$1 sources=$2

rows="callChannel ChannelInit ChannelOpen ChannelExecute ChannelClose ChannelTerm ChannelIsOpen
callChannel ChannelGetInputStream ChannelGetOutputStream ChannelGetPropertyValue
callChannel ChannelHasAsyncError
callKeepingLastError ChannelHasSyncError ChannelGetLastSyncError ChannelGetLastAsyncError
callStream StreamFlush StreamAddFilter StreamTuneFilters InputStreamPeek InputStreamReadBuffers
callStream InputStreamReadBufferData InputStreamFreeBuffer OutputStreamWriteTypedDataOld
queryStream StreamIsSupported StreamIsDeviceDone StreamIsOpen
queryStream StreamGetCountDimension StreamGetDataAvailable StreamGetSpaceAvailable
guarded ChannelCreate ComputeAbsolutePath
none ChannelDestroy ChannelGetLastError StreamGetChannel"

status=0
complain() {
    echo "$*" >&2
    status=1
}

declarations=$(tr '\n' ' ' <"$sources/include/brenixcoder/coder.h" | tr ';' '\n')
functions=$(nm --dynamic --defined-only --format=posix "$library" | awk '/^coder/ {print $1}')
[[ -n $functions ]] || complain "$library exports no function"
for function in $functions; do
    helper=$(sed -nE "s/^(\w+) .*\b${function#coder}\b.*/\1/p" <<<"$rows")
    body=$(sed -n "/^[a-z].*[ *]$function(/,/^}/p" "$sources"/api/*.cpp | sed 's,//.*,,')
    [[ -n $helper ]] || complain "$function has no row"
    grep -qE "CODER_API [^;]*\b$function\(.*\) CODER_NOEXCEPT *$" <<<"$declarations" ||
        complain "$function is not declared CODER_NOEXCEPT"
    [[ $body == *") noexcept"$'\n{'* ]] || complain "$function is not noexcept"
    [[ $helper == none || $body != *')->'* ]] || complain "$function calls past $helper"
    [[ $helper == none || $body == *"$helper"[\(\<]* ]] || complain "$function does not use $helper"
done
exit $status
