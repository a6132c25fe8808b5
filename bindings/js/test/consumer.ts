// Compiled, not run: the declarations fit what a consumer writes.

import { type Conflict, dispose, type FileChoice, load, Repository } from "kivvcs";

export async function keep(store: Map<string, Uint8Array>): Promise<string[]> {
    await load(new URL("https://example.org/kivvcs.wasm"));
    const repository = new Repository();
    const first = repository.commit({ files: { a: "text", b: Uint8Array.of(1), c: { id: "0" } }, author: { name: "Ada" } });
    const second = repository.commit({ files: new Map([["d", "text"]]), remove: new Set(["a"]) });
    const byName = ({ path, left }: Conflict): FileChoice => (path === "a" && left !== null ? "left" : "undecided");
    const { kind, conflicts } = repository.merge(first, { file: byName, directory: () => "merge" });
    for (const { id, bytes } of repository.missing(second, (id) => store.has(id)))
        store.set(id, bytes);
    const copy = await repository.read(second.id, (id) => store.get(id));
    copy[dispose]();
    // @ts-expect-error A commit is made by a repository.
    new (await import("kivvcs")).Commit();
    // @ts-expect-error Conflicts between files cannot be merged.
    repository.merge(first, { file: () => "merge" });
    return [kind, ...conflicts.map((conflict) => conflict.path), ...second.differences(first).map(({ path }) => path)];
}
