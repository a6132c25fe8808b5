#!/bin/bash
# usage: check_macros.sh COMPILER INCLUDE
# Public headers leave no macro behind but those that export.

set -euo pipefail
headers=$(cd "$2" && find . -name '*.h' -printf '#include "%P"\n')
macros=$("$1" -std=c++20 -E -dD -I "$2" -x c++ - <<<"$headers" |
    awk -v include="\"$2/" '/^# [0-9]/ { ours = index($3, include) == 1 } ours && /^#define/ { sub(/\(.*/, "", $2); print $2 }' |
    sort -u)
grep -qx KIVVCS_EXPORT <<<"$macros"
if grep -vxE 'KIV[A-Z]+_EXPORT' <<<"$macros"; then
    exit 1
fi
