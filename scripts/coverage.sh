#!/bin/bash
# usage: scripts/coverage.sh [GCOVR-OPTION...]
# Runs the tests and tells which lines and branches of the library they reach: a table of files, and the sums. With options
# such as --html-details FILE it tells more.

. "$(dirname "$0")/lib.sh"

install_packages build vault coverage
build_preset coverage
find "$build_directory" -name '*.gcda' -delete
run_tests
cd "$source_directory"
gcovr --root . --filter src/ --filter include/ --exclude-throw-branches --exclude-unreachable-branches --print-summary \
    "$@" "$build_directory"
