#include "cli/Progress.h"

#include <array>
#include <cmath>
#include <cstdio>
#include <string_view>

namespace kx::cli {

namespace {

constexpr double kRedrawSeconds = 0.1;
constexpr double kFirstRateSeconds = 1.0;

std::string oneDecimal(double value) {
  std::array<char, 32> text{};
  std::snprintf(text.data(), text.size(), "%.1f", value);
  return text.data();
}

std::string twoDigits(std::uint64_t value) {
  return (value < 10 ? "0" : "") + std::to_string(value);
}

const char* activityOf(SyncPhase phase) {
  switch (phase) {
    case SyncPhase::kChecking:
      return "checking the host's library ...";
    case SyncPhase::kPreparing:
      return "opening the device's library ...";
    case SyncPhase::kReconciling:
      return "comparing both libraries ...";
    case SyncPhase::kTransferring:
      return "transferring ...";
    case SyncPhase::kFinishing:
      return "finishing ...";
    case SyncPhase::kOpeningBackup:
      return "opening the backup and the device ...";
    case SyncPhase::kPlanning:
      return "looking for what is missing ...";
  }
  return "";
}

std::string percentage(const SyncProgress& state) {
  const bool byBytes = state.bytesTotal > 0;
  const std::uint64_t total = byBytes ? state.bytesTotal : state.filesTotal;
  const std::uint64_t done = byBytes ? state.bytesDone : state.filesDone;
  if (total == 0) return "";
  const double share = static_cast<double>(done) / static_cast<double>(total);
  return std::to_string(static_cast<int>(std::floor(share * 100.0))) + " %  ";
}

}  // namespace

std::string groupedNumber(std::uint64_t number) {
  std::string digits = std::to_string(number);
  for (std::size_t i = digits.size(); i > 3; i -= 3) digits.insert(i - 3, 1, ',');
  return digits;
}

std::string readableBytes(std::uint64_t bytes) {
  constexpr std::array<const char*, 6> kUnits = {"kB", "MB", "GB", "TB", "PB", "EB"};
  if (bytes < 1000) return std::to_string(bytes) + " B";
  double value = static_cast<double>(bytes) / 1000.0;
  std::size_t unit = 0;
  while (value >= 999.95 && unit + 1 < kUnits.size()) {
    value /= 1000.0;
    ++unit;
  }
  return oneDecimal(value) + " " + kUnits[unit];
}

std::string readableDuration(double seconds) {
  constexpr double kLongest = 100.0 * 3600.0;
  if (!(seconds >= 0.0)) seconds = 0.0;
  if (seconds >= kLongest) return "more than 100 hours";
  const auto whole = static_cast<std::uint64_t>(seconds + 0.5);
  const std::uint64_t hours = whole / 3600;
  const std::uint64_t minutes = whole / 60 % 60;
  const std::string rest = twoDigits(whole % 60);
  if (hours == 0) return std::to_string(minutes) + ":" + rest;
  return std::to_string(hours) + ":" + twoDigits(minutes) + ":" + rest;
}

std::string progressLine(const SyncProgress& state, double seconds) {
  if (state.phase != SyncPhase::kTransferring || state.filesTotal == 0) {
    return activityOf(state.phase);
  }
  std::string line = percentage(state);
  line += groupedNumber(state.filesDone) + " of " + groupedNumber(state.filesTotal) + " files, " +
          readableBytes(state.bytesDone);
  if (state.bytesTotal > 0) line += " of " + readableBytes(state.bytesTotal);
  const bool byBytes = state.bytesTotal > 0;
  const double done = static_cast<double>(byBytes ? state.bytesDone : state.filesDone);
  const double total = static_cast<double>(byBytes ? state.bytesTotal : state.filesTotal);
  if (seconds >= kFirstRateSeconds && done > 0.0) {
    const double bytesPerSecond = static_cast<double>(state.bytesDone) / seconds;
    line += ", " + readableBytes(static_cast<std::uint64_t>(bytesPerSecond)) + "/s";
    if (total > done) line += ", " + readableDuration((total - done) * seconds / done) + " left";
  }
  if (state.failures > 0) line += ", " + groupedNumber(state.failures) + " failed";
  return line;
}

void ProgressDisplay::show(const SyncProgress& state) {
  if (!console_.errIsTerminal()) return;
  const double now = clock_.absoluteTime();
  const bool newPhase = !started_ || state.phase != lastPhase_;
  const bool newTotal = state.filesTotal != lastTotal_;
  if (!newPhase && !newTotal && now - lastDrawnSeconds_ < kRedrawSeconds) return;
  if (newPhase || newTotal) startSeconds_ = now;
  started_ = true;
  lastPhase_ = state.phase;
  lastTotal_ = state.filesTotal;
  lastDrawnSeconds_ = now;
  console_.progress(progressLine(state, now - startSeconds_));
}

}  // namespace kx::cli
