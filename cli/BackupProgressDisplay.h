#pragma once

#include <string>

#include "backup/BackupTaker.h"
#include "cli/Console.h"
#include "platform/files/Clock.h"

namespace kx::cli {

// One line that says how far a backup or a verification is, `seconds` after its phase began.
std::string backupProgressLine(const BackupProgress& state, double seconds);

// Draws these lines on the console: whenever a phase begins, else at most ten a second. One thread;
// the clock outlives it.
class BackupProgressDisplay {
 public:
  BackupProgressDisplay(Console& console, Clock& clock) : console_(console), clock_(clock) {}
  void show(const BackupProgress& state);

 private:
  Console& console_;
  Clock& clock_;
  bool started_ = false;
  double startSeconds_ = 0.0;
  double lastDrawnSeconds_ = 0.0;
  BackupPhase lastPhase_ = BackupPhase::kLooking;
};

}  // namespace kx::cli
