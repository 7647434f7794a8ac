#include <condition_variable>
#include <mutex>

#include "platform/dispatch/Dispatch.h"
#include "platform/foundation/Exceptions.h"

namespace kx {

struct DispatchGroup::State {
  std::mutex mutex;
  std::condition_variable idle;
  std::size_t entered = 0;
};

DispatchGroup::DispatchGroup() : state_(std::make_unique<State>()) {}
DispatchGroup::~DispatchGroup() = default;

void DispatchGroup::enter() {
  std::lock_guard<std::mutex> lock(state_->mutex);
  ++state_->entered;
}

void DispatchGroup::leave() {
  // Notified under the lock: the waiter may destroy the group as soon as it sees the count at 0.
  std::lock_guard<std::mutex> lock(state_->mutex);
  if (state_->entered == 0) throw InternalInconsistency("a group was left more often than entered");
  if (--state_->entered == 0) state_->idle.notify_all();
}

void DispatchGroup::wait() {
  std::unique_lock<std::mutex> lock(state_->mutex);
  state_->idle.wait(lock, [this] { return state_->entered == 0; });
}

struct DispatchSemaphore::State {
  std::mutex mutex;
  std::condition_variable signalled;
  long count = 0;
};

DispatchSemaphore::DispatchSemaphore(long count) : state_(std::make_unique<State>()) {
  state_->count = count;
}
DispatchSemaphore::~DispatchSemaphore() = default;

void DispatchSemaphore::signal() {
  std::lock_guard<std::mutex> lock(state_->mutex);
  ++state_->count;
  state_->signalled.notify_one();
}

void DispatchSemaphore::wait() {
  std::unique_lock<std::mutex> lock(state_->mutex);
  state_->signalled.wait(lock, [this] { return state_->count > 0; });
  --state_->count;
}

bool DispatchSemaphore::tryWait() {
  std::lock_guard<std::mutex> lock(state_->mutex);
  if (state_->count <= 0) return false;
  --state_->count;
  return true;
}

bool DispatchSemaphore::waitFor(std::chrono::nanoseconds timeout) {
  std::unique_lock<std::mutex> lock(state_->mutex);
  if (!state_->signalled.wait_for(lock, timeout, [this] { return state_->count > 0; }))
    return false;
  --state_->count;
  return true;
}

}  // namespace kx
