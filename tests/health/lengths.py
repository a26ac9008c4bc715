#!/usr/bin/env python3
"""Files stay below 600 lines, functions within 70, lines within 100 columns."""

import re

import common

MAX_FILE, MAX_FUNCTION, MAX_COLUMNS = 599, 70, 100
FOLDERS = ["src", "tests", "bench", "fuzz", "examples", "cmake"]
SOURCES = ["*.cpp", "*.h"]
ALL = SOURCES + ["*.py", "*.sh", "*.cmake", "CMakeLists.txt"]
NO_FUNCTION = re.compile(
    r"^\s*(?:namespace|extern|enum|if|for|while|switch|catch|else|do|return|case|default)\b")
TYPE = re.compile(r"\b(?:class|struct|union)\b[^()]*$")


def functions(text):
    """Yields (first line, last line, name) of each function body. Works on layout-free text: a
    brace opens a function when it stands in a namespace or a class and a parameter list precedes
    it."""
    code = re.sub(r"(?m)^[ \t]*#(?:[^\n\\]|\\\n|\\.)*", lambda m: re.sub(r"[^\n]", " ", m.group(0)),
                  common.blank(text))
    stack, start = [], 0
    for match in re.finditer(r"[{};]", code):
        token, position = match.group(0), match.start()
        head = code[start:position]
        if token == "{":
            outer = all(kind == "scope" for kind, _, _ in stack)
            opens = re.sub(r"^\s*(?:(?:public|private|protected)\s*:\s*)+", "", head)
            if outer and "(" in opens and not NO_FUNCTION.match(opens) and not TYPE.search(opens):
                name = re.search(r"([\w~:]+)\s*\(", opens)
                begin = position - len(opens.lstrip())
                stack.append(("function", begin, name.group(1) if name else "?"))
            elif outer and (TYPE.search(opens) or re.match(r"\s*(?:namespace|extern)\b", opens)):
                stack.append(("scope", position, ""))
            else:
                stack.append(("block", position, ""))
        elif token == "}" and stack:
            kind, begin, name = stack.pop()
            if kind == "function":
                yield common.line_of(code, begin), common.line_of(code, position), name
        start = position + 1


def check(root):
    findings = []
    for file in common.files(root, FOLDERS, ALL) + [root / "dev"]:
        if not file.exists():
            continue
        name, text = file.relative_to(root), file.read_text(encoding="utf-8")
        lines = text.splitlines()
        if len(lines) > MAX_FILE:
            findings.append(f"{name}: {len(lines)} lines, at most {MAX_FILE}")
        for number, line in enumerate(lines, 1):
            if len(line) > MAX_COLUMNS:
                findings.append(f"{name}:{number}: {len(line)} columns, at most {MAX_COLUMNS}")
        if file.suffix in (".cpp", ".h"):
            for first, last, function in functions(text):
                if last - first + 1 > MAX_FUNCTION:
                    findings.append(f"{name}:{first}: {function} has {last - first + 1} lines, "
                                    f"at most {MAX_FUNCTION}")
    return findings


if __name__ == "__main__":
    common.run("lengths", check)
