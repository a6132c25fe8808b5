// The versions of all copies as a list with lines: newest first, each in the lane of the line of versions it belongs to.

const laneWidth = 18;
const rowHeight = 32;
const mostRows = 100;

/** Draws into `place`. `versions` has all of them by id, `heads` names by id, and `tips` the ids at which lines begin. */
export function drawGraph(place, versions, heads, tips) {
    const lanes = new Map();
    for (const [lane, tip] of [...new Set(tips)].entries())
        for (let id = tip; id !== null && !lanes.has(id); id = versions.get(id).parent)
            lanes.set(id, lane);
    const rows = inOrder(versions).slice(0, mostRows);
    const rowOf = new Map(rows.map((version, row) => [version.id, row]));
    const width = (Math.max(0, ...rows.map(({ id }) => lanes.get(id))) + 1) * laneWidth;
    const list = document.createElement("ol");
    list.append(...rows.map((version, row) => drawRow(version, row)));
    place.replaceChildren(list);

    function drawRow({ id, description, author, parent }, row) {
        const item = document.createElement("li");
        const names = heads.get(id) ?? [];
        item.classList.toggle("head", names.length > 0);
        item.innerHTML = `<svg width="${width}" height="${rowHeight}" aria-hidden="true"></svg><span class="text"></span>`;
        item.firstChild.innerHTML = line(id, row, parent) + `<circle cx="${x(id)}" cy="${rowHeight / 2}" r="5" />`;
        for (const name of names) {
            const label = document.createElement("b");
            label.dataset.copy = name;
            label.textContent = name;
            item.lastChild.append(label, " ");
        }
        const code = document.createElement("code");
        code.textContent = id.slice(0, 8);
        item.lastChild.append(description + (author === "" ? " " : ` (${author}) `), code);
        return item;
    }

    function x(id) {
        return (lanes.get(id) + 0.5) * laneWidth;
    }

    function line(id, row, parent) {
        if (parent === null)
            return "";
        const down = ((rowOf.get(parent) ?? rows.length) - row) * rowHeight;
        const [from, to, middle] = [x(id), x(parent), rowHeight / 2];
        return `<path d="M${from} ${middle} V${middle + down - rowHeight} C${from} ${middle + down - rowHeight / 2}
                ${to} ${middle + down - rowHeight / 2} ${to} ${middle + down}" />`;
    }
}

/** Each version before its parent: the longer the history below one, the earlier. */
function inOrder(versions) {
    const depths = new Map();
    for (const { id } of versions.values()) {
        const line = [];
        for (let next = id; next !== null && !depths.has(next); next = versions.get(next).parent)
            line.push(next);
        for (const next of line.reverse())
            depths.set(next, (depths.get(versions.get(next).parent) ?? 0) + 1);
    }
    return [...versions.values()].sort((left, right) => depths.get(right.id) - depths.get(left.id));
}
