"""usage: bench/plot.py RESULT.json PLOT.svg: the ratios of a run of the benchmarks over the sizes, with their limits."""

import collections
import json
import sys

import matplotlib

matplotlib.use("svg")
import matplotlib.pyplot as plot  # noqa: E402

# Colours that show on a light and on a dark page; the background is the page's.
ink, ours, limit = "#808890", "#2f81f7", "#d9534f"
plot.rcParams.update({
    "svg.hashsalt": "performance", "svg.fonttype": "none", "font.size": 8, "axes.titlesize": 8, "axes.edgecolor": ink,
    "text.color": ink, "axes.titlecolor": ink, "axes.labelcolor": ink, "xtick.color": ink, "ytick.color": ink,
})

with open(sys.argv[1], encoding="utf-8") as file:
    runs = [run for run in json.load(file)["benchmarks"] if run.get("aggregate_name") == "median"]
panels = collections.defaultdict(list)
for run in runs:
    name, size = run["run_name"].split("/")[:2]
    if run["ratioLimit"]:
        panels[name].append((int(size), run["ratio"], run["ratioLimit"]))
panels = {name: sorted(points) for name, points in panels.items() if len(points) > 1}

columns = 4
lines = -(-len(panels) // columns)
figure, axes = plot.subplots(lines, columns, figsize=(3 * columns, 2 * lines), squeeze=False)
for axis, (name, points) in zip(axes.flat, panels.items()):
    sizes, ratios, limits = zip(*points)
    axis.set_title(name)
    axis.set_xscale("log")
    axis.set_xticks(sizes, [f"{size:,}" for size in sizes])
    axis.minorticks_off()
    axis.plot(sizes, ratios, color=ours, marker="o", markersize=4)
    axis.axhline(limits[0], color=limit, linestyle="--", linewidth=1)
    axis.set_ylim(0, 1.15 * max(*ratios, limits[0]))
    axis.patch.set_alpha(0)
for axis in axes.flat[len(panels):]:
    axis.set_visible(False)
figure.suptitle("time over the floor's time, by size; dashed: at most", color=ink)
figure.tight_layout()
figure.savefig(sys.argv[2], transparent=True, metadata={"Date": None})
