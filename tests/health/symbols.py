#!/usr/bin/env python3
"""The engine library needs nothing but the platform beneath it: its undefined symbols are memory
moves, the platform's functions, and what the compiler adds. So it has no heap of its own, no
exceptions, no run-time types. docs/porting.md names everything that a driver may have to supply.

usage: symbols.py ENGINE_LIBRARY PLATFORM_LIBRARY [OTHER_LIBRARY_OF_THE_PROJECT...]"""

import re
import subprocess
import sys

import common

# What the compiler adds.
ADDED = re.compile(
    r"__stack_chk_fail|_GLOBAL_OFFSET_TABLE_"
    r"|__(?:asan|ubsan|sanitizer|gcov|llvm|sancov)_\w+")
ALLOWED = re.compile(
    r"memcpy|memmove|memset|memcmp"
    r"|velk_\w+|_VELKTrace|VELKError|VELK_DumpMemory|" + ADDED.pattern)


def symbols(library, defined):
    """Names of the symbols an archive defines, or those it leaves undefined in itself."""
    listed = subprocess.run(["nm", "-P", library], capture_output=True, text=True, check=True)
    inside, outside = set(), set()
    for line in listed.stdout.splitlines():
        fields = line.split()
        if len(fields) >= 2 and not fields[0].endswith(":"):
            (outside if fields[1] in "Uw" else inside).add(fields[0])
    return inside if defined else outside - inside


def judge(undefined, provided):
    return [f"undefined symbol {name}" for name in sorted(undefined - provided)
            if not ALLOWED.fullmatch(name)]


def unnamed(undefined, guide):
    """What the text for people who bring their own platform does not name."""
    named = re.findall(r"`(\w+)`", guide)
    return [f"docs/porting.md does not name {name}" for name in sorted(undefined)
            if not ADDED.fullmatch(name) and not any(each in name for each in named)]


def check(root, engine, platform, *others):
    needed = symbols(engine, False)
    provided = symbols(platform, True)
    guide = (root / "docs" / "porting.md").read_text(encoding="utf-8")
    findings = unnamed(needed - provided, guide)
    for other in others:
        provided |= symbols(other, True)
    return judge(needed, provided) + findings


if __name__ == "__main__":
    common.run("symbols", check, sys.argv[1:])
