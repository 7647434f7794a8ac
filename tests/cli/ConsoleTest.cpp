#include "cli/Console.h"

#include <gtest/gtest.h>

#include <sstream>

namespace kx::cli {
namespace {

TEST(ConsoleTest, ControlCharactersNeverReachTheTerminal) {
  EXPECT_EQ(printable("plain \xC3\xA9"), "plain \xC3\xA9");
  EXPECT_EQ(printable("a\x1b[31mb"), "a\\x1b[31mb");
  EXPECT_EQ(printable("a\nb\tc\rd"), "a\\x0ab\\x09c\\x0dd");
  EXPECT_EQ(printable(std::string_view("a\0b", 3)), "a\\x00b");
  EXPECT_EQ(printable("\x7f"), "\\x7f");
  EXPECT_EQ(printable("\xff\xfe"), "\\xff\\xfe");
}

TEST(ConsoleTest, UpperControlsAndDirectionMarksAreEscaped) {
  EXPECT_EQ(printable("\xC2\x9B"
                      "31m"),
            "\\xc2\\x9b31m");
  EXPECT_EQ(printable("photo\xE2\x80\xAEgpj.exe"), "photo\\xe2\\x80\\xaegpj.exe");
  EXPECT_EQ(printable("\xE2\x80\xA8"), "\\xe2\\x80\\xa8");
  EXPECT_EQ(printable("\xE2\x81\xA6"), "\\xe2\\x81\\xa6");
  EXPECT_EQ(printable("\xE2\x80\x94"), "\xE2\x80\x94") << "a dash is no control";
}

TEST(ConsoleTest, ColumnsCountCodePoints) {
  EXPECT_EQ(columnsOf("\xC3\xA9t\xC3\xA9"), 3U);
  EXPECT_EQ(padded("\xC3\xA9", 3), "\xC3\xA9  ");
  EXPECT_EQ(padded("abcd", 3), "abcd");
  EXPECT_EQ(shortened("abcdef", 6), "abcdef");
  EXPECT_EQ(shortened("abc\xC3\xA9"
                      "efg",
                      6),
            "abc...");
  EXPECT_EQ(shortened("ab\xC3\xA9"
                      "defg",
                      6),
            "ab\xC3\xA9...");
}

class ConsoleStreamsTest : public testing::Test {
 protected:
  Console::Setup setup(bool colors) {
    Console::Setup setup;
    setup.out = &out_;
    setup.err = &err_;
    setup.colorOut = colors;
    setup.colorErr = colors;
    return setup;
  }
  std::ostringstream out_, err_;
};

TEST_F(ConsoleStreamsTest, ResultsAndProblemsGoToDifferentStreams) {
  Console console(setup(false));
  console.result("result");
  console.error("error");
  console.warning("warning");
  console.hint("hint");
  EXPECT_EQ(out_.str(), "result\n");
  EXPECT_EQ(err_.str(), "kxsync: error\nkxsync: warning\nhint\n");
}

TEST_F(ConsoleStreamsTest, ColorsAreUsedOnlyWhereAllowed) {
  Console colored(setup(true));
  colored.heading("Albums");
  EXPECT_EQ(out_.str(), "\x1b[1mAlbums\x1b[0m\n");
  out_.str("");
  colored.withoutColor();
  colored.heading("Albums");
  colored.error("no");
  EXPECT_EQ(out_.str(), "Albums\n");
  EXPECT_EQ(err_.str(), "kxsync: no\n");
}

TEST_F(ConsoleStreamsTest, FurtherLinesOfALogMessageAreIndented) {
  Console console(setup(false));
  console.log("first\nkxsync: forged");
  EXPECT_EQ(err_.str(), "first\n    kxsync: forged\n");
}

TEST_F(ConsoleStreamsTest, OutputThatWasNotTakenIsNoticed) {
  Console console(setup(false));
  console.result("x");
  EXPECT_TRUE(console.finish());
  out_.setstate(std::ios::badbit);
  EXPECT_FALSE(console.finish());
}

}  // namespace
}  // namespace kx::cli
