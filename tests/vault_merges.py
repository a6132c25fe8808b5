"""usage: vault_merges.py VAULT COUNT SEED|random

Merges COUNT random pairs of directories that disagree in every way, and judges the result path by path: what only one side
changed is taken over, what both changed alike is there once, and whatever else happens to a path is named.
"""

import json
import os
import random
import shutil
import stat
import subprocess
import sys

VAULT = sys.argv[1]
NAMES = ["a", "b", "c", "ä", "\udcff"]


def fill(generator, path, depth=0):
    """Makes a random directory."""
    os.mkdir(path)
    for name in generator.sample(NAMES, generator.randint(0, 3)):
        change(generator, os.path.join(path, name), depth)


def change(generator, path, depth):
    """Makes a path anything else."""
    if os.path.islink(path) or os.path.isfile(path):
        os.unlink(path)
    elif os.path.isdir(path):
        shutil.rmtree(path)
    kind = generator.randint(0, 6)
    if kind <= 2:
        with open(path, "w", encoding="utf-8") as file:
            file.write(generator.choice(["one\n", "two\n", ""]))
        os.chmod(path, generator.choice([0o644, 0o755, 0o600]))
    elif kind == 3:
        os.symlink(generator.choice(["one", "two"]), path)
    elif kind <= 5 and depth < 2:
        fill(generator, path, depth + 1)


def disturb(generator, path, depth=0):
    """Changes a directory here and there."""
    for name in NAMES:
        inner = os.path.join(path, name)
        if os.path.isdir(inner) and not os.path.islink(inner) and generator.random() < 0.7:
            disturb(generator, inner, depth + 1)
        elif generator.random() < 0.35:
            change(generator, inner, depth)
        elif os.path.isfile(inner) and not os.path.islink(inner) and generator.random() < 0.2:
            os.chmod(inner, generator.choice([0o644, 0o755, 0o600]))


def look(path, found=None, prefix=""):
    """What is at each path: a kind, and the parts that merge by themselves."""
    found = {} if found is None else found
    for name in os.listdir(path):
        inner = os.path.join(path, name)
        status = os.lstat(inner)
        if stat.S_ISDIR(status.st_mode):
            found[prefix + name] = ("directory", None, stat.S_IMODE(status.st_mode))
            look(inner, found, prefix + name + "/")
        elif stat.S_ISLNK(status.st_mode):
            found[prefix + name] = ("link", os.readlink(inner), None)
        else:
            with open(inner, encoding="utf-8") as file:
                found[prefix + name] = ("file", file.read(), stat.S_IMODE(status.st_mode))
    return found


def run(*arguments, accepted=(0,)):
    result = subprocess.run([VAULT, *arguments], capture_output=True, check=False)
    if result.returncode not in accepted:
        sys.exit(f"{arguments} ended with {result.returncode}: {os.fsdecode(result.stdout + result.stderr)}")
    return result


def judge(base, left, right, merged, named):
    """Complaints about a merge; `named` are the paths of conflicts."""
    for path in sorted(base.keys() | left.keys() | right.keys() | merged.keys()):
        if any(path == one or path.startswith(one + "/") or one.startswith(path + "/") for one in named):
            continue
        b, l, r, m = (tree.get(path) for tree in (base, left, right, merged))
        expected = r if l == b else l
        if l != b and r != b and l != r:
            if "directory" in (entry and entry[0] for entry in (l, r)):
                continue
            is_kind_kept = b and l and r and b[0] == l[0] == r[0]
            if not is_kind_kept or any(x != z and y != z and x != y for x, y, z in zip(l, r, b)):
                yield f"{path!r}: {b} became {l} and {r}, unnamed, and is {m}"
                continue
            expected = tuple(y if x == z else x for x, y, z in zip(l, r, b))
        if expected and expected[0] == "directory":
            if not m or m[0] != "directory":
                # A directory goes with its last entry if the other side removed it.
                if all(entry for entry in (l, r)) or m:
                    yield f"{path!r}: a directory is {m}"
        elif not expected and m and m[0] == "directory" and any(one.startswith(path + "/") for one in merged):
            # What the other side put into a directory keeps it.
            continue
        elif m != expected:
            yield f"{path!r}: {b} became {l} and {r}, and is {m}"


def main():
    count = int(sys.argv[2])
    seed = random.randrange(1 << 30) if sys.argv[3] == "random" else int(sys.argv[3])
    conflicts = 0
    for number in range(count):
        generator = random.Random(seed + number)
        for name in os.listdir("."):
            shutil.rmtree(name) if os.path.isdir(name) else os.unlink(name)
        fill(generator, "base")
        shutil.copytree("base", "left", symlinks=True)
        shutil.copytree("base", "right", symlinks=True)
        disturb(generator, "left")
        disturb(generator, "right")
        run("save", "base")
        run("branch", "side")
        run("save", "left")
        run("checkout", "side")
        run("save", "right")
        run("checkout", "master")
        policy = generator.choice(["left", "right"])
        told = json.loads(run("merge", "side", "--json", "--on-conflict", policy).stdout)
        named = [conflict["path"] for conflict in told["conflicts"] if conflict["taken"] != "combined"]
        conflicts += len(named)
        run("restore", "master", "merged")
        for complaint in judge(look("base"), look("left"), look("right"), look("merged"), named):
            sys.exit(f"seed {seed + number}, {policy}: {complaint}; named are {named}")
        run("verify")
    print(f"{count} pairs, {conflicts} conflicts, nothing vanished unnamed")


main()
