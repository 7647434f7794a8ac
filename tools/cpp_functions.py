"""Finds functions in C++ text well enough to measure them; it is no parser.

Works on text from source_tree.code_only. Bodies are found outermost first: a lambda counts towards
the function that holds it.
"""

import collections
import re

Function = collections.namedtuple("Function", "name first_line last_line parameters")

_SCOPE = re.compile(r"^(?:inline\s+)?(?:namespace|class|struct|union|enum|extern\s+\"\")\b")
_TEMPLATE = re.compile(r"^template\s*<")
_ACCESS = re.compile(r"^(?:public|private|protected)\s*:")
_INITIALISERS = re.compile(r"\)\s*(?:noexcept\s*)?:(?!:)")
_NOT_FUNCTIONS = {"if", "for", "while", "switch", "catch", "return", "decltype", "alignas", "static_assert",
                  "noexcept", "requires", "explicit"}
_OPENING = {"(": ")", "{": "}", "[": "]"}


def matching(text, start):
    """The offset of the bracket that closes the one at start, or the end of the text."""
    close, depth = _OPENING[text[start]], 0
    for index in range(start, len(text)):
        if text[index] == text[start]:
            depth += 1
        elif text[index] == close:
            depth -= 1
            if depth == 0:
                return index
    return len(text) - 1


def _angles_end(text, start):
    depth = 0
    for index in range(start, len(text)):
        if text[index] == "<":
            depth += 1
        elif text[index] == ">" and text[index - 1] != "-":
            depth -= 1
            if depth == 0:
                return index
        elif text[index] in ";{":
            return None
    return None


def _strip_prefixes(text):
    """Takes template headers, access specifiers and attributes from the front."""
    while True:
        text = text.lstrip()
        if _TEMPLATE.match(text):
            end = _angles_end(text, text.index("<"))
            if end is None:
                return text
            text = text[end + 1:]
        elif _ACCESS.match(text):
            text = text[_ACCESS.match(text).end():]
        elif text.startswith("[["):
            text = text[text.find("]]") + 2:]
        else:
            return text


def signature(declaration):
    """(name, number of parameters) of a function's declaration, or None when it is none."""
    text = _strip_prefixes(declaration)
    if _SCOPE.match(text) or text.startswith(("using", "typedef", "#", "friend class")):
        return None
    index = 0
    while index < len(text):
        char = text[index]
        if char == "=" and "operator" not in text[:index]:
            return None
        if char == "<" and re.search(r"[A-Za-z0-9_]\s*$", text[:index]) and \
                not re.search(r"operator\s*$", text[:index]):
            end = _angles_end(text, index)
            if end is not None:
                index = end + 1
                continue
        if char == "(":
            name = re.search(r"(operator\s*(?:\(\s*\)|[^\s\w(]+|[\w:<>*& ]+)?|[~\w:]+)\s*$", text[:index])
            end = matching(text, index)
            if text[:index].rstrip().endswith("operator"):
                index = end + 1
                continue
            if not name:
                return None
            last = name.group(1).strip()
            if last in _NOT_FUNCTIONS:
                index = end + 1
                continue
            return last, _count(text[index + 1:end])
        index += 1
    return None


def _count(parameters):
    if parameters.strip() in ("", "void"):
        return 0
    count, depth, angles = 1, 0, 0
    for index, char in enumerate(parameters):
        if char in "([{":
            depth += 1
        elif char in ")]}":
            depth -= 1
        elif char == "<":
            angles += 1
        elif char == ">" and parameters[index - 1] != "-":
            angles = max(0, angles - 1)
        elif char == "," and depth == 0 and angles == 0:
            count += 1
    return count


def _without_directives(text):
    return re.sub(r"^[ \t]*#(?:\\\n|[^\n])*", "", text, flags=re.MULTILINE)


def functions(text):
    """Yields a Function for each definition, and for each declaration with last_line 0."""
    text = _without_directives(text)
    index = start = 0
    while index < len(text):
        char = text[index]
        if char == "(" or char == "[":
            index = matching(text, index)
        elif char == ";":
            found = signature(text[start:index])
            if found:
                yield Function(found[0], _first_line(text, start), 0, found[1])
            start = index + 1
        elif char == "}":
            start = index + 1
        elif char == "{":
            declaration = text[start:index]
            end = matching(text, index)
            found = signature(declaration)
            if found and _is_initialiser(declaration, text, end):
                index = end
            elif found:
                yield Function(found[0], _first_line(text, start), text.count("\n", 0, end) + 1,
                               found[1])
                index, start = end, end + 1
            elif _SCOPE.match(_strip_prefixes(declaration)) and "enum" not in declaration.split()[:2]:
                start = index + 1
            else:
                index = end  # a variable's or an enumeration's braces
        index += 1


def _is_initialiser(declaration, text, end):
    """A brace after "Class() : member_" belongs to the member, not to the body."""
    if not _INITIALISERS.search(declaration):
        return False
    if not re.search(r"[\w>]\s*$", declaration):
        return False
    return re.match(r"\s*[,{]", text[end + 1:end + 40]) is not None


def _first_line(text, start):
    skipped = len(text[start:]) - len(text[start:].lstrip())
    return text.count("\n", 0, start + skipped) + 1
