"""The shell in front of a person: keys, completion, Ctrl-C, the end of the input."""

import os
import pty
import re
import select
import signal
import subprocess
import time

import harness

checks = harness.Failures()
folder = harness.scratch()
checks.equal(harness.run("format", "new.img", "--size", "8M", cwd=folder)[0], 0, "a volume")


class Terminal:
    """A shell on a terminal of its own."""

    def __init__(self, *arguments):
        self.main, other = pty.openpty()
        environment = {**os.environ, "TERM": "xterm"}
        environment.pop("NO_COLOR", None)
        self.process = subprocess.Popen(
            [harness.tool(), "shell", *arguments], cwd=folder, stdin=other, stdout=other,
            stderr=other, env=environment, start_new_session=True)
        os.close(other)

    def until(self, wanted, seconds=60):
        """What is shown up to a match of `wanted`, or to the end."""
        shown = ""
        end = time.time() + seconds
        while not re.search(wanted, shown) and time.time() < end:
            if not select.select([self.main], [], [], 0.5)[0]:
                continue
            try:
                piece = os.read(self.main, 65536)
            except OSError:  # the other end is closed
                break
            if not piece:
                break
            shown += piece.decode("utf-8", "replace").replace("\r\n", "\n")
        checks.check(re.search(wanted, shown), "%r is not in %r" % (wanted, shown[-400:]))
        return shown

    def type(self, keys, wanted):
        os.write(self.main, keys.encode())
        return self.until(wanted)

    def sleeps(self):
        with open("/proc/%d/stat" % self.process.pid, encoding="utf-8", errors="replace") as file:
            return file.read().rpartition(")")[2].split()[0] == "S"

    def wait_for_keys(self):
        """Until the shell waits for a key: a signal in the instant before counts with the next, and
        the key that ends the input is not one yet while the terminal collects lines."""
        end = time.time() + 60
        samples = 0
        while samples < 3 and time.time() < end:
            samples = samples + 1 if self.sleeps() else 0
            time.sleep(0.05)

    def interrupt(self, wanted):
        self.process.send_signal(signal.SIGINT)
        return self.until(wanted)

    def interrupt_typing(self, wanted):
        self.wait_for_keys()
        return self.interrupt(wanted)

    def ends(self, expected, what):
        checks.equal(self.process.wait(60), expected, what)
        os.close(self.main)


PROMPT = r"catalog\(memory\)> $"

shell = Terminal("new.img")
shell.until(PROMPT)
shell.type("insert 2:kept file{id:50}\n", PROMPT)
shell.type("find 2:ke\t", "pt $")
shown = shell.type("\n", PROMPT)
checks.check("2 find   00000000 ok found=yes at=1/2" in shown, "completed by Tab: %r" % shown)

# --- Ctrl-C at the prompt: the line is given up, the shell stays --------------------------------
shell.type("delete 2:kept", "delete 2:kept$")
shell.interrupt_typing(PROMPT)
shown = shell.type("find 2:kept\n", PROMPT)
checks.check("3 find   00000000 ok found=yes" in shown, "the line was given up: %r" % shown)
shell.type("repeat 2\n", r"\.\.\.> $")
shell.type("delete 2:kept\n", r"\.\.\.> $")
shell.interrupt_typing(PROMPT)
shown = shell.type("find 2:kept\n", PROMPT)
checks.check("found=yes" in shown, "so is a repetition: %r" % shown)

# --- Ctrl-C while something runs: that ends, and what was changed is there ----------------------
for turn in (1, 2):
    shell.type("repeat 1000000000\nfind 2:kept\nend\n", "ok found=yes")
    shown = shell.interrupt("treehfs: interrupted\n" + PROMPT)
    shown = shell.type("find 2:kept\n", r"\d+ find +00000000 ok found=yes at=1/2\n" + PROMPT)
shell.type("repeat 2\necho $i\nend\n", "# 1\n# 2\n" + PROMPT)

# --- the end of the input ------------------------------------------------------------------------
shell.wait_for_keys()
shell.type("\x04", r"\n.*nothing was written: 1 block changed in memory")
shell.ends(0, "the end of the input")

# --- a coloured prompt: the cursor stands behind what is seen of it -------------------------------
shell = Terminal("new.img", "--write")
shown = shell.until(r"catalog\(WRITE\)>.* $")
checks.equal(shown, "\x1b[31mcatalog(WRITE)>\x1b[0m ", "the prompt is red, and only it")
shown = shell.type("hel\t", "p")
columns = [int(number) for number in re.findall(r"\x1b\[(\d+)G", shown)]
checks.check(columns in ([], [len("catalog(WRITE)> hel") + 1]), "columns %s" % columns)
shell.wait_for_keys()
shell.process.send_signal(signal.SIGTERM)
shell.ends(32, "a signal that asks for the end")

# --- the history ---------------------------------------------------------------------------------
shell = Terminal("new.img", "--history", "typed")
shell.until(PROMPT)
shell.type("state\n", PROMPT)
shell.type("exit\n", "exit\n")
shell.ends(0, "a shell that keeps its history")
checks.check("state\nexit" in (folder / "typed").read_text("utf-8"), "what was typed is kept")
shell = Terminal("new.img", "--history", "typed")
shell.until(PROMPT)
shell.type("\x1b[A\x1b[A", "state$")
shell.type("\n", PROMPT)
shell.type("exit\n", "exit\n")
shell.ends(0, "the next shell knows it")
image = (folder / "new.img").read_bytes()
shell = Terminal("new.img", "--history", "new.img")
shell.until("treehfs: new.img: holds no history and would be replaced: "
            "choose another name for --history\n")
shell.ends(8, "a file that holds something else")
checks.check((folder / "new.img").read_bytes() == image, "it is as it was")
shell = Terminal("new.img", "--history", "nowhere/typed")
shell.until(PROMPT)
shell.type("exit\n", "nowhere/typed: the history cannot be kept there\n")
shell.ends(0, "a history that cannot be kept")

checks.finish()
