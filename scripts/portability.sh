#!/bin/bash
# usage: scripts/portability.sh [PLATFORM...]
# Installs what is missing, then builds the library and its tests for each platform and runs them: x86-64 (once in each of
# four time zones), libcxx (clang with libc++ instead of libstdc++), x86, aarch64 and s390x (emulated), and windows (a DLL,
# run by wine), and wasm (WebAssembly, run by node). All platforms without arguments.
# The identifiers that the tests expect are first compared with those which a script computes by other means. libcxx and x86
# run the full tests, the others the quick ones.
# wasm then prints, and fails beyond these, the size of the README's first program (250,000 bytes, 90,000 compressed) and what
# the speed of kivvcs_speed is to that of the native build (4 times its time; twice for hashing).

. "$(dirname "$0")/lib.sh"

time_zones=(UTC Asia/Kathmandu Pacific/Kiritimati America/St_Johns)

compare_expected_identifiers() {
    local expected name identifier
    expected=$(python3 "$source_directory/tests/golden_repository.py")
    while IFS=: read -r name identifier; do
        grep -q "\"${identifier# }\"" "$source_directory/tests/commit_test.cpp" ||
            die "the tests expect another identifier than ${identifier# } for '$name' of the golden repository"
    done <<<"$expected"
}

# Fails where VALUE is more than LIMIT.
report() {
    local name=$1 value=$2 limit=$3 unit=$4
    printf '%-28s %10s %s, at most %s\n' "$name" "$value" "$unit" "$limit"
    awk -v value="$value" -v limit="$limit" 'BEGIN { exit !(value <= limit) }' || die "$name: $value is more than $limit"
}

report_sizes() {
    local program=$build_directory/examples/quickstart.wasm
    local shown
    shown=$(awk '/^It prints$/ { shown = 1; next } shown && /^[^ ]/ { exit } shown && NF { print substr($0, 5) }' \
        "$source_directory/README.md")
    [ "$(node --no-experimental-fetch "${program%wasm}js")" = "$shown" ] ||
        die "the first program does not print what the README says"
    report 'first program' "$(stat -c %s "$program")" 250000 bytes
    report 'first program, compressed' "$(gzip -9 <"$program" | wc -c)" 90000 bytes
}

# The least of each line's times, given those of several runs.
fastest() {
    awk '!($1 in least) { order[++count] = $1; least[$1] = $2 } $2 < least[$1] { least[$1] = $2 }
        END { for (i = 1; i <= count; i++) print order[i], least[order[i]] }'
}

# The runs take turns, so that other work on the machine disturbs both sides.
report_speed() {
    local here='' there='' name value reference wasm_directory=$build_directory
    build_preset bench
    for _ in 1 2 3; do
        there+=$(node --no-experimental-fetch "$wasm_directory/bench/kivvcs_speed.js")$'\n'
        here+=$("$build_directory/bench/kivvcs_speed")$'\n'
    done
    while read -r name value; do
        reference=$(fastest <<<"${here%$'\n'}" | awk -v name="$name" '$1 == name { print $2 }')
        printf '%-28s %10s ms, natively %s\n' "$name" "$value" "$reference"
        report "$name" "$(awk -v a="$value" -v b="$reference" 'BEGIN { printf "%.2f", a / b }')" \
            "$([ "$name" = hash ] && echo 2 || echo 4)" 'times the native time'
    done < <(fastest <<<"${there%$'\n'}")
}

install_packages build vault portability
compare_expected_identifiers
[ $# -gt 0 ] || set -- x86-64 libcxx x86 aarch64 s390x windows wasm
for platform in "$@"; do
    printf '%s:\n' "$platform"
    install_packages "$platform"
    case $platform in
    x86-64)
        build_preset release
        for zone in "${time_zones[@]}"; do
            printf '%s:\n' "$zone"
            TZ=$zone run_tests quick
        done
        ;;
    libcxx | x86)
        build_preset "$platform"
        run_tests full
        ;;
    aarch64 | s390x)
        build_preset "$platform"
        run_tests quick
        ;;
    windows)
        export WINEPREFIX=$build_root/windows-wine WINEDEBUG=-all
        build_preset windows
        # Started by a test, wine's services would keep the pipe open at whose end ctest knows that the test has ended.
        mkdir -p "$WINEPREFIX"
        trap 'wineserver --kill' EXIT
        wineserver --persistent
        quietly wine cmd /c exit
        run_tests quick
        ;;
    wasm)
        install_packages bench
        build_preset wasm
        run_tests quick
        report_sizes
        report_speed
        ;;
    *) usage 1 ;;
    esac
done
