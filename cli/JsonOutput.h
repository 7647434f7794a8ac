#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "host/HostLibrary.h"
#include "platform/foundation/Error.h"

namespace kx::cli {

// What --json prints when a command fails: for `sync`, `plan` and `restore` the result with the
// outcome "failed", for every other command {"error": {"domain","code","message"}}. One line with
// its line break.
std::string failureJson(const std::string& command, const ErrorPtr& error);

// [{"path","text"}, ...]
nlohmann::ordered_json hostProblemsJson(const std::vector<HostProblem>& problems);

// One line of JSON with its line break; text that is no UTF-8 is replaced.
std::string jsonLine(const nlohmann::ordered_json& json);

}  // namespace kx::cli
