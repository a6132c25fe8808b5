#!/bin/bash
# usage: scripts/merging.sh [ROUNDS [PARTIES [SEED]]]
# Lets parties edit, merge, cross, rewrite, collect and exchange at random, and compares every merge with what it should do;
# prints how many rounds went wrong. 20,000 rounds of three parties unless it is told otherwise.

. "$(dirname "$0")/lib.sh"
[ $# -le 3 ] || usage 1

install_packages build archive
build_preset release
KIVVCS_MERGE_ROUNDS=${1:-20000} KIVVCS_MERGE_PARTIES=${2:-3} KIVVCS_MERGE_SEED=${3:-1} \
    "$build_directory/tests/archive/merging_rounds_test"
