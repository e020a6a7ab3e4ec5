#!/usr/bin/env bash
# Prints what every exported call costs on the null core: its allocations, and the instructions of the
# library's own code, a hundredth of a hundred calls. What the C and C++ libraries do for it is left
# out, since their code depends on the processor.
#
# Usage: costs.sh CALL-COSTS [TABLE]
#
# With a table of an earlier run, fails if an allocation differs, or the instructions by over 5 %.
set -euo pipefail
dumps=$(mktemp -d)
trap 'rm -r "$dumps"' EXIT

valgrind --quiet --tool=callgrind --callgrind-out-file="$dumps/dump" "$1" >"$dumps/allocations"

# A dump names the object of the code (ob=) and lists the costs by line; the line behind a calls= is
# what the callee cost. An object has its full name only where it, as caller or callee (cob=), is
# first named.
mapfile -t files < <(printf '%s\n' "$dumps"/dump.* | sort --version-sort)
awk '
    FILENAME ~ /allocations$/         { allocations[$1] = $2 }
    /^desc: Trigger: Client Request:/ { name = $NF; order[++calls] = name }
    /^c?ob=/        { split($0, part, /[()]/)
                      if ($0 ~ / /) { object[part[2]] = $0 } }
    /^ob=/          { ours = object[part[2]] ~ /brenixcoder-on-null-core/ }
    /^calls=/       { getline; next }
    /^[-+*0-9]/ && ours { split($0, cost, " "); own[name] += cost[2] }
    END {
        for (i = 1; i <= calls; ++i) {
            printf "%-40s %3d %6d\n", order[i], allocations[order[i]], own[order[i]] / 100
        }
    }' "$dumps/allocations" "${files[@]}" >"$dumps/table"

if (($# == 1)); then
    cat "$dumps/table"
    exit
fi
awk '
    FNR == NR { allocations[$1] = $2; instructions[$1] = $3; ++expected; next }
    {
        off = $3 - instructions[$1]
        if ($2 != allocations[$1] || (off < 0 ? -off : off) > 0.05 * instructions[$1]) {
            printf "%s: %d allocations and %d instructions, not %d and %d\n",
                   $1, $2, $3, allocations[$1], instructions[$1]
            failed = 1
        }
        ++found
    }
    END { exit failed || found != expected }' "$2" "$dumps/table"
