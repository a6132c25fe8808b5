// usage: node drive.js SITE SCREENSHOTS [RELOADS]
// Serves the directory SITE and uses the page in headless Chromium as a person would, by keyboard where that matters; reloads it
// RELOADS times (200 unless told) at random moments; leaves pictures in SCREENSHOTS.

import assert from "node:assert/strict";
import { mkdtemp, readFile, rm } from "node:fs/promises";
import { createServer } from "node:http";
import { tmpdir } from "node:os";
import { extname, join, normalize } from "node:path";
import { chromium } from "playwright-core";

const [site, screenshots, reloads = "200"] = process.argv.slice(2);
const types = { ".html": "text/html", ".js": "text/javascript", ".css": "text/css", ".wasm": "application/wasm" };

const server = createServer(async (request, response) => {
    const path = normalize(new URL(request.url, "http://localhost").pathname);
    const file = path === "/" ? "/index.html" : path;
    try {
        const bytes = await readFile(join(site, file));
        response.writeHead(200, { "content-type": types[extname(file)] ?? "text/plain" }).end(bytes);
    } catch {
        response.writeHead(404).end();
    }
});
await new Promise((resolve) => server.listen(0, "127.0.0.1", resolve));
const address = `http://127.0.0.1:${server.address().port}/`;
const profile = await mkdtemp(join(tmpdir(), "kivvcs-browser-"));
const browser = await chromium.launchPersistentContext(profile, {
    executablePath: "/usr/bin/chromium",
    headless: true,
    args: ["--no-sandbox", "--disable-gpu", "--disable-quic", "--no-first-run", "--disable-background-networking",
           "--disable-component-update", "--disable-sync"],
    viewport: { width: 1100, height: 900 },
});

const page = browser.pages()[0];
const complaints = [];
page.on("console", (message) => message.type() === "error" && complaints.push(message.text()));
page.on("pageerror", (error) => complaints.push(String(error)));

/** Every version that the page has called saved, in order, by copy. */
const published = { Ada: [], Bo: [] };
await page.exposeFunction("notePublished", ({ copy, id }) => published[copy].push(id));
await page.addInitScript(() => document.addEventListener("published", ({ detail }) => window.notePublished(detail)));

const ready = () => page.waitForSelector("html[data-state=ready]");
const area = (copy, part) => page.getByRole("region", { name: `${copy}'s copy` }).getByLabel(part, { exact: true });
const button = (copy, name) => page.getByRole("region", { name: `${copy}'s copy` }).getByRole("button", { name });
const textOf = (copy, part) => area(copy, part).inputValue();

async function saved(copy, action) {
    const before = published[copy].length;
    await action();
    for (let waits = 0; published[copy].length === before && waits < 400; ++waits)
        await page.waitForTimeout(10);
    assert.ok(published[copy].length > before, `${copy}'s version is saved`);
}

const write = (copy, part, text) =>
    saved(copy, async () => {
        await area(copy, part).fill(text);
        await area(copy, part).blur();
    });

async function merge() {
    await page.getByRole("button", { name: "Bring both together" }).click();
}

/** The ids that the store of a copy holds, and its heads. */
const stored = (copy) =>
    page.evaluate(async (name) => {
        const { Store } = await import("./store.js");
        const { objects, heads } = await (await Store.open(`two-copies-${name}`)).readAll();
        return { ids: [...objects.keys()], heads: Object.fromEntries(heads) };
    }, copy);

await page.goto(address);
await ready();

// The ids that tests/golden_repository.py prints.
const golden = await page.evaluate(async () => {
    const { load, Repository } = await import("./kivvcs.js");
    await load();
    const repository = new Repository();
    const first = repository.commit({
        files: { README: "one\n" },
        author: { name: "Zo\u00eb", email: "zoe@example.org" },
        description: "First",
        time: 1700000000000,
        offsetMinutes: 120,
    });
    const second = repository.commit({
        files: {
            "src.txt": "one\n",
            "src/\u{1f600}": Uint8Array.from({ length: 256 }, (_, byte) => byte),
            "src/\ufffd": "one\n",
            README: "",
            "src/main.cpp": "int main() {}\n",
        },
        author: { name: "Bo" },
        description: "Second\nwith two lines",
        time: -1000,
        offsetMinutes: -330,
    });
    return [first.id, second.id];
});
assert.deepEqual(golden, [
    "24488f154d474f3fda8eb38c5d1c092bf68d1744f98089effed77388d44078d7",
    "375da041bd867a6db66364e208b1498019a7792abb872f0757a97f929e4758ed",
]);
console.log("the ids in the browser are those of the other platforms");

// Undo, redo, and a merge without conflict; across a reload.
await write("Ada", "Title", "A trip to the mountains");
await write("Ada", "Title", "A trip to the Alps");
await area("Ada", "Title").focus();
await saved("Ada", () => page.keyboard.press("Control+z"));
assert.equal(await textOf("Ada", "Title"), "A trip to the mountains");
await saved("Ada", () => button("Ada", "Undo").click());
assert.equal(await textOf("Ada", "Title"), "A trip to the sea");
await page.reload();
await ready();
assert.equal(await textOf("Ada", "Title"), "A trip to the sea");
for (let steps = 0; steps < 2; ++steps)
    await saved("Ada", () => button("Ada", "Redo").click());
assert.equal(await textOf("Ada", "Title"), "A trip to the Alps");
await write("Bo", "Route", "By bicycle");
await saved("Bo", async () => {
    await button("Bo", "Remove Packing").click();
});
await page.screenshot({ path: join(screenshots, "apart.png"), fullPage: true });
await saved("Bo", merge);
for (const copy of ["Ada", "Bo"]) {
    assert.equal(await textOf(copy, "Title"), "A trip to the Alps");
    assert.equal(await textOf(copy, "Route"), "By bicycle");
    assert.equal(await area(copy, "Packing").count(), 0);
}
assert.equal((await stored("Ada")).heads.master, (await stored("Bo")).heads.master);

// A conflict, settled by keyboard alone.
await write("Ada", "Route", "On foot, all the way");
await write("Bo", "Route", "By night train");
await page.getByRole("button", { name: "Bring both together" }).focus();
await page.keyboard.press("Enter");
await page.waitForSelector("dialog[open]");
await page.screenshot({ path: join(screenshots, "conflict.png") });
await page.keyboard.press("Escape");
assert.equal(await textOf("Ada", "Route"), "On foot, all the way");
await page.keyboard.press("Enter");
await page.waitForSelector("dialog[open]");
await page.keyboard.press("Space");
await page.keyboard.press("ArrowDown");
await saved("Bo", () => page.keyboard.press("Enter"));
for (const copy of ["Ada", "Bo"])
    assert.equal(await textOf(copy, "Route"), "By night train");
assert.equal(await page.evaluate(() => document.activeElement.id), "merge");

// Everything that can be used is reached by Tab, and shows it.
const usable = "main button:enabled, main textarea, main input";
const reached = new Set();
await page.evaluate(() => document.activeElement.blur());
for (let presses = 0; presses < 40; ++presses) {
    await page.keyboard.press("Tab");
    reached.add(await page.evaluate((selector) => {
        const now = document.activeElement;
        const isSeen = getComputedStyle(now).outlineStyle !== "none";
        return isSeen ? [...document.querySelectorAll(selector)].indexOf(now) : -1;
    }, usable));
}
reached.delete(-1);
assert.equal(reached.size, await page.locator(usable).count(), "everything is reached, and seen to be");
console.log(`all ${reached.size} controls are reached by Tab`);

// Light and dark, wide and at 400 pixels, where nothing sticks out.
for (const colorScheme of ["light", "dark"])
    for (const width of [1100, 400]) {
        await page.emulateMedia({ colorScheme });
        await page.setViewportSize({ width, height: 900 });
        assert.ok(await page.evaluate(() => document.documentElement.scrollWidth <= innerWidth), `fits ${width} pixels`);
        await page.screenshot({ path: join(screenshots, `${colorScheme}-${width}.png`), fullPage: true });
    }
await page.setViewportSize({ width: 1100, height: 900 });

// Reloads while versions are made and saved.
const random = (below) => Math.floor(Math.random() * below);
for (let count = 1; count <= Number(reloads); ++count) {
    for (let edits = random(4); edits >= 0; --edits) {
        const copy = ["Ada", "Bo"][random(2)];
        await area(copy, "Title").fill(`Reload ${count}, ${edits} to go, ${random(1000)}`);
        await (random(2) === 0 ? area(copy, "Title").blur() : page.keyboard.press("Control+z"));
    }
    await page.waitForTimeout(random(40));
    await page.reload();
    await ready();
    for (const copy of ["Ada", "Bo"]) {
        const { ids, heads } = await stored(copy);
        const there = new Set(ids);
        for (const id of [...published[copy], ...Object.values(heads)])
            assert.ok(there.has(id), `${copy}'s version ${id} is there after reload ${count}`);
    }
}
const versions = published.Ada.length + published.Bo.length;
assert.deepEqual(complaints, []);
console.log(`${reloads} reloads at random moments, ${versions} times a version was saved, none was lost`);

// A damaged store is reported, and not used.
const damaged = (await stored("Ada")).heads.newest;
await page.evaluate(async (id) => {
    const { Store } = await import("./store.js");
    await (await Store.open("two-copies-Ada")).write([{ id, bytes: Uint8Array.of(1, 2, 3) }], []);
}, damaged);
await page.reload();
await page.waitForSelector("html[data-state=broken]");
assert.match(await page.textContent("#problem"), new RegExp(`${damaged} is damaged`));
console.log("a damaged version is noticed");

await browser.close();
server.close();
await rm(profile, { recursive: true });
