#!/usr/bin/env python3
"""Lines covered by the tests, by source file, from the counters of a coverage build.

usage: coverage.py BUILD_FOLDER"""

import collections
import gzip
import json
import os
import pathlib
import subprocess
import sys
import tempfile


def counters(build):
    """Yields gcov's JSON documents for every counter file of the build."""
    notes = sorted(pathlib.Path(build).resolve().glob("src/**/*.gcda"))
    if not notes:
        sys.exit(f"coverage: no counters in {build}: build the coverage preset and run its tests")
    with tempfile.TemporaryDirectory() as folder:
        subprocess.run(["gcov", "--json-format", *map(str, notes)], cwd=folder, check=True,
                       stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        for document in pathlib.Path(folder).glob("*.gcov.json.gz"):
            with gzip.open(document, "rt", encoding="utf-8") as file:
                yield json.load(file)


def main():
    root = pathlib.Path(__file__).resolve().parents[1]
    lines = collections.defaultdict(dict)
    for document in counters(sys.argv[1]):
        for entry in document["files"]:
            path = os.path.join(document["current_working_directory"], entry["file"])
            name = os.path.relpath(os.path.realpath(path), root)
            if not name.startswith("src/"):
                continue
            for line in entry["lines"]:
                seen = lines[name].get(line["line_number"], 0)
                lines[name][line["line_number"]] = seen + line["count"]
    total = hit = 0
    for name in sorted(lines):
        counts = lines[name].values()
        covered = sum(1 for count in counts if count)
        total, hit = total + len(counts), hit + covered
        print(f"{name:44} {covered:5} of {len(counts):5}  {100 * covered / len(counts):5.1f}%")
    print(f"{'all':44} {hit:5} of {total:5}  {100 * hit / total:5.1f}%")


if __name__ == "__main__":
    main()
