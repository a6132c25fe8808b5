"""usage: bench/table.py RESULT.json: the table of a run of the benchmarks, medians over its rounds."""

import json
import sys


def time(seconds):
    if seconds < 1e-3:
        return f"{seconds * 1e6:.2f} us"
    return f"{seconds * 1e3:.2f} ms" if seconds < 1 else f"{seconds:.2f} s"


def amount(count):
    return f"{count:.0f} B" if count < 1e5 else f"{count / 2**20:.1f} MiB"


def limited(value, limit, text):
    """The two cells of a value and its limit."""
    return text(value) if value else "-", text(limit) if limit else "-"


with open(sys.argv[1], encoding="utf-8") as file:
    runs = [run for run in json.load(file)["benchmarks"] if run.get("aggregate_name") == "median"]

rows = [("workload", "size", "floor", "ours", "ratio", "at most", "contender", "", "ours to it", "at most", "growth", "at most", "kept/op", "at most", "resident/op", "")]
missed = 0
smaller = {}
for run in runs:
    name, size = run["run_name"].split("/")[:2]
    values = {"ratio": run["ratio"], "versus": run["versus"], "bytes": run["bytes"], "growth": 0}
    for smaller_size, seconds in smaller.setdefault(name, []):
        if abs(int(size) / smaller_size - 4) < 0.1:
            values["growth"] = run["ours"] / seconds
    smaller[name].append((int(size), run["ours"]))
    bad = any(run[f"{kind}Limit"] and value > run[f"{kind}Limit"] for kind, value in values.items())
    missed += bad
    rows.append((
        name, size, time(run["floor"]) if run["floor"] else "-", time(run["ours"]),
        *limited(values["ratio"], run["ratioLimit"], "{:.2f}".format),
        run.get("label", "") if run["contender"] else "", time(run["contender"]) if run["contender"] else "-",
        *limited(values["versus"], run["versusLimit"], "{:.2f}".format),
        *limited(values["growth"], run["growthLimit"], "{:.1f}".format),
        *limited(values["bytes"], run["bytesLimit"], amount),
        amount(run["resident"]) if run["resident"] else "-", "MISSED" if bad else "",
    ))

widths = [max(map(len, column)) for column in zip(*rows)]
for row in rows:
    cells = (cell.rjust(width) if index else cell.ljust(width) for index, (cell, width) in enumerate(zip(row, widths)))
    print("  ".join(cells).rstrip())
print(f"{len(runs)} rows, {missed} missed a limit")
