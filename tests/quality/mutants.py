#!/usr/bin/env python3
"""Mutation testing: conditional jumps of a library are reversed or removed in its machine code, one
at a time, and the tests that load the library are to notice.

The library has to be a shared one with line numbers, built without inlining over its files. Each
mutant is a copy with one changed jump; tests find it through LD_LIBRARY_PATH, so nothing is built
again. A mutant is killed when a test fails, crashes, or uses much more time or memory than it
should. Jumps to a trap are left out: reversing those kills by itself.

Mutants that behave as the original does may stand in a list (see line_list.py); `what` is
"reversed", "removed" or "any", and may go on with "in FUNCTION": of the copies that the compiler
made of a line, those put into such a function. FUNCTION is a pattern of the shell, met by a name
without its namespaces, or by all of them as they are printed, "INNER < OUTER". Such mutants are
tried all the same; those that survive are left out of the score. The run fails with an entry that
no jump of the library is like.

What became of each mutant is noted, so that a run broken off can go on: a mutant that was killed is
tried again with its killer first, one that survived only after the tests have changed.

usage: mutants.py LIBRARY SOURCES [options] TEST...
       TEST: a program with its arguments, as one word; the quickest first"""

import argparse
import collections
import concurrent.futures
import fnmatch
import hashlib
import os
import pathlib
import random
import re
import resource
import shlex
import shutil
import subprocess
import sys
import tempfile
import time

from line_list import Lines

MEMORY = 4 << 30
JUMP = re.compile(r"^\s*([0-9a-f]+):\t([0-9a-f ]+?)\s*\tj(?!mp)([a-z]+)\s+([0-9a-f]+)\b")
ANY = re.compile(r"^\s*([0-9a-f]+):\t([0-9a-f ]+?)\s*(?:\t(\S+).*)?$")

FAILED = re.compile(r"\[  FAILED  \] ([^\s,]+)")

# `functions`: that of the line, then those it was put into.
Mutant = collections.namedtuple("Mutant", "address what file line functions old new")


def output(*words):
    return subprocess.run(words, check=True, capture_output=True, text=True).stdout


def jumps(library):
    """Yields address and bytes of each conditional jump that does not guard a trap."""
    instructions = []
    for line in output("objdump", "-dw", "-j", ".text", library).splitlines():
        match = ANY.match(line)
        if match:
            instructions.append((int(match[1], 16), bytes.fromhex(match[2]), match[3], line))
    traps = {address for address, _, name, _ in instructions if name == "ud2"}
    for (address, code, _, line), (following, _, _, _) in zip(instructions, instructions[1:]):
        match = JUMP.match(line)
        if match and (0x70 <= code[0] <= 0x7F or (code[0] == 0x0F and code[1] & 0xF0 == 0x80)):
            if following not in traps and int(match[4], 16) not in traps:
                yield address, code


def bare(function):
    """A function's name without namespaces and classes."""
    return re.sub(r"(\(anonymous namespace\)|\w+)::", "", function)


def places(library, addresses):
    """File and line of each address, and the functions it is in, the innermost first."""
    text = subprocess.run(["addr2line", "-Cfie", library, "-a", *map(hex, addresses)], check=True,
                          capture_output=True, text=True).stdout.splitlines()
    starts = [at for at, line in enumerate(text) if re.fullmatch("0x[0-9a-f]+", line)]
    for start, end in zip(starts, [*starts[1:], len(text)]):
        file, _, line = text[start + 2].partition(":")
        number = re.match(r"\d+", line)
        functions = tuple(bare(name) for name in text[start + 1:end:2])
        yield file, int(number[0]) if number else 0, functions


def reversed_jump(code):
    if code[0] == 0x0F:
        return bytes([0x0F, code[1] ^ 1]) + code[2:]
    return bytes([code[0] ^ 1]) + code[1:]


def population(library, sources):
    found = list(jumps(library))
    top = os.path.realpath(sources) + "/"
    mutants = []
    for (address, code), (file, line, functions) in zip(
            found, places(library, [address for address, _ in found])):
        if not os.path.realpath(file).startswith(top):
            continue
        file = os.path.realpath(file)
        mutants.append(Mutant(address, "reversed", file, line, functions, code,
                              reversed_jump(code)))
        mutants.append(Mutant(address, "removed", file, line, functions, code,
                              b"\x90" * len(code)))
    return mutants


def text_offset(library):
    """What to add to an address of .text to have its place in the file."""
    for line in output("readelf", "-SW", library).splitlines():
        match = re.search(r"\.text\s+PROGBITS\s+([0-9a-f]+)\s+([0-9a-f]+)", line)
        if match:
            return int(match[2], 16) - int(match[1], 16)
    raise SystemExit(f"mutants: no .text in {library}")


class Tests:
    def __init__(self, library, commands, spare):
        self.binary = pathlib.Path(library).resolve()
        self.offset = text_offset(library)
        self.spare = spare
        self.commands = [shlex.split(command) for command in commands]
        self.seconds = [None] * len(commands)

    def digest(self):
        """Of the programs and how they are called."""
        whole = hashlib.sha256(repr(sorted(
            (name, value) for name, value in os.environ.items() if name.startswith("TREEHFS_")
        )).encode())
        for command in self.commands:
            whole.update(repr(command).encode() + pathlib.Path(command[0]).read_bytes())
        return whole.hexdigest()[:16]

    def run(self, index, folder, test=None):
        """None when this program, or one test of it, passes with the library in this folder; else
        how it failed."""
        limit = self.seconds[index]

        def limits():
            resource.setrlimit(resource.RLIMIT_CORE, (0, 0))
            resource.setrlimit(resource.RLIMIT_AS, (MEMORY, MEMORY))
            if limit is not None:
                resource.setrlimit(resource.RLIMIT_CPU, (limit, limit))

        environment = dict(os.environ, LD_LIBRARY_PATH=str(folder), MALLOC_PERTURB_="165")
        environment.pop("TREEHFS_SITES_DIR", None)
        words = self.commands[index] + ([f"--gtest_filter={test}"] if test else [])
        done = subprocess.run(words, env=environment, preexec_fn=limits, cwd=folder,
                              stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                              stderr=subprocess.STDOUT, text=True, errors="replace", check=False)
        if done.returncode == 0:
            return None
        failed = FAILED.search(done.stdout)
        return failed[1] if failed else f"status {done.returncode}"

    def prepare(self, folder, mutant):
        code = bytearray(self.binary.read_bytes())
        if mutant is not None:
            at = mutant.address + self.offset
            assert code[at:at + len(mutant.old)] == mutant.old
            code[at:at + len(mutant.old)] = mutant.new
        copy = pathlib.Path(folder, self.binary.name)
        copy.write_bytes(code)
        copy.chmod(0o755)

    def killer(self, mutant, notes):
        """How the tests notice this mutant, or None."""
        if notes.has_survived(mutant):
            return None
        folder = tempfile.mkdtemp(prefix="mutant")
        try:
            self.prepare(folder, mutant)
            for index, test in [*notes.killers(mutant),
                                *((index, None) for index in range(len(self.commands)))]:
                failed = self.run(index, folder, test)
                if failed is not None:
                    notes.add(mutant, index, failed)
                    return failed
            notes.add(mutant, None, None)
            return None
        finally:
            shutil.rmtree(folder)

    def measure(self):
        """Runs all tests with an unchanged copy, which has to pass, and sets the limits of time."""
        with tempfile.TemporaryDirectory(prefix="mutant") as folder:
            self.prepare(folder, None)
            for index, command in enumerate(self.commands):
                before = resource.getrusage(resource.RUSAGE_CHILDREN)
                failed = self.run(index, folder)
                after = resource.getrusage(resource.RUSAGE_CHILDREN)
                if failed is not None:
                    raise SystemExit(f"mutants: {command[0]} fails without a mutant: {failed}")
                used = (after.ru_utime - before.ru_utime) + (after.ru_stime - before.ru_stime)
                self.seconds[index] = int(used * 4) + self.spare
                print(f"{pathlib.Path(command[0]).name}: {used:.1f} s, "
                      f"limit {self.seconds[index]} s", flush=True)


class Notes:
    """What became of the mutants of one library, in a file of a folder; nowhere without one. A line
    is an address, what was done there, and the number of the program that noticed and its test; or
    "survived" and the digest of the tests."""

    def __init__(self, folder, library, tests):
        self.tests = tests.digest()
        self.known = {}
        self.remembered = 0
        self.path = None
        if folder:
            digest = hashlib.sha256(pathlib.Path(library).read_bytes()).hexdigest()[:16]
            self.path = pathlib.Path(folder, digest)
            self.path.parent.mkdir(parents=True, exist_ok=True)
            self.path.touch()
            for line in self.path.read_text(encoding="utf-8").splitlines():
                address, what, result, how = line.split(" ", 3)
                self.known[int(address, 16), what] = (result, how)

    def has_survived(self, mutant):
        if self.known.get((mutant.address, mutant.what)) != ("survived", self.tests):
            return False
        self.remembered += 1
        return True

    def killers(self, mutant):
        """The program and test that noticed before, where known."""
        result, how = self.known.get((mutant.address, mutant.what), ("survived", ""))
        if result != "survived":
            yield int(result), None if how.startswith("status ") else how

    def add(self, mutant, index, failed):
        entry = ("survived", self.tests) if failed is None else (str(index), failed)
        if self.path and self.known.get((mutant.address, mutant.what)) != entry:
            with self.path.open("a", encoding="utf-8") as file:
                file.write(f"{mutant.address:x} {mutant.what} {' '.join(entry)}\n")


class Excuses:
    def __init__(self, path):
        self.lines = Lines.read(path) if path else Lines("")

    def find(self, mutant):
        for what, why in self.lines.remarks(pathlib.Path(mutant.file).name, code_of(mutant)):
            if self.is_meant(mutant, what):
                return why
        return None

    def idle(self, mutants):
        """Entries that mean none of these mutants."""
        for mutant in mutants:
            name, code = pathlib.Path(mutant.file).name, code_of(mutant)
            self.lines.used.update((name, code, what)
                                   for what, _ in self.lines.remarks(name, code)
                                   if self.is_meant(mutant, what))
        return self.lines.unused()

    @staticmethod
    def is_meant(mutant, what):
        what, _, function = what.partition(" in ")
        names = [*mutant.functions, chain_of(mutant)]
        return what in (mutant.what, "any") and (not function or any(
            fnmatch.fnmatchcase(name, function) for name in names))


def code_of(mutant):
    lines = pathlib.Path(mutant.file).read_text(encoding="utf-8").splitlines()
    return lines[mutant.line - 1].strip() if 0 < mutant.line <= len(lines) else "?"


def chain_of(mutant):
    """The function of the line < the one it was put into < ..."""
    return " < ".join(name.partition("(")[0] for name in mutant.functions)


def describe(mutant):
    name = f"{pathlib.Path(mutant.file).name}:{mutant.line}"
    return f"{name}: jump {mutant.address:x} {mutant.what} in {chain_of(mutant)}: {code_of(mutant)}"


def arguments():
    parser = argparse.ArgumentParser(description=__doc__,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("binary", metavar="library")
    parser.add_argument("sources", help="folder: jumps of code from elsewhere are left alone")
    parser.add_argument("tests", nargs="+")
    parser.add_argument("--count", type=int, default=300, help="mutants to try; 0: all")
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--jobs", type=int, default=1)
    parser.add_argument("--spare", type=int, default=5, metavar="SECONDS",
                        help="of processor time beyond four times what the tests use")
    parser.add_argument("--least", type=float, default=90.0, help="percent that have to be killed")
    parser.add_argument("--equivalent", help="list of mutants that change nothing")
    parser.add_argument("--file", action="append", help="only jumps of this file, or of these")
    parser.add_argument("--notes", metavar="FOLDER", help="where to note what became of mutants")
    parser.add_argument("--verbose", action="store_true",
                        help="name what kills each mutant, and those in the list")
    return parser.parse_args()


def main():
    args = arguments()
    mutants = population(args.binary, args.sources)
    excuses = Excuses(args.equivalent)
    idle = excuses.idle(mutants)
    for file, code, what in idle:
        print(f"listed, but there is no such jump: {file}: {code}: {what}")
    if args.file:
        mutants = [mutant for mutant in mutants if pathlib.Path(mutant.file).name in args.file]
    if not mutants:
        raise SystemExit("mutants: no conditional jump found")
    print(f"{len(mutants) // 2} conditional jumps, each reversed or removed; seed {args.seed}")
    count = min(args.count, len(mutants)) if args.count else len(mutants)
    sample = random.Random(args.seed).sample(mutants, count)
    tests = Tests(args.binary, args.tests, args.spare)
    notes = Notes(args.notes, args.binary, tests)
    tests.measure()
    started = time.monotonic()
    killed = survived = equivalent = 0
    with concurrent.futures.ThreadPoolExecutor(args.jobs) as pool:
        results = pool.map(lambda mutant: tests.killer(mutant, notes), sample)
        for mutant, killer in zip(sample, results):
            if killer is not None:
                killed += 1
                if args.verbose:
                    print("killed:", describe(mutant), "by", killer, flush=True)
            elif excuses.find(mutant):
                equivalent += 1
                if args.verbose:
                    print("equivalent:", describe(mutant), flush=True)
            else:
                survived += 1
                print("survived:", describe(mutant), flush=True)
            if (killed + survived + equivalent) % 50 == 0:
                print(f"{killed + survived + equivalent} of {count} tried, {survived} survived",
                      flush=True)
    percent = 100.0 * killed / (killed + survived) if killed + survived else 0.0
    children = resource.getrusage(resource.RUSAGE_CHILDREN)
    if notes.remembered:
        print(f"{notes.remembered} had survived these tests before and were not tried again")
    print(f"{killed} killed, {survived} survived, {equivalent} equivalent, of {count}: "
          f"{percent:.1f}% killed (wanted {args.least}%), {time.monotonic() - started:.0f} s, "
          f"{children.ru_utime + children.ru_stime:.0f} s of processor time")
    return 0 if percent >= args.least and not idle else 1


if __name__ == "__main__":
    sys.exit(main())
