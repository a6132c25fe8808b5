#!/bin/bash
# usage: scripts/lint.sh
# Checks formatting with clang-format and code with clang-tidy; says nothing when all is well.

. "$(dirname "$0")/lib.sh"
[ $# -eq 0 ] || usage 1

"$source_directory/scripts/format.sh" --check
install_packages build vault lint
build_preset clang-tidy
