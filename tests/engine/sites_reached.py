#!/usr/bin/env python3
"""Which sites of the engine the tests reached.

Every process that captures reports leaves the sites it saw in a directory, one file each. This
compares their sum with the catalogue docs/sites.txt: a site nobody reached must stand below with
the reason why nothing can reach it, and one that stands below must not have been reached.

usage: sites_reached.py CATALOGUE DIRECTORY FILE...     (FILE: sources that are looked at)
"""
import pathlib
import sys

UNREACHABLE = {
    262: "a key lies inside its record and the record inside the node, so its next block exists",
    294: "data is gathered only when it is longer than its first block",
    1179: "the accessor has refused free space behind its slot",
    1269: "the marking before it succeeded",
    1285: "the marking before it succeeded",
    1296: "the marking before it succeeded",
    1471: "an odd key takes one byte to become even",
    2157: "the compiler aligns the header",
    2187: "the compiler aligns the header",
    2938: "the cache hands every node out with a count of one or more",
    3292: "a load sets the index to 0",
    3754: "a map record is taken only where the format puts it, so all its pieces lie in the node",
    3804: "the walk stops at the piece that holds the bit",
    3830: "as 3754",
    4076: "map nodes are added only when the map is too short, and bits missing are rounded up",
    4117: "every node holds 512 bytes or more",
    4160: "a step along the chain refuses other kinds",
    4181: "as 3754",
    4522: "set a few lines before; nothing in between writes the header",
    4666: "a root has no separator, and a node split before cannot be split by the second key",
    4960: "checked for the whole path before the first change",
    5062: "the lookup before it set it",
    5066: "an existing key has been answered before",
    5370: "every node holds 512 bytes or more",
    9201: "a record that was given room is no longer than the scratch buffer, which is there",
    9213: "as 9201",
    9263: "as 4960",
}


def catalogue(path):
    for line in path.read_text().splitlines():
        words = line.split()
        if words and words[0].isdigit():
            yield int(words[0]), words[2], line


def main():
    path, directory, files = sys.argv[1], sys.argv[2], set(sys.argv[3:])
    seen = set()
    for tally in pathlib.Path(directory).iterdir():
        seen.update(int(word) for word in tally.read_text().split())
    wrong = 0
    count = 0
    for site, source, line in catalogue(pathlib.Path(path)):
        if source not in files:
            continue
        count += 1
        if site in seen and site in UNREACHABLE:
            print("reached, although said to be unreachable:", line)
            wrong += 1
        elif site not in seen and site not in UNREACHABLE:
            print("never reached:", line)
            wrong += 1
    print(f"{count} sites looked at, {wrong} wrong")
    return 1 if wrong or not count else 0


sys.exit(main())
