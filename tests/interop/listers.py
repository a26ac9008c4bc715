"""What other programs list of a volume: the paths of files and folders, composed for comparison.

A lister that is not installed is None; the test says so and goes on with the others."""

import re
import shutil
import subprocess
import unicodedata


def run(*command):
    return subprocess.run(command, capture_output=True, check=False)


def composed(path):
    return unicodedata.normalize("NFC", path)


def fls(image):
    paths = set()
    for line in run("fls", "-r", "-p", image).stdout.decode("utf-8").splitlines():
        match = re.match(r"\S+ (\d+)(?:-\S+)?:\t(.*)", line)
        if match and int(match.group(1)) >= 16:
            paths.add(composed(match.group(2)))
    return paths


def seven_zip(image):
    paths = set()
    output = run("7z", "l", "-ba", "-slt", image).stdout.decode("utf-8")
    for line in output.splitlines():
        if line.startswith("Path = "):
            # The first component is the volume itself.
            _, slash, path = line[len("Path = "):].partition("/")
            if slash:
                paths.add(composed(path))
    return paths


def fshfsinfo(image):
    output = run("fshfsinfo", "-H", image).stdout.decode("utf-8")
    return {composed(line[1:]) for line in output.splitlines()
            if line.startswith("/") and line != "/"}




def installed(program):
    return shutil.which(program) is not None


class Lister:
    def __init__(self, program, paths, opens_without_attributes, reads_surrogates):
        self.program = program
        self.paths = paths
        self.opens_without_attributes = opens_without_attributes
        # False: it takes the two halves of a character beyond U+FFFF for something else, so paths
        # with such a character are left out of the comparison.
        self.reads_surrogates = reads_surrogates

    def comparable(self, paths):
        if self.reads_surrogates:
            return paths
        return {path for path in paths if all(ord(c) < 0x10000 for c in path)}


RECURSIVE = [Lister("fls", fls, True, True), Lister("7z", seven_zip, True, True),
             Lister("fshfsinfo", fshfsinfo, False, False)]
