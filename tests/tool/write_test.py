"""What reaches an image with --write, and what is refused: journals, locks, mounts, kills at any
moment, failures of the host, with the texts a person gets."""

import fcntl
import os
import re
import resource
import shutil
import signal
import struct
import subprocess
import time

import harness

checks = harness.Failures()
folder = harness.scratch()
HEADER = 1024
CLEAN = 0x100
INSERTS = "use catalog\nrepeat %d\ninsert 2:\"name $i\" file{id:$i}\nend\n"


def run(*arguments, code=0, **options):
    """Standard output and error of a run that has to end with `code`."""
    found, out, err = harness.text(*arguments, cwd=folder, **options)
    checks.equal(found, code, "treehfs %s (%s)" % (" ".join(map(str, arguments)), err.strip()))
    return out, err


def refused(line, *arguments, code=8):
    before = (folder / arguments[1]).read_bytes()
    out, err = run(*arguments, code=code)
    checks.equal((out, err), ("", line + "\n"), "treehfs " + " ".join(arguments))
    checks.check((folder / arguments[1]).read_bytes() == before, line + ": bytes have changed")


def script(name, text):
    (folder / name).write_text(text)
    return name


def volume(name, *options):
    run("format", name, "--size", "4M", "--force", *options)
    return name


def small_volume(name, *options):
    """Small nodes: a small journal then holds more than one change."""
    return volume(name, "--block-size", "512", "--node-size", "512", "--journal", "32K", *options)


def names_in(image):
    out, _ = run("dump", image, "--values", "none", "-q")
    return re.findall(r'2:"(name \d+)"', out)


def names_in_lines(lines):
    return [line for line in lines if '"name":"name ' in line and '"parent":2' in line and
            '"key":{"parent":2' in line]


def header(image):
    return (folder / image).read_bytes()[HEADER:HEADER + 512]


def is_clean(image):
    return struct.unpack_from(">I", header(image), 4)[0] & CLEAN != 0


def patch(image, at, piece):
    with open(folder / image, "r+b") as file:
        file.seek(at)
        file.write(piece)


def sound(image):
    _, err = run("check", image, "-q")
    checks.check("error" not in err, image + ": " + err)


def leave_transaction(image):
    """Commits in a shell and kills it: the journal holds what was committed."""
    shell = subprocess.Popen([harness.tool(), "shell", image, "--write"], cwd=folder, text=True,
                             stdin=subprocess.PIPE, stdout=subprocess.PIPE, bufsize=1)
    shell.stdin.write("insert 2:\"name 1\" file{id:77}\nflush\n")
    shell.stdin.flush()
    for line in shell.stdout:
        if "flush" in line:
            break
    shell.kill()
    shell.wait()
    shell.stdin.close()
    shell.stdout.close()


# --- what a volume is after each command ---------------------------------------------------------
some = script("some.tr", INSERTS % 50)
for journal in ([], ["--journal", "64K"]):
    image = volume("a.img", *journal)
    run("apply", image, some, "--write")
    checks.equal(len(names_in(image)), 50, "names kept by apply %s" % journal)
    run("create-tree", image, "--write")
    checks.check(re.search("^attributes +[1-9]", run("info", image)[0], re.M), "create-tree")
    checks.check(is_clean(image), "clean after writing, %s" % journal)
    sound(image)
    exported, _ = run("export", image)
    (folder / "records.jsonl").write_text(exported)
    copy = volume("b.img", "--empty", *journal)
    out, _ = run("import", copy, "records.jsonl", "--write")
    checks.check("digest equals the source" in out, "import: " + out)
    sound(copy)

# --- a journal smaller than the changes: the tool commits in time --------------------------------
many = script("many.tr", INSERTS % 700)
image = small_volume("c.img")
run("apply", image, many, "--write")
checks.equal(len(names_in(image)), 700, "names through a journal of 32K")
sound(image)
exported, _ = run("export", image)
(folder / "records.jsonl").write_text(exported)
copy = small_volume("d.img", "--empty")
out, _ = run("import", copy, "records.jsonl", "--write")
checks.check("digest equals the source" in out, "import through a small journal: " + out)
sound(copy)

# Changes that go on from a position, with nothing between them that names its place: the tree goes
# on standing where it stood, as it does where nothing is kept in between.
steps = script("steps.tr", "seek first\nnext 8\nrepeat 500\nupdate file{id:$i}\nnext\nend\n"
                           "pos\nrepeat 150\nfind 2:\"name $i\"\ndelete\nend\nseek last\n")
shutil.copy(folder / image, folder / "steps.img")
in_memory, _ = run("apply", "steps.img", steps, "--save", "saved.img")
checks.equal(in_memory.count(" 00000000 ok"), 1304, "steps in memory: " + in_memory)
written, _ = run("apply", "steps.img", steps, "--write")
checks.check(written == in_memory, "steps through a small journal: " + written)
checks.check(run("export", "steps.img") == run("export", "saved.img"), "records after steps")
sound("steps.img")

# A single change that no commit can make smaller: nothing of it is kept.
volume("whole.img", "--node-size", "32K", "--journal", "64K")
out, err = run("apply", "whole.img", some, "--write", code=8)
checks.check(re.search(r"^3 insert \w+ journal-full restored=yes$", out, re.M), "too large: " + out)
checks.check(re.search(r"^line 3: insert: the changes could not be kept: the changes take [\d,]+ "
                       r"bytes of the journal, which holds 64,512: commit more often$", err, re.M),
             "too large in between: " + err)
checks.equal(names_in("whole.img"), [], "names after changes too large")
one = script("one.tr", INSERTS % 1)
_, err = run("apply", "whole.img", one, "--write", code=8)
checks.check(re.search(r"^treehfs: whole\.img: the last changes could not be kept: the changes "
                       r"take [\d,]+ bytes of the journal, which holds 64,512: commit more often$",
                       err, re.M), "too large: " + err)
checks.equal(names_in("whole.img"), [], "names after a transaction too large")
checks.check(is_clean("whole.img"), "clean after a transaction too large")

# --- import tells up to where the records are kept -------------------------------------------
lines = exported.splitlines()
(folder / "broken.jsonl").write_text("\n".join(lines[:600] + ["{"] + lines[600:]) + "\n")
copy = volume("e.img", "--empty")
_, err = run("import", copy, "broken.jsonl", "--write", "--batch", "100", code=8)
checks.check(err.startswith("treehfs: broken.jsonl: line 601: ") and
             err.endswith(": kept up to line 501\n"), "import, damaged line: " + err)
checks.equal(len(names_in(copy)), len(names_in_lines(lines[:501])), "names up to line 501")
sound(copy)
copy = volume("e.img", "--empty")
_, err = run("import", copy, "broken.jsonl", "--write", code=8)
checks.check(err.endswith(": nothing was kept\n"), "import, damaged line, one batch: " + err)

# --- transactions that wait ----------------------------------------------------------------------
find = script("find.tr", "find 2:\"name 1\"\n")
waiting = volume("waiting.img", "--journal", "64K")
leave_transaction(waiting)
checks.check(not is_clean(waiting), "unclean after a kill")
pending = re.search(r"journal holds ([\d,]+) B", run("info", waiting)[0]).group(1)
_, err = run("apply", waiting, find)
checks.equal(err, "treehfs: waiting.img: the journal holds transactions (%s B): read as the volume "
             "stands without them\n" % pending, "apply in memory")
shutil.copy(folder / waiting, folder / "foreign.img")
shutil.copy(folder / waiting, folder / "damaged.img")
out, err = run("apply", waiting, find, "--write")
checks.check("found=yes" in out, "the transaction is carried out: " + out)
checks.equal(err, "treehfs: waiting.img: the journal held 1 transaction: carried out before "
             "anything else\n", "replay is told")
checks.check(is_clean(waiting), "clean after the replay")
sound(waiting)

patch("foreign.img", HEADER + 8, b"10.0")  # last written by somebody who keeps no journal
refused("treehfs: foreign.img: the journal holds transactions (%s B): writing would lose them; let "
        "the native system replay it, or --force" % pending,
        "apply", "foreign.img", find, "--write")
run("apply", "foreign.img", script("one.tr", "insert 2:\"name 2\" file{id:78}\n"), "--write",
    "--force")
checks.check("journal empty" in run("info", "foreign.img")[0], "journal thrown away with --force")
checks.check("name 2" in names_in("foreign.img"), "written with --force")
sound("foreign.img")

at = struct.unpack_from(">I", header("damaged.img"), 12)[0] * 4096 + 4096 + 512
patch("damaged.img", at + 4, b"\xff\xff")
_, err = run("apply", "damaged.img", find, "--write", code=8)
checks.check(re.fullmatch(r"treehfs: damaged\.img: the journal is damaged at [\d,]+: .+: run "
                          r"check, then --force\n", err), "damaged journal: " + err)

# --- volumes that say no -------------------------------------------------------------------------
plain = volume("plain.img")
unclean = struct.unpack_from(">I", header(plain), 4)[0] & ~CLEAN
patch(plain, HEADER + 4, struct.pack(">I", unclean))
refused("treehfs: plain.img: the volume was not unmounted cleanly: run check, then --force",
        "apply", plain, some, "--write")
run("apply", plain, some, "--write", "--force")
checks.check(not is_clean(plain), "a volume that was unclean stays so")
locked = volume("locked.img")
patch(locked, HEADER + 4, struct.pack(">I", CLEAN | 0x8000))
refused("treehfs: locked.img: the volume is locked against writing (attribute bit 15): it can only "
        "be read", "apply", locked, some, "--write", "--force")

# --- another process -----------------------------------------------------------------------------
busy = volume("busy.img", "--journal", "64K")
LOCKED = "treehfs: busy.img: another process has it open for writing"
with open(folder / busy, "r+b") as other:
    fcntl.flock(other, fcntl.LOCK_EX)
    for words in (["apply", busy, some, "--write"], ["create-tree", busy, "--write"],
                  ["import", busy, "records.jsonl", "--write"], ["shell", busy, "--write"],
                  ["format", busy, "--size", "1M", "--force"]):
        refused(LOCKED, *words)
    run("apply", busy, some)  # reading is no trouble
first = subprocess.Popen([harness.tool(), "shell", busy, "--write"], cwd=folder,
                         stdin=subprocess.PIPE, stdout=subprocess.PIPE)
first.stdin.write(b"state\n")
first.stdin.flush()
first.stdout.readline()
refused(LOCKED, "apply", busy, some, "--write")
first.stdin.close()
first.stdout.close()
first.wait()
run("apply", busy, some, "--write")

# --- killed at any moment ------------------------------------------------------------------------
more = script("more.tr", INSERTS % 4000)
killed = 0
for turn in range(12):
    image = small_volume("killed.img")
    worker = subprocess.Popen([harness.tool(), "apply", image, more, "--write", "-q"], cwd=folder,
                              stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
    for _ in range(20 + 50 * turn):  # lines of output before the end comes
        worker.stdout.readline()
    worker.kill()
    worker.stdout.close()
    killed += worker.wait() == -signal.SIGKILL
    out, err = run("apply", image, script("none.tr", "state\n"), "--write")
    sound(image)
    found = names_in(image)
    wanted = {"name %d" % i for i in range(1, len(found) + 1)}
    checks.check(set(found) == wanted, "turn %d: names are not the first %d" % (turn, len(found)))
    checks.check(is_clean(image), "turn %d: clean after replay" % turn)
checks.check(killed >= 6, "only %d runs were killed in the middle" % killed)

# --- the host refuses a write --------------------------------------------------------------------
def limit_file_size():
    signal.signal(signal.SIGXFSZ, signal.SIG_IGN)
    resource.setrlimit(resource.RLIMIT_FSIZE, (48 << 10, 48 << 10))


for journal in (["--journal", "64K"], []):
    full = volume("full.img", *journal)
    done = subprocess.run([harness.tool(), "apply", full, some, "--write", "-q"], cwd=folder,
                          preexec_fn=limit_file_size, restore_signals=False, capture_output=True,
                          text=True, timeout=120)
    checks.equal(done.returncode, 8, "a write that fails: exit code " + done.stderr)
    checks.check(re.fullmatch(r"treehfs: full\.img: the last changes could not be kept: write "
                              r"error at 0x[0-9a-f]+ \(.+\): File too large\n", done.stderr),
                 "a write that fails: " + done.stderr)
    if journal:
        run("apply", full, "none.tr", "--write")
        found = names_in(full)
        checks.equal(set(found), {"name %d" % i for i in range(1, len(found) + 1)},
                     "names after a failing write")
        sound(full)
    else:
        refused("treehfs: full.img: the volume was not unmounted cleanly: run check, then --force",
                "apply", full, some, "--write")

# --- interrupted ---------------------------------------------------------------------------------
image = small_volume("stopped.img")
worker = subprocess.Popen([harness.tool(), "apply", image, script("long.tr", INSERTS % 60000),
                           "--write", "-q"], cwd=folder, stdout=subprocess.PIPE,
                          stderr=subprocess.PIPE)
for _ in range(200):
    worker.stdout.readline()
worker.send_signal(signal.SIGINT)
worker.communicate()
checks.equal(worker.returncode, 32, "exit code when interrupted")
checks.check(is_clean(image), "clean when interrupted")
sound(image)


# --- devices of the host -------------------------------------------------------------------------
def host(*words):
    return subprocess.run(words, capture_output=True, text=True, check=False,
                          stdin=subprocess.DEVNULL)


def loop_device(path):
    if os.geteuid() != 0 or shutil.which("losetup") is None:
        return None
    made = host("losetup", "-f", "--show", str(path))
    return made.stdout.strip() if made.returncode == 0 else None


backing = volume("backing.img", "--journal", "64K")
(folder / "noise").write_bytes(os.urandom(1 << 16) * 64)
device = loop_device(folder / backing)
if device is None:
    print("no loop devices here: block devices and mounts are not tried")
else:
    point = folder / "a mount"
    try:
        refused("treehfs: backing.img: in use as %s: losetup -d %s first" % (device, device),
                "apply", backing, some, "--write")
        run("apply", device, some, "--write")
        checks.equal(len(names_in(device)), 50, "names written to a device")
        host("cp", str(folder / "noise"), device)
        _, err = run("format", device, code=8)
        checks.equal(err, "treehfs: %s is a device: --force replaces what it holds\n" % device,
                     "format without --force")
        _, err = run("format", device, "--force", "--size", "1M", code=16)
        checks.equal(err, "treehfs format: --size 1,048,576: the device %s has 4,194,304 bytes: "
                     "leave it out: the volume takes all of a device\n" % device, "format --size")
        run("format", device, "--force", "--journal", "64K", "--with-attributes")
        run("check", device, "--full", "--warnings-as-errors")
        run("apply", device, some, "--write")
        sound(device)
        point.mkdir()
        if shutil.which("mkfs.ext4") and host("mkfs.ext4", "-q", device).returncode == 0 and \
                host("mount", device, str(point)).returncode == 0:
            for words in (["apply", device, some, "--write"], ["format", device, "--force"]):
                _, err = run(*words, code=8)
                checks.equal(err, "treehfs: %s: mounted on %s: unmount it first\n"
                             % (device, point), "mounted device")
            refused("treehfs: backing.img: mounted on %s: unmount it first" % point,
                    "apply", backing, some, "--write")
        else:
            print("nothing can be mounted here: mounted devices are not tried")
    finally:
        host("umount", str(point))
        for _ in range(20):
            if host("losetup", "-d", device).returncode == 0:
                break
            time.sleep(0.1)

# --- numbers of files that the caller has closed -------------------------------------------------
# The image would get one of them, and what is meant for the terminal.
volume("closed.img")
script("look.tr", "find 2:a\nstate\n")
before = (folder / "closed.img").read_bytes()
for closed in ((0,), (1,), (2,), (0, 1, 2)):
    def close_them(numbers=closed):
        for number in numbers:
            os.close(number)
    done = subprocess.run([harness.tool(), "apply", "closed.img", "look.tr", "--write"], cwd=folder,
                          capture_output=True, preexec_fn=close_them)
    checks.equal(done.returncode, 8 if 1 in closed else 0, "closed: %s" % (closed,))
    checks.check((folder / "closed.img").read_bytes() == before,
                 "closed: %s: the image has changed" % (closed,))

# --- files that are the image, and copies of it --------------------------------------------------
refused("treehfs: same.img: is the image itself: choose another name",
        "apply", volume("same.img"), script("one.tr", INSERTS % 1), "--write", "--undo",
        "same.img", "--force")
os.link(folder / "same.img", folder / "other-name")
refused("treehfs: other-name: is the image itself: choose another name",
        "apply", "same.img", "one.tr", "--write", "--undo", "other-name", "--force")
refused("treehfs: ./kept: --undo writes there: choose another name",
        "apply", "same.img", "one.tr", "--write", "--undo", "kept", "--save", "./kept", "--force")
checks.check(not (folder / "kept").exists(), "nothing was written before the names were looked at")
small_volume("copied.img")
run("apply", "copied.img", "one.tr", "--write", "--save", "copy.img", "-q")
checks.check(is_clean("copied.img") and
             (folder / "copy.img").read_bytes() == (folder / "copied.img").read_bytes(),
             "a copy of a volume with a journal is closed as the volume is")

# --- a volume that cannot be made replaces nothing -----------------------------------------------
refused("treehfs: closed.img: block size 3,000 is not a power of two from 512 to 65,536",
        "format", "closed.img", "--size", "1M", "--force", "--block-size", "3000", code=16)

checks.finish()
