#!/usr/bin/env python3
"""No function takes more stack than a kernel can spare. Read from machine code: a frame is what a
function takes off the stack pointer. Sanitizers only make frames larger.

usage: stack.py MOST_BYTES LIBRARY..."""

import platform
import re
import subprocess
import sys

import common

FUNCTION = re.compile(r"^[0-9a-f]+ <(.+)>:$")
TAKEN = re.compile(r"\bsub\s+\$0x([0-9a-f]+),%rsp")
PUSHED = re.compile(r"\bpush\s+%r")
NEGATIVE = 1 << 63  # taking so much gives back


def frames(listing):
    """Bytes each function of a disassembly takes, by name."""
    sizes = {}
    name = None
    for line in listing.splitlines():
        start = FUNCTION.match(line)
        taken = TAKEN.search(line)
        if start:
            name = start.group(1)
            sizes.setdefault(name, 0)
        elif name and taken and int(taken.group(1), 16) < NEGATIVE:
            sizes[name] += int(taken.group(1), 16)
        elif name and PUSHED.search(line):
            sizes[name] += 8
    return sizes


def judge(sizes, most):
    if not sizes:
        return ["no functions found"]
    return [f"{name} takes {size} bytes of stack, more than {most}"
            for name, size in sorted(sizes.items()) if size > most]


def check(_root, most, *libraries):
    if platform.machine() != "x86_64":
        print("stack: knows the code of x86-64 only, nothing looked at")
        return []
    findings = []
    for library in libraries:
        listed = subprocess.run(["objdump", "-d", "-C", "--no-show-raw-insn", library],
                                capture_output=True, text=True, check=True)
        findings += judge(frames(listed.stdout), int(most))
    return findings


if __name__ == "__main__":
    common.run("stack", check, sys.argv[1:])
