// The face of the module: what kivvcs.d.ts declares, on top of the raw operations of bindings.cpp. The build puts this text
// behind what emscripten generates, which is the function `instantiate`.

/* global instantiate */

let core = null;
let loading = null;

export class KivVcsError extends Error {
    name = "KivVcsError";
}

/** The key of the method that frees an object: `Symbol.dispose` where the platform has it. */
export const dispose = Symbol.dispose ?? Symbol("Symbol.dispose");

export function load(source) {
    loading ??= start(source ?? new URL("kivvcs.wasm", import.meta.url)).catch((error) => {
        loading = null;
        throw error;
    });
    return loading;
}

async function start(source) {
    const wasmBinary = await readModule(source);
    const abort = (reason) => {
        throw new KivVcsError(`kivvcs.wasm cannot be used: ${reason}`);
    };
    core = await instantiate({ wasmBinary, onAbort: abort, print() {}, printErr() {} });
    for (const raw of [core.Repository, core.Commit, core.Draft, core.Walk])
        explainFailuresOf(raw.prototype);
}

async function readModule(source) {
    if (source instanceof ArrayBuffer || ArrayBuffer.isView(source))
        return source;
    const url = new URL(source, import.meta.url);
    if (url.protocol === "file:") {
        const { readFile } = await import(/* webpackIgnore: true */ /* @vite-ignore */ "node:fs/promises");
        return readFile(url);
    }
    const response = await fetch(url);
    if (!response.ok)
        throw new KivVcsError(`${url} cannot be loaded: ${response.status} ${response.statusText}`);
    return response.arrayBuffer();
}

/** The only C++ exceptions that come out of the library are those of memory; those of the page's own functions stay. */
function explainFailuresOf(prototype) {
    for (const name of Object.getOwnPropertyNames(prototype)) {
        const operation = prototype[name];
        if (name === "constructor" || typeof operation !== "function")
            continue;
        prototype[name] = function (...operands) {
            try {
                return operation.apply(this, operands);
            } catch (error) {
                if (error instanceof WebAssembly.Exception)
                    throw new KivVcsError("There is not enough memory.", { cause: error });
                throw error;
            }
        };
    }
}

const unreachable = new FinalizationRegistry((raw) => raw.delete());
const rawOf = Symbol("raw");

/** An object of the module's memory, which ends with `delete`, or some time after nothing refers to it any more. */
class Handle {
    #raw;

    constructor(raw) {
        this.#raw = raw;
        unreachable.register(this, raw, this);
    }

    get [rawOf]() {
        if (this.#raw === null)
            throw new KivVcsError(`This ${this.constructor.name} has been deleted.`);
        return this.#raw;
    }

    get isDeleted() {
        return this.#raw === null;
    }

    delete() {
        if (this.#raw === null)
            return;
        unreachable.unregister(this);
        this.#raw.delete();
        this.#raw = null;
    }

    [dispose]() {
        this.delete();
    }
}

/** Runs `use` on raw objects, which may be null, and frees them. */
function using(raws, use) {
    try {
        return use(...raws);
    } finally {
        for (const raw of raws)
            raw?.delete();
    }
}

const wrap = (raw) => (raw === null ? null : new Commit(raw));

function rawCommit(commit, what) {
    if (!(commit instanceof Commit))
        throw new KivVcsError(`${what} has to be a Commit.`);
    return commit[rawOf];
}

function checkText(text, what) {
    if (typeof text !== "string")
        throw new KivVcsError(`${what} has to be a string.`);
    if (text.includes("\0"))
        throw new KivVcsError(`${what} cannot contain U+0000.`);
    return text;
}

function checkSignature(text, what) {
    if (/[<>\n\r]/.test(checkText(text, what)))
        throw new KivVcsError(`${what} cannot contain "<", ">" or a line break.`);
    return text;
}

function checkPath(path) {
    if (checkText(path, "A path").split("/").every((name) => name === ""))
        throw new KivVcsError(`The path ${JSON.stringify(path)} names nothing.`);
    return path;
}

const encoder = new TextEncoder();

function toBytes(content, path) {
    if (typeof content === "string")
        return encoder.encode(content);
    if (content instanceof Uint8Array)
        return content;
    throw new KivVcsError(`The content of "${path}" has to be a Uint8Array, a string, or an object with the id of one.`);
}

const entriesOf = (files) =>
    typeof files?.[Symbol.iterator] === "function" ? files : Object.entries(files);

const toEntry = (raw) => raw && { id: raw.id, kind: raw.isDirectory ? "directory" : "file" };

export class Commit extends Handle {
    get id() {
        return this[rawOf].id();
    }
    get author() {
        return { name: this[rawOf].authorName(), email: this[rawOf].authorEmail() };
    }
    get description() {
        return this[rawOf].description();
    }
    get time() {
        return new Date(this[rawOf].seconds() * 1000);
    }
    get offsetMinutes() {
        return this[rawOf].offsetMinutes();
    }
    get treeId() {
        return this[rawOf].treeId() || null;
    }

    parent() {
        return wrap(this[rawOf].parent());
    }

    *history({ limit = Infinity, path = null } = {}) {
        const walk = core.walkHistory(this[rawOf], path === null ? null : checkText(path, "A path"));
        try {
            for (let count = 0; count < limit; ++count) {
                const raw = walk.next();
                if (raw === null)
                    return;
                yield new Commit(raw);
            }
        } finally {
            walk.delete();
        }
    }

    paths() {
        return this[rawOf].paths();
    }

    find(path) {
        return toEntry(this[rawOf].find(checkText(path, "A path")));
    }

    read(path) {
        return this[rawOf].read(checkText(path, "A path"));
    }

    text(path) {
        const bytes = this.read(path);
        return bytes && new TextDecoder("utf-8", { ignoreBOM: true }).decode(bytes);
    }

    list(directory = "") {
        const names = this[rawOf].list(checkText(directory, "A path"));
        return (
            names &&
            names.flatMap((some, index) => some.map((name) => ({ name, kind: index === 0 ? "directory" : "file" })))
        );
    }

    differences(older, { findRenames = false } = {}) {
        const former = older === null ? null : rawCommit(older, "What a Commit is compared with");
        return this[rawOf].differences(former, findRenames).map(({ kind, path, oldPath, oldId, newId }) => ({
            path,
            kind: changeKinds[kind],
            oldPath: oldPath || null,
            oldId: oldId || null,
            newId: newId || null,
        }));
    }
}

// In the order of the library's numbers.
const changeKinds = [
    "unchanged",
    "added",
    "removed",
    "changed",
    "directory became file",
    "file became directory",
    "renamed",
];
const settlements = ["undecided", "left", "right", "root", "combined"];
const mergeResults = ["up to date", "forwarded", "merged", "gave up", "nothing to commit", "refused"];
const fileChoices = ["left", "right", "root", "undecided"];
const directoryChoices = ["merge", "left", "right", "root", "undecided"];

const toConflict = (raw) => ({
    path: raw.path,
    kind: raw.isDirectory ? "directory" : "file",
    left: raw.leftId || null,
    root: raw.rootId || null,
    right: raw.rightId || null,
    leftChange: changeKinds[raw.leftChange],
    rightChange: changeKinds[raw.rightChange],
    settlement: settlements[raw.settlement],
});

/** A resolver for the module, which asks `resolver`; what that leaves open is answered by `otherwise`. */
function numbered(resolver, choices, otherwise) {
    return (raw) => {
        const conflict = toConflict(raw);
        const choice = resolver?.(conflict) ?? otherwise;
        if (!choices.includes(choice))
            throw new KivVcsError(
                `A resolver of ${conflict.kind} conflicts answers ${choices.join(", ")}, and not ${choice}.`,
            );
        return choices.indexOf(choice);
    };
}

export class Repository extends Handle {
    constructor() {
        if (core === null)
            throw new KivVcsError("The module has not been loaded: await load() first.");
        super(new core.Repository());
    }

    get branch() {
        return this[rawOf].branch();
    }

    branches() {
        return this[rawOf].branches().sort();
    }

    hasBranch(name) {
        return this[rawOf].hasBranch(checkText(name, "The name of a branch"));
    }

    checkout(name) {
        this.#checkBranch(name);
        this[rawOf].checkout(name);
    }

    createBranch(name, at = null) {
        if (checkText(name, "The name of a branch") === "")
            throw new KivVcsError("A branch needs a name.");
        if (this.hasBranch(name))
            throw new KivVcsError(`There is a branch "${name}" already.`);
        this[rawOf].createBranch(name, at === null ? null : rawCommit(at, "The head of a branch"));
    }

    moveBranch(name, to) {
        this.#checkBranch(name);
        this[rawOf].moveBranch(name, rawCommit(to, "The head of a branch"));
    }

    removeBranch(name) {
        this.#checkBranch(name);
        this[rawOf].removeBranch(name);
    }

    head(branch = this.branch) {
        this.#checkBranch(branch);
        return wrap(this[rawOf].head(branch));
    }

    find(id) {
        return wrap(this[rawOf].find(checkText(id, "An id")));
    }

    readFile(id) {
        return this[rawOf].readFile(checkText(id, "An id"));
    }

    commonBase(first, second) {
        return wrap(this[rawOf].commonBase(rawCommit(first, "What has a base"), rawCommit(second, "What has a base")));
    }

    commit({ files = {}, remove = [], author = {}, description = "", amend = false, time, offsetMinutes } = {}) {
        const raw = this[rawOf];
        this.#checkBranch(this.branch);
        if (time !== undefined && Number.isNaN(Number(time)))
            throw new KivVcsError("The time of a commit has to be a Date.");
        return using([raw.head(this.branch)], (head) => {
            if (amend && head === null)
                throw new KivVcsError(`The branch "${this.branch}" has no commit to amend.`);
            return using([raw.edit(head, amend)], (draft) => {
                for (const path of remove)
                    if (!draft.remove(checkPath(path)))
                        throw new KivVcsError(`There is no "${path}" to remove.`);
                for (const [path, content] of entriesOf(files))
                    addTo(draft, checkPath(path), content);
                if (!amend || author.name !== undefined || author.email !== undefined)
                    sign(draft, author);
                if (!amend || description !== "")
                    draft.setDescription(checkText(description, "A description"));
                if (time === undefined)
                    return wrap(draft.commit());
                const offset = offsetMinutes ?? -new Date(time).getTimezoneOffset();
                const stored = draft.store(Math.floor(Number(time) / 1000), offset, "");
                raw.moveBranch(this.branch, stored);
                return wrap(stored);
            });
        });
    }

    merge(other, { file, directory, author, description } = {}) {
        this.#checkBranch(this.branch);
        const { result, conflicts } = this[rawOf].merge(
            rawCommit(other, "What is merged"),
            numbered(file, fileChoices, "undecided"),
            numbered(directory, directoryChoices, "merge"),
        );
        const kind = mergeResults[result];
        if (kind === "merged" && (author !== undefined || description !== undefined))
            this.commit({ amend: true, author, description }).delete();
        return { kind, conflicts: conflicts.map(toConflict) };
    }

    rebase(tip, onto, base) {
        const raw = this[rawOf];
        const moved = rawCommit(tip, "What is rebased");
        const place = rawCommit(onto, "What a history is put on");
        if (base !== undefined)
            return wrap(raw.rebase(moved, base === null ? null : rawCommit(base, "The base"), place));
        // The base that lies on the history of the tip.
        return using([raw.commonBase(place, moved)], (found) => wrap(raw.rebase(moved, found, place)));
    }

    simplify({ purge = true } = {}) {
        this[rawOf].simplify(purge);
    }

    ensureCommonRoot(first, second, root) {
        this.#checkBranch(first);
        this.#checkBranch(second);
        if (!this[rawOf].ensureCommonRoot(first, second, checkText(root, "The name of a branch")))
            throw new KivVcsError(`The branch "${root}" cannot become the root of "${first}" and "${second}".`);
    }

    deleteHistory(commit) {
        this[rawOf].deleteCommits(rawCommit(commit, "What is deleted"));
    }

    purge() {
        this[rawOf].purge();
    }

    counts() {
        const raw = this[rawOf];
        return { commits: raw.countCommits(), directories: raw.countDirectories(), files: raw.countFiles() };
    }

    holds(id) {
        return this[rawOf].holds(checkText(id, "An id"));
    }

    pack(id) {
        return this[rawOf].pack(checkText(id, "An id"));
    }

    *missing(head, has = () => false) {
        const done = new Set();
        const isThere = (id) => done.has(id) || has(id);
        const commits = [];
        for (let id = head.id; id !== null && !isThere(id); ) {
            const bytes = this.#packed(id);
            const { tree, parent } = parseCommit(bytes, id);
            commits.push({ id, kind: "commit", bytes, tree });
            id = parent;
        }
        for (const { tree, ...commit } of commits.reverse()) {
            for (const entry of tree === "" ? [] : bottomUp({ id: tree, kind: "directory" }, isThere, this.#entry)) {
                done.add(entry.id);
                yield entry;
            }
            done.add(commit.id);
            yield commit;
        }
    }

    async read(head, get) {
        const raw = this[rawOf];
        const known = new Map();
        const fetched = async (id) => {
            const bytes = await get(id);
            if (!(bytes instanceof Uint8Array))
                throw new KivVcsError(`The packed form of ${id} is missing.`);
            if (core.identify(bytes) !== id)
                throw new KivVcsError(`The packed form of ${id} is damaged: its digest is another one.`);
            return bytes;
        };
        const commits = [];
        for (let id = checkText(head, "An id"); id !== null && !raw.holds(id); ) {
            const commit = { id, ...parseCommit(await fetched(id), id) };
            if (commit.tree !== "")
                await gather(commit.tree, (some) => known.has(some) || raw.holds(some), fetched, known);
            commits.push(commit);
            id = commit.parent;
        }
        // From here on nothing waits, so that nobody purges what is not yet part of a commit.
        for (const [id, bytes] of known)
            if (!raw.addPacked(id, bytes))
                throw new KivVcsError(`The packed form of ${id} is not one of a file or directory.`);
        for (const commit of commits.reverse())
            restore(raw, commit);
        const read = this.find(head);
        if (read === null)
            throw new KivVcsError(`${head} is not the id of a commit.`);
        return read;
    }

    #entry = (entry) => ({ ...entry, bytes: this.#packed(entry.id) });

    #packed(id) {
        const bytes = this.pack(id);
        if (bytes === null)
            throw new KivVcsError(`The repository does not hold ${id}.`);
        return bytes;
    }

    #checkBranch(name) {
        if (!this.hasBranch(name))
            throw new KivVcsError(`There is no branch "${name}".`);
    }
}

export function identify(packed) {
    if (core === null)
        throw new KivVcsError("The module has not been loaded: await load() first.");
    return core.identify(toBytes(packed, "a packed form"));
}

export function countAllocatedBytes() {
    return core === null ? 0 : core.countAllocatedBytes();
}

function addTo(draft, path, content) {
    const there = draft.find(path);
    if (there?.isDirectory)
        throw new KivVcsError(`"${path}" is a directory; remove it first.`);
    for (let end = path.indexOf("/"); there === null && end !== -1; end = path.indexOf("/", end + 1))
        if (draft.find(path.slice(0, end))?.isDirectory === false)
            throw new KivVcsError(`"${path.slice(0, end)}" is a file; remove it first.`);
    if (typeof content?.id !== "string")
        draft.add(path, toBytes(content, path));
    else if (!draft.addObject(path, content.id))
        throw new KivVcsError(`There is no file or directory ${content.id} to add as "${path}".`);
}

function sign(draft, { name = "", email = "" }) {
    draft.setAuthor(checkSignature(name, "An author's name"), checkSignature(email, "An author's e-mail address"));
}

const decoder = new TextDecoder("utf-8", { ignoreBOM: true });
const isAt = (bytes, position, word) => [...word].every((letter, index) => bytes[position + index] === letter.charCodeAt(0));

function dataOf(packed) {
    return packed.subarray(packed.indexOf(0) + 1);
}

function parseCommit(packed, id) {
    const text = decoder.decode(dataOf(packed));
    const parts =
        /^tree (.*)\n(?:parent (.*)\n)?author (.*) <(.*)> (-?\d+) ([+-])(\d+)(\d\d)\ncommitter .*\n\n([^]*)\n$/.exec(text);
    if (!isAt(packed, 0, "commit ") || parts === null)
        throw new KivVcsError(`The packed form of ${id} is not one of a commit.`);
    const [, tree, parent = null, name, email, seconds, sign, hours, minutes, description] = parts;
    const offset = (sign === "-" ? -1 : 1) * (Number(hours) * 60 + Number(minutes));
    return { tree, parent, author: { name, email }, seconds: Number(seconds), offset, description };
}

/** The entries of a packed directory; none for a file. */
function* parseTree(packed) {
    if (!isAt(packed, 0, "tree "))
        return;
    const data = dataOf(packed);
    for (let position = 0; position < data.length; ) {
        const end = data.indexOf(0, position);
        yield {
            id: decoder.decode(data.subarray(end + 1, end + 65)),
            kind: isAt(data, position, "40000 ") ? "directory" : "file",
        };
        if (end === -1)
            return;
        position = end + 65;
    }
}

/** What lies below a directory and is not there yet, and the directory itself, each behind everything that it names. */
function* bottomUp(root, isThere, withBytes) {
    const entered = new Set();
    const open = [root];
    while (open.length > 0) {
        const entry = open.at(-1);
        if (entry.bytes !== undefined || entered.has(entry.id) || isThere(entry.id)) {
            open.pop();
            if (entry.bytes !== undefined)
                yield entry;
            continue;
        }
        entered.add(entry.id);
        open[open.length - 1] = withBytes(entry);
        open.push(...parseTree(open.at(-1).bytes));
    }
}

/** The same into a map, where the bytes have to be waited for. */
async function gather(root, isThere, fetched, known) {
    const entered = new Set();
    const open = [{ id: root }];
    while (open.length > 0) {
        const entry = open.at(-1);
        if (entry.bytes !== undefined || entered.has(entry.id) || isThere(entry.id)) {
            open.pop();
            if (entry.bytes !== undefined)
                known.set(entry.id, entry.bytes);
            continue;
        }
        entered.add(entry.id);
        entry.bytes = await fetched(entry.id);
        for (const child of parseTree(entry.bytes))
            open.push(child);
    }
}

function restore(raw, { id, tree, parent, author, seconds, offset, description }) {
    using([parent && raw.find(parent)], (former) =>
        using([raw.edit(former, false)], (draft) => {
            draft.useTree(tree);
            draft.setAuthor(author.name, author.email);
            draft.setDescription(description);
            const stored = draft.store(seconds, offset, id);
            if (stored === null)
                throw new KivVcsError(`The commit ${id} cannot be rebuilt from its packed form.`);
            stored.delete();
        }),
    );
}
