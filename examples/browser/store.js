// A place for packed forms and the heads of branches that outlasts the page.

const settled = (request) =>
    new Promise((resolve, reject) => {
        request.onsuccess = () => resolve(request.result);
        request.onerror = () => reject(request.error);
    });

export class Store {
    #database;
    /** The ids of all objects that are kept. */
    #kept = new Set();

    static async open(name) {
        const request = indexedDB.open(name, 1);
        request.onupgradeneeded = () => {
            request.result.createObjectStore("objects");
            request.result.createObjectStore("heads");
        };
        const store = new Store();
        store.#database = await settled(request);
        return store;
    }

    /** Everything, as two maps: packed forms by id, and ids by branch. */
    async readAll() {
        const transaction = this.#database.transaction(["objects", "heads"]);
        const read = async (name) => {
            const table = transaction.objectStore(name);
            const [keys, values] = await Promise.all([settled(table.getAllKeys()), settled(table.getAll())]);
            return new Map(keys.map((key, index) => [key, values[index]]));
        };
        const [objects, heads] = await Promise.all([read("objects"), read("heads")]);
        this.#kept = new Set(objects.keys());
        return { objects, heads };
    }

    has = (id) => this.#kept.has(id);

    /** Keeps objects and heads, all of them or none; they are safe when the promise is fulfilled. */
    async write(objects, heads) {
        const transaction = this.#database.transaction(["objects", "heads"], "readwrite", { durability: "strict" });
        for (const { id, bytes } of objects)
            transaction.objectStore("objects").put(bytes, id);
        for (const [branch, id] of heads)
            transaction.objectStore("heads").put(id, branch);
        await new Promise((resolve, reject) => {
            transaction.oncomplete = resolve;
            transaction.onabort = () => reject(transaction.error);
        });
        for (const { id } of objects)
            this.#kept.add(id);
    }
}
