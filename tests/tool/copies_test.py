"""diff, rebuild, metadump, scan, undo and format --wrap: what they say of volumes made for it, and
what is left in the files they write."""

import json
import random
import struct
import zlib

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()
chance = random.Random(7)


def ask(*arguments, code=0):
    found, out, err = harness.text(*arguments, cwd=folder)
    checks.equal(found, code, "treehfs %s (%s)" % (" ".join(map(str, arguments)), err.strip()))
    return out


def digest(image, *options):
    return json.loads(ask("info", "--digest", "--json", *options, image))


def script(name, lines):
    (folder / name).write_text("\n".join(lines) + "\n", "utf-8")
    return name


def quoted(name):
    return json.dumps(name, ensure_ascii=True)


# --- a volume with names of every sort ---------------------------------------------------------
names = {2: ["Report 2026.txt", "Zulu", "alpha", "Größe", "naïve café.txt", ".hidden", "a", "b",
             "\u65e5\u672c\u8a9e", "x-ray_9.tar.gz", "\u200dinvisible", "UPPER lower 42"]}
for parent in range(16, 26):
    names[parent] = sorted({"".join(chance.choice("abcdeABCDE0123456789 .-_äß")
                                    for _ in range(chance.randrange(1, 30)))
                            for _ in range(40)})


def build(image, *options):
    lines = []
    item = 1000
    for number in range(16, 26):
        name = quoted("Folder %d" % number)
        lines += ["flush",
                  "insert 2:%s folder{id:%d,valence:%d}" % (name, number, len(names[number])),
                  "insert %d:\"\" thread{parent:2,name:%s}" % (number, name)]
    for parent, each in names.items():
        for name in each:
            item += 1
            lines += ["flush"] if item % 20 == 0 else []
            lines += ["insert %d:%s file{id:%d,size:%d}" % (parent, quoted(name), item, 0),
                      "insert %d:\"\" thread-file{parent:%d,name:%s}" % (item, parent,
                                                                       quoted(name))]
    ask("format", image, "--size", "4M", "--node-size", "1024", "--with-attributes", "--date",
        "2026-11-21", "--catalog-size", "512K", "--uuid", "5ec7e7", "--name", "Secret Volume",
        *options)
    lines += ["use attributes", 'insert 1001:"com.secret.tag" inline{"the secret value"}',
              'insert 1001:"com.secret.other" inline{"more of it"}']
    ask("apply", image, script("fill.tr", lines), "--write", "-q")


build("a.img")
build("case.img", "--case-sensitive")

# --- diff --------------------------------------------------------------------------------------
copy = (folder / "a.img").read_bytes()
(folder / "b.img").write_bytes(copy)
out = ask("diff", "a.img", "b.img")
checks.check(out.startswith("catalog: no difference in "),
             "equal volumes: " + out)
ask("apply", "b.img", script("change.tr", [
    "delete 2:alpha", "insert 2:omega file{id:9000}", "replace 2:Zulu file{id:1002,size:5}"]),
    "--write", "-q", "--undo", "b.undo")
out = ask("diff", "-t", "catalog", "a.img", "b.img", code=1)
checks.equal(out.splitlines()[:3],
             ['- 2:"alpha"  file id 1003, size 0', '+ 2:"omega"  file id 9000, size 0',
              '~ 2:"Zulu"  size 0 -> 5'], "three differences")
checks.check("catalog: 1 only in a.img, 1 only in b.img, 1 changed" in out, "summary: " + out)
out = ask("diff", "--summary", "-t", "catalog", "--ignore", "size", "a.img", "b.img", code=1)
checks.check(out.startswith("catalog: 1 only in a.img, 1 only in b.img, 0 changed"),
             "size is ignored: " + out)
lines = [json.loads(line) for line in
         ask("diff", "--json", "-t", "c", "a.img", "b.img", code=1).splitlines()]
checks.equal([(line.get("change"), line.get("fields")) for line in lines[1:4]],
             [("removed", None), ("added", None), ("changed", ["size"])], "differences as JSON")
checks.equal(lines[3]["after"]["size"], 5, "the record after")
checks.equal({key: lines[4]["summary"][key] for key in ("removed", "added", "changed")},
             {"removed": 1, "added": 1, "changed": 1}, "summary as JSON")
ask("diff", "a.img", "case.img", code=8)

# --- undo --------------------------------------------------------------------------------------
after = (folder / "b.img").read_bytes()
(folder / "touched.img").write_bytes(after[:5000] + b"?" + after[5001:])
ask("undo", "b.img", "a.img", code=8)
ask("undo", "b.img", "b.undo")
checks.check((folder / "b.img").read_bytes() == copy, "undo brings every byte back")
(folder / "b.img").write_bytes(after)
torn = (folder / "b.undo").read_bytes()[:-20]  # as after a crash: the last entry is missing
(folder / "torn.undo").write_bytes(torn)
out = ask("undo", "b.img", "torn.undo")
checks.check("did not end by itself" in out and (folder / "b.img").read_bytes() == copy,
             "undo after a crash: " + out)
at = next(i for i in range(len(copy)) if after[i] != copy[i])
changed = bytearray(after)
changed[at] ^= 0x55
(folder / "b.img").write_bytes(changed)
code, out, err = harness.text("undo", "b.img", "b.undo", cwd=folder)
checks.check(code == 8 and "has changed since b.undo was written" in err, "changed since: " + err)
ask("undo", "--force", "b.img", "b.undo")
checks.check((folder / "b.img").read_bytes() == copy, "undo by force")

# --- rebuild -----------------------------------------------------------------------------------
(folder / "thin.img").write_bytes(copy)
thin = ["delete %d:%s" % (parent, quoted(name)) for parent, each in names.items()
        for i, name in enumerate(each) if i % 3]
ask("apply", "thin.img", script("thin.tr", thin), "--write", "-q")
(folder / "kept.img").write_bytes((folder / "thin.img").read_bytes())
before = digest("thin.img")
first = ask("rebuild", "thin.img", "-q")
checks.check((folder / "thin.img").read_bytes() == (folder / "kept.img").read_bytes(),
             "without --write nothing is written")
again = ask("rebuild", "thin.img", "--write", "--undo", "rebuild.undo")
checks.equal(again, first, "the trial says what the real run says")
checks.equal(digest("thin.img"), before, "rebuild keeps the records")
found = json.loads(ask("rebuild", "thin.img", "--json", "-q"))
old = int(first.split(" nodes before")[0].split()[-1])
checks.check(found["nodes_before"] < old * 0.8, "rebuild saves nodes: " + first)
checks.equal(found["nodes_after"], found["nodes_before"], "a second time there is nothing to save")
code, out, err = harness.text("check", "thin.img", cwd=folder)
checks.equal(code, 0, "check after rebuild: " + out)
for tree in ("extents", "attributes"):
    ask("rebuild", "-t", tree, "thin.img", "-q")
(folder / "bad.img").write_bytes(vb.volume(catalog=vb.leaf_tree(
    [vb.plain_leaves()[0][::-1], vb.plain_leaves()[1]])))
code, out, err = harness.text("rebuild", "bad.img", cwd=folder)
checks.equal((code, err), (8, "treehfs: bad.img: catalog tree: the tree is damaged: "
                              "run check; a damaged tree is not rebuilt\n"), "a damaged tree")
# No room in the journal: nothing has changed.
build("journal.img", "--journal", "64K")
kept = digest("journal.img")
code, out, err = harness.text("rebuild", "journal.img", "--write", cwd=folder)
checks.check(code in (0, 8) and digest("journal.img") == kept, "rebuild with a journal: " + err)

# --- metadump ----------------------------------------------------------------------------------
SECRETS = [name for each in names.values() for name in each if len(name) > 4]
SECRETS += ["Secret Volume", "com.secret.tag", "com.secret.other", "Folder 16"]


def poisoned(image, target):
    """The same volume with secrets wherever no tree looks."""
    data = bytearray((folder / image).read_bytes())
    info = json.loads(ask("info", "--json", image))
    secret = "gap secret".encode("utf-16-be")
    for tree in info["trees"]:
        if not tree["present"]:
            continue
        name, size = tree["tree"], tree["node_size"]
        checks.equal(tree["extents"], 1, image + ": the nodes lie in a row")
        shown = ask("node", "-t", name, image, "header")
        base = int(shown.split("image offset ")[1].split()[0], 16)
        for line in ask("dump", "--nodes", "--order", "disk", "--json", "-t", name,
                        image).splitlines()[1:-1]:
            node = json.loads(line)
            start = base + node["node"] * size
            if node["kind"] in ("leaf", "index") and node["free"] > 2 * len(secret) + 4:
                at = start + size - 2 * (node["records"] + 1) - len(secret) - 2
                data[at:at + len(secret)] = secret
            elif node["kind"] == "blank":
                data[start + 40:start + 40 + len(secret)] = secret
            elif node["kind"] == "header":
                data[start + 124:start + 124 + len(secret)] = secret
    for at in range(0, len(data), 65536):  # blocks that belong to nobody, and file contents
        if not any(data[at:at + 4096]):
            data[at + 100:at + 100 + len(secret)] = secret
    data[10:10 + len(secret)] = secret
    (folder / target).write_bytes(data)


def shape(image):
    rows = [json.loads(line) for line in ask("ls", "-R", "-a", "--json", image).splitlines()[1:-1]]
    return [{key: row[key] for key in row if key not in ("path", "name")} |
            {"length": len(row["name"].encode("utf-16-be")), "depth": row["path"].count("/")}
            for row in rows]


for image in ("a.img", "case.img", "thin.img"):
    poisoned(image, "poisoned.img")
    found = json.loads(ask("metadump", "poisoned.img", "-o", "meta.img", "--force", "--json"))
    data = (folder / "meta.img").read_bytes()
    checks.equal(len(data), len((folder / image).read_bytes()), image + ": size of the dump")
    for secret in SECRETS + ["gap secret", "secret value", "more of it"]:
        for encoding in ("utf-16-be", "utf-8"):
            checks.check(secret.encode(encoding) not in data,
                         "%s: %r is still there in %s" % (image, secret, encoding))
    checks.equal(shape("meta.img"), shape(image), image + ": shape of the listing")
    was, now = (harness.text("check", "--full", "--json", each, cwd=folder)
                for each in (image, "meta.img"))
    checks.equal((now[0], [json.loads(line).get("id") for line in now[1].splitlines()]),
                 (was[0], [json.loads(line).get("id") for line in was[1].splitlines()]),
                 image + ": check")
    was, now = (json.loads(ask("stats", "--json", each)) for each in (image, "meta.img"))
    was.pop("image", 0), now.pop("image", 0)
    checks.equal(now, was, image + ": stats")
    # What the tree does not need is zero in both: the dump of a dump is the same shape.
    ask("metadump", "meta.img", "-o", "twice.img", "--force")
    checks.equal(shape("twice.img"), shape(image), image + ": dump of a dump")
ask("metadump", "a.img", "-o", "meta.img", code=8)
ask("metadump", "a.img", code=16)
upper = [json.loads(line) for line in ask("ls", "-R", "--json", "a.img").splitlines()[1:-1]]
ask("metadump", "a.img", "-o", "meta.img", "--force")
masked = [json.loads(line) for line in ask("ls", "-R", "--json", "meta.img").splitlines()[1:-1]]
for one, other in zip(upper, masked):
    for was, now in zip(one["name"], other["name"]):
        if was.isascii() and was.isalpha():
            checks.check(now.isalpha() and now.isupper() == was.isupper(),
                         "case of %r in %r" % (one["name"], other["name"]))
        if was == ".":
            checks.equal(now, ".", "full stop of " + one["name"])

# --- scan --------------------------------------------------------------------------------------
leaves = vb.plain_leaves()
nodes = vb.leaf_tree(leaves, total=8)
gone = [vb.file(2, "deleted one", 77), vb.thread(77, 2, "deleted one", True)]
nodes[5] = vb.node(-1, 1, gone)                                      # its bit is clear: freed
nodes[6] = vb.node(-1, 1, [leaves[0][2], vb.file(2, "beta", 99)])    # same; other data
head = bytearray(nodes[0])
head[248] |= 0x80 >> 6                                               # node 6 is stranded
nodes[0] = bytes(head)
gap = bytearray(nodes[1])
piece = vb.file(2, "left in the gap", 78)
gap[2000:2000 + len(piece)] = piece
nodes[1] = bytes(gap)
(folder / "scan.img").write_bytes(vb.volume(catalog=nodes))
out = ask("scan", "-t", "catalog", "scan.img")
rows = [line.split(None, 4) for line in out.splitlines()[:-2]]
checks.equal([(row[0], row[1], row[3], row[4]) for row in rows],
             [("gap", "1", "gone", '2:"left in the gap"  file id 78, size 0'),
              ("freed", "5", "gone", '2:"deleted one"  file id 77, size 0'),
              ("freed", "5", "gone", '77:""  thread-file 2:"deleted one"'),
              ("stranded", "6", "same", '2:"alpha"  file id 16, size 5, data [20,1]'),
              ("stranded", "6", "other", '2:"beta"  file id 99, size 0')], "scan: " + out)
at = 4 * vb.BLOCK + vb.NODE + 2000
checks.equal(rows[0][2], hex(at), "scan: place of the record in the gap")
checks.equal(out.splitlines()[-2:],
             ["catalog: 5 records outside the tree: 3 gone from it, 1 with other data, 1 the same;",
              "    2 in stranded leaves, 2 in freed nodes, 1 in gaps, 0 in the journal"],
             "scan: summary")
out = ask("scan", "-t", "catalog", "--limit", "2", "scan.img").splitlines()
checks.equal((len(out), out[2]), (5, "... the others are only counted (--limit)"), "scan --limit")
out = ask("scan", "--deleted", "--json", "scan.img")
lines = [json.loads(line) for line in out.splitlines()]
checks.equal([line["id"] for line in lines if "id" in line], [78, 77], "deleted files")
ask("scan", "-t", "extents", "scan.img", code=1)
ask("scan", "--journal", "scan.img", code=1)
ask("format", "log.img", "--size", "4M", "--journal", "256K", "--node-size", "512")
ask("apply", "log.img", script("one.tr", ["insert 2:once file{id:50}", "flush",
                                          "insert 2:more file{id:51}", "flush"]), "--write", "-q")
ask("apply", "log.img", script("two.tr", ["delete 2:once"]), "--write", "-q")
out = ask("scan", "--journal", "--deleted", "log.img")
checks.check('gone    2:"once"  file id 50' in out, "scan of the journal: " + out)


# A leaf at the end of the journal's ring goes on at the ring's start; so do the places of records.
ask("format", "ring.img", "--size", "4M", "--journal", "256K", "--node-size", "1024")
ring = bytearray((folder / "ring.img").read_bytes())
journal = ring.index(b"JNLx")                                        # the sector before the ring
end = journal + 256 * 1024
lost = [vb.file(2, name, 51 + i) for i, name in enumerate(("before", "middle", "onwards"))]
leaf = vb.node(-1, 1, lost, size=1024)
ring[end - 512:end], ring[journal + 512:journal + 1024] = leaf[:512], leaf[512:]
(folder / "ring.img").write_bytes(ring)
rows = [line.split(None, 4) for line in ask("scan", "--journal", "-t", "c",
                                            "ring.img").splitlines()[:-2]]
starts = [14, 14 + len(lost[0]), 14 + len(lost[0]) + len(lost[1])]
places = [end - 512 + starts[0], end - 512 + starts[1], journal + starts[2]]
checks.equal([(row[2], row[4]) for row in rows],
             [(hex(place), '2:"%s"  file id %d, size 0' % (name, 51 + i))
              for i, (name, place) in enumerate(zip(("before", "middle", "onwards"), places))],
             "scan around the end of the journal")

# --- format --wrap -----------------------------------------------------------------------------
for scheme, partition in (("apm", 2), ("gpt", 1)):
    ask("format", "wrap.img", "--size", "1M", "--wrap", scheme, "--force", "--name", "Wrapped")
    info = json.loads(ask("info", "--json", "wrap.img"))
    checks.equal((info["scheme"], info["partition"], info["offset"], info["name"]),
                 (scheme.upper(), partition, 32768, "Wrapped"), "wrapped in " + scheme)
    code, out, err = harness.text("check", "--full", "wrap.img", cwd=folder)
    checks.equal((code, err), (0, ""), "check of a wrapped volume: " + out)
data = (folder / "wrap.img").read_bytes()
for at in (512, len(data) - 512):
    head = bytearray(data[at:at + 92])
    own, table = struct.unpack_from("<Q", head, 24)[0], struct.unpack_from("<Q", head, 72)[0]
    crc, table_crc = struct.unpack_from("<I", head, 16)[0], struct.unpack_from("<I", head, 88)[0]
    head[16:20] = bytes(4)
    checks.equal((zlib.crc32(head), own * 512), (crc, at), "sum and place of a GPT header")
    checks.equal(zlib.crc32(data[table * 512:table * 512 + 128 * 128]), table_crc,
                 "sum of the table")

# --- bench -------------------------------------------------------------------------------------
out = ask("bench", "--records", "2000", "--repeat", "2", "--order", "zipf")
checks.equal([line[:18].rstrip() for line in out.splitlines()[1:-1]],
             ["insert zipf", "find hit", "find absent", "iterate", "find + update", "delete half",
              "flush + reopen"], "rows of bench")
checks.check(out.splitlines()[-1].endswith("; check ok"), "bench: " + out)
found = json.loads(ask("bench", "--json", "a.img", "--ops", "find"))
checks.equal([(row["operation"], row["count"] > 400) for row in found["operations"]],
             [("find hit", True)], "bench on an image")
checks.finish()
