#!/usr/bin/env python3
"""The catalogue of sites. A site is the stable number of one check of the engine; this collects
them from the source, fails when a number has two owners, and compares docs/sites.txt.
`--write` writes the catalogue again."""

import re
import sys

import common

CALL = re.compile(r"\b(HFS_TRY|HFS_ASSERT|Fail|AssertFailed|Report)\s*\(")
KIND = {"HFS_TRY": "pass", "HFS_ASSERT": "assert", "Fail": "fail", "AssertFailed": "assert",
        "Report": "report"}
# Where the forms themselves are defined; helpers there hand a site through.
DEFINING = {"report.h", "report.cpp"}
HEAD = """\
# Sites: the stable number of each check of the engine. Written by `./dev docs`.
# pass: a status on its way up; fail: a failure arises here; report: reported, then handled;
# assert: prints and goes on.
# site  kind    file                 what is checked or called
"""


def arguments(text, start):
    """The arguments of the call whose opening bracket is at start - 1, split at outer commas."""
    depth, parts, begin, position = 1, [], start, start
    while depth > 0 and position < len(text):
        character = text[position]
        if character in "([{":
            depth += 1
        elif character in ")]}":
            depth -= 1
        elif character == "," and depth == 1:
            parts.append(text[begin:position])
            begin = position + 1
        position += 1
    parts.append(text[begin:position - 1])
    return [re.sub(r"\s+", " ", part).strip() for part in parts]


def collect(root):
    """All sites as (number, kind, file, what) and the findings of calls without a number."""
    sites, findings = [], []
    for file in common.files(root, ["src/hfs/treehfs"], ["*.h", "*.cpp"]):
        if file.name in DEFINING:
            continue
        text = common.blank(file.read_text(encoding="utf-8"))
        for match in CALL.finditer(text):
            parts = arguments(text, match.end())
            where = f"{file.relative_to(root)}:{common.line_of(text, match.start())}"
            if match.start() >= 2 and text[match.start() - 2:match.start()] in ("->", "::"):
                continue
            if not re.fullmatch(r"\d+", parts[-1]):
                findings.append(f"{where}: {match.group(1)}: site '{parts[-1]}' is no number")
                continue
            fails = match.group(1) == "Fail" and len(parts) > 2
            what = parts[1] if fails else ", ".join(parts[:-1])
            sites.append((int(parts[-1]), KIND[match.group(1)], file.name, what, where))
    return sorted(sites), findings


def catalogue(sites):
    lines = [f"{number:6}  {kind:6}  {file:19}  {what}".rstrip()
             for number, kind, file, what, _ in sites]
    return HEAD + "\n".join(lines) + ("\n" if lines else "")


def check(root):
    sites, findings = collect(root)
    owners = {}
    for number, _, _, _, where in sites:
        if number in owners:
            findings.append(f"{where}: site {number} belongs to {owners[number]} already")
        owners.setdefault(number, where)
    document = root / "docs/sites.txt"
    if not document.exists() or document.read_text(encoding="utf-8") != catalogue(sites):
        findings.append("docs/sites.txt is stale: run ./dev docs")
    return findings


def write(root):
    (root / "docs").mkdir(exist_ok=True)
    (root / "docs/sites.txt").write_text(catalogue(collect(root)[0]), encoding="utf-8")


if __name__ == "__main__":
    if sys.argv[1:] == ["--write"]:
        write(common.project_root())
    common.run("sites", check)
