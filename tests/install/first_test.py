#!/usr/bin/env python3
"""The first example: what it prints, twice, on a copy of a small volume.

usage: first_test.py PROGRAM IMAGE.gz"""

import gzip
import pathlib
import subprocess
import sys
import tempfile


def run(*arguments):
    done = subprocess.run(arguments, capture_output=True, text=True, check=False)
    return done.returncode, done.stdout, done.stderr


def main(program, image):
    with tempfile.TemporaryDirectory() as folder:
        copy = pathlib.Path(folder, "disk.img")
        copy.write_bytes(gzip.decompress(pathlib.Path(image).read_bytes()))
        listing = '2:"letters"\n2:"readme"\n'
        assert run(program, copy) == (0, listing + "note: success\n", ""), run(program, copy)
        again = run(program, copy)
        assert again == (1, listing + "note: the key is there already\n", ""), again
        absent = run(program, copy.with_name("absent.img"))
        assert absent == (1, "", "cannot open: no such file\n"), absent


if __name__ == "__main__":
    main(*sys.argv[1:])
