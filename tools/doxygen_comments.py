#!/usr/bin/env python3
"""Prints a header with its plain comments as Doxygen wants them (a filter; see docs/Doxyfile).

The sources are commented for those who read them there. Here the same comments become the site's:
- the first comment of a file is the file's;
- a comment on lines of its own describes what follows. Declarations that follow each other without
  a blank line or another comment share it; where they have comments of their own it is their title;
- one that a blank line follows is a heading for those who read the source;
- a comment behind code describes what stands before it, also inside such a group.
Comments of C headers are read in the same way.
"""
import os
import re
import sys

comment_line = re.compile(r'^(\s*)//( .*|)$')
behind = re.compile(r'^(\s*[^\s}/].*)// (.*)$')
opens_scope = re.compile(
    r'^\s*(class|struct|union|enum|namespace|extern "C"|template|public|private)\b')
literal = re.compile(r'"(\\.|[^"\\])*"|\'(\\.|[^\'\\])\'')


def in_line_comments(lines):
    """The lines with block comments, as C has them, turned into line comments."""
    inside = False
    for line in lines:
        text = line.rstrip()
        opens = not inside and re.match(r'(.*\s|)/\*(\s|$)', text)
        inside = inside or bool(opens)
        ends = inside and text.endswith('*/')
        if ends:
            text = text[:-2].rstrip()
        if opens:
            line = text.replace('/*', '//', 1)
        elif inside:
            line = re.sub(r'^(\s*?) ?(\*|$)', r'\1//', text, count=1)
        inside = inside and not ends
        yield line


def code_of(line):
    """The line without its comment and without what literals hold."""
    return re.sub(r'\s*//.*', '', literal.sub('0', line)).rstrip()


def depth_change(code):
    return sum(code.count(c) for c in '({[') - sum(code.count(c) for c in ')}]')


def group_length(lines, first):
    """How many lines from `first` on are declarations that share the comment before them; 0 if
    there is but one, or if what follows opens a scope of its own."""
    declarations, depth, number = 0, 0, first
    while number < len(lines):
        code = code_of(lines[number])
        is_macro = code.startswith('#define ')
        at_edge = depth == 0 and (not code or opens_scope.match(code) or
                                  code.startswith('#') and not is_macro)
        depth += depth_change(code)
        if at_edge or depth < 0:
            break
        if depth == 0 and (is_macro or code.endswith((';', '}'))):
            declarations += 1
        number += 1
    return number - first if declarations > 1 else 0


def named(comment):
    """A comment as the heading of a group: its first sentence is the title."""
    text = ' '.join(line.strip().removeprefix('//').strip() for line in comment)
    title, _, rest = text.partition('. ')
    yield '/// \\name ' + title.rstrip('.')
    if rest:
        yield '/// ' + rest


def without_commands(line):
    """A comment whose backslashes and at signs Doxygen takes as they are."""
    text = line.replace('//', '///', 1)
    return text if re.match(r'\s*/// {4}', text) else re.sub(r'[\\@]', r'\\\g<0>', text)


def filtered(lines, name=''):
    """The lines of the header `name` as Doxygen wants them."""
    number = 0
    group_ends = -1  # line in front of which a group closes
    while number < len(lines):
        if number == group_ends:
            yield '/// @}'
        first = number
        while number < len(lines) and comment_line.match(lines[number]):
            number += 1
        comment = lines[first:number]
        if not comment:
            tail = behind.match(lines[number])
            yield f'{tail[1]}///< {tail[2]}' if tail else lines[number]
            number += 1
            continue
        is_heading = first > 0 and (number == len(lines) or not lines[number].strip())
        length = group_length(lines, number)
        if first == 0:
            yield f'/// \\file {name}'.rstrip()
        if is_heading:
            yield from [''] * len(comment)
        elif length and behind.match(lines[number]):
            yield from named(comment)
        else:
            yield from map(without_commands, comment)
        if length:
            yield '/// @{'
            group_ends = number + length
    if group_ends == len(lines):
        yield '/// @}'


if __name__ == '__main__':
    with open(sys.argv[1], encoding='utf-8') as header:
        lines = list(in_line_comments(header.read().split('\n')))
    print('\n'.join(filtered(lines, os.path.abspath(sys.argv[1]))))
