#!/usr/bin/python3
"""usage: compare.py DIRECTORY [--quick]

Runs the benchmarks in DIRECTORY on a database of their own, with its files on disk, beside bare transactions and archives in
files, and prints one table: what was done, what it is compared with, the archive, the ratio and the limit. Medians of five
runs, of one with --quick.
"""

import os
import shutil
import statistics
import subprocess
import sys
import tempfile
import time

BENCH = sys.argv[1]
QUICK = "--quick" in sys.argv
ROUNDS = 1 if QUICK else 5
SECONDS = 2 if QUICK else 5
CLIENTS = 8
TREE = "/usr/include/c++" if QUICK else "/usr/include"
COMMITS = 10000 if QUICK else 100000
MEMORY = "/dev/shm" if os.path.isdir("/dev/shm") else None
SCRIPT = os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../scripts/postgres.sh")


class Database:
    """A new cluster, as long as it is used."""

    def __init__(self, parent, name):
        self.directory = os.path.join(parent, name)

    def __enter__(self):
        started = subprocess.run([SCRIPT, "start", self.directory], capture_output=True, check=True, text=True)
        return started.stdout.strip()

    def __exit__(self, *_):
        subprocess.run([SCRIPT, "stop", self.directory], check=True)


def run(program, *arguments):
    return subprocess.run([os.path.join(BENCH, program), *map(str, arguments)], capture_output=True, check=True, text=True).stdout


def together(command, address, last, names=range(CLIENTS)):
    """The numbers that processes print, one for each name, which begin at once when all are ready."""
    processes = [subprocess.Popen([os.path.join(BENCH, "kivvcs_team_bench"), command, address, str(name), str(last)],
                                  stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True) for name in names]
    if any([process.stdout.readline() != "ready\n" for process in processes]):
        sys.exit(f"failed: {command}")
    for process in processes:
        process.stdin.write("\n")
        process.stdin.flush()
    outputs = [process.communicate()[0] for process in processes]
    if any(process.returncode != 0 for process in processes):
        sys.exit(f"failed: {command}")
    return [float(output) for output in outputs]


def row(what, theirs, ours, ratio, limit, is_least=False):
    over = "" if limit is None or (ratio >= limit if is_least else ratio <= limit) else "  OVER"
    bound = "" if limit is None else (">" if is_least else "<") + format(limit, "g")
    print(f"{what:<52}{theirs:>16}{ours:>16}{ratio:>8.2f}{bound:>7}{over}", flush=True)


def medians(*functions):
    """Each run ROUNDS times, in turns."""
    results = [[function(number) for function in functions] for number in range(ROUNDS)]
    return [statistics.median(column) for column in zip(*results)]


def seconds_of(function):
    start = time.monotonic()
    function()
    return time.monotonic() - start


def rates(address):
    bare, ours = medians(*(lambda n, command=command: together(command, address, SECONDS, [f"one{n}"])[0]
                           for command in ("bare", "edits")))
    row("publish one small edit, one client", f"{bare:.0f}/s", f"{ours:.0f}/s", ours / bare, 0.5, True)
    return bare


def own_branches(parent):
    def fresh(command):
        def measure(number):
            with Database(parent, f"{command}{number}") as address:
                together("edits", address, 0, ["first"])
                return sum(together(command, address, SECONDS))
        return measure

    bare, ours = medians(fresh("bare"), fresh("edits"))
    row(f"{CLIENTS} processes on branches of their own", f"{bare:.0f}/s", f"{ours:.0f}/s", ours / bare, 0.5, True)


def one_branch(parent):
    edits = 10 if QUICK else 50
    with Database(parent, "merging") as address:
        attempts = sum(together("merging", address, edits)) / (CLIENTS * edits)
        files = int(run("kivvcs_team_bench", "files", address))
    row(f"{CLIENTS} processes on one branch: attempts", "1", f"{attempts:.2f}", attempts, 4)
    row("    edits in the final version", str(CLIENTS * edits), str(files), files / (CLIENTS * edits), 1, True)


def listing(parent):
    with Database(parent, "listing") as address:
        run("kivvcs_postgres_bench", "commits", address, COMMITS)
        empty, ours = (float(run("kivvcs_team_bench", *command)) * 1e3
                       for command in (("ping", address), ("list", address, 20)))
    row(f"open and list 20 of {COMMITS} commits, above nothing", f"{empty:.1f} ms", f"{ours:.1f} ms", ours - empty, 50)


def trees(parent, memory):
    copy, file, near = (os.path.join(parent, name) for name in ("copy", "file.kiv", "near.kiv"))
    # Writing many files to a disk takes one to five seconds, whoever does it.
    target = os.path.join(memory, "target")
    shutil.copytree(TREE, copy, symlinks=True, ignore=lambda at, names: [n for n in names if os.path.islink(os.path.join(at, n))])
    # Directories of nothing but links, which no version has.
    for at, _, _ in os.walk(copy, topdown=False):
        if not os.listdir(at):
            os.rmdir(at)

    def to_file(_):
        for suffix in ("", "-wal", "-shm"):
            if os.path.exists(file + suffix):
                os.unlink(file + suffix)
        return seconds_of(lambda: run("kivvcs_archive_bench", "import", file, copy))

    def to_database(number):
        with Database(parent, f"import{number}") as address:
            return seconds_of(lambda: run("kivvcs_postgres_bench", "import", address, copy))

    theirs, ours = medians(to_file, to_database)
    row(f"publish {TREE} the first time", f"{theirs:.2f} s", f"{ours:.2f} s", ours / theirs, 2)

    def restored(program, archive):
        shutil.rmtree(target, ignore_errors=True)
        return seconds_of(lambda: run(program, "restore", archive, target))

    with Database(parent, "restore") as address:
        run("kivvcs_postgres_bench", "import", address, copy)
        restored("kivvcs_postgres_bench", f"{near}+{address}")
        theirs, ours = medians(lambda _: restored("kivvcs_archive_bench", file),
                               lambda _: restored("kivvcs_postgres_bench", f"{near}+{address}"))
    if subprocess.run(["diff", "-rq", copy, target], check=False).returncode != 0:
        sys.exit("what was restored differs")
    row("restore it to memory with a warm cache", f"{theirs:.2f} s", f"{ours:.2f} s", ours / theirs, 1.2)


def main():
    print(f"{os.cpu_count()} processors, load {os.getloadavg()[0]:.1f}, server and clients on one machine")
    print(f"{'':<52}{'beside':>16}{'database':>16}{'ratio':>8}{'limit':>7}")
    with tempfile.TemporaryDirectory(prefix="kiv-bench-") as parent:
        # The server may run as somebody else.
        os.chmod(parent, 0o711)
        with Database(parent, "rates") as address:
            rates(address)
        own_branches(parent)
        one_branch(parent)
        listing(parent)
        with tempfile.TemporaryDirectory(prefix="kiv-bench-", dir=MEMORY) as memory:
            trees(parent, memory)


main()
