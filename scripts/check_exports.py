#!/usr/bin/env python3
"""Checks that the shared library exports every symbol of the public API.

    scripts/check_exports.py LIBKIVIOSSDK.so STATIC_ARCHIVE.a INCLUDE_DIR

The static archive holds the same objects as the shared library. Every
strong symbol it defines in namespace kivi belongs to the public API unless
a scope on its way is internal: a namespace whose name holds "detail", or a
class that no public header defines (a pimpl's body, say). Each such public
symbol must be in the shared library's dynamic symbol table; the script
lists the ones that are not and exits 1.
"""
import pathlib
import re
import subprocess
import sys


def nm(*args):
    out = subprocess.run(["nm", "-C", "--defined-only", *args], check=True,
                         capture_output=True, text=True).stdout
    for line in out.splitlines():
        parts = line.split(" ", 2)
        if len(parts) == 3:
            yield parts[1], parts[2]


def split_scope(name):
    """'kivi::A<x::y>::f' -> ['kivi', 'A', 'f'] (template arguments dropped)."""
    depth, part, parts = 0, "", []
    i = 0
    while i < len(name):
        c = name[i]
        if c == "<":
            depth += 1
        elif c == ">":
            depth -= 1
        elif depth == 0 and name.startswith("::", i):
            parts.append(part)
            part = ""
            i += 2
            continue
        elif depth == 0:
            part += c
        i += 1
    parts.append(part)
    return parts


def qualified_name(symbol):
    """The name before the parameter list, without a leading return type."""
    depth = 0
    for i, c in enumerate(symbol):
        if c == "<":
            depth += 1
        elif c == ">":
            depth -= 1
        elif c == "(" and depth == 0 and not symbol.startswith("operator()", max(0, i - 8)):
            symbol = symbol[:i]
            break
    start = symbol.find("kivi::")
    return symbol[start:] if start > 0 and symbol[start - 1] == " " else symbol


def public_scopes(include_dir):
    classes, namespaces = set(), set()
    for header in pathlib.Path(include_dir).rglob("*.h"):
        if "detail" in header.parts:
            continue
        for line in header.read_text().splitlines():
            m = re.match(r"\s*(?:class|struct)\s+(?:KIVI_EXPORT\s+)?(\w+)\b([^;]*)$", line)
            if m and not line.rstrip().endswith(";"):
                classes.add(m.group(1))
            for ns in re.findall(r"^\s*namespace\s+([\w:]+)\s*\{", line):
                namespaces.update(ns.split("::"))
    return classes, namespaces


def is_public(scope, classes, namespaces):
    if len(scope) < 2 or scope[0] != "kivi":
        return False
    for part in scope[1:-1]:
        if "detail" in part or part.startswith("(anonymous"):
            return False
        if part in namespaces:
            continue
        if part not in classes:
            return False
    return "detail" not in scope[-1]


def main():
    if len(sys.argv) != 4:
        sys.exit(__doc__)
    shared, archive, include_dir = sys.argv[1:]
    classes, namespaces = public_scopes(include_dir)
    exported = {name for kind, name in nm("-D", shared)}
    missing = sorted(
        name for kind, name in nm(archive)
        if kind in "TDBR" and name not in exported
        and is_public(split_scope(qualified_name(name)), classes, namespaces))
    for name in missing:
        print(f"not exported: {name}")
    if missing:
        print(f"{len(missing)} public symbols are missing from {shared}: mark their "
              "declarations KIVI_EXPORT", file=sys.stderr)
        sys.exit(1)
    print(f"every public symbol is exported ({len(exported)} in the dynamic symbol table)")


if __name__ == "__main__":
    main()
