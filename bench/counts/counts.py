#!/usr/bin/env python3
"""Counts the instructions of 10,000 calls of each operation and compares them with baseline.json.

usage: counts.py --program OP_COUNTS --compiler TEXT [--write]

Counted by callgrind, in the program itself only: what the C library does inside a copy depends on
the processor. A count more than 3 percent off the baseline fails, also a lower one: it is to be
recorded with --write, or the next slip up to the old count would pass unseen."""

import argparse
import json
import pathlib
import re
import subprocess
import sys
import tempfile

BASELINE = pathlib.Path(__file__).with_name("baseline.json")
OPERATIONS = ("load-ordered load-random lookup absent scan list update delete").split()
RECORDS = 20000
CALLS = 10000
TOLERANCE = 0.03
SKIPPED = 77


def own_instructions(profile, program):
    """Sums the self cost of everything in the program's own object."""
    names = {}
    own = False
    skip_next = False
    total = 0
    for line in profile.splitlines():
        if line.startswith("ob="):
            number, name = re.match(r"ob=\((\d+)\)\s*(.*)", line).groups()
            names.setdefault(number, name)
            own = names[number] == program
        elif line.startswith("cob="):
            number, name = re.match(r"cob=\((\d+)\)\s*(.*)", line).groups()
            if name:
                names.setdefault(number, name)
        elif line.startswith("calls="):
            skip_next = True  # the cost of what was called
        elif re.match(r"[0-9+*-]", line):
            if own and not skip_next:
                total += int(line.split()[1])
            skip_next = False
    return total


def count(program, operation):
    with tempfile.TemporaryDirectory() as folder:
        out = pathlib.Path(folder) / "profile"
        done = subprocess.run(
            ["valgrind", "--tool=callgrind", "--instr-atstart=no", f"--callgrind-out-file={out}",
             program, operation, str(RECORDS), str(CALLS)],
            capture_output=True, text=True, check=False, env={"PATH": "/usr/bin:/bin"})
        if done.returncode != 0:
            sys.exit(f"{operation}: {done.stderr.strip()}")
        return own_instructions(out.read_text(), program)


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--program", required=True)
    parser.add_argument("--compiler", required=True)
    parser.add_argument("--write", action="store_true", help="record the counts as the baseline")
    options = parser.parse_args()
    program = str(pathlib.Path(options.program).resolve())
    if options.write:
        counts = {operation: count(program, operation) for operation in OPERATIONS}
        BASELINE.write_text(json.dumps({"compiler": options.compiler, "records": RECORDS,
                                        "calls": CALLS, "instructions": counts}, indent=2) + "\n")
        return
    baseline = json.loads(BASELINE.read_text())
    if baseline["compiler"] != options.compiler:
        print(f"skipped: the baseline is that of {baseline['compiler']}, "
              f"this build's compiler is {options.compiler}")
        sys.exit(SKIPPED)
    failed = False
    for operation in OPERATIONS:
        now = count(program, operation)
        before = baseline["instructions"][operation]
        change = now / before - 1
        wrong = abs(change) > TOLERANCE
        failed = failed or wrong
        print(f"{operation:14}{before:>12,}{now:>12,}{change:>+8.1%}{'  FAILED' if wrong else ''}")
    if failed:
        sys.exit("more than 3 percent off: find the reason, or record the counts with --write")


if __name__ == "__main__":
    main()
