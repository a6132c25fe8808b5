#!/bin/bash
# usage: scripts/bench.sh [--quick] [FILTER]
# Installs what is missing, builds the benchmarks and runs those whose names match FILTER, each workload and its floor in
# turn, and prints one table with the medians over seven rounds; build/bench/result.json holds the numbers. --quick runs
# small sizes in three rounds, which takes seconds. Times are processor time, and a floor is the time that libcrypto's
# SHA-256 needs for the bytes that the workload must hash, unless docs/performance.md names another one.

. "$(dirname "$0")/lib.sh"

sizes=()
if [ "${1:-}" = --quick ]; then
    sizes=(--quick)
    shift
fi
[ $# -le 1 ] || usage 1

install_packages build bench
build_preset bench
result=$build_directory/result.json
quietly "$build_directory/bench/kivvcs_bench" "${sizes[@]}" --benchmark_filter="${1:-.}" \
    --benchmark_out="$result" --benchmark_out_format=json
grep -m1 'model name' /proc/cpuinfo 2>/dev/null || true
python3 "$source_directory/bench/table.py" "$result"
