#!/usr/bin/env python3
"""Checks the project's own rules that no compiler knows: budgets, banned calls, left-over marks,
test files without tests, and paths in documents that lead nowhere.

usage: tidy.py [ROOT]     exit code 1 and one line per violation
"""

import os
import re
import sys

import cpp_functions
import source_tree

FILE_LINES = 600
TEST_FILE_LINES = 900
FUNCTION_LINES = 70
PARAMETERS = 5
TEST_FOLDERS = ("tests/", "fuzz/", "bench/")

# (what, pattern over code without comments and literals, where it is allowed, what to use)
BANNED = [
    ("sleeping", r"\b(?:sleep_for|sleep_until|usleep|nanosleep|sleep)\s*\(", (),
     "wait for the event itself, or advance the faked clock"),
    ("reading a clock",
     r"\b\w*_clock::now\s*\(|\bclock_gettime\s*\(|\bgettimeofday\s*\("
     r"|(?<![\w.>])(?:std::|::)?time\s*\(\s*(?:nullptr|NULL|0|&)",
     ("device/", "tests/device/", "bench/"), "ask the platform's clock"),
    ("std::filesystem", r"\bstd::filesystem\b|#\s*include\s*<filesystem>",
     ("cli/", "host/", "tests/", "bench/", "fuzz/", "tools/", "testing/"),
     "go through the platform's files"),
]

# Put together from pieces, so that this file does not trip over itself.
MARKS = re.compile(r"\b(?:TO" r"DO|FIX" r"ME|XX" r"X|HA" r"CK|not imple" r"mented|st" r"ub)\b")
MARKED_FILES = (".cpp", ".h", ".sh", ".md", ".py", "CMakeLists.txt")
MARK_ALLOWED = "Method not imple" "mented on base class"
FOREIGN = re.compile(
    r"\b[Pp]ar" r"ts? [0-9]+(?:\.[0-9]+)?\b|\bsp" r"ec\.md\b|\b(?:the|our|this) sp" r"ec(?:ification)?\b"
    r"|\bper sp" r"ec\b|\bOrder of buil" r"ding\b|\b[Ii]ss" r"ue #?[0-9]+\b|\.\./sha" r"red")
DOCUMENT_TYPE = re.compile(rb"<!" rb"doctype", re.IGNORECASE)
TEST = re.compile(r"^\s*(?:TEST|TEST_F|TEST_P|TYPED_TEST|TYPED_TEST_P|RC_GTEST_PROP|"
                  r"RC_GTEST_FIXTURE_PROP|INSTANTIATE_(?:TYPED_)?TEST_SUITE_P)\s*\(", re.MULTILINE)


def file_budget(path, text):
    limit = TEST_FILE_LINES if path.startswith(TEST_FOLDERS) else FILE_LINES
    lines = text.count("\n")
    if lines > limit:
        yield path, 1, f"{lines} lines, {limit} are allowed: split it by meaning"


def function_budget(path, code):
    for function in cpp_functions.functions(code):
        lines = function.last_line - function.first_line + 1
        if lines > FUNCTION_LINES:
            yield (path, function.first_line,
                   f"{function.name}: {lines} lines, {FUNCTION_LINES} are allowed")
        if function.parameters > PARAMETERS:
            yield (path, function.first_line, f"{function.name}: {function.parameters} parameters, "
                   f"{PARAMETERS} are allowed: use a struct")


def banned_calls(path, code):
    for what, pattern, allowed, instead in BANNED:
        if path.startswith(allowed):
            continue
        for match in re.finditer(pattern, code):
            yield path, source_tree.line_of(code, match.start()), f"{what} is banned: {instead}"


def sleeping_script(path, text):
    for match in re.finditer(r"\btime\.sle" r"ep\s*\(", text):
        yield path, source_tree.line_of(text, match.start()), \
            "sleeping is banned: wait for the event itself"


def left_over(path, text):
    for number, line in enumerate(text.splitlines(), 1):
        if path.endswith(MARKED_FILES) and MARKS.search(line.replace(MARK_ALLOWED, "")):
            yield path, number, "a mark of unfinished work: finish it"
        if FOREIGN.search(line):
            yield path, number, "refers to something outside the project"


def empty_test(path, code):
    if path.startswith("tests/") and path.endswith("Test.cpp") and not TEST.search(code):
        yield path, 1, "a test file without a test"


def document_type(path, data):
    match = DOCUMENT_TYPE.search(data)
    if match:
        yield path, data.count(b"\n", 0, match.start()) + 1, "holds a document type declaration"


def document_paths(root, path, text, known):
    """Paths between backticks, and targets of links, have to exist."""
    tops = {name.split("/")[0] for name in known if "/" in name}
    bases = {name.split("/")[-1] for name in known}
    folders = {os.path.dirname(name) for name in known}
    for number, line in enumerate(text.splitlines(), 1):
        for link in re.findall(r"\]\(([^)#\s]+)", line):
            if "://" not in link and not os.path.exists(
                    os.path.join(root, os.path.dirname(path), link)):
                yield path, number, f"links to {link}, which does not exist"
        for token in re.findall(r"`([A-Za-z0-9_.+/-]+)`", line):
            name = token[2:] if token.startswith("./") else token
            name = name.rstrip("/")
            if name.split("/")[0] in tops:
                missing = name not in known and not any(
                    folder == name or folder.startswith(name + "/") for folder in folders)
            else:
                missing = re.fullmatch(r"[A-Za-z0-9_+-]+\.(?:h|cpp|py|cmake)", name) is not None \
                    and name not in bases
            if missing:
                yield path, number, f"names {token}, which does not exist"


def violations(root):
    names = source_tree.files(root)
    known = set(names)
    for path in names:
        data = source_tree.read_bytes(root, path)
        yield from document_type(path, data)
        if b"\0" in data[:4096]:
            continue
        text = data.decode("utf-8", errors="replace")
        if path != "LICENSE":
            yield from left_over(path, text)
        if path.endswith(source_tree.CPP_SUFFIXES):
            code = source_tree.code_only(text)
            yield from file_budget(path, text)
            yield from function_budget(path, code)
            yield from banned_calls(path, code)
            yield from empty_test(path, code)
        if path.endswith(".py"):
            yield from file_budget(path, text)
            yield from sleeping_script(path, text)
        if path.endswith(".md"):
            yield from document_paths(root, path, text, known)


def main(arguments):
    root = arguments[0] if arguments else os.path.join(os.path.dirname(__file__), "..")
    found = [f"{path}:{line}: {what}" for path, line, what in violations(root)]
    count = len(source_tree.files(root))
    print("\n".join(found + [f"{count} files checked, {len(found)} violations"]))
    return 1 if found or not count else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
