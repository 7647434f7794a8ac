#!/usr/bin/env python3
"""Says which source files of a target can be compiled as one: prints "FILE;GROUP" lines.

    unity_groups.py [--lines N] FILE...

Files that are compiled as one share their unnamed namespaces, macros and using directives. So two
files never meet in a group when one of them declares such a name and the other one uses the same
word (as a call, where the name is a function's), or reads a header that declares it. That is stricter than the compiler needs, and so
a new file never breaks a build: at worst it is compiled by itself. A group holds about N lines.
"""

import argparse
import functools
import os
import re
import sys

from cpp_functions import matching
from source_tree import code_only

LINES = 2200
ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))

_WORD = re.compile(r"[A-Za-z_]\w*")
_CALL = re.compile(r"(?<![\w.>:])([A-Za-z_]\w*)\s*\(")
_UNNAMED = re.compile(r"^(?:inline\s+)?namespace\s*\{", re.MULTILINE)
_NAMED = re.compile(r"^namespace\s+[\w:]+\s*\{", re.MULTILINE)
_INCLUDE = re.compile(r'^[ \t]*#[ \t]*include[ \t]+"([^"]+)"', re.MULTILINE)
_DEFINE = re.compile(r"^[ \t]*#[ \t]*define[ \t]+(\w+)", re.MULTILINE)
_DIRECTIVE = re.compile(r"^using\s+namespace\s[^;]*;", re.MULTILINE)
_STATIC = re.compile(r"^(?:static|const|constexpr|thread_local)\b[^;={(]*", re.MULTILINE)
_TYPE = re.compile(r"^(?:template\s*<[^{;]*?>\s*)?(?:class|struct|union|enum(?:\s+(?:class|struct))?)\s+"
                   r"(?:\[\[\w+\]\]\s*)?([A-Za-z_]\w*)")
_MACRO = re.compile(r"^[A-Z][A-Z0-9_]+\s*\(\s*(\w+)\s*,\s*(\w+)")
_PREPROCESSOR = re.compile(r"^[ \t]*#(?:\\\n|[^\n])*", re.MULTILINE)


def statements(text):
    """Yields the head of each declaration of a namespace's inside: up to its body, value or end."""
    start = index = 0
    while index < len(text):
        if text[index] == ";":
            yield text[start:index].strip()
            start = index = index + 1
        elif text[index] == "{":
            yield text[start:index].strip()
            index = matching(text, index) + 1
            rest = re.compile(r"[^;{}\n]*;").match(text, index)
            start = index = rest.end() if rest else index
        else:
            index += 1


@functools.cache
def included(path, root):
    """The project's headers that a file reads, itself not counted."""
    with open(path, encoding="utf-8", errors="replace") as stream:
        direct = [os.path.join(root, name) for name in _INCLUDE.findall(stream.read())]
    found = set()
    for header in filter(os.path.isfile, direct):
        if header not in found:
            found |= {header} | included(header, root)
    return frozenset(found)


@functools.cache
def declared(header):
    """The words of a header outside of any body: all that it declares, and some more."""
    with open(header, encoding="utf-8", errors="replace") as stream:
        text = _PREPROCESSOR.sub("", code_only(stream.read()))
    names = set()
    for space in _NAMED.finditer(text):
        opening = space.end() - 1
        for head in statements(text[opening + 1:matching(text, opening)]):
            names.update(_WORD.findall(head))
    return frozenset(names)


class Source:
    """What of a file can collide with others."""

    def __init__(self, path, root):
        with open(path, encoding="utf-8", errors="replace") as stream:
            raw = code_only(stream.read())
        self.headers = included(path, root)
        self.known = set().union(*map(declared, self.headers))
        self.path = path
        self.lines = raw.count("\n")
        self.macros = set(_DEFINE.findall(raw))
        text = _PREPROCESSOR.sub("", raw)
        self.directives = {" ".join(using.split()) for using in _DIRECTIVE.findall(text)}
        self.aliases = {}
        self.words = set(_WORD.findall(raw))
        self.calls = set(_CALL.findall(text))
        self.names = set(self.macros)
        self.functions = set()
        self.tests = set()
        for static in _STATIC.findall(_UNNAMED.sub("", text)):
            self.names.add(_WORD.findall(static)[-1])
        for unnamed in _UNNAMED.finditer(text):
            opening = unnamed.end() - 1
            for head in statements(text[opening + 1:matching(text, opening)]):
                self._add(head)

    def _add(self, head):
        macro = _MACRO.match(head)
        if macro:
            self.tests.add(macro.groups())
            return
        kind = _TYPE.match(head)
        if kind:
            self.names.add(kind.group(1))
            return
        declared = re.split(r"[=\[]" if "(" not in head else r"\(", head)[0]
        words = _WORD.findall(declared)
        if not words or words[0] == "namespace":
            return
        if words[0] == "using":
            if words[1] != "namespace":
                name = words[1] if "=" in head else words[-1]
                self.aliases[name] = " ".join(head.split())
        elif "(" in head:
            self.functions.add(words[-1])
        else:
            self.names.add(words[-1])

    def stands_in_the_way_of(self, other):
        types = self.names | set(self.aliases)
        return bool(types & (other.known - self.known) or self.names & other.words
                    or self.functions & (other.calls | other.functions)
                    or self.functions & other.names or self.tests & other.tests
                    or self.directives - other.directives
                    or any(alias != other.aliases.get(name) and name in other.words
                           for name, alias in self.aliases.items()))


def groups(sources, lines):
    """Lists of sources: each goes to the first group in which it disturbs nobody."""
    found = []
    for source in sources:
        for group in found:
            if sum(member.lines for member in group) + source.lines > lines:
                continue
            if not any(source.stands_in_the_way_of(member) or member.stands_in_the_way_of(source)
                       for member in group):
                group.append(source)
                break
        else:
            found.append([source])
    return found


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("--lines", type=int, default=LINES)
    parser.add_argument("--root", default=ROOT, help="what includes are relative to")
    parser.add_argument("files", nargs="*")
    arguments = parser.parse_args()
    sources = [Source(path, arguments.root) for path in arguments.files]
    for number, group in enumerate(groups(sources, arguments.lines)):
        for member in group:
            print(f"{member.path};{number}")
    return 0


if __name__ == "__main__":
    sys.exit(main())
