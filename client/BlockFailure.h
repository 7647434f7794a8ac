#pragma once

#include <exception>
#include <mutex>
#include <utility>

#include "platform/dispatch/Dispatch.h"

namespace kx {

// Carries the first exception of several library blocks to the caller who waits for them. A guarded
// block lets its exception go on, so that the library rolls its transaction back; blocks that come
// after a failed one do nothing. Any thread; must outlive the blocks.
class BlockFailure {
 public:
  Block guard(Block block) {
    return [this, block = std::move(block)] {
      if (failed()) return;
      try {
        block();
      } catch (...) {
        note(std::current_exception());
        throw;
      }
    };
  }

  void note(std::exception_ptr exception) {
    std::lock_guard<std::mutex> lock(mutex_);
    if (!exception_) exception_ = std::move(exception);
  }

  // Does nothing when no block failed.
  void rethrow() const {
    std::exception_ptr exception;
    {
      std::lock_guard<std::mutex> lock(mutex_);
      exception = exception_;
    }
    if (exception) std::rethrow_exception(exception);
  }

 private:
  bool failed() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return exception_ != nullptr;
  }

  mutable std::mutex mutex_;
  std::exception_ptr exception_;
};

}  // namespace kx
