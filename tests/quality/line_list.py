"""Lists of lines of the source with a word on each: the shape of the files *.list here.

    file.cpp: the text of the line
        what: why

`what` says which of the things on that line is meant; a line that stands more than once in the
file is meant wherever it stands, or with file.cpp#2 only where it stands the second time. An
empty line or one that starts with # says nothing."""

import pathlib


class Lines:
    """Remarks by (file, text of the line, what)."""

    def __init__(self, text):
        self.why = {}
        self.used = set()
        place = None
        for number, line in enumerate(text.splitlines(), 1):
            if not line.strip() or line.startswith("#"):
                continue
            if line[0].isspace():
                what, separator, why = line.strip().partition(": ")
                if place is None or not separator:
                    raise SystemExit(f"line {number} of a list is neither a place nor a remark")
                self.why[(*place, what)] = why
            else:
                name, _, code = line.partition(": ")
                place = (name, code.strip())

    @classmethod
    def read(cls, path):
        return cls(pathlib.Path(path).read_text(encoding="utf-8"))

    def find(self, name, code, what):
        """The remark, or None; remembers that it was asked for."""
        key = (name, code.strip(), what)
        if key in self.why:
            self.used.add(key)
        return self.why.get(key)

    def remarks(self, name, code):
        """Yields all remarks on a line, as (what, why)."""
        for (file, text, what), why in self.why.items():
            if (file, text) == (name, code.strip()):
                yield what, why

    def has(self, name, code, what):
        return (name, code.strip(), what) in self.why

    def unused(self):
        return sorted(set(self.why) - self.used)
