#!/bin/bash
# usage: scripts/fuzz.sh [SECONDS] [TARGET...]
# Installs what is missing, builds the fuzz targets with clang 14's libFuzzer under AddressSanitizer and
# UndefinedBehaviorSanitizer, and lets each (readers, paths, operations, lanes; forms and files of the archive) look for
# inputs that break something, for SECONDS of CPU time (60 unless given) from the inputs in fuzz/corpus on. Fails at the first
# finding and says where its input is kept.
# New inputs that reach more code are kept below the build directory, in corpus/TARGET, for the next time.

. "$(dirname "$0")/lib.sh"
seconds=${1:-60}
[[ $seconds =~ ^[0-9]+$ ]] || usage 1
targets=("${@:2}")
[ ${#targets[@]} -gt 0 ] || targets=(readers paths operations lanes forms files)

install_packages build archive fuzz
build_preset fuzz
export ASAN_OPTIONS=malloc_context_size=2:quarantine_size_mb=16
TIMEFORMAT='%U %S'

for target in "${targets[@]}"; do
    [ -x "$build_directory/fuzz/fuzz_$target" ] || die "there is no fuzz target '$target'"
    inputs=$build_directory/corpus/$target
    log=$build_directory/fuzz_$target.log
    mkdir -p "$inputs"
    : >"$log"
    case $target in
    forms) longest=1024 ;;
    *) longest=128 ;;
    esac
    options=(-max_len="$longest" -entropic=0 -timeout=60 -malloc_limit_mb=64 -print_final_stats=1
        -artifact_prefix="$build_directory/finding-$target-")
    [ ! -e "$source_directory/fuzz/$target.dict" ] || options+=(-dict="$source_directory/fuzz/$target.dict")
    spent=0
    # It counts time on the clock, of which a busy machine gives it a part.
    while awk "BEGIN { exit !($spent + 1 <= $seconds) }"; do
        slice=$(awk "BEGIN { print int($seconds - $spent) }")
        status=0
        times=$({ time "$build_directory/fuzz/fuzz_$target" "${options[@]}" -max_total_time="$slice" "$inputs" \
            "$source_directory/fuzz/corpus/$target" >>"$log" 2>&1; } 2>&1) || status=$?
        if [ "$status" -ne 0 ]; then
            grep -aE '^Broken|ERROR|SUMMARY|Test unit written' "$log" >&2 || tail "$log" >&2
            die "$target: a finding; the whole report is in $log"
        fi
        spent=$(awk "BEGIN { split(\"$times\", used); print $spent + used[1] + used[2] }")
    done
    awk -v target="$target" -v spent="$spent" '/number_of_executed_units/ { runs += $2 } / cov: / { coverage = $4 }
        END { printf "%s: %d executions in %d CPU seconds, %d a second, no finding; code points reached: %s\n",
            target, runs, spent, runs / spent, coverage }' "$log"
done
