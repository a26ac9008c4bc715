#!/usr/bin/env python3
"""The health checks can fail: each is run over small trees made to break its rule, and over one
that keeps it."""

import pathlib
import sys
import tempfile
import unittest

import banned
import layers
import lengths
import links
import sites
import stack
import symbols

sys.path.append(str(pathlib.Path(__file__).resolve().parents[2] / "tools"))
import doxygen_comments  # noqa: E402


class Tree(unittest.TestCase):
    def setUp(self):
        self.folder = tempfile.TemporaryDirectory()
        self.root = pathlib.Path(self.folder.name)

    def tearDown(self):
        self.folder.cleanup()

    def put(self, name, text):
        file = self.root / name
        file.parent.mkdir(parents=True, exist_ok=True)
        file.write_text(text, encoding="utf-8")

    def engine(self, text, name="path_find.cpp"):
        self.put("src/hfs/treehfs/" + name, text)


class Lengths(Tree):
    def test_function_of_70_lines_passes_and_of_71_fails(self):
        self.put("src/a.cpp", "int F(int a) {\n" + "    a += 1;\n" * 68 + "}\n")
        self.assertEqual(lengths.check(self.root), [])
        self.put("src/a.cpp", "int F(int a) {\n" + "    a += 1;\n" * 69 + "}\n")
        self.assertEqual(len(lengths.check(self.root)), 1)

    def test_methods_in_namespaces_and_classes_are_seen(self):
        body = "    void F() {\n" + "        if (x) { y(); }\n" * 69 + "    }\n"
        self.put("src/a.h", "namespace A {\nclass C {\npublic:\n" + body + "};\n}\n")
        self.assertIn("F has 71 lines", lengths.check(self.root)[0])

    def test_long_namespaces_and_tables_are_no_functions(self):
        table = "const int kTable[] = {\n" + "    1,\n" * 99 + "};\n"
        self.put("src/a.cpp", "namespace A {\n" + table + "}\n")
        self.assertEqual(lengths.check(self.root), [])

    def test_long_files_and_lines_fail(self):
        self.put("src/a.cpp", "int a;\n" * 600)
        self.put("tests/b.py", "#" * 101 + "\n")
        self.assertEqual(len(lengths.check(self.root)), 2)


class Banned(Tree):
    def test_engine_code_without_them_passes(self):
        self.engine("// a new node, delete nothing\nvoid* p = velk_heap_alloc(1);\n"
                    "C(const C&) = delete;\nauto* n = new (memory) Node;\n")
        self.assertEqual(banned.check(self.root), [])

    def test_each_kind_fails_in_the_engine(self):
        for line in ("p = malloc(1);", "auto* p = new Node;", "delete p;", "throw 1;",
                     "virtual void F();", "std::vector<int> v;", "std::mutex m;",
                     "x = dynamic_cast<T*>(p);", "assert(x);", "std::memcpy(a, b, 1);"):
            self.engine(line + "\n")
            self.assertEqual(len(banned.engine_findings(self.root)), 1, line)

    def test_plain_memory_functions_pass_where_allowed(self):
        self.engine("std::memcpy(a, b, 1);\n", "bytes.cpp")
        self.assertEqual(banned.check(self.root), [])

    def test_words_fail_anywhere(self):
        for line in ("TO" + "DO later", "see the" + " spec", "as Pa" + "rt 4.1 says",
                     "dec" + "ision 7", "cd /wo" + "rk/main", "not imple" + "mented"):
            self.put("docs/a.md", line + "\n")
            self.assertEqual(len(banned.text_findings(self.root)), 1, line)


class Sites(Tree):
    def test_catalogue_matches_after_writing(self):
        self.engine("HFS_TRY(Get(a, b(c, d)), 11);\nreturn Fail(kErrCorrupt, kReasonNode, 12);\n"
                    "HFS_ASSERT(a < b, 13);\nReport(status, 14);\n"
                    "if (HFS_UNLIKELY(a > (b))) {\n    AssertFailed(15);\n}\n")
        sites.write(self.root)
        self.assertEqual(sites.check(self.root), [])
        text = (self.root / "docs/sites.txt").read_text()
        self.assertIn("    11  pass    path_find.cpp        Get(a, b(c, d))\n", text)
        self.assertIn("    12  fail    path_find.cpp        kReasonNode\n", text)
        self.assertIn("    15  assert  path_find.cpp        not (a > (b))\n", text)

    def test_two_owners_fail(self):
        self.engine("HFS_ASSERT(a, 7);\n")
        self.engine("HFS_ASSERT(b, 7);\n", "cache.cpp")
        sites.write(self.root)
        self.assertIn("site 7 belongs to", sites.check(self.root)[0])

    def test_calls_of_a_helper_are_the_owners(self):
        self.engine("int Bad(int site) {\n    return Fail(kErrCorrupt, kReasonTree, site);\n}\n"
                    "int F() { return Bad(21); }\nint G() { return Bad(21); }\n")
        sites.write(self.root)
        self.assertEqual([s[:4] for s in sites.collect(self.root)[0]],
                         [(21, "fail", "path_find.cpp", "kReasonTree")] * 2)
        self.assertIn("site 21 belongs to", sites.check(self.root)[0])

    def test_stale_catalogue_fails(self):
        self.engine("HFS_ASSERT(a, 7);\n")
        sites.write(self.root)
        self.engine("HFS_ASSERT(a, 8);\n")
        self.assertEqual(sites.check(self.root), ["docs/sites.txt is stale: run ./dev docs"])

    def test_site_that_is_no_number_fails(self):
        self.engine("HFS_TRY(F(), site);\n")
        sites.write(self.root)
        self.assertIn("is no number", sites.check(self.root)[0])


class Links(Tree):
    def test_links_to_files_and_headings_pass(self):
        self.put("docs/a.md", "# The `a`: one\n\n[b](../b.md#on-the-b-1) [c](#the-a-one)\n"
                              "![p](p.svg) [net](https://example.org/x) `[no](link)`\n\n"
                              "    [no](x)\n")
        self.put("docs/p.svg", "")
        self.put("b.md", "## On the b\n\n## On the b\n\n[a]: docs/a.md\n")
        self.assertEqual(links.check(self.root), [])

    def test_links_that_lead_nowhere_fail(self):
        self.put("a.md", "# A\n\n[x](b.md)\n[two\nlines](#b)\n[![p](p.png)](a.md)\n\n[r]: no.md\n")
        self.put("docs/c.md", "[out](../../etc)\n")
        self.assertEqual([f.split(": ")[0] for f in links.check(self.root)],
                         ["a.md:3", "a.md:5", "a.md:6", "a.md:8", "docs/c.md:1"])

    def test_sites_are_followed_to_their_anchors(self):
        self.put("a.html", '<h1 id="top">A</h1><a href="b.html#x">b</a><a href="#top">a</a>')
        self.put("b.html", '<a name="x"></a><img src="p.png"><a href="a.html#y">a</a>')
        self.assertEqual(links.check_site(self.root),
                         ["b.html:1: p.png: no such file", "b.html:1: a.html#y: no such anchor"])
        self.assertEqual(len(links.check_site(self.root / "none")), 1)


class Comments(unittest.TestCase):
    def shown(self, text):
        return "\n".join(doxygen_comments.filtered(text.split("\n")))

    def test_comments_describe_the_file_what_follows_and_what_precedes(self):
        self.assertEqual(self.shown("// The file.\n\n// A.\nint a;\n\nint b;  // B\n"),
                         "/// \\file\n/// The file.\n\n/// A.\nint a;\n\nint b;  ///< B\n")

    def test_headings_describe_nothing(self):
        self.assertEqual(self.shown("\n// Trees.\n// More.\n\n// A.\nint a;"),
                         "\n\n\n\n/// A.\nint a;")

    def test_declarations_in_a_row_share_a_comment(self):
        both = "int F(int a,\n      int b);\nint G() {\n}\n"
        self.assertEqual(self.shown(f"\n// Both.\n{both}\nint H();"),
                         f"\n/// Both.\n/// @{{\n{both}/// @}}\n\nint H();")

    def test_no_comment_gives_commands(self):
        self.assertEqual(self.shown("\n// \\u0020, @x\n//\n//     a = '\\n';\nint a;"),
                         "\n/// \\\\u0020, \\@x\n///\n///     a = '\\n';\nint a;")

    def test_comments_of_c_become_line_comments(self):
        self.assertEqual(list(doxygen_comments.in_line_comments(
            ["/* A file", " * of C.", " */", "int a; /* A */", "/* B */", "int b; int* c; // C"])),
            ["// A file", "// of C.", "//", "int a; // A", "// B", "int b; int* c; // C"])

    def test_a_comment_over_declarations_with_their_own_is_their_title(self):
        self.assertEqual(self.shown("\n// Kinds. Of a\n// node.\nint a;  // A\nint b;\n"),
                         "\n/// \\name Kinds\n/// Of a node.\n/// @{\n"
                         "int a;  ///< A\nint b;\n/// @}\n")

    def test_a_type_shares_its_comment_with_nobody(self):
        text = "\n/// A.\nstruct A {\n    int a;\n};\nint b;"
        self.assertEqual(self.shown(text.replace("///", "//")), text)


class Symbols(unittest.TestCase):
    def test_platform_and_memory_moves_pass(self):
        needed = {"memcpy", "velk_heap_alloc", "VELKError", "__ubsan_handle_x", "Own"}
        self.assertEqual(symbols.judge(needed, {"Own"}), [])

    def test_anything_else_fails(self):
        for name in ("malloc", "_Znwm", "__cxa_throw", "_ZTVN10__cxxabiv1E", "printf", "memchr"):
            self.assertEqual(symbols.judge({name}, set()), [f"undefined symbol {name}"])

    def test_what_a_driver_supplies_is_named(self):
        needed = {"memcpy", "_ZN4VELK11FoldHfsUnitEt", "__ubsan_handle_x"}
        self.assertEqual(symbols.unnamed(needed, "`memcpy` and `FoldHfsUnit`"), [])
        self.assertEqual(symbols.unnamed(needed, "`memcpy`"),
                         ["docs/porting.md does not name _ZN4VELK11FoldHfsUnitEt"])


class Stack(unittest.TestCase):
    LISTING = ("0000 <Small()>:\n  0: push   %rbp\n  1: sub    $0x7f8,%rsp\n"
               "0010 <Large(int)>:\n 10: push   %rbp\n 11: push   %r12\n 13: sub $0x7f8,%rsp\n"
               " 20: sub    $0xffffffffffffff80,%rsp\n 24: sub    $0x9000,%rax\n")

    def test_frame_of_the_limit_passes(self):
        self.assertEqual(stack.judge({"Small()": 2048}, 2048), [])

    def test_larger_frame_fails(self):
        self.assertEqual(stack.judge(stack.frames(self.LISTING), 2048),
                         ["Large(int) takes 2056 bytes of stack, more than 2048"])

    def test_library_without_functions_fails(self):
        self.assertEqual(stack.judge(stack.frames("nothing"), 2048), ["no functions found"])


class Layers(Tree):
    def test_downward_includes_pass(self):
        self.put("src/platform/types.h", "")
        self.put("src/hfs/format.h", '#include "platform/types.h"\n')
        self.put("src/hfs/check/check.h", '#include "hfs/format.h"\n')
        self.engine('#include "hfs/format.h"\n', "bytes.h")
        self.engine('#include "hfs/treehfs/bytes.h"\n', "delete_tree.cpp")
        self.assertEqual(layers.check(self.root), [])

    def test_upward_includes_fail(self):
        self.engine("", "cache.h")
        self.put("src/tool/a.h", "")
        self.put("src/hfs/check/check.cpp", '#include "hfs/treehfs/cache.h"\n')
        self.engine('#include "hfs/treehfs/cache.h"\n', "bytes.cpp")
        self.put("src/hfs/volume/v.cpp", '#include "tool/a.h"\n#include "hfs/treehfs/cache.h"\n')
        self.assertEqual(len(layers.check(self.root)), 4)

    def test_file_without_a_place_fails(self):
        self.engine("", "helpers.cpp")
        self.put("src/other/x.cpp", "")
        self.assertEqual(len(layers.check(self.root)), 2)

    def test_symbols_are_judged_by_object(self):
        listing = ("lib.a[cache.cpp.o]: Get T 0 1\nlib.a[delete_tree.cpp.o]: Get U\n"
                   "lib.a[delete_tree.cpp.o]: Del T 0 1\n")
        self.assertEqual(layers.symbol_findings(listing), [])
        listing += "lib.a[cache.cpp.o]: Del U\n"
        self.assertEqual(layers.symbol_findings(listing),
                         ["cache uses Del of delete_tree, which is above it"])


if __name__ == "__main__":
    unittest.main()
