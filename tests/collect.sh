#!/usr/bin/env bash
# Runs collect on two writers. Usage: collect.sh COLLECT BRENIX
set -euo pipefail
collect=$1 brenix=$2
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
options=("Endpoint=ipc://$scratch/socket" Pattern=pull Bind=1 Writers=2)
"$collect" zmq "${options[@]}" >"$scratch/out" &
for name in one two; do
    seq 10000 | "$brenix" write zmq -o "${options[0]}" -o Pattern=push -o Bind=0 -o Name=$name -q
done
wait $!
cat "$scratch/out"
for expected in '^one/[0-9a-f]*: 10000 counts, [0-9]* a second, 0 missing$' \
    '^two/[0-9a-f]*: 10000 counts, [0-9]* a second, 0 missing$' '^2 sources, 0 counts lost$'; do
    grep -q "$expected" "$scratch/out"
done
