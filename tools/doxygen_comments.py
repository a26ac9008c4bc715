#!/usr/bin/env python3
"""Prints a header with its plain comments as Doxygen wants them (a filter; see docs/Doxyfile).

The sources are commented for those who read them there. Here the same comments become the site's:
- the first comment of a file is the file's;
- a comment on lines of its own describes what follows. Declarations that follow each other without
  a blank line or another comment share it;
- a comment behind code describes what stands before it, also inside such a group;
- a ruled comment, as in `// --- trees ----`, is a heading for those who read the source.
"""
import re
import sys

comment_line = re.compile(r'^(\s*)//( .*|)$')
ruler = re.compile(r'^\s*// --- .* ---+$')
behind = re.compile(r'^(\s*[^\s}/].*)// (.*)$')
opens_scope = re.compile(r'^\s*(class|struct|union|enum|namespace|extern "C"|template|public|private)\b')
literal = re.compile(r'"(\\.|[^"\\])*"|\'(\\.|[^\'\\])\'')


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
        at_edge = depth == 0 and (not code or opens_scope.match(code) or code.startswith('#'))
        depth += depth_change(code)
        if at_edge or depth < 0:
            break
        if depth == 0 and code.endswith((';', '}')):
            declarations += 1
        number += 1
    return number - first if declarations > 1 else 0


def filtered(lines):
    group_ends = -1  # line in front of which a group closes
    after_comment = False
    for number, line in enumerate(lines):
        if number == group_ends:
            yield '/// @}'
        comment = comment_line.match(line)
        if ruler.match(line):
            yield ''
            continue
        if comment:
            if number == 0:
                yield '/// \\file'
            yield f'{comment[1]}///{comment[2]}'
        else:
            length = group_length(lines, number) if after_comment else 0
            if length:
                yield '/// @{'
                group_ends = number + length
            tail = behind.match(line)
            yield f'{tail[1]}///< {tail[2]}' if tail else line
        after_comment = bool(comment)
    if group_ends == len(lines):
        yield '/// @}'


if __name__ == '__main__':
    with open(sys.argv[1], encoding='utf-8') as header:
        print('\n'.join(filtered(header.read().split('\n'))))
