#!/usr/bin/env bash
# Installs another core in place of the embedded one, builds the product on it and runs a program.
# Usage: external.sh SOURCE-FOLDER CC CXX
set -euo pipefail
source=$1
export CC=$2 CXX=$3 CMAKE_GENERATOR=Ninja

scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
cd "$scratch"
export CMAKE_PREFIX_PATH=$scratch/installed
quietly() {
    "$@" >>log || { cat log && exit 1; }
}
quietly cmake -S "$source/tests/external" -B core
quietly cmake --build core
quietly cmake --install core --prefix installed
quietly cmake -S "$source" -B product -DBRENIX_CORE=external
quietly cmake --build product --parallel 2
quietly cmake --install product --prefix installed

lib=$(dirname "$(find "$scratch/installed" -name libbrenixcoder.so)")
"$source/tests/exports.sh" "$lib/libbrenixcoder.so"
"$CC" -Iinstalled/include "$source/tests/external/try.c" "-L$lib" -lbrenixcoder "-Wl,-rpath,$lib" -o try
printed=$(./try)
echo "$printed"
[[ $printed == 'create: brenix:Channel:couldNotLoadDevice, 
available: 42
open: brenix:Channel:unexpectedException, The stand-in does not open.' ]]
