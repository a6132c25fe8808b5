// Commits, and what they are shown as.

const wrap = (raw) => (raw === null ? null : new Commit(raw));

function rawCommit(commit, what) {
    if (!(commit instanceof Commit))
        throw new KivVcsError(`${what} has to be a Commit.`);
    return commit[rawOf];
}

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
