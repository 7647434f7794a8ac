#include "daemon/SyncJson.h"

namespace kx {

using Json = nlohmann::ordered_json;

Json errorJson(const ErrorPtr& error) {
  if (!error) return nullptr;
  return Json{{"domain", error->domain()},
              {"code", error->code()},
              {"message", error->message().empty() ? error->description() : error->message()}};
}

Json syncResultJson(const SyncResult& result) {
  Json failed = Json::array();
  for (const SyncFailure& failure : result.failed) {
    failed.push_back(Json{{"uuid", failure.uuid},
                          {"domain", failure.domain},
                          {"code", failure.code},
                          {"reason", failure.reason}});
  }
  return Json{{"outcome", syncOutcomeName(result.outcome)},
              {"resync", result.resync},
              {"requested", result.requested},
              {"imported", result.imported},
              {"failed", std::move(failed)},
              {"deletedAssets", result.deletedAssets},
              {"updatedAssets", result.updatedAssets},
              {"albumsCreated", result.albumsCreated},
              {"albumsDeleted", result.albumsDeleted},
              {"albumsRenamed", result.albumsRenamed},
              {"seconds", result.seconds},
              {"error", errorJson(result.error)}};
}

std::string dumpJson(const Json& json, int indent) {
  return json.dump(indent, ' ', false, Json::error_handler_t::replace);
}

}  // namespace kx
