#!/bin/bash
# usage: scripts/portability.sh [PLATFORM...]
# Installs what is missing, then builds the library and its tests for each platform and runs them: x86-64 (once in each of
# four time zones), libcxx (clang with libc++ instead of libstdc++), x86, aarch64 and s390x (emulated), and windows (a DLL,
# run by wine). All platforms without arguments.
# The identifiers that the tests expect are first compared with those which a script computes by other means. libcxx and x86
# run the full tests, the others the quick ones.

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

install_packages build vault portability
compare_expected_identifiers
[ $# -gt 0 ] || set -- x86-64 libcxx x86 aarch64 s390x windows
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
    *) usage 1 ;;
    esac
done
