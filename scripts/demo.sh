#!/bin/bash
# usage: scripts/demo.sh [PICTURE]
#        scripts/demo.sh --team
# Installs what is missing, builds the example host `vault`, and shows what it does with this project: versions its
# history (or, where there is none, its tree), lists and compares versions and verifies them; then lets two people work
# apart and bring their work together three times, and a damaged vault be repaired. Draws the history that comes out of it
# to PICTURE, an SVG file, by default beside the vaults.
# With --team three processes publish at once on one branch of a database, and end with one head.

. "$(dirname "$0")/lib.sh"
[[ $# -le 1 && (${1:-} != -* || $1 == --team) ]] || usage 1
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

# What git takes for the same versions after it has packed them.
size_in_git() {
    git clone --quiet --bare --no-local --depth $versions_shown "file://$source_directory" packed.git
    git -C packed.git gc --quiet --aggressive --prune=now
    size_of packed.git/objects
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
    if has_history; then
        printf 'while the same in git, packed, takes %s bytes\n' "$(size_in_git)"
    fi
    step "Every stored object, checked"
    show verify
    "$vault" restore master restored && diff -r version restored && echo "restored without a difference"
}

# Ann and Ben each have the project, and work on it apart from each other.
begin_apart() {
    mv vault.db ann.db && cp ann.db ben.db
    "$vault" -f ann.db restore master ann && "$vault" -f ben.db restore master ben
}

as_ann() {
    export VAULT_AUTHOR='Ann <ann@example.org>'
    show -f ann.db "$@"
}

as_ben() {
    export VAULT_AUTHOR='Ben <ben@example.org>'
    show -f ben.db "$@"
}

# Brings both together: Ann merges what Ben did, and Ben takes over what Ann made of it.
exchange() {
    as_ann sync ben.db
    as_ann merge other/master "$@"
    as_ben sync ann.db
    as_ben merge other/master
    "$vault" -f ann.db restore master ann --force --delete && "$vault" -f ben.db restore master ben --force --delete
}

work_together() {
    step "Both change the README, in different places, and files of their own"
    sed -i '1s/$/ (edited by Ann)/' ann/README.md && mkdir ann/plans && echo 'Sail to the north.' >ann/plans/summer
    as_ann save ann -m 'Plan the summer'
    echo 'Ben was here.' >>ben/README.md && echo 'Ben wrote this.' >ben/notes.txt
    as_ben save ben -m 'Write notes'
    exchange
    step "Ann removes what Ben wrote, Ben goes on: nothing comes back, nothing is lost"
    rm ann/notes.txt && as_ann save ann -m 'No notes'
    echo 'Sail to the south.' >>ben/plans/winter && as_ben save ben -m 'Plan the winter'
    exchange
    step "A true conflict: both change one line, and a directory becomes a file"
    echo 'Stay at home.' >ann/plans/summer && as_ann save ann -m 'Stay'
    rm -r ben/plans && echo 'No plans.' >ben/plans && as_ben save ben -m 'No plans'
    as_ann sync ben.db
    as_ann merge other/master && die "the conflict was not found"
    step "Ann keeps her side"
    exchange --on-conflict left
}

prove_equality() {
    local ann ben
    step "Both vaults hold the same root"
    ann=$("$vault" -f ann.db show master | grep '^root')
    ben=$("$vault" -f ben.db show master | grep '^root')
    printf 'ann.db %s\nben.db %s\n' "$ann" "$ben"
    [ "$ann" = "$ben" ] || die "the vaults differ"
    show -f ann.db graph --text | sed -n '1,12p'
}

survive_damage() {
    step "A disk loses a piece of Ann's vault: what is sound is read, the rest comes from Ben"
    sqlite3 ann.db 'UPDATE segments SET form = zeroblob(length(form)) WHERE number = (SELECT min(number) FROM segments)'
    show -f ann.db verify 2>&1 | tail -n 1 || true
    show -f ann.db log -n 2 || [ $? -eq 3 ]
    show -f ann.db repair ben.db
    show -f ann.db verify
}

draw() {
    "$vault" -f ann.db graph >history.dot
    dot -Tsvg history.dot -o "$1"
    printf 'The history that is left is drawn in %s\n' "$1"
}

# Three members of a team, who publish at once.
show_team() {
    local server heads member
    build_directory=$build_root/release
    quietly cmake -S "$source_directory" --preset release -B "$build_directory" || die "configuring failed"
    quietly cmake --build "$build_directory" --parallel "$jobs" --target team || die "building failed"
    workshop=$(mktemp -d)
    chmod 711 "$workshop"
    server=$workshop/server
    # shellcheck disable=SC2064
    trap "'$source_directory/scripts/postgres.sh' stop '$server'; rm -rf '$workshop'" EXIT
    address=$("$source_directory/scripts/postgres.sh" start "$server")
    step "Ann, Ben and Cleo publish five notes each on one branch of one database"
    for member in Ann Ben Cleo; do
        "$build_directory/examples/team" "$address" "$workshop/$member.cache" "$member" 5 3 >"$workshop/$member" &
    done
    wait
    for member in Ann Ben Cleo; do
        printf '%s:\n' "$member"
        cat "$workshop/$member"
    done
    heads=$(grep -h '^head' "$workshop"/{Ann,Ben,Cleo})
    [ "$(wc -l <<<"$heads")" -eq 3 ] || die "not everybody has a head"
    [ "$(sort -u <<<"$heads" | wc -l)" -eq 1 ] || die "the heads differ"
    grep -q ', 18 files$' <<<"$heads" || die "something is lost"
    step "Three equal heads, and everybody's notes"
}

if [[ ${1:-} == --team ]]; then
    install_packages build archive postgres
    show_team
    exit
fi
install_packages build vault demo
build_vault
workshop=$(mktemp -d)
picture=$(realpath -m "${1:-$workshop/history.svg}")
cd "$workshop" || exit
show_project
begin_apart
work_together
prove_equality
survive_damage
draw "$picture"
printf 'The vaults are in %s\n' "$workshop"
