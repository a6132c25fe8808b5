#!/bin/bash
# usage: tests/vault_database_test.sh VAULT CASE
# Runs one of the cases below, on vaults in a database, on the program VAULT. Each case is a function, and has a server of its
# own. Ends with status 77 where PostgreSQL is not installed.

. "$(dirname "$0")/vault_testing.sh"

server=$here/../scripts/postgres.sh
if ! "$server" installed 2>/dev/null; then
    echo "Skipped: this test needs a PostgreSQL server, which is not installed here."
    exit 77
fi
# The server may run as somebody else.
chmod o+x "$work"
address=$("$server" start "$work/server" fsync=off)
trap '"$server" stop "$work/server"; chmod -R u+rwx "$work" 2>/dev/null; rm -rf "$work"' EXIT
export HOME=$work/home
unset XDG_CACHE_HOME XDG_STATE_HOME

# Every command once or more, with what it writes; what differs each time is blotted out.
transcript() (
    export VAULT_FILE=$1
    mkdir "$2"
    cd "$2"
    run() {
        local status=0
        echo "\$ ${*/"$VAULT_FILE"/vault}"
        "$vault" "$@" </dev/null 2>&1 || status=$?
        [ "$status" = 0 ] || echo "ends with $status"
    }
    commands() {
        run save d -m none
        write d/both base d/dir/deep deep d/old old
        run save d -m first
        run save d -m again
        run branch side
        write d/both ours d/new new
        run status d
        run diff master d --text
        run save d -m ours
        run checkout side
        write d/both theirs && rm d/old
        run save d -m theirs
        run log
        run log side:dir --json
        run show master:both
        run diff master side
        run branch
        run checkout master
        run merge side
        run merge side --on-conflict right
        run graph --text
        run restore master restored
        run restore master:dir part
        files restored
        files part
        run branch spare
        run branch --delete spare
        run branch --delete master
        run branch grown
        run checkout grown
        write restored/grown grown
        run save restored -m grown
        run rebase grown side
        write d/more more
        "$vault" -f other.db save d -m elsewhere --author 'Ben <ben@example.org>' >/dev/null
        run sync other.db
        run sync other.db
        run -f other.db sync "$VAULT_FILE"
        run join side other/master common
        run verify
        run verify --json
        run repair other.db
        run collect --yes --days 0
        run forget grown --dry-run
        run forget grown --yes
        run compact --yes
        run verify
        run log
        run log nowhere
        run show grown:missing
        run sync "$VAULT_FILE"
    }
    commands | sed -E 's/[0-9a-f]{64}/ID/g; s/\b[0-9a-f]{12}\b/ID/g; s/[0-9-]{10}T[0-9:]{8}/TIME/g; s/[0-9]+ (bytes|new objects)/SOME \1/;
        s/[1-9][0-9]* left/SOME left/'
)

DatabasesTakeTheSameCommandsAsFiles() {
    transcript vault.db files >in_file
    transcript "$address" database >in_database
    diff in_file in_database || fail "not the same"
    equal "$(grep -c '^\$' in_file)" 43
    equal "$(stat -c %a home/.cache/vault)" 700
    [ "$(find home/.cache/vault -name '*.db' -size +4k | wc -l)" -ge 1 ] || fail "nothing is in the cache"
}

TwoUsersOfADatabaseHaveCurrentBranchesOfTheirOwn() {
    export VAULT_FILE=$address
    write d/file content
    "$vault" save d -m first >/dev/null
    "$vault" branch side
    HOME=$work/ben "$vault" checkout side
    matches "$(HOME=$work/ben "$vault" branch)" '^[*] side'
    matches "$("$vault" branch)" '^[*] master'
}

ReadersGoOnWithWhatWasSeenWhileTheServerIsAway() {
    export VAULT_FILE=$address
    write d/file content
    "$vault" save d -m first >/dev/null
    seen() { "$vault" log && "$vault" show master:file; }
    seen >before
    "$server" crash "$work/server"
    seen >meanwhile 2>said
    diff before meanwhile || fail "not what was seen before"
    equal "$(grep -c 'the database is away' said)" 2
    refused "cannot be reached" save d -m second
    refused "cannot be reached" branch other
    refused "cannot be reached" -f "${address/\/postgres?host/\/other?host}" log
    "$server" restart "$work/server"
    seen 2>said >/dev/null
    equal "$(cat said)" ""
}

"$2"
