# shellcheck shell=bash
# Sourced by the tests of the vault, which are called with the program and a case: works in a directory of its own.

set -euo pipefail
vault=$(realpath "$1")
# shellcheck disable=SC2034
here=$(realpath "$(dirname "${BASH_SOURCE[0]}")")
work=$(mktemp -d)
trap 'umount "$work/small" 2>/dev/null || true; chmod -R u+rwx "$work" 2>/dev/null; rm -rf "$work"' EXIT
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
# ends STATUS PATTERN ARGUMENT...: vault ends with STATUS and has PATTERN on standard error, whose output is in out.
ends() {
    local status=0
    "$vault" "${@:3}" >out 2>err </dev/null || status=$?
    [ "$status" = "$1" ] || fail "'$*' ended with $status: $(cat err)"
    matches "$(cat err)" "$2"
}
# refused PATTERN ARGUMENT...: vault ends with status 2 and one line on standard error that has PATTERN.
refused() {
    ends 2 "$@"
    equal "$(wc -l <err)" 1
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
# Everything in a directory that a version keeps.
state_of() { (cd "$1" && find . -printf '%P %y %#m %l %T@ ' -type f -exec md5sum {} + -o -printf '\n' | LC_ALL=C sort); }
same() { diff <(state_of "$1") <(state_of "$2") || fail "$1 and $2 differ"; }
# files DIR: the files below it with their contents, on one line.
files() { (cd "$1" && find . -type f -printf '%P\n' | LC_ALL=C sort | while read -r f; do echo "$f:$(cat "$f")"; done | xargs); }
