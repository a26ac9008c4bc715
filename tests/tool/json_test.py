"""docs/json.md against what the program prints: every member is described, none has vanished."""

import json
import re
import struct

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()

bad = vb.leaf_tree([[vb.extents_record(5, 0, 0, [(8, 2)])]], max_key=10, attributes=2, compare=0)
fallen = vb.plain_leaves()
fallen[0][2], fallen[0][4] = fallen[0][4], fallen[0][2]
whole = vb.volume(extents=bad)
(folder / "good.img").write_bytes(whole)
(folder / "order.img").write_bytes(vb.volume(catalog=vb.leaf_tree(fallen)))
broken = bytearray(whole)
struct.pack_into(">I", broken, vb.CATALOG_BLOCK * vb.BLOCK + 16, 900)
(folder / "root.img").write_bytes(broken)
leaves = vb.plain_leaves()
leaves[0][2] = vb.file(2, "alpha", 16, 6, [(20, 1)])
leaves[0][3:4] = []
leaves[0][4:4] = [vb.file(2, "delta", 30)]
leaves[0].sort(key=lambda record: (record[2:6], record[8:]))
(folder / "other.img").write_bytes(vb.volume(catalog=vb.leaf_tree(leaves)))
nodes = vb.leaf_tree(vb.plain_leaves())
gap = vb.file(2, "left", 78)
nodes[1] = nodes[1][:2000] + gap + nodes[1][2000 + len(gap):]
(folder / "gap.img").write_bytes(vb.volume(catalog=nodes))
(folder / "good.jsonl").write_text(harness.text("export", "good.img", cwd=folder)[1], "utf-8")
(folder / "one.tr").write_text('insert 2:a folder{id:16}\nget 2:b\nstate\n')

COMMANDS = {
    "treehfs.info/1": [["info", "good.img"], ["info", "root.img"]],
    "treehfs.info.digest/1": [["info", "--digest", "good.img"]],
    "treehfs.info.partitions/1": [["info", "--partitions", "good.img"]],
    "treehfs.ls/1": [["ls", "--extents", "good.img"]],
    "treehfs.find.key/1": [["find", "good.img", "--key", "17:inner"]],
    "treehfs.find.block/1": [["find", "good.img", "--block", "21"]],
    "treehfs.check/1": [["check", "order.img"]],
    "treehfs.stats/1": [["stats", "good.img"]],
    "treehfs.badblocks/1": [["badblocks", "good.img"]],
    "treehfs.dump/1": [["dump", "good.img"], ["dump", "--nodes", "good.img"],
                       ["dump", "--order", "bfs", "good.img"],
                       ["dump", "--values", "full", "good.img"]],
    "treehfs.node/1": [["node", "good.img", "header", "root", "first"]],
    "treehfs.records/1": [["export", "good.img"], ["export", "-t", "extents", "good.img"]],
    "treehfs.import/1": [["import", "--new", "1M,empty", "good.jsonl"]],
    "treehfs.apply/1": [["apply", "--new", "1M", "one.tr", "--trace"]],
    "treehfs.diff/1": [["diff", "good.img", "other.img"]],
    "treehfs.scan/1": [["scan", "gap.img"]],
    "treehfs.metadump/1": [["metadump", "good.img", "-o", "meta.img"]],
    "treehfs.rebuild/1": [["rebuild", "good.img", "-q"]],
    "treehfs.bench/1": [["bench", "--records", "100"], ["bench", "good.img"]],
    "treehfs.error/1": [["ls", "root.img"], ["ls", "nope.img"], ["ls"]],
}
WITH_RECORDS = {"treehfs.dump/1", "treehfs.node/1", "treehfs.records/1", "treehfs.diff/1",
                "treehfs.scan/1"}
# Names of record kinds are keys of an object, too.
KINDS = {"file", "folder", "thread-file", "thread-folder", "extents"}


def described(text, schema):
    """Members that the section of a schema names: all of them, and those always there."""
    section = text.split("## " + schema + "\n", 1)[1].split("\n## ", 1)[0]
    rows = re.findall(r"^\| (\w+) \| (-?) *\|", section, re.M)
    names = {name for name, _ in rows if name != "member"}
    return names, {name for name, mark in rows if name in names and mark != "-"}


def members(value):
    if isinstance(value, dict):
        found = set()
        for key, inner in value.items():
            found |= {key} | members(inner)
        return found
    if isinstance(value, list):
        return set().union(*map(members, value)) if value else set()
    return set()


def record_fields():
    """Members of keys and records, wherever a schema has them: the table of docs/json.md, and the
    fields that docs/records.md lists."""
    bullets = (harness.ROOT / "docs" / "records.md").read_text("utf-8").split("## JSON Lines")[0]
    fields = re.findall(r"`(\w+)`", "".join(re.findall(r"^- .*(?:\n  .*)*", bullets, re.M)))
    return described(text, "Keys and records")[0] | set(fields)


def without_fields(value):
    """Script operations have fields and statuses of their own, which docs/script.md describes."""
    return {key: None if key in ("fields", "statuses") else inner for key, inner in value.items()}


text = (harness.ROOT / "docs" / "json.md").read_text("utf-8")
for schema, commands in COMMANDS.items():
    seen = set()
    for command in commands:
        code, out, err = harness.text(*command, "--json", cwd=folder)
        if command[0] == "export":
            code, out, err = harness.text(*command, cwd=folder)
        lines = (err if "error" in schema else out).splitlines()
        checks.equal(json.loads(lines[0])["schema"], schema, " ".join(command))
        for line in lines:
            value = json.loads(line)
            seen |= members(without_fields(value) if schema == "treehfs.apply/1" else value)
    known, always = described(text, schema)
    extra = KINDS if schema == "treehfs.stats/1" else set()
    extra |= record_fields() if schema in WITH_RECORDS else set()
    checks.equal(sorted(seen - known - extra), [], schema + ": members docs/json.md lacks")
    checks.equal(sorted(always - seen), [], schema + ": members that have vanished")
checks.finish()
