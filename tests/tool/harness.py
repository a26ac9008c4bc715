"""What the tests of the command-line tool share: running it, finding sample volumes, skipping
visibly when something a test needs is not there. Standard library only."""

import atexit
import gzip
import lzma
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile

HERE = pathlib.Path(__file__).resolve().parent
ROOT = HERE.parent.parent
SKIPPED = 77
# Every exit code the program may end with.
EXIT_CODES = {0, 1, 4, 8, 12, 16, 32}

_scratch = None


def scratch():
    """A folder that is gone when the test ends."""
    global _scratch
    if _scratch is None:
        _scratch = pathlib.Path(tempfile.mkdtemp(prefix="treehfs-test-"))
        atexit.register(shutil.rmtree, _scratch, ignore_errors=True)
    return _scratch


def tool():
    path = os.environ.get("TREEHFS_TOOL")
    if not path:
        sys.exit("TREEHFS_TOOL names no program")
    return path


def run(*arguments, cwd=None, stdin=b"", timeout=120):
    """Runs the tool; returns (exit code, standard output, standard error) with bytes."""
    done = subprocess.run([tool(), *map(str, arguments)], cwd=cwd, input=stdin,
                          capture_output=True, timeout=timeout)
    return done.returncode, done.stdout, done.stderr


def text(*arguments, **options):
    code, out, err = run(*arguments, **options)
    return code, out.decode("utf-8"), err.decode("utf-8")


def skip(why):
    print("SKIPPED: " + why)
    sys.exit(SKIPPED)


def sample_folder():
    named = os.environ.get("TREEHFS_SAMPLES")
    folder = pathlib.Path(named) if named else ROOT.parent / "shared" / "samples"
    return folder if folder.is_dir() else None


def need_samples():
    folder = sample_folder()
    if folder is None:
        skip("no folder with sample volumes (set TREEHFS_SAMPLES)")
    return folder


def unpack(packed, target):
    """Unpacks an .xz or .gz file; stretches of zeros take no room."""
    opener = gzip.open if packed.suffix == ".gz" else lzma.open
    with opener(packed) as source, open(target, "wb") as out:
        while True:
            block = source.read(1 << 16)
            if not block:
                break
            if block.count(0) == len(block):
                out.seek(len(block), os.SEEK_CUR)
            else:
                out.write(block)
        out.truncate(out.tell())
    return target


def sample(name):
    """Path of an unpacked sample; its packed form must be in the sample folder."""
    target = scratch() / name
    if not target.exists():
        unpack(need_samples() / (name + ".xz"), target)
    return target


def small_volume():
    """A little volume that comes with the project."""
    target = scratch() / "small.img"
    if not target.exists():
        unpack(ROOT / "tests" / "data" / "small.img.gz", target)
    return target


def need_program(name):
    path = shutil.which(name)
    if path is None:
        skip("the program %s is not there" % name)
    return path


def make_tree(folder, count, per_folder=100):
    """Fills `folder` with `count` names, a folder for each hundred of them."""
    made = 0
    names = []
    while made < count:
        parent = "Folder %05d" % (made // per_folder)
        os.makedirs(folder / parent)
        names.append(parent)
        made += 1
        for i in range(min(per_folder - 1, count - made)):
            name = "%s/file number %06d%s" % (parent, made, ".txt" if i % 3 else "")
            (folder / name).touch()
            names.append(name)
            made += 1
    return names


def xorriso_volume(count):
    """An image with an HFS+ volume of `count` names, and the names."""
    need_program("xorriso")
    source = scratch() / ("names-%d" % count)
    source.mkdir()
    names = make_tree(source, count)
    image = scratch() / ("names-%d.iso" % count)
    subprocess.run(["xorriso", "-as", "mkisofs", "-quiet", "-hfsplus", "-o", image, source],
                   check=True, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    shutil.rmtree(source)
    return image, names


def hfs_offset(image):
    """Byte where the volume starts, as the tool itself found it."""
    import json
    code, out, err = run("info", "--json", image)
    assert code == 0, err
    return json.loads(out)["offset"]


class Failures:
    """Collects what is wrong and ends the test."""

    def __init__(self):
        self.texts = []
        self.checks = 0

    def check(self, condition, what):
        self.checks += 1
        if not condition:
            self.texts.append(what)

    def equal(self, found, expected, what):
        self.check(found == expected, "%s:\n  expected %r\n  found    %r" % (what, expected, found))

    def finish(self):
        for line in self.texts[:40]:
            print("FAILED: " + line)
        print("%d checks, %d failed" % (self.checks, len(self.texts)))
        assert self.checks > 0, "nothing was checked"
        sys.exit(1 if self.texts else 0)
