#include "platform/foundation/Text.h"

#include <algorithm>
#include <cstring>
#include <iterator>

#include "platform/foundation/CaseFoldingTable.h"
#include "platform/foundation/Utf8.h"

namespace kx {
namespace {

std::uint32_t foldPoint(std::uint32_t point) {
  if (point < 0x80) return point >= 'A' && point <= 'Z' ? point + 32 : point;
  const auto* run = std::lower_bound(
      std::begin(kCaseFoldingRuns), std::end(kCaseFoldingRuns), point,
      [](const CaseFoldingRun& candidate, std::uint32_t p) { return candidate.last < p; });
  if (run == std::end(kCaseFoldingRuns) || point < run->first) return point;
  if ((point - run->first) % run->step != 0) return point;
  return static_cast<std::uint32_t>(static_cast<std::int64_t>(point) + run->delta);
}

bool isDigit(char c) { return c >= '0' && c <= '9'; }

// The folded code point at a place; a byte that is not UTF-8 sorts after all of Unicode.
Utf8Unit foldedAt(std::string_view text, std::size_t at) {
  Utf8Unit unit = decodeUtf8(text, at);
  if (unit.length == 0) return {0x110000U + static_cast<unsigned char>(text[at]), 1};
  unit.point = foldPoint(unit.point);
  return unit;
}

// The run of digits at a place without its leading zeros; `at` moves behind it.
std::string_view takeNumber(std::string_view text, std::size_t& at) {
  while (at < text.size() && text[at] == '0') ++at;
  const std::size_t start = at;
  while (at < text.size() && isDigit(text[at])) ++at;
  return text.substr(start, at - start);
}

int compareNumbers(std::string_view a, std::string_view b) {
  if (a.size() != b.size()) return a.size() < b.size() ? -1 : 1;
  const int order = a.compare(b);
  return order < 0 ? -1 : (order > 0 ? 1 : 0);
}

std::string_view withoutTrailingSlashes(std::string_view path) {
  while (path.size() > 1 && path.back() == '/') path.remove_suffix(1);
  return path;
}

// Where the extension's dot stands in the path, or npos.
std::size_t extensionDot(std::string_view path) {
  const std::string_view name = lastPathComponent(path);
  const std::size_t dot = name.rfind('.');
  if (dot == std::string_view::npos || dot == 0 || dot + 1 == name.size()) {
    return std::string_view::npos;
  }
  if (name.find_first_not_of('.') > dot) return std::string_view::npos;
  return static_cast<std::size_t>(name.data() - path.data()) + dot;
}

}  // namespace

std::string foldCase(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  for (std::size_t at = 0; at < text.size();) {
    const Utf8Unit unit = decodeUtf8(text, at);
    if (unit.length == 0) {
      result += text[at++];
      continue;
    }
    appendUtf8(result, foldPoint(unit.point));
    at += unit.length;
  }
  return result;
}

int compareNames(OptionalString a, OptionalString b) {
  if (!a || !b) return static_cast<int>(a.has_value()) - static_cast<int>(b.has_value());
  std::size_t i = 0;
  std::size_t j = 0;
  while (i < a->size() && j < b->size()) {
    if (isDigit((*a)[i]) && isDigit((*b)[j])) {
      const std::string_view x = takeNumber(*a, i);
      const std::string_view y = takeNumber(*b, j);
      if (const int order = compareNumbers(x, y); order != 0) return order;
      continue;
    }
    const Utf8Unit x = foldedAt(*a, i);
    const Utf8Unit y = foldedAt(*b, j);
    if (x.point != y.point) return x.point < y.point ? -1 : 1;
    i += x.length;
    j += y.length;
  }
  return static_cast<int>(i < a->size()) - static_cast<int>(j < b->size());
}

bool isValidUtf8(std::string_view text) {
  std::size_t at = 0;
  while (at < text.size()) {
    std::uint64_t word = 0;
    if (text.size() - at >= sizeof(word)) {
      std::memcpy(&word, text.data() + at, sizeof(word));
      if ((word & 0x8080808080808080U) == 0) {
        at += sizeof(word);
        continue;
      }
    }
    const Utf8Unit unit = decodeUtf8(text, at);
    if (unit.length == 0) return false;
    at += unit.length;
  }
  return true;
}

std::string escapeControlCharacters(std::string_view text) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string result;
  result.reserve(text.size());
  for (std::size_t at = 0; at < text.size();) {
    const Utf8Unit unit = decodeUtf8(text, at);
    const bool isControl = unit.point < 0x20 || (unit.point >= 0x7F && unit.point < 0xA0);
    const std::size_t length = std::max(unit.length, 1U);
    if (unit.length != 0 && !isControl) {
      result.append(text, at, length);
    } else {
      for (std::size_t i = 0; i < length; ++i) {
        const auto byte = static_cast<unsigned char>(text[at + i]);
        result += "\\x";
        result += kDigits[byte >> 4];
        result += kDigits[byte & 15];
      }
    }
    at += length;
  }
  return result;
}

std::string_view lastPathComponent(std::string_view path) {
  path = withoutTrailingSlashes(path);
  const std::size_t slash = path.rfind('/');
  if (slash == std::string_view::npos || path.size() == 1) return path;
  return path.substr(slash + 1);
}

std::string_view pathByDeletingExtension(std::string_view path) {
  path = withoutTrailingSlashes(path);
  const std::size_t dot = extensionDot(path);
  return dot == std::string_view::npos ? path : path.substr(0, dot);
}

std::string_view pathExtension(std::string_view path) {
  path = withoutTrailingSlashes(path);
  const std::size_t dot = extensionDot(path);
  return dot == std::string_view::npos ? std::string_view() : path.substr(dot + 1);
}

std::string pathByAppending(std::string_view directory, std::string_view component) {
  if (directory.empty()) return std::string(component);
  std::string result(directory);
  if (result.back() != '/') result += '/';
  while (!component.empty() && component.front() == '/') component.remove_prefix(1);
  return result += component;
}

std::string describe(OptionalString text) { return text ? std::string(*text) : "(null)"; }

}  // namespace kx
