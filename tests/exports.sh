#!/usr/bin/env bash
# Holds what a built libbrenixcoder exports and needs against what it must.
# Usage: exports.sh LIBRARY
set -euo pipefail
library=$1

expected() {
    # The functions that the header declares...
    grep -oE 'coder[A-Z][A-Za-z]+\(' "$(dirname "$0")/../include/brenixcoder/coder.h" |
        tr -d '(' | sort -u
    # ... and the property classes: type information of all, everything of the full ones.
    local common=12brenixplugin10interfaces13IPropertyInfo
    printf '%s\n' "_ZTIN${common}E" "_ZTSN${common}E"
    local u16string=NSt7__cxx1112basic_stringIDsSt11char_traitsIDsESaIDsEEE
    local string=NSt7__cxx1112basic_stringIcSt11char_traitsIcESaIcEEE
    local shape element class d
    for shape in 6device15TScalarProperty 6device15TVectorProperty \
        14coderconverter16TPointerProperty; do
        for element in d f m l j i t s h a b "$u16string" "$string"; do
            class=N12brenixplugin3kit${shape}I${element}E
            printf '%s\n' "_ZTI${class}E" "_ZTS${class}E"
            if [[ ${#element} -eq 1 || $shape$element == *TScalarProperty"$u16string" ]]; then
                printf '%s\n' "_ZTV${class}E" "_ZNK${class#N}7getNameEv" "_Z${class}7destroyEv"
                for d in 0 2; do echo "_Z${class}D${d}Ev"; done
            fi
        done
    done
}

# Without the complete-object destructors (D1): a compiler may have D2 stand for them.
exported() {
    nm --dynamic --defined-only --format=posix "$library" | awk '$1 !~ /D1Ev$/ {print $1}' | sort -u
}

status=0
if [[ $(exported | grep -c '^coder') -ne 32 ]]; then
    echo "$library does not export 32 functions" >&2
    status=1
fi
if ! diff <(expected | sort -u) <(exported); then
    echo "exports of $library differ: < missing, > not wanted" >&2
    status=1
fi

needed=$(readelf --dynamic "$library" | sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p')
if extra=$(grep -vE '^(libbrenixcore\.so\.1|libstdc\+\+\.so\.6|lib(m|c|gcc_s)\.so\.[0-9]+|ld-linux-x86-64\.so\.2|lib[at]?u?b?san\.so\.[0-9]+)$' <<<"$needed"); then
    echo "$library needs more than it may: $extra" >&2
    status=1
fi
exit $status
