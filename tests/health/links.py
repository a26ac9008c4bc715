#!/usr/bin/env python3
"""Links: every relative link in a Markdown file of the project leads to a file that is there and,
behind a #, to one of its headings. Links into the network are not followed.

usage: links.py [--site FOLDER]    with it, the links inside a built site are checked instead"""

import html.parser
import pathlib
import re
import sys
import urllib.parse

import common

CODE = re.compile(r"(?ms)^(`{3,}|~{3,}).*?^\1[`~]*$|`+[^`\n]+`+|<!--.*?-->")
INDENTED = re.compile(r"(?m)(?<=\n\n)(?: {4}[^\n]*(?:\n|$)|\n(?= {4}))+")
INLINE = re.compile(r"\]\(<?([^()\s>]+)>?(?:\s+\"[^\"]*\")?\)")
REFERENCE = re.compile(r"(?m)^ {0,3}\[[^\]]+\]:\s+<?([^\s>]+)>?")
HEADING = re.compile(r"(?m)^#{1,6}\s+(.*?)\s*#*\s*$")
OUTSIDE = re.compile(r"^(?:[a-z][a-z0-9+.-]*:|//)", re.I)


def without_code(text):
    """Code turned into blanks, so that what looks like a link in it is none; lines stay."""
    def blank(match):
        return re.sub(r"[^\n]", " ", match.group(0))
    return INDENTED.sub(blank, CODE.sub(blank, text))


def slugs(text):
    """The anchors of the headings, as sites that show Markdown make them."""
    found = set()
    for match in HEADING.finditer(re.sub(r"(?ms)^(`{3,}).*?^\1$", "", text)):
        plain = re.sub(r"\[([^\]]*)\]\([^)]*\)", r"\1", match.group(1)).lower()
        slug = re.sub(r"[^\w\- ]", "", plain).replace(" ", "-")
        number = 0
        while (unique := f"{slug}-{number}" if number else slug) in found:
            number += 1
        found.add(unique)
    return found


def check_link(root, file, target):
    """What is wrong with a link of `file`, None if nothing is."""
    if OUTSIDE.match(target):
        return None
    path, _, anchor = target.partition("#")
    goal = (file.parent / urllib.parse.unquote(path)).resolve() if path else file
    if not goal.exists():
        return f"{target}: no such file"
    if not goal.is_relative_to(root.resolve()):
        return f"{target}: leads out of the project"
    if anchor and goal.suffix == ".md" and anchor not in slugs(goal.read_text(encoding="utf-8")):
        return f"{target}: no such heading"
    return None


def check(root):
    findings = []
    for file in common.text_files(root):
        if file.suffix != ".md":
            continue
        text = without_code(file.read_text(encoding="utf-8"))
        for pattern in (INLINE, REFERENCE):
            for match in pattern.finditer(text):
                wrong = check_link(root, file, match.group(1))
                if wrong:
                    line = common.line_of(text, match.start(1))
                    findings.append(f"{file.relative_to(root)}:{line}: {wrong}")
    return findings


class Page(html.parser.HTMLParser):
    """The links of a page, with their lines, and the anchors it offers."""

    def __init__(self, text):
        super().__init__()
        self.links, self.anchors = [], set()
        self.feed(text)

    def handle_starttag(self, tag, attributes):
        for name, value in attributes:
            if name in ("href", "src", "data") and value is not None:
                self.links.append((self.getpos()[0], value))
            if name == "id" or (name == "name" and tag == "a"):
                self.anchors.add(value)


def check_site(folder):
    """The links between the pages of a site, to files and to anchors."""
    pages = {file.resolve(): Page(file.read_text(encoding="utf-8", errors="replace"))
             for file in sorted(folder.rglob("*.html"))}
    findings = [] if pages else [f"{folder}: holds no page"]
    for file, page in pages.items():
        for line, link in page.links:
            path, _, anchor = urllib.parse.unquote(link).partition("#")
            goal = (file.parent / path.partition("?")[0]).resolve() if path else file
            if OUTSIDE.match(link) or link in ("", "#"):
                continue
            if not goal.is_file():
                findings.append(f"{file.name}:{line}: {link}: no such file")
            elif anchor and goal in pages and anchor not in pages[goal].anchors:
                findings.append(f"{file.name}:{line}: {link}: no such anchor")
    return findings


if __name__ == "__main__":
    if len(sys.argv) == 3 and sys.argv[1] == "--site":
        sys.exit(common.finish("links of the site", check_site(pathlib.Path(sys.argv[2]))))
    common.run("links", check)
