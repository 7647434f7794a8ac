#pragma once

#include <memory>

#include "device/DeviceRoot.h"
#include "platform/files/Clock.h"

namespace kx {

inline constexpr const char* kBackupRunningPath = "/tmp/BackupRunning";

// The lock that says that a backup of the device is running, held until it goes: an exclusive flock
// on a file that stays and whose text is the last holder's process id.
class RunningLock {
 public:
  // Null and kInUse (with "pid") or kIo. Who only looks whether the lock is free holds it for a
  // moment; that is waited for.
  static std::unique_ptr<RunningLock> take(const DeviceRoot& device, Clock& clock, ErrorPtr* error);

 private:
  explicit RunningLock(UniqueFd fd) : fd_(std::move(fd)) {}
  const UniqueFd fd_;
};

}  // namespace kx
