#pragma once

#include <exception>
#include <mutex>
#include <utility>

#include "platform/dispatch/Dispatch.h"

namespace kx {

// Carries exceptions of library blocks, and of the one who submits them, to the caller who waits
// for the blocks. A guarded block lets its exception go on, so that the library rolls its
// transaction back; blocks that come after a failed one do nothing. What the submitter throws stops
// no block that is submitted already. Any thread; must outlive the blocks.
class BlockFailure {
 public:
  Block guard(Block block) {
    return [this, block = std::move(block)] {
      if (anyBlockFailed()) return;
      try {
        block();
      } catch (...) {
        std::lock_guard<std::mutex> lock(mutex_);
        ofBlock_ = std::current_exception();
        throw;
      }
    };
  }

  void noteOfSubmitter(std::exception_ptr exception) {
    std::lock_guard<std::mutex> lock(mutex_);
    ofSubmitter_ = std::move(exception);
  }

  // A block's exception before the submitter's; nothing when there was none.
  void rethrow() const {
    std::exception_ptr exception;
    {
      std::lock_guard<std::mutex> lock(mutex_);
      exception = ofBlock_ ? ofBlock_ : ofSubmitter_;
    }
    if (exception) std::rethrow_exception(exception);
  }

 private:
  bool anyBlockFailed() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return ofBlock_ != nullptr;
  }

  mutable std::mutex mutex_;
  std::exception_ptr ofBlock_;
  std::exception_ptr ofSubmitter_;
};

}  // namespace kx
