#!/usr/bin/env bash
# Looks for what hardens a shared library in each of those named: relocations that are read-only before
# the first instruction runs, none in the code, no executable stack, stack protectors, and checked forms of the functions of the C
# library where they are called.
# Usage: hardening.sh LIBRARY...
set -euo pipefail

status=0
for library; do
    headers=$(readelf --program-headers --dynamic --wide "$library")
    symbols=$(nm --dynamic --undefined-only "$library")
    require() { # WHAT TEXT PATTERN
        if ! grep -qE "$3" <<<"$2"; then
            echo "$library: no $1" >&2
            status=1
        fi
    }
    require 'read-only relocations' "$headers" 'GNU_RELRO'
    require 'binding at load time' "$headers" '\(FLAGS.*NOW'
    require 'stack that cannot be executed' "$headers" 'GNU_STACK .* RW +0x'
    require 'stack protector' "$symbols" '__stack_chk_fail'
    if [[ $library == *@(tcp|udp).so ]]; then # nothing else calls a function that has such a form
        require 'fortified calls' "$symbols" '__(memcpy|sprintf|strcat)_chk'
    fi
    if grep -q TEXTREL <<<"$headers"; then
        echo "$library: relocations in the code" >&2
        status=1
    fi
done
exit $status
