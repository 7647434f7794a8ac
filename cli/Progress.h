#pragma once

#include <cstdint>
#include <string>

#include "cli/Console.h"
#include "daemon/SyncRunner.h"
#include "platform/files/Clock.h"

namespace kx::cli {

// "1,234", "999 B", "1.5 MB" (decimal units), "0:07", "12:34", "1:02:03".
std::string groupedNumber(std::uint64_t number);
std::string readableBytes(std::uint64_t bytes);
std::string readableDuration(double seconds);

// One line that says how far a sync is, `seconds` after its transfers began: files, bytes, rate,
// time left, failures so far. Rate and time left only after the first second; before the transfers
// the line names what is being done.
std::string progressLine(const SyncProgress& state, double seconds);

// Draws progress lines on the console: whenever something new begins, else at most ten a second.
// One thread; the clock outlives it.
class ProgressDisplay {
 public:
  ProgressDisplay(Console& console, Clock& clock) : console_(console), clock_(clock) {}
  void show(const SyncProgress& state);
  void end() { console_.endProgress(); }

 private:
  Console& console_;
  Clock& clock_;
  bool started_ = false;
  double startSeconds_ = 0.0;
  double lastDrawnSeconds_ = 0.0;
  SyncPhase lastPhase_ = SyncPhase::kChecking;
  std::size_t lastTotal_ = 0;
};

}  // namespace kx::cli
