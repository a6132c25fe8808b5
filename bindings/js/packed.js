// Packed forms, read as far as exchanging them takes.

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
