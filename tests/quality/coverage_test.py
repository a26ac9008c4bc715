#!/usr/bin/env python3
"""The judge of coverage can fail: outcomes not seen and not listed, listed and seen, listed
wrongly."""

import pathlib
import tempfile
import unittest

import coverage
from line_list import Lines

CODE = "int F(int a, int b) {\n    return a > 0 && b > 0 ? 1 : 2;\n}\n"
NAME = "src/hfs/treehfs/a.cpp"
LINE = "a.cpp: return a > 0 && b > 0 ? 1 : 2;\n"


def line(number, counts, throws=()):
    ways = [{"count": count, "throw": False, "fallthrough": False} for count in counts]
    for count in throws:  # calls
        ways += [{"count": 7, "throw": False, "fallthrough": True},
                 {"count": count, "throw": True, "fallthrough": False}]
    return {"line_number": number, "count": sum(counts), "branches": ways}


class Judge(unittest.TestCase):
    def judge(self, counts, listed=""):
        with tempfile.TemporaryDirectory() as folder:
            source = pathlib.Path(folder, NAME)
            source.parent.mkdir(parents=True)
            source.write_text(CODE, encoding="utf-8")
            file = coverage.File()
            file.add({"lines": [line(2, counts, throws=[0])]})
            return coverage.judge({NAME: file}, Lines(listed), {3754},
                                  coverage.Source(pathlib.Path(folder)))

    def test_all_seen_is_no_complaint(self):
        self.assertEqual(self.judge([1, 2, 3, 4]), ([], 0))

    def test_an_outcome_not_seen_is_named(self):
        complaints, _ = self.judge([1, 2, 0, 4])
        self.assertEqual(len(complaints), 1)
        self.assertIn("a.cpp:2: outcome 3 of: return a > 0", complaints[0])
        self.assertIn("was not seen", complaints[0])

    def test_a_listed_one_is_excused(self):
        self.assertEqual(self.judge([1, 2, 0, 4], LINE + "    3: b is never negative\n"), ([], 1))

    def test_a_listed_one_that_was_seen_is_named(self):
        complaints, _ = self.judge([1, 2, 3, 4], LINE + "    3: b is never negative\n")
        self.assertIn("was seen, although engine.list says: b is never negative", complaints[0])

    def test_one_of_several_equal_lines_can_be_meant(self):
        listed = LINE.replace("a.cpp:", "a.cpp#%d:") + "    3: b is never negative\n"
        self.assertEqual(self.judge([1, 2, 0, 4], listed % 1), ([], 1))
        self.assertEqual(len(self.judge([1, 2, 0, 4], listed % 2)[0]), 2)

    def test_a_listed_line_that_is_not_there_is_named(self):
        complaints, _ = self.judge([1, 2, 3, 4], "a.cpp: return 7;\n    1: gone\n")
        self.assertEqual(complaints, ["a.cpp: no outcome 1 of: return 7;"])

    def test_a_site_given_as_the_reason_has_to_be_a_listed_one(self):
        self.assertEqual(self.judge([1, 2, 0, 4], LINE + "    3: site 3754\n"), ([], 1))
        complaints, _ = self.judge([1, 2, 0, 4], LINE + "    3: site 12\n")
        self.assertIn("does not list site 12", complaints[0])

    def test_counts_of_several_units_are_added_up(self):
        file = coverage.File()
        file.add({"lines": [line(2, [0, 1])]})
        file.add({"lines": [line(2, [1, 0]), line(3, [])]})
        self.assertEqual(file.outcomes, {(2, 1): 1, (2, 2): 1})

    def test_calls_are_no_conditions(self):
        file = coverage.File()
        file.add({"lines": [line(2, [0, 1], throws=[0, 3])]})
        self.assertEqual(file.outcomes, {(2, 1): 0, (2, 2): 1})

    def test_the_ways_of_a_switch_may_be_odd(self):
        file = coverage.File()
        file.add({"lines": [line(2, [0, 1, 5])]})
        self.assertEqual(file.outcomes, {(2, 1): 0, (2, 2): 1, (2, 3): 5})

    def test_the_sites_nothing_leads_to_are_read(self):
        self.assertIn(3754, coverage.unreachable_sites())


class List(unittest.TestCase):
    def test_a_remark_without_a_place_is_refused(self):
        with self.assertRaises(SystemExit):
            Lines("    1: why\n")


if __name__ == "__main__":
    unittest.main()
