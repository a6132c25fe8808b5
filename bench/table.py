"""usage: bench/table.py RESULT.json: the table of a run of the benchmarks, medians over its rounds."""

import json
import sys


def time(seconds):
    return f"{seconds * 1e3:.3f} ms" if seconds < 1 else f"{seconds:.3f} s"


def amount(count):
    return f"{count:.0f} B" if count < 1e5 else f"{count / 2**20:.1f} MiB"


with open(sys.argv[1], encoding="utf-8") as file:
    result = json.load(file)

rows = [("workload", "size", "floor", "ours", "ratio", "limit", "kept/op", "limit", "resident", "")]
missed = 0
for run in result["benchmarks"]:
    if run.get("aggregate_name") != "median":
        continue
    name, size = run["run_name"].split("/")[:2]
    bad = any(run[limit] > 0 and run[value] > run[limit] for value, limit in (("ratio", "ratioLimit"), ("bytes", "bytesLimit")))
    missed += bad
    rows.append((
        name, size, time(run["floor"]), time(run["ours"]),
        f"{run['ratio']:.2f}" if run["ratio"] else "-", f"{run['ratioLimit']:g}" if run["ratioLimit"] else "-",
        amount(run["bytes"]), amount(run["bytesLimit"]) if run["bytesLimit"] else "-", amount(run["resident"]),
        "MISSED" if bad else "ok",
    ))

widths = [max(map(len, column)) for column in zip(*rows)]
for row in rows:
    print("  ".join(cell.ljust(width) if index == 0 else cell.rjust(width) for index, (cell, width) in enumerate(zip(row, widths))))
print(f"{len(rows) - 1} rows, {missed} missed their limit")
