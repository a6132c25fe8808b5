#!/bin/bash
# usage: scripts/test.sh
# Installs what is missing, builds the library, its examples and its tests with warnings as errors, and runs the quick and the
# full tests.

. "$(dirname "$0")/lib.sh"
[ $# -eq 0 ] || usage 1

install_packages build archive vault
build_preset release
run_tests full
