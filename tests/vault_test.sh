#!/bin/bash
# usage: tests/vault_test.sh VAULT CASE [KILLS]
# Runs one of the cases below on the program VAULT. Each case is a function; KilledSaves takes the number of kills.

. "$(dirname "$0")/vault_testing.sh"

sql() { sqlite3 vault.db "$1"; }

SavesAndRestoresWhatADirectoryHolds() {
    write d/a.txt hello d/copy hello d/dir/deep.txt deep
    mkdir d/nothing
    : >$'d/dir/ä😀\n'
    matches "$("$vault" save d -m 'parent of all')" '4 files, 7 new objects$'
    # Computed by another program.
    equal "$(root_of master)" cd150ad060116392acca02074c4d7d7ab5ad5f4ccf36bda31f3010fe9856d9c4
    matches "$("$vault" show master:)" '^blob 2cf8d83d9ee2' '^tree .* dir$'
    equal "$("$vault" show master:dir/deep.txt)" deep
    matches "$("$vault" save d -m again)" '1 new objects$'
    write d/a.txt changed d/new/b b
    rm d/copy
    "$vault" save d -m 'third parent ' --author 'Bob <>' >out
    equal "$("$vault" diff "$("$vault" log | sed -n '2s/^\(.\{10\}\).*/\1/p')" master | xargs)" \
        "changed a.txt removed copy added new/b"
    equal "$("$vault" log | sed 's/^[0-9a-f]\{64\}  [-0-9]\{10\} [0-9:]\{5\} //')" "+0545  Bob <>  third parent 
+0545  Ann Example <ann@example.org>  again
+0545  Ann Example <ann@example.org>  parent of all"
    "$vault" restore master restored/here
    diff -r d restored/here
    "$vault" verify >out
    rm -r d && mkdir d
    "$vault" save d -m emptied >out
    "$vault" restore master empty
    equal "$(find empty)" empty
    matches "$("$vault" verify)" '^verified'
}

BranchesAreIndependentLines() {
    write d/f one
    "$vault" save d -m one >out
    "$vault" branch side
    write d/f two
    "$vault" save d -m two >out
    "$vault" checkout side
    matches "$("$vault" branch)" '^\* side ' '^  master '
    equal "$("$vault" log | wc -l) $("$vault" log master | wc -l)" "1 2"
    refused 2 'current branch cannot be deleted' branch --delete side
    "$vault" branch --delete master
    refused 2 'no such branch: master' checkout master
    "$vault" verify >out
}

BadInputGetsOneLineAndChangesNothing() {
    refused 2 'no vault vault.db' log
    refused 2 'not a directory' save missing
    write d/f one
    refused 2 'unable to open' -f '' save d
    refused 2 "must be given as 'Name <mail>'" save d --author 'A <b'
    [ ! -e vault.db ] || fail "a refused save left a vault"
    for i in $(seq 17); do write d/f "$i" && "$vault" save d -m "$i" >out; done
    cp vault.db before.db
    refused 2 'one line: only the first' save d -m $'two\nlines'
    refused 2 'not UTF-8' save d -m $'\xff'
    refused 2 'no such revision' show nowhere
    refused 2 'no such revision' diff master ''
    refused 2 'ambiguous revision' show "$("$vault" log | cut -c 1 | sort | uniq -d | head -n 1)"
    refused 2 'no such file' show master:g
    refused 2 'not UTF-8' show $'master:\xff'
    refused 2 'already' branch master
    refused 2 'neither' branch a:b
    refused 2 'is not empty' restore master d
    refused 2 'required' frobnicate
    cmp vault.db before.db
    refused 2 'not a vault file' -f d/f log
    sqlite3 foreign.db 'CREATE TABLE t(x)'
    refused 2 'not a vault file' -f foreign.db save d
    sql 'PRAGMA user_version = 2'
    refused 2 'newer version \(format 2, this one reads 1\)' log
    refused 2 'newer version' save d
    "$vault" -f before.db show master:f >/dev/full 2>err && fail "a full disk went unnoticed"
    matches "$(cat err)" 'output could not be written'
}

AnotherProcessKeepsTheVaultLocked() {
    write d/f one
    "$vault" save d >out
    (echo 'BEGIN EXCLUSIVE; SELECT 1;' && sleep 8) | sqlite3 vault.db >locked &
    until [ -s locked ]; do sleep 0.1; done
    refused 2 'locked by another process' log
    refused 2 'locked by another process' save d
    kill %1
}

DamagedObjectsAreNamedAndNothingIsWritten() {
    write d/f one d/g two
    "$vault" save d >out
    local id
    id=$("$vault" show master: | sed -n 's/^blob \(.*\) f$/\1/p')
    cp vault.db whole.db
    for damage in "UPDATE objects SET packed = CAST('blob 4' || char(0) || 'One' AS BLOB)" 'DELETE FROM objects'; do
        cp whole.db vault.db
        sql "$damage WHERE id = '$id'"
        cp vault.db damaged.db
        refused 1 "(damaged|missing) object $id" log
        refused 1 "(damaged|missing) object $id" save d
        "$vault" verify >out 2>err && fail "verify found nothing"
        matches "$(cat err)" "(damaged|missing) object $id"
        cmp vault.db damaged.db
    done
    cp whole.db vault.db
    dd if=/dev/zero of=vault.db bs=4096 seek=1 count=2 conv=notrunc status=none
    refused 1 'damaged' log
}

AnyDamagedByteIsFoundOrHarmless() {
    local size status noticed=0
    for i in $(seq 12); do write d/sub/"$i" "$(seq $((i * 100)))"; done
    "$vault" save d >out
    cp vault.db whole.db
    size=$(stat -c %s vault.db)
    for _ in $(seq 40); do
        cp whole.db vault.db
        printf '%b' "\\x$(printf %x $((RANDOM % 256)))" |
            dd of=vault.db bs=1 seek=$((RANDOM * RANDOM % size)) conv=notrunc status=none
        status=0
        "$vault" verify >out 2>err || status=$?
        if [ "$status" -eq 0 ]; then
            rm -rf restored && "$vault" restore master restored && diff -r d restored
        else
            [ "$status" -le 2 ] || fail "verify ended with $status"
            noticed=$((noticed + 1))
        fi
    done
    [ "$noticed" -gt 0 ] || fail "no damage was noticed"
}

LinksAndSpecialFilesAreLeftOut() {
    write d/f one outside/secret secret
    ln -s ../outside d/link
    ln -s f d/linked_file
    mkfifo d/pipe
    write d/$'\xff' unreadable
    "$vault" -f d/vault.db save d >out 2>err
    matches "$(cat out)" ' 1 files'
    matches "$(cat err)" 'skipped d/link: .*link' 'd/linked_file: .*link' 'd/pipe: .*special' 'not UTF-8'
    "$vault" -f d/vault.db save d -m again >out 2>err
    matches "$(cat err)" 'skipped d/vault.db: it is the vault'
}

ForcedRestoreStaysInsideItsDirectory() {
    write d/f one d/sub/g two
    "$vault" save d >out
    write outside/g outside target/other other hard hard
    ln -s ../outside target/sub
    ln hard target/f
    "$vault" restore master target --force
    equal "$(cat outside/g hard target/f target/sub/g target/other | xargs)" "outside hard one two other"
    [ ! -L target/sub ] || fail "the link is still there"
    # A name that leads out of the directory, in a vault whose identifiers are right.
    local blob_id tree_id commit_id
    blob_id=$("$vault" show master: | sed -n 's/^blob \(.*\) f$/\1/p')
    printf 'tree 79\000100644 blob ..\000%s' "$blob_id" >tree
    tree_id=$(sha256sum <tree | cut -c 1-64)
    printf 'commit 116\000tree %s\nauthor a <> 0 +0000\ncommitter a <> 0 +0000\n\nm\n' "$tree_id" >commit
    commit_id=$(sha256sum <commit | cut -c 1-64)
    sql "INSERT INTO objects VALUES('$tree_id', readfile('tree')), ('$commit_id', readfile('commit'));
         UPDATE branches SET head = '$commit_id'"
    refused 2 'cannot be restored: \.\.' restore master evil
}

KilledSaves() {
    local kills=${1:-25} hit=0 before=0 after=0 versions=1 start took
    for i in $(seq 300); do head -c 8000 /dev/urandom >d_"$i"; done
    mkdir d && mv d_* d
    start=$(date +%s%N)
    "$vault" save d -m 0 >out
    # How long a save takes, more or less: corrected so that about half of the kills come too late.
    took=$((($(date +%s%N) - start) / 1000))
    for round in $(seq "$kills"); do
        for i in $(seq 150); do echo "$round" >>d/d_"$i"; done
        old=$(root_of master)
        "$vault" save d -m "$round" >out 2>&1 &
        sleep "$(printf '0.%06d' $((RANDOM * RANDOM % (took * 2))))"
        kill -9 $! 2>/dev/null && hit=$((hit + 1))
        wait $! 2>/dev/null || true
        "$vault" verify >out || fail "damaged in round $round"
        if [ "$(root_of master)" = "$old" ]; then
            before=$((before + 1)) took=$((took * 10 / 9))
        else
            after=$((after + 1)) took=$((took * 9 / 10)) versions=$((versions + 1))
            rm -rf restored && "$vault" restore master restored && diff -r d restored
        fi
        equal "$("$vault" log | wc -l)" "$versions"
    done
    echo "$kills kills, $hit of a running save: the state before $before times, after $after times"
    [ "$hit" -gt 0 ] || fail "no kill met a running save"
}

"${@:2}"
