#!/usr/bin/env python3
"""Layers: a file may include, and its object may use, only what stands on its own line or on one
before it. docs/architecture.md gives the same order for people.

usage: layers.py [ENGINE_LIBRARY]    with it, what nm says of its objects is checked too"""

import re
import subprocess
import sys

import common

# The house: each area with the areas it may use besides itself.
AREAS = {
    "platform": set(),
    "names": {"platform"},
    "format": {"platform"},
    "interface": {"platform", "format"},
    "engine": {"platform", "format", "interface", "names"},
    "check": {"platform", "format", "names"},
    "volume": {"platform", "format", "interface", "engine-public", "names", "host"},
    "records": {"platform", "format", "interface", "engine-public", "names", "volume"},
    "host": {"platform"},
    "c": {"platform", "host", "format", "interface", "names", "volume", "records", "check"},
    "tool": {"platform", "format", "interface", "engine-public", "names", "host", "volume",
             "check", "records"},
}
# Private engine headers that code above the engine may use, and why.
ENGINE_PUBLIC = {"bytes.h": "big-endian loads and stores of the whole project"}

# Inside the engine, lowest first.
LINES = [
    "bytes node_desc one_piece prefetch report noderef own_change",
    "node_access keys_compare header_record slots hints",
    "cache cache_dirty key_shape next_node scratch",
    "map_walk path_level path_find path_deliver path_check plain_record node_child node_search way",
    "path_iterate badblocks",
    "record_insert record_delete record_move record_update separator",
    "map_alloc space_fork space_extend space_reserve space_clump",
    "balance insert_entry insert_level insert_node",
    "delete_tree",
    "tree_open tree_flush tree_create",
]
RANK = {stem: rank for rank, line in enumerate(LINES) for stem in line.split()}
INCLUDE = re.compile(r'^\s*#\s*include\s+"([^"]+)"', re.M)


def area(name):
    """The area of a file under src/."""
    if name.startswith("platform/host/"):
        return "host"
    if name.startswith("platform/"):
        return "platform"
    if name.startswith("hfs/treehfs/"):
        return "engine"
    for folder in ("volume", "check", "records"):
        if name.startswith(f"hfs/{folder}/"):
            return folder
    for folder in ("c", "tool"):
        if name.startswith(folder + "/"):
            return folder
    stem = name.removeprefix("hfs/").split(".")[0]
    if stem == "format":
        return "format"
    if stem.startswith("names"):
        return "names"
    return "interface" if stem in ("treehfs", "fshfs") else None


def include_findings(root):
    findings, source = [], root / "src"
    for file in common.files(root, ["src"], ["*.h", "*.cpp", "*.inc"]):
        name = file.relative_to(source).as_posix()
        own = area(name)
        if own is None:
            findings.append(f"src/{name}: belongs to no area")
            continue
        if own == "engine" and file.stem not in RANK:
            findings.append(f"src/{name}: has no line in the engine's order")
        text = common.blank(file.read_text(encoding="utf-8"), keep_strings=True)
        for match in INCLUDE.finditer(text):
            target = match.group(1)
            if not (source / target).exists():
                continue
            other = area(target)
            where = f"src/{name}:{common.line_of(text, match.start())}"
            if own == "engine" and other == "engine":
                upper = target.rsplit("/", 1)[1].split(".")[0]
                if RANK.get(upper, 0) > RANK.get(file.stem, 99):
                    findings.append(f"{where}: {file.stem} includes {upper}, which is above it")
                continue
            if other == "engine" and target.rsplit("/", 1)[1] in ENGINE_PUBLIC:
                other = "engine-public"
            if other != own and other not in AREAS[own]:
                findings.append(f"{where}: {own} includes {target}")
    return findings


def parse_nm(text):
    """Defined and used symbols by object, from `nm -A -P`."""
    defined, used = {}, {}
    for line in text.splitlines():
        match = re.match(r".*\[(\w+)\.(?:cpp\.)?o(?:bj)?\]: (\S+) (\w)", line)
        if not match:
            continue
        stem, symbol, kind = match.groups()
        if kind == "U":
            used.setdefault(stem, set()).add(symbol)
        elif kind in "TDBR":
            defined[symbol] = stem
    return defined, used


def symbol_findings(listing):
    findings, (defined, used) = [], parse_nm(listing)
    for stem in sorted(used):
        for symbol in sorted(used[stem]):
            owner = defined.get(symbol, stem)
            if RANK.get(owner, 0) > RANK.get(stem, 99):
                findings.append(f"{stem} uses {symbol} of {owner}, which is above it")
    return findings


def check(root, library=None):
    findings = include_findings(root)
    if library:
        listed = subprocess.run(["nm", "-A", "-P", library], capture_output=True, text=True,
                                check=True)
        findings += symbol_findings(listed.stdout)
    return findings


if __name__ == "__main__":
    common.run("layers", check, sys.argv[1:])
