#pragma once

#include "platform/files/Clock.h"

namespace kx {

// The machine's clock. Any thread.
class SystemClock : public Clock {
 public:
  Date now() override;
  double absoluteTime() override;
  bool wait(DispatchSemaphore& semaphore, double seconds) override;
};

}  // namespace kx
