"""What mutate.sh runs: SOURCE BUILD PLACES SEED."""

import hashlib
import os
import pathlib
import random
import re
import resource
import shutil
import signal
import subprocess
import sys

SOURCE, BUILD = map(pathlib.Path, sys.argv[1:3])
PLACES, SEED = map(int, sys.argv[3:5])
FLIPS = {"==": ["!="], "!=": ["=="], "<": [">=", "<="], ">": ["<=", ">="], "<=": [">", "<"], ">=": ["<", ">"]}
NO_STATEMENT = re.compile(r"(return|using|static|const|constexpr|auto|if|for|while|throw|break|continue|else|case|struct|"
                          r"class|template|friend|namespace|static_assert|default|public|private|inline)\b")
DECLARATION = re.compile(r"[\w:<>,*&\s]*[\w>*&]\s+[*&]*\w+\s*(\(|=[^=]|\{|;|\[)")
# Their arguments may be swapped without a change; the others are no calls.
UNSWAPPABLE = {"min", "max", "swap", "equal", "set_intersection", "BlobDiffers", "TreeDiffers", "ForEachDifference",
               "DivideAlike", "if", "for", "while", "switch", "decltype", "sizeof", "alignas", "target", "static_assert",
               "return"}


def comparisons(lines, random_source):
    for number, line in enumerate(lines):
        for match in re.finditer(r" (==|!=|<=|>=|<|>) ", line):
            flipped = random_source.choice(FLIPS[match[1]])
            yield number, f"{line[:match.start()]} {flipped} {line[match.end():]}"


def statements(lines, _):
    before = ""
    for number, line in enumerate(lines):
        code = line.strip()
        if (line.startswith("    ") and code.endswith(";") and code.count("(") == code.count(")") and "}" not in code
                and re.search(r"[;{}):]$|\belse$", before) and not NO_STATEMENT.match(code)
                and not DECLARATION.match(code) and re.search(r"[(=]|\+\+|--", code)):
            yield number, line[:len(line) - len(line.lstrip())] + ";"
        before = code or before


def arguments_of(line, start):
    """The ends of the arguments of the call that opens before start; none if it does not close in this line."""
    depth, ends = 0, []
    for position in range(start, len(line)):
        character = line[position]
        if character == "," and depth == 0:
            ends.append(position)
        elif character in "([{":
            depth += 1
        elif character in ")]}":
            depth -= 1
            if depth < 0:
                return ends + [position]
    return []


def argument_pairs(lines, _):
    for number, line in enumerate(lines):
        for match in re.finditer(r"(\w+)[({]", line) if line.startswith("    ") else ():
            if match[1] in UNSWAPPABLE:
                continue
            start, ends = match.end(), arguments_of(line, match.end())
            for middle, end in zip(ends, ends[1:]):
                left, right = line[start:middle].strip(), line[middle + 1:end].strip()
                if left != right:
                    yield number, f"{line[:start]}{right}, {left}{line[end:]}"
                start = middle + 1


def code_of(path):
    """The lines with comments and what is no code blanked, so that nothing is found there."""
    return [re.sub(r"//.*|^\s*(#|\[\[).*", "", line) for line in path.read_text().split("\n")]


def all_mutants(random_source):
    """Of each kind in turn, in random order: file, line number, the line as it becomes."""
    kinds = []
    for kind in (comparisons, statements, argument_pairs):
        found = [(path, *mutant) for path in sorted(SOURCE.glob("src/*/*.*"))
                 for mutant in kind(code_of(path), random_source)]
        random_source.shuffle(found)
        kinds.append(found)
    while any(kinds):
        for kind in kinds:
            if kind:
                yield kind.pop()


def build():
    return subprocess.run(["cmake", "--build", BUILD, "--parallel", "2", "--target", "KivVcs", "objects_test"],
                          capture_output=True).returncode == 0


class Mutation:
    """A line of a file is another one while this lasts."""

    def __init__(self, path, number, line):
        self.path, self.text, self.times = path, path.read_text(), path.stat()
        lines = self.text.split("\n")
        self.before, lines[number] = lines[number], line
        self.mutated = "\n".join(lines)
        self.object = BUILD / "CMakeFiles/KivVcs.dir" / f"{path.relative_to(SOURCE)}.o"
        # A file that goes into one object only is not compiled again when it is as it was.
        self.restores_object = path.suffix == ".cpp" and not path.name.startswith("Sha256")
        self.kept = BUILD / "kept.o"

    def __enter__(self):
        if self.restores_object:
            shutil.copy2(self.object, self.kept)
        self.path.write_text(self.mutated)
        return self

    def __exit__(self, *_):
        self.path.write_text(self.text)
        if self.restores_object:
            shutil.copy2(self.kept, self.object)
            os.utime(self.path, ns=(self.times.st_atime_ns, self.times.st_mtime_ns))


def library_digest():
    # objects_test compiles a part of the library into itself.
    return [hashlib.sha256((BUILD / name).read_bytes()).digest() for name in ("libKivVcs.so", "tests/objects_test")]


def run(test, seconds):
    """How a test ends, and the CPU seconds it took. Only those count, as a busy machine gives a test little of the clock's."""
    def limit():
        resource.setrlimit(resource.RLIMIT_AS, (6 << 30, 6 << 30))
        resource.setrlimit(resource.RLIMIT_CPU, (int(seconds) + 1, int(seconds) + 1))

    before = resource.getrusage(resource.RUSAGE_CHILDREN)
    try:
        status = subprocess.run([test, "--gtest_brief=1", "--gtest_fail_fast"], timeout=600 + 10 * seconds,
                                stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, preexec_fn=limit).returncode
    except subprocess.TimeoutExpired:
        status = -signal.SIGXCPU
    after = resource.getrusage(resource.RUSAGE_CHILDREN)
    spent = after.ru_utime + after.ru_stime - before.ru_utime - before.ru_stime
    timed_out = status == -signal.SIGXCPU or status == -signal.SIGKILL and spent >= seconds
    return "timeout" if timed_out else "failed" if status else "passed", spent


def main():
    tests = {}
    for test in sorted(BUILD.glob("tests/*_test")):
        ending, seconds = run(test, 300)
        if ending != "passed":
            sys.exit(f"{test.name} {ending} before anything is broken")
        tests[test] = seconds
    quickest_first = sorted(tests, key=tests.get)
    likely = {}
    original = library_digest()
    count = dict.fromkeys(("failed", "timeout", "passed"), 0)
    not_compiling, without_effect = 0, 0
    for path, number, mutated in all_mutants(random.Random(SEED)):
        if sum(count.values()) == PLACES:
            break
        ending, noticing = "passed", None
        try:
            with Mutation(path, number, mutated) as mutation:
                if not build():
                    not_compiling += 1
                    continue
                if library_digest() == original:
                    without_effect += 1
                    continue
                # The test that caught the last fault in this directory goes first.
                for test in sorted(quickest_first, key=lambda test: test != likely.get(path.parent)):
                    ending, _ = run(test, 20 + 5 * tests[test])
                    if ending != "passed":
                        noticing = test
                        break
        except KeyboardInterrupt:
            break
        count[ending] += 1
        if ending == "failed":
            likely[path.parent] = noticing
            continue
        verdict = "survived" if ending == "passed" else f"did not end in {noticing.name}"
        print(f"{path.relative_to(SOURCE)}:{number + 1} {verdict}:\n- {mutation.before.strip()}\n+ {mutated.strip()}",
              flush=True)
    noticed = count["failed"] + count["timeout"]
    print(f"{noticed} of {sum(count.values())} faults were noticed (seed {SEED}): a test failed with {count['failed']} and did "
          f"not end with {count['timeout']}; {not_compiling} more did not compile and {without_effect} compiled to the same code")
    return 0 if noticed >= 0.95 * PLACES else 1


sys.exit(main())
