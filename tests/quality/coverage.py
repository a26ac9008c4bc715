#!/usr/bin/env python3
"""Outcomes of conditions that the tests saw, by source file, from the counters of a coverage build.

An outcome is one way on from a condition: each operand of && and || counts as a condition of its
own. Calls that may end in an exception are none. Of the engine every outcome has to be seen or
to stand in engine.list with the reason why nothing can lead there, and none that stands there may
have been seen; of the volume layer at least 95 of 100 have to be seen.

usage: coverage.py BUILD_FOLDER [--missing PREFIX]    (lists the outcomes of src/PREFIX not seen)"""

import argparse
import collections
import gzip
import json
import os
import pathlib
import re
import subprocess
import sys
import tempfile

from line_list import Lines

HERE = pathlib.Path(__file__).resolve().parent
ROOT = HERE.parents[1]
ENGINE = "src/hfs/treehfs/"
VOLUME = "src/hfs/volume/"
VOLUME_LEAST = 95.0


def documents(build):
    """Yields gcov's JSON document of every counter file of the build. Those of the tests count as
    well: the linker may have taken inline functions of the engine's headers from a test."""
    counters = sorted(pathlib.Path(build).resolve().glob("**/*.gcda"))
    if not counters:
        sys.exit(f"coverage: no counters in {build}: build the coverage preset and run its tests")
    with tempfile.TemporaryDirectory() as folder:
        for number, counter in enumerate(counters):
            own = pathlib.Path(folder, str(number))
            own.mkdir()
            subprocess.run(["gcov", "--json-format", "--branch-probabilities", str(counter)],
                           cwd=own, check=True, stdout=subprocess.DEVNULL,
                           stderr=subprocess.DEVNULL)
            for document in own.glob("*.gcov.json.gz"):
                with gzip.open(document, "rt", encoding="utf-8") as file:
                    yield json.load(file)


def conditions(ways):
    """The counts of ways that conditions take. They come in pairs; a pair of which one is taken by
    an exception is no condition but a call."""
    counts = []
    for first, second in zip(ways[0::2], ways[1::2]):
        if not first["throw"] and not second["throw"]:
            counts += [first["count"], second["count"]]
    if len(ways) % 2:
        counts.append(ways[-1]["count"])  # of a switch
    return counts


class File:
    """Counts of one source file, added up over all units that contain its code."""

    def __init__(self):
        self.lines = collections.Counter()
        self.outcomes = {}  # (line, number on that line) -> count

    def add(self, entry):
        by_function = collections.defaultdict(list)
        for line in entry["lines"]:
            number = line["line_number"]
            self.lines[number] += line["count"]
            by_function[number].append(conditions(line["branches"]))
        for number, functions in by_function.items():
            # The same line of a template or of a constructor's twins: one set of outcomes.
            longest = max(len(ways) for ways in functions)
            for ways in functions:
                if len(ways) == longest:
                    for index, count in enumerate(ways):
                        key = (number, index + 1)
                        self.outcomes[key] = self.outcomes.get(key, 0) + count


def gather(build):
    files = collections.defaultdict(File)
    for document in documents(build):
        for entry in document["files"]:
            path = os.path.join(document["current_working_directory"], entry["file"])
            name = os.path.relpath(os.path.realpath(path), ROOT)
            if name.startswith("src/"):
                files[name].add(entry)
    return files


def share(seen, of):
    return 100.0 * seen / of if of else 100.0


def table(files):
    print(f"{'':44} {'lines':>14}  {'outcomes':>14}")
    totals = collections.Counter()
    for name in sorted(files):
        file = files[name]
        lines = sum(1 for count in file.lines.values() if count)
        outcomes = sum(1 for count in file.outcomes.values() if count)
        print(f"{name:44} {lines:5} of {len(file.lines):5}  {outcomes:5} of "
              f"{len(file.outcomes):5}  {share(outcomes, len(file.outcomes)):5.1f}%")
        for layer in (ENGINE, VOLUME):
            if name.startswith(layer):
                totals[layer, "seen"] += outcomes
                totals[layer, "all"] += len(file.outcomes)
    return totals


class Source:
    def __init__(self, root):
        self.root = root
        self.texts = {}

    def line(self, name, number):
        if name not in self.texts:
            text = (self.root / name).read_text(encoding="utf-8")
            self.texts[name] = text.splitlines()
        return self.texts[name][number - 1].strip()

    def occurrence(self, name, number):
        """1 where the text of this line stands in its file for the first time, and so on."""
        code = self.line(name, number)
        return sum(1 for text in self.texts[name][:number] if text.strip() == code)


def unreachable_sites():
    """Sites that sites_reached.py says nothing leads to."""
    text = (HERE.parent / "engine" / "sites_reached.py").read_text(encoding="utf-8")
    return {int(number) for number in re.findall(r"^    (\d+): \"", text, re.M)}


def judge(files, excuses, sites, source):
    """Complaints about the engine, and how many outcomes are excused."""
    complaints, excused = [], 0
    for name in sorted(files):
        if not name.startswith(ENGINE):
            continue
        for (number, index), count in sorted(files[name].outcomes.items()):
            code = source.line(name, number)
            place = f"{name}:{number}: outcome {index} of: {code}"
            short = name.removeprefix(ENGINE)
            why = (excuses.find(short, code, str(index)) or
                   excuses.find(f"{short}#{source.occurrence(name, number)}", code, str(index)))
            if count and why is not None:
                complaints.append(f"{place}\n    was seen, although engine.list says: {why}")
            elif not count and why is None:
                complaints.append(f"{place}\n    was not seen")
            elif not count:
                excused += 1
                site = re.fullmatch(r"site (\d+)", why)
                if site and int(site[1]) not in sites:
                    complaints.append(f"{place}\n    sites_reached.py does not list {why}")
    for name, code, what in excuses.unused():
        complaints.append(f"{name}: no outcome {what} of: {code}")
    return complaints, excused


def missing(files, prefix, source):
    """Prints each line with an outcome not seen, and how often each of its outcomes was."""
    for name in sorted(files):
        if not name.startswith("src/" + prefix):
            continue
        by_line = collections.defaultdict(list)
        for (number, _), count in sorted(files[name].outcomes.items()):
            by_line[number].append(count)
        for number, counts in by_line.items():
            if 0 in counts:
                print(f"{name}:{number}: {counts}: {source.line(name, number)}")


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("build")
    parser.add_argument("--missing", metavar="PREFIX")
    args = parser.parse_args()
    files = gather(args.build)
    source = Source(ROOT)
    if args.missing is not None:
        missing(files, args.missing, source)
        return 0
    totals = table(files)
    complaints, excused = judge(files, Lines.read(HERE / "engine.list"), unreachable_sites(),
                                source)
    print("\n".join(complaints))
    engine, volume = totals[ENGINE, "all"], totals[VOLUME, "all"]
    print(f"engine: {totals[ENGINE, 'seen']} of {engine} outcomes seen, {excused} excused, "
          f"{len(complaints)} complaints")
    volume_share = share(totals[VOLUME, "seen"], volume)
    print(f"volume layer: {totals[VOLUME, 'seen']} of {volume} outcomes seen, "
          f"{volume_share:.1f}% (wanted {VOLUME_LEAST}%)")
    return 1 if complaints or not engine or volume_share < VOLUME_LEAST else 0


if __name__ == "__main__":
    sys.exit(main())
