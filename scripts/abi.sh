#!/bin/bash
# usage: scripts/abi.sh [--update]
# Installs what is missing, builds the shared libraries with debug information and compares what they export (functions, virtual
# tables, layouts) with the interfaces stored in tests/abi. Fails where the version does not announce a difference: what breaks
# programs that were built before needs a new SONAME, what is only added a higher version. docs/versioning.md has the rules.
# --update stores the interfaces as they are now, under the version that the build gives them: to be done with every release.

. "$(dirname "$0")/lib.sh"
[[ $# -eq 0 || ($# -eq 1 && $1 == --update) ]] || usage 1

baselines=$source_directory/tests/abi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

# Writes the interface of a library as text.
describe() {
    abidw --suppressions "$baselines/foreign.ini" --headers-dir "$source_directory/include" --drop-private-types \
        --drop-undefined-syms --no-corpus-path --no-comp-dir-path --no-show-locs "$1" >"$2"
}

# 0.2.3 gives 0.2 and 1.2.3 gives 1, as in the SONAME.
soname_part() {
    case $1 in
    0.*) echo "${1%.*}" ;;
    *) echo "${1%%.*}" ;;
    esac
}

compare() {
    local name=$1 old_version=$2 new_version=$3 old=$4 new=$5
    if abidiff --no-added-syms "$old" "$new" >"$work/report"; then
        if abidiff "$old" "$new" >"$work/report"; then
            printf '%s %s: the interface of %s\n' "$name" "$new_version" "$old_version"
        elif [ "$old_version" != "$new_version" ]; then
            printf '%s %s: the interface of %s, and additions\n' "$name" "$new_version" "$old_version"
        else
            cat "$work/report" >&2
            die "$name $new_version adds to the interface that it was released with; raise the version"
        fi
    elif [ "$(soname_part "$old_version")" != "$(soname_part "$new_version")" ]; then
        printf '%s %s: another interface than %s, as the SONAME announces\n' "$name" "$new_version" "$old_version"
    else
        cat "$work/report" >&2
        die "$name $new_version breaks programs that were built with $old_version, and its SONAME does not say so"
    fi
}

install_packages build abi
build_preset abi
while IFS= read -r library; do
    name=$(basename "$library" .so)
    version=$(basename "$(readlink -f "$library")")
    version=${version#"$name.so."}
    describe "$library" "$work/new.abi"
    if [ "${1:-}" = --update ]; then
        rm -f "$baselines/$name"-*.abi.xz
        xz -9e --stdout "$work/new.abi" >"$baselines/$name-$version.abi.xz"
        continue
    fi
    baseline=$(find "$baselines" -name "$name-*.abi.xz")
    if [ -z "$baseline" ]; then
        printf '%s %s: no interface is stored yet\n' "$name" "$version"
        continue
    fi
    old_version=$(basename "$baseline" .abi.xz)
    xz --decompress --stdout "$baseline" >"$work/old.abi"
    compare "$name" "${old_version#"$name-"}" "$version" "$work/old.abi" "$work/new.abi"
done < <(find "$build_directory" -name 'libKiv*.so' | sort)
