#!/usr/bin/env python3
"""Judges units of a compilation database one by one, and remembers which had nothing to complain
about: a run that was broken off goes on where it was, a second one looks at what has changed.

usage: lint_units.py warnings|tidy BUILD_FOLDER JOBS [UNIT...]

warnings: the compiler with the options of the build; no object is written. tidy: clang-tidy.
A unit is known as clean as long as its command, the rules, its source and the headers of the
project that it includes are the same; BUILD_FOLDER/clean holds what is known."""

import argparse
import concurrent.futures
import hashlib
import json
import os
import pathlib
import re
import shlex
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parents[1]


def compiling(entry):
    """The command of a unit without what it writes."""
    kept, skip = [], False
    for word in shlex.split(entry["command"]):
        if skip:
            skip = False
        elif word == "-o":
            skip = True
        elif word != "-c":
            kept.append(word)
    return kept


def judging(kind, entry):
    if kind == "tidy":
        # A unit that the database holds twice would be judged twice by one process, which then
        # finds faults in the second that are not there.
        options = [word for word in compiling(entry)[1:] if word != entry["file"]]
        return ["clang-tidy", "--quiet", entry["file"], "--", *options]
    return compiling(entry) + ["-fsyntax-only"]


def included(entry):
    """The source of a unit and the headers it includes, those of the system left out."""
    done = subprocess.run(compiling(entry) + ["-MM"], cwd=entry["directory"], capture_output=True,
                          text=True, check=True)
    names = done.stdout.replace("\\\n", " ").split()[1:]
    return sorted({os.path.normpath(os.path.join(entry["directory"], name)) for name in names})


class Memory:
    """Which units were clean, and of what they were made at that time."""

    def __init__(self, kind, build):
        self.folder = build / "clean" / kind
        self.folder.mkdir(parents=True, exist_ok=True)
        self.rules = (ROOT / ".clang-tidy").read_text(encoding="utf-8") if kind == "tidy" else ""

    def place(self, entry):
        return self.folder / re.sub(r"\W", "_", os.path.relpath(entry["file"], ROOT))

    def digest(self, entry, files):
        total = hashlib.sha256((entry["command"] + self.rules).encode())
        for name in files:
            total.update(name.encode() + pathlib.Path(name).read_bytes())
        return total.hexdigest()

    def knows(self, entry):
        try:
            known = json.loads(self.place(entry).read_text(encoding="utf-8"))
            return known["digest"] == self.digest(entry, known["files"])
        except (OSError, ValueError):
            return False

    def note(self, entry):
        files = included(entry)
        text = json.dumps({"files": files, "digest": self.digest(entry, files)})
        self.place(entry).write_text(text, encoding="utf-8")


def judge(kind, memory, entry):
    """What is to be said of a unit; nothing when it is clean."""
    if memory.knows(entry):
        return ""
    done = subprocess.run(judging(kind, entry), cwd=entry["directory"], capture_output=True,
                          text=True, check=False)
    text = re.sub(r"^\d+ warnings? .*generated.*\n", "", done.stdout + done.stderr, flags=re.M)
    if done.returncode == 0:
        memory.note(entry)
        return text if kind == "warnings" else ""
    return text or f"{entry['file']}: status {done.returncode} without a word\n"


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("kind", choices=["warnings", "tidy"])
    parser.add_argument("build", type=pathlib.Path)
    parser.add_argument("jobs", type=int)
    parser.add_argument("units", nargs="*")
    args = parser.parse_args()
    build = args.build.resolve()
    wanted = {os.path.abspath(unit) for unit in args.units}
    entries = {}
    for entry in json.loads((build / "compile_commands.json").read_text(encoding="utf-8")):
        if not wanted or os.path.abspath(entry["file"]) in wanted:
            entries.setdefault(entry["file"], entry)
    memory = Memory(args.kind, build)
    failed = 0
    with concurrent.futures.ThreadPoolExecutor(args.jobs) as pool:
        judged = pool.map(lambda entry: judge(args.kind, memory, entry), entries.values())
        for text in judged:
            if text:
                failed += 1
                print(text, end="", flush=True)
    print(f"{len(entries)} units, {failed} with findings")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
