#!/usr/bin/env python3
"""Every status has one number, wherever it is stated: those of the C header are those of the C++
headers, and each of them has a name and a text."""

import pathlib
import re
import sys

ROOT = pathlib.Path(__file__).resolve().parents[2]


def numbers(pattern, *names):
    found = {}
    for name in names:
        for symbol, number in re.findall(pattern, (ROOT / name).read_text(encoding="utf-8")):
            found[symbol] = int(number, 16)
    return found


def main():
    inner = numbers(r"constexpr int (kErr\w+) = static_cast<int>\((0x[0-9A-F]+)u\)",
                    "src/platform/error.h", "src/platform/status.h")
    outer = numbers(r"#define (TREEHFS_ERR_\w+) \(\(int\)(0x[0-9A-F]+)u\)",
                    "include/treehfs/treehfs.h")
    table = re.findall(r"\{(kErr\w+), \"[a-z-]+\", \"[a-z].*?[a-z]\"\}",
                       (ROOT / "src/platform/status.cpp").read_text(encoding="utf-8"))
    faults = [f"{name} has no entry in status.cpp" for name in inner if name not in table]
    faults += [f"{number:08X} is in one of the headers only"
               for number in set(inner.values()) ^ set(outer.values())]
    if len(set(inner.values())) != len(inner):
        faults.append("two statuses share a number")
    print("\n".join(faults) or f"{len(inner)} statuses")
    return 1 if faults or len(inner) < 17 else 0


if __name__ == "__main__":
    sys.exit(main())
