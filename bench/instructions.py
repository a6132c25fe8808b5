"""usage: bench/instructions.py DUMPS BASELINE TOOLS [--update]

Compares the instructions that the dumps in the directory DUMPS counted, one for each workload, with those that the file
BASELINE keeps, and ends with 1 if one has grown beyond the tolerance; --update writes BASELINE instead. TOOLS says what
built and counted. What the compression function of SHA-256 takes is counted apart: it would hide everything else, and it is
another one where the counting machine knows the processor's instructions for it. What compresses several messages at once
is not counted: there are several ways, and the counting machine does not have them all.
"""

import json
import pathlib
import re
import sys

tolerance = 0.02
portable_compression = "Sha256::CompressPortably"
vector_compression = "::CompressEightLanes"
trigger = "desc: Trigger: Client Request: "


def counts_of(dump):
    """The workload's name and its instructions, by kind."""
    workload, functions, function, follows_call = None, {}, None, False
    counts = {"hashing": 0, "rest": 0}
    for line in dump.read_text(encoding="utf-8").splitlines():
        if line.startswith(trigger):
            workload = line.removeprefix(trigger)
        elif match := re.match(r"c?fn=\((\d+)\)(?: (.*))?", line):
            number, name = match.groups()
            if name:
                functions[number] = name
            if line.startswith("fn="):
                function = functions[number]
        elif line.startswith("calls="):
            follows_call = True
        elif re.match(r"[\d+*-]", line):
            if not follows_call and vector_compression not in function:
                counts["hashing" if portable_compression in function else "rest"] += int(line.split()[1])
            follows_call = False
    return workload, counts


def compare(name, then, now):
    """What there is to say about a workload, and whether it is a failure."""
    if then is None:
        return f"{name}: not in the baseline", True
    for kind in ("rest", "hashing"):
        if kind == "hashing" and not (then[kind] and now[kind]):
            continue
        growth = now[kind] / max(then[kind], 1) - 1
        if abs(growth) > tolerance:
            what = "instructions" + (" of hashing" if kind == "hashing" else "")
            return f"{name}: {then[kind]:,} {what} became {now[kind]:,} ({growth:+.1%})", growth > 0
    return None, False


directory, baseline, tools = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2]), sys.argv[3]
workloads = dict(sorted(filter(lambda counted: counted[0], map(counts_of, directory.iterdir()))))
if sys.argv[4:] == ["--update"]:
    baseline.write_text(json.dumps({"tools": tools, "workloads": workloads}, indent=1) + "\n", encoding="utf-8")
    sys.exit()

stored = json.loads(baseline.read_text(encoding="utf-8"))
if stored["tools"] != tools:
    print(f"The baseline was counted with {stored['tools']}; here are {tools}.")
failed = set(stored["workloads"]) - set(workloads)
for name in sorted(failed):
    print(f"{name}: not counted")
for name, counts in workloads.items():
    text, bad = compare(name, stored["workloads"].get(name), counts)
    if text:
        print(text)
    if bad:
        failed.add(name)
print(f"{len(workloads)} workloads, {len(failed)} of them worse than the baseline by more than {tolerance:.0%}")
sys.exit(1 if failed else 0)
