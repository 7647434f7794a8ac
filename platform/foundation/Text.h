#pragma once

#include <string>
#include <string_view>

#include "platform/foundation/Value.h"

namespace kx {

// Unicode simple case folding of UTF-8 text (tables from Unicode's CaseFolding data, status C and
// S).
std::string foldCase(std::string_view text);

// Order of names as people expect it: case-insensitive (simple folding), runs of decimal digits by
// their numeric value, null before everything. <0, 0, >0. Names that differ only in case or in
// leading zeros of a number are equal.
int compareNames(OptionalString a, OptionalString b);

bool isValidUtf8(std::string_view text);

// Control bytes and bytes that are not UTF-8 written as \xNN, for logs and terminals.
std::string escapeControlCharacters(std::string_view text);

// Path helpers on text alone: the last component; the path without its last component's extension
// (the dot included; a leading dot starts no extension); the extension without the dot, or "".
std::string_view lastPathComponent(std::string_view path);
std::string_view pathByDeletingExtension(std::string_view path);
std::string_view pathExtension(std::string_view path);
std::string pathByAppending(std::string_view directory, std::string_view component);

// "(null)" for null.
std::string describe(OptionalString text);

}  // namespace kx
