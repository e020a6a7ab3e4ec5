#!/usr/bin/env bash
# Installs the library into a scratch folder, and does there what the documentation tells users to do:
# the C programs and the plug-ins of its pages are built outside of this tree and run.
# Usage: install.sh BUILD-FOLDER CC CXX
set -euo pipefail
build=$1
source=$(cd "$(dirname "$0")/.." && pwd)
export CC=$2 CXX=$3 CFLAGS='-Wall -Wextra -Wpedantic -Werror' CMAKE_GENERATOR=Ninja
export CXXFLAGS=$CFLAGS

scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
cd "$scratch"

# expect PATTERN COMMAND...: what the command prints must match.
expect() {
    local printed
    printed=$("${@:2}" 2>&1) || printed+=" (exit code $?)"
    # shellcheck disable=SC2053 # it is a pattern
    if [[ $printed != $1 ]]; then
        printf '%s\nprinted: %s\nexpected: %s\n' "${*:2}" "$printed" "$1"
        exit 1
    fi
}

# pieces LANGUAGE PAGE [NUMBER]: all pieces of a page in a language, or one of them.
pieces() {
    awk -v start="\`\`\`$1" -v wanted="${3:-0}" '
        $0 == start { code = 1; ++number; next }
        $0 == "```" { code = 0 }
        code && (wanted == 0 || wanted == number)' "$docs/$2"
}

echo "== the installation, moved after it was made"
cmake --install "$build" --prefix "$scratch/made" >log
mv made installed
docs=$scratch/installed/share/doc/brenixcoder
folder=$(dirname "$(find "$scratch/installed" -name brenixcoder.pc)")
pkgconfig=(env "PKG_CONFIG_PATH=$folder" pkg-config) # before the system's folders
read -ra flags < <("${pkgconfig[@]}" --cflags --libs brenixcoder)
flags+=("-Wl,-rpath,$("${pkgconfig[@]}" --variable=libdir brenixcoder)" -lm)

echo "== every relative link of the pages, here and in the repository, leads somewhere"
for page in {"$docs","$source"}/{,docs/}*.md; do
    while read -r link; do
        [[ -e ${page%/*}/$link ]] || { echo "$page: $link" && exit 1; }
    done < <(grep -oP '\]\((?!https?:)\K[^)#]+' "$page")
done

echo "== the programs of the pages with pkg-config, as C and as C++"
read -ra warnings <<<"$CFLAGS"
mkdir programs
pieces c README.md 1 >programs/first.c
pieces c docs/generated-code.md >programs/generated.c
cp "$docs"/examples/* programs
for language in c:99 c++:17; do
    for program in first generated; do
        "$CC" -x "${language%:*}" "-std=${language/:/}" "${warnings[@]}" programs/$program.c -x none \
            "${flags[@]}" -o $program
    done
    expect '-1 -0.981667 -0.963333' env -i ./first
    expect 'tone.wav: 48000 samples at 48000 Hz' env -i ./generated
done
for example in levels echo gaps stream collect; do
    "$CC" "${warnings[@]}" programs/$example.c "${flags[@]}" -o $example
done
expect '*char *: the same' env -i ./echo
expect '*gap: * counts from * on*the core says *[0-9]' env -i ./gaps
expect '1.000 s, 48000 Hz*Overall *1.000000 *0.707*' env -i ./levels tone.wav

if [[ -e $build/lib/brenix-plugins/zmq.so ]]; then
    echo "== one reader of many writers, and the program of README on another machine"
    "$source/tests/collect.sh" ./collect installed/bin/brenix
    # Its file of a socket has a name as long as the address.
    awk 'NR == FNR { if (/Create/) create = $0; else init = init (init == "" ? "" : "\n") $0; next }
        /coderChannelCreate/ { $0 = create } /coderChannelInit/ { $0 = init } { print }' \
        <(pieces c README.md 2 | sed 's|tcp://127.0.0.1:5000|ipc://remote.socket_|') \
        programs/first.c >programs/remote.c
    "$CC" "${warnings[@]}" programs/remote.c "${flags[@]}" -o remote
    printf '1.5\n2.5\n3.5\n' | installed/bin/brenix write zmq -o Endpoint=ipc://remote.socket_ \
        -o Pattern=push -q &
    expect '1.5 2.5 3.5' env -i ./remote
    wait $!
fi

echo "== with CMake, as C and as C++"
cp programs/first.c programs/first.cpp
cat >programs/CMakeLists.txt <<'END'
cmake_minimum_required(VERSION 3.25)
project(programs LANGUAGES C CXX)
find_package(brenixcoder 1.0 REQUIRED)
foreach(language c cpp)
    add_executable(${language} first.${language})
    target_link_libraries(${language} PRIVATE brenixcoder::brenixcoder)
endforeach()
END
export CMAKE_PREFIX_PATH=$scratch/installed
cmake -S programs -B programs/build >>log
cmake --build programs/build >>log
expect '-1 -0.981667 -0.963333' env -i programs/build/c
expect '-1 -0.981667 -0.963333' env -i programs/build/cpp

echo "== the guide for plug-in authors"
cp -r "$docs/plugins/template" plugins
cd plugins
pieces cpp docs/plugin-authors.md 1 >numbers.cpp
pieces cpp docs/plugin-authors.md 2 >ticks.cpp
pieces c docs/plugin-authors.md >show.c
expect '*0 1 2 3 4 5 5 5 ' bash -e <(pieces sh docs/plugin-authors.md 1)
rm build/clip.so
expect 'brenix:Stream:couldNotLoadFilter: Could not load *./clip.so* (exit code 1)' env -C build ./try
pieces cmake docs/plugin-authors.md >>CMakeLists.txt
expect '*
1.5 2.5 3.5
brenix:InputStream:synchronousInputNotPossible: Cannot read 3 counts: there are 1 and the device is done.
device: brenix:Device:failed: broken.txt: no number after 1 lines.
exit code 1
brenix:Channel:unexpectedException: Option FileName: must be given.
exit code 1' bash -e <(pieces sh docs/plugin-authors.md 2)
expect '*device that loads*
0
1
2
read 3 counts *' env "PATH=$scratch/installed/bin:$PATH" "PKG_CONFIG_PATH=$folder" \
    bash -e <(pieces sh docs/plugin-authors.md 3)
[[ -e $("${pkgconfig[@]}" --variable=plugindir brenixcore)/loopback.so ]]
cd ..
