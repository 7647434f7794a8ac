#include "cli/Progress.h"

#include <gtest/gtest.h>

#include <sstream>

#include "platform/files/Clock.h"

namespace kx::cli {
namespace {

class HandClock : public Clock {
 public:
  Date now() override { return Date{seconds}; }
  double absoluteTime() override { return seconds; }
  bool wait(DispatchSemaphore& semaphore, double) override { return semaphore.tryWait(); }
  double seconds = 100.0;
};

SyncProgress transferring(std::size_t files, std::size_t ofFiles, std::uint64_t bytes,
                          std::uint64_t ofBytes) {
  SyncProgress progress;
  progress.phase = SyncPhase::kTransferring;
  progress.filesDone = files;
  progress.filesTotal = ofFiles;
  progress.bytesDone = bytes;
  progress.bytesTotal = ofBytes;
  return progress;
}

TEST(ProgressTest, NumbersAreGroupedByThousands) {
  EXPECT_EQ(groupedNumber(0), "0");
  EXPECT_EQ(groupedNumber(999), "999");
  EXPECT_EQ(groupedNumber(1000), "1,000");
  EXPECT_EQ(groupedNumber(1234567), "1,234,567");
}

TEST(ProgressTest, BytesAreReadable) {
  EXPECT_EQ(readableBytes(0), "0 B");
  EXPECT_EQ(readableBytes(999), "999 B");
  EXPECT_EQ(readableBytes(1000), "1.0 kB");
  EXPECT_EQ(readableBytes(999949), "999.9 kB");
  EXPECT_EQ(readableBytes(999950), "1.0 MB");
  EXPECT_EQ(readableBytes(12'345'678'901), "12.3 GB");
}

TEST(ProgressTest, DurationsAreReadable) {
  EXPECT_EQ(readableDuration(0.0), "0:00");
  EXPECT_EQ(readableDuration(59.4), "0:59");
  EXPECT_EQ(readableDuration(59.6), "1:00");
  EXPECT_EQ(readableDuration(3723.0), "1:02:03");
  EXPECT_EQ(readableDuration(-1.0), "0:00");
  EXPECT_EQ(readableDuration(1e12), "more than 100 hours");
}

TEST(ProgressTest, LineTellsFilesBytesRateTimeLeftAndFailures) {
  SyncProgress progress = transferring(25, 100, 10'000'000, 40'000'000);
  EXPECT_EQ(progressLine(progress, 0.5), "25 %  25 of 100 files, 10.0 MB of 40.0 MB");
  EXPECT_EQ(progressLine(progress, 5.0),
            "25 %  25 of 100 files, 10.0 MB of 40.0 MB, 2.0 MB/s, 0:15 left");
  progress.failures = 2;
  EXPECT_EQ(progressLine(progress, 5.0),
            "25 %  25 of 100 files, 10.0 MB of 40.0 MB, 2.0 MB/s, 0:15 left, 2 failed");
}

TEST(ProgressTest, WithoutKnownSizesFilesDecide) {
  EXPECT_EQ(progressLine(transferring(1, 4, 3000, 0), 2.0),
            "25 %  1 of 4 files, 3.0 kB, 1.5 kB/s, 0:06 left");
}

TEST(ProgressTest, NothingIsLeftAtTheEnd) {
  EXPECT_EQ(progressLine(transferring(4, 4, 8000, 8000), 2.0),
            "100 %  4 of 4 files, 8.0 kB of 8.0 kB, 4.0 kB/s");
}

TEST(ProgressTest, OtherPhasesAreNamed) {
  SyncProgress progress;
  progress.phase = SyncPhase::kReconciling;
  EXPECT_EQ(progressLine(progress, 3.0), "comparing both libraries ...");
}

class ProgressDisplayTest : public testing::Test {
 protected:
  Console::Setup setup(bool terminal) {
    Console::Setup setup;
    setup.out = &out_;
    setup.err = &err_;
    setup.errIsTerminal = terminal;
    setup.errColumns = 30;
    return setup;
  }
  std::size_t redraws() const {
    std::size_t count = 0;
    for (char byte : err_.str()) count += byte == '\r' ? 1U : 0U;
    return count;
  }
  std::ostringstream out_, err_;
  HandClock clock_;
};

TEST_F(ProgressDisplayTest, NothingIsDrawnWithoutATerminal) {
  Console console(setup(false));
  ProgressDisplay display(console, clock_);
  display.show(transferring(1, 2, 1, 2));
  display.end();
  EXPECT_EQ(err_.str(), "");
  EXPECT_EQ(out_.str(), "");
}

TEST_F(ProgressDisplayTest, OneLineIsRedrawnAtMostTenTimesASecond) {
  Console console(setup(true));
  ProgressDisplay display(console, clock_);
  for (int i = 0; i < 100; ++i) {
    display.show(transferring(static_cast<std::size_t>(i), 100, 1, 2));
    clock_.seconds += 0.01;
  }
  EXPECT_GE(redraws(), 9U);
  EXPECT_LE(redraws(), 11U);
  EXPECT_EQ(err_.str().find('\n'), std::string::npos);
}

TEST_F(ProgressDisplayTest, LineIsCutToTheTerminalsWidth) {
  Console console(setup(true));
  ProgressDisplay display(console, clock_);
  display.show(transferring(1, 2, 1'000'000, 2'000'000));
  const std::string drawn = err_.str().substr(std::string("\r\x1b[K").size());
  EXPECT_EQ(drawn.size(), 29U);
}

TEST_F(ProgressDisplayTest, OtherLinesTakeTheProgressLineAway) {
  Console console(setup(true));
  ProgressDisplay display(console, clock_);
  display.show(transferring(1, 2, 1, 2));
  console.error("no");
  EXPECT_EQ(err_.str().substr(err_.str().rfind('\r')), "\r\x1b[Kkxsync: no\n");
}

}  // namespace
}  // namespace kx::cli
