"""usage: check_snippets.py SOURCE-DIRECTORY
       check_snippets.py DOCUMENT PROGRAM
Every piece of C++ that a document shows stands, line by line, in a program that is compiled and run: one of docs/snippets or
examples. It may be indented there. Or: what a document shows as text is, all together, what a program prints."""

import pathlib
import re
import subprocess
import sys
import textwrap


def main(root):
    programs = [*root.glob("docs/snippets/*.cpp"), *root.glob("examples/**/*.cpp")]
    sources = {program: program.read_text().splitlines() for program in programs}
    shown = strays = 0
    for document in [*root.glob("*.md"), *root.glob("docs/*.md"), *root.glob("examples/**/*.md")]:
        for block in blocks(document, "cpp"):
            shown += 1
            if not any(stands_in(block.splitlines(), lines) for lines in sources.values()):
                strays += 1
                print(f"{document.relative_to(root)} shows what no program runs:\n{block}", file=sys.stderr)
    return 1 if strays or not shown else 0


def compare_output(document, program):
    printed = subprocess.run([program], capture_output=True, text=True, check=True).stdout
    if "".join(blocks(document, "text")) != printed:
        print(f"{document} does not show what {program} prints:\n{printed}", file=sys.stderr)
        return 1
    return 0


def blocks(document, language):
    return re.findall(rf"^```{language}\n(.*?)^```$", document.read_text(), re.MULTILINE | re.DOTALL)


def stands_in(block, lines):
    for start in range(len(lines) - len(block) + 1):
        if block[0] in lines[start]:
            part = textwrap.dedent("\n".join(lines[start : start + len(block)])).splitlines()
            if [line.rstrip() for line in part] == [line.rstrip() for line in block]:
                return True
    return False


path = pathlib.Path(sys.argv[1])
sys.exit(compare_output(path, sys.argv[2]) if len(sys.argv) > 2 else main(path))
