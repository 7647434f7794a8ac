#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "device/DeviceRoot.h"
#include "device/LibraryStore.h"

namespace kx {

// The library database of a backup.
struct LibraryCopy {
  int file = -1;  // open for reading
  std::int64_t size = 0;
  std::string sha256;
  std::string backup;  // the backup's identity
};

// kBroughtBack: the device has it now, or had it already from this very restore. kKept: the device
// has assets or albums of its own, so that its library stays. kUnusable: the backup's library is
// not what it should be; the device's stays.
enum class LibraryReturn { kBroughtBack, kKept, kUnusable };

struct LibraryReturnResult {
  LibraryReturn outcome = LibraryReturn::kKept;
  bool changed = false;  // brought back by this very call
  ErrorPtr why;          // of an unusable library
};

// Puts the backup's library in the place of the device's, in one step, when the device has nothing
// of its own. The device-made assets in it count as incomplete from then on; what came by sync is
// left out, and the last-synced snapshot goes. For DeviceOptions::beforeLibrary: under the device's
// lock, with no library open. Null, or the failure of the device that ends the restore.
ErrorPtr bringLibraryBack(const std::shared_ptr<DeviceRoot>& root, const LibraryCopy& copy,
                          LibraryReturnResult* result);

// The restore has ended: the library is the device's own again. On the library's queue.
[[nodiscard]] ErrorPtr forgetLibraryReturn(LibraryStore& store);

}  // namespace kx
