#!/usr/bin/python3
"""usage: compare.py PROGRAM [--quick] [ROWS...]

Runs kivvcs_archive_bench beside git, in turns, and prints one table: what was done, git, the archive, the ratio and the
limit that docs/archive.md sets. Times are medians of five runs (of one with --quick), of 41 for log and diff, which take
milliseconds; sizes are sums of file sizes. ROWS are some of the groups that ALL_ROWS names; all of them unless given.
"""

import os
import random
import shutil
import statistics
import subprocess
import sys
import tempfile
import time

PROGRAM = sys.argv[1]
QUICK = "--quick" in sys.argv
ROUNDS = 1 if QUICK else 5
# Commands that take milliseconds vary by more than five of them show.
ROUNDS_OF_SHORT = 5 if QUICK else 41
TREE = "/usr/include"
PEAK = os.path.join(tempfile.gettempdir(), f"archive-bench-peak-{os.getpid()}")
ENVIRONMENT = dict(os.environ, GIT_CONFIG_GLOBAL="/dev/null", GIT_CONFIG_SYSTEM="/dev/null", GIT_AUTHOR_NAME="Ada",
                   GIT_AUTHOR_EMAIL="ada@example.org", GIT_COMMITTER_NAME="Ada", GIT_COMMITTER_EMAIL="ada@example.org",
                   # It would go on in the background while files are moved.
                   GIT_CONFIG_COUNT="1", GIT_CONFIG_KEY_0="gc.auto", GIT_CONFIG_VALUE_0="0")


class Run:
    """A finished program: seconds of wall clock and of processor, most memory in MiB if that is asked for, output."""

    def __init__(self, *command, data=None, cwd=None, peak=False):
        with tempfile.TemporaryFile() as source, tempfile.TemporaryFile() as output:
            if data is not None:
                source.write(data)
                source.seek(0)
            start = time.monotonic()
            process = subprocess.Popen(command, cwd=cwd, stdin=source, stdout=output,
                                       env=dict(ENVIRONMENT, ARCHIVE_BENCH_PEAK=PEAK) if peak else ENVIRONMENT,
                                       stderr=subprocess.DEVNULL if command[0] == "git" else None)
            _, status, usage = os.wait4(process.pid, 0)
            self.seconds = time.monotonic() - start
            process.returncode = os.waitstatus_to_exitcode(status)
            if process.returncode != 0:
                sys.exit(f"failed: {' '.join(command)}")
            self.processor = usage.ru_utime + usage.ru_stime
            # The kernel's own count would include this program, which the other one was forked from.
            self.memory = 0.0
            if os.path.exists(PEAK):
                with open(PEAK, encoding="ascii") as file:
                    self.memory = float(file.read())
                os.unlink(PEAK)
            output.seek(0)
            self.output = output.read().decode(errors="replace")


def archive(command, path, *arguments, data=None, peak=False):
    return Run(PROGRAM, command, path, *map(str, arguments), data=data, peak=peak)


def git(directory, *arguments, data=None):
    return Run("git", *arguments, cwd=directory, data=data)


def size_of(path):
    """The bytes of a file and of what SQLite keeps beside it, or of all files of a directory."""
    if os.path.isdir(path):
        return sum(os.path.getsize(os.path.join(at, name)) for at, _, names in os.walk(path) for name in names)
    return sum(os.path.getsize(path + suffix) for suffix in ("", "-wal", "-shm") if os.path.exists(path + suffix))


def median(values):
    return statistics.median(values)


def number_of(output, name):
    return float(output.split(name + "=")[1].split()[0])


def row(what, theirs, ours, ratio, limit):
    within = "" if ratio is None or limit is None else ("" if ratio <= limit else "  OVER")
    shown = "" if ratio is None else f"{ratio:.2f}"
    print(f"{what:<58}{theirs:>16}{ours:>16}{shown:>8}{'' if limit is None else format(limit, 'g'):>7}{within}", flush=True)


def seconds(value):
    return f"{value:.3f} s" if value >= 1 else f"{value * 1e3:.1f} ms"


def mebibytes(value):
    return f"{value / 1048576:.2f} MiB"


def compare_times(what, theirs, ours, limit, starts=None):
    """Both as functions that run once; in turns. With @p starts, which only start the programs, also without that, and
    more often: such commands are short."""
    rounds = ROUNDS_OF_SHORT if starts else ROUNDS
    runs = [(theirs(), ours(), *(start() for start in starts or ())) for _ in range(rounds)]
    one, other = median([run[0].seconds for run in runs]), median([run[1].seconds for run in runs])
    row(what, seconds(one), seconds(other), other / one, limit)
    one, other = median([run[0].processor for run in runs]), median([run[1].processor for run in runs])
    row("    of it on the processor", seconds(one), seconds(other), other / one, None)
    if starts:
        one -= median([run[2].processor for run in runs])
        other -= median([run[3].processor for run in runs])
        row("    of that without starting the programs", seconds(one), seconds(other), other / one, None)
    return [run[1] for run in runs]


def fast_import(versions):
    """Versions, each a list of paths and bytes, as git's fast-import reads them and as kivvcs_archive_bench does."""
    theirs, ours = [], []
    for number, files in enumerate(versions):
        theirs.append(b"commit refs/heads/master\ncommitter Ada <ada@example.org> 1700000000 +0100\n")
        message = f"version {number}".encode()
        theirs.append(b"data %d\n%s\n" % (len(message), message))
        for path, data in files:
            theirs.append(b"M 100644 inline %s\ndata %d\n%s\n" % (path.encode(), len(data), data))
            ours.append(b"F %s %d\n%s" % (path.encode(), len(data), data))
        ours.append(b"C\n")
    return b"".join(theirs), b"".join(ours)


def some_lines(generator, count):
    words = [b"archive", b"branch", b"content", b"version", b"merge", b"parent", b"store", b"tree", b"while", b"return"]
    return [b" ".join(generator.choice(words) for _ in range(generator.randint(3, 12))) + b" %d" % generator.randint(0, 99999)
            for _ in range(count)]


def text_versions(count):
    generator = random.Random(1)
    lines = some_lines(generator, 36000)
    for _ in range(count):
        yield [("text.txt", b"\n".join(lines) + b"\n")]
        at = generator.randrange(len(lines))
        lines[at:at + generator.randint(0, 2)] = some_lines(generator, generator.randint(1, 3))


def source_versions(count):
    generator = random.Random(2)
    files = {}
    for at, directories, names in os.walk("/usr/include/c++"):
        directories.sort()
        for name in sorted(names):
            with open(os.path.join(at, name), "rb") as file:
                files[os.path.relpath(os.path.join(at, name), "/usr/include")] = file.read().split(b"\n")
    yield [(path, b"\n".join(lines)) for path, lines in sorted(files.items())]
    for _ in range(count - 1):
        edited = generator.sample(sorted(files), generator.randint(1, 6))
        for path in edited:
            lines = files[path]
            at = generator.randrange(len(lines) + 1)
            lines[at:at + generator.randint(0, 3)] = some_lines(generator, generator.randint(1, 5))
        yield [(path, b"\n".join(files[path])) for path in sorted(edited)]


def first_save(directory):
    copy = os.path.join(directory, "include")
    shutil.copytree(TREE, copy, symlinks=True)
    # Neither side is asked for links and empty directories.
    for at, directories, names in os.walk(copy, topdown=False):
        for name in directories + names:
            if os.path.islink(os.path.join(at, name)):
                os.unlink(os.path.join(at, name))
        if not os.listdir(at):
            os.rmdir(at)
    store, repository = os.path.join(directory, "include.kiv"), os.path.join(copy, ".git")

    class Both:
        def __init__(self, *runs):
            self.seconds = sum(run.seconds for run in runs)
            self.processor = sum(run.processor for run in runs)

    def theirs():
        shutil.rmtree(repository, ignore_errors=True)
        git(copy, "init", "-q", "-b", "master")
        os.sync()
        return Both(git(copy, "add", "-A"), git(copy, "commit", "-q", "-m", "import"))

    kept = os.path.join(directory, "git")

    def ours():
        # git's directory is no part of what is saved.
        shutil.rmtree(kept, ignore_errors=True)
        os.rename(repository, kept)
        for suffix in ("", "-wal", "-shm"):
            if os.path.exists(store + suffix):
                os.unlink(store + suffix)
        os.sync()
        try:
            return archive("import", store, copy)
        finally:
            os.rename(kept, repository)

    compare_times("publish /usr/include the first time", theirs, ours, 0.3)
    before = size_of(repository)
    row("    size, against .git before gc", mebibytes(before), mebibytes(size_of(store)), size_of(store) / before, 0.8)
    git(copy, "gc", "-q")
    after = size_of(repository)
    row("    size, against .git after gc", mebibytes(after), mebibytes(size_of(store)), size_of(store) / after, 1.0)
    target = os.path.join(directory, "target")

    def emptied(run):
        shutil.rmtree(target, ignore_errors=True)
        os.mkdir(target)
        os.sync()
        return run()

    compare_times("restore it",
                  lambda: emptied(lambda: git(copy, "--work-tree", target, "checkout", "-q", "-f", "master", "--", ".")),
                  lambda: emptied(lambda: archive("restore", store, target)), 0.8)
    if subprocess.run(["diff", "-rq", "--exclude=.git", copy, target], check=False).returncode != 0:
        sys.exit("what was restored differs")


def many_versions(directory, what, versions, limit):
    theirs, ours = fast_import(versions)
    repository, store = os.path.join(directory, what), os.path.join(directory, what + ".kiv")
    os.mkdir(repository)
    git(repository, "init", "-q", "--bare", "-b", "master")
    git(repository, "fast-import", "--quiet", data=theirs)
    git(repository, "gc", "-q", "--prune=now")
    archive("versions", store, data=ours)
    one, other = size_of(repository), size_of(store)
    row(f"size after 300 versions of a {what}", mebibytes(one), mebibytes(other), other / one, limit)


def history(directory):
    count = 500 if QUICK else 2000
    theirs, ours = fast_import([("d%d/f%d" % (i % 10, i % 200), b"content %d" % i)] for i in range(count))
    repository, store = os.path.join(directory, "history"), os.path.join(directory, "history.kiv")
    os.mkdir(repository)
    git(repository, "init", "-q", "--bare", "-b", "master")
    git(repository, "fast-import", "--quiet", data=theirs)
    git(repository, "gc", "-q")
    archive("versions", store, data=ours)
    starts = (lambda: git(repository, "version"), lambda: archive("start", store))
    runs = compare_times(f"log of {count} versions", lambda: git(repository, "log", "--format=%H %s", "master"),
                         lambda: archive("log", store, count), 1.0, starts)
    theirs = git(repository, "rev-list", "master").output.split()
    ours = [line.split()[0] for line in runs[0].output.splitlines()]
    compare_times("diff of two of them", lambda: git(repository, "diff", "--name-status", theirs[-1], theirs[0]),
                  lambda: archive("diff", store, ours[-1], ours[0]), 1.0, starts)
    bound = 20 + 600 * count / 1048576
    memory = archive("log", store, count, peak=True).memory
    row("    memory of the log", f"< {bound:.1f} MiB", f"{memory:.1f} MiB", memory / bound, 1.0)


def million(directory):
    count = 50000 if QUICK else 1000000
    store = os.path.join(directory, "million.kiv")
    archive("commits", store, count)
    runs = [archive("log", store, 20) for _ in range(ROUNDS)]
    row(f"list the newest 20 of {count} commits", "30 ms", seconds(median([run.seconds for run in runs])),
        median([run.seconds for run in runs]) / 0.030, 1.0)
    memory = archive("log", store, 20, peak=True).memory
    row("    memory", "20 MiB", f"{memory:.1f} MiB", memory / 20, 1.0)


def large_content(directory):
    size = (30 if QUICK else 300) * 1048576
    path, store, target = (os.path.join(directory, name) for name in ("large", "large.kiv", "large.out"))
    generator = random.Random(3)
    with open(path, "wb") as file:
        for _ in range(size // 1048576):
            file.write(generator.randbytes(524288) + b"some text %d\n" % generator.randint(0, 9) * 47662)
        size = file.tell()
    stored = archive("store", store, path, peak=True)
    fetched = archive("fetch", store, target, peak=True)
    if subprocess.run(["cmp", path, target], check=False).returncode != 0:
        sys.exit("what was fetched differs")
    row(f"publish a file of {size // 1048576} MiB: time", "", seconds(stored.seconds), None, None)
    row("    memory", "64 MiB", f"{stored.memory:.1f} MiB", stored.memory / 64, 1.0)
    wal = number_of(stored.output, "wal_mib")
    row("    write-ahead log", "64 MiB", f"{wal:.1f} MiB", wal / 64, 1.0)
    row("restore it: time", "", seconds(fetched.seconds), None, None)
    row("    memory", "64 MiB", f"{fetched.memory:.1f} MiB", fetched.memory / 64, 1.0)


def edits(directory):
    count, times = (10000, 100) if QUICK else (100000, 2000)
    output = archive("directory", os.path.join(directory, "directory.kiv"), count, times).output
    hashing, publishing = number_of(output, "hash_ms"), number_of(output, "median_ms")
    row(f"publish an edit in a directory of {count}, median", f"{hashing:.2f} ms hash", f"{publishing:.2f} ms",
        publishing / hashing, 4.0)
    growth = number_of(output, "growth")
    row(f"    growth of the file by one edit, mean of {times}", "2000 B", f"{growth:.0f} B", growth / 2000, 1.0)
    output = archive("edits", os.path.join(directory, "edits.kiv"), times).output
    first, last = number_of(output, "first100_ms"), number_of(output, "last100_ms")
    row(f"publish one change: the last 100 of {times}, the first 100", f"{first:.2f} ms", f"{last:.2f} ms", last / first, 1.5)


ALL_ROWS = {
    "files": first_save,
    "text": lambda directory: many_versions(directory, "text of 2 MB", text_versions(30 if QUICK else 300), 1.0),
    "source": lambda directory: many_versions(directory, "source tree", source_versions(30 if QUICK else 300), 1.0),
    "history": history,
    "million": million,
    "large": large_content,
    "edits": edits,
}


def main():
    chosen = [name for name in sys.argv[2:] if name != "--quick"] or list(ALL_ROWS)
    for line in open("/proc/cpuinfo", encoding="utf-8"):
        if line.startswith("model name"):
            print(line.split(":")[1].strip() + f", {os.cpu_count()} processors, load {os.getloadavg()[0]:.1f}")
            break
    print(subprocess.run(["git", "--version"], capture_output=True, check=True, text=True).stdout.strip())
    print(f"{'':<58}{'git':>16}{'archive':>16}{'ratio':>8}{'limit':>7}")
    with tempfile.TemporaryDirectory(prefix="archive-bench-") as directory:
        for name in chosen:
            ALL_ROWS[name](directory)


main()
