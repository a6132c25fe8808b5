#!/bin/bash
# usage: scripts/check.sh PRESET...
# Installs what is missing, then builds each preset of CMakePresets.json and runs its tests: release, debug, clang, static,
# asan, tsan, glibcxx-debug, valgrind, and clang-tidy, which only builds. Valgrind and the debug containers, which are
# slow, run the quick tests only, the others all but those of the longest tier; tsan lets few allocations fail, which are
# tried by one thread.

. "$(dirname "$0")/lib.sh"
[ $# -gt 0 ] || usage 1

install_packages build vault
for preset in "$@"; do
    case $preset in
    clang | clang-tidy) install_packages lint ;;
    tsan | glibcxx-debug) install_packages googletest ;;
    valgrind) install_packages valgrind ;;
    esac
    printf '%s:\n' "$preset"
    build_preset "$preset"
    case $preset in
    clang-tidy) ;;
    valgrind | glibcxx-debug) run_tests quick ;;
    tsan) KIVVCS_FAULT_STRIDE=97 KIVVCS_ARCHIVE_FAULT_STRIDE=97 run_tests full ;;
    *) run_tests full ;;
    esac
done
