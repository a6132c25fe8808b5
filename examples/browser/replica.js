// One copy of the document, with all its versions, in memory and in a store.

import { Repository } from "./kivvcs.js";
import { Store } from "./store.js";

/** What the copy shows. */
const current = "master";
/** The newest version, to which redoing leads. */
const newest = "newest";

export class Replica {
    #store;
    #repository = new Repository();
    #author;
    #written = Promise.resolve();

    /** Opens the copy, or makes one with the given parts. Every version is compared with its id. */
    static async open(name, parts) {
        const replica = new Replica();
        replica.name = name;
        replica.#author = { name, email: `${name.toLowerCase()}@example.org` };
        replica.#store = await Store.open(`two-copies-${name}`);
        const { objects, heads } = await replica.#store.readAll();
        if (heads.size === 0) {
            // The same for everybody, so that histories meet.
            const start = { files: parts, description: "Start", time: 0, offsetMinutes: 0 };
            replica.#repository.commit(start).delete();
            replica.#repository.createBranch(newest);
        } else {
            await replica.#move(newest, await replica.#repository.read(heads.get(newest), (id) => objects.get(id)));
            await replica.#move(current, await replica.#repository.read(heads.get(current), (id) => objects.get(id)));
        }
        await replica.publish();
        return replica;
    }

    get head() {
        return this.#repository.head(current);
    }

    /** The texts of the parts by name. */
    get parts() {
        const head = this.head;
        return new Map(head.paths().map((path) => [path, head.text(path)]));
    }

    /** All versions from the newest one on, and from the one that is shown. */
    versions() {
        const seen = new Map();
        for (const branch of [newest, current])
            for (const commit of this.#repository.head(branch).history()) {
                const { id, description } = commit;
                const parent = commit.parent();
                if (!seen.has(id))
                    seen.set(id, { id, description, author: commit.author.name, parent: parent?.id ?? null });
                parent?.delete();
                commit.delete();
            }
        return seen;
    }

    change(files, remove, description) {
        this.#repository.commit({ files, remove, author: this.#author, description }).delete();
        this.#move(newest, this.head);
    }

    get canUndo() {
        return this.head.parent() !== null;
    }
    undo() {
        this.#move(current, this.head.parent());
    }

    get canRedo() {
        return this.#next() !== null;
    }
    redo() {
        this.#move(current, this.#next());
    }

    #next() {
        const shown = this.head.id;
        for (const commit of this.#repository.head(newest).history()) {
            if (commit.parent()?.id === shown)
                return commit;
            if (commit.id === shown)
                return null;
        }
        return null;
    }

    /** Takes what `other` has and this copy lacks: packed forms, as they would be sent over a network. */
    async #receive(other) {
        const sent = new Map();
        for (const { id, bytes } of other.#repository.missing(other.head, (id) => this.#repository.holds(id)))
            sent.set(id, bytes);
        return this.#repository.read(other.head.id, (id) => sent.get(id));
    }

    /**
     * Merges the other copy's document into this one. `choices` says by path which side wins a conflict.
     * The own line of versions then continues that of the other copy, which only has to move forward.
     */
    async merge(other, choices = new Map()) {
        const theirs = await this.#receive(other);
        const outcome = this.#repository.merge(theirs, {
            file: ({ path }) => choices.get(path),
            author: this.#author,
            description: `Merge with ${other.name}`,
        });
        if (outcome.kind === "merged")
            this.#move(current, this.#repository.rebase(this.head, theirs));
        if (outcome.kind === "merged" || outcome.kind === "forwarded")
            this.#move(newest, this.head);
        return outcome;
    }

    /** The text of a file; null for none. */
    textOf(id) {
        return id === null ? null : new TextDecoder().decode(this.#repository.readFile(id));
    }

    /** Makes the versions last. Fulfilled, with the id of the version that is shown, when they do. */
    publish() {
        const shown = this.head.id;
        const heads = [newest, current].map((branch) => [branch, this.#repository.head(branch).id]);
        // One after the other, so that the store has what an earlier version brought when the next looks for what is missing.
        this.#written = this.#written.then(async () => {
            const objects = heads.flatMap(([, id]) => [
                ...this.#repository.missing(this.#repository.find(id), this.#store.has),
            ]);
            await this.#store.write(objects, heads);
            return shown;
        });
        return this.#written;
    }

    #move(branch, to) {
        if (this.#repository.hasBranch(branch))
            this.#repository.moveBranch(branch, to);
        else
            this.#repository.createBranch(branch, to);
    }
}
