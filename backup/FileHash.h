#pragma once

#include <functional>
#include <string>

#include "backup/BackupManifest.h"
#include "device/DeviceRoot.h"

namespace kx {

// Size and hash of an open file from its beginning, or of one beneath a root: 0 or an errno;
// ECANCELED when `goOn`, asked after each piece, says no.
[[nodiscard]] int hashFile(int fd, const std::function<bool()>& goOn, BackupPart* out);
[[nodiscard]] int hashFile(const DeviceRoot& root, const std::string& path,
                           const std::function<bool()>& goOn, BackupPart* out);

}  // namespace kx
