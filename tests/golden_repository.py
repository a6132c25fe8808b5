#!/usr/bin/env python3
"""Prints the identifiers of a fixed small repository, computed with nothing of the library."""

from hashlib import sha256


def identifier(kind, data):
    return sha256(f"{kind} {len(data)}\0".encode() + data).hexdigest()


def blob(content):
    return "100644 blob", identifier("blob", content)


def tree(entries):
    # Names in the order of their UTF-16 code units.
    ordered = sorted(entries.items(), key=lambda entry: entry[0].encode("utf-16-be"))
    data = b"".join(f"{kind} {name}\0{child}".encode() for name, (kind, child) in ordered)
    return "40000 tree", identifier("tree", data)


def commit(root, parent, name, email, seconds, offset, description):
    signature = f"{name} <{email}> {seconds} {offset}"
    lines = [f"tree {root[1]}"] + ([f"parent {parent}"] if parent else [])
    lines += [f"author {signature}", f"committer {signature}", "", description, ""]
    return identifier("commit", "\n".join(lines).encode())


readme = blob(b"one\n")
first_root = tree({"README": readme})
first = commit(first_root, None, "Zoë", "zoe@example.org", 1700000000, "+0200", "First")
second_root = tree({
    "README": blob(b""),
    "src": tree({"main.cpp": blob(b"int main() {}\n"), "\ufffd": readme, "\U0001f600": blob(bytes(range(256)))}),
    "src.txt": readme,
})
second = commit(second_root, first, "Bo", "", -1, "-0530", "Second\nwith two lines")
empty = commit(tree({}), None, "", "", 0, "+0000", "")
for label, value in {"first tree": first_root[1], "first": first, "second tree": second_root[1], "second": second,
                     "empty": empty}.items():
    print(f"{label}: {value}")
