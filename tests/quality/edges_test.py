#!/usr/bin/env python3
"""What fuzz/edges.awk makes of a fuzzer's log: whether new code still turned up at its end."""
import pathlib
import subprocess
import unittest

PROGRAM = pathlib.Path(__file__).resolve().parents[2] / "fuzz" / "edges.awk"

# The log as libFuzzer writes it: inputs read in 40 runs, then 1,000 more runs.
START = """INFO: Seed: 1
#32\tpulse  cov: 90 ft: 200 corp: 20/1Kb exec/s: 20 rss: 30Mb
#40\tINITED cov: 95 ft: 300 corp: 30/2Kb exec/s: 20 rss: 30Mb
"""
END = """#1040\tDONE   cov: {cov} ft: 900 corp: 60/9Kb lim: 4200 exec/s: 100 rss: 30Mb
stat::number_of_executed_units: 1040
stat::average_exec_per_sec:     100
"""


def new(run, cov):
    return f"#{run}\tNEW    cov: {cov} ft: 400 corp: 31/3Kb exec/s: 9 rss: 30Mb L: 3/9 MS: 1\n"


class Edges(unittest.TestCase):
    def said(self, log, enough=1000, status=0):
        run = subprocess.run(
            ["awk", "-v", f"enough={enough}", "-f", PROGRAM],
            input=log, text=True, capture_output=True, check=False)
        self.assertEqual((run.returncode, run.stderr), (status, ""))
        return run.stdout

    def test_last_edge_in_the_first_half(self):
        log = START + new(60, 97) + new(539, 99) + new(1000, 99) + END.format(cov=99)
        self.assertEqual(self.said(log), "99 edges, 4 of them new, the last at run 499; dry\n")

    def test_last_edge_in_the_second_half(self):
        log = START + new(60, 97) + new(540, 98) + END.format(cov=98)
        self.assertEqual(self.said(log), "98 edges, 3 of them new, the last at run 500; not dry\n")

    def test_edge_that_only_the_last_line_tells_of(self):
        log = START + END.format(cov=96)
        self.assertEqual(self.said(log), "96 edges, 1 of them new, the last at run 1000; not dry\n")

    def test_no_new_edge(self):
        self.assertEqual(self.said(START + END.format(cov=95)),
                         "95 edges, none of them new; dry\n")

    def test_more_features_are_no_new_code(self):
        log = START + new(1000, 95) + END.format(cov=95)
        self.assertEqual(self.said(log), "95 edges, none of them new; dry\n")

    def test_too_few_runs(self):
        self.assertEqual(
            self.said(START + END.format(cov=95), enough=1001),
            "95 edges, none of them new; 1001 runs would be enough to say whether it is dry\n")

    def test_a_log_without_an_end(self):
        self.assertEqual(self.said(START + new(60, 97), status=1), "no runs\n")
        self.assertEqual(self.said("", status=1), "no runs\n")


if __name__ == "__main__":
    unittest.main()
