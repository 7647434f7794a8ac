#include "platform/foundation/Text.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace kx {
namespace {

TEST(Text, FoldCaseIsSimpleFolding) {
  const std::pair<const char*, const char*> rows[] = {
      {"", ""},
      {"Trip 2", "trip 2"},
      {"ÄÖÜ", "äöü"},
      {"straße", "straße"},
      {"STRAẞE", "straße"},  // capital sharp s folds to the small one
      {"ΣΊΣΥΦΟΣ", "σίσυφοσ"},
      {"ς", "σ"},  // final sigma folds to sigma
      {"İ", "İ"},  // has no simple folding
      {"Ǆ ǅ ǆ", "ǆ ǆ ǆ"},
      {"ΑΒΓ Ω", "αβγ ω"},  // the last letter is the ohm sign
      {"ЖЯ", "жя"},
      {"𐐀", "𐐨"},
      {"Ꭰ", "Ꭰ"},
      {"ꭰ", "Ꭰ"},  // Cherokee folds to the capital
      {"ᾈ", "ᾀ"},
      {"日本", "日本"}};
  for (const auto& [text, folded] : rows) EXPECT_EQ(foldCase(text), folded) << text;
}

TEST(Text, FoldCaseLeavesBytesThatAreNotUtf8) { EXPECT_EQ(foldCase("A\xFF\xC3Z"), "a\xFF\xC3z"); }

TEST(Text, CompareNamesOrder) {
  const OptionalString ordered[] = {std::nullopt, "",     "1",      "2",     "10",      "a",
                                    "A 2",        "a 10", "a 10 b", "album", "Album 9", "album 10",
                                    "b",          "z",    "Ä",      "日本"};
  for (std::size_t i = 0; i < std::size(ordered); ++i) {
    for (std::size_t j = 0; j < std::size(ordered); ++j) {
      const int order = compareNames(ordered[i], ordered[j]);
      EXPECT_EQ(order < 0, i < j) << describe(ordered[i]) << " and " << describe(ordered[j]);
      EXPECT_EQ(order > 0, i > j) << describe(ordered[i]) << " and " << describe(ordered[j]);
    }
  }
}

TEST(Text, CompareNamesEqualOnes) {
  EXPECT_EQ(compareNames("Trip 007", "trip 7"), 0);
  EXPECT_EQ(compareNames("000", "0"), 0);
  EXPECT_EQ(compareNames("ÉTÉ", "été"), 0);
  EXPECT_EQ(compareNames(std::nullopt, std::nullopt), 0);
}

TEST(Text, CompareNamesOfLongDigitRuns) {
  const std::string nines(100'000, '9');
  const std::string large = "1" + std::string(100'000, '0');
  EXPECT_LT(compareNames(nines, large), 0);
  EXPECT_GT(compareNames(large, nines), 0);
  EXPECT_EQ(compareNames(std::string(50, '0') + nines, nines), 0);
  EXPECT_LT(compareNames("18446744073709551615", "18446744073709551616"), 0);
}

RC_GTEST_PROP(Text, CompareNamesIsAnOrder,
              (const std::string& a, const std::string& b, const std::string& c)) {
  RC_ASSERT(compareNames(a, a) == 0);
  RC_ASSERT(compareNames(a, b) == -compareNames(b, a));
  if (compareNames(a, b) <= 0 && compareNames(b, c) <= 0) RC_ASSERT(compareNames(a, c) <= 0);
}

RC_GTEST_PROP(Text, FoldedTextIsEqualUnderCompareNames, (const std::string& text)) {
  RC_ASSERT(compareNames(foldCase(text), text) == 0);
  RC_ASSERT(foldCase(foldCase(text)) == foldCase(text));
}

TEST(Text, ValidUtf8) {
  for (const char* good : {"", "abc", "é", "€", "𝄞", "\xF4\x8F\xBF\xBF", "\xEF\xBF\xBF"}) {
    EXPECT_TRUE(isValidUtf8(good)) << good;
  }
  EXPECT_TRUE(isValidUtf8(std::string_view("\0", 1)));
  for (const char* bad : {"\x80", "\xC0\xAF", "\xC1\xBF", "\xE0\x80\x80", "\xED\xA0\x80",
                          "\xED\xBF\xBF", "\xF0\x80\x80\x80", "\xF4\x90\x80\x80",
                          "\xF5\x80\x80\x80", "\xFF", "abcdefgh\xE2\x82", "\xC3",
                          "abcdefgh\xFF"
                          "abcdefgh"}) {
    EXPECT_FALSE(isValidUtf8(bad));
  }
}

TEST(Text, EscapeControlCharacters) {
  EXPECT_EQ(escapeControlCharacters("plain é 日本"), "plain é 日本");
  EXPECT_EQ(escapeControlCharacters("a\nb\x1B[0m\x7F"), "a\\x0ab\\x1b[0m\\x7f");
  EXPECT_EQ(escapeControlCharacters(std::string_view("\0", 1)), "\\x00");
  EXPECT_EQ(escapeControlCharacters("\xFF\xC3"), "\\xff\\xc3");
  EXPECT_EQ(escapeControlCharacters("\xC2\x9B"), "\\xc2\\x9b");
}

TEST(Text, LastPathComponent) {
  const std::pair<const char*, const char*> rows[] = {
      {"a/b.jpg", "b.jpg"}, {"b.jpg", "b.jpg"}, {"/a", "a"}, {"a/b/", "b"},
      {"a//", "a"},         {"/", "/"},         {"", ""},    {"//", "/"}};
  for (const auto& [path, last] : rows) EXPECT_EQ(lastPathComponent(path), last) << path;
}

TEST(Text, Extensions) {
  struct Row {
    const char* path;
    const char* without;
    const char* extension;
  };
  const Row rows[] = {{"a/b.jpg", "a/b", "jpg"},
                      {"a.b/c", "a.b/c", ""},
                      {"a.tar.gz", "a.tar", "gz"},
                      {".hidden", ".hidden", ""},
                      {"a/.hidden", "a/.hidden", ""},
                      {".hidden.txt", ".hidden", "txt"},
                      {"name.", "name.", ""},
                      {"..", "..", ""},
                      {"...", "...", ""},
                      {"..a", "..a", ""},
                      {"", "", ""},
                      {"/", "/", ""},
                      {"a.d/", "a", "d"}};
  for (const Row& row : rows) {
    EXPECT_EQ(pathByDeletingExtension(row.path), row.without) << row.path;
    EXPECT_EQ(pathExtension(row.path), row.extension) << row.path;
  }
}

TEST(Text, PathByAppending) {
  EXPECT_EQ(pathByAppending("a", "b"), "a/b");
  EXPECT_EQ(pathByAppending("a/", "/b"), "a/b");
  EXPECT_EQ(pathByAppending("", "b"), "b");
  EXPECT_EQ(pathByAppending("/", "b"), "/b");
}

TEST(Text, DescribeNull) {
  EXPECT_EQ(describe(std::nullopt), "(null)");
  EXPECT_EQ(describe(""), "");
}

}  // namespace
}  // namespace kx
