"""What a terminal and a program at the other end get: colours and progress, and none of either in
files and pipes."""

import fcntl
import os
import pty
import re
import struct
import subprocess
import termios
import time

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()
fallen = vb.plain_leaves()
fallen[0][2], fallen[0][4] = fallen[0][4], fallen[0][2]
(folder / "order.img").write_bytes(vb.volume(catalog=vb.leaf_tree(fallen)))
(folder / "good.img").write_bytes(vb.volume())


def on_terminal(*arguments, **environment):
    """Everything the program writes when it runs on a terminal."""
    main, other = pty.openpty()
    usual = {name: value for name, value in os.environ.items() if name != "NO_COLOR"}
    process = subprocess.Popen([harness.tool(), *arguments], cwd=folder, stdin=other, stdout=other,
                               stderr=other, env={**usual, "TERM": "xterm", **environment})
    os.close(other)
    shown = b""
    while True:
        try:
            piece = os.read(main, 65536)
        except OSError:  # the other end is closed
            break
        if not piece:
            break
        shown += piece
    os.close(main)
    return process.wait(), shown.replace(b"\r\n", b"\n")


# --- colours -----------------------------------------------------------------------------------
plain = harness.run("check", "order.img", cwd=folder)
checks.check(plain[0] == 4 and b"\x1b" not in plain[1] + plain[2], "no colours in a pipe")
code, shown = on_terminal("check", "order.img")
checks.check(code == 4 and b"\x1b[31m" in shown, "errors are red on a terminal: %r" % shown[:300])
without = re.sub(rb"\x1b\[[0-9;]*[mK]", b"", shown)
steady = re.compile(rb"\d+\.\d\d s")
checks.equal(steady.sub(b"", without), steady.sub(b"", plain[1]), "but for colours it is the same")
checks.check(b"\x1b" not in on_terminal("check", "--color", "never", "order.img")[1],
             "--color never on a terminal")
for name, value in (("NO_COLOR", "1"), ("TERM", "dumb")):
    checks.check(b"\x1b" not in on_terminal("check", "order.img", **{name: value})[1],
                 "no colours with %s=%s" % (name, value))
    checks.check(b"\x1b[31m" in on_terminal("check", "--color", "always", "order.img",
                                            **{name: value})[1],
                 "--color always with %s=%s" % (name, value))
checks.check(b"\x1b[31m" in on_terminal("check", "order.img", NO_COLOR="")[1],
             "an empty NO_COLOR is none")
checks.check(b"\x1b[31m" in harness.run("check", "--color", "always", "order.img", cwd=folder)[1],
             "--color always in a pipe")
code, shown = on_terminal("check", "order.img", "--json")
checks.check(b"\x1b" not in shown, "no colours in JSON")

# --- progress ----------------------------------------------------------------------------------
code, shown = on_terminal("ls", "good.img")
checks.equal((code, shown), (0, b"alpha\nbeta\ngamma\nlink\n"), "a short run leaves no progress")
reader, writer = os.pipe()
done = subprocess.run([harness.tool(), "dump", "good.img", "--progress-fd", str(writer)],
                      cwd=folder, pass_fds=[writer], capture_output=True)
os.close(writer)
lines = os.read(reader, 65536).decode().splitlines()
os.close(reader)
checks.equal((done.returncode, done.stderr), (0, b""), "dump with --progress-fd")
checks.check(len(lines) >= 1 and all(re.fullmatch(r"dump\.catalog \d+ 12", line)
                                     for line in lines), "lines for a program: %s" % lines)
checks.equal(lines[-1:], ["dump.catalog 12 12"], "the last line says that all is done")

# The program stops at a full pipe for over a second; then it has been long enough at work to draw.
code, out, err = harness.text(
    "apply", "--new", "4M", "-q", "--save", "many.img", "-", cwd=folder,
    stdin=b"repeat 3000\ninsert 2:number-$i file{id:100}\nend\n")
checks.equal((code, err), (0, ""), "a volume of many names")


def drawn(*arguments, columns=100):
    """What is drawn on a terminal of so many columns while standard output is a pipe."""
    main, other = pty.openpty()
    fcntl.ioctl(other, termios.TIOCSWINSZ, struct.pack("HHHH", 25, columns, 0, 0))
    process = subprocess.Popen([harness.tool(), *arguments, "many.img"], cwd=folder,
                               stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=other)
    os.close(other)
    out = process.stdout.read(1)
    time.sleep(1.2)
    out += process.stdout.read()
    shown = b""
    while True:
        try:
            piece = os.read(main, 65536)
        except OSError:
            break
        if not piece:
            break
        shown += piece
    os.close(main)
    checks.equal(process.wait(), 0, " ".join(arguments))
    checks.check(out.count(b"number-") >= 3000, "all is printed beside the drawing")
    return shown.decode()


shown = drawn("dump")
match = re.fullmatch(r"(\rdump catalog +\d+% \[#* *\]  [\d,]+/3,002 records  \d:\d\d left\x1b\[K)+"
                     r"\r\x1b\[K", shown)
checks.check(match, "a bar is drawn and erased: %r" % shown)
for part, bar, done in re.findall(r" +(\d+)% \[(#* *)\]  ([\d,]+)/", shown):
    share = int(done.replace(",", "")) / 3002
    checks.equal((int(part), len(bar), bar.count("#")),
                 (round(share * 100), 24, int(share * 24)), "the bar shows its part")
shown = drawn("dump", columns=30)
checks.check(re.match(r"\rdump catalog +\d+% \[[# ]+\x1b\[K", shown) and
             all(len(line.replace("\x1b[K", "")) <= 29 for line in shown.split("\r")),
             "the line keeps to a narrow terminal: %r" % shown)
checks.equal(drawn("dump", "--progress", "never"), "", "--progress never")
checks.equal(drawn("dump", "-q"), "", "-q draws nothing")
shown = drawn("ls", "-l")
checks.check(re.match(r"\rls catalog  [\d,]+ records\x1b\[K", shown),
             "what has no total shows what was done: %r" % shown)
checks.finish()
