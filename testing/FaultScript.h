#pragma once

#include <cstddef>
#include <deque>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/foundation/Error.h"

namespace kx {

// Which of the operations to come shall fail. Wrappers ask it before each operation of a point that
// they know ("transaction", "fetchAssets", ...). Any thread.
class FaultScript {
 public:
  struct Fault {
    std::string point;
    unsigned long times = 1;  // how many operations it hits
    unsigned long skip = 0;   // how many such operations pass first
    ErrorPtr error;           // null: the wrapper's own
    std::string kind;         // what the point's own arguments say
  };

  // Faults that are armed and have not been hit as often as they shall: no more than these.
  static constexpr std::size_t kMostArmed = 1024;

  // False, and nothing done, when there are too many.
  bool arm(Fault fault) {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (fault.times == 0) return true;
    if (faults_.size() >= kMostArmed) return false;
    faults_.push_back(std::move(fault));
    return true;
  }

  void clear() {
    const std::lock_guard<std::mutex> lock(mutex_);
    faults_.clear();
  }

  // The fault that hits this operation, if any: the first armed one of the point.
  std::optional<Fault> take(std::string_view point) {
    const std::lock_guard<std::mutex> lock(mutex_);
    for (auto fault = faults_.begin(); fault != faults_.end(); ++fault) {
      if (fault->point != point) continue;
      if (fault->skip > 0) {
        --fault->skip;
        return std::nullopt;
      }
      Fault hit = *fault;
      if (--fault->times == 0) faults_.erase(fault);
      return hit;
    }
    return std::nullopt;
  }

 private:
  std::mutex mutex_;
  std::deque<Fault> faults_;
};

// The error of a fault that names none.
inline ErrorPtr injectedError(std::string_view point) {
  return Error::make("com.veltro.fault", 1, "made to fail: " + std::string(point));
}

}  // namespace kx
