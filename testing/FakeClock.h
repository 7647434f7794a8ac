#pragma once

#include <condition_variable>
#include <list>
#include <mutex>

#include "platform/files/Clock.h"

namespace kx {

// A clock that stands still until a test moves it. A timed wait ends when the semaphore is
// signalled or when the clock is moved past its limit, whichever comes first; no real time is
// waited for. Any thread.
class FakeClock final : public Clock {
 public:
  Date now() override;
  double absoluteTime() override;
  bool wait(DispatchSemaphore& semaphore, double seconds) override;

  void setNow(Date now);
  void advance(double seconds);
  // Waits until `count` threads are in a timed wait.
  void awaitWaiters(std::size_t count);
  // From now on a timed wait whose semaphore is not free ends at once, as if its time went by.
  void setTimeOutAtOnce(bool atOnce);

 private:
  struct Waiter {
    DispatchSemaphore* semaphore;
    double deadline;  // absolute time
    bool timedOut = false;
  };

  std::mutex mutex_;
  std::condition_variable changed_;
  double now_ = 700000000.0;
  double absoluteTime_ = 1000.0;
  bool timeOutAtOnce_ = false;
  std::list<Waiter> waiters_;
};

}  // namespace kx
