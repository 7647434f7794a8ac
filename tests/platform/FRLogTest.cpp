#include "platform/sync/FRLog.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/foundation/Limits.h"

namespace kx {
namespace {

struct Line {
  LogLevel level;
  std::string text;
  std::string source;
  std::string facility;
};

class RecordingLog final : public FRLog {
 public:
  bool takes(LogLevel level) override { return static_cast<int>(level) <= static_cast<int>(most); }
  void write(const LogSite& site, LogLevel level, std::string_view message) override {
    lines.push_back({level, std::string(message), site.sourceFile, site.facility});
  }
  LogLevel most = LogLevel::kDebug;
  std::vector<Line> lines;
};

class RecordingLibraryLog final : public KXLibraryLog {
 public:
  bool isEnabled(LogLevel level) override { return enabled && level != LogLevel::kDebug; }
  void write(LogLevel, std::string_view message) override { lines.emplace_back(message); }
  bool enabled = true;
  std::vector<std::string> lines;
};

class RecordingStandardLog final : public StandardLog {
 public:
  void write(std::string_view message) override { lines.emplace_back(message); }
  std::vector<std::string> lines;
};

class FRLogTest : public testing::Test {
 protected:
  void SetUp() override { setLogSinks({sync_, library_, standard_}); }
  void TearDown() override { setLogSinks({}); }

  std::shared_ptr<RecordingLog> sync_ = std::make_shared<RecordingLog>();
  std::shared_ptr<RecordingLibraryLog> library_ = std::make_shared<RecordingLibraryLog>();
  std::shared_ptr<RecordingStandardLog> standard_ = std::make_shared<RecordingStandardLog>();
};

TEST_F(FRLogTest, FillsPlaceholdersInOrderWhateverTheirType) {
  EXPECT_EQ(formatMessage("%@ is %d of %lu (%f) %s%%", {"a", 2, 3UL, 0.5, "done"}),
            "a is 2 of 3 (0.500000) done%");
}

TEST_F(FRLogTest, NullArgumentsPrintAsNull) {
  EXPECT_EQ(formatMessage("%@ %@ %@ %@",
                          {OptionalString(), std::optional<std::string>(), Value(), ErrorPtr()}),
            "(null) (null) (null) (null)");
}

TEST_F(FRLogTest, EveryMessageGoesToBothLogsWhereTheyTakeItsLevel) {
  KX_LOG("Source", "function", LogLevel::kInfo, "info %d", 1);
  KX_LOG("Source", "function", LogLevel::kDebug, "debug %d", 2);
  ASSERT_EQ(sync_->lines.size(), 2U);
  EXPECT_EQ(sync_->lines[0].text, "info 1");
  EXPECT_EQ(sync_->lines[0].source, "Source");
  EXPECT_EQ(sync_->lines[0].facility, "com.veltro.kxsyncbundle");
  EXPECT_EQ(library_->lines, std::vector<std::string>{"info 1"});
  EXPECT_TRUE(standard_->lines.empty());
}

TEST_F(FRLogTest, LibraryLogTakesMessagesThatTheSyncLogRefuses) {
  sync_->most = LogLevel::kError;
  KX_LOG("Source", "function", LogLevel::kInfo, "only there");
  EXPECT_TRUE(sync_->lines.empty());
  EXPECT_EQ(library_->lines, std::vector<std::string>{"only there"});
}

TEST_F(FRLogTest, ArgumentsAreNotEvaluatedWhenNoSinkTakesTheLevel) {
  library_->enabled = false;
  sync_->most = LogLevel::kError;
  int evaluated = 0;
  KX_LOG("Source", "function", LogLevel::kInfo, "%d", ++evaluated);
  EXPECT_EQ(evaluated, 0);
}

TEST_F(FRLogTest, MessagesAreCutAtTheLimitWithoutSplittingACharacter) {
  std::string text(limits::kLogLineBytes - 1, 'x');
  text += "\xC3\xA9 and more";
  KX_LOG("Source", "function", LogLevel::kInfo, "%@", text);
  EXPECT_EQ(sync_->lines.at(0).text, std::string(limits::kLogLineBytes - 1, 'x'));
  KX_LOG("Source", "function", LogLevel::kInfo, "%@", std::string(limits::kLogLineBytes, 'y'));
  EXPECT_EQ(sync_->lines.at(1).text.size(), limits::kLogLineBytes);
}

TEST_F(FRLogTest, LongListsAreRenderedOnlyUpToTheLimit) {
  std::vector<int> numbers(1000000, 7);
  int rendered = 0;
  std::vector<LogArgument> arguments(
      1000, LogArgument(LogArgument::Renderer([&](std::string& out, std::size_t) {
        ++rendered;
        out += std::string(100, 'z');
      })));
  KX_LOG("Source", "function", LogLevel::kInfo, "%@", describeList(arguments));
  EXPECT_LT(rendered, 60);
  EXPECT_GT(rendered, 30);
  EXPECT_EQ(formatMessage("%@", {describeList(std::vector<int>{})}), "()");
  const std::vector<int> two{1, 2};
  EXPECT_EQ(formatMessage("%@", {describeList(two)}), "(\n    1,\n    2\n)");
}

TEST_F(FRLogTest, ControlCharactersAreEscaped) {
  KX_LOG("Source", "function", LogLevel::kInfo, "%@", "a\x1b[2Jb\tc");
  EXPECT_EQ(sync_->lines.at(0).text, "a\\x1b[2Jb\\x09c");
}

TEST_F(FRLogTest, EscapesCountForTheLimitAndAreNotSplit) {
  KX_LOG("Source", "function", LogLevel::kInfo, "%@", std::string(limits::kLogLineBytes, '\x1b'));
  const std::string& text = sync_->lines.at(0).text;
  EXPECT_LE(text.size(), limits::kLogLineBytes);
  EXPECT_GT(text.size(), limits::kLogLineBytes - 4);
  EXPECT_TRUE(text.ends_with("\\x1b"));
}

TEST_F(FRLogTest, StandardLogAndSyncLogAloneCanBeWritten) {
  writeStandardLog("standard %d", {1});
  writeSyncLog({"Source", "function", 1, kLogFacility}, LogLevel::kError, "sync only", {});
  EXPECT_EQ(standard_->lines, std::vector<std::string>{"standard 1"});
  ASSERT_EQ(sync_->lines.size(), 1U);
  EXPECT_EQ(sync_->lines[0].facility, kLogFacility);
  EXPECT_TRUE(library_->lines.empty());
}

TEST_F(FRLogTest, WithoutSinksNothingIsTaken) {
  setLogSinks({});
  EXPECT_FALSE(logTakes(LogLevel::kError));
  writeStandardLog("nowhere", {});
  EXPECT_TRUE(standard_->lines.empty());
}

}  // namespace
}  // namespace kx
