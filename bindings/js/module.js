// Loading the module, and objects of its memory. What kivvcs.d.ts declares stands in this file and in commit.js, packed.js and
// repository.js, on top of the raw operations of the C++ code. The build puts their text, in this order, behind what
// emscripten generates, which is the function `instantiate`: all of it is one ES module.

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

export function identify(packed) {
    if (core === null)
        throw new KivVcsError("The module has not been loaded: await load() first.");
    return core.identify(toBytes(packed, "a packed form"));
}

export function countAllocatedBytes() {
    return core === null ? 0 : core.countAllocatedBytes();
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
