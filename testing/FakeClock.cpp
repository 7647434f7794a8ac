#include "testing/FakeClock.h"

namespace kx {

Date FakeClock::now() {
  std::lock_guard<std::mutex> lock(mutex_);
  return Date{now_};
}

double FakeClock::absoluteTime() {
  std::lock_guard<std::mutex> lock(mutex_);
  return absoluteTime_;
}

bool FakeClock::wait(DispatchSemaphore& semaphore, double seconds) {
  std::list<Waiter>::iterator waiter;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    if (timeOutAtOnce_) return semaphore.tryWait();
    waiter = waiters_.insert(waiters_.end(), Waiter{&semaphore, absoluteTime_ + seconds});
    changed_.notify_all();
  }
  semaphore.wait();
  std::lock_guard<std::mutex> lock(mutex_);
  const bool timedOut = waiter->timedOut;
  waiters_.erase(waiter);
  // A time-out wakes the waiter with a signal of its own: the real one may have come besides.
  return !timedOut || semaphore.tryWait();
}

void FakeClock::setNow(Date now) {
  std::lock_guard<std::mutex> lock(mutex_);
  now_ = now.secondsSinceReference;
}

void FakeClock::advance(double seconds) {
  std::lock_guard<std::mutex> lock(mutex_);
  now_ += seconds;
  absoluteTime_ += seconds;
  for (Waiter& waiter : waiters_) {
    if (waiter.timedOut || waiter.deadline > absoluteTime_) continue;
    waiter.timedOut = true;
    waiter.semaphore->signal();
  }
}

void FakeClock::awaitWaiters(std::size_t count) {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [this, count] { return waiters_.size() >= count; });
}

void FakeClock::setTimeOutAtOnce(bool atOnce) {
  std::lock_guard<std::mutex> lock(mutex_);
  timeOutAtOnce_ = atOnce;
}

}  // namespace kx
