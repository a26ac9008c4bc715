"""The power goes off before every write in turn: each run finds what had been committed.

usage: safe_volume_test.py PROGRAM"""

import os
import subprocess
import sys
import tempfile

RECORDS = 60


def run(path, writes):
    done = subprocess.run([sys.argv[1], path, str(writes)], capture_output=True, text=True,
                          check=False, timeout=60)
    lines = [line.split() for line in done.stdout.splitlines()]
    if not lines:  # cut while the log was carried out
        assert done.returncode == 99, done.stderr
        return 99, None, None
    assert lines[0][0] == "found", done.stdout + done.stderr
    return done.returncode, int(lines[0][1]), int(lines[-1][1])


with tempfile.TemporaryDirectory() as folder:
    # Cut before the nth write of a fresh volume, then look.
    cuts = 0
    for nth in range(0, 200, 3):
        path = os.path.join(folder, "fresh")
        code, found, committed = run(path, nth)
        assert (code, found) == (99, 0), (nth, code, found)
        cuts += 1
        code, found, _ = run(path, -1)
        assert code == 0 and committed <= found <= committed + 1, (nth, committed, found)
        os.remove(path)
    # One volume, cut again and again, also while its log is carried out.
    path = os.path.join(folder, "worn")
    before, turn = 0, 0
    while True:
        code, found, committed = run(path, turn % 17)
        turn += 1
        cuts += code == 99
        if found is None:
            continue
        assert before <= found <= before + 1, (turn, before, found)
        before = committed
        if code == 0:
            break
        assert code == 99 and turn < 1000, (turn, code)
    assert before == RECORDS, before
    print("%d cuts, nothing lost" % cuts)
