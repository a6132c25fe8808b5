#!/bin/bash
# usage: tests/vault_history_test.sh VAULT CASE [NUMBER [SEED]]
# Runs one of the cases below, on histories, on the program VAULT. Each case is a function; the trials take the number of
# kills, or of pairs of trees, and where these begin (a number, or "random").

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
    local before
    before=$("$vault" branch)
    ends 1 'nothing was changed' merge side
    equal "$(sed -n 's/^conflict \([^:]*\):.*undecided/\1/p' out | sort -u | xargs)" "added both gone kind turned"
    equal "$("$vault" branch)" "$before"
    ends 1 'nothing was changed' merge side --json
    equal "$(python3 -c 'import json; a = json.load(open("out")); print(a["result"], *sorted({c["path"] + ":" + c["taken"] for c in a["conflicts"]}))')" \
        'stopped added:undecided both:undecided gone:undecided kind:undecided turned:undecided'
    local -A expected=(
        [left]='added:ours both:ours gone:ours kind:ours left:ours right:theirs turned:ours'
        [right]='added:theirs both:theirs kind/of:theirs left:ours right:theirs turned/into:theirs'
        [base]='both:base gone:base kind:base left:ours right:theirs turned/into:base')
    expected[newest]=${expected[right]}
    "$vault" checkout side && touch d/both && sleep 1 && write d/later x && "$vault" save d >out && rm d/later &&
        "$vault" save d -m later >out && "$vault" checkout master
    for policy in left right base newest; do
        cp vault.db "$policy.db"
        matches "$("$vault" -f "$policy.db" merge side --on-conflict "$policy")" '^conflict both: left changed it, right changed it' \
            '^conflict gone: left changed it, right removed it' '^conflict kind'
        "$vault" -f "$policy.db" restore master "$policy"
        equal "$(files "$policy")" "${expected[$policy]}"
        "$vault" -f "$policy.db" verify >out
        matches "$("$vault" -f "$policy.db" merge side)" '^nothing to merge'
    done
    matches "$("$vault" -f left.db log | head -n 1)" 'Ann Example <ann@example.org>  Merge side'
    # Settled by hand.
    ends 1 '' merge side --into merged
    matches "$(cat out)" '5 conflicts to settle in merged'
    matches "$(cat merged/both)" '<<<<<<< current' '^theirs'
    write merged/both both && rm -r merged/*~theirs && "$vault" save merged --merge side >out
    equal "$("$vault" show master:both)" both
    matches "$("$vault" merge side)" '^nothing to merge'
}

MergesKeepAttributesAndLines() {
    seq 20 >lines && mkdir d && cp lines d/text && write d/run x d/plain x d/dir/f x
    "$vault" save d >out && "$vault" branch side
    sed -i 's/^3$/three/' d/text && chmod 700 d/run && ln -s plain d/link && write d/dir/f ours
    "$vault" save d >out && "$vault" restore side e && "$vault" checkout side
    sed -i 's/^17$/seventeen/' e/text && write e/run theirs && chmod 600 e/plain && chmod 711 e/dir && mkfifo e/pipe
    mkdir e/empty && "$vault" save e >out 2>err && "$vault" checkout master
    matches "$("$vault" merge side --json)" '"result":"merged"' '"path":"text".*"taken":"combined"'
    "$vault" restore master merged
    equal "$(xargs <merged/text)" "$(sed 's/^3$/three/; s/^17$/seventeen/' lines | xargs)"
    equal "$(cd merged && stat -c '%n:%a' run plain dir empty | xargs) $(readlink merged/link)" \
        "run:700 plain:600 dir:711 empty:755 plain"
    equal "$(cat merged/run merged/dir/f | xargs) $(stat -c %Y merged/run)" "theirs ours $(stat -c %Y e/run)"
    matches "$("$vault" save merged)" '^nothing has changed'
}

# Two who exchange in turns, many times: nothing that one had seen is lost or comes back, and both end alike.
ExchangesLoseNothing() {
    write a/f0 start && "$vault" -f a.db save a >out
    "$vault" -f b.db sync a.db >out && "$vault" -f b.db merge other/master >out
    local me you
    for round in $(seq 8); do
        for me in a b; do
            you=$([ $me = a ] && echo b || echo a)
            rm -rf "$me" && "$vault" -f "$me".db restore master "$me"
            write "$me/f$round$me" "$round" && rm -f "$me/f$((round - 2))$you"
            "$vault" -f "$me".db save "$me" -m "$me$round" >out
            [ $((round % 3)) -ne 0 ] || "$vault" -f "$me".db compact --yes >out
        done
        for me in a b a; do
            you=$([ $me = a ] && echo b || echo a)
            "$vault" -f "$me".db sync "$you".db --yes >out 2>err
            "$vault" -f "$me".db merge other/master >out || fail "round $round: $(cat out)"
        done
        equal "$(root_of master -f a.db)" "$(root_of master -f b.db)"
    done
    rm -rf a && "$vault" -f a.db restore master a
    equal "$(cd a && echo *)" "f0 f7a f7b f8a f8b"
    matches "$("$vault" -f b.db sync a.db --yes)" '^0 objects'
    "$vault" -f a.db verify >out && "$vault" -f b.db verify >out
}

HistoriesAreRewrittenAndShrink() {
    diverge
    write d/b5 5 && "$vault" save d >out
    local root
    root=$(root_of master)
    matches "$("$vault" rebase side master)" '^side is now'
    equal "$("$vault" log side | wc -l) $(root_of master)" "4 $root"
    matches "$("$vault" forget master --dry-run)" '^2 versions would'
    "$vault" forget "$("$vault" log master | head -n 1 | cut -c 1-64)" --yes >out 2>&1
    equal "$("$vault" log side | wc -l) $("$vault" log master | wc -l)" "2 1"
    head -c 300000 /dev/urandom >d/large
    "$vault" save d >out
    rm d/large && "$vault" save d -m smaller >out
    write d/last 1 && "$vault" save d -m last >out
    matches "$("$vault" compact --yes)" '^(29|3[0-9])[0-9]{4} bytes reclaimed'
    equal "$("$vault" log | wc -l) $("$vault" log side | wc -l)" "2 2"
    matches "$("$vault" graph)" 'digraph' '"branch side" -> ' 'last'
    matches "$("$vault" graph --text)" '^\* [0-9a-f]{12} \(master\*\).*last' '^\|? ?\* .*\(side\)'
    "$vault" verify >out
    # A branch in the middle of what is forgotten stays.
    rm vault.db* && "$vault" save d -m first >out && "$vault" branch kept
    for version in second third; do write d/f "$version" && "$vault" save d -m "$version" >out; done
    "$vault" forget "$("$vault" log | sed -n '2s/ .*//p')" --yes >out 2>&1
    equal "$("$vault" log | sed 's/.*  //' | xargs)" "third second first"
    equal "$("$vault" log kept | sed 's/.*  //' | xargs)" "first"
    "$vault" verify >out
}

TwoVaultsComeTogether() {
    write d/f one e/g two
    "$vault" -f a.db save d -m a >out
    "$vault" -f b.db save e -m b >out
    matches "$("$vault" -f a.db sync b.db)" '^other/master ' '^4 objects'
    matches "$("$vault" -f a.db sync b.db)" '^0 objects'
    "$vault" -f a.db join master other/master root >out
    matches "$("$vault" -f a.db show root)" 'message Root commit'
    "$vault" -f a.db merge other/master --on-conflict left >out
    "$vault" -f b.db sync a.db >out
    "$vault" -f b.db merge other/master --on-conflict right >out
    equal "$("$vault" -f b.db show master:f) $("$vault" -f b.db show master:g)" "one two"
    # What was forgotten does not come back unasked.
    write d/f three && "$vault" -f a.db save d -m new >out && "$vault" -f a.db forget master --yes >out 2>&1
    refused 'with itself' -f a.db sync ./a.db
    ends 2 'forgotten here' -f a.db sync b.db
    "$vault" -f a.db verify >out
    "$vault" -f b.db verify >out
}

# Kills each command that writes at random moments: the state is the one before or the one after, and all is whole.
KilledCommands() {
    local kills=${1:-10} took hit
    write d/text start && "$vault" save d >out
    for i in $(seq 200); do head -c 6000 /dev/urandom >"d/$i"; done
    "$vault" save d >out && cp vault.db other.db && "$vault" branch side
    for command in save merge sync compact restore; do
        hit=0 took=30000
        for round in $(seq "$kills"); do
            case $command in
            save) for i in $(seq 100); do echo "$round" >>"d/$i"; done && set -- save d ;;
            merge)
                "$vault" checkout side && rm -rf e && "$vault" restore side e && write "e/m$round" "$round" && "$vault" save e >out
                "$vault" checkout master && write "d/n$round" "$round" && "$vault" save d >out && set -- merge side ;;
            sync) rm -rf e && "$vault" -f other.db restore master e && for i in $(seq 50); do head -c 9000 /dev/urandom >"e/s$i"; done
                "$vault" -f other.db save e >out && set -- sync other.db --yes ;;
            compact) write "d/c$round" 1 && "$vault" save d >out && rm "d/c$round" && "$vault" save d >out && set -- compact --yes ;;
            restore) rm -rf target* && set -- restore master target ;;
            esac
            "$vault" "$@" >out 2>&1 &
            sleep "$(printf '0.%06d' $((RANDOM * 32768 % (took * 2) + 1)))"
            kill -9 $! 2>/dev/null && hit=$((hit + 1)) && took=$((took * 11 / 10)) || took=$((took * 9 / 10))
            wait $! 2>/dev/null || true
            "$vault" verify >out || fail "damaged by $command in round $round: $(cat out)"
            [ "$command" != restore ] || [ ! -e target ] || { "$vault" restore master whole && same target whole && rm -r whole; }
            "$vault" "$@" >out 2>&1 || [ "$command" = restore ] || fail "$command afterwards: $(cat out)"
        done
        echo "$command: $kills kills, $hit of a running command"
        rm -rf restored && "$vault" restore master restored
    done
}

RandomTreesMerge() { python3 "$here/vault_merges.py" "$vault" "${1:-20}" "${2:-1}"; }

"${@:2}"
