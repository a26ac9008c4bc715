#!/usr/bin/env python3
"""The shared library offers the functions that its header declares, and no other symbol.

usage: exports_test.py LIBRARY HEADER"""

import pathlib
import re
import subprocess
import sys


def declared(header):
    text = re.sub(r"/\*.*?\*/", "", pathlib.Path(header).read_text(encoding="utf-8"), flags=re.S)
    return set(re.findall(r"^TREEHFS_API [\w *]*?\*?(treehfs_\w+)\(", text, re.M))


def offered(library):
    listed = subprocess.run(["nm", "-D", "-P", "--defined-only", library], capture_output=True,
                            text=True, check=True)
    names = {line.split()[0] for line in listed.stdout.splitlines()}
    return {re.sub(r"@.*", "", name) for name in names} - {"TREEHFS_0"}


def main(library, header):
    want, have = declared(header), offered(library)
    for name in sorted(want - have):
        print(f"declared, but not offered: {name}")
    for name in sorted(have - want):
        print(f"offered, but not declared: {name}")
    print(f"{len(have)} symbols")
    return 0 if want == have and len(want) > 20 else 1


if __name__ == "__main__":
    sys.exit(main(*sys.argv[1:]))
