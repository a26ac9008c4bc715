"""The listings of every sample volume, name by name, against those of other programs that can read
it, and against the lists of paths that belong to some samples."""

import re
import shutil
import subprocess
import unicodedata

import harness

SAMPLES = ["plain.img", "blank.img", "hardlinks-small.img", "many-names.img", "noattr.img",
           "linux-512.img", "linux-hfsx-1024.img", "linux-2048-cp.img", "hfsx.img",
           "hfsx-app.img", "wrapped.img", "hardlinks-journaled.img", "attributes-journaled.img",
           "attributes-nine.img", "attribute-fork.img", "names-spotlight.img",
           "mbr-journaled.img", "gpt-open-journal.img", "iso-2000-b512.hfs", "iso-20000.hfs"]
# What each of the others is known not to read.
NOT_FLS = {"linux-512.img", "linux-hfsx-1024.img", "linux-2048-cp.img"}
NOT_FSHFSINFO = {"noattr.img", "wrapped.img", "iso-2000-b512.hfs", "iso-20000.hfs"}
OFFSETS = {"mbr-journaled.img": 32256, "gpt-open-journal.img": 20480, "wrapped.img": 45056}

checks = harness.Failures()
harness.need_samples()


def ours(image):
    code, out, err = harness.run("ls", "-R", "-a", "-0", image)
    assert code == 0, err
    return [path.decode("utf-8") for path in out.split(b"\0")[:-1]]


def partition_only(image):
    """The volume alone: not every lister takes an offset."""
    offset = OFFSETS.get(image.name)
    if offset is None:
        return image
    target = harness.scratch() / ("cut-" + image.name)
    if not target.exists():
        subprocess.run(["dd", "if=%s" % image, "of=%s" % target, "bs=512", "conv=sparse",
                        "skip=%d" % (offset // 512), "status=none"], check=True)
    return target


def masked(path):
    """Control characters and NUL signs as fls shows them."""
    return re.sub("[\x00-\x1f\x7f\u2400]", "^", path)


def plane_zero(path):
    """fshfsinfo gets characters outside the basic plane wrong."""
    return re.sub("[\U00010000-\U0010ffff]", "?", path)


def by_fls(image):
    out = subprocess.run(["fls", "-r", "-p", partition_only(image)], check=True,
                         capture_output=True).stdout.decode("utf-8")
    paths = []
    for line in out.splitlines():
        kind, path = line.split("\t", 1)
        if re.fullmatch(r"\$\w+", path) and int(re.search(r"(\d+):$", kind)[1]) < 16:
            continue  # the special files, which are no catalog items
        paths.append("/" + path)
    return paths


def by_7z(image):
    done = subprocess.run(["7z", "l", "-ba", "-slt", partition_only(image)], capture_output=True)
    # The first one is the image itself.
    return [line[7:] for line in done.stdout.decode("utf-8").splitlines()
            if line.startswith("Path = ")][1:]


def by_fshfsinfo(image):
    out = subprocess.run(["fshfsinfo", "-H", partition_only(image)], check=True,
                         capture_output=True).stdout.decode("utf-8")
    return [line for line in out.splitlines() if line.startswith("/") and line != "/"]


def compare(name, lister, found, expected):
    found, expected = sorted(found), sorted(expected)
    if found != expected:
        only_ours = [path for path in found if path not in set(expected)][:3]
        only_theirs = [path for path in expected if path not in set(found)][:3]
        checks.check(False, "%s: %s differs; only we list %r, only it lists %r" %
                     (name, lister, only_ours, only_theirs))
    checks.check(True, name)


def check_sample(name):
    image = harness.sample(name)
    paths = ours(image)
    code, text, remarks = harness.text("ls", "-R", "-a", image)
    checks.equal(len(text.splitlines()), len(paths), name + ": lines of the readable list")
    code, found, err = harness.text("find", image)
    checks.equal(found, text, name + ": find without conditions")
    # Held in small pieces, nodes and records read the same.
    checks.equal(harness.text("ls", "-R", "-a", "--map", "512", image), (0, text, remarks),
                 name + ": in pieces of 512 bytes")
    for tree in ("c", "a"):
        whole_dump = harness.text("dump", "-t", tree, "--values", "full", image)
        checks.equal(harness.text("dump", "-t", tree, "--values", "full", "--map", "512", image),
                     whole_dump, "%s: dump of %s in pieces" % (name, tree))
    if shutil.which("fls") and name not in NOT_FLS:
        compare(name, "fls", [masked(path) for path in paths],
                [masked(path) for path in by_fls(image)])
    if shutil.which("7z"):
        # It puts the volume's name in front and names private folders its own way.
        theirs = by_7z(image)
        checks.equal(len(paths), len(theirs), name + ": number of names 7z lists")
        own = {path.rsplit("/", 1)[1] for path in paths if "HFS+ Private" not in path}
        others = {path.rsplit("/", 1)[-1].replace("\u2400", "^") for path in theirs}
        missing = [x for x in own if x not in others and not re.search("[:\x00-\x1f]", x)]
        checks.equal(missing[:3], [], name + ": names 7z does not list")
    if shutil.which("fshfsinfo") and name not in NOT_FSHFSINFO:
        code, escaped, err = harness.text("ls", "-R", "-a", image)
        compare(name, "fshfsinfo", [plane_zero(path) for path in escaped.splitlines()],
                [plane_zero(path) for path in by_fshfsinfo(image)])


for sample_name in SAMPLES:
    check_sample(sample_name)

for name in ("iso-2000-b512", "iso-20000"):
    listed = harness.sample(name + ".paths").read_text("utf-8").splitlines()
    code, out, err = harness.text("ls", "-R", "--nfc", harness.sample(name + ".hfs"))
    expected = sorted(unicodedata.normalize("NFC", "/" + line.strip("./").rstrip("/"))
                      for line in listed if line.strip("./"))
    found = sorted(unicodedata.normalize("NFC", line) for line in out.splitlines())
    compare(name, "its list of paths", found, expected)
whole = harness.sample("iso-2000-b512.iso")
checks.equal(sorted(ours(whole)), sorted(ours(harness.sample("iso-2000-b512.hfs"))),
             "the volume inside its partition map")
checks.finish()
