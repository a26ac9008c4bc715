"""The commands that make things: format, create-tree, plot, demo.

usage: make_test.py TREEHFS [unittest arguments]"""

import hashlib
import os
import shutil
import subprocess
import sys
import tempfile
import unittest
import xml.etree.ElementTree

TREEHFS = None
FIXED = ("--date", "2026-11-21T00:00:00Z", "--uuid", "0123456789abcdef")
SVG = "{http://www.w3.org/2000/svg}"


class Made(unittest.TestCase):
    def setUp(self):
        self.folder = tempfile.TemporaryDirectory()
        self.image = self.path("volume.img")

    def tearDown(self):
        self.folder.cleanup()

    def path(self, name):
        return os.path.join(self.folder.name, name)

    def run_tool(self, *arguments):
        return subprocess.run([TREEHFS, *arguments], capture_output=True, check=False, text=True,
                              cwd=self.folder.name)

    def good(self, *arguments):
        done = self.run_tool(*arguments)
        self.assertEqual(done.returncode, 0, done.stderr)
        return done.stdout

    def refused(self, code, line, *arguments):
        done = self.run_tool(*arguments)
        self.assertEqual((done.returncode, done.stderr), (code, line + "\n"))
        self.assertEqual(done.stdout, "")

    def digest(self, name):
        with open(self.path(name), "rb") as file:
            return hashlib.sha256(file.read()).hexdigest()


class Format(Made):
    def test_says_what_was_made(self):
        self.assertEqual(
            self.good("format", "volume.img", "--size", "64M", "--name", "Test", *FIXED),
            "volume.img: HFS Plus, 16,384 blocks of 4,096 B; catalog 512 KiB (128 nodes of "
            "4,096 B), extents 512 KiB (128 nodes of 4,096 B), attributes none\n")
        self.assertEqual(os.path.getsize(self.image), 64 << 20)

    def test_the_new_volume_passes_the_full_check(self):
        for options in ([], ["--case-sensitive"], ["--with-attributes"],
                        ["--block-size", "512", "--node-size", "c=32768,e=512,a=8192",
                         "--with-attributes"],
                        ["--block-size", "65536", "--node-size", "8192"]):
            with self.subTest(options=options):
                self.good("format", "volume.img", "--size", "16M", "--force", *options)
                told = self.good("check", "--full", "--warnings-as-errors", "volume.img")
                self.assertIn("no errors", told)

    def test_a_volume_for_import_has_no_record(self):
        self.good("format", "volume.img", "--size", "8M", "--empty")
        # Not even a root folder, which the full check would miss.
        self.assertIn("no errors", self.good("check", "--warnings-as-errors", "volume.img"))
        told = [line.split() for line in self.good("info", "volume.img").splitlines()]
        catalog = next(line for line in told if line and line[0] == "catalog")
        self.assertEqual(catalog[4:6], ["0", "0"])  # depth, records

    def test_same_date_and_identifier_give_identical_bytes(self):
        self.good("format", "a.img", "--size", "8M", "--with-attributes", *FIXED)
        self.good("format", "b.img", "--size", "8M", "--with-attributes", *FIXED)
        self.assertEqual(self.digest("a.img"), self.digest("b.img"))
        self.good("format", "c.img", "--size", "8M", "--with-attributes", "--date",
                  "2026-11-21T00:00:00Z", "--uuid", "1")
        self.assertNotEqual(self.digest("a.img"), self.digest("c.img"))

    def test_another_reader_sees_the_name(self):
        if shutil.which("fsstat") is None:
            self.skipTest("fsstat is not installed")
        self.good("format", "volume.img", "--size", "8M", "--name", "Größe", *FIXED)
        told = subprocess.run(["fsstat", self.image], capture_output=True, check=True, text=True)
        self.assertIn("File System Type: HFS+", told.stdout)

    def test_refuses_what_cannot_be(self):
        self.good("format", "volume.img", "--size", "1M")
        self.refused(8, "treehfs: volume.img exists: --force replaces it",
                     "format", "volume.img", "--size", "1M")
        self.refused(16, "treehfs format: how large is the volume to be?: give --size, for example "
                     "64M", "format", "new.img")
        self.refused(16, "treehfs format: --size 4,096 is too small: a volume takes 64K at least",
                     "format", "new.img", "--size", "4K")
        self.refused(16, "treehfs: node size 3,000 is none: powers of two from 512 to 32768 are",
                     "format", "new.img", "--size", "1M", "--node-size", "3000")
        self.refused(16, "treehfs: --node-size: 'x=512' names no tree: c, e and a stand for "
                     "catalog, extents and attributes",
                     "format", "new.img", "--size", "1M", "--node-size", "x=512")
        self.refused(16, "treehfs: date '21.11.2026' is none the volume can hold: for example "
                     "2026-11-21T01:18:16Z, from 1904 to 2040",
                     "format", "new.img", "--size", "1M", "--date", "21.11.2026")
        self.refused(16, "treehfs: --uuid 'xyz' is no identifier: give up to 16 hexadecimal digits",
                     "format", "new.img", "--size", "1M", "--uuid", "xyz")
        self.assertFalse(os.path.exists(self.path("new.img")))


class CreateTree(Made):
    def test_stays_in_memory_without_write(self):
        self.good("format", "volume.img", "--size", "8M", *FIXED)
        before = self.digest("volume.img")
        done = self.run_tool("create-tree", "-t", "attributes", "volume.img")
        self.assertEqual(done.returncode, 0)
        self.assertIn("nothing was written", done.stderr)
        self.assertEqual(self.digest("volume.img"), before)

    def test_adds_the_tree(self):
        self.good("format", "volume.img", "--size", "8M", *FIXED)
        self.assertEqual(self.good("create-tree", "volume.img", "--node-size", "4096", "--write"),
                         "volume.img: attributes tree of 16 nodes of 4,096 B, 64 KiB\n")
        self.assertIn("attributes       16       15   4096      0",
                      self.good("info", "volume.img"))
        self.good("check", "--full", "--warnings-as-errors", "volume.img")

    def test_refuses_a_second_one(self):
        self.good("format", "volume.img", "--size", "8M", "--with-attributes")
        before = self.digest("volume.img")
        self.refused(8, "treehfs: volume.img: the volume has a tree of attributes already: nothing "
                     "was changed", "create-tree", "volume.img", "--write")
        self.assertEqual(self.digest("volume.img"), before)


class Plot(Made):
    def setUp(self):
        super().setUp()
        with open(self.path("fill.tr"), "w", encoding="ascii") as file:
            file.write("use catalog\nrepeat 300\ninsert 2:\"name $i\" file{id:$i}\nend\n")
        self.good("apply", "--new", "4M,node=512", "--save", "volume.img", "fill.tr")

    def draw(self, *options, name="tree.svg"):
        self.good("plot", "volume.img", "-o", name, *options)
        with open(self.path(name), encoding="utf-8") as file:
            return file.read()

    def boxes(self, text, style):
        root = xml.etree.ElementTree.fromstring(text)
        return [box for box in root.iter(SVG + "rect")
                if style in box.get("class", "").split() and box.find(SVG + "title") is not None]

    def test_the_map_has_a_square_for_every_node(self):
        text = self.draw()
        root = xml.etree.ElementTree.fromstring(text)
        titles = [title.text for title in root.iter(SVG + "title") if " node " in title.text]
        info = self.good("info", "volume.img")
        catalog = next(line for line in info.splitlines() if line.startswith("catalog")).split()
        self.assertEqual(len(titles), int(catalog[1].replace(",", "")))
        self.assertEqual(sum(title.startswith("free") for title in titles),
                         int(catalog[2].replace(",", "")))
        self.assertEqual(titles[0], "header node 0")

    def test_the_other_kinds_are_pictures_too(self):
        self.assertEqual(len(self.boxes(self.draw("--kind", "fill", name="f.svg"), "bar")) % 10, 0)
        dots = self.boxes(self.draw("--kind", "keys", name="k.svg"), "dot")
        leaves = self.boxes(self.draw(name="m.svg"), "leaf")
        self.assertEqual(len(dots), len([leaf for leaf in leaves
                                         if "leaf node" in leaf.find(SVG + "title").text]))
        self.assertGreater(len(self.boxes(self.draw("--kind", "tree", name="t.svg"), "index")), 1)

    def test_a_page_holds_the_picture(self):
        page = self.draw(name="tree.html")
        self.assertTrue(page.startswith("<!DOCTYPE html>"))
        self.assertIn("<svg xmlns=", page)
        self.assertNotIn("http://", page.replace("http://www.w3.org/2000/svg", ""))

    def test_two_runs_draw_the_same(self):
        self.assertEqual(self.draw(name="a.svg"), self.draw(name="b.svg"))

    def test_refuses_what_it_cannot_draw(self):
        self.refused(16, "treehfs plot: no file to draw into: give -o FILE.svg or -o FILE.html",
                     "plot", "volume.img")
        self.refused(16, "treehfs plot: tree.png ends neither in .svg nor in .html: give -o "
                     "FILE.svg or -o FILE.html", "plot", "volume.img", "-o", "tree.png")
        done = self.run_tool("plot", "none.img", "-o", "tree.svg")
        self.assertEqual((done.returncode, done.stderr),
                         (8, "treehfs: none.img: cannot open: no such file\n"))
        self.assertFalse(os.path.exists(self.path("tree.svg")))


class Demo(Made):
    def test_shows_a_sound_volume_twice_the_same(self):
        first = self.good("demo")
        image, picture = self.digest("demo.img"), self.digest("demo.svg")
        self.assertEqual(first, self.good("demo"))
        self.assertEqual((self.digest("demo.img"), self.digest("demo.svg")), (image, picture))
        lines = first.splitlines()
        self.assertEqual(lines[0], "a volume of 64 MiB in memory: 200 folders and 20,000 files "
                         "inserted, 6,800 deleted")
        self.assertEqual(lines[-1], "all 51 invariants hold")
        self.good("check", "--full", "--warnings-as-errors", "demo.img")

    def test_replaces_only_what_an_earlier_run_made(self):
        for name in ("demo.svg", "demo.img"):
            with open(self.path(name), "w", encoding="utf-8") as file:
                file.write("somebody's")
            self.refused(8, "treehfs: ./%s exists: --force replaces it" % name, "demo")
            with open(self.path(name), encoding="utf-8") as file:
                self.assertEqual(file.read(), "somebody's")
        self.good("demo", "--force")
        self.good("demo")

    def test_needs_a_folder_it_can_write_to(self):
        self.refused(8, "treehfs: nowhere/demo.img: cannot be written: choose another folder with "
                     "--folder", "demo", "--folder", "nowhere")


if __name__ == "__main__":
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    TREEHFS = os.path.abspath(sys.argv.pop(1))
    unittest.main()
