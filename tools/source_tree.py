"""The files of the project, and C++ text without comments and literals: shared by the checks."""

import os
import re

SKIPPED_FOLDERS = {"build", "__pycache__", "node_modules"}
CPP_SUFFIXES = (".h", ".cpp")


def files(root):
    """Yields every file of the project as a path relative to root, sorted, with "/" between parts.

    Hidden folders but .ci and all build output are left out; no link is followed.
    """
    found = []
    for folder, folders, names in os.walk(root):
        folders[:] = [
            name
            for name in folders
            if name not in SKIPPED_FOLDERS and (not name.startswith(".") or name == ".ci")
        ]
        for name in names:
            path = os.path.join(folder, name)
            if os.path.isfile(path) and not os.path.islink(path):
                found.append(os.path.relpath(path, root).replace(os.sep, "/"))
    return sorted(found)


def cpp_files(root):
    return [path for path in files(root) if path.endswith(CPP_SUFFIXES)]


def read_bytes(root, path):
    with open(os.path.join(root, path), "rb") as stream:
        return stream.read()


def read_text(root, path):
    return read_bytes(root, path).decode("utf-8", errors="replace")


_TOKENS = re.compile(
    r'(?P<raw>\b(?:u8|u|U|L)?R"(?P<mark>[^()\\\s]{0,16})\(.*?\)(?P=mark)")'
    r'|(?P<string>"(?:\\.|[^"\\\n])*")'
    r"|(?P<char>(?<![0-9A-Fa-f])'(?:\\.|[^'\\\n])+')"
    r"|(?P<line>//(?:\\\n|[^\n])*)"
    r"|(?P<block>/\*.*?\*/)",
    re.DOTALL,
)


def code_only(text, keep_literals=False):
    """Blanks comments and (unless kept) the insides of literals; every line stays in its place."""

    def blank(match):
        kind = match.lastgroup if match.lastgroup != "mark" else "raw"
        piece = match.group(0)
        if kind in ("raw", "string", "char"):
            if keep_literals:
                return piece
            return '"' + "\n" * piece.count("\n") + '"'
        return "\n" * piece.count("\n") if "\n" in piece else " "

    return _TOKENS.sub(blank, text)


def line_of(text, offset):
    return text.count("\n", 0, offset) + 1
