"""A volume that xorriso writes during the test: every name is listed, in little memory, and the
whole catalog is checked. The number of names is the argument."""

import os
import signal
import subprocess
import sys

import harness

COUNT = int(sys.argv[1])
MEMORY_LIMIT = 32 << 20

checks = harness.Failures()
image, names = harness.xorriso_volume(COUNT)


# A process begins with the peak of the one that started it, so a small one starts the tool.
STARTER = """
import os, sys
child = os.posix_spawn(sys.argv[1], sys.argv[1:], os.environ)
_, status, usage = os.wait4(child, 0)
print(os.waitstatus_to_exitcode(status), usage.ru_maxrss * 1024, file=sys.stderr)
"""


def measured(*arguments):
    """Runs the tool; returns its exit code, its output and its peak memory in bytes."""
    done = subprocess.run([sys.executable, "-c", STARTER, harness.tool(), *map(str, arguments)],
                          capture_output=True, check=True)
    code, memory = map(int, done.stderr.split()[-2:])
    return code, done.stdout, memory


code, out, memory = measured("ls", "-R", "-0", image)
found = out.decode("utf-8").split("\0")[:-1]
checks.equal(code, 0, "ls -R")
checks.equal(len(found), COUNT, "number of names")
checks.check(sorted(found) == sorted("/" + name for name in names), "names")
code, out, check_memory = measured("check", image)
checks.equal(code, 0, "check: " + out.decode("utf-8"))
if "asan" not in os.environ.get("TREEHFS_BUILD", ""):
    checks.check(memory < MEMORY_LIMIT, "ls -R takes %d bytes" % memory)
    checks.check(check_memory < MEMORY_LIMIT, "check takes %d bytes" % check_memory)

# Somebody stops it while nobody reads what it writes: it ends at once and says so.
stopped = subprocess.Popen([harness.tool(), "ls", "-R", "-l", image], stdout=subprocess.PIPE,
                           stderr=subprocess.PIPE)
stopped.stdout.read(1)
stopped.send_signal(signal.SIGINT)
try:
    checks.equal(stopped.wait(timeout=30), 32, "interrupted")
    checks.equal(stopped.stderr.read(), b"treehfs: interrupted\n", "interrupted")
except subprocess.TimeoutExpired:
    stopped.kill()
    checks.check(False, "it does not stop")
# A reader that has seen enough is no failure.
enough = subprocess.Popen([harness.tool(), "ls", "-R", "-l", image], stdout=subprocess.PIPE,
                          stderr=subprocess.PIPE)
enough.stdout.read(1)
enough.stdout.close()
checks.equal((enough.wait(timeout=60), enough.stderr.read()), (0, b""), "closed pipe")

# Every kind of walk sees the same records.
code, out, err = harness.text("find", image, "--name", "*.txt")
checks.equal(len(out.splitlines()), sum(name.endswith(".txt") for name in names), "find *.txt")
code, out, err = harness.text("dump", image, "--values", "none", "--order", "dfs", "--json")
leaf_rows = sum('"child"' not in line for line in out.splitlines()) - 2
code, by_key, err = harness.text("dump", image, "--values", "none", "--json")
checks.equal(leaf_rows, len(by_key.splitlines()) - 2, "records by node and by key")
checks.equal(leaf_rows, 2 * COUNT + 2, "a record and a thread for each name and the root")
one = names[COUNT // 2 + 1]
code, out, err = harness.text("ls", "-l", image, "/" + one)
checks.check(code == 0 and out.endswith(one.rsplit("/", 1)[-1] + "\n"), "one by its path: " + err)
code, out, err = harness.text("stats", "-t", "c", image)
checks.check("leaf order:" in out and code == 0, "stats: " + err)
checks.finish()
