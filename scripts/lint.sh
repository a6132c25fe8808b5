#!/bin/bash
# usage: scripts/lint.sh [--quick]
# Checks formatting with clang-format, scripts with shellcheck, that every include points to where it may, that every public
# header compiles alone, and code with clang-tidy, which takes minutes and --quick leaves out. When all is well it only says
# how much of the code is tests, at most a third.

. "$(dirname "$0")/lib.sh"
[[ $# -le 1 && ${1:---quick} == --quick ]] || usage 1

"$source_directory/scripts/format.sh" --check
install_packages build archive vault lint
cd "$source_directory"
shellcheck -x -P scripts .ci/run scripts/*.sh
/usr/bin/python3 scripts/structure.py
[[ ${1:-} == --quick ]] || build_preset clang-tidy
