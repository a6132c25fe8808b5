#!/bin/bash
# usage: scripts/lint.sh
# Checks formatting with clang-format, code with clang-tidy and scripts with shellcheck; says nothing when all is well.

. "$(dirname "$0")/lib.sh"
[ $# -eq 0 ] || usage 1

"$source_directory/scripts/format.sh" --check
install_packages build archive vault lint
cd "$source_directory"
shellcheck -x -P scripts .ci/run scripts/*.sh
build_preset clang-tidy
