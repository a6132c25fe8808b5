#!/bin/bash
# usage: scripts/trials.sh kills | damages | faults | vault-kills | vault-merges [COUNT]
# Installs what is missing, builds the tests of the archive, or the vault, and runs one of their trials, as often as it is
# meant to be, or COUNT times; prints its figures, and fails at the first thing that is wrong.
#   kills     COUNT (200) writers that publish, synchronize and collect, each killed at a random moment
#   damages   COUNT (300) files that are damaged in one of many ways
#   faults    fails every COUNT-th (first) allocation, access to the disk and callback in turn; at least 3,000 of them if
#             it is each; on all processors
#   vault-kills   COUNT (60) runs of each command of the vault that writes, each killed at a random moment
#   vault-merges  COUNT (300) random pairs of directories that the vault merges, judged path by path

. "$(dirname "$0")/lib.sh"
[[ $# -ge 1 && $# -le 2 && ${2:-1} =~ ^[1-9][0-9]*$ ]] || usage 1

in_vault=()
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
    program=archive_faults_test filter='*' figures=faults, processes=$jobs
    ;;
vault-kills) in_vault=(KilledCommands "${2:-60}") ;;
vault-merges) in_vault=(RandomTreesMerge "${2:-300}" random) ;;
*) usage 1 ;;
esac

if [ ${#in_vault[@]} -gt 0 ]; then
    install_packages build archive vault
    build_preset release
    exec bash "$source_directory/tests/vault_history_test.sh" "$build_directory/examples/vault/vault" "${in_vault[@]}"
fi
install_packages build archive
build_preset release
output=$(mktemp -d)
trap 'rm -rf "$output"' EXIT
export GTEST_TOTAL_SHARDS=${processes:-1}
running=()
for ((part = 0; part < GTEST_TOTAL_SHARDS; ++part)); do
    GTEST_SHARD_INDEX=$part "$build_directory/tests/archive/$program" --gtest_filter="$filter" >"$output/$part" 2>&1 &
    running+=($!)
done
status=0
for process in "${running[@]}"; do
    wait "$process" || status=$?
done
[ "$status" -eq 0 ] || {
    cat "$output"/*
    die "a trial failed"
}
cat "$output"/* | grep "$figures"
if [ "$1" = faults ]; then
    count=$(cat "$output"/* | awk '{ for (i = 2; i <= NF; ++i) if ($i == "faults,") count += $(i - 1) } END { print count + 0 }')
    printf '%d faults altogether\n' "$count"
    [[ $count -ge 3000 || ${2:-1} -gt 1 ]] || die "fewer than 3,000 faults"
fi
