#!/usr/bin/env python3
"""Checks every #include against the layers: who may include which folder, and which library.

usage: check_layers.py [ROOT]     exit code 1 and one line per violation
"""

import os
import re
import sys

import source_tree

PLATFORM = {"platform/foundation", "platform/dispatch", "platform"}
ANY = None

# Folder -> the folders it may include besides itself. The longest matching folder counts.
FOLDERS = {
    "platform/foundation": set(),
    "platform/dispatch": {"platform/foundation"},
    "platform": {"platform/foundation", "platform/dispatch"},
    "records": PLATFORM,
    "transport": PLATFORM | {"records"},
    "client": PLATFORM | {"records", "transport"},
    "device": PLATFORM,
    "backup": PLATFORM | {"device"},
    "daemon/drive": PLATFORM | {"daemon", "device", "records", "transport", "testing"},
    "daemon": PLATFORM | {"backup", "daemon/drive", "device", "records", "transport"},
    "host": PLATFORM | {"records", "transport"},
    "cli": PLATFORM | {"backup", "daemon", "device", "host", "records", "transport"},
    "testing": PLATFORM | {"records", "transport"},
    "tests": ANY,
    "bench": ANY,
    "fuzz": ANY,
    "tools": ANY,
}

# First part of a third-party include -> the folders that may name it.
LIBRARIES = {
    "sqlite3.h": {"device", "tests", "bench"},
    "exiv2": {"device", "host", "tests", "tools"},
    "nlohmann": {"backup", "daemon", "daemon/drive", "cli", "tests", "bench"},
    "CLI": {"cli"},
    "dlfcn.h": {"daemon", "tests"},
    "gtest": {"tests"},
    "gmock": {"tests"},
    "rapidcheck": {"tests"},
    "rapidcheck.h": {"tests"},
    "benchmark": {"bench"},
}

# These know the C++ standard library and nothing of the operating system.
PORTABLE = PLATFORM | {"records", "transport", "client"}

INCLUDE = re.compile(r'^[ \t]*#[ \t]*include[ \t]*([<"])([^>"\n]+)[>"]', re.MULTILINE)


def folder_of(path):
    matches = [name for name in FOLDERS if path.startswith(name + "/")]
    return max(matches, key=len) if matches else None


def check_own(root, folder, target):
    """What is wrong with #include "target" in a file of folder; None when nothing is."""
    if not os.path.isfile(os.path.join(root, target)):
        return f'"{target}" is no file below the project\'s root'
    other = folder_of(target)
    if other is None:
        return f'"{target}" lies in no known layer'
    allowed = FOLDERS[folder]
    if allowed is ANY or other == folder or other in allowed:
        return None
    return f'"{target}": {folder} may not include {other}'


def check_foreign(folder, target):
    """What is wrong with #include <target> in a file of folder; None when nothing is."""
    first = target.split("/")[0]
    if first in LIBRARIES:
        if folder in LIBRARIES[first]:
            return None
        return f"<{target}>: only {', '.join(sorted(LIBRARIES[first]))} may include it"
    if folder in PORTABLE and ("/" in target or "." in target):
        return f"<{target}>: {folder} uses the C++ standard library alone"
    return None


def violations(root):
    for path in source_tree.cpp_files(root):
        folder = folder_of(path)
        if folder is None:
            yield f"{path}:1: lies in no known layer"
            continue
        text = source_tree.code_only(source_tree.read_text(root, path), keep_literals=True)
        for match in INCLUDE.finditer(text):
            own = match.group(1) == '"'
            target = match.group(2)
            wrong = check_own(root, folder, target) if own else check_foreign(folder, target)
            if wrong:
                yield f"{path}:{source_tree.line_of(text, match.start())}: {wrong}"


def main(arguments):
    root = arguments[0] if arguments else os.path.join(os.path.dirname(__file__), "..")
    count = len(source_tree.cpp_files(root))
    found = list(violations(root))
    print("\n".join(found + [f"{count} files checked, {len(found)} violations"]))
    return 1 if found or not count else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
