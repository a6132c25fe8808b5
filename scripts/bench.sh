#!/bin/bash
# usage: scripts/bench.sh [--quick | --plot] [FILTER]
#        scripts/bench.sh --check [--update]
# Installs what is missing, builds the benchmarks and runs those whose names match FILTER, each workload, its contender and its
# floor in turn, and prints one table with the medians over nine rounds; build/bench/result.json holds the numbers. --quick
# runs a quarter of each size and less, which takes a minute; --plot adds a sixteenth and draws build/bench/performance.svg.
# With `archive` or `vault` as FILTER it runs that beside git instead, and prints one table with the limits that it keeps to;
# `archive` may be followed by the names of some of its rows: files, text, source, history, million, large, edits.
# With `postgres` as FILTER it runs archives in a database beside bare transactions and archives in files.
# --check counts the instructions of one small round of each workload and fails where they are more than bench/baseline.json
# says by over 2 %; --update writes that file. docs/performance.md says what is measured.

. "$(dirname "$0")/lib.sh"

# The same functions of the C library on every processor, and a world without anything else that could change a count.
count_instructions() {
    local dumps=$1 tunables prefix=()
    tunables=glibc.cpu.hwcaps=-AVX512F,-AVX2,-AVX,-AVX_Fast_Unaligned_Load,-ERMS,-FSRM,-SSSE3,-SSE4_2
    ! setarch -R true 2>/dev/null || prefix=(setarch -R)
    quietly env -i TZ=UTC LD_BIND_NOW=1 GLIBC_TUNABLES="$tunables:glibc.cpu.x86_non_temporal_threshold=0x8000000" \
        "${prefix[@]}" valgrind --quiet --tool=callgrind --collect-atstart=no --callgrind-out-file="$dumps/dump" \
        "$build_directory/bench/kivvcs_bench" count
}

check() {
    local dumps tools status=0
    dumps=$(mktemp -d)
    # shellcheck disable=SC2064
    trap "rm -rf '$dumps'" EXIT
    count_instructions "$dumps" || die "counting failed"
    tools="$("$build_directory/bench/kivvcs_bench" tools), $(valgrind --version)"
    /usr/bin/python3 "$source_directory/bench/instructions.py" "$dumps" "$source_directory/bench/baseline.json" "$tools" "$@" ||
        status=$?
    exit "$status"
}

measure() {
    local sizes=$1 filter=$2
    quietly "$build_directory/bench/kivvcs_bench" "$sizes" --benchmark_filter="$filter" --benchmark_out="$result" \
        --benchmark_out_format=json
    grep -m1 'model name' /proc/cpuinfo 2>/dev/null || true
    /usr/bin/python3 "$source_directory/bench/table.py" "$result"
}

mode=${1:-}
case $mode in
--quick | --plot | --check) shift ;;
-*) usage 1 ;;
*) mode= ;;
esac
if [[ ${1:-} == archive ]]; then
    [[ ${mode:---quick} == --quick ]] || usage 1
    install_packages build archive bench demo
    build_preset bench-static
    exec /usr/bin/python3 "$source_directory/bench/archive/compare.py" "$build_directory/bench/kivvcs_archive_bench" \
        ${mode:+"$mode"} "${@:2}"
fi
if [[ ${1:-} == vault ]]; then
    [[ $# -eq 1 && ${mode:---quick} == --quick ]] || usage 1
    install_packages build archive vault demo
    build_preset release
    exec /usr/bin/python3 "$source_directory/bench/vault.py" "$build_directory/examples/vault/vault" ${mode:+"$mode"}
fi
if [[ ${1:-} == postgres ]]; then
    [[ $# -eq 1 && ${mode:---quick} == --quick ]] || usage 1
    install_packages build archive postgres bench
    build_preset bench
    exec /usr/bin/python3 "$source_directory/bench/postgres/compare.py" "$build_directory/bench" ${mode:+"$mode"}
fi
if [ $# -gt 1 ] || [[ $mode == --check && ${1:---update} != --update ]]; then
    usage 1
fi

install_packages build bench
(install_packages contenders) || printf 'Without libgit2 as a contender: it cannot be installed here\n'
build_preset bench
result=$build_directory/result.json
case $mode in
--check) check "$@" ;;
--quick) measure quick "${1:-.}" ;;
--plot)
    install_packages plot
    measure growth "${1:-.}"
    /usr/bin/python3 "$source_directory/bench/plot.py" "$result" "$build_directory/performance.svg"
    ;;
*) measure whole "${1:-.}" ;;
esac
