# shellcheck shell=bash
# Sourced by the tests of the vault, which are called with the program and a case: works in a directory of its own.

set -euo pipefail
vault=$(realpath "$1")
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cd "$work"
export VAULT_AUTHOR='Ann Example <ann@example.org>' TZ=Asia/Kathmandu

fail() {
    echo "line ${BASH_LINENO[1]}: $*" >&2
    exit 1
}
equal() { [ "$1" = "$2" ] || fail "expected '$2', got '$1'"; }
# matches TEXT PATTERN...: every extended regular expression is found in TEXT.
matches() {
    local text=$1 pattern
    for pattern in "${@:2}"; do
        grep -qE -- "$pattern" <<<"$text" || fail "no '$pattern' in: $text"
    done
}
# refused STATUS PATTERN ARGUMENT...: vault ends with STATUS and one line on standard error that has PATTERN.
refused() {
    local status=0
    "$vault" "${@:3}" >out 2>err || status=$?
    equal "$status" "$1"
    equal "$(wc -l <err)" 1
    matches "$(cat err)" "$2"
}
root_of() { "$vault" "${@:2}" show "$1" | sed -n 's/^root *//p'; }
# write FILE CONTENT...: makes files of one line each, and their directories.
write() {
    while [ $# -gt 0 ]; do
        mkdir -p "$(dirname "$1")"
        echo "$2" >"$1"
        shift 2
    done
}
