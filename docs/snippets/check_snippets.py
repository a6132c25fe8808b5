"""usage: check_snippets.py SOURCE-DIRECTORY
Every piece of C++ that a document shows stands, line by line, in a program that is compiled and run: one of docs/snippets or
examples. It may be indented there."""

import pathlib
import re
import sys
import textwrap


def main(root):
    programs = [*root.glob("docs/snippets/*.cpp"), *root.glob("examples/**/*.cpp")]
    sources = {program: program.read_text().splitlines() for program in programs}
    shown = strays = 0
    for document in [*root.glob("*.md"), *root.glob("docs/*.md"), *root.glob("examples/**/*.md")]:
        for block in re.findall(r"^```cpp\n(.*?)^```$", document.read_text(), re.MULTILINE | re.DOTALL):
            shown += 1
            if not any(stands_in(block.splitlines(), lines) for lines in sources.values()):
                strays += 1
                print(f"{document.relative_to(root)} shows what no program runs:\n{block}", file=sys.stderr)
    return 1 if strays or not shown else 0


def stands_in(block, lines):
    for start in range(len(lines) - len(block) + 1):
        if block[0] in lines[start]:
            part = textwrap.dedent("\n".join(lines[start : start + len(block)])).splitlines()
            if [line.rstrip() for line in part] == [line.rstrip() for line in block]:
                return True
    return False


sys.exit(main(pathlib.Path(sys.argv[1])))
