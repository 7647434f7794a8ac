#include <gtest/gtest.h>

#include <sstream>

#include "cli/BackupProgressDisplay.h"
#include "testing/FakeClock.h"

namespace kx::cli {
namespace {

BackupProgress copying() { return {BackupPhase::kCopying, 1, 2000, 5'000'000, 25'000'000, 0}; }

TEST(BackupProgressTest, NamesWhatIsBeingDone) {
  EXPECT_EQ(backupProgressLine({BackupPhase::kLooking, 0, 0, 0, 0, 0}, 5), "looking at the device");
  EXPECT_EQ(backupProgressLine({BackupPhase::kLibrary, 0, 0, 0, 0, 0}, 5), "copying the library");
  EXPECT_EQ(backupProgressLine({BackupPhase::kFinishing, 0, 0, 0, 0, 0}, 5),
            "putting the backup in place");
}

TEST(BackupProgressTest, CountsFilesAndBytesAndTellsTheRateAfterASecond) {
  EXPECT_EQ(backupProgressLine(copying(), 0.5), "copying: 1 of 2,000 files, 5.0 MB of 25.0 MB");
  EXPECT_EQ(backupProgressLine(copying(), 2),
            "copying: 1 of 2,000 files, 5.0 MB of 25.0 MB, 2.5 MB/s, 0:08 left");
  BackupProgress state = copying();
  state.failures = 3;
  state.bytesDone = state.bytesTotal;
  EXPECT_EQ(backupProgressLine(state, 10),
            "copying: 1 of 2,000 files, 25.0 MB of 25.0 MB, 2.5 MB/s, 3 failed");
  state.phase = BackupPhase::kVerifying;
  EXPECT_EQ(backupProgressLine(state, 10),
            "verifying: 1 of 2,000 files, 25.0 MB of 25.0 MB, 2.5 MB/s, 3 damaged");
}

TEST(BackupProgressTest, IsDrawnTenTimesASecondAtMostAndOnTerminalsAlone) {
  std::ostringstream out, err;
  Console::Setup setup;
  setup.out = &out;
  setup.err = &err;
  setup.errIsTerminal = true;
  Console console(setup);
  FakeClock clock;
  BackupProgressDisplay display(console, clock);
  display.show(copying());
  const std::string first = err.str();
  EXPECT_NE(first.find("copying: 1 of"), std::string::npos);
  BackupProgress state = copying();
  state.filesDone = 2;
  clock.advance(0.05);
  display.show(state);
  EXPECT_EQ(err.str(), first);
  clock.advance(0.06);
  display.show(state);
  EXPECT_NE(err.str().find("copying: 2 of"), std::string::npos);
  state.phase = BackupPhase::kFinishing;
  display.show(state);
  EXPECT_NE(err.str().find("putting the backup in place"), std::string::npos);

  std::ostringstream quiet;
  setup.err = &quiet;
  setup.errIsTerminal = false;
  Console plain(setup);
  BackupProgressDisplay(plain, clock).show(copying());
  EXPECT_EQ(quiet.str(), "");
}

}  // namespace
}  // namespace kx::cli
