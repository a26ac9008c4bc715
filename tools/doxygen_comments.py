#!/usr/bin/env python3
"""Prints a header with its plain comments as Doxygen wants them (a filter; see docs/Doxyfile).

The sources are commented for those who read them there. Here the same comments become the site's:
- the first comment of a file is the file's;
- a comment on lines of its own describes what follows, up to the next comment, blank line or end
  of the block: several declarations in a row share it;
- a comment behind code describes what stands before it.
"""
import re
import sys

own_line = re.compile(r'^(\s*)//( .*|)$')
behind = re.compile(r'^(.*\S\s+)// (.*)$')
ends_group = re.compile(r'^\s*(\}.*|)$')
opens_block = re.compile(r'[{(,]\s*(//.*)?$')


def filtered(lines):
    is_open = False  # a group of declarations that share a comment
    previous_was_comment = False
    for number, line in enumerate(lines):
        comment = own_line.match(line)
        if is_open and (comment or ends_group.match(line)):
            yield '/// @}'
            is_open = False
        if comment:
            if number == 0:
                yield '/// \\file'
            yield f'{comment[1]}///{comment[2]}'
            previous_was_comment = True
            continue
        code = re.sub(r'\s*//.*', '', line)
        if previous_was_comment and code.endswith(';') and not code.startswith(('#', 'namespace')):
            following = lines[number + 1] if number + 1 < len(lines) else ''
            if following.strip() and not ends_group.match(following) and not own_line.match(following):
                yield '/// @{'
                is_open = True
        previous_was_comment = False
        tail = behind.match(line)
        yield f'{tail[1]}///< {tail[2]}' if tail else line
    if is_open:
        yield '/// @}'


print('\n'.join(filtered(open(sys.argv[1], encoding='utf-8').read().split('\n'))))
