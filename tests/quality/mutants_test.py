#!/usr/bin/env python3
"""The mutation tester can fail: a library of two functions, of which the tests try only one."""

import pathlib
import os
import shutil
import subprocess
import sys
import tempfile
import unittest

HERE = pathlib.Path(__file__).resolve().parent
TRIED = "int Larger(int a, int b) {\n    if (a > b) {\n        return a;\n    }\n    return b;\n}\n"
UNTRIED = "int Sign(int a) {\n    if (a < 0) {\n        return -1;\n    }\n    return 1;\n}\n"
SHOULD = """
int Larger(int a, int b);
int main() { return Larger(1, 2) == 2 && Larger(4, 3) == 4 && Larger(5, 5) == 5 ? 0 : 1; }
"""


class Mutants(unittest.TestCase):
    def setUp(self):
        self.folder = pathlib.Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.folder)

    def run_on(self, source, program=SHOULD, listed=""):
        source_folder = self.folder / "source"
        source_folder.mkdir(exist_ok=True)
        (source_folder / "lib.cpp").write_text(source, encoding="utf-8")
        (self.folder / "test.cpp").write_text(program, encoding="utf-8")
        (self.folder / "equivalent.list").write_text(listed, encoding="utf-8")
        compiler = os.environ.get("CXX", "g++")
        flags = ["-g", "-O0", "-fcf-protection=none"]
        subprocess.run([compiler, *flags, "-shared", "-fPIC", "source/lib.cpp", "-o", "libx.so"],
                       cwd=self.folder, check=True)
        subprocess.run([compiler, *flags, "test.cpp", "-L.", "-lx", "-o", "test"],
                       cwd=self.folder, check=True)
        done = subprocess.run(
            [sys.executable, HERE / "mutants.py", "libx.so", "source", str(self.folder / "test"),
             "--count", "0", "--spare", "1", "--equivalent", "equivalent.list",
             "--notes", "notes"],
            cwd=self.folder, capture_output=True, text=True, check=False)
        return done.returncode, done.stdout + done.stderr

    def test_a_tested_function_leaves_no_survivor(self):
        status, text = self.run_on(TRIED)
        self.assertEqual(status, 0, text)
        self.assertIn("2 killed, 0 survived, 0 equivalent, of 2: 100.0% killed", text)

    def test_an_untested_function_survives_with_its_line_and_fails_the_run(self):
        status, text = self.run_on(TRIED + UNTRIED)
        self.assertEqual(status, 1, text)
        self.assertIn("2 killed, 2 survived, 0 equivalent, of 4: 50.0% killed", text)
        self.assertRegex(text, r"survived: lib\.cpp:8: jump \w+ reversed in .*: if \(a < 0\) \{")
        self.assertRegex(text, r"survived: lib\.cpp:8: jump \w+ removed in .*: if \(a < 0\) \{")

    def test_listed_mutants_are_left_out_of_the_score(self):
        status, text = self.run_on(TRIED + UNTRIED,
                                   listed="lib.cpp: if (a < 0) {\n    any: nobody asks\n")
        self.assertEqual(status, 0, text)
        self.assertIn("2 killed, 0 survived, 2 equivalent, of 4: 100.0% killed", text)

    def test_a_mutant_is_listed_for_the_function_it_is_in(self):
        listed = "lib.cpp: if (a < 0) {\n    any in {}: nobody asks\n"
        status, text = self.run_on(TRIED + UNTRIED, listed=listed.replace("{}", "Larg*"))
        self.assertIn("2 killed, 2 survived, 0 equivalent, of 4", text)
        status, text = self.run_on(TRIED + UNTRIED, listed=listed.replace("{}", "Sign(*"))
        self.assertEqual(status, 0, text)
        self.assertIn("2 killed, 0 survived, 2 equivalent, of 4", text)

    def test_an_entry_that_means_no_jump_fails_the_run(self):
        status, text = self.run_on(TRIED, listed="lib.cpp: if (a > b) {\n"
                                                 "    any in Sign*: it has moved\n"
                                                 "    removed: nobody asks\n")
        self.assertEqual(status, 1, text)
        self.assertIn("listed, but there is no such jump: lib.cpp: if (a > b) {: any in Sign*\n",
                      text)
        self.assertNotIn("no such jump: lib.cpp: if (a > b) {: removed", text)

    def test_what_survived_is_tried_again_when_the_tests_have_changed(self):
        self.run_on(TRIED + UNTRIED)
        _, text = self.run_on(TRIED + UNTRIED)
        self.assertIn("2 had survived these tests before and were not tried again", text)
        self.assertIn("2 killed, 2 survived, 0 equivalent, of 4", text)
        better = SHOULD.replace("int main() { return", "int Sign(int a);\nint main() { return "
                                "Sign(-7) == -1 && Sign(0) == 1 &&")
        status, text = self.run_on(TRIED + UNTRIED, better)
        self.assertEqual(status, 0, text)
        self.assertNotIn("not tried again", text)
        self.assertIn("4 killed, 0 survived, 0 equivalent, of 4", text)

    def test_endless_mutants_are_killed(self):
        loop = "int Larger(int a, int b) {\n    while (a == 77) {\n    }\n"
        status, text = self.run_on(TRIED.replace("int Larger(int a, int b) {\n", loop))
        self.assertIn("limit 1 s", text)
        self.assertNotRegex(text, r"survived: lib\.cpp:2: jump \w+ reversed")
        self.assertEqual(status, 1, "without the test at 77 the removed loop survives")

    def test_tests_that_fail_by_themselves_are_refused(self):
        status, text = self.run_on(TRIED, "int main() { return 3; }\n")
        self.assertEqual(status, 1)
        self.assertIn("fails without a mutant: status 3", text)


if __name__ == "__main__":
    unittest.main()
