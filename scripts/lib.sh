# shellcheck shell=bash disable=SC2119,SC2120
# Shared by the scripts beside it, which source it:
#   install_packages SET...   installs with apt-get what is missing of the named sets, or says plainly what is missing
#   build_preset PRESET       configures and builds a preset of CMakePresets.json; its directory is then in $build_directory
#   run_tests TIER            runs the tests of the directory built last that have the label quick, or full as well, or any
#                             (tests/CMakeLists.txt explains them), and shows only the summary when all pass
#   quietly COMMAND...        runs a command and shows its output only when it fails
#   die MESSAGE               ends the script
#   usage [STATUS]            shows the comment at the top of the script and ends it; -h and --help do so by themselves
# Build directories are build/PRESET, or $KIVVCS_BUILD_ROOT/PRESET where that is set.

set -euo pipefail

source_directory=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)
build_root=${KIVVCS_BUILD_ROOT:-$source_directory/build}
jobs=$(nproc)

die() {
    printf '%s: %s\n' "${0##*/}" "$*" >&2
    exit 1
}

usage() {
    awk 'NR > 1 { if (!/^#/) exit; sub(/^# ?/, ""); print }' "$0"
    exit "${1:-0}"
}

case ${1:-} in
-h | --help) usage ;;
esac

quietly() {
    local output status=0
    output=$(mktemp)
    "$@" >"$output" 2>&1 || status=$?
    [ "$status" -eq 0 ] || cat "$output" >&2
    rm -f "$output"
    return "$status"
}

packages_of() {
    case $1 in
    build) echo cmake g++ ninja-build pkg-config libgtest-dev binutils tzdata gdb dpkg-dev python3 ;;
    archive) echo libsqlite3-dev libzstd-dev libpq-dev ;;
    postgres) echo postgresql ;;
    vault) echo libsqlite3-dev libzstd-dev libcli11-dev sqlite3 ;;
    demo) echo git graphviz ;;
    clang) echo clang-14 ;;
    abi) echo abigail-tools xz-utils ;;
    docs) echo doxygen doxygen-awesome-css python3 ;;
    lint) echo clang-14 clang-format-16 clang-tidy-14 shellcheck python3 ;;
    bench) echo libbenchmark-dev libssl-dev valgrind python3 ;;
    contenders) echo libgit2-dev ;;
    plot) echo python3-matplotlib ;;
    valgrind) echo valgrind ;;
    coverage) echo gcovr ;;
    mutation) echo python3 ;;
    fuzz) echo clang-14 libclang-rt-14-dev ;;
    googletest) echo googletest ;;
    portability) echo googletest python3 ;;
    x86-64) ;;
    libcxx) echo clang-14 libc++-14-dev libc++abi-14-dev ;;
    x86) echo g++-i686-linux-gnu ;;
    aarch64) echo g++-aarch64-linux-gnu qemu-user ;;
    s390x) echo g++-s390x-linux-gnu qemu-user ;;
    wasm) echo emscripten nodejs ;;
    browser) echo chromium ;;
    windows) echo g++-mingw-w64-x86-64-posix wine wine64 ;;
    *) die "there is no package set '$1'" ;;
    esac
}

install_packages() {
    command -v dpkg-query >/dev/null || die "this is no Debian system; install by hand what these stand for:" \
        "$(for set in "$@"; do packages_of "$set"; done | tr '\n' ' ')"
    local missing=() package as_root=()
    for package in $(for set in "$@"; do packages_of "$set"; done); do
        dpkg-query -W -f='${db:Status-Status}\n' "$package" 2>/dev/null | grep -qx installed || missing+=("$package")
    done
    [ ${#missing[@]} -gt 0 ] || return 0
    if [ "$(id -u)" -ne 0 ]; then
        command -v sudo >/dev/null || die "missing packages: ${missing[*]}; neither root nor sudo is there to install them"
        as_root=(sudo)
    fi
    printf 'Installing %s\n' "${missing[*]}"
    quietly "${as_root[@]}" apt-get update || die "missing packages: ${missing[*]}; apt-get update failed"
    quietly "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive apt-get install -y --no-install-recommends "${missing[@]}" ||
        die "missing packages: ${missing[*]}; apt-get install failed"
}

build_preset() {
    build_directory=$build_root/$1
    case $1 in
    wasm | js) export NODE_PATH=/usr/share/nodejs ;;
    esac
    quietly cmake -S "$source_directory" --preset "$1" -B "$build_directory" || die "configuring '$1' failed"
    local build=(cmake --build "$build_directory" --parallel "$jobs")
    # On a terminal the build tool keeps to one line, which shows how far it is.
    [ -t 1 ] || build=(quietly "${build[@]}" -- --quiet)
    "${build[@]}" || die "building '$1' failed"
}

run_tests() {
    local tests=(ctest --test-dir "$build_directory" --output-on-failure --no-tests=error --parallel "$jobs")
    case $1 in
    quick) tests+=(--label-exclude 'full|soak') ;;
    full) tests+=(--label-exclude soak) ;;
    soak) ;;
    *) die "there are no tests of the tier '$1'" ;;
    esac
    local output status=0
    if [ -t 1 ]; then
        "${tests[@]}" --progress
        return
    fi
    output=$(mktemp)
    "${tests[@]}" >"$output" 2>&1 || status=$?
    if [ "$status" -eq 0 ]; then
        sed -n '/% tests passed/,$p' "$output"
    else
        cat "$output"
    fi
    rm -f "$output"
    return "$status"
}
