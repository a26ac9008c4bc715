#!/usr/bin/env python3
"""The engine library needs nothing but the platform beneath it: its undefined symbols are memory
moves, the platform's functions, and what the compiler adds. So it has no heap of its own, no
exceptions, no run-time types.

usage: symbols.py ENGINE_LIBRARY [OTHER_LIBRARY_OF_THE_PROJECT...]"""

import re
import subprocess
import sys

import common

ALLOWED = re.compile(
    r"(?:memcpy|memmove|memset|memcmp"
    r"|velk_\w+|_VELKTrace|VELKError|VELK_DumpMemory"
    r"|__stack_chk_fail|_GLOBAL_OFFSET_TABLE_"
    r"|__asan_\w+|__ubsan_\w+|__sanitizer_\w+|__gcov_\w+|__llvm_\w+|__sancov_\w+)")


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


def check(_root, engine, *others):
    provided = set()
    for other in others:
        provided |= symbols(other, True)
    return judge(symbols(engine, False), provided)


if __name__ == "__main__":
    common.run("symbols", check, sys.argv[1:])
