#!/bin/bash
# usage: scripts/trials.sh kills | damages | faults [COUNT]
# Installs what is missing, builds the archive's tests and runs one of its trials, as often as it is meant to be, or COUNT
# times; prints its figures, and fails at the first thing that is wrong.
#   kills     COUNT (200) writers that publish, synchronize and collect, each killed at a random moment
#   damages   COUNT (300) files that are damaged in one of many ways
#   faults    fails every COUNT-th (first) allocation, access to the disk and callback in turn; at least 3,000 of them

. "$(dirname "$0")/lib.sh"
[[ $# -ge 1 && $# -le 2 && ${2:-1} =~ ^[1-9][0-9]*$ ]] || usage 1

case $1 in
kills)
    export KIVVCS_ARCHIVE_KILLS=${2:-200}
    program=sqlite_archive_test filter='*Killed*' figures=kills
    ;;
damages)
    export KIVVCS_ARCHIVE_DAMAGES=${2:-300}
    program=sqlite_archive_test filter='*Damage*' figures=damaged
    ;;
faults)
    export KIVVCS_ARCHIVE_FAULT_STRIDE=${2:-1}
    program=archive_faults_test filter='*' figures=faults,
    ;;
*) usage 1 ;;
esac

install_packages build archive
build_preset release
output=$(mktemp)
trap 'rm -f "$output"' EXIT
"$build_directory/tests/archive/$program" --gtest_filter="$filter" >"$output" 2>&1 || {
    cat "$output"
    die "a trial failed"
}
grep "$figures" "$output"
[ "$1" != faults ] || awk '{ for (i = 2; i <= NF; ++i) if ($i == "faults,") count += $(i - 1) }
    END { printf "%d faults altogether\n", count; exit count < 3000 }' "$output" || die "fewer than 3,000 faults"
