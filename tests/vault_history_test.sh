#!/bin/bash
# usage: tests/vault_history_test.sh VAULT CASE
# Runs one of the cases below on the program VAULT. Each case is a function.

. "$(dirname "$0")/vault_testing.sh"

# Two branches that changed the same things: a file, a removal, an addition, and a file on one side that is a directory on
# the other.
diverge() {
    write d/both base d/gone base d/left base d/right base d/kind base d/turned/into base
    "$vault" save d -m base >out
    "$vault" branch side
    write d/both ours d/left ours d/added ours d/gone ours d/kind ours
    rm -r d/turned && write d/turned ours
    "$vault" save d -m ours >out
    "$vault" checkout side
    rm -r d && write d/both theirs d/left base d/right theirs d/added theirs d/kind/of theirs d/turned/into theirs
    "$vault" save d -m theirs >out
    "$vault" checkout master
}

MergesAskThePolicyAboutEveryConflict() {
    diverge
    cp vault.db diverged.db
    refused 1 'nothing was changed' merge side
    equal "$(sed 's/^conflict //' out | xargs)" "added both gone kind turned turned/into"
    cmp vault.db diverged.db
    local -A expected=(
        [left]='added:ours both:ours gone:ours kind:ours left:ours right:theirs turned:ours'
        [right]='added:theirs both:theirs kind/of:theirs left:ours right:theirs turned/into:theirs'
        [base]='both:base gone:base kind:base left:ours right:theirs turned/into:base')
    expected[newest]=${expected[right]}
    for policy in left right base newest; do
        cp diverged.db vault.db
        # Without stamps the branch that was saved last wins: side, if the clock has moved on.
        if [ "$policy" = newest ]; then
            sleep 1
            "$vault" checkout side && "$vault" save d -m later >out && "$vault" checkout master
        fi
        matches "$("$vault" merge side --on-conflict "$policy")" '^conflict both: ' '^conflict gone: ' \
            '^conflict kind: '
        "$vault" restore master "$policy"
        equal "$(cd "$policy" && find . -type f -printf '%P\n' | sort | while read -r f; do echo "$f:$(cat "$f")"; done |
            xargs)" "${expected[$policy]}"
        "$vault" verify >out
    done
    matches "$("$vault" log | head -n 1)" 'Ann Example <ann@example.org>  Merge side'
    # The stamps say who was later, whatever the heads' times say.
    rm -r d vault.db && write d/x/f base
    "$vault" save d >out
    "$vault" branch side
    write d/x/f ours d/x/.vault-stamp 2000
    "$vault" save d >out
    "$vault" checkout side
    write d/x/f theirs d/x/.vault-stamp 1000
    "$vault" save d >out
    "$vault" checkout master
    equal "$("$vault" merge side --on-conflict newest | head -n -1)" "conflict x/f: left"
    equal "$("$vault" show master:x/f) $("$vault" show master:x/.vault-stamp)" "ours 2000"
    write d/x/f later
    "$vault" save d --stamp >out
    [ "$("$vault" show master:x/.vault-stamp)" -gt 2000 ] || fail "the directory was not stamped"
    "$vault" save d -m unchanged --stamp | grep -q ' 1 new objects'
}

HistoriesAreRewrittenAndShrink() {
    diverge
    write d/b5 5 && "$vault" save d >out
    local root
    root=$(root_of master)
    matches "$("$vault" rebase side master)" '^side is now'
    equal "$("$vault" log side | wc -l) $(root_of master)" "4 $root"
    "$vault" forget "$("$vault" log master | head -n 1 | cut -c 1-64)"
    equal "$("$vault" log side | wc -l) $("$vault" log master | wc -l)" "2 1"
    head -c 300000 /dev/urandom >d/large
    "$vault" save d >out
    rm d/large
    "$vault" save d >out
    "$vault" save d -m last >out
    matches "$("$vault" compact)" '^3[0-9]{5} bytes reclaimed'
    equal "$("$vault" log | wc -l) $("$vault" log side | wc -l)" "2 2"
    matches "$("$vault" graph)" 'digraph' '"branch side" -> ' 'last'
    "$vault" verify >out
    # A version that is the same without what was forgotten stays.
    rm vault.db && "$vault" save d -m first >out && "$vault" branch kept
    for version in second third; do write d/f "$version" && "$vault" save d -m "$version" >out; done
    "$vault" forget "$("$vault" log | sed -n '2s/ .*//p')"
    equal "$("$vault" log | sed 's/.*  //' | xargs)" "third second first"
    "$vault" verify >out
}

TwoVaultsComeTogether() {
    write d/f one e/g two
    "$vault" -f a.db save d -m a >out
    "$vault" -f b.db save e -m b >out
    matches "$("$vault" -f a.db sync b.db)" '^other/master ' '^3 objects'
    matches "$("$vault" -f a.db sync b.db)" '^0 objects'
    "$vault" -f a.db join master other/master root >out
    matches "$("$vault" -f a.db show root)" 'message Root commit'
    "$vault" -f a.db merge other/master >out
    "$vault" -f b.db sync a.db >out
    "$vault" -f b.db merge other/master >out
    equal "$(root_of master -f a.db)" "$(root_of master -f b.db)"
    equal "$("$vault" -f b.db show master:f) $("$vault" -f b.db show master:g)" "one two"
    refused 2 'with itself' -f a.db sync ./a.db
    "$vault" -f a.db verify >out
    "$vault" -f b.db verify >out
}

"${@:2}"
