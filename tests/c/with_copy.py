#!/usr/bin/env python3
"""Runs a program on a copy of a packed image, which it may write to.

usage: with_copy.py IMAGE.gz PROGRAM [ARGUMENT...]    the copy's path comes last"""

import gzip
import pathlib
import subprocess
import sys
import tempfile


def main(image, *command):
    with tempfile.TemporaryDirectory() as folder:
        copy = pathlib.Path(folder, "disk.img")
        copy.write_bytes(gzip.decompress(pathlib.Path(image).read_bytes()))
        return subprocess.run([*command, copy], check=False).returncode


if __name__ == "__main__":
    sys.exit(main(*sys.argv[1:]))
