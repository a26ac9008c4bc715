#!/usr/bin/env python3
"""Calls and words that have no place here. In the engine: other sources of memory, exceptions,
run-time types, containers, locks, and plain memory functions on node bytes. In the whole project:
marks of unfinished work, and words that lean on something a reader of the project does not have."""

import re

import common

ENGINE = ["src/hfs/treehfs"]
ENGINE_FILES = ["src/hfs/treehfs.h", "src/hfs/fshfs.h", "src/hfs/format.h"]
PLATFORM = ["src/platform"]
HOSTED = "src/platform/host"

# Plain memory functions belong into the window on a node's bytes. Other files may use them for
# memory that is no node's bytes; which memory that is stands here.
MEMORY_CALLS = re.compile(r"\b(?:memcpy|memmove|memset|memcmp)\s*\(")
MEMORY_ALLOWED = {
    "bytes.h": "the window itself", "bytes.cpp": "the window itself",
    "cache.cpp": "a new node object and its zero-filled new blocks",
    "cache_dirty.cpp": "zero-filling of whole blocks",
    "hints.cpp": "what a node remembers beside its blocks",
    "scratch.h": "the scratch buffer", "scratch.cpp": "the scratch buffer",
    "path_deliver.h": "buffers of the caller", "path_deliver.cpp": "buffers of the caller",
}

STANDARD = (r"std::(?:vector|string|map|set|list|deque|array|function|unique_ptr|shared_ptr|"
            r"unordered_\w+|optional|variant|thread|atomic|cout|cerr)\b")
ENGINE_BANNED = [
    (re.compile(r"\b(?:malloc|calloc|realloc|free|alloca|strdup)\s*\("), "memory of its own"),
    (re.compile(r"\bnew\b(?!\s*\()|\bdelete\b(?!\s*;)"), "memory of its own"),
    (re.compile(r"\b(?:throw|try|catch)\b"), "exceptions"),
    (re.compile(r"\b(?:virtual|override|dynamic_cast|typeid)\b"), "run-time types"),
    (re.compile(STANDARD), "standard containers"),
    (re.compile(r"\b(?:mutex|pthread_\w+|thread_local|volatile)\b"), "locks and threads"),
    (re.compile(r"\b(?:printf|fprintf|puts|abort|exit|assert)\s*\("), "hosted library"),
]
PLACEMENT_NEW = re.compile(r"\bnew\s*\([^)]*\)")

# Written with brackets so that the patterns do not find themselves.
UNFINISHED = re.compile(r"\b(?:T[O]DO|F[I]XME|X[X]X|H[A]CK)\b|not imp[l]emented")
OUTSIDE = [
    (re.compile(r"\bspeci[f]ications?\b|\bthe[ ]spec\b|\bspec\.m[d]\b", re.I),
     "the text stands on its own"),
    (re.compile(r"\b[P]arts? \d+(?:\.\d+)?\b|\bdecisions? \d+\b|\bissues? #?\d+\b", re.I),
     "a number of a document that is not here"),
    (re.compile(r"(?<![\w.$}/])/(?:work|farm|home/\w+|root)/"), "a path of one machine"),
    (re.compile(r"\b(?:debian\.[o]rg|np[m]js|pypi\.[o]rg|DEVELOPERS\.m[d])\b"),
     "a name of one place"),
    (re.compile(r"\bA[I] (?:assistant|model)|\blanguage m[o]del\b|\bL[L]M\b"), "a tool of work"),
]
SELF = "tests/health/banned.py"


def engine_findings(root):
    findings = []
    sources = common.files(root, ENGINE + PLATFORM, ["*.h", "*.cpp"])
    sources += [root / name for name in ENGINE_FILES if (root / name).exists()]
    for file in sources:
        name = file.relative_to(root).as_posix()
        if name.startswith(HOSTED):
            continue
        text = common.blank(file.read_text(encoding="utf-8"))
        text = re.sub(r"=\s*delete\b", "", text)
        for number, line in enumerate(text.splitlines(), 1):
            if "#include" in line:
                continue
            if MEMORY_CALLS.search(line) and name.startswith("src/hfs/treehfs/") \
                    and file.name not in MEMORY_ALLOWED:
                findings.append(f"{name}:{number}: plain memory function: use NodeBytes")
            line = PLACEMENT_NEW.sub("", line)
            for pattern, what in ENGINE_BANNED:
                if pattern.search(line):
                    findings.append(f"{name}:{number}: {what}: {line.strip()}")
    return findings


def text_findings(root):
    findings = []
    for file in common.text_files(root):
        name = file.relative_to(root).as_posix()
        if name == SELF:
            continue
        for number, line in enumerate(file.read_text(encoding="utf-8", errors="replace")
                                      .splitlines(), 1):
            if UNFINISHED.search(line):
                findings.append(f"{name}:{number}: unfinished: {line.strip()}")
            for pattern, what in OUTSIDE:
                if pattern.search(line):
                    findings.append(f"{name}:{number}: {what}: {line.strip()}")
    return findings


def check(root):
    return engine_findings(root) + text_findings(root)


if __name__ == "__main__":
    common.run("banned", check)
