#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "device/DeviceRoot.h"

namespace kx {

// What the synced-assets folders and the database looked like when the device was last closed in
// order. Times are nanoseconds.
struct CleanState {
  std::int64_t databaseSize = 0;
  std::int64_t databaseTime = 0;
  std::map<std::string, std::int64_t> folderTimes;  // by folder name
  friend bool operator==(const CleanState&, const CleanState&) = default;

  // As it is now.
  static CleanState of(const DeviceRoot& root);
};

// The device's lock, held by the one process that writes until this object goes. The lock file is
// never removed: its text is the holder's process id or, after an orderly end, a CleanState.
class DeviceLock {
 public:
  // Null and kLocked (with "pid") when another process holds it, kIo when it cannot be had.
  static std::unique_ptr<DeviceLock> take(const std::shared_ptr<DeviceRoot>& root, ErrorPtr* error);

  // The lock as one of several that only read: no process can take it meanwhile. The file is
  // neither made nor written. Null without an error when there is none.
  static std::unique_ptr<DeviceLock> share(const std::shared_ptr<DeviceRoot>& root,
                                           ErrorPtr* error);

  // What the last holder left; null after an unclean stop.
  const std::optional<CleanState>& lastState() const { return lastState_; }
  // Writes this process's id in place of that, before the first change to the device.
  [[nodiscard]] int markInUse();
  // The orderly end.
  [[nodiscard]] int markClean(const CleanState& state);

 private:
  explicit DeviceLock(UniqueFd fd) : fd_(std::move(fd)) {}
  [[nodiscard]] int write(const std::string& text);

  UniqueFd fd_;
  std::optional<CleanState> lastState_;
};

}  // namespace kx
