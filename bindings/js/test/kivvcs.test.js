// What a consumer of the package relies on. The expected ids are what tests/golden_repository.py prints.

import assert from "node:assert/strict";
import { readFile } from "node:fs/promises";
import { createRequire } from "node:module";
import { test } from "node:test";
import { countAllocatedBytes, dispose, identify, KivVcsError, load, Repository } from "kivvcs";

assert.throws(() => new Repository(), /await load\(\) first/);
await assert.rejects(load(Uint8Array.of(1, 2, 3)));
await load(await readFile(createRequire(import.meta.url).resolve("kivvcs/kivvcs.wasm")));

const refuses = (action, sentence) =>
    assert.throws(action, (error) => error instanceof KivVcsError && sentence.test(error.message) && /\.$/.test(error.message));

/** A base and a branch "other", which both changed `a`; the current branch also holds `c`, the other `b`. */
function twoSides() {
    const repository = new Repository();
    const base = repository.commit({ files: { a: "base", "d/x": "1" }, description: "base" });
    repository.createBranch("other");
    const mine = repository.commit({ files: { a: "mine", c: "c" } });
    repository.checkout("other");
    const theirs = repository.commit({ files: { a: "theirs", "d/y": "2" } });
    repository.checkout("master");
    return { repository, base, mine, theirs };
}

function goldenRepository() {
    const repository = new Repository();
    const first = repository.commit({
        files: { README: "one\n" },
        author: { name: "Zo\u00eb", email: "zoe@example.org" },
        description: "First",
        time: new Date(1700000000000),
        offsetMinutes: 120,
    });
    const second = repository.commit({
        files: [
            ["src.txt", "one\n"],
            ["src/\u{1f600}", Uint8Array.from({ length: 256 }, (_, byte) => byte)],
            ["src/\ufffd", { id: first.find("README").id }],
            ["README", ""],
            ["src/main.cpp", "int main() {}\n"],
        ],
        author: { name: "Bo" },
        description: "Second\nwith two lines",
        time: -1000,
        offsetMinutes: -330,
    });
    return { repository, first, second };
}

test("ids are those of every other platform", () => {
    const { first, second } = goldenRepository();
    assert.equal(first.id, "24488f154d474f3fda8eb38c5d1c092bf68d1744f98089effed77388d44078d7");
    assert.equal(second.id, "375da041bd867a6db66364e208b1498019a7792abb872f0757a97f929e4758ed");
    assert.equal(second.treeId, "82423a4b57728b405c146a50e1cca65fd47eb3931abb6178db7ce07b84315674");
    assert.equal(second.time.getTime(), -1000);
    assert.deepEqual([...second.history()].map((commit) => commit.author.name), ["Bo", "Zo\u00eb"]);
    assert.deepEqual([...second.history({ limit: 1 })].map((commit) => commit.id), [second.id]);
});

test("files are listed, read and compared", () => {
    const repository = new Repository();
    const before = repository.commit({ files: { gone: "1", "was/directory": "2", was2: "3", same: "\ufeff4" } });
    const after = repository.commit({
        remove: ["gone", "was", "was2"],
        files: { was: "5", "was2/file": "6", "new/deep/file": Uint8Array.of(0, 255) },
    });
    assert.deepEqual(
        after.differences(before).map(({ path, kind }) => `${path}: ${kind}`),
        ["gone: removed", "new/deep/file: added", "was: directory became file", "was/directory: removed",
         "was2: file became directory", "was2/file: added"],
    );
    assert.deepEqual(after.differences(null).map(({ path }) => path), after.paths());
    assert.deepEqual(after.read("new/deep/file"), Uint8Array.of(0, 255));
    assert.equal(after.text("same"), "\ufeff4");
    assert.deepEqual([after.read("new"), after.find("nowhere"), after.list("nowhere")], [null, null, null]);
    assert.deepEqual(after.list("new"), [{ name: "deep", kind: "directory" }]);
    assert.deepEqual([...after.history({ path: "same" })].map(({ id }) => id), [before.id]);
    const moved = repository.commit({ remove: ["same"], files: { "new/same": { id: before.find("same").id } } });
    assert.deepEqual(moved.differences(after, { findRenames: true }), [
        { path: "new/same", kind: "renamed", oldPath: "same", oldId: before.find("same").id, newId: before.find("same").id },
    ]);
    repository.moveBranch("master", after);
    assert.equal(after.parent().id, before.id);
    assert.equal(before.parent(), null);
    assert.equal(repository.commit({ amend: true, description: "Amended" }).parent().id, before.id);
});

test("a merge lists all conflicts, asks its resolvers, and lets their exceptions pass", () => {
    const { repository, base, mine, theirs } = twoSides();
    const { kind, conflicts } = repository.merge(theirs);
    assert.equal(kind, "gave up");
    assert.deepEqual(conflicts, [
        { path: "a", kind: "file", left: mine.find("a").id, root: base.find("a").id, right: theirs.find("a").id,
          leftChange: "changed", rightChange: "changed", settlement: "undecided" },
    ]);
    assert.equal(new TextDecoder().decode(repository.readFile(conflicts[0].right)), "theirs");
    const mistake = new RangeError("a mistake of the page");
    assert.throws(() => repository.merge(theirs, { file() { throw mistake; } }), (error) => error === mistake);
    refuses(() => repository.merge(theirs, { file: () => "both" }), /answers left, right, root, undecided, and not both/);
    assert.equal(repository.head().id, mine.id);
    assert.equal(repository.merge(theirs, { file: () => "right", description: "Settled" }).kind, "merged");
    const merged = repository.head();
    assert.deepEqual([merged.text("a"), merged.text("c"), merged.text("d/y"), merged.description],
                     ["theirs", "c", "2", "Settled"]);
    assert.equal(repository.merge(base).kind, "up to date");
    repository.checkout("other");
    const onto = repository.rebase(mine, theirs);
    assert.deepEqual([onto.parent().id, onto.treeId], [theirs.id, mine.treeId]);
    assert.equal(repository.merge(onto).kind, "forwarded");
    repository.createBranch("empty", base);
    repository.simplify();
    assert.equal(repository.head("other").parent().id, base.id);
});

test("packed forms rebuild a history, and nothing of it if one is missing or damaged", async () => {
    const { repository, second } = goldenRepository();
    const third = repository.commit({ remove: second.paths(), description: "parent \n\ntree " });
    const store = new Map();
    for (const { id, bytes } of repository.missing(third, (id) => store.has(id))) {
        const text = new TextDecoder().decode(bytes);
        for (const [child] of text.matchAll(/[0-9a-f]{64}/g))
            assert.ok(store.has(child), "children come first");
        assert.equal(identify(bytes), id);
        store.set(id, bytes);
    }
    assert.deepEqual([...repository.missing(third)].map(({ id }) => id), [...store.keys()]);
    const copy = new Repository();
    assert.equal((await copy.read(second.id, (id) => store.get(id))).text("src.txt"), "one\n");
    const rest = [];
    assert.equal((await copy.read(third.id, async (id) => (rest.push(id), store.get(id)))).id, third.id);
    assert.equal(rest.length, 2);
    assert.deepEqual([...repository.missing(third, (id) => copy.holds(id))], []);
    for (const id of store.keys()) {
        const repositoryOfNothing = new Repository();
        const damaged = new Map(store).set(id, Uint8Array.from(store.get(id), (byte, at) => (at === 0 ? byte ^ 1 : byte)));
        await assert.rejects(repositoryOfNothing.read(third.id, (wanted) => damaged.get(wanted)), /damaged/);
        damaged.delete(id);
        await assert.rejects(repositoryOfNothing.read(third.id, (wanted) => damaged.get(wanted)), /is missing/);
        assert.deepEqual(repositoryOfNothing.counts(), { commits: 0, directories: 0, files: 0 });
    }
    await assert.rejects(new Repository().read(second.treeId, (id) => store.get(id)), /not one of a commit/);
});

test("mistakes are explained in sentences and change nothing", () => {
    const { repository, mine, theirs } = twoSides();
    const before = repository.counts();
    refuses(() => repository.commit({ files: { "a/b": "1" } }), /"a" is a file; remove it first/);
    refuses(() => repository.commit({ files: { d: "1" } }), /"d" is a directory; remove it first/);
    refuses(() => repository.commit({ files: { "//": "1" } }), /names nothing/);
    refuses(() => repository.commit({ files: { a: 1 } }), /has to be a Uint8Array, a string/);
    refuses(() => repository.commit({ files: { a: { id: "x" } } }), /no file or directory x/);
    refuses(() => repository.commit({ remove: ["nothing"] }), /no "nothing" to remove/);
    refuses(() => repository.commit({ author: { name: "A <a@b>" } }), /cannot contain "<"/);
    refuses(() => repository.commit({ description: "a\0b" }), /U\+0000/);
    refuses(() => repository.checkout("nowhere"), /no branch "nowhere"/);
    refuses(() => repository.createBranch("other"), /already/);
    refuses(() => repository.merge(theirs.id), /has to be a Commit/);
    refuses(() => new Repository().commit({ amend: true }), /no commit to amend/);
    theirs.delete();
    theirs[dispose]();
    refuses(() => theirs.id, /has been deleted/);
    repository.removeBranch("master");
    refuses(() => repository.commit(), /no branch "master"/);
    assert.equal(mine.text("a"), "mine");
    assert.deepEqual(repository.counts().commits, before.commits);
});

test("ten thousand cycles leave nothing behind", async () => {
    const cycle = (free) => {
        const { repository, base, mine, theirs } = twoSides();
        const handles = [repository, base, mine, theirs, ...theirs.history({ limit: 1 }), repository.rebase(mine, theirs)];
        assert.throws(() => repository.merge(theirs, { file() { throw new Error(); } }));
        repository.merge(theirs, { file: () => "left" });
        theirs.differences(base);
        repository.simplify();
        if (free)
            handles.forEach((handle) => handle.delete());
    };
    for (let warmingUp = 0; warmingUp < 100; ++warmingUp)
        cycle(true);
    const before = countAllocatedBytes();
    for (let count = 0; count < 10_000; ++count)
        cycle(true);
    assert.equal(countAllocatedBytes(), before);

    for (let count = 0; count < 1000; ++count)
        cycle(false);
    assert.ok(countAllocatedBytes() > before + 1_000_000);
    for (let turns = 0; turns < 100 && countAllocatedBytes() > before + 100_000; ++turns) {
        globalThis.gc();
        await new Promise((resolve) => setTimeout(resolve, 10));
    }
    assert.ok(countAllocatedBytes() <= before + 100_000, "what is forgotten is freed");
});
