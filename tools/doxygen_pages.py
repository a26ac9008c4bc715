#!/usr/bin/env python3
"""Prints a Markdown page so that Doxygen knows its headings by name (a filter; see docs/Doxyfile).

A link to a heading, `#slug` in the page or `page.md#slug`, is what sites that show Markdown make of
it. Doxygen wants a label on the heading, one of its own in all the site: page and slug together.
"""
import pathlib
import re
import sys


def label(page, slug):
    return f'{pathlib.PurePath(page).stem}-{slug}'


def labelled(text, page):
    code = False
    for line in text.split("\n"):
        code ^= line.startswith('```')
        heading = re.match(r'(##+ )(.*)$', line)
        if heading and not code:
            plain = re.sub(r'\[([^\]]*)\]\([^)]*\)', r'\1', heading[2]).lower()
            slug = re.sub(r'[^\w\- ]', '', plain).strip().replace(' ', '-')
            line = f'{line} {{#{label(page, slug)}}}'
        yield re.sub(r'\]\(([^()\s:]*\.md)?#([\w-]+)\)',
                     lambda link: f'](#{label(link[1] or page, link[2])})', line)


if __name__ == '__main__':
    with open(sys.argv[1], encoding='utf-8') as file:
        print('\n'.join(labelled(file.read(), sys.argv[1])), end='')
