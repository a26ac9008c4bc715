"""Every command on every kind of wrong input: one line on standard error that says what, where and
what to do, and the exit code that belongs to it. The tables are complete by construction: commands
come from the program's own help, and one that no table knows fails the test."""

import concurrent.futures
import os
import struct
import subprocess

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()

# How each command is called on an image. `-` in place of one: it takes none.
CALLS = {
    "info": "info IMAGE", "check": "check IMAGE", "ls": "ls IMAGE", "find": "find IMAGE",
    "dump": "dump IMAGE", "node": "node IMAGE root", "stats": "stats IMAGE",
    "plot": "plot IMAGE -o NEW.svg", "badblocks": "badblocks IMAGE", "diff": "diff IMAGE IMAGE",
    "scan": "scan IMAGE", "create-tree": "create-tree IMAGE", "rebuild": "rebuild IMAGE",
    "apply": "apply IMAGE ok.tr", "shell": "shell IMAGE", "export": "export IMAGE",
    "import": "import IMAGE ok.jsonl", "metadump": "metadump IMAGE -o NEW.img",
    "undo": "undo IMAGE ok.undo", "bench": "bench IMAGE --records 10",
    "format": "-", "demo": "-", "completion": "-", "help": "-", "version": "-",
}
IMAGE_COMMANDS = [name for name, call in CALLS.items() if call != "-"]

good = vb.volume()
(folder / "good.img").write_bytes(good)
(folder / "ok.tr").write_text("use catalog\n")
CATALOG = vb.CATALOG_BLOCK * vb.BLOCK


def write(name, data):
    (folder / name).write_bytes(bytes(data))
    return name


def patched(data, at, piece):
    out = bytearray(data)
    out[at:at + len(piece)] = piece
    return out


def run(line, name):
    words = line.replace("NEW", "new-%s" % name).split()
    done = subprocess.run([harness.tool(), *words], cwd=folder, input=b"", capture_output=True,
                          timeout=120)
    return done.returncode, done.stdout.decode("utf-8", "replace"), done.stderr.decode()


def run_all(rows):
    """Runs (key, command line) and returns {key: (code, out, err)}; two at a time."""
    with concurrent.futures.ThreadPoolExecutor(2) as pool:
        keys = [key for key, _ in rows]
        return dict(zip(keys, pool.map(lambda row: run(row[1], "-".join(map(str, row[0]))), rows)))


code, overview, _ = harness.text("help")
named = [line.split()[0] for line in overview.split("Commands:\n")[1].split("\n\n")[0].splitlines()]
checks.equal(sorted(named), sorted(CALLS), "commands of the program and of this table")
code, records, _ = harness.text("export", "good.img", cwd=folder)
(folder / "ok.jsonl").write_text(records, "utf-8")
harness.text("format", "undo.img", "--size", "1M", cwd=folder)
(folder / "fill.tr").write_text("insert 2:x file{id:50}\n")
harness.text("apply", "undo.img", "fill.tr", "--write", "--undo", "ok.undo", cwd=folder)

# --- what holds no volume: the same line from every command ----------------------------------
os.mkdir(folder / "dir.img")
apfs = bytearray(1 << 17)
apfs[32:36] = b"NXSB"
sectors = len(good) // 512
NO_VOLUME = {
    "nope.img": (None, 8, "cannot open: no such file"),
    "dir.img": (None, 8, "is a folder: name an image file or a block device"),
    "none.img": (b"", 8, "no HFS+ volume found (the image is empty)"),
    "noise.img": (b"\x90\xa3\x2e\xf7" + bytes(300000), 8,
                  "no HFS+ volume found (looked at offset 1024, GPT, APM, MBR); first bytes "
                  "90a3 2ef7: if you know where it starts, give --offset"),
    "short.img": (good[:1000], 8,
                  "no HFS+ volume found (looked at offset 1024, GPT, APM, MBR); first bytes "
                  "0000 0000: if you know where it starts, give --offset"),
    "old.img": (patched(bytes(65536), 1024, b"BD"), 8,
                "HFS volume without an HFS+ volume inside (signature 4244 at 1024): "
                "only HFS+ and HFSX are supported"),
    "app.dmg": (bytes(4096) + b"koly" + struct.pack(">II", 4, 512) + bytes(500), 8,
                "compressed disk image (koly trailer): convert it to a raw image first"),
    "two.img": (vb.mbr([(8, sectors, 0xAF), (8 + sectors, sectors, 0xAF)], 8) + good + good, 16,
                "2 HFS+ volumes (partitions 1 and 2): choose with --partition"),
    "apfs.img": (vb.mbr([(8, 256, 0xAF)], 8) + apfs, 8, None),
    "size.img": (patched(good, 1024 + 40, struct.pack(">I", 3000)), 8,
                 "volume header at 1024: block size 3000 is not a power of two: "
                 "try --backup-header"),
}
for name, (data, _, _) in NO_VOLUME.items():
    if data is not None:
        write(name, data)
# undo looks at no volume: it puts bytes back into any file of the right size.
UNDO = {"nope.img": "cannot open: no such file",
        "dir.img": "is a folder: name an image file or a block device"}
found = run_all([((command, image), CALLS[command].replace("IMAGE", image))
                 for command in IMAGE_COMMANDS for image in NO_VOLUME])
apfs_line = found["info", "apfs.img"][2]
checks.check("holds APFS" in apfs_line, "another file system: " + apfs_line)
for (command, image), (code, out, err) in found.items():
    _, expected, text = NO_VOLUME[image]
    line = apfs_line if text is None else "treehfs: %s: %s\n" % (image, text)
    if command == "undo":
        expected = 8
        line = "treehfs: %s: %s\n" % (image, UNDO[image]) if image in UNDO else err
        checks.check(image in UNDO or "the image that ok.undo belongs to had 1,048,576" in err,
                     "undo of %s: %s" % (image, err))
    checks.equal((code, err, out), (expected, line, ""), "%s %s" % (command, image))

# --- volumes that open but lack something ------------------------------------------------------
write("cut.img", good[:100000])
write("root.img", patched(good, CATALOG + 16, struct.pack(">I", 900)))
fallen = vb.plain_leaves()
fallen[0][2], fallen[0][4] = fallen[0][4], fallen[0][2]
write("order.img", vb.volume(catalog=vb.leaf_tree(fallen)))
harness.text("format", "empty.img", "--size", "1M", "--empty", cwd=folder)
CUT = "treehfs: cut.img: image ends at 100,000, the volume at 262,144: reading what is there; " \
      "check and dump need --keep-going\n"
ROOT = "treehfs: root.img: catalog tree: corrupt (A000011C): rootNode 900 is not below " \
       "totalNodes 4 (image offset 0x4010, check H04)"
PLOT = ": catalog, 4 nodes, 2 levels"
ORDER = "is not above the one before it"
# (exit code, text that standard error must hold; "" alone: it must be silent)
DAMAGED = {
    "cut.img": {
        "info": (0, CUT), "check": (8, CUT), "ls": (0, CUT), "find": (0, CUT), "dump": (8, CUT),
        "node": (0, CUT), "stats": (0, CUT), "plot": (0, CUT), "badblocks": (0, CUT),
        "diff": (8, CUT), "scan": (1, CUT), "create-tree": (8, "nothing was changed"),
        "rebuild": (0, "nothing was written"), "apply": (0, CUT), "shell": (0, CUT),
        "export": (0, CUT), "import": (1, CUT), "metadump": (8, CUT), "bench": (8, CUT)},
    "root.img": {
        "info": (8, ""), "check": (4, ""), "badblocks": (0, ""),
        "create-tree": (0, "nothing was written"),
        "shell": (0, ""), **{name: (8, ROOT) for name in (
            "ls", "find", "dump", "node", "stats", "plot", "diff", "scan", "rebuild", "export",
            "import", "metadump", "bench")}, "apply": (0, ROOT.split(": ", 2)[2])},
    "order.img": {
        "info": (0, ""), "check": (4, ""), "ls": (8, ORDER), "find": (8, ORDER),
        "dump": (8, ORDER), "node": (0, ""), "stats": (0, ""), "plot": (0, PLOT),
        "badblocks": (0, ""), "diff": (8, ORDER), "scan": (1, ""),
        "create-tree": (0, "nothing was written"), "rebuild": (8, "the tree is damaged"),
        "apply": (0, ""), "shell": (0, ""), "export": (8, ORDER),
        "import": (1, "nothing was written"), "metadump": (0, ""), "bench": (8, ORDER)},
    "empty.img": {
        "info": (0, ""), "check": (0, ""), "ls": (8, "the root folder has no record"),
        "find": (1, ""), "dump": (0, ""), "node": (1, "catalog tree is empty"), "stats": (0, ""),
        "plot": (0, "catalog, 8 nodes, 0 levels"), "badblocks": (0, ""),
        "diff": (0, ""), "scan": (1, ""), "create-tree": (0, "nothing was written"),
        "rebuild": (0, ""), "apply": (0, ""), "shell": (0, ""), "export": (0, ""),
        "import": (0, "nothing was written"), "metadump": (0, ""),
        "bench": (1, "the catalog tree is empty")},
}
found = run_all([((command, image), CALLS[command].replace("IMAGE", image))
                 for image, row in DAMAGED.items() for command in row])
for (command, image), (code, out, err) in found.items():
    expected, text = DAMAGED[image][command]
    what = "%s %s" % (command, image)
    checks.equal(code, expected, what + ": exit code (%s)" % err.strip())
    if text == "":
        checks.equal(err, "", what + ": standard error")
    elif text is not None:
        checks.check(text in err, "%s: %r is not in %r" % (what, text, err))
    lines = (err if text == CUT else err.replace(CUT, "")).splitlines()
    checks.check(code in (0, 1, 4) or len(lines) == (text != ""),
                 "%s: more than one line: %s" % (what, err))
for image, row in DAMAGED.items():
    checks.equal(sorted(set(IMAGE_COMMANDS) - set(row) - {"undo"}), [],
                 image + ": commands left out")

# --- a tree that is not there ------------------------------------------------------------------
ABSENT = "treehfs: good.img: the volume has no attributes tree: create-tree would add one\n"
TREE_COMMANDS = ["info", "check", "dump", "node", "stats", "plot", "diff", "scan", "rebuild",
                 "export", "bench"]
found = run_all([((command,), CALLS[command].replace("IMAGE", "good.img") + " -t attributes")
                 for command in TREE_COMMANDS])
for (command,), (code, out, err) in found.items():
    checks.equal((code, err), (1, ABSENT), command + " of an absent tree")

# --- no permission -----------------------------------------------------------------------------
def without_permission():
    image = folder / write("locked.img", good)
    image.chmod(0)
    options = {}
    if os.geteuid() == 0:
        folder.chmod(0o755)
        options = {"user": 65534, "group": 65534, "extra_groups": []}
    try:
        subprocess.run([harness.tool(), "version"], check=True, capture_output=True, **options)
    except (OSError, subprocess.CalledProcessError, ValueError):
        print("SKIPPED: no permission: the program cannot be started as another user")
        return
    for command in ("info", "check", "apply"):
        words = CALLS[command].replace("IMAGE", "locked.img").split()
        done = subprocess.run([harness.tool(), *words], cwd=folder, capture_output=True, **options)
        checks.equal((done.returncode, done.stderr.decode()),
                     (8, "treehfs: locked.img: cannot open: permission denied\n"),
                     command + " without permission")


without_permission()

# --- the command line --------------------------------------------------------------------------
WITHOUT_IMAGE = {"format": "format NEW.img --size 1M", "completion": "completion bash",
                 "demo": "demo", "help": "help", "version": "version"}
rows = []
for command in CALLS:
    call = WITHOUT_IMAGE.get(command) or CALLS[command].replace("IMAGE", "good.img")
    rows += [((command, "unknown"), call + " --nonsense"),
             ((command, "twice"), call + " --color always --color never"),
             ((command, "word"), call + " --color red"),
             ((command, "value"), call + " --progress-fd"),
             ((command, "extra"), command + " a b c d")]
rows += [((command, "nothing"), command) for command in IMAGE_COMMANDS if command != "bench"]
found = run_all(rows)
MANY = {"node", "help"}  # take any number of words
for (command, fault), (code, out, err) in found.items():
    what = "%s, %s: %s" % (command, fault, err)
    if fault == "extra":
        checks.check(code != 0 if command in MANY else code == 16 and (
            "is one argument too many" in err or "expected" in err), what)
        continue
    text = {
        "unknown": "treehfs %s: unknown option --nonsense" % command,
        "twice": "treehfs %s: --color is given twice, as 'always' and as 'never': give it once"
                 % command,
        "word": "treehfs %s: --color: 'red' is none of auto|always|never" % command,
        "value": "treehfs %s: --progress-fd needs a value" % command,
        "nothing": "treehfs %s: " % command,
    }[fault]
    checks.equal((code, len(err.splitlines())), (16, 1), what)
    checks.check(err.startswith(text), "%s\n  expected %s" % (what, text))

# --- an xorriso image in an Apple partition map: everything that reads, reads ------------------
small = harness.small_volume()
found = run_all([((command,), CALLS[command].replace("IMAGE", str(small)))
                 for command in IMAGE_COMMANDS if command not in ("undo", "import")])
FULL = {"create-tree": 8, "scan": 1}  # no free block; nothing outside
for (command,), (code, out, err) in found.items():
    checks.equal(code, FULL.get(command, 0), "%s of an image in a partition map: %s"
                 % (command, err))

checks.equal((folder / "good.img").read_bytes(), good, "nothing has changed the good image")
left = [each.name for each in folder.iterdir() if each.name.endswith(".part")]
checks.equal(left, [], "files of commands that failed")
checks.finish()
