#include "daemon/RestoreJson.h"

#include "daemon/SyncJson.h"

namespace kx {

using Json = nlohmann::ordered_json;

Json restoreResultJson(const RestoreResult& result) {
  Json failed = Json::array();
  for (const RestoreFailure& failure : result.failed) {
    failed.push_back(Json{{"path", failure.path},
                          {"domain", failure.domain},
                          {"code", failure.code},
                          {"reason", failure.reason}});
  }
  return Json{{"outcome", restoreOutcomeName(result.outcome)},
              {"library", restoreLibraryName(result.library)},
              {"requested", result.requested},
              {"restored", result.restored},
              {"present", result.present},
              {"failed", std::move(failed)},
              {"registered", result.registered},
              {"albumsCreated", result.albumsCreated},
              {"seconds", result.seconds},
              {"error", errorJson(result.error)}};
}

}  // namespace kx
