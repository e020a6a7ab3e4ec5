#!/usr/bin/env bash
# Runs brenix: a table of commands with their exit codes and output, the plug-ins' tables against their
# documentation, and the C programs that it writes against what it did itself.
# Usage: cli.sh SOURCE-FOLDER BUILD-FOLDER CC
set -euo pipefail
source=$1 build=$2 cc=$3 plugins=$2/tests/plugins
export PATH=$build/bin:$PATH
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
cd "$scratch"
mkfifo pipe
failures=0

fail() {
    echo "FAILED: $1" >&2
    failures=$((failures + 1))
}

# Things to check: no shared library, one that needs another that is gone, and one that is no plug-in.
echo text >text.so
echo 'int gone(void) { return 0; }' | "$cc" -shared -fPIC -x c - -o libgone.so
echo 'int gone(void); int f(void) { return gone(); }' |
    "$cc" -shared -fPIC -x c - -o needs.so -L. -lgone
rm libgone.so
echo 'int f(void) { return 0; }' | "$cc" -shared -fPIC -x c - -o other.so
printf 'left,right\n1,-2\n3,-4\n' >samples.csv
printf '1,2\n3\n' >uneven.csv
printf '1\nx\n' >letters.csv
printf '1.5,2\n3,4\n' >fraction.csv
printf '1e400\n1\n' >range.csv
printf 'a,b\n1\n' >header.csv
printf '1\n\e[31m\xc2\x9b\xc3\xa4\xff\n' >escapes.csv
seq 50000 >many.csv
seq -s , 3000 >wide.csv
# Three channels of 8 bits: a frame and the byte that makes the length even, and two bytes of a frame.
wav='RIFFxxxxWAVEfmt \x10\0\0\0\1\0\3\0\x40\x1F\0\0\xC0\x5D\0\0\3\0\x8\0data'
printf '%b' "$wav\3\0\0\0abc\0" >padded.wav
printf '%b' "$wav\5\0\0\0abcde\0" >incomplete.wav
mkdir folder

# exit code | text in the output | arguments
while IFS='|' read -r code text arguments; do
    eval "set -- $arguments"
    if [[ $1 == keys || ${2:-} == zmq ]] && [[ ! -e $build/lib/brenix-plugins/zmq.so ]]; then
        continue # it was left out
    fi
    got=0
    timeout -k 5 20 brenix "$@" >out 2>&1 </dev/null || got=$?
    if [[ $got -ne $code ]] || ! grep -qF -- "$text" out || grep -q 'brenix: brenix:' out; then
        fail "brenix $arguments: exit code $got, wanted $code with: $text"
        cat out >&2
    fi
done <<END
0|signal: a device that loads|check signal
1|wrongFileType: it is not a regular file|check ./pipe
1|notFound: $build/lib/brenix-plugins/none.so: No such file|check none
1|wrongFileType: ./text.so|check ./text.so
1|missingDependency: it needs a library that does not load: libgone.so: cannot open|check ./needs.so
1|notAPlugin|check ./other.so
1|abiVersion: it has plug-in ABI version 999, needed is |check $plugins/otherAbiVersion.so
1|noFactory|check $plugins/noFactory.so
1|factoryFailed: thrown by the factory|check $plugins/throwingFactory.so
1|factoryFailed: the factory returned nothing|check $plugins/nullFactory.so
1|notLoadable: thrown by a static object|check $plugins/throwingStatic.so
1|"problem": "abiVersion"|check --json signal $plugins/otherAbiVersion.so
0|does not describe its options|plugins $plugins/probe.so
1|couldNotLoadDevice: $build/lib/brenix-plugins/none.so: No such file|info none
1|couldNotLoadFilter: Could not load ./needs.so: libgone.so: cannot open|info signal -f ./needs.so
1|{"error":{"id":"brenix:Channel:unexpectedException","message":"Option Foo: is not known."}}|info signal -o Foo=1 --json
2|not a value of type int8: 300|info signal -o Foo:int8=300
2|an option is Name=value|info signal -o Foo
2|samples and --emit-c - cannot both go to the standard output|read signal -n 1 --emit-c -
0|fputs("data" "\n", file);|read signal -n 1 -q -w tone.csv --emit-c -
2|at most 16 options|info signal $(printf -- '-o Foo=1 %.0s' {1..17})
0|Frequency: 1000 Hz|info signal -o Frequency:int32=1000 -o Waveform:char=sine -o Pace=fast -o Channels=1
1|Custom property: Foo not found|info signal -p Foo:double
2|{"error":{"id":"","message":"The following argument was not expected: --nonsense|info signal --json --nonsense
0|serial|find
0|signal: does not look for anything|find signal
1|scale: cannot look: it is a filter and no device|find scale
1|probe.so: cannot look: Unrecognized error.|find $plugins/probe.so
1|  \x1b[31m|find $plugins/probe.so
1|  may not be opened: group none|find $plugins/probe.so
1|"Packets": "2 3"|find --json signal $plugins/probe.so
1|"message": "Unrecognized error."|find --json $plugins/probe.so
1|{"error":{"id":"brenix:Device:failed","message":"Field none|scope $plugins/probe.so -o Packets:int32=2,-4 --json
0|wrote 2 counts|write loopback -i samples.csv -t int16
0|{"counts":2,"seconds":|write loopback -i samples.csv --json
0|"counts": 10,|scope signal -n 10 --json
1|uneven.csv: line 2: 1 values instead of 2|write loopback -i uneven.csv
1|letters.csv: line 2: not a number of type double: x|write loopback -i letters.csv
1|range.csv: line 1: not a number of type double: 1e400|write loopback -i range.csv
1|fraction.csv: line 1: not a number of type int16: 1.5|write loopback -i fraction.csv -t int16
1|fraction.csv: line 1: not a number of type uint8: 1.5|write udp -o Host=127.0.0.1 -o Port=9 -i fraction.csv
1|fraction.csv: line 1: not a number of type int64: 1.5|write udp -o Host=127.0.0.1 -o Port=9 -o ElementType=int64 -i fraction.csv
1|header.csv: line 2: 1 values instead of 2|write loopback -i header.csv
1|folder: cannot be read|write loopback -i folder
1|folder: cannot be read|write loopback -i folder --format raw
1|signal has no output stream with these options: it cannot be written to|write signal -i samples.csv
1|audiofile has no input stream with these options: it cannot be read|read audiofile -o Mode=write -o FileName=a.wav
1|couldNotCreateDevice: scale: it is a filter and no device; filters are given with -f|read scale
1|couldNotCreateConverter: scale: it is a filter and no converter|info signal -c scale
1|identity.so: it is a converter and no filter|info signal -f identity
1|has an ending that names no sound file format: 123.|read audiofile -o FileName=123 -o Mode=write
0|Frequency: 0.0047 Hz|info signal -o Frequency=4.7m -o BlockSize=4Ki
1|Frequency: must be one number|info signal -o Frequency=1k,2
2|brenix: option Frequency: not a number: 1x|info signal -o Frequency=1x
2|option Gain: not a number: nothing|read signal -f 'scale Gain='
2|option Timeout: not a number: long|read signal --open-option Timeout=long
2|option Stamps: not a logical: maybe|read signal -o Stamps=maybe
2|--time needs csv, not wav|read signal --time -n 1 -w time.wav
0|read 1200 counts|read signal -o Pace=fast -n 1.2k -r 1M --limit 4Ki -w kilo.csv
2|--block: 2Mi is not a whole number from 1 to 1048576|write loopback -b 2Mi
2|foo is no command: there are plugins, check, find, info, read, write, scope, keys|foo
2|a command is missing: there are plugins|''
2|--nonsense; see brenix read --help|read signal --nonsense
0|Usage: brenix write|help write
0|{"secretKeyFile":"a.key","publicKeyFile":"a.key.pub","publicKey":"|keys a.key --json
1|a.key: File exists|keys a.key
1|none/a.key: No such file or directory|keys none/a.key
2|file is required|keys
1|Could not bind tcp://nowhere:5000: No such device|write zmq -o Endpoint=tcp://nowhere:5000 -o Pattern=push -i samples.csv
1|Option Topic: is not for pull|read zmq -o Endpoint=tcp://127.0.0.1:5000 -o Pattern=pull -o Topic=a
1|line 2: not a number of type double: \x1b[31m\xc2\x9bä\xff|write loopback -i escapes.csv
1|brenix:Device:failed: failed in run; also: |write $plugins/probe.so -o Streams=o -o FailIn=run -b 1 -i many.csv
1|brenix:InputStream:couldNotConvertInputData: 13 is refused|read $plugins/probe.so -c $plugins/pickyConverter.so -o Packets:int32=5,15 -w refused.csv
0|wrote 1 counts|write audiofile -o FileName=padded.au -o Mode=write -o Channels=3 -i padded.wav
1|incomplete.wav: the last frame has 2 of 3 bytes|write loopback -i incomplete.wav -n 5
2|--block: 1048576 counts of 3000 columns are more than|write loopback -i wide.csv -b 1048576
2|x.foo: the ending .foo names no format|read signal -n 1 -w x.foo
1|none/x.csv: No such file or directory|read signal -n 1 -w none/x.csv
2|x.foo: the ending .foo names no format|write loopback -i x.foo
1|short.flac: 2 samples beyond full scale were cut off|read signal -n 8 -o Amplitude=1.1 -o Frequency=6000 -w short.flac
0|"counts":8,|read audiofile -o FileName=short.flac --json -w short.TXT
0|read 0 counts|read $plugins/probe.so -w none.csv
0|read 0 counts|read $plugins/probe.so -w none.flac -r 8000
0|read 0 counts|read audiofile -o FileName=none.flac --field left --field right -w names.csv
1|Field none has no elements|read $plugins/probe.so -o Packets:int32=2,3,-4 -w kept.csv
2|--counts: 1.5 is not a whole number of at least 1|read signal -n 1.5
2|--limit: 0.5 is not a whole number of at least 1|read signal -n 1 --limit 0.5
2|--limit: inf is not a whole number|read signal -n 2 --limit inf
2|--seconds: nan is not a number above 0|read signal -s nan
2|--rate: 0 is not a number above 0|read signal -n 1 -r 0
1|a sound file needs a whole number as sample rate|read signal -n 1 -r 44100.5 -w rate.wav
1|does not load|plugins nosuch
0|  data  int16: |info udp -o ElementType=int16
0|  data  as ElementType says: |plugins udp
0|command set: from the next block on|plugins signal
1|brenix: nosuch: notFound|plugins --names signal nosuch
0|  Stamp  double in s: one for each packet|plugins $plugins/pickyConverter.so
0|  Stamp  double in s: one for each packet|info $plugins/probe.so -c $plugins/pickyConverter.so
1|the data has no field Foo; it has data, Stamp|read $plugins/probe.so -c $plugins/pickyConverter.so -o Packets:int32=3,4 --field Foo
0|6 counts were lost: the input stream was full; 6 since open.|read signal -o Pace=fast -o Frames=10 -o BlockSize=10 -o Overflow=dropNewest --limit 4
0|"counts":4,"lost":6,|read signal -o Pace=fast -o Frames=10 -o BlockSize=10 -o Overflow=dropNewest --limit 4 --json
1|read 4 counts in|read signal -o Pace=fast -o Frames=10 -o BlockSize=10 -o Overflow=dropNewest --limit 4 --fail-on-loss
1|field Odd has no fixed number of elements|scope $plugins/probe.so -o Packets:int32=10,10,5 --field Odd
1|the data has no field Foo; it has data|read signal -n 1 --field Foo
0|RMS 0.7071|scope signal -o Pace=fast -n 4800 --png picture.png
END
if [[ $(tr '\n' ' ' <kept.csv) != 'data 0 1 2 3 4 ' ]] || ! cut -d, -f1 refused.csv | cmp - kept.csv; then
    fail "what came before an error of a device or a converter is lost"
fi
[[ $(cat none.csv names.csv) == $'data\nleft,right' ]] || fail "names of nothing: $(cat none.csv names.csv)"
for command in "info signal" plugins "check signal" "scope signal -n 10" \
    "read signal -n 10 --format "{csv,raw,wav,flac,ogg}; do
    for output in '>/dev/full' '>&-' '-w /dev/full'; do
        [[ $output != -w* || $command == read* ]] || continue
        if eval "brenix $command 2>errors $output" ||
            ! grep -qE '(standard output|/dev/full): (cannot|No space|Bad)' errors; then
            fail "brenix $command $output: $(cat errors)"
        fi
    done
done
got=0
PATH=$build/bin brenix scope signal -o Pace=fast -o Channels=4 -n 48000 --png none.png >out 2>&1 || got=$?
if [[ $got -ne 1 ]] || ! grep -q 'is it installed' out; then
    fail "scope without gnuplot: exit code $got"
fi
file picture.png | grep -q 'PNG image data' || fail "picture.png is no picture"

# A picture of few samples has a part of the trace in each of its 79 columns, and some more at its steps.
brenix scope signal -o Waveform=ramp -o SampleRate=8 -o Frequency=1 -o BlockSize=8 -o Pace=fast -n 8 >picture
[[ $(LC_ALL=C.UTF-8 grep -o '[█▀▄]' picture | wc -l) -eq 89 ]] || fail "scope of few samples: $(cat picture)"

# What is found can be pasted.
eval "brenix read $(brenix find "$plugins/probe.so" | head -n 1) -q" >pasted.csv || fail "what is found cannot be pasted"
cmp pasted.csv kept.csv || fail "what is found reads other data: $(cat pasted.csv)"

# On a terminal a picture fits the screen, keys are not echoed, and the terminal is left as it was.
while IFS='|' read -r columns keys shown arguments; do
    rm -f terminal
    got=0
    {
        while ! grep -qs $'\e\[J' terminal; do sleep 0.1; done
        printf '%b' "$keys"
    } | timeout -k 5 20 script -qefc "trap : INT; stty rows 24 cols $columns; stty -g >before
        brenix scope signal $arguments && stty -g | cmp before -" terminal >/dev/null || got=$?
    if [[ $got -ne 0 ]] || ! grep -qF "$shown" terminal || grep -qE 'xy|\^C' terminal ||
        ! awk 'BEGIN { RS = "\033\\[J" } lines > 24 { exit 1 } { lines = gsub("\n", "") }' terminal; then
        fail "scope on $columns columns, keys $keys: exit code $got: $(cat -v terminal)"
    fi
done <<'END'
80|xyq|11 of 12 channels|-o Channels=12
1|\003|RMS|-o Channels=2
END

# What an interrupted read has read is complete.
got=0
timeout -s INT 1 brenix read signal -w part.raw 2>summary <&- || got=$?
[[ -s part.raw && $(stat -c %s part.raw) -eq $(($(awk '{ print $2 * 8 }' summary))) ]] ||
    fail "an interrupted read: $(cat summary)"
got=$(timeout -s KILL 0.5 brenix read signal -o SampleRate=500 -o BlockSize=10 -o Frequency=100 --format raw | wc -c) || true
[[ $got -gt 0 ]] || fail "raw samples do not come at once"
# It ends at the first interrupt, whatever it waits for: the other side of a FIFO, its samples, a reader.
write=(brenix write audiofile -o Mode=write -o SampleFormat=DOUBLE -q)
for command in "read signal -w pipe --format "{csv,wav} "write loopback -i pipe --format "{csv,raw,wav}; do
    read -ra words <<<"$command"
    got=0
    timeout --preserve-status -s INT -k 5 0.3 brenix "${words[@]}" 2>summary || got=$?
    [[ $got -eq 130 && $(cat summary) =~ ^(read|wrote)\ 0\ counts.*interrupted ]] ||
        fail "brenix $command, interrupted: exit code $got, $(cat summary)"
done
{
    got=0
    timeout --preserve-status -s INT -k 5 0.5 brenix read signal -o Pace=fast --format raw 2>summary || got=$?
    echo "$got" >code
} | { sleep 1 && wc -c >size; }
[[ $(cat code size) == $'130\n'$(($(awk '{ print $2 * 8 }' summary))) ]] ||
    fail "an interrupted read to a full pipe: exit code and size $(cat code size), $(cat summary)"
exec 3<>pipe
for format in csv raw; do
    got=0
    if [[ $format == csv ]]; then printf '0.5\n0.25\n0.' >&3; else head -c 19 /dev/zero >&3; fi
    timeout --preserve-status -s INT -k 5 0.5 "${write[@]}" -o FileName=cut.wav --format $format -i pipe || got=$?
    brenix read audiofile -o FileName=cut.wav -q >cut.csv
    [[ $got -eq 130 && $(tr '\n' ' ' <cut.csv) =~ ^'data 0.5 0.25 '$|^'data 0 0 '$ ]] ||
        fail "an interrupted write that waits for its input: exit code $got, $(cat cut.csv)"
done

# Completion offers what fits.
# shellcheck source=/dev/null
source "$source/tools/brenix.bash"
# shellcheck disable=SC2317 # the completion calls it
compopt() { :; }
while IFS='|' read -r words offered; do
    eval "COMP_WORDS=(brenix $words)"
    COMP_CWORD=$((${#COMP_WORDS[@]} - 1))
    _brenix
    [[ ${COMPREPLY[*]} == "$offered" ]] || fail "completion of $words: ${COMPREPLY[*]}"
done <<'END'
read si|signal
read signal -c ''|columns identity
read signal -f ''|decimate scale
read signal -o F|Frequency= Frames=
read loopback -o ''|
read loopback --field ''|data
write loopback -t u|uint8 uint16 uint32 uint64
check co|columns
read signal --format w|wav w64
END

# Documented options and properties are those that the plug-ins describe.
brenix plugins --json | jq -r '.plugins[] | .name as $p | (.options + .properties)[] |
    [$p, .name, .type, .unit, (.default // "-"), .meaning] | join("|")' | sort >described
awk -F'|' '/^## / { gsub("`", "", $0); n = split($0, words, " "); plugin = words[n] }
    /^\| `/ && plugin != "" {
        for (i = 2; i < NF; i++) { gsub(/[`"]/, "", $i); gsub(/^ +| +$/, "", $i) }
        if (NF == 7) print plugin "|" $2 "|" $3 "|" $4 "|" $5 "|" $6
        else if (NF == 6) print plugin "|" $2 "|" $3 "|" $4 "|-|" $5
    }' "$source/docs/plugins.md" | sort | while IFS= read -r row; do
    [[ ! -e $build/lib/brenix-plugins/${row%%|*}.so ]] || echo "$row" # some may be left out
done >documented
[[ $(wc -l <documented) -gt 30 ]] || fail "no tables found in plugins.md"
diff described documented >&2 || fail "plug-ins and plugins.md differ"

compile() {
    "$cc" -std=c99 -Wall -Wextra -Wpedantic -Werror "-I$source/include" program.c -o program \
        "-L$build/lib" -lbrenixcoder -lsndfile -lm "-Wl,-rpath,$build/lib"
}

# Plug-ins are found also by a library that was found in a relative folder, before the program left it.
cat >program.c <<'END'
#include <brenixcoder/coder.h>
#include <unistd.h>
int main(void)
{
    char id[CODER_ERROR_SIZE], message[CODER_ERROR_SIZE];
    return chdir("/") != 0 || coderChannelCreate("signal", "identity", id, message, 1.0, 1.0) == NULL;
}
END
"$cc" "-I$source/include" program.c -o program "-L$build/lib" -lbrenixcoder "-Wl,-rpath-link,$build/lib"
program=$PWD/program
(cd "$build" && LD_LIBRARY_PATH=lib "$program") || fail "plug-ins beside a library in a relative folder"

# Emitted programs: each does the same again. The result is a file, or what is printed.
emitted() { # FILE-OF-RESULT ARGUMENTS...
    local result=$1
    shift
    rm -f "$result" program
    timeout 20 brenix "$@" --emit-c program.c >stdout
    if [[ -e $result ]]; then mv "$result" first; else mv stdout first; fi
    compile
    timeout 20 ./program >stdout || fail "the program fails"
    if [[ -e $result ]]; then cp "$result" second; else mv stdout second; fi
    if [[ ! -s first ]] || ! cmp first second; then
        fail "the program of: brenix $*"
    fi
}
signal=(signal -o Pace=fast -o Channels=2)
emitted - info "${signal[@]}" --open -p Channels:uint32
emitted - info "$plugins/probe.so" -c "$plugins/pickyConverter.so"
emitted - read "$plugins/probe.so" -c "$plugins/pickyConverter.so" -o Packets:int32=1,3 -q
[[ $(tail -n 2 second | tr '\n' ' ') == '2,4 3,4 ' ]] || fail "a stamp of each packet: $(cat second)"
emitted - read "${signal[@]}" -q --time -o Frames=6 -o BlockSize=6 -o Overflow=dropNewest --limit 4
[[ $(cut -d, -f1,2 second | tr '\n' ' ') == 'Index,Time 0,0 1,0 2,0 3,0 ' ]] || fail "numbers and times: $(cat second)"
[[ $(brenix read signal -q -o BlockSize=3 -n 3 --time | awk -F, '{ time = substr($2, 6) } NR > 2 { print time - last } { last = time }' | tr '\n' ' ') =~ ^2083[0-9]\ 2083[0-9]\ $ ]] ||
    fail "the times of three samples"
brenix info signal --emit-c - >program.c
compile
./program | cmp - <(brenix info signal) || fail "the program on the standard output"
emitted - info signal -o Channels=1 -o Channels=2 -p Channels:uint32
name=$'./*\\\n/*??/\n/*.raw' # it would end a comment
mkdir -p "${name%/*}"
emitted "$name" read "${signal[@]}" -n 100 -w "$name" -f 'scale Gain=-0 Offset=12345678901234567890'
emitted samples.raw read "${signal[@]}" -o Frames=10000 -w samples.raw
emitted - read "${signal[@]}" -q -s 0.1 -c columns -f 'scale Gain:float=0.1 Offset=100' -n 1000
emitted a.wav read "${signal[@]}" -c columns -n 5000 -w a.wav
emitted a.flac read "${signal[@]}" -o Amplitude=0.9 -n 5000 -w a.flac
sed -i 's/0\.9/1.1/' program.c
compile
while IFS='|' read -r file message; do
    if ./program "$file" 2>errors | cat >out || ! grep -qE "^$file: $message" errors; then
        fail "the program of $file: $(cat errors)"
    fi
done <<'END'
loud.flac|[0-9]+ samples beyond full scale
/dev/full|cannot be written
/dev/stdout|Illegal seek
END
# FLAC writes these 4000 samples only when it is closed.
noise=(brenix read signal -o Waveform=noise -o Pace=fast -n 4000 -q -w full.flac)
"${noise[@]}" --emit-c program.c
compile
for command in "${noise[*]}" "./program full.flac"; do
    if (trap '' XFSZ && ulimit -f 4 && $command) 2>errors || ! grep -q 'full.flac: ' errors; then
        fail "$command on a full disk: $(cat errors)"
    fi
done
emitted b.flac write audiofile -o FileName=b.flac -o Mode=write -o Channels=2 -i a.flac
grep -q 'static double elements' program.c || fail "the type that audiofile takes is not written"
brenix write loopback -q -i a.flac --emit-c program.c
grep -q 'static int32_t elements' program.c || fail "the type of a.flac is not written"
emitted b.au write audiofile -o FileName=b.au -o Mode=write -o Channels=2 -o SampleFormat=DOUBLE -i a.wav
emitted c.wav write audiofile -o FileName=c.wav -o Mode=write -o Channels=2 -i samples.csv -f 'scale Gain=0.1'
emitted d.wav write audiofile -o FileName=d.wav -o Mode=write -o Channels=2 --format raw -i samples.raw -n 3000

# Both write what comes before bad input, and take a number in quotes for one.
{ echo ' "1" ' && seq 2 1500 && echo x; } >torn.csv
head -c 12003 /dev/zero >torn.raw
brenix read signal -o Pace=fast -n 1501 -q -w whole.wav
head -c -3 whole.wav >torn.wav
for format in csv raw wav; do
    input=/dev/null
    [[ $format != wav ]] || input=whole.wav
    "${write[@]}" -o FileName=good.wav --format $format -i $input --emit-c program.c
    compile
    for command in "${write[*]} -o FileName=good.wav -i" ./program; do
        if $command torn.$format 2>errors || ! grep -qE 'line 1501: not|last element|ends after 1500 ' errors ||
            [[ $(brenix read audiofile -o FileName=good.wav -q | wc -l) -ne 1501 ]]; then
            fail "good.wav of $command torn.$format: $(cat errors)"
        fi
    done
done

# Floating-point WAV has the levels of integers, from the command and from its program.
printf '0.5\n-0.25\n1.5\n' | "${write[@]}" -o FileName=loud.wav
timeout 20 brenix read udp -o ElementType=int16 -n 6 -w levels.flac -r 8000 2>told &
while kill -0 $! && ! grep -qs LocalPort told; do sleep 0.02; done
brenix write udp -o Host=127.0.0.1 -o "Port=$(sed -n 's/^udp: LocalPort //p' told)" -o ElementType=int16 -t int16 \
    -i loud.wav -q --emit-c program.c
compile
./program
wait $! || true
brenix read audiofile -o FileName=levels.flac -q >levels.csv
[[ $(tr '\n' ' ' <levels.csv) == 'data 0.5 -0.25 0.999969482421875 0.5 -0.25 0.999969482421875 ' ]] ||
    fail "levels: $(cat told levels.csv)"

# Nothing of the device is taken for a standard output that is closed, such as what takes 8 bytes of anybody.
rm told
timeout 20 brenix read udp -o ElementType=int64 -n 1 --format raw 2>told >&- &
while kill -0 $! && ! grep -qs LocalPort told; do sleep 0.02; done
echo 1 | brenix write udp -o Host=127.0.0.1 -o "Port=$(sed -n 's/^udp: LocalPort //p' told)" -o ElementType=int64 -q
if wait $! || ! grep -q 'standard output: Bad' told; then
    fail "what goes to a closed output: $(cat told)"
fi

# They tell what is wrong in their input, and keep what came before an error of the device.
brenix write loopback -q -t int8 -i samples.csv --emit-c program.c
compile
for row in 300,1 1 1,2,3 1,x $'1,\e'; do
    printf 'a,b\n1,2\n%s\n' "$row" >bad.csv
    if ./program bad.csv 2>errors || [[ $(cat errors; echo .) != "bad.csv: line 3: not 2 values of type int8: ${row/$'\e'/\\x1b}
." ]]; then
        fail "the program of $row: $(cat errors)"
    fi
done
for row in '0x10,a' 'nan ,inf' '"1,5",2' '"1,x'; do
    echo "$row" >first.csv
    for command in "brenix write loopback -q -t int8 -i" ./program; do
        if $command first.csv 2>errors || ! grep -q 'first.csv: line 1: not' errors; then
            fail "$command of a first line $row: $(cat errors)"
        fi
    done
done
printf '\xEF\xBB\xBF1,2\n' >marked.csv
printf '\xEF\xBB\xBF\n"a, 5",info\n1,2\n' >names.csv
for file in marked.csv names.csv; do
    for command in "brenix write loopback -q -i" ./program; do
        $command $file || fail "$command $file"
    done
done

# Both take the same numbers.
while IFS='|' read -r type numbers others; do
    echo 1 >number.csv
    brenix write loopback -q -t "$type" -i number.csv --emit-c program.c
    compile
    for number in $numbers $others; do
        wanted=$([[ " $others " == *" $number "* ]]; echo $((1 - $?)))
        echo "1
$number" >number.csv
        for command in "brenix write loopback -q -t $type -i" ./program; do
            got=0
            $command number.csv 2>errors || got=$?
            [[ $got -eq $wanted ]] || fail "$number as $type: exit code $got of $command: $(cat errors)"
        done
    done
done <<'END'
double|1e-400 -1e-400 1e308 -0 +1 .5 5. inf -Infinity nan "1"|1e400 -1e400 0x10 0X1p3 +-1 1" "1
float|1e-50 1e38|1e39 0x1
int8|-0 +1 -128 127 007|128 -129 0x1 1.5 1e1 +-1
uint8|-0 255|256 -1
uint64|-0 18446744073709551615|18446744073709551616 -1
logical|-0 +1 true false|2 -1 0x1 True
END
# And both print them alike, as short as can be.
while read -r type numbers; do
    [[ -e $build/lib/brenix-plugins/hdf5.so ]] || continue # it was left out
    printf 'data\n%s\n' "${numbers// /$'\n'}" >wanted.csv
    brenix write hdf5 -q -o FileName=numbers.h5 -o Mode=write -o ElementType="$type" -t "$type" -i wanted.csv
    emitted - read hdf5 -q -o FileName=numbers.h5 --field data
    diff wanted.csv second || fail "numbers of type $type"
done <<'END'
double 0 -0 0.1 0.001 1e-04 0.00012 1e+05 123456 12345678901234567168 1.2345678901234568e+22 5e-324 -inf nan
float 0.1 1e-04 -0.3 1e+05 16777216 3.4028235e+38 1e-45
END
while read -r converter last message; do
    brenix read "$plugins/probe.so" -c "$converter" -o Packets:int32=2,3,4 -q -w whole.csv --emit-c program.c
    sed -i "s/{2, 3, 4}/{2, 3, $last}/" program.c
    compile
    if ./program broken.csv 2>errors || ! cut -d, -f1 broken.csv | cmp - kept.csv || ! grep -q "$message" errors; then
        fail "the program with a packet $last: $(cat errors)"
    fi
done <<END
identity -4 brenix:Device:failed: Field none
$plugins/pickyConverter.so 9 couldNotConvertInputData: 13 is refused
END

# Samples arrive as they were, as far as the format holds them: a file of each format, through pipes.
brenix read "${signal[@]}" -n 3000 --format raw -q >samples.raw
for format in $(brenix read signal --format none 2>&1 | grep -oP '\{\K[^}]+' | tr ',' ' '); do
    brenix read "${signal[@]}" -n 3000 --format "$format" -q | cat >"one.$format"
    rm -f copy.wav
    # shellcheck disable=SC2002 # a pipe is what is tested
    cat "one.$format" | brenix write audiofile -o FileName=copy.wav -o Mode=write \
        -o SampleFormat=DOUBLE -o Channels=2 -q --format "$format"
    brenix read audiofile -o FileName=copy.wav --format raw -q >copy.raw
    if [[ ' avr flac mp3 oga ogg opus pvf sf voc ' == *" $format "* ]]; then
        [[ $(stat -c %s copy.raw) -eq 48000 ]]
    else
        cmp copy.raw samples.raw
    fi || fail "$format through pipes"
done

exit $((failures > 0))
