#!/bin/bash
# usage: tests/vault_test.sh VAULT CASE
# Runs one of the cases below, on saving and restoring, on the program VAULT. Each case is a function.

. "$(dirname "$0")/vault_testing.sh"

# The identifier that a directory has by examples/vault/README.md, computed by another program.
root_by_hand() {
    python3 - "$1" <<'EOF'
import hashlib, os, stat, sys
def identify(kind, data):
    return hashlib.sha256(b"%s %d\0%s" % (kind, len(data), data)).hexdigest()
def line(status, name):
    return b"%o%s %d %s\0" % (status.st_mode & 0o7777, b"l" if stat.S_ISLNK(status.st_mode) else b"", status.st_mtime_ns, name)
def stored(name):
    return name.decode(errors="surrogateescape").encode(errors="surrogatepass")
def tree(path):
    entries, lines = [], [line(os.lstat(path), b"")]
    for name in sorted(os.listdir(path), key=lambda n: stored(n).decode(errors="surrogatepass").encode("utf-16-be", "surrogatepass")):
        inner, status = os.path.join(path, name), os.lstat(os.path.join(path, name))
        if stat.S_ISDIR(status.st_mode):
            entries.append((stored(name), b"40000 tree ", tree(inner)))
            continue
        content = os.readlink(inner) if stat.S_ISLNK(status.st_mode) else open(inner, "rb").read()
        entries.append((stored(name), b"100644 blob ", identify(b"blob", content)))
        lines.append(line(status, stored(name)))
    entries.append((b"\xed\xb0\x80", b"100644 blob ", identify(b"blob", b"".join(lines))))
    entries.sort(key=lambda e: e[0].decode(errors="surrogatepass").encode("utf-16-be", "surrogatepass"))
    return identify(b"tree", b"".join(mode + name + b"\0" + id.encode() for name, mode, id in entries))
print(tree(os.fsencode(sys.argv[1])))
EOF
}

SavesAndRestoresWhatADirectoryHolds() {
    write d/a.txt hello d/copy hello d/dir/deep.txt deep d/$'\xff\xe4' bytes d/$'\xed\xb2\x80' escaped d/.vault-stamp mine
    mkdir d/nothing d/closed
    touch $'d/dir/ä😀\n' d/$'\xef\xbf\xbd'
    ln -s ../outside d/link && ln -s nowhere d/dir/dangling
    head -c 3000000 /dev/urandom >d/large
    chmod 7751 d/copy && chmod 400 d/a.txt && chmod 2500 d/closed && touch -h -d 1969-07-20T20:17:40.123456789 d/link d/a.txt
    mkfifo d/pipe
    ends 0 '1 devices, sockets or pipes' -f d/vault.db save d -m 'parent of all'
    matches "$(cat out)" ' 11 files'
    rm d/pipe && mv d/vault.db . && ! ls d/vault.db* 2>err || fail "the database left files behind"
    equal "$(stat -c %a vault.db)" 600
    "$vault" restore master restored/here --special-modes
    touch -r restored/here d && same d restored/here
    "$vault" restore master:dir restored/part && same d/dir restored/part
    touch d/copy d/dir && sleep 0.1
    matches "$("$vault" save d -m again)" '^nothing has changed'
    "$vault" restore master other && equal "$(stat -c %a other/copy)" 751
    write d/a.txt changed d/new/b b && rm d/copy && rmdir d/nothing && chmod +x d/dir/deep.txt
    equal "$("$vault" status d | sed 's/  */ /' | xargs)" "changed a.txt removed copy mode dir/deep.txt added new/b removed nothing/"
    "$vault" save d -m third --author 'Bob <>' >out
    equal "$(root_of master)" "$(root_by_hand d)"
    equal "$("$vault" log | sed -E 's/^[0-9a-f]{64}  [-0-9]{10}T[0-9:]{8}//')" "+05:45  Bob <>  third
+05:45  Ann Example <ann@example.org>  parent of all"
    # A mode alone is a change, too.
    equal "$("$vault" log a.txt | wc -l) $("$vault" log master:dir/deep.txt --json | grep -c '"id"')" "2 2"
    write d/a.txt 'changed again'
    matches "$("$vault" diff master d a.txt --text)" '^-changed' '^\+changed again'
    equal "$("$vault" diff d)" 'changed a.txt'
    "$vault" verify >out
    rm -r d && mkdir d
    "$vault" save d -m emptied >out
    "$vault" restore master empty
    equal "$(find empty)" empty
}

NothingIsLeftOutUnnamed() {
    chmod 777 .
    write d/f one d/g two d/sub/h three d/x.o 1
    "$vault" save d >out
    write d/x.o 2 d/y.o 3 d/.vaultignore '*.o'
    matches "$("$vault" status d)" '^added *.vaultignore' '^changed *x.o'
    "$vault" save d >out
    equal "$("$vault" show master: | grep -c '\.o$')" 1
    "$vault" save d --yes >out 2>&1 && equal "$("$vault" show master: | grep -c '\.o$')" 0
    # What cannot be read stays as it was.
    local user=()
    [ "$(id -u)" -ne 0 ] || { user=(setpriv --reuid=65534 --regid=65534 --clear-groups) && chown -R 65534 d vault.db; }
    write d/f later d/new secret && chmod 0 d/f d/new d/sub
    "${user[@]}" "$vault" save d --strict >out 2>&1 && fail "--strict saved"
    "${user[@]}" "$vault" save d >out 2>err && fail "status 0 although something could not be read"
    matches "$(cat err)" ' f: ' ' new: ' ' sub: '
    equal "$("$vault" show master:f) $("$vault" show master:sub/h) $("$vault" show master: | grep -c new)" "one three 0" || true
    # A file that is written all the time is never half one and half the other.
    rm -rf d vault.db* && mkdir d
    (while :; do
        head -c 400000 /dev/zero | tr '\0' a >d/f
        head -c 500000 /dev/zero | tr '\0' b >d/f
    done) &
    local writer=$!
    for _ in $(seq 10); do
        "$vault" save d >out 2>&1 || true
        [ ! -e vault.db ] || "$vault" show master:f 2>/dev/null | tr -s ab >seen || true
        [ ! -s seen ] || grep -qxE 'a|b' seen || fail "a torn file: $(head -c 10 seen)"
    done
    kill "$writer"
}

BadInputGetsOneLineAndChangesNothing() {
    refused 'no vault vault.db' log
    refused 'not a directory' save missing
    write d/f one
    refused "must be given as 'Name <mail>'" save d --author 'A <b'
    [ ! -e vault.db ] || fail "a refused save left a vault"
    for i in $(seq 17); do write d/f "$i" && "$vault" save d -m "$i" >out; done
    refused 'one line' save d -m $'two\nlines'
    refused 'not UTF-8' save d -m $'\xff'
    refused 'no such revision' show nowhere
    refused 'no such revision' show "$("$vault" log | head -c 3)"
    refused 'no such file' show master:g
    refused 'already' branch master
    refused 'neither' branch a:b
    refused 'is not empty' restore master d
    refused "no command 'stats'; did you mean 'status'" stats
    ends 2 'say --yes' forget master
    refused 'is not a|not one' -f d/f log
    equal "$("$vault" log | wc -l)" 17
    equal "$("$vault" log | head -n 1 | wc -l)" 1
    ends 3 '' log -n 2
    equal "$(wc -l <out)" 2
    ends 3 '' log master~14 -2
    equal "$(sed 's/.*  //' out | xargs) $("$vault" show "$("$vault" log | head -c 9)~:f")" "3 2 16"
    equal "$("$vault" diff master~16 ~1 f --text | grep '^[-+][0-9]' | xargs)" "-1 +16"
    equal "$("$vault" diff master~16 --text | grep '^[-+][0-9]' | xargs)" "-1 +17"
    refused 'only 16 versions before' show master~17
    refused 'only 16 versions before' show "$(printf 'master%020000d' 0 | tr 0 '~')"
    refused 'no such revision' show nowhere~1
    "$vault" show master:f >/dev/full 2>err && fail "a full disk went unnoticed"
    matches "$(cat err)" 'output could not be written'
    matches "$("$vault" --help)" 'vault save' 'Exit status' 'nothing is encrypted'
}

DamageIsLocalAndRepaired() {
    write d/f one d/g two
    head -c 2000000 /dev/urandom >d/large
    "$vault" save d >out
    head -c 2000000 /dev/urandom >d/other && "$vault" save d >out
    sqlite3 vault.db 'UPDATE segments SET form = zeroblob(length(form))
        WHERE number = (SELECT max(number) FROM segments WHERE length(form) > 500000)'
    ends 1 'damaged|missing' verify
    "$vault" log >out
    ends 1 'not restored: other' restore master partial
    equal "$(cat partial/f) $(cd partial && echo *)" "one f g large"
    ends 2 'locked|not a vault|no vault' -f vault.db repair missing.db
    "$vault" -f twin.db save d >out
    "$vault" repair twin.db >out
    "$vault" verify >out
    # What cannot even be opened.
    dd if=/dev/zero of=vault.db bs=1 seek=40 count=60 conv=notrunc 2>err
    ends 2 '' log
    refused 'is there already' salvage twin.db
    # The damaged piece from above is still in it.
    ends 1 '' -f saved.db salvage vault.db
    "$vault" -f saved.db verify >out
    "$vault" -f saved.db restore master whole && same d whole
}

# Where 2 MiB are left, which what is to go would fill several times if it were all marked, logged or moved at once.
CollectsWithLittleRoom() {
    local free
    mkdir small
    mount -t tmpfs -o size=40m none small 2>err || { echo "Skipped, for no file system can be mounted here: $(cat err)" && exit 77; }
    export VAULT_FILE=small/vault.db
    write d/kept kept
    "$vault" save d >out && "$vault" branch side && "$vault" checkout side
    head -c 12000000 /dev/urandom | split -a 5 -b 1000 - d/small && head -c 3000000 /dev/urandom >d/large
    "$vault" save d >out && "$vault" checkout master && "$vault" branch --delete side
    free=$(df --output=avail -B1 small | tail -n 1)
    head -c $((free - 2 * 1024 * 1024)) /dev/zero >small/full
    matches "$("$vault" collect --days 0 --yes)" '^12[0-9]{3} objects removed, 0 more wait'
    [ "$(df --output=avail -B1 small | tail -n 1)" -gt 16000000 ] || fail "no room was given back: $(ls -l small)"
    [ "$(stat -c %s small/vault.db)" -lt 100000 ] || fail "the file is still large: $(ls -l small)"
    matches "$("$vault" verify)" '^verified 4 objects'
    equal "$("$vault" show master:kept)" kept
}

# 1,024 files, in ten levels that hold the next one twice.
RepeatedDirectoriesAreListedOnce() {
    local e
    write d/f x
    for _ in $(seq 10); do mkdir e && cp -a d e/a && cp -a d e/b && rm -r d && mv e d; done
    "$vault" save d >out
    # A directory is meant also where its name begins an identifier.
    e=$("$vault" log | head -c 4) && mkdir "$e" && "$vault" diff master "$e" >out
    equal "$(wc -l <out) $(grep -c 'as in' out)" "11 10"
    equal "$("$vault" diff master "$e" a/a | wc -l)" 9
}

OldVaultsAreBroughtUpToDate() {
    local blob tree commit
    put() { # put KIND FILE: stores the data of a file as an object, and names it
        { printf '%s %s\0' "$1" "$(stat -c %s "$2")" && cat "$2"; } >packed
        sha256sum <packed | cut -c 1-64
        sqlite3 old.db "INSERT INTO objects VALUES('$(sha256sum <packed | cut -c 1-64)', readfile('packed'))"
    }
    sqlite3 old.db 'CREATE TABLE objects(id TEXT PRIMARY KEY, packed BLOB NOT NULL);
        CREATE TABLE branches(name TEXT PRIMARY KEY, head TEXT NOT NULL) WITHOUT ROWID;
        CREATE TABLE settings(name TEXT PRIMARY KEY, value TEXT NOT NULL) WITHOUT ROWID;
        PRAGMA application_id = 0x4B564C54; PRAGMA user_version = 1'
    printf hello >content && blob=$(put blob content)
    printf '100644 blob ..\0%s100644 blob f\0%s40000 tree none\0%s' "$blob" "$blob" "$(put tree /dev/null)" >data && tree=$(put tree data)
    printf 'tree %s\nauthor a <> 0 +0000\ncommitter a <> 0 +0000\n\nparent of\n' "$tree" >data && commit=$(put commit data)
    sqlite3 old.db "INSERT INTO branches VALUES('side', '$commit'); INSERT INTO settings VALUES('branch', 'side')"
    equal "$("$vault" -f old.db log | cut -c 1-64) $("$vault" -f old.db branch)" "$commit * side  $commit"
    ends 1 'cannot be restored: \.\.' -f old.db restore side d
    equal "$(files d) $(cd d && echo *)" "f:hello f none"
    write e/f mine && "$vault" save e >out
    refused "$commit.*\"\.\.\"" sync old.db
    equal "$("$vault" branch | wc -l)" 1
    "$vault" -f old.db save d >out && "$vault" -f old.db verify >out
}

ForcedRestoreStaysInsideItsDirectory() {
    write d/f one d/sub/g two
    "$vault" save d >out
    write outside/g outside target/other other hard hard target/.vault-restoring-1-1 torn
    ln -s ../outside target/sub
    ln hard target/f
    "$vault" restore master target --force
    equal "$(cat outside/g hard target/f target/sub/g target/other | xargs)" "outside hard one two other"
    [ ! -L target/sub ] && [ ! -e target/.vault-restoring-1-1 ] || fail "something is still there"
    rm target/f && write target/f/in/the/way x
    ends 1 'not restored: f' restore master target --force
    "$vault" restore master target --force --delete
    same d target
}

ManySaveAtOnce() {
    for i in $(seq 8); do write "d$i/f" "$i"; done
    "$vault" save d1 >out
    for i in $(seq 2 8); do "$vault" save "d$i" -m "$i" >"out$i" 2>&1 & done
    wait
    equal "$("$vault" log | wc -l)" 8
    "$vault" verify >out
    # Who waits says for whom; who only reads does not wait.
    (echo 'BEGIN IMMEDIATE;' && while [ -e d2 ]; do sleep 0.05; done) | sqlite3 vault.db &
    until ! sqlite3 vault.db 'BEGIN IMMEDIATE; ROLLBACK' 2>err; do sleep 0.05; done
    ends 2 "^vault: waiting, at most 1 s, for process $(pgrep -P $$ -x sqlite3), which is writing to .*/vault.db" --wait 1 save d1
    matches "$(cat err)" 'in use by somebody else'
    ends 0 '^$' log
    rm -r d2 && wait
}

NestingHasAnEnd() {
    write d/f x
    "$vault" save d >out
    python3 -c 'import os; os.chdir("d"); [(os.mkdir("n" * 255), os.chdir("n" * 255)) for _ in range(300)]'
    refused 'nested too deep, nothing was saved: n' save d
    equal "$("$vault" log | wc -l)" 1
    # What is nested as deep as can be is restored alike.
    python3 -c 'import os; os.chdir("d"); [os.chdir("n" * 255) for _ in range(255)]; os.rename("n" * 255, "'"$work"'/rest")'
    "$vault" save d >out && "$vault" restore master restored
    equal "$("$vault" status restored)" ''
}

"${@:2}"
