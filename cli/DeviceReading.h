#pragma once

#include <optional>
#include <string>

#include "cli/Command.h"
#include "device/ReferenceDevice.h"

namespace kx::cli {

// One consistent reading of the device at that directory, which is not changed; it works while a
// sync holds the device. Nothing and an error when there is no device or it cannot be read.
std::optional<DeviceDump> readDevice(Context& context, const std::string& root, bool hash,
                                     ErrorPtr* error);

// When the device's present state was sealed as the whole of a host library; nothing when it is
// not.
std::optional<Date> lastSyncDate(const std::string& root);

}  // namespace kx::cli
