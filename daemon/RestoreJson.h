#pragma once

#include <nlohmann/json.hpp>

#include "daemon/RestoreRunner.h"

namespace kx {

// The machine-readable form of a restore's result (docs/cli.md), keys in the documented order. To
// be written with dumpJson.
nlohmann::ordered_json restoreResultJson(const RestoreResult& result);

}  // namespace kx
