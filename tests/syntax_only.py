#!/usr/bin/env python3
"""Compiles units of a compilation database for their warnings alone: no object is written.

usage: syntax_only.py COMPILE_COMMANDS JOBS [UNIT...]"""

import concurrent.futures
import json
import os
import shlex
import subprocess
import sys


def command_of(entry):
    words = shlex.split(entry["command"])
    kept, skip = [], False
    for word in words:
        if skip:
            skip = False
        elif word == "-o":
            skip = True
        elif word != "-c":
            kept.append(word)
    return kept + ["-fsyntax-only"]


def compile_one(entry):
    done = subprocess.run(command_of(entry), cwd=entry["directory"], capture_output=True,
                          text=True, check=False)
    return done.returncode, done.stdout + done.stderr


def main():
    database, jobs, wanted = sys.argv[1], int(sys.argv[2]), {os.path.abspath(u)
                                                            for u in sys.argv[3:]}
    with open(database, encoding="utf-8") as file:
        entries = [entry for entry in json.load(file)
                   if not wanted or os.path.abspath(entry["file"]) in wanted]
    failed = 0
    with concurrent.futures.ThreadPoolExecutor(jobs) as pool:
        for status, text in pool.map(compile_one, entries):
            if status != 0:
                failed += 1
                print(text, end="")
    print(f"{len(entries)} units, {failed} with findings")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
