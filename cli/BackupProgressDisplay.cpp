#include "cli/BackupProgressDisplay.h"

#include "cli/Progress.h"

namespace kx::cli {

namespace {

constexpr double kRedrawSeconds = 0.1;
constexpr double kFirstRateSeconds = 1.0;

}  // namespace

std::string backupProgressLine(const BackupProgress& state, double seconds) {
  switch (state.phase) {
    case BackupPhase::kLooking:
      return "looking at the device";
    case BackupPhase::kLibrary:
      return "copying the library";
    case BackupPhase::kFinishing:
      return "putting the backup in place";
    case BackupPhase::kCopying:
    case BackupPhase::kVerifying:
      break;
  }
  std::string line = state.phase == BackupPhase::kCopying ? "copying: " : "verifying: ";
  line += groupedNumber(state.filesDone) + " of " + groupedNumber(state.filesTotal) + " files, " +
          readableBytes(state.bytesDone) + " of " + readableBytes(state.bytesTotal);
  if (seconds >= kFirstRateSeconds && state.bytesDone > 0) {
    const double bytesPerSecond = static_cast<double>(state.bytesDone) / seconds;
    line += ", " + readableBytes(static_cast<std::uint64_t>(bytesPerSecond)) + "/s";
    const std::uint64_t left =
        state.bytesTotal > state.bytesDone ? state.bytesTotal - state.bytesDone : 0;
    if (left > 0) {
      line += ", " + readableDuration(static_cast<double>(left) / bytesPerSecond) + " left";
    }
  }
  if (state.failures > 0) {
    line += ", " + groupedNumber(state.failures) +
            (state.phase == BackupPhase::kCopying ? " failed" : " damaged");
  }
  return line;
}

void BackupProgressDisplay::show(const BackupProgress& state) {
  if (!console_.errIsTerminal()) return;
  const double now = clock_.absoluteTime();
  const bool newPhase = !started_ || state.phase != lastPhase_;
  if (!newPhase && now - lastDrawnSeconds_ < kRedrawSeconds) return;
  if (newPhase) startSeconds_ = now;
  started_ = true;
  lastPhase_ = state.phase;
  lastDrawnSeconds_ = now;
  console_.progress(backupProgressLine(state, now - startSeconds_));
}

}  // namespace kx::cli
