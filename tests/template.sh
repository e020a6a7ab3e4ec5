#!/usr/bin/env bash
# Installs the library into a scratch folder, builds the plug-in template against it, outside of this
# tree, and runs it.
# Usage: template.sh SOURCE-FOLDER BUILD-FOLDER CC CXX
set -euo pipefail
source=$1 build=$2 cc=$3 cxx=$4

scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
cmake --install "$build" --prefix "$scratch/installed" >"$scratch/log"
cp -r "$source/plugins/template" "$scratch/copy"
cd "$scratch/copy"
cmake -S . -B build -G Ninja -DCMAKE_PREFIX_PATH="$scratch/installed" -DCMAKE_C_COMPILER="$cc" \
    -DCMAKE_CXX_COMPILER="$cxx" -DCMAKE_CXX_FLAGS="-Wall -Wextra -Wpedantic -Werror" >>"$scratch/log"
cmake --build build >>"$scratch/log" || { cat "$scratch/log" && exit 1; }
cd build
printed=$(./try)
echo "$printed"
[[ $printed == '0 1 2 3 4 5 5 5 ' ]]
