#pragma once

#include <atomic>
#include <functional>

#include "testing/FakeClock.h"

namespace kx {

// A clock that follows another one until it is set for the first time; from then on it stands still
// but for setNow and advance. Any thread; the other clock outlives it.
class StandingClock final : public Clock {
 public:
  explicit StandingClock(Clock& inner) : inner_(inner) {}

  Date now() override { return stands_ ? fake_.now() : inner_.now(); }
  double absoluteTime() override { return stands_ ? fake_.absoluteTime() : inner_.absoluteTime(); }
  bool wait(DispatchSemaphore& semaphore, double seconds) override {
    if (givesUp_ && givesUp_()) return false;
    return stands_ ? fake_.wait(semaphore, seconds) : inner_.wait(semaphore, seconds);
  }

  bool stands() const { return stands_; }
  void setNow(Date now) {
    fake_.setNow(now);
    stands_ = true;
  }
  // Only once it stands.
  void advance(double seconds) { fake_.advance(seconds); }
  // Asked before each timed wait: true ends it at once, as if its time had gone by. Set it before
  // the clock is used.
  void setGivesUp(std::function<bool()> givesUp) { givesUp_ = std::move(givesUp); }

 private:
  Clock& inner_;
  FakeClock fake_;
  std::atomic<bool> stands_{false};
  std::function<bool()> givesUp_;
};

}  // namespace kx
