#include "cli/JsonOutput.h"

#include "daemon/RestoreJson.h"
#include "daemon/SyncJson.h"

namespace kx::cli {

std::string failureJson(const std::string& command, const ErrorPtr& error) {
  if (command == "sync" || command == "plan") {
    SyncResult result;
    result.error = error;
    return jsonLine(syncResultJson(result));
  }
  if (command == "restore") {
    RestoreResult result;
    result.error = error;
    return jsonLine(restoreResultJson(result));
  }
  nlohmann::ordered_json json;
  json["error"] = errorJson(error);
  return jsonLine(json);
}

nlohmann::ordered_json hostProblemsJson(const std::vector<HostProblem>& problems) {
  nlohmann::ordered_json json = nlohmann::ordered_json::array();
  for (const HostProblem& problem : problems) {
    json.push_back({{"path", problem.path}, {"text", problem.text}});
  }
  return json;
}

std::string jsonLine(const nlohmann::ordered_json& json) { return dumpJson(json) + "\n"; }

}  // namespace kx::cli
