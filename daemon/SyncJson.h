#pragma once

#include <nlohmann/json.hpp>

#include "daemon/SyncRunner.h"

namespace kx {

// The machine-readable forms, keys in the documented order. Texts that are not UTF-8 must be
// written with dumpJson, which replaces their bad bytes instead of raising.
nlohmann::ordered_json syncResultJson(const SyncResult& result);
// {"domain","code","message"}, or null.
nlohmann::ordered_json errorJson(const ErrorPtr& error);
// One line; reals round-trip. indent < 0: no line breaks.
std::string dumpJson(const nlohmann::ordered_json& json, int indent = -1);

}  // namespace kx
