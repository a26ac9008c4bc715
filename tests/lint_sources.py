"""What the sources of the project include, read from the sources themselves."""

import functools
import os
import re
import shlex

INCLUDE = re.compile(r'^\s*#\s*include\s*(?:"([^"]+)"|<([^>]+)>)', re.M)


@functools.cache
def named_in(path):
    """The headers a file names: those in quotes, and those in angle brackets."""
    with open(path, encoding="utf-8") as file:
        found = INCLUDE.findall(file.read())
    return [own for own, _ in found if own], [system for _, system in found if system]


class Unit:
    """A source and the command that compiles it."""

    def __init__(self, entry):
        self.source = os.path.abspath(entry["file"])
        self.folder = entry["directory"]
        self.command = entry["command"]
        self.compiler, *words = shlex.split(self.command.replace(" -isystem ", " -isystem"))
        self.options, skip = [], False
        for word in words:
            if skip or word == "-o":
                skip = not skip
            elif word not in ("-c", entry["file"]):
                self.options.append(word)

    def files(self):
        """The source and every header of the project that it includes."""
        return self._closure[0]

    def system_headers(self):
        """The headers of others that one of these files names."""
        return self._closure[1]

    @functools.cached_property
    def _closure(self):
        places = self._places()
        seen, system, rest = set(), set(), [self.source]
        while rest:
            path = rest.pop()
            if path in seen:
                continue
            seen.add(path)
            own, others = named_in(path)
            system.update(others)
            for name in own:
                tried = [os.path.dirname(path), *places]
                there = [os.path.normpath(os.path.join(place, name)) for place in tried]
                rest.extend([path for path in there if os.path.isfile(path)][:1])
        return sorted(seen), system

    def _places(self):
        """Where headers are looked for."""
        places = [word.removeprefix("-I").removeprefix("-isystem") for word in self.options
                  if word.startswith(("-I", "-isystem"))]
        return [os.path.join(self.folder, place) for place in places]
