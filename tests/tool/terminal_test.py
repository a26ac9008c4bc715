"""What a terminal and a program at the other end get: colours and progress, and none of either in
files and pipes."""

import os
import pty
import re
import subprocess

import harness
import volume_bytes as vb

checks = harness.Failures()
folder = harness.scratch()
fallen = vb.plain_leaves()
fallen[0][2], fallen[0][4] = fallen[0][4], fallen[0][2]
(folder / "order.img").write_bytes(vb.volume(catalog=vb.leaf_tree(fallen)))
(folder / "good.img").write_bytes(vb.volume())


def on_terminal(*arguments):
    """Everything the program writes when it runs on a terminal."""
    main, other = pty.openpty()
    process = subprocess.Popen([harness.tool(), *arguments], cwd=folder, stdin=other, stdout=other,
                               stderr=other)
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
checks.finish()
