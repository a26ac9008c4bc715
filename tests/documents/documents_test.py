"""Holds what the documents show against what the program does.

In README.md and docs/*.md:
- a ```console block is a transcript: its `$ ` lines are run by a shell in a folder that holds
  small.img, and print what follows, to the byte. A line `...` stands for any lines. Durations are
  taken as equal.
- a table row whose second column is a command in backticks that starts with `treehfs ` names in
  its third column, in backticks too, one line that the command prints.
- a block behind `<!-- file: PATH -->` is that file.
And docs/pictures/tree.svg is what the script beside it draws.
"""

import os
import pathlib
import re
import shutil
import subprocess
import sys

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "tool"))
import harness  # noqa: E402

ROOT = harness.ROOT
DURATION = re.compile(r"\d+\.\d\d s\b")


def pages():
    return [ROOT / "README.md", *sorted((ROOT / "docs").glob("*.md"))]


def blocks(text):
    """Yields (language, text of the line before, line number, content) of each fenced block."""
    lines = text.split("\n")
    start = None
    for number, line in enumerate(lines):
        if not line.startswith("```"):
            continue
        if start is None:
            start = number
            continue
        before = next((l for l in reversed(lines[:start]) if l.strip()), "")
        yield lines[start][3:].strip(), before, start + 1, "\n".join(lines[start + 1:number]) + "\n"
        start = None


def shell(command):
    """What a reader gets who types the command beside small.img."""
    folder = harness.scratch() / "reader"
    folder.mkdir(exist_ok=True)
    shutil.copy(harness.small_volume(), folder / "small.img")
    path = f"{pathlib.Path(harness.tool()).resolve().parent}{os.pathsep}{os.environ['PATH']}"
    done = subprocess.run(["bash", "-c", command], cwd=folder, env={**os.environ, "PATH": path},
                          stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT, timeout=300)
    return DURATION.sub("# s", done.stdout.decode("utf-8"))


def matches(expected, printed):
    pattern = "".join("(?:.*\n)*?" if line == "...\n" else re.escape(line)
                      for line in DURATION.sub("# s", expected).splitlines(keepends=True))
    return re.fullmatch(pattern, printed) is not None


def transcript_faults(content):
    for part in re.split(r"^(?=\$ )", content, flags=re.MULTILINE):
        if not part:
            continue
        command, _, expected = part.partition("\n")
        if not command.startswith("$ "):
            yield f"output without a command: {command}"
            continue
        printed = shell(command[2:])
        if not matches(expected, printed):
            yield f"{command}\nwritten down:\n{expected}printed:\n{printed}"


def row_faults(text):
    for line in text.split("\n"):
        row = re.fullmatch(r"\|[^|]*\| `(treehfs [^`]*)` \| `([^`]*)` \|", line)
        if row and DURATION.sub("# s", row[2]) not in shell(row[1]).split("\n"):
            yield f"`{row[1]}` prints no line `{row[2]}`"


def page_faults(page):
    text = page.read_text(encoding="utf-8")
    yield from row_faults(text)
    for language, before, line, content in blocks(text):
        if language == "console":
            for fault in transcript_faults(content):
                yield f"line {line}: {fault}"
        source = re.fullmatch(r"<!-- file: (\S+) -->", before)
        if source and (ROOT / source[1]).read_text(encoding="utf-8") != content:
            yield f"line {line}: not what {source[1]} holds"


def picture_faults():
    pictures = ROOT / "docs" / "pictures"
    shell(f"treehfs apply --new 1M,node=512 --save tree.img --force '{pictures}/tree.tr'; "
          "treehfs plot tree.img --kind tree -o tree.svg --force")
    drawn = harness.scratch() / "reader" / "tree.svg"
    if drawn.read_text() != (pictures / "tree.svg").read_text():
        yield "docs/pictures/tree.svg is not what docs/pictures/tree.tr draws"


def main():
    faults = [f"{page.relative_to(ROOT)}: {fault}"
              for page in pages() for fault in page_faults(page)]
    faults += picture_faults()
    shown = sum(len(list(blocks(page.read_text(encoding="utf-8")))) for page in pages())
    for fault in faults:
        print(fault)
    print(f"documents: {len(faults)} faults in {len(pages())} pages with {shown} blocks")
    return 1 if faults or shown == 0 else 0


sys.exit(main())
