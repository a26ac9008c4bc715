"""A walk through some rooms of the museum with the program as it is built: one exhibit in five, its
exit codes and the refusal of --write, told by a process of its own. The whole walk is museum_test,
which calls the commands without a process for each."""

import hashlib
import os
import pathlib
import subprocess
import sys
import tempfile

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "tool"))
import harness  # noqa: E402

STEP = 5
COMMANDS = [["info", "IMAGE"], ["check", "--full", "IMAGE"], ["ls", "-R", "IMAGE"]]

checks = harness.Failures()


def labels(path):
    """What docs/damage.md says of each exhibit: {name: {"exits": ..., "write": ...}}."""
    found = {}
    label = None
    for line in pathlib.Path(path).read_text("utf-8").splitlines():
        if line.startswith("### "):
            label = found.setdefault(line[4:], {})
        elif line.startswith("- ") and label is not None:
            what, said = line[2:].split(": ", 1)
            label[what] = said.strip("`")
    return found


def digest(path):
    return hashlib.sha256(path.read_bytes()).hexdigest()


def run(folder, *arguments):
    done = subprocess.run([harness.tool(), *arguments], cwd=folder, capture_output=True, timeout=60)
    return done.returncode, done.stderr.decode("utf-8")


def walk(folder, name, exits, refusal):
    image = folder / (name + ".img")
    before = digest(image)
    for command, expected in zip(COMMANDS, exits.split()):
        code, err = run(folder, *[image.name if word == "IMAGE" else word for word in command])
        checks.equal(code, int(expected), "%s of %s: %s" % (command[0], name, err))
    code, err = run(folder, "apply", image.name, "look.tr", "--write")
    if refusal:
        checks.equal((code, err.split("\n")[0]), (8, refusal.replace("IMAGE", image.name)),
                     "apply --write to " + name)
        checks.equal(digest(image), before, name + " after looking at it")
    else:
        checks.check(code in (0, 1), "apply --write to %s: %d %s" % (name, code, err))


with tempfile.TemporaryDirectory(prefix="treehfs-museum-") as made:
    folder = pathlib.Path(made)
    listed = subprocess.run([os.environ["MUSEUM_GUIDE"], "images", made], check=True,
                            capture_output=True, timeout=300)
    (folder / "look.tr").write_text("state\n")
    names = listed.stdout.decode("utf-8").split()
    checks.check(len(names) >= 150, "exhibits: %d" % len(names))
    said = labels(os.environ["MUSEUM_LABELS"])
    for name in names[::STEP]:
        walk(folder, name, said[name]["exits"], said[name].get("write"))
checks.finish()
