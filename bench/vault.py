#!/usr/bin/python3
"""usage: vault.py PROGRAM [--quick]

Runs the vault beside git, in turns, and prints one table: what was done, git, the vault, the ratio or the memory, and the limit.
Times are medians of five runs of each, of 41 where they are a few milliseconds, and of one with --quick. The vault is a copy of
PROGRAM, as an installed one is: what a linker has just written is in memory in smaller pieces, and starts more slowly.
"""

import os
import pathlib
import random
import shutil
import statistics
import subprocess
import sys
import tempfile
import time

PROGRAM = os.path.abspath(sys.argv[1])
IS_QUICK = "--quick" in sys.argv
workshop = tempfile.mkdtemp()
os.chdir(workshop)
VAULT = os.path.join(workshop, "vault")
ENVIRONMENT = dict(os.environ, VAULT_AUTHOR="Ada <ada@example.org>", GIT_CONFIG_GLOBAL="/dev/null", GIT_CONFIG_SYSTEM="/dev/null",
                   GIT_AUTHOR_NAME="Ada", GIT_AUTHOR_EMAIL="ada@example.org", GIT_COMMITTER_NAME="Ada",
                   GIT_COMMITTER_EMAIL="ada@example.org")
PEAK = "import resource, subprocess, sys; status = subprocess.call(sys.argv[1:], stdout=subprocess.DEVNULL); " \
       "print(resource.getrusage(resource.RUSAGE_CHILDREN).ru_maxrss); sys.exit(status)"


def run(*command, cwd=None):
    """Seconds that a program takes."""
    start = time.monotonic()
    result = subprocess.run(command, cwd=cwd, env=ENVIRONMENT, capture_output=True, check=False)
    if result.returncode != 0:
        sys.exit(f"{command} failed: {os.fsdecode(result.stderr)}")
    return time.monotonic() - start


def git(*arguments):
    return run("git", "-c", "gc.auto=0", *arguments, cwd="tree")


def vault(*arguments):
    return run(VAULT, "-f", "vault.db", *arguments)


def compare(what, limit, theirs, ours, rounds=5):
    """Both as functions that run once and give seconds; in turns."""
    times = [(theirs(), ours()) for _ in range(1 if IS_QUICK else rounds)]
    one, other = (statistics.median(column) for column in zip(*times))
    print(f"{what:<52}{one * 1e3:>10.1f} ms{other * 1e3:>10.1f} ms{other / one:>7.2f}{limit:>7}"
          f"{'' if other / one <= limit else '  OVER'}", flush=True)


def peak(what, limit, *arguments):
    """A small program starts the vault: what forks from a large one is counted as large as that."""
    result = subprocess.run([sys.executable, "-c", PEAK, VAULT, "-f", "vault.db", *arguments], env=ENVIRONMENT,
                            capture_output=True, check=True)
    mebibytes = int(result.stdout) / 1024
    print(f"{what:<52}{'':>13}{mebibytes:>9.1f} MiB{'':>7}{limit:>7}{'' if mebibytes <= limit else '  OVER'}", flush=True)


def make_tree(files):
    """Sources, as it were: short texts, forty to a directory. They are older than what may change unnoticed."""
    generator = random.Random(files)
    for number in range(files):
        path = pathlib.Path(f"tree/d{number // 400}/e{number // 40 % 10}/file{number}.txt")
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text("".join(f"line {generator.randrange(10 ** 6)} of {number}\n" for _ in range(generator.randrange(200))),
                        encoding="ascii")
        os.utime(path, (1700000000, 1700000000))


def begin(files):
    for path in ("tree", "vault.db", "vault.db-wal", "vault.db-shm"):
        shutil.rmtree(path, ignore_errors=True) if os.path.isdir(path) else pathlib.Path(path).unlink(missing_ok=True)
    make_tree(files)
    git("init", "-q")
    time.sleep(3)
    git("add", "-A")
    git("commit", "-qm", "first")
    vault("save", "tree", "-m", "first", "--exclude", ".git")


def edit(number):
    with open(f"tree/d0/e0/file{number % 40}.txt", "a", encoding="ascii") as file:
        file.write(f"edit {number}\n")


def edit_and(save, counter=iter(range(10 ** 6))):
    edit(next(counter))
    return save()


def restore(program):
    shutil.rmtree("restored", ignore_errors=True)
    return program()


def main():
    print(f"{'':<52}{'git':>13}{'vault':>13}{'ratio':>7}{'limit':>7}")
    for files, limit in ((8000, 1.0), (20000, 1.2)):
        begin(files)
        compare(f"save with nothing changed, {files:,} files", limit, lambda: git("status"),
                lambda: vault("save", "tree", "--exclude", ".git"))
    compare("save with one of 20,000 files changed", 0.75, lambda: edit_and(lambda: git("add", "-A") + git("commit", "-qm", "edit")),
            lambda: edit_and(lambda: vault("save", "tree", "--exclude", ".git")))
    git("gc", "-q")
    compare("restore into an empty directory", 0.8,
            lambda: restore(lambda: git("worktree", "prune") + git("worktree", "add", "-fq", "--detach", "../restored", "HEAD")),
            lambda: restore(lambda: vault("restore", "master", "restored")))
    begin(2000)
    for number in range(300):
        edit(number)
        git("commit", "-qam", f"edit {number}")
        vault("save", "tree", "-m", f"edit {number}", "--exclude", ".git")
    git("gc", "-q")
    compare("log of 300 versions", 1.0, lambda: git("log"), lambda: vault("log"), rounds=41)
    log = subprocess.run([VAULT, "-f", "vault.db", "log"], capture_output=True, check=True).stdout.decode()
    first = log.splitlines()[-1].split()[0]
    compare("diff of the first and the last", 1.0, lambda: git("diff", "--name-status", "HEAD~300", "HEAD"),
            lambda: vault("diff", first, "master"), rounds=41)
    views = (("branch",), ("log",), ("graph",), ("diff", first, "master"))
    for number in range(300, 2000):
        edit(number)
        vault("save", "tree", "-m", f"edit {number}", "--exclude", ".git")
    for command in views:
        peak(f"{command[0]} beside 2,000 versions: memory", 30, *command)
    shutil.rmtree("restored", ignore_errors=True)
    os.mkdir("large")
    with open("large/file", "wb") as file:
        for seed in range(300):
            file.write(random.Random(seed).randbytes(1 << 20))
    peak("save of a file of 300 MB: memory", 100, "save", "large")
    peak("restore of it", 100, "restore", "master", "restored")
    peak("verify", 100, "verify")
    for command in views:
        peak(f"{command[0]} beside it", 30, *command)


shutil.copy(PROGRAM, VAULT)
try:
    main()
finally:
    os.chdir("/")
    shutil.rmtree(workshop, ignore_errors=True)
