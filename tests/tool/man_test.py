"""The manual pages against the program's own help: a page for each command, and in it the same
summary, arguments, options and examples; in treehfs-script(5) every operation of the language."""

import re
import shutil
import subprocess

import harness

checks = harness.Failures()
PAGES = harness.ROOT / "docs" / "man"


def page(name):
    path = PAGES / (name + ".scd")
    checks.check(path.exists(), "there is no page " + path.name)
    return path.read_text("utf-8") if path.exists() else ""


def section(text, title):
    """Lines of a section of a page."""
    parts = re.split(r"^# (.*)$", text, flags=re.M)
    return dict(zip(parts[1::2], parts[2::2])).get(title, "")


def plain(text):
    """Text without scdoc's marks."""
    return re.sub(r"\\(.)", r"\1", re.sub(r"(?<!\\)[*_]", "", text))


def help_section(shown, title):
    match = re.search(r"^%s:\n((?:  .*\n)*)" % re.escape(title), shown, re.M)
    return match.group(1).splitlines() if match else []


def options_of_help(lines):
    """(names, meta) of each option; what goes on below its names is deeper than any of them."""
    return [re.match(r"^  ((?:-\w, |    )--[\w-]+(?: \S+)?)(?:  +|$)", line).group(1).strip()
            for line in lines if not line.startswith(" " * 30)]


def options_of_page(text):
    return [plain(line) for line in re.findall(r"^(\*-.*)\n\t", text, re.M)]


code, overview, err = harness.text("help")
commands = dict(re.findall(r"^  (\S+) +(.*)$",
                           overview.split("Commands:\n")[1].split("\n\n")[0], re.M))
checks.check(len(commands) > 20, "commands of the overview: %d" % len(commands))
main = page("treehfs.1")
general = options_of_page(section(main, "GENERAL OPTIONS"))
listed = dict(re.findall(r"^(\S+)\n\t(.*?)\. See treehfs", plain(section(main, "COMMANDS")), re.M))
checks.equal({name: text[0].lower() for name, text in listed.items()},
             {name: text[0].lower() for name, text in commands.items()}, "commands of treehfs(1)")
for name, summary in commands.items():
    code, shown, err = harness.text("help", name)
    text = page("treehfs-%s.1" % name)
    what = "treehfs-%s(1): " % name
    checks.equal(plain(section(text, "NAME")).strip(), "treehfs-%s - %s" % (name, summary),
                 what + "name")
    usage = shown.splitlines()[0].split("[options]")[1].strip()
    synopsis = [line.replace("treehfs %s [options]" % name, "").strip(" +")
                for line in plain(section(text, "SYNOPSIS")).strip().splitlines()]
    checks.equal(", ".join(synopsis), usage, what + "synopsis")
    arguments = [re.match(r"^  (.*?)  +", line).group(1)
                 for line in help_section(shown, "Arguments") if not line.startswith(" " * 30)]
    checks.equal([plain(line) for line in
                  re.findall(r"^(_.*)\n\t", section(text, "ARGUMENTS"), re.M)], arguments,
                 what + "arguments")
    checks.equal(options_of_page(section(text, "OPTIONS")),
                 options_of_help(help_section(shown, "Options")), what + "options")
    checks.equal(general, options_of_help(help_section(shown, "General options")),
                 what + "general options")
    examples = [line.strip() for line in shown.rsplit("\nExamples:\n", 1)[1].splitlines()]
    checks.equal(section(text, "EXAMPLES").strip().strip("`").strip().splitlines(), examples,
                 what + "examples")
    checks.check(len(section(text, "DESCRIPTION").strip()) > 40, what + "description")

written = {path.name for path in PAGES.glob("*.scd")}
expected = {"treehfs-%s.1.scd" % name for name in commands}
checks.equal(sorted(written), sorted(expected | {"treehfs.1.scd", "treehfs-script.5.scd"}),
             "pages and commands")

# --- the script language -----------------------------------------------------------------------
code, shown, err = harness.text("shell", "--new", "1M", stdin=b"help\nexit\n")
usages = [line[:36].strip() for line in shown.splitlines() if line[:1].islower()]
script = plain(section(page("treehfs-script.5"), "OPERATIONS"))
described = {word.split()[0] for line in re.findall(r"^(\S.*)\n\t", script, re.M)
             for word in line.split(", ")}
# The last lines name the program's own commands.
operations = {usage.split()[0] for usage in usages[:-3]} - {"end"}
checks.check(len(operations) > 25, "operations of the shell: %s" % sorted(operations))
checks.equal(sorted(operations - described), [], "operations treehfs-script(5) lacks")
checks.equal(sorted(described - operations - {"end"}), [], "operations nobody knows")

# --- the pages are well formed -----------------------------------------------------------------
if shutil.which("scdoc") is None:
    print("SKIPPED: the pages are not formatted: no scdoc")
else:
    for path in sorted(PAGES.glob("*.scd")):
        done = subprocess.run(["scdoc"], input=path.read_bytes(), capture_output=True)
        checks.check(done.returncode == 0 and done.stdout.startswith(b".\\\""),
                     "%s: %s" % (path.name, done.stderr.decode()))
        checks.check(path.name.startswith(path.read_text("utf-8").split("(")[0]),
                     path.name + " is headed by another name")
checks.finish()
