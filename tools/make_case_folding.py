#!/usr/bin/env python3
"""Writes platform/foundation/CaseFoldingTable.h: Unicode simple case folding as runs.

A code point folds to str.casefold() when that is one code point (status C), else to str.lower()
when that is one code point and differs (status S, for those whose full folding is longer).
usage: make_case_folding.py > platform/foundation/CaseFoldingTable.h
"""
import sys
import unicodedata


def fold(point):
    text = chr(point)
    folded = text.casefold()
    if len(folded) != 1:
        folded = text.lower()
    return ord(folded) if len(folded) == 1 else point


def runs():
    """(first, last, step, delta): each step-th code point from first to last moves by delta."""
    pairs = [(p, fold(p) - p) for p in range(0x110000) if not 0xD800 <= p <= 0xDFFF]
    pairs = [(p, d) for p, d in pairs if d != 0]
    found = []
    for point, delta in pairs:
        if found:
            first, last, step, run_delta = found[-1]
            gap = point - last
            if delta == run_delta and gap in (1, 2) and step in (0, gap):
                found[-1] = (first, point, gap, delta)
                continue
        found.append((point, point, 0, delta))
    return [(first, last, step or 1, delta) for first, last, step, delta in found]


def main():
    out = sys.stdout
    table = runs()
    out.write("#pragma once\n\n#include <cstdint>\n\n")
    out.write("// Made by tools/make_case_folding.py from Unicode %s; not edited by hand.\n"
              % unicodedata.unidata_version)
    out.write("namespace kx {\n\n")
    out.write("// Each step-th code point from first to last folds to itself plus delta.\n")
    out.write("struct CaseFoldingRun {\n  std::uint32_t first;\n  std::uint32_t last;\n"
              "  std::uint32_t step;\n  std::int32_t delta;\n};\n\n")
    out.write("// clang-format off\n")
    out.write("inline constexpr CaseFoldingRun kCaseFoldingRuns[] = {\n")
    for first, last, step, delta in table:
        out.write("    {0x%04X, 0x%04X, %d, %d},\n" % (first, last, step, delta))
    out.write("};\n// clang-format on\n\n}  // namespace kx\n")


main()
