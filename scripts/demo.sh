#!/bin/bash
# usage: scripts/demo.sh [PICTURE]
# Installs what is missing, builds the example host `vault`, and shows what it does with this project: versions its
# history (or, where there is none, its tree), lists and compares versions and verifies them; then lets two people work
# apart and brings their work together. Draws the history that comes out of it to PICTURE, an SVG file, by default beside
# the vaults.

. "$(dirname "$0")/lib.sh"
[[ $# -le 1 && ${1:-} != -* ]] || usage 1
versions_shown=36
content_size=0

step() {
    printf '\n== %s\n' "$*"
}

# Shows a command and runs it in the directory of the vaults.
show() {
    printf '$ vault %s\n' "$*"
    "$vault" "$@"
}

build_vault() {
    build_directory=$build_root/release
    quietly cmake -S "$source_directory" --preset release -B "$build_directory" || die "configuring failed"
    quietly cmake --build "$build_directory" --parallel "$jobs" --target vault || die "building failed"
    vault=$build_directory/examples/vault/vault
}

size_of() {
    find "$1" -type f -printf '%s\n' | awk '{ sum += $1 } END { print sum + 0 }'
}

has_history() {
    git -C "$source_directory" rev-parse --quiet --verify HEAD >/dev/null 2>&1
}

save_history() {
    local commit
    while read -r commit; do
        rm -rf version && mkdir version
        git -C "$source_directory" archive "$commit" | tar -x -C version
        content_size=$((content_size + $(size_of version)))
        "$vault" save version -m "$(git -C "$source_directory" log -1 --format=%s "$commit")" \
            --author "$(git -C "$source_directory" log -1 --format='%an <%ae>' "$commit")" >>saved
    done < <(git -C "$source_directory" rev-list --first-parent --max-count=$versions_shown HEAD | tac)
    tail -n 3 saved
}

save_tree() {
    mkdir version
    tar -C "$source_directory" --exclude=./build --exclude=./.git -c . | tar -x -C version
    content_size=$(size_of version)
    show save version -m "The project as it is"
}

show_project() {
    if has_history; then
        step "The last versions of this project, saved one after the other"
        save_history
    else
        step "This project's tree (it has no history here)"
        save_tree
    fi
    step "The log, newest first"
    show log | sed -n '1,10p'
    if [ "$("$vault" log | wc -l)" -gt 1 ]; then
        step "What the last version changed"
        show diff "$("$vault" log | sed -n '2s/^\(.\{12\}\).*/\1/p')" master
    fi
    step "Sizes"
    printf '%s versions of together %s bytes\n' "$("$vault" log | wc -l)" "$content_size"
    printf 'are held by one file of %s bytes\n' "$(stat -c %s vault.db)"
    step "Every stored object, checked"
    show verify
    "$vault" restore master restored && diff -r version restored && echo "restored without a difference"
}

# Ann and Ben each have the project, work on it apart, and do not agree about the README.
work_apart() {
    export VAULT_AUTHOR='Ann <ann@example.org>'
    mv vault.db ann.db && cp ann.db ben.db
    "$vault" -f ann.db restore master ann && "$vault" -f ben.db restore master ben
    echo 'Ann was here.' >>ann/README.md
    mkdir ann/plans && echo 'Sail to the north.' >ann/plans/summer
    rm ann/CHANGELOG.md
    show -f ann.db save ann -m 'Plan the summer'
    sleep 1
    export VAULT_AUTHOR='Ben <ben@example.org>'
    echo 'Ben was here.' >>ben/README.md
    echo 'Stay at home.' >ben/plans
    echo '- Ben' >>ben/CHANGELOG.md
    echo 'Ben wrote this.' >ben/notes.txt
    show -f ben.db save ben -m 'Write notes'
}

come_together() {
    step "Ann gets Ben's work; nothing of hers is touched"
    export VAULT_AUTHOR='Ann <ann@example.org>'
    show -f ann.db sync ben.db
    show -f ann.db merge other/master && die "the conflicts were not found"
    step "Both changed the same: the later one wins"
    show -f ann.db merge other/master --on-conflict newest
    step "Ben takes what Ann made of it"
    export VAULT_AUTHOR='Ben <ben@example.org>'
    show -f ben.db sync ann.db
    show -f ben.db merge other/master --on-conflict right
}

prove_equality() {
    local ann ben
    step "Both vaults hold the same root"
    ann=$("$vault" -f ann.db show master | grep '^root')
    ben=$("$vault" -f ben.db show master | grep '^root')
    printf 'ann.db %s\nben.db %s\n' "$ann" "$ben"
    [ "$ann" = "$ben" ] || die "the vaults differ"
    "$vault" -f ann.db verify && "$vault" -f ben.db verify
    step "Only the heads and where they part are kept"
    show -f ann.db compact
}

draw() {
    "$vault" -f ann.db graph >history.dot
    dot -Tsvg history.dot -o "$1"
    printf 'The history that is left is drawn in %s\n' "$1"
}

install_packages build vault demo
build_vault
workshop=$(mktemp -d)
picture=$(realpath -m "${1:-$workshop/history.svg}")
cd "$workshop" || exit
show_project
step "Two people work apart"
work_apart
come_together
prove_equality
draw "$picture"
printf 'The vaults are in %s\n' "$workshop"
