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
    "treehfs.error/1": [["ls", "root.img"], ["ls", "nope.img"], ["ls"]],
}
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


text = (harness.ROOT / "docs" / "json.md").read_text("utf-8")
for schema, commands in COMMANDS.items():
    seen = set()
    for command in commands:
        code, out, err = harness.text(*command, "--json", cwd=folder)
        lines = (err if "error" in schema else out).splitlines()
        checks.equal(json.loads(lines[0])["schema"], schema, " ".join(command))
        for line in lines:
            seen |= members(json.loads(line))
    known, always = described(text, schema)
    extra = KINDS if schema == "treehfs.stats/1" else set()
    checks.equal(sorted(seen - known - extra), [], schema + ": members docs/json.md lacks")
    checks.equal(sorted(always - seen), [], schema + ": members that have vanished")
checks.finish()
