// The page: what is typed becomes versions of two copies; what they say becomes the page.

import { load } from "./kivvcs.js";
import { drawGraph } from "./graph.js";
import { Replica } from "./replica.js";

const pauseBeforeVersion = 400;

const start = {
    Title: "A trip to the sea",
    Packing: "Tent, stove, two books",
    Route: "By train to the coast, then on foot",
};

const byId = (id) => document.getElementById(id);
const fromTemplate = (id) => byId(id).content.firstElementChild.cloneNode(true);

function tell(error) {
    byId("problem").hidden = false;
    byId("problem").textContent = `${error.message} Nothing more is saved; reload the page to go on from what was.`;
    document.documentElement.dataset.state = "broken";
    throw error;
}

class Panel {
    #replica;
    #element = fromTemplate("copy");
    #pending = new Map();
    #timer = null;

    constructor(replica) {
        this.#replica = replica;
        this.#element.dataset.copy = replica.name;
        this.#element.setAttribute("aria-label", `${replica.name}'s copy`);
        this.#find("h2").textContent = `${replica.name}'s copy`;
        this.#find(".tools").setAttribute("aria-label", `History of ${replica.name}'s copy`);
        this.#find(".undo").onclick = () => this.#step("undo");
        this.#find(".redo").onclick = () => this.#step("redo");
        this.#find(".add").onsubmit = (event) => this.#add(event);
        this.#element.onkeydown = (event) => this.#pressed(event);
        byId("copies").append(this.#element);
    }

    get replica() {
        return this.#replica;
    }

    #find(selector) {
        return this.#element.querySelector(selector);
    }

    /** Makes a version of what has been typed since the last one. */
    flush() {
        clearTimeout(this.#timer);
        if (this.#pending.size === 0)
            return;
        const changed = [...this.#pending].filter(([name, text]) => this.#replica.parts.get(name) !== text);
        this.#pending.clear();
        if (changed.length > 0)
            this.#change(changed, [], `Edit ${changed.map(([name]) => name).join(", ")}`);
    }

    /** Shows the document as the replica has it, and makes its versions last. */
    show() {
        const parts = this.#replica.parts;
        const place = this.#find(".parts");
        for (const part of [...place.children])
            if (!parts.has(part.dataset.name))
                part.remove();
        for (const [index, [name, text]] of [...parts].entries()) {
            const part = [...place.children].find((other) => other.dataset.name === name) ?? this.#makePart(name);
            const area = part.querySelector("textarea");
            if (area.value !== text && !this.#pending.has(name))
                area.value = text;
            // Only where it is not: what is moved loses the focus.
            if (place.children[index] !== part)
                place.insertBefore(part, place.children[index] ?? null);
        }
        this.#find(".undo").disabled = !this.#replica.canUndo;
        this.#find(".redo").disabled = !this.#replica.canRedo;
        this.#publish();
    }

    #makePart(name) {
        const part = fromTemplate("part");
        const [label, area, remove] = part.children;
        part.dataset.name = name;
        label.textContent = name;
        label.htmlFor = area.id = `${this.#replica.name}-${name}`;
        remove.setAttribute("aria-label", `Remove ${name}`);
        area.oninput = () => {
            this.#pending.set(name, area.value);
            clearTimeout(this.#timer);
            this.#timer = setTimeout(() => this.flush(), pauseBeforeVersion);
        };
        area.onblur = () => this.flush();
        remove.onclick = () => {
            this.flush();
            this.#change([], [name], `Remove ${name}`);
        };
        return part;
    }

    #add(event) {
        event.preventDefault();
        this.flush();
        const input = event.target.elements.name;
        if (!this.#replica.parts.has(input.value))
            this.#change([[input.value, ""]], [], `Add ${input.value}`);
        this.#find(`.part[data-name="${CSS.escape(input.value)}"] textarea`).focus();
        input.value = "";
    }

    #step(direction) {
        this.flush();
        if (direction === "undo" ? this.#replica.canUndo : this.#replica.canRedo)
            this.#replica[direction]();
        draw(this);
    }

    #pressed(event) {
        if (!(event.ctrlKey || event.metaKey) || event.altKey || event.key.toLowerCase() !== "z")
            return;
        event.preventDefault();
        this.#step(event.shiftKey ? "redo" : "undo");
    }

    #change(files, remove, description) {
        this.#replica.change(files, remove, description);
        draw(this);
    }

    async #publish() {
        const state = this.#find(".state");
        state.textContent = "Saving…";
        const id = await this.#replica.publish().catch(tell);
        if (this.#replica.head.id === id)
            state.textContent = `Saved as ${id.slice(0, 8)}`;
        this.#element.dataset.saved = id;
        document.dispatchEvent(new CustomEvent("published", { detail: { copy: this.#replica.name, id } }));
    }
}

let panels = [];

function draw(...changed) {
    for (const panel of changed)
        panel.show();
    const versions = new Map(panels.flatMap(({ replica }) => [...replica.versions()]));
    const heads = new Map();
    for (const { replica } of panels)
        heads.set(replica.head.id, [...(heads.get(replica.head.id) ?? []), replica.name]);
    const parents = new Set([...versions.values()].map(({ parent }) => parent));
    const tips = [...heads.keys(), ...[...versions.keys()].filter((id) => !parents.has(id))];
    drawGraph(byId("graph"), versions, heads, tips);
}

/** Asks a person which side of each conflict to keep; null if they will not say. */
function ask(conflicts, replica, other) {
    const sides = { left: `${replica.name}'s`, right: `${other.name}'s`, root: "What was there before" };
    byId("questions").replaceChildren(
        ...conflicts.map((conflict, index) => {
            const question = fromTemplate("question");
            question.querySelector("legend").textContent = conflict.path;
            for (const [side, name] of Object.entries(sides)) {
                const label = document.createElement("label");
                label.innerHTML = `<input type="radio" name="${index}" value="${side}" required /><span></span><pre></pre>`;
                label.children[1].textContent = name;
                label.children[2].textContent = replica.textOf(conflict[side]) ?? "(removed)";
                question.lastElementChild.append(label);
            }
            return question;
        }),
    );
    const dialog = byId("conflicts");
    dialog.returnValue = "cancel";
    dialog.showModal();
    return new Promise((resolve) => {
        dialog.onclose = () => {
            const answers = new FormData(dialog.querySelector("form"));
            const choices = conflicts.map(({ path }, index) => [path, answers.get(String(index))]);
            resolve(dialog.returnValue === "settle" ? new Map(choices) : null);
        };
    });
}

async function bringTogether() {
    for (const panel of panels)
        panel.flush();
    const [mine, theirs] = panels.map(({ replica }) => replica);
    let outcome = await mine.merge(theirs);
    if (outcome.kind === "gave up") {
        const undecided = outcome.conflicts.filter(({ settlement }) => settlement === "undecided");
        const choices = await ask(undecided, mine, theirs);
        if (choices === null)
            return "Nothing was changed.";
        outcome = await mine.merge(theirs, choices);
    }
    const back = await theirs.merge(mine);
    return outcome.kind === "up to date" && back.kind === "up to date"
        ? "Both were the same already."
        : "Both copies now hold the same document.";
}

async function open() {
    await load();
    const replicas = [await Replica.open("Ada", start), await Replica.open("Bo", start)];
    panels = replicas.map((replica) => new Panel(replica));
    draw(...panels);
    byId("merge").disabled = false;
    byId("merge").onclick = async () => {
        byId("merge").disabled = true;
        byId("outcome").textContent = "";
        byId("outcome").textContent = await bringTogether().catch(tell);
        draw(...panels);
        byId("merge").disabled = false;
        byId("merge").focus();
    };
    addEventListener("pagehide", () => panels.forEach((panel) => panel.flush()));
    document.documentElement.dataset.state = "ready";
}

// In one tab at a time: another one would not know of the versions that this one makes.
byId("outcome").textContent = "Waiting for another tab with this page to be closed…";
await navigator.locks.request("two-copies", async () => {
    byId("outcome").textContent = "";
    await open().catch(tell);
    await new Promise(() => {});
});
