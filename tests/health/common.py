"""What the health checks share: where the sources are, reading them without comments and strings,
and how findings are printed. A check is a function that takes a root folder and returns findings,
so that self_test.py can run it over small trees made to fail."""

import pathlib
import re
import shutil
import subprocess
import sys

SKIPPED_FOLDERS = {"build", ".git", ".cache", "__pycache__", "corpus"}


def project_root():
    return pathlib.Path(__file__).resolve().parents[2]


def files(root, folders, patterns):
    """All files under root/folder matching a pattern, sorted; a folder may be absent."""
    found = []
    for folder in folders:
        for pattern in patterns:
            found.extend((root / folder).glob("**/" + pattern))
    return sorted({f for f in found if not SKIPPED_FOLDERS & set(f.relative_to(root).parts)})


def listed_by_git(root):
    """What git tracks or would track; None where the sources are no repository of it, or it is not
    installed."""
    if not (root / ".git").exists() or shutil.which("git") is None:
        return None
    listed = subprocess.run(["git", "-C", str(root), "ls-files", "-co", "--exclude-standard"],
                            capture_output=True, text=True, check=False)
    return listed.stdout.splitlines() if listed.returncode == 0 else None


def text_files(root):
    """Every file that belongs to the project: what git knows of, else all there is."""
    known = listed_by_git(root)
    if known is not None:
        names = [root / name for name in known]
    else:
        names = [f for f in root.glob("**/*")
                 if not SKIPPED_FOLDERS & set(f.relative_to(root).parts)]
    texts = []
    for name in sorted(set(names)):
        if name.is_file() and b"\0" not in name.read_bytes()[:4096]:
            texts.append(name)
    return texts


_TOKEN = re.compile(
    r'//[^\n]*|/\*.*?\*/|R"(\w*)\(.*?\)\1"|"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])+\'', re.S)


def blank(text, keep_strings=False):
    """The text with comments (and strings) turned into blanks; lines and columns stay."""
    def replace(match):
        token = match.group(0)
        if keep_strings and not token.startswith("/"):
            return token
        if token[0] in "\"'" and len(token) >= 2:
            return token[0] + " " * (len(token) - 2) + token[-1]
        return re.sub(r"[^\n]", " ", token)
    # A digit separator (1'000) is no character literal.
    text = re.sub(r"(?<=[0-9a-fA-F])'(?=[0-9a-fA-F])", "_", text)
    return _TOKEN.sub(replace, text)


def line_of(text, position):
    return text.count("\n", 0, position) + 1


def finish(name, findings):
    """Prints the findings, one per line, and returns the exit status."""
    for finding in findings:
        print(finding)
    print(f"{name}: {len(findings)} findings" if findings else f"{name}: ok")
    return 1 if findings else 0


def run(name, check, arguments=()):
    sys.exit(finish(name, check(project_root(), *arguments)))
