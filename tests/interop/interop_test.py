"""Volumes made and changed by this program, read by others: the lists are compared name by name.

usage: interop_test.py TREEHFS [unittest arguments]
TREEHFS_INTEROP_NAMES sets how many names the largest volume has."""

import json
import os
import subprocess
import sys
import tempfile
import unittest

import listers
import names

TREEHFS = None
LARGEST = int(os.environ.get("TREEHFS_INTEROP_NAMES", "300000"))
FIRST_ID = 16
PER_FOLDER = 500
DATE = "2026-11-21T00:00:00Z"


def treehfs(*arguments, stdin=None):
    done = subprocess.run([TREEHFS, *arguments], input=stdin, capture_output=True, check=False)
    if done.returncode != 0:
        raise AssertionError(f"treehfs {' '.join(arguments)}: {done.stderr.decode()[-2000:]}")
    return done.stdout


class Plan:
    """Folders in the root, files in the folders; which of them are deleted again."""

    def __init__(self, count, seed):
        self.items = []  # (id, parent, name, is folder)
        folders = max(1, count // PER_FOLDER)
        self.valence = {}
        for number, name in enumerate(names.make_names(count, seed)):
            item_id = FIRST_ID + number
            is_folder = number < folders
            parent = 2 if is_folder or count < 50 else FIRST_ID + number % folders
            self.items.append((item_id, parent, name, is_folder))

    def script(self):
        lines = ["use catalog"]
        children = {}
        for item_id, parent, name, is_folder in self.items:
            children[parent] = children.get(parent, 0) + 1
        for item_id, parent, name, is_folder in self.items:
            text = json.dumps(name)
            dates = f"created:{DATE}"
            if is_folder:
                valence = children.get(item_id, 0)
                record = f"folder{{id:{item_id},valence:{valence},mode:040755,{dates}}}"
            else:
                record = f"file{{id:{item_id},mode:0100644,{dates}}}"
            kind = "thread" if is_folder else "thread-file"
            lines.append(f"insert {parent}:{text} {record}")
            lines.append(f'insert {item_id}:"" {kind}{{parent:{parent},name:{text}}}')
        return "\n".join(lines) + "\n"

    def delete_script(self):
        """Every second file goes."""
        lines = ["use catalog"]
        left = []
        for number, item in enumerate(self.items):
            item_id, parent, name, is_folder = item
            if is_folder or number % 2 == 0:
                left.append(item)
                continue
            lines.append(f"delete {parent}:{json.dumps(name)}")
            lines.append(f'delete {item_id}:""')
        self.items = left
        return "\n".join(lines) + "\n"

    def paths(self):
        by_id = {item_id: name for item_id, _, name, _ in self.items}
        return {listers.composed(name if parent == 2 else by_id[parent] + "/" + name)
                for _, parent, name, _ in self.items}


class Interoperability(unittest.TestCase):
    maxDiff = 2000

    def setUp(self):
        self.folder = tempfile.TemporaryDirectory()
        self.image = os.path.join(self.folder.name, "volume.img")

    def tearDown(self):
        self.folder.cleanup()

    def run_script(self, script):
        path = os.path.join(self.folder.name, "script.tr")
        with open(path, "w", encoding="utf-8") as file:
            file.write(script)
        subprocess.run([TREEHFS, "apply", "--strict", "--write", self.image, path], check=True,
                       stdout=subprocess.DEVNULL)

    def compare(self, plan, has_attributes, only=None):
        expected = plan.paths()
        self.assertEqual(len(expected), len(plan.items))
        treehfs("check", self.image)
        own = treehfs("ls", "-R", "-0", self.image).decode("utf-8").split("\0")
        self.assertEqual({listers.composed(path.lstrip("/").rstrip("/")) for path in own if path},
                         expected)
        compared = 0
        for lister in listers.RECURSIVE:
            if only is not None and lister.program not in only:
                continue
            if not listers.installed(lister.program):
                continue
            if not has_attributes and not lister.opens_without_attributes:
                continue
            with self.subTest(reader=lister.program):
                found = lister.comparable(lister.paths(self.image))
                wanted = lister.comparable(expected)
                self.assertEqual(sorted(found - wanted)[:5], [])
                self.assertEqual(sorted(wanted - found)[:5], [])
            compared += 1
        self.assertGreater(compared, 0, "none of the listers is installed")

    def grow_and_thin(self, count, *options, has_attributes=True, only=None):
        treehfs("format", self.image, "--name", "Interop", "--date", DATE, "--uuid", "1", *options,
                *(["--with-attributes"] if has_attributes else []))
        plan = Plan(count, count)
        self.run_script(plan.script())
        self.compare(plan, has_attributes, only)
        self.run_script(plan.delete_script())
        self.compare(plan, has_attributes, only)

    def test_ten_names(self):
        self.grow_and_thin(10, "--size", "1M")

    def test_ten_names_in_blocks_of_512(self):
        self.grow_and_thin(10, "--size", "1M", "--block-size", "512")

    def test_ten_names_compared_binary(self):
        self.grow_and_thin(10, "--size", "1M", "--case-sensitive")

    def test_ten_names_without_attributes(self):
        self.grow_and_thin(10, "--size", "1M", has_attributes=False)

    def test_ten_thousand_names(self):
        self.grow_and_thin(10000, "--size", "64M")

    def test_ten_thousand_names_in_small_blocks_and_large_nodes(self):
        self.grow_and_thin(10000, "--size", "32M", "--block-size", "512", "--node-size",
                           "c=8192,e=4096,a=8192")

    def test_ten_thousand_names_in_large_blocks(self):
        self.grow_and_thin(10000, "--size", "128M", "--block-size", "65536", "--node-size",
                           "c=32768,e=4096,a=8192")

    def test_the_largest_volume(self):
        # One reader each of the quick ones: the others take minutes.
        self.grow_and_thin(LARGEST, "--size", "1G", only={"7z", "fls"})

    def test_the_root_folder_as_a_boot_loader_sees_it(self):
        if not listers.installed("grub-fstest"):
            self.skipTest("grub-fstest is not installed")
        treehfs("format", self.image, "--size", "1M", "--name", "Interop", "--with-attributes")
        self.run_script('use catalog\ninsert 2:"kernel" file{id:16,mode:0100644}\n'
                        'insert 16:"" thread-file{parent:2,name:"kernel"}\n')
        listed = subprocess.run(["grub-fstest", self.image, "ls", "(loop0)/"], check=False,
                                capture_output=True).stdout.decode("utf-8").split()
        self.assertEqual(listed, ["kernel"])


if __name__ == "__main__":
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    TREEHFS = os.path.abspath(sys.argv.pop(1))
    unittest.main()
