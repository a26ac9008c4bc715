#!/usr/bin/env python3
"""What fuzz/run.sh says of a run, with programs that only behave like fuzzers and targets."""
import os
import pathlib
import subprocess
import tempfile
import unittest

PROGRAM = pathlib.Path(__file__).resolve().parents[2] / "fuzz" / "run.sh"

SEEDS = 'mkdir -p "$1/node"; echo seed >"$1/node/seed"'
CANARY = 'echo "does not hold: alike"; exit 1'
LIVING_CANARY = "exit 0"

# A target as libFuzzer drives it: a run that found nothing, and one that did.
QUIET = """printf '#40\\tINITED cov: 95 ft: 300 corp: 30/2Kb\\n#60000\\tDONE   cov: 95 ft: 300\\n'
echo 'stat::number_of_executed_units: 60000'"""
LOUD = "echo 'ERROR: libFuzzer: deadly signal'; exit 77"

# AFL++: what it leaves in the folder behind -o. The input it was given is no find of its own.
AFL = """while [ "$1" != -o ]; do shift; done
mkdir -p "$2/default/queue" "$2/default/crashes" "$2/default/hangs"
echo old >"$2/default/queue/id:000000,time:0,execs:0,orig:seed"
echo new >"$2/default/queue/id:000001,src:000000,time:5,execs:9,op:havoc,rep:2"
printf 'run_time          : 1\\nexecs_done        : 12345\\nexecs_per_sec     : 99.00\\n' \\
    >"$2/default/fuzzer_stats"
printf 'edges_found       : 678\\ntotal_edges       : 9000\\n' >>"$2/default/fuzzer_stats"
"""
AFL_CRASH = AFL + 'echo bad >"$2/default/crashes/id:000000,sig:06"'
AFL_HANG = AFL + 'echo slow >"$2/default/hangs/id:000000,src:000000"'
AFL_BROKEN = "echo 'PROGRAM ABORT : no instrumentation detected' >&2; exit 1"


class FuzzRun(unittest.TestCase):
    def setUp(self):
        holder = tempfile.TemporaryDirectory()
        self.addCleanup(holder.cleanup)
        self.root = pathlib.Path(holder.name)
        self.found = self.root / "fuzz-found"
        self.program("build/fuzz_seeds", SEEDS)
        self.program("build/fuzz_canary", CANARY)
        self.program("build/fuzz_node", QUIET)
        self.program("bin/afl-fuzz", AFL)

    def program(self, name, text):
        path = self.root / name
        path.parent.mkdir(exist_ok=True)
        path.write_text("#!/bin/sh\n" + text + "\n", encoding="utf-8")
        path.chmod(0o755)

    def said(self, fuzzer, status=0, target="node"):
        run = subprocess.run(
            [PROGRAM, fuzzer, self.root / "build", "1", target], text=True, capture_output=True,
            check=False, env={**os.environ, "PATH": f"{self.root / 'bin'}:{os.environ['PATH']}"})
        self.assertEqual(run.returncode, status, run.stderr)
        return run.stdout + run.stderr

    def test_a_libfuzzer_run_that_found_nothing(self):
        self.assertEqual(self.said("libfuzzer"),
                         "canary: failed, as it must\n"
                         "node: 60000 runs in 1 s, nothing found; "
                         "95 edges, none of them new; dry\n")

    def test_a_libfuzzer_run_that_failed_shows_its_log(self):
        self.program("build/fuzz_node", LOUD)
        said = self.said("libfuzzer", status=1)
        self.assertIn("node: FAILED, see ", said)
        self.assertIn("ERROR: libFuzzer: deadly signal\n", said)

    def test_an_afl_run_that_found_nothing(self):
        self.assertEqual(self.said("afl"), "canary: failed, as it must\n"
                         "node: 12345 runs in 1 s, nothing found; 678 edges\n")

    def test_an_afl_run_hands_on_what_it_found_itself(self):
        self.said("afl")
        kept = [path.read_text(encoding="utf-8") for path in (self.found / "node").iterdir()]
        self.assertEqual(kept, ["new\n"])

    def test_an_afl_run_that_crashed_hung_or_did_not_start(self):
        for afl in AFL_CRASH, AFL_HANG, AFL_BROKEN:
            self.program("bin/afl-fuzz", afl)
            self.assertIn("node: FAILED, see ", self.said("afl", status=1))

    def test_a_canary_that_lives_ends_the_run(self):
        self.program("build/fuzz_canary", LIVING_CANARY)
        for fuzzer in "libfuzzer", "afl":
            self.assertEqual(self.said(fuzzer, status=1),
                             "fuzz: the canary lived: failures would not be seen\n")

    def test_a_target_that_is_not_there(self):
        self.assertIn("fuzz: there is no target 'nodes'\n",
                      self.said("libfuzzer", status=16, target="nodes"))


if __name__ == "__main__":
    unittest.main()
