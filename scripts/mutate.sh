#!/bin/bash
# usage: scripts/mutate.sh [PLACES [SEED]]
# Breaks the library at so many places (100) that the seed (1) chooses, one after the other in a copy of the sources: flips a
# comparison, drops a statement or swaps two arguments. Then builds it and runs the tests, the quickest first, until one
# notices: one that fails, or one that does not end in five times the processor time that it takes otherwise and 20 seconds.
# Shows which of the faults survived and which only kept a test from ending, and fails if more than 5 in 100 survived.
# Interrupted, it shows what it has found so far.

. "$(dirname "$0")/lib.sh"
[ $# -le 2 ] || usage 1

install_packages build mutation
build_directory=$build_root/mutation
rm -rf "$build_directory/source"
mkdir -p "$build_directory/source"
cp -r "$source_directory"/{CMakeLists.txt,cmake,include,src,examples,tests} "$build_directory/source"
export KIVVCS_FAULT_STRIDE=7
quietly cmake -S "$build_directory/source" -B "$build_directory/build" -G Ninja -DCMAKE_BUILD_TYPE=None \
    -DCMAKE_CXX_FLAGS='-O1 -D_GLIBCXX_ASSERTIONS' -DKIVVCS_PACKAGE_TESTS=OFF -DKIVVCS_ARCHIVE=OFF -DKIVVCS_EXAMPLES=OFF
quietly cmake --build "$build_directory/build" --parallel "$jobs"
python3 "$source_directory/scripts/mutate.py" "$build_directory/source" "$build_directory/build" "${1:-100}" "${2:-1}"
