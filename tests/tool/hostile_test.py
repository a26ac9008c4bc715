"""Volumes that lie: rings, keys that fall, names that attack a terminal, bytes changed at random.
Every command must end in time with one of the program's own exit codes, and never show a part as
the whole."""

import json
import os
import random
import struct

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()
CATALOG = vb.CATALOG_BLOCK * vb.BLOCK


def write(name, data):
    (folder / name).write_bytes(bytes(data))
    return folder / name


def patched(data, at, piece):
    out = bytearray(data)
    out[at:at + len(piece)] = piece
    return out


good = vb.volume()

# --- rings -----------------------------------------------------------------------------------
# Two folders, each the other's parent: their threads never reach the root.
ring = vb.leaf_tree([[
    vb.folder(1, "Vol", 2, 1), vb.thread(2, 1, "Vol"), vb.file(2, "good", 16),
    vb.thread(16, 2, "good", True), vb.thread(17, 18, "a"), vb.folder(17, "b", 18, 1),
    vb.file(17, "lost", 19), vb.thread(18, 17, "b"), vb.folder(18, "a", 17, 2),
    vb.thread(19, 17, "lost", True)]])
image = write("folders.img", vb.volume(catalog=ring, files=2, folders=2))
code, out, err = harness.text("ls", "-R", image, timeout=20)
checks.equal((code, out), (8, "/good\n?17/b\n?17/lost\n?18/a\n"), "ring of folders")
checks.check("2 folders could not be placed" in err, "ring of folders: " + err)
code, out, err = harness.text("find", image, "--orphans")
checks.equal((code, out), (0, "?17/b\n?17/lost\n?18/a\n"), "orphans")
code, out, err = harness.text("find", image, "--id", "19")
checks.equal((code, out), (0, "?17/lost\n"), "an orphan by its ID")

# A folder that has neither record nor thread.
alone = vb.leaf_tree([[vb.folder(1, "Vol", 2, 0), vb.thread(2, 1, "Vol"), vb.file(40, "x", 41),
                       vb.thread(41, 40, "x", True)]])
code, out, err = harness.text("ls", "-R", write("alone.img", vb.volume(catalog=alone)))
checks.equal((code, out), (8, "?40/x\n"), "folder without thread")

# The last leaf leads back to the first one.
leaves = vb.leaf_tree(vb.plain_leaves())
last = bytearray(leaves[2])
last[0:4] = struct.pack(">I", 1)
looped = list(leaves)
looped[2] = bytes(last)
image = write("leaves.img", vb.volume(catalog=looped))
code, out, err = harness.text("ls", "-R", image, timeout=20)
checks.equal(code, 8, "ring of leaves")
checks.check("is not above the one before it" in err, "ring of leaves: " + err)
code, out, err = harness.text("ls", "-R", "--keep-going", image, timeout=20)
checks.equal((code, out), (8, "/alpha\n/beta\n/gamma\n/link\n/beta/inner\n"),
             "ring of leaves, gone past")
for command in ("stats", "info", "dump"):
    code, out, err = harness.text(command, image, timeout=20)
    checks.equal(code, 8, command + " of a ring of leaves")

# A leaf that points at itself with no records in it.
hollow = list(leaves)
hollow[2] = vb.node(-1, 1, [], flink=2, blink=1)
code, out, err = harness.text("ls", "-R", write("hollow.img", vb.volume(catalog=hollow)),
                              timeout=20)
checks.equal(code, 8, "empty leaf in a ring")

# --- order and keys --------------------------------------------------------------------------
fallen = vb.plain_leaves()
fallen[0][2], fallen[0][4] = fallen[0][4], fallen[0][2]
image = write("order.img", vb.volume(catalog=vb.leaf_tree(fallen)))
code, out, err = harness.text("ls", image)
checks.equal(code, 8, "keys that fall")
checks.check('record 3: key 2:"beta" is not above the one before it' in err, "falling: " + err)

# A damaged leaf in the middle is passed over, and the leaf after it is found through the index.
three = [vb.plain_leaves()[0], vb.plain_leaves()[1][:3], vb.plain_leaves()[1][3:]]
nodes = vb.leaf_tree(three)
nodes[2] = bytes(vb.NODE)
image = write("middle.img", vb.volume(catalog=nodes))
code, out, err = harness.text("dump", image)
checks.equal(code, 8, "blank leaf")
code, out, err = harness.text("dump", "--keep-going", image)
checks.equal(code, 8, "blank leaf, gone past")
checks.check('20:""' in out and '2:"link"' in out and '16:""' not in out,
             "blank leaf, gone past: " + out)
checks.check("catalog node 2: corrupt" in err and "passed over" in err, "blank leaf: " + err)

# --- names -----------------------------------------------------------------------------------
nasty = ["a\x1b[31mred", "back\\slash", "bell\x07", "bidi\u202e", "colon/slash", "cr\r", "lf\n",
         "lone\ud800", "\0nul", "true:colon", "sign\u2400"]
records = sorted(nasty, key=lambda name: [0xFFFF if u == "\0" else ord(u) for u in name.lower()])
listed = [vb.folder(1, "Vol", 2, len(nasty)), vb.thread(2, 1, "Vol")]
listed += [vb.file(2, name, 16 + i) for i, name in enumerate(records)]
image = write("names.img", vb.volume(catalog=vb.leaf_tree([listed]), files=len(nasty)))
code, out, err = harness.text("ls", image)
checks.equal(code, 0, "nasty names: " + err)
checks.equal(sorted(out.splitlines()),
             sorted(["a\\x1b[31mred", "back\\\\slash", "bell\\x07", "bidi\\u202e", "colon:slash",
                     "cr\\x0d", "lf\\x0a", "lone\\ud800", "\u2400nul", "true\\x3acolon",
                     "sign\\u2400"]), "nasty names")
for line in out.splitlines():
    code, again, err = harness.text("ls", image, "/" + line)
    checks.equal((code, again), (0, line + "\n"), "a printed name is understood")
code, raw, err = harness.run("ls", "-0", image)
checks.equal(raw.count(b"\0"), len(nasty), "names that end in NUL")
checks.check(b"lf\n\0" in raw and b"colon:slash\0" in raw and b"lone\xed\xa0\x80\0" in raw,
             "bare names: %r" % raw)
code, out, err = harness.text("ls", "--json", image)
names = {json.loads(line)["name"] for line in out.splitlines()[1:-1]}
checks.equal(names, set(nasty), "names in JSON are what is on disk")
for command in ("ls", "find", "dump", "stats", "info", "check", "node"):
    code, out, err = harness.run(command, image)
    checks.check(b"\x1b" not in out + err and b"\x07" not in out + err,
                 command + " lets an escape through")

# --- anything at all -------------------------------------------------------------------------
COMMANDS = [["info"], ["check", "--full"], ["ls", "-R", "-l"], ["find", "--name", "*a*"],
            ["dump", "--order", "dfs"], ["dump", "--order", "disk", "--keep-going"],
            ["dump", "--keep-going"], ["node", "root", "--follow"], ["stats", "--keep-going"],
            ["badblocks"], ["ls", "-R", "--keep-going", "--json"], ["find", "--key", "17:inner"],
            ["find", "--block", "21"], ["info", "--digest"], ["stats"]]


def run_all(image, what, commands):
    for command in commands:
        code, out, err = harness.run(command[0], image, *command[1:], timeout=60)
        text = "%s of %s: " % (" ".join(command), what)
        checks.check(code in harness.EXIT_CODES, text + "exit code %d: %r" % (code, err[-400:]))
        # What is damaged is a result of check and info: they tell it on stdout.
        told = err != b"" or b"error" in out or b"\ndamaged: " in out
        checks.check(code in (0, 1, 4) or told, text + "failed silently")
        if "--json" in command:
            for line in out.splitlines():
                json.loads(line)


seed = int(os.environ.get("TREEHFS_SEED") or random.randrange(1 << 32))
print("seed %d" % seed)
chance = random.Random(seed)
run_all(write("noise.img", chance.randbytes(300000)), "random bytes", COMMANDS)
run_all(write("none.img", b""), "length 0", COMMANDS)
run_all(folder, "a folder", COMMANDS[:3])
for cut in (1536, 20000):
    run_all(write("cut.img", good[:cut]), "%d bytes" % cut, COMMANDS)
spots = list(range(1024, 1536)) + list(range(CATALOG, CATALOG + 4 * vb.NODE))
for round_number in range(25):
    data = bytearray(good)
    for _ in range(chance.choice((1, 1, 2, 8))):
        at = chance.choice(spots)
        width = chance.choice((1, 2, 4))
        data[at:at + width] = chance.choice((bytes(width), b"\xff" * width,
                                             chance.randbytes(width)))
    image = write("changed.img", data)
    run_all(image, "round %d of seed %d" % (round_number, seed), chance.sample(COMMANDS, 4))
checks.finish()
