#!/usr/bin/env python3
"""The catalogue of sites. A site is the stable number of one check of the engine; this collects
them from the source, fails when a number has two owners, and compares docs/sites.txt.
`--write` writes the catalogue again."""

import re
import sys

import common

FORMS = ("HFS_TRY", "HFS_ASSERT", "Fail", "AssertFailed", "Report")
# A helper that hands its last parameter on as the site: its calls are the owners.
HELPER = re.compile(r"\b(?:int|void|bool)\s+(\w+)\(([^()]*\bint site)\)\s*\{([^{}]*)\}")
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


def condition(text, position):
    """The condition of the `if` that guards a call, on one line; empty when there is none."""
    guard = text.rfind("if (", 0, position)
    if guard < 0 or "}" in text[guard:position]:
        return ""
    checked = arguments(text, guard + len("if ("))[0]
    unlikely = re.fullmatch(r"HFS_UNLIKELY\((.*)\)", checked)
    return unlikely.group(1) if unlikely else checked


def read_file(text, name, where, sites, findings):
    """Adds the sites of one file; its helpers count in this file only."""
    helpers = {match.group(1): match for match in HELPER.finditer(text)
               if re.search(r"\b(?:Fail|AssertFailed|Report)\([^;]*\bsite\)", match.group(3))}
    inside = [match.span() for match in helpers.values()]
    for match in re.finditer(r"\b(" + "|".join((*FORMS, *helpers)) + r")\s*\(", text):
        if any(start <= match.start() < end for start, end in inside):
            continue
        form, parts = match.group(1), arguments(text, match.end())
        place = f"{where}:{common.line_of(text, match.start())}"
        if not re.fullmatch(r"\d+", parts[-1]):
            findings.append(f"{place}: {form}: site '{parts[-1]}' is no number")
            continue
        what = ", ".join(parts[:-1])
        if form == "Fail" or form in helpers:
            reason = re.search(r"kReason\w+", parts[1] if form == "Fail"
                               else helpers[form].group(3))
            guard = condition(text, match.start())
            what = (reason.group(0) if reason else form) + (f" if {guard}" if guard else "")
        elif form == "AssertFailed":
            what = f"not ({condition(text, match.start())})"
        sites.append((int(parts[-1]), KIND.get(form, "fail"), name, what, place))


def collect(root):
    """All sites as (number, kind, file, what, place) and the findings of calls without a number."""
    sites, findings = [], []
    for file in common.files(root, ["src/hfs/treehfs"], ["*.h", "*.cpp"]):
        if file.name not in DEFINING:
            text = common.blank(file.read_text(encoding="utf-8"))
            read_file(text, file.name, file.relative_to(root), sites, findings)
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
