#!/usr/bin/env python3
"""Judges the units of a compilation database, and remembers which had nothing to complain about: a
run that was broken off goes on where it was, a second one looks at what has changed.

usage: lint_units.py warnings|tidy BUILD_FOLDER JOBS [UNIT...]

Most of the work would be the same headers of the system over and over, so:
warnings: the compiler with the options of the build, writing no object. The headers that units of
one kind include from elsewhere are compiled once before, for all of them.
tidy: clang-tidy, on several units at a time in one translation. Units whose names clash go apart.
When something is found the units are judged again in halves, down to single ones: what is said in
the end is said of a unit by itself.

A unit is known as clean as long as its command, the rules, its source and the headers of the
project that it includes are the same; BUILD_FOLDER/clean holds what is known."""

import argparse
import collections
import concurrent.futures
import hashlib
import json
import os
import pathlib
import re
import subprocess
import sys

from lint_sources import Unit

ROOT = pathlib.Path(__file__).resolve().parents[1]
UNITS_TOGETHER = 16  # in one run of clang-tidy: beyond that little is won, and memory runs short
WORTH_ONE = 4  # units that include a system header, from which on it is compiled before
HEADERS = r"(src|tests|bench|fuzz|python)/.*\.(h|cpp)$"


def run(command, unit):
    return subprocess.run(command, cwd=unit.folder, capture_output=True, text=True, check=False)


class Memory:
    """Which units were clean, and of what they were made at that time."""

    def __init__(self, kind, build):
        self.folder = build / "clean" / kind
        self.folder.mkdir(parents=True, exist_ok=True)
        self.rules = (ROOT / ".clang-tidy").read_text(encoding="utf-8") if kind == "tidy" else ""

    def place(self, unit):
        return self.folder / re.sub(r"\W", "_", os.path.relpath(unit.source, ROOT))

    def digest(self, unit):
        total = hashlib.sha256((unit.command + self.rules).encode())
        for name in unit.files():
            total.update(name.encode() + pathlib.Path(name).read_bytes())
        return total.hexdigest()

    def knows(self, unit):
        try:
            return self.place(unit).read_text(encoding="utf-8") == self.digest(unit)
        except OSError:
            return False

    def note(self, unit):
        self.place(unit).write_text(self.digest(unit), encoding="utf-8")


def groups_by(units, key):
    groups = collections.defaultdict(list)
    for unit in units:
        groups[key(unit)].append(unit)
    return list(groups.values())


class Warnings:
    """The compiler's own words."""

    def __init__(self, build):
        self.folder = build / "headers"
        self.folder.mkdir(exist_ok=True)
        self.before = {}  # by source: the options that bring in what was compiled before

    @staticmethod
    def kind(unit):
        """The options of units that may share compiled headers: not where headers of the project
        lie, nor what only its sources ask for."""
        return tuple(sorted({word for word in unit.options
                             if not word.startswith(("-I", "-isystem", "-DTREEHFS_"))}))

    def prepare(self, units, pool):
        list(pool.map(self._compile_headers, groups_by(units, self.kind)))

    def _compile_headers(self, units):
        count = collections.Counter(name for unit in units for name in unit.system_headers())
        names = sorted(name for name, users in count.items() if users >= WORTH_ONE)
        if not names:
            return
        digest = hashlib.sha256(repr((self.kind(units[0]), names)).encode()).hexdigest()[:16]
        header = self.folder / f"{digest}.h"
        header.write_text("".join(f"#include <{name}>\n" for name in names), encoding="utf-8")
        suffix = "pch" if "clang" in units[0].compiler else "gch"
        done = run([units[0].compiler, *self.kind(units[0]), "-x", "c++-header", str(header), "-o",
                    f"{header}.{suffix}"], units[0])
        if done.returncode == 0:
            self.before.update({unit.source: ["-include", str(header)] for unit in units})

    @staticmethod
    def parts(units):
        return [[unit] for unit in units]

    def judge(self, units):
        """What is to be said of units, by unit; of clean ones nothing."""
        (unit,) = units
        done = run([unit.compiler, *self.before.get(unit.source, []), *unit.options, unit.source,
                    "-fsyntax-only"], unit)
        text = done.stdout + done.stderr
        return {unit: text or f"{unit.source}: status {done.returncode} without a word\n"
                if done.returncode else text}


class Tidy:
    """clang-tidy."""

    def __init__(self, build):
        self.folder = build / "together"
        self.folder.mkdir(exist_ok=True)

    def prepare(self, units, pool):
        pass

    @staticmethod
    def parts(units):
        return [group[at:at + UNITS_TOGETHER]
                for group in groups_by(units, lambda unit: tuple(unit.options))
                for at in range(0, len(group), UNITS_TOGETHER)]

    def judge(self, units):
        """What is to be said of units, by unit; of clean ones nothing."""
        said = {}
        while units:
            together = self._without_clashes(units)
            text = self._tidy(together)
            if not text or len(together) == 1:
                said.update({unit: text for unit in together})
            else:
                half = len(together) // 2
                said.update(self.judge(together[:half]))
                said.update(self.judge(together[half:]))
            units = [unit for unit in units if unit not in together]
        return said

    def _source(self, units):
        """One source that is all of them."""
        if len(units) == 1:
            return units[0].source
        text = "".join(f'#include "{unit.source}"  // NOLINT: it is a source\n' for unit in units)
        path = self.folder / (hashlib.sha256(text.encode()).hexdigest()[:16] + ".cpp")
        path.write_text(text, encoding="utf-8")
        return str(path)

    def _without_clashes(self, units):
        """Those of the units that one translation can hold: local names are theirs alone."""
        while len(units) > 1:
            done = run([units[0].compiler, *units[0].options, "-w", "-ferror-limit=0",
                        "-fsyntax-only", self._source(units)], units[0])
            faulty = set(re.findall(r"^(.*?):\d+:\d+: (?:fatal )?error:", done.stderr, re.M))
            if not faulty:
                break
            fitting = [unit for unit in units if unit.source not in faulty]
            units = fitting if fitting and len(fitting) < len(units) else units[:1]
        return units

    def _tidy(self, units):
        done = run(["clang-tidy", "--quiet", f"--header-filter={HEADERS}", self._source(units),
                    "--", *units[0].options], units[0])
        text = re.sub(r"^\d+ warnings? .*generated.*\n", "", done.stdout + done.stderr, flags=re.M)
        if done.returncode == 0:
            return ""
        return text or f"{units[0].source}: status {done.returncode} without a word\n"


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("kind", choices=["warnings", "tidy"])
    parser.add_argument("build", type=pathlib.Path)
    parser.add_argument("jobs", type=int)
    parser.add_argument("units", nargs="*")
    args = parser.parse_args()
    build = args.build.resolve()
    wanted = {os.path.abspath(unit) for unit in args.units}
    units = {}
    for entry in json.loads((build / "compile_commands.json").read_text(encoding="utf-8")):
        if not wanted or os.path.abspath(entry["file"]) in wanted:
            units.setdefault(entry["file"], Unit(entry))
    memory = Memory(args.kind, build)
    unknown = [unit for unit in units.values() if not memory.knows(unit)]
    judge = Warnings(build) if args.kind == "warnings" else Tidy(build)
    failed = 0
    with concurrent.futures.ThreadPoolExecutor(args.jobs) as pool:
        judge.prepare(unknown, pool)
        for said in pool.map(judge.judge, judge.parts(unknown)):
            for unit, text in said.items():
                if text:
                    failed += 1
                    print(text, end="", flush=True)
                else:
                    memory.note(unit)
    print(f"{len(units)} units, {len(unknown)} of them looked at, {failed} with findings")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
