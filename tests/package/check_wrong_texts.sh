#!/bin/bash
# usage: check_wrong_texts.sh INCLUDE COMPILER...
# Each wrong text in wrong_texts.cpp gives one error of fewer than 15 lines, which names the function to call; without them it
# compiles.

set -euo pipefail
source=$(dirname "$0")/wrong_texts.cpp
include=$1
shift
count=$(grep -c 'WRONG ==' "$source")
for compiler in "$@"; do
    compile=("$compiler" -std=c++20 -fsyntax-only -I "$include" "$source")
    "${compile[@]}" -D WRONG=0
    for ((wrong = 1; wrong <= count; ++wrong)); do
        if errors=$("${compile[@]}" -D WRONG="$wrong" 2>&1); then
            echo "$compiler: $wrong compiles"
            exit 1
        fi
        lines=$(wc -l <<<"$errors")
        if [ "$lines" -ge 15 ] || [ "$(grep -c 'error:' <<<"$errors")" -ne 1 ] || ! grep -q FromUtf8 <<<"$errors"; then
            printf '%s: %s gives %s lines\n%s\n' "$compiler" "$wrong" "$lines" "$errors"
            exit 1
        fi
    done
done
