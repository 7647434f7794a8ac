#pragma once

#include "platform/dispatch/Dispatch.h"
#include "platform/foundation/Date.h"

namespace kx {

// The only way to read or wait for time. Any thread; outlives everything that uses it.
class Clock {
 public:
  virtual ~Clock() = default;
  // Wall time, now.
  virtual Date now() = 0;
  // Seconds since an arbitrary start, never going back.
  virtual double absoluteTime() = 0;
  // Waits for the semaphore at most `seconds`; false when they went by.
  virtual bool wait(DispatchSemaphore& semaphore, double seconds) = 0;
};

}  // namespace kx
