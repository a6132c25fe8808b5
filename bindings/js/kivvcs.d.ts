// Version control in memory: commits of named files on branches, for pages and for node.

/** What goes wrong, in a sentence. What the caller's own functions throw passes through as it is. */
export class KivVcsError extends Error {}

/**
 * Loads the module; to be awaited before anything else, any number of times.
 * @param source the bytes of kivvcs.wasm, or where they are; without it, beside this module.
 */
export function load(source?: BufferSource | URL | string): Promise<void>;

/** The key of the method that frees an object: `Symbol.dispose` where the platform has it. */
export const dispose: unique symbol;

/** The id of a packed form: 64 hexadecimal digits of its SHA-256 digest. */
export function identify(packed: Uint8Array): Id;

/** How many bytes of the module's memory are taken. */
export function countAllocatedBytes(): number;

/** 64 lowercase hexadecimal digits. */
export type Id = string;

/** Names joined by "/", from the top of the files. */
export type Path = string;

/**
 * An object in the module's memory. `delete` frees it at once; one that is forgotten is freed some time after nothing refers to
 * it any more. Commits and repositories may be freed in any order.
 */
interface Handle {
    readonly isDeleted: boolean;
    delete(): void;
    [dispose](): void;
}

export interface Author {
    /** Without "<", ">" and line breaks. */
    name: string;
    email: string;
}

export type EntryKind = "file" | "directory";

export interface Entry {
    id: Id;
    kind: EntryKind;
}

export type DifferenceKind =
    | "added"
    | "removed"
    | "changed"
    | "directory became file"
    | "file became directory"
    | "renamed";

export interface Difference {
    path: Path;
    kind: DifferenceKind;
    /** Where a renamed file was before; null for other kinds. */
    oldPath: Path | null;
    /** What was at the path before; null if nothing was. */
    oldId: Id | null;
    newId: Id | null;
}

/** One version of all files. It never changes. */
export class Commit implements Handle {
    private constructor();

    readonly id: Id;
    readonly author: Author;
    readonly description: string;
    /** In whole seconds. */
    readonly time: Date;
    /** How far the author's time zone was from UTC, positive east of Greenwich. */
    readonly offsetMinutes: number;
    /** Equal where all files are; null if there never was one. */
    readonly treeId: Id | null;

    /** What it was made from; null for the first. */
    parent(): Commit | null;
    /**
     * This commit and those before it, newest first. Each is an object of its own, which the caller may free.
     * @param options `path`: only those that changed what is at that path; `limit`: at most so many
     */
    history(options?: { limit?: number; path?: Path | null }): Generator<Commit, void, undefined>;

    /** The paths of all files, sorted. */
    paths(): Path[];
    /** What is at a path; null if nothing is. */
    find(path: Path): Entry | null;
    /** The content of a file; null if there is none at that path. */
    read(path: Path): Uint8Array | null;
    /** The same as UTF-8 text. */
    text(path: Path): string | null;
    /** The names in a directory, subdirectories first; null if there is no such directory. Without it, the top. */
    list(directory?: Path): { name: string; kind: EntryKind }[] | null;
    /**
     * The files that differ from those of an older commit, by path; all of them for null. With `findRenames`, files that were
     * removed are paired with files of equal content that were added.
     */
    differences(older: Commit | null, options?: { findRenames?: boolean }): Difference[];

    readonly isDeleted: boolean;
    delete(): void;
    [dispose](): void;
}

/** The content of a file, or the id of a file or directory that the repository holds. */
export type Content = Uint8Array | string | { id: Id };

export interface Change {
    /** What to add or replace. Texts are stored as UTF-8. */
    files?: Record<Path, Content> | Iterable<readonly [Path, Content]>;
    /** Files and directories to remove first; directories that this leaves empty go with them. */
    remove?: Iterable<Path>;
    author?: Partial<Author>;
    description?: string;
    /** Takes the place of the head, whose files, author and description it starts from. */
    amend?: boolean;
    /** When it was made; now, if left out. */
    time?: Date | number;
    offsetMinutes?: number;
}

/** An entry that both sides changed differently. */
export interface Conflict {
    path: Path;
    kind: EntryKind;
    /** What the current branch, the common base and the other commit have there; null for nothing. */
    left: Id | null;
    root: Id | null;
    right: Id | null;
    /** What each side did since the base. */
    leftChange: DifferenceKind | "unchanged";
    rightChange: DifferenceKind | "unchanged";
    /** Whose version was taken; "undecided" where nobody has decided, as when a resolver is asked. */
    settlement: "undecided" | "left" | "right" | "root" | "combined";
}

export type FileChoice = "left" | "right" | "root" | "undecided";
export type DirectoryChoice = FileChoice | "merge";

export interface MergeOptions {
    /** Settles a conflict between files. Without it, and where it answers "undecided", the merge gives up. */
    file?: (conflict: Conflict) => FileChoice | undefined;
    /** Settles one between directories; without it they are merged entry by entry. The path of the top is "". */
    directory?: (conflict: Conflict) => DirectoryChoice | undefined;
    author?: Partial<Author>;
    description?: string;
}

export interface MergeOutcome {
    /**
     * "up to date": the other commit was part of the branch; "forwarded": the branch moved to it; "merged": there is a new
     * commit on the branch; "gave up": nothing has changed, since conflicts are undecided; "nothing to commit": the resolvers
     * left nothing at all; "refused": the current branch has been removed.
     */
    kind: "up to date" | "forwarded" | "merged" | "gave up" | "nothing to commit" | "refused";
    /** Those that were settled, and after a merge that gave up all others behind them. */
    conflicts: Conflict[];
}

export interface PackedObject {
    id: Id;
    kind: "commit" | EntryKind;
    /** From which `identify` computes the id. The same on every platform. */
    bytes: Uint8Array;
}

/** Commits on branches, in memory. A new one has the branch "master", which is current, and no commit. */
export class Repository implements Handle {
    constructor();

    /** The name of the current branch. */
    readonly branch: string;
    branches(): string[];
    hasBranch(name: string): boolean;
    checkout(name: string): void;
    /** Makes a branch at a commit, or at the head of the current branch. */
    createBranch(name: string, at?: Commit | null): void;
    moveBranch(name: string, to: Commit): void;
    removeBranch(name: string): void;
    /** The newest commit of a branch, or of the current one; null if it has none. */
    head(branch?: string): Commit | null;
    /** The commit of that id; null if the repository holds none. */
    find(id: Id): Commit | null;
    /** The content of the file of that id; null if the repository holds none. */
    readFile(id: Id): Uint8Array | null;
    /** Where the histories of two commits meet; null if they never do. */
    commonBase(first: Commit, second: Commit): Commit | null;

    /** Makes a commit on the current branch. If it throws, no branch has moved. */
    commit(change?: Change): Commit;
    /** Brings a commit into the current branch. Contents are never mixed: one side's file wins, or nobody's. */
    merge(other: Commit, options?: MergeOptions): MergeOutcome;
    /**
     * Puts the line of commits from `tip` down to, but without, `base` on top of `onto`: the same files, authors and times with
     * new parents. Without a base it is the common one; null moves the whole history. No branch moves.
     * @returns the new tip
     */
    rebase(tip: Commit, onto: Commit, base?: Commit | null): Commit;
    /** Rewrites history so that it keeps only the heads of branches and the common bases of every two of them. */
    simplify(options?: { purge?: boolean }): void;
    /** Makes two branches share an ancestor: the head of the branch `root`, which is made if it is not there. */
    ensureCommonRoot(first: string, second: string, root: string): void;
    /** Deletes a commit and those before it, but for the heads of branches. A first commit is left alone. */
    deleteHistory(commit: Commit): void;
    /** Frees what no branch, and no commit that is held, refers to. */
    purge(): void;
    counts(): { commits: number; directories: number; files: number };

    holds(id: Id): boolean;
    /** The packed form of what the repository holds under an id; null if it holds nothing. */
    pack(id: Id): Uint8Array | null;
    /**
     * What a store lacks of a commit and its history, each object behind everything that it refers to, so that a store that
     * has an object has all of it, also when writing was cut short.
     * @param has whether the store has the object of that id, and so everything below
     */
    missing(head: Commit, has?: (id: Id) => boolean): Generator<PackedObject, void, undefined>;
    /**
     * Reads a commit, its files and its history back from packed forms, as far as they are not here. Each is compared with its
     * id. The repository is as before if anything is missing or damaged. No branch moves.
     * @param get gives the packed form of an id, at once or some time
     */
    read(
        head: Id,
        get: (id: Id) => Uint8Array | null | undefined | Promise<Uint8Array | null | undefined>,
    ): Promise<Commit>;

    readonly isDeleted: boolean;
    delete(): void;
    [dispose](): void;
}
