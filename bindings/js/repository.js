// Repositories: what is asked of the raw operations, checked and explained.

// In the order of the library's numbers.
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

const entriesOf = (files) =>
    typeof files?.[Symbol.iterator] === "function" ? files : Object.entries(files);

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
