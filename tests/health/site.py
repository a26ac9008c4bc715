#!/usr/bin/env python3
"""The site: Doxygen builds it without a word, so every public declaration is documented, and every
link in it leads somewhere. Without Doxygen there is nothing to judge: exit code 77."""

import pathlib
import shutil
import subprocess
import sys
import tempfile

import common
import links


def check(root):
    with tempfile.TemporaryDirectory() as folder:
        settings = (root / "docs/Doxyfile").read_text(encoding="utf-8")
        built = subprocess.run(["doxygen", "-"], input=f"{settings}\nOUTPUT_DIRECTORY = {folder}\n",
                               cwd=root, capture_output=True, text=True, check=False)
        findings = (built.stdout + built.stderr).splitlines()
        if built.returncode != 0 and not findings:
            findings = [f"doxygen ended with {built.returncode}"]
        return findings or links.check_site(pathlib.Path(folder) / "html")


if __name__ == "__main__":
    if shutil.which("doxygen") is None:
        print("site: skipped, doxygen is not installed (./dev docs installs it)")
        sys.exit(77)
    common.run("site", check)
