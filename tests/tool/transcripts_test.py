"""Runs the commands of the transcripts in golden/ and compares what they print, byte by byte.

A transcript is a list of `$ treehfs ...` lines, each followed by its standard output, then its
standard error with `! ` in front of each line, then `=> N` unless the exit code is 0. Its first
line says which volumes it needs: `# volumes: small`, `built` or `samples`.

`transcripts_test.py --update` writes the transcripts anew; read the difference before you keep it.
"""

import pathlib
import re
import shlex
import sys

import harness
import volume_bytes as vb

GOLDEN = harness.HERE / "golden"


def prepare(kind):
    """Fills the scratch folder with the volumes of one kind; false: they are not there."""
    folder = harness.scratch()
    if kind == "small":
        harness.small_volume()
    elif kind == "built":
        (folder / "good.img").write_bytes(vb.volume())
        overflow = [vb.extents_record(5, 0, 0, [(12288 % 64, 2)]),
                    vb.extents_record(5, 0, 2, [(50, 4)]),
                    vb.extents_record(18, 0, 18, [(60, 1)])]
        tree = vb.leaf_tree([overflow], max_key=10, attributes=2, compare=0)
        (folder / "bad.img").write_bytes(vb.volume(extents=tree))
        fallen = vb.plain_leaves()
        fallen[0][2], fallen[0][4] = fallen[0][4], fallen[0][2]
        (folder / "order.img").write_bytes(vb.volume(catalog=vb.leaf_tree(fallen)))
        binary = vb.leaf_tree([[vb.folder(1, "Vol", 2, 2), vb.thread(2, 1, "Vol"),
                                vb.file(2, "Bob", 16), vb.file(2, "apple", 17),
                                vb.thread(16, 2, "Bob", True),
                                vb.thread(17, 2, "apple", True)]], compare=0xBC)
        (folder / "case.img").write_bytes(
            vb.volume(catalog=binary, signature=b"HX", version=5, files=2, folders=0))
    elif kind == "samples":
        if harness.sample_folder() is None:
            return False
        for packed in ("plain.img", "many-names.img", "attribute-fork.img", "noattr.img",
                       "wrapped.img", "gpt-open-journal.img", "damaged-wrapped.img",
                       "linux-hfsx-1024.img", "iso-2000-b512.iso", "iso-20000.hfs"):
            harness.sample(packed)
    return True


def steady(text):
    """Times differ from run to run."""
    return re.sub(r" in \d+\.\d\d s ", " in 0.00 s ", text)


def perform(line):
    code, out, err = harness.text(*shlex.split(line)[2:], cwd=harness.scratch())
    shown = [line, *steady(out).splitlines(), *("! " + each for each in err.splitlines())]
    return shown + (["=> %d" % code] if code else [])


def replay(path):
    """The transcript as it would be written now; None when its volumes are not there."""
    lines = path.read_text("utf-8").splitlines()
    if not prepare(lines[0].split(":")[1].strip()):
        return None
    shown = [lines[0]]
    for line in lines[1:]:
        if line.startswith("$ "):
            shown += ["", *perform(line)]
    return "\n".join(shown) + "\n"


def main():
    update = sys.argv[1:2] == ["--update"]
    chosen = [pathlib.Path(name).stem for name in sys.argv[2 if update else 1:]]
    checks = harness.Failures()
    skipped = []
    for path in sorted(GOLDEN.glob("*.txt")):
        if chosen and path.stem not in chosen:
            continue
        now = replay(path)
        if now is None:
            skipped.append(path.stem)
        elif update:
            path.write_text(now, "utf-8")
        else:
            old = path.read_text("utf-8")
            for number, (was, is_now) in enumerate(zip(old.splitlines(), now.splitlines()), 1):
                if was != is_now:
                    checks.equal(is_now, was, "%s:%d" % (path.name, number))
                    break
            checks.equal(len(now.splitlines()), len(old.splitlines()), path.name + ": lines")
    if skipped and checks.checks == 0:
        harness.skip("no sample volumes for the transcripts " + ", ".join(skipped))
    if not update:
        checks.finish()


main()
