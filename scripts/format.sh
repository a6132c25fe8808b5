#!/bin/bash
# usage: scripts/format.sh [--check]
# Formats the sources with clang-format; with --check, only lists the files that would change, and fails if there are any.

. "$(dirname "$0")/lib.sh"
case ${1:-} in
'') mode=(-i) ;;
--check) mode=(--dry-run --Werror) ;;
*) usage 1 ;;
esac

install_packages lint
cd "$source_directory"
find include src archive bindings tests examples bench fuzz docs/snippets \( -name '*.h' -o -name '*.cpp' \) -print0 | xargs -0 clang-format-16 "${mode[@]}"
