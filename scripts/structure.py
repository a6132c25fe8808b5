"""What lint.sh runs to keep the house in order; finds its files from the project's directory.

Every include points from a room to itself or to one that it stands on, and every public header compiles alone. Prints the
lines that do not, and fails if there are any; then prints how much of the code is tests, and fails above a third.
"""

import concurrent.futures
import os
import pathlib
import re
import subprocess
import sys

# The rooms and what each stands on; it may include whatever those may include.
STANDS_ON = {
    "foundation": (),
    "identifiers": ("foundation",),
    "objects": ("identifiers",),
    "interface": ("identifiers",),
    "tree": ("objects", "interface"),
    "merge": ("tree", "interface"),
    "commit": ("tree",),
    "storage": ("commit",),
    "repository": ("storage", "merge"),
    "core": ("repository",),
    "archive": ("core",),
    "examples": ("archive",),
    "bench": ("archive",),
    "bindings": ("core",),
    "fuzz": ("archive",),
    "tests": ("archive",),
}
# The public headers of the core, whose directory does not say which room they are in.
HEADERS = {
    "foundation": ("Foundation",),
    "identifiers": ("SHADigest256", "Id", "detail/Published", "detail/PublishedWord"),
    "objects": ("Object", "Helpers", "Blob", "detail/CachedId", "detail/KeptForm", "detail/ObjectTable"),
    "interface": ("IRepository",),
    "tree": ("Tree", "CommitTree", "Differences", "PortablePaths", "detail/DigestTrail", "detail/EntryTable"),
    "merge": ("Merge", "Conflicts"),
    "commit": ("Commit", "History", "detail/DeferredLinks"),
    "storage": ("Storage", "ShortIds"),
    "repository": ("Repository", "MergeOutcome"),
    "core": ("KivVcs",),
}
ROOM_OF_HEADER = {f"include/KivVcs/{name}.h": room for room, names in HEADERS.items() for name in names}
# They time and fuzz code that the library does not show.
MEASURE_HIDDEN_CODE = ("bench/speed.cpp", "fuzz/lanes.cpp")
CODE = ("include", "src", "archive", "bindings", "examples", "bench", "fuzz", "tests")
COUNTED = ("include", "src", "archive", "examples", "fuzz", "tests")
INCLUDE = re.compile(r'\s*#\s*include\s*["<]([^">]+)[">]')


def sources(*directories):
    for directory in directories:
        yield from sorted(path.as_posix() for suffix in ("h", "cpp") for path in pathlib.Path(directory).rglob(f"*.{suffix}"))


def room_of(path):
    if path.startswith(("include/KivPlatform/", "include/KivUtils/")):
        return "foundation"
    if path.startswith("include/KivArchive/"):
        return "archive"
    if path.startswith("src/"):
        return path.split("/")[1]
    return ROOM_OF_HEADER.get(path) if path.startswith("include/") else path.split("/")[0]


def rooms_below(room):
    below = {room}
    for other in STANDS_ON[room]:
        below |= rooms_below(other)
    return below


def included_file(including, name):
    """Where an include leads to in this project; nothing for what is not ours."""
    top = including.split("/")[0]
    for directory in (pathlib.Path(including).parent, "include", "src", top):
        path = os.path.normpath(f"{directory}/{name}")
        if os.path.isfile(path):
            return path
    return None


def objection(including, included):
    """Why a file may not include another one; nothing if it may."""
    room, other = room_of(including), room_of(included)
    if room is None or room not in STANDS_ON:
        return f"{including} is in no room; scripts/structure.py lists them"
    if other not in rooms_below(room):
        return f"{room} does not stand on {other}"
    if including.startswith("include/") and not included.startswith("include/"):
        return "a public header includes a private one"
    if room == "tests" or room == other or including in MEASURE_HIDDEN_CODE:
        return None
    if not including.startswith(("include/KivVcs/", "src/")) and (included.startswith("src/") or "/detail/" in included):
        return f"{room} uses public headers only"
    return None


def upward_includes():
    for path in sources(*CODE):
        with open(path, encoding="utf-8") as lines:
            for number, line in enumerate(lines, 1):
                match = INCLUDE.match(line)
                included = included_file(path, match[1]) if match else None
                problem = objection(path, included) if included else None
                if problem:
                    yield f"{path}:{number}: {line.strip()}: {problem}"


def compile_alone(header):
    compiler = [os.environ.get("CXX", "c++"), "-std=c++20", "-Wall", "-Wextra", "-Werror", "-Iinclude", "-fsyntax-only"]
    result = subprocess.run([*compiler, "-x", "c++", "-"], input=f'#include "{header.removeprefix("include/")}"\n',
                            capture_output=True, text=True)
    message = next((line for line in result.stderr.split("\n") if "error:" in line), result.stderr)
    return None if result.returncode == 0 else f"{header} does not compile alone: {message}"


def code_lines(path):
    with open(path, encoding="utf-8") as lines:
        return sum(1 for line in lines if line.strip() and not line.lstrip().startswith("//"))


def main():
    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        headers = [header for header in sources("include") if header.endswith(".h")]
        findings = [*upward_includes(), *filter(None, pool.map(compile_alone, headers))]
    for finding in findings:
        print(finding, file=sys.stderr)
    tests = sum(map(code_lines, sources("tests", "fuzz")))
    everything = sum(map(code_lines, sources(*COUNTED)))
    print(f"{tests / everything:.1%} of the code is tests: {tests} of {everything} lines")
    if 3 * tests > everything:
        print("more than a third", file=sys.stderr)
    return 1 if findings or 3 * tests > everything else 0


sys.exit(main())
