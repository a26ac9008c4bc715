"""Every kind of bad input gets one line that says what is wrong, where and what to do, and the exit
code that belongs to it."""

import json
import os
import struct
import subprocess

import harness
import volume_bytes as vb

BASE = 0x4000  # of the catalog in the small volume
checks = harness.Failures()
folder = harness.scratch()


def write(name, data):
    (folder / name).write_bytes(bytes(data))
    return name


def expect(arguments, code, line, also=None):
    found, out, err = harness.text(*arguments, cwd=folder)
    what = "treehfs " + " ".join(map(str, arguments))
    checks.equal(found, code, what + ": exit code (" + err.strip() + ")")
    lines = err.splitlines()
    checks.check(len(lines) >= 1 and lines[-1] == line,
                 "%s:\n  expected %s\n  found    %s" % (what, line, lines[-1:] or out))
    checks.equal(len(lines), 1 + len(also or []), what + ": number of lines")
    for extra in also or []:
        checks.check(extra in err, what + ": " + extra + " is missing")


def patched(data, at, piece):
    out = bytearray(data)
    out[at:at + len(piece)] = piece
    return out


good = write("good.img", vb.volume())
whole = (folder / good).read_bytes()

# --- what is no volume -----------------------------------------------------------------------
expect(["info", "nope.img"], 8, "treehfs: nope.img: cannot open: no such file")
write("photo.jpg", b"\xff\xd8\xff\xe0" + bytes(range(256)) * 40)
expect(["info", "photo.jpg"], 8,
       "treehfs: photo.jpg: no HFS+ volume found (looked at offset 1024, GPT, APM, MBR); "
       "first bytes ffd8 ffe0: if you know where it starts, give --offset")
write("old.img", patched(bytes(65536), 1024, b"BD"))
expect(["ls", "old.img"], 8,
       "treehfs: old.img: HFS volume without an HFS+ volume inside (signature 4244 at 1024): "
       "only HFS+ and HFSX are supported")
write("app.dmg", os.urandom(4096) + b"koly" + struct.pack(">II", 4, 512) + bytes(500))
expect(["ls", "app.dmg"], 8,
       "treehfs: app.dmg: compressed disk image (koly trailer): convert it to a raw image first")
os.mkdir(folder / "dir.img")
code, out, err = harness.text("ls", "dir.img", cwd=folder)
checks.check(code == 8 and err.count("\n") == 1 and "treehfs: dir.img: " in err, "folder: " + err)
write("empty.img", b"")
code, out, err = harness.text("check", "empty.img", cwd=folder)
checks.check(code == 8 and err.count("\n") == 1 and "treehfs: empty.img: " in err,
             "length 0: " + err)

# --- partitions ------------------------------------------------------------------------------
sectors = len(whole) // 512
two = vb.mbr([(8, sectors, 0xAF), (8 + sectors, sectors, 0xAF)], 8) + whole + whole
write("two.img", two)
expect(["ls", "two.img"], 16,
       "treehfs: two.img: 2 HFS+ volumes (partitions 1 and 2): choose with --partition")
code, out, err = harness.text("ls", "two.img", "--partition", "2", cwd=folder)
checks.equal((code, out), (0, "alpha\nbeta\ngamma\nlink\n"), "second partition")
code, out, err = harness.text("ls", "two.img", "--offset", "8s", cwd=folder)
checks.equal((code, out), (0, "alpha\nbeta\ngamma\nlink\n"), "volume at sector 8")
code, out, err = harness.text("ls", "two.img", "--offset", "4K", cwd=folder)
checks.equal(code, 0, "volume at 4 KiB")
apfs = bytearray(1 << 20)
apfs[32:36] = b"NXSB"
write("apfs.img", vb.mbr([(8, 2048, 0xAF)], 8) + apfs)
expect(["ls", "apfs.img", "--partition", "1"], 8,
       "treehfs: apfs.img: partition 1 holds APFS (NXSB at 4128), not HFS+")

# --- damaged volumes -------------------------------------------------------------------------
write("cut.img", whole[:100000])
cut = "image ends at 100,000, the volume at 262,144: reading what is there; " \
      "check and dump need --keep-going"
expect(["check", "cut.img"], 8, "treehfs: cut.img: " + cut)
expect(["dump", "cut.img"], 8, "treehfs: cut.img: " + cut)
code, out, err = harness.text("ls", "cut.img", cwd=folder)
checks.equal((code, err), (0, "treehfs: cut.img: %s\n" % cut), "ls of a cut image")
code, out, err = harness.text("check", "--keep-going", "cut.img", cwd=folder)
checks.check(code in (4, 12), "check of a cut image: %d" % code)
write("size.img", patched(whole, 1024 + 40, struct.pack(">I", 3000)))
expect(["info", "size.img"], 8,
       "treehfs: size.img: volume header at 1024: block size 3000 is not a power of two: "
       "try --backup-header")
code, out, err = harness.text("ls", "size.img", "--backup-header", cwd=folder)
checks.equal((code, out), (0, "alpha\nbeta\ngamma\nlink\n"), "through the backup header")
write("root.img", patched(whole, BASE + 16, struct.pack(">I", 900)))
code, out, err = harness.text("ls", "root.img", cwd=folder)
checks.equal(code, 8, "rootNode past the end")
checks.check("catalog tree: corrupt (A000011C): rootNode 900 is not below totalNodes 4" in err
             and "check H04" in err, "rootNode past the end: " + err)
expect(["find", "-t", "attributes", "--key", "16:x", good], 1,
       "treehfs: good.img: the volume has no attributes tree: create-tree would add one")

# --- what is not there -----------------------------------------------------------------------
expect(["node", good, "9000"], 16, "treehfs: good.img: catalog node 9000: the tree has nodes 0..3")
expect(["ls", good, "/beta/nope"], 1, "treehfs: good.img: /beta/nope: not found; /beta has 1 entry")
expect(["ls", good, "/alpha/x"], 1, "treehfs: good.img: /alpha: is a file, not a folder")
expect(["ls", good, "--by-id", "77"], 1, "treehfs: good.img: no file or folder has ID 77")
expect(["find", good, "--key", "2:delta"], 1,
       "treehfs: good.img: no record with key 2:delta in the catalog tree: "
       "--nearest shows where it would be")
expect(["node", good, "map"], 1,
       "treehfs: good.img: catalog tree has no map nodes: the header node holds the whole map")

# --- keys ------------------------------------------------------------------------------------
expect(["find", good, "--key", "2-alpha"], 16,
       "treehfs: key '2-alpha': expected PARENT:NAME, for example 2:alpha")
expect(["find", good, "--key", "5:data:0"], 16,
       "treehfs: key '5:data:0' is an extents key, the tree is catalog: add -t extents")
expect(["find", good, "--key", "hex:00zz"], 16,
       "treehfs: hex:00zz: 'z' at digit 3 is not hexadecimal")
expect(["find", good, "--key", "hex:0010 0000 0002 0003 0061 0062 0063"], 16,
       "treehfs: hex:0010 ... : length field says 16 bytes, 12 follow")
expect(["dump", good, "--range", "2:a-2:b"], 16,
       "treehfs: range '2:a-2:b': expected FROM..TO: for example '2:a..2:b', '2:a..' or '..2:b'")
expect(["dump", good, "--range", "2:b..2:a"], 16,
       "treehfs: range '2:b..2:a': the first key sorts behind the second: exchange them")
expect(["dump", good, "--range", "3:a..2:zz", "--reverse"], 16,
       "treehfs: range '3:a..2:zz': the first key sorts behind the second: exchange them")

# --- the command line ------------------------------------------------------------------------
expect(["chek"], 16, "treehfs: unknown command 'chek' (did you mean check?)")
expect(["check", "--jsn", good], 16,
       "treehfs check: unknown option --jsn (did you mean --json?)")
expect(["ls"], 16, "treehfs ls: IMAGE is missing: treehfs ls IMAGE [PATH]")
expect(["ls", good, "/", "extra"], 16,
       "treehfs ls: 'extra' is one argument too many: treehfs ls IMAGE [PATH]")
expect(["ls", good, "--limit"], 16, "treehfs ls: --limit needs a value")
expect(["ls", good, "--limit", "some"], 16, "treehfs ls: --limit: 'some' is no number")
expect(["ls", good, "--json=1"], 16, "treehfs ls: --json takes no value")
expect(["ls", good, "--offset", "12q"], 16,
       "treehfs ls: --offset: '12q' is no size: write it like 86016, 84K or 168s")
expect(["ls", good, "--limit", "1", "--limit", "2"], 16,
       "treehfs ls: --limit is given twice, as '1' and as '2': give it once")
code, out, err = harness.text("ls", good, "--limit", "1", "--limit", "1", cwd=folder)
checks.equal((code, out), (0, "alpha\n"), "the same value twice is no contradiction")
expect(["stats", "-t", "catalogue", good], 16,
       "treehfs stats: --tree: 'catalogue' is no tree (did you mean catalog?): "
       "catalog, extents or attributes")
expect(["dump", "-t", "c", "-t", "e", good], 16,
       "treehfs dump: --tree is given twice, as 'c' and as 'e': give it once")
expect(["check", "--only", "K99", good], 16,
       "treehfs check: --only: no invariant is called 'K99': check --list shows them")
expect(["node", good, "roof"], 16,
       "treehfs node: 'roof' is no node (did you mean root?): "
       "a number, 0x..., root, first, last, header or map")
expect(["ls", good, "--color", "blue"], 16,
       "treehfs ls: --color: 'blue' is none of auto|always|never")
expect(["ls", good, "--map", "700"], 16, "treehfs ls: --map: 700 is not a power of two")
expect(["node", good, "-1"], 16, "treehfs node: unknown option -1")
expect(["info", ""], 16, "treehfs info: IMAGE is empty: treehfs info IMAGE")
expect(["ls", "two.img", "--partition", "1", "--offset", "8s"], 16,
       "treehfs ls: --partition and --offset both say where the volume starts: give one of them")
expect(["find", good, "--key", "2:alpha", "--name", "beta"], 16,
       "treehfs find: --key, --nearest and --block stand alone: other conditions are for lists")
expect(["find", good, "--block", "2", "/beta"], 16,
       "treehfs find: --key, --nearest and --block stand alone: other conditions are for lists")
expect(["ls", good, "--progress-fd", "99"], 16,
       "treehfs ls: --progress-fd: descriptor 99 is not open")
expect(["apply", "--new", "1M,node", "nope.tr"], 8,
       "treehfs: nope.tr: cannot read the script: no such file")
write("look.tr", b"state\n")
expect(["apply", "--new", "1M,node", "look.tr"], 16,
       "treehfs: --new: 'node' needs a value: "
       "SIZE[,block=N][,map=N][,node=N][,clump=N][,case][,empty]")
expect(["apply", "--new", "999T", "look.tr"], 16,
       "treehfs: --new: 1,098,412,116,148,224 bytes are too many blocks of 4,096: "
       "choose a larger block size")
expect(["apply", "--new", "1M", "look.tr", "--undo", "x.undo"], 16,
       "treehfs apply: --undo is for --write: without it the image stays as it is")
expect(["format", "new.img", "--size", "1M", "--name", ""], 16,
       "treehfs: a name of 0 UTF-16 units cannot be stored: 1 to 255 can")
expect(["format", "new.img", "--size", "1M", "--node-size", "c=4096,c=8192"], 16,
       "treehfs: --node-size: 'c=8192' gives a tree a second size: give each tree one")
expect(["format", "new.img", "--size", "99999T"], 16,
       "treehfs: new.img: 109,950,063,265,972,224 bytes are too many blocks of 4,096: "
       "choose a larger block size")
checks.check(not (folder / "new.img").exists(), "what format refuses leaves no file")
write("strange.tr", b"inser\x1b]0;x\x07 2:a\n")
expect(["apply", "--new", "1M", "strange.tr"], 16,
       "strange.tr:1: unknown operation 'inser\\x1b]0;x\\x07'")
expect(["--vers"], 16, "treehfs: unknown option --vers (did you mean --version?)")
expect([], 16, "treehfs: no command given: treehfs help lists them")

# --- output files ----------------------------------------------------------------------------
write("there.txt", b"old")
expect(["ls", good, "-o", "there.txt"], 8, "treehfs: there.txt exists: --force replaces it")
expect(["ls", good, "-o", good, "--force"], 8,
       "treehfs: good.img: is the image itself: choose another name")
expect(["diff", "two.img", good, "--partition", "1", "-o", good, "--force"], 8,
       "treehfs: good.img: is the image itself: choose another name")
code, out, err = harness.text("shell", good, cwd=folder, stdin=b"ls -o good.img --force\n")
checks.equal((code, out, err),
             (0, "", "treehfs: good.img: is the image itself: choose another name\n"),
             "-o in the shell")
code, out, err = harness.text("ls", good, "-o", "there.txt", "--force", cwd=folder)
checks.equal((code, out, (folder / "there.txt").read_text()), (0, "", "alpha\nbeta\ngamma\nlink\n"),
             "-o FILE --force")
code, out, err = harness.text("ls", good, "-o", "-", cwd=folder)
checks.equal((code, out, (folder / "-").exists()), (0, "alpha\nbeta\ngamma\nlink\n", False),
             "-o - is standard output")
# Refused before the work, not behind it.
expect(["apply", "--new", "1M", "look.tr", "--save", "there.txt"], 8,
       "treehfs: there.txt exists: --force replaces it")
checks.equal(harness.run("apply", "--new", "1M", "look.tr", "--save", "there.txt", cwd=folder)[1],
             b"", "--save: nothing has run")
expect(["ls", good, "/nope", "-o", "never.txt"], 1,
       "treehfs: good.img: /nope: not found; / has 4 entries")
checks.check(not (folder / "never.txt").exists() and not (folder / "never.txt.part").exists(),
             "a command that failed leaves no file")
if os.path.exists("/dev/full"):
    for words in (["ls", folder / good], ["help"], ["help", "ls"], ["ls", "--help"]):
        with open("/dev/full", "wb") as full:
            done = subprocess.run([harness.tool(), *words], stdout=full, stderr=subprocess.PIPE)
        checks.equal((done.returncode, done.stderr.decode()),
                     (8, "treehfs: standard output: cannot write: no space left on the disk\n"),
                     "full disk: %s" % words)

# --- errors for programs ---------------------------------------------------------------------
code, out, err = harness.text("ls", "--json", good, "/nope", cwd=folder)
error = json.loads(err)
checks.equal((code, error["schema"], error["code"]), (1, "treehfs.error/1", 1), "error as JSON")
code, out, err = harness.text("ls", "--json", "root.img", cwd=folder)
error = json.loads(err.splitlines()[-1])
checks.check(error["code"] == 8 and error["offset"] == BASE + 16, "error with offset: %s" % error)
# A name cannot smuggle terminal escapes into an error.
code, out, err = harness.text("ls", good, "/\x1b[31mred", cwd=folder)
checks.check("\x1b" not in err and "\\x1b[31mred" in err, "escaped error: %r" % err)

# --- help ------------------------------------------------------------------------------------
code, overview, err = harness.text("help")
names = [line.split()[0] for line in overview.split("Commands:\n")[1].split("\n\n")[0].splitlines()]
checks.check({"info", "check", "ls", "find", "dump", "node", "stats", "badblocks"} <= set(names),
             "commands in the overview: %s" % names)
for name in names:
    code, shown, err = harness.text("help", name)
    examples = shown.rsplit("\nExamples:\n", 1)[-1].splitlines()
    checks.check(code == 0 and len(examples) == 3 and
                 all(line.startswith("  treehfs ") for line in examples),
                 "help of %s ends with three examples" % name)
    checks.equal(harness.text(name, "--help"), (0, shown, ""), "%s --help" % name)
for shell in ("bash", "zsh", "fish"):
    code, script, err = harness.text("completion", shell)
    checks.check(code == 0 and all(name in script for name in names), "completion " + shell)

checks.equal((folder / good).read_bytes(), whole, "no reading command has changed the image")
checks.finish()
