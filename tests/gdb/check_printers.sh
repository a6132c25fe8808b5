#!/bin/bash
# usage: check_printers.sh PROGRAM PRINTERS whole|plain
# Lets gdb stop in the program and show its values: all of them with debug information of the library, the plain ones without.

set -euo pipefail
program=$1
printers=$2
extent=$3
export ASAN_OPTIONS=detect_leaks=0 LC_ALL=C.UTF-8

commands=(-ex 'set breakpoint pending on' -ex 'set width 0' -ex 'break Look' -ex run -ex up)
for value in word view empty noId id content unidentified chain blob object first next tree wide nothing; do
    commands+=(-ex "printf \"$value: \"" -ex "print $value")
done
output=$(gdb --batch --nx -x "$printers" "${commands[@]}" "$program" 2>&1) || true
if grep -qiE 'ptrace|could not trace' <<<"$output"; then
    echo "no program may be traced here"
    exit 77
fi

expect() {
    grep -qE "^$1: \\\$[0-9]+ = $2\$" <<<"$output" || {
        printf '%s\nexpected %s = %s\n' "$output" "$1" "$2" >&2
        exit 1
    }
}

# sha256 of "blob 5", a zero byte and "hello", and of trees of it that Python's hashlib computed
directory=8418b19103788eb3733a7d1ec6419bc8cea6377f5d89630505832c1281925b36
root=84d52eb6de077aed1c9d7d009dd8c723700c818e29ca900130886a4a72e9d731
hello=8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60
expect word 'u"Grüße"'
expect view '"view"'
expect empty '""'
expect noId 'no object'
expect id "$hello"
expect nothing null
if [ "$extent" = whole ]; then
    expect content '5 bytes "hello"'
    expect unidentified 'blob .not identified yet., 5 bytes "hello"'
    expect chain '100005 bytes "hello(\\000){195}"...'
    expect blob "held [0-9]+ times = \\{object = blob ${hello:0:12}, 5 bytes \"hello\"\\}"
    expect object "held [0-9]+ times = \\{object = blob ${hello:0:12}, 5 bytes \"hello\"\\}"
    expect first 'held [0-9]+ times = \{object = commit [0-9a-f]{12} = \{description_ = u"Start", authorName_ = u"Ada", authorEmail_ = u"ada@example.org", commitTime_ = 20[-0-9]+ [0-9:]+ UTC, parent_ = none, .*'
    expect tree "held [0-9]+ times = \\{object = tree ${root:0:12} = \\{a = \"?tree ${directory:0:12}\"?\\}\\}"
    blob="blob ${hello:0:12}"
    expect wide "tree [^=]* = \\{00 = $blob; tree ${root:0:12}(, [0-9]{2} = $blob){98}, 99 = $blob\\}"
    expect next 'commit \(not identified yet\) = \{.* 2001-09-09 01:46:40 UTC, parent_ = commit [0-9a-f]{12}, .*'
fi
if grep -E 'Python Exception|Traceback' <<<"$output"; then
    exit 1
fi
