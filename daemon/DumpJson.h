#pragma once

#include <nlohmann/json.hpp>

#include "device/ReferenceDevice.h"

namespace kx {

// The device library as JSON (docs/formats/dump.md): what `kxsync dump` and the drive console's
// device.dump show. Keys in the documented order, "assets" in row order.
nlohmann::ordered_json deviceDumpJson(const DeviceDump& dump);

}  // namespace kx
