"""Choosing records and items: dump --where and --reverse, find --collisions and --format."""

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()
(folder / "good.img").write_bytes(vb.volume())


def out_of(*arguments, code=0):
    found, out, err = harness.text(*arguments, cwd=folder)
    checks.equal(found, code, "treehfs %s (%s)" % (" ".join(arguments), err.strip()))
    return out.splitlines() if code in (0, 1) else err


def keys(*arguments):
    return [line.split()[2] for line in out_of("dump", "--values", "none", *arguments,
                                               "good.img")[1:]]


ALL = ['1:"Vol"', '2:""', '2:"alpha"', '2:"beta"', '2:"gamma"', '2:"link"', '16:""', '17:""',
       '17:"inner"', '18:""', '19:""', '20:""']
checks.equal(keys(), ALL, "all records")
checks.equal(keys("--reverse"), ALL[::-1], "backwards")
checks.equal(keys("--reverse", "--range", '2:b..17:""'), ALL[3:8][::-1], "a range backwards")
checks.equal(keys("--reverse", "--limit", "2", "--offset-records", "1"), ALL[::-1][1:3], "a window")
checks.equal(keys("--where", "size>5"), ['2:"gamma"'], "size > 5")
checks.equal(keys("--where", "size>=5", "--where", "name!=g*"), ['2:"alpha"', '2:"link"'],
             "size >= 5, name != g*")
checks.equal(keys("--where", "type=folder"), ['1:"Vol"', '2:"beta"'], "folders")
checks.equal(keys("--where", "parent=17"), ALL[7:9], "by parent")
checks.equal(keys("--where", "mode=0xa1ed"), ['2:"link"'], "by mode")
checks.equal(keys("--where", "modified<2023-02-02", "--where", "node=2"), ['17:"inner"'], "by date")
checks.equal(keys("--order", "dfs", "--where", "node=3"), ['1:"Vol"', '16:""'], "index records")
checks.equal(keys("--where", "tree=catalog", "--where", "id=20"), ['17:"inner"'], "a tree by name")
(folder / "names.tr").write_text(
    'insert 2:"\\u00e9" file{id:50}\ninsert 2:"\\ud83c\\udf08" file{id:51}\n'
    'insert 2:"\\ud800" file{id:52}\ninsert 2:two file{id:53}\n')
out_of("apply", "--new", "1M", "-q", "--save", "names.img", "names.tr")
for pattern, paths in (("?", ["/\u00e9", "/\\ud800", "/\U0001f308"]), ("??", []),
                       ("[\U0001f300-\U0001f310]", ["/\U0001f308"]), ("[!\u00e9]?*", ["/two"])):
    checks.equal(out_of("find", "names.img", "--name", pattern, code=0 if paths else 1), paths,
                 "characters that %s takes" % pattern)
for condition, fault in (
        ("sise=5", "no record of the catalog tree has a 'sise' (did you mean size?): "
                   "dump --values full shows the fields"),
        ("size", "expected FIELD=VALUE: write it like size>=64K, type=folder or name=*.txt"),
        ("size=big", "'big' is no number, size or date: "
                     "write it like size>=64K, type=folder or name=*.txt"),
        ("name>a", "texts are compared with = or != only: "
                   "write it like size>=64K, type=folder or name=*.txt"),
        ("tree=cat", "no such tree: catalog, extents or attributes")):
    checks.equal(out_of("dump", "good.img", "--where", condition, code=16),
                 "treehfs: condition '%s': %s\n" % (condition, fault), condition)
out_of("dump", "good.img", "--reverse", "--order", "bfs", code=16)
out_of("dump", "good.img", "--nodes", "--where", "id=5", code=16)

# A ring of leaves ends a backward walk, too.
ring = vb.leaf_tree(vb.plain_leaves())
first = bytearray(ring[1])
first[4:8] = b"\0\0\0\2"
ring[1] = bytes(first)
(folder / "ring.img").write_bytes(vb.volume(catalog=ring))
checks.check("is not below the one behind it" in out_of("dump", "--reverse", "ring.img", code=8),
             "a ring backwards")

# --- find --------------------------------------------------------------------------------------
leaf = [vb.folder(1, "Vol", 2, 6), vb.thread(2, 1, "Vol")]
for i, name in enumerate(["README", "Readme", "alone", "cafe\u0301", "caf\u00e9", "readme"]):
    leaf.append(vb.file(2, name, 16 + i, i))
tree = vb.leaf_tree([leaf], compare=0xBC)
(folder / "case.img").write_bytes(vb.volume(catalog=tree, signature=b"HX", version=5, files=6,
                                            folders=0))
checks.equal(sorted(out_of("find", "case.img", "--collisions")),
             sorted(["/README", "/Readme", "/readme", "/cafe\u0301", "/caf\u00e9"]), "collisions")
checks.equal(len(out_of("find", "case.img", "--collisions", "--limit", "2")), 2, "two of them")
checks.equal(out_of("find", "good.img", "--collisions", code=1), [], "no collisions")
checks.equal(out_of("find", "good.img", "--type", "file", "--format",
                    "{id}\\t{size}\\t{{{name}}}\\t{parent} {mode} {modified} {path}\\n"),
             ["16\t5\t{alpha}\t2 100644 2023-02-01T11:39:44Z /alpha",
              "18\t70000\t{gamma}\t2 100644 2023-02-01T11:39:44Z /gamma",
              "20\t0\t{inner}\t17 100644 2023-02-01T11:39:44Z /beta/inner"], "a format")
code, raw, err = harness.run("find", "good.img", "--type", "folder", "--format", "{path}\\0",
                             cwd=folder)
checks.equal(raw, b"/beta\0", "a format that ends in NUL")
checks.equal(out_of("find", "good.img", "--format", "{sise}", code=16).split(":")[2],
             " no field is called 'sise' (did you mean size?)", "a field nobody knows")
checks.equal(out_of("find", "good.img", "--format", "{id", code=16),
             "treehfs find: --format: '{' without '}': {{ stands for a brace\n", "an open brace")

# Looking at a tree from the shell leaves its unsaved changes alone.
done = harness.text("shell", "good.img", cwd=folder,
                    stdin=b'set trace off\ninsert 17:zz file{id:99}\ndump --limit 1\ninfo\n'
                          b'find 17:zz\nls /beta\n')
checks.check("found=yes" in done[1] and "inner\nzz" in done[1],
             "looking from the shell: %r" % (done,))
checks.finish()
