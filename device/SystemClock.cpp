#include "device/SystemClock.h"

#include <algorithm>
#include <chrono>

namespace kx {
namespace {

constexpr double kReferenceDateSinceUnixEpoch = 978307200.0;
constexpr double kLongestWaitSeconds = 1e9;  // what nanoseconds in 64 bits hold

}  // namespace

Date SystemClock::now() {
  const std::chrono::duration<double> sinceEpoch =
      std::chrono::system_clock::now().time_since_epoch();
  return Date{sinceEpoch.count() - kReferenceDateSinceUnixEpoch};
}

double SystemClock::absoluteTime() {
  const std::chrono::duration<double> sinceStart =
      std::chrono::steady_clock::now().time_since_epoch();
  return sinceStart.count();
}

bool SystemClock::wait(DispatchSemaphore& semaphore, double seconds) {
  const double bounded = std::clamp(seconds, 0.0, kLongestWaitSeconds);
  return semaphore.waitFor(
      std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::duration<double>(bounded)));
}

}  // namespace kx
