#include <memory>
#include <utility>

#include "daemon/PlistJson.h"
#include "daemon/drive/DriveSession.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

// Requests that outstandingAssetTransfers has listed stay addressable for the session's life,
// unless there are more than so many.
using KnownRequests = std::map<std::string, FRAssetPtr>;
constexpr std::size_t kMostKnown = 1'000'000;

Json requestJson(const FRAsset& request) {
  return {{"identifier", request.identifier()},
          {"dataclass", request.dataclass()},
          {"prettyName", request.prettyName() ? Json(*request.prettyName()) : Json()},
          {"path", request.path() ? Json(*request.path()) : Json()},
          {"isDownload", request.isDownload()},
          {"isRestore", request.isRestore()}};
}

// A known request, or a new one that is in no list.
FRAssetPtr requestFor(const DriveArguments& arguments, const KnownRequests& known) {
  const std::string identifier = arguments.string("identifier");
  FRAssetPtr request;
  if (arguments.boolean("unknown", false)) {
    request = FRAsset::downloadAssetWithIdentifier(identifier, "Photo", std::nullopt);
    request->setIsRestore(arguments.boolean("isRestore", false));
  } else {
    const auto found = known.find(identifier);
    if (found == known.end()) {
      throw DriveException(kUnknownRequest,
                           "no request \"" + identifier + "\" was ever listed as outstanding");
    }
    request = found->second;
  }
  request->setIsDownload(arguments.boolean("isDownload", true));
  if (arguments.names("path")) request->setPath(arguments.optionalString("path"));
  return request;
}

DriveAnswer assetTransfer(DriveSession& session, const KnownRequests& known,
                          const DriveArguments& arguments) {
  const bool succeeded = arguments.boolean("succeeded", true);
  const ErrorPtr error = arguments.optionalError("error");
  const FRAssetPtr request = requestFor(arguments, known);
  session.client().assetTransfer(request, succeeded, error);
  return {};
}

DriveAnswer pathsToBackup(DriveSession& session, const DriveArguments& arguments) {
  StringList toBackup;
  StringList notToBackup = arguments.optionalStrings("pathsNotToBackup").value_or(StringList());
  session.client().pathsToBackup(&toBackup, &notToBackup);
  return {{{"pathsToBackup", toBackup}, {"pathsNotToBackup", notToBackup}}, nullptr};
}

void addSyncCalls(DriveSession& session, DriveCallTable& table) {
  table["supportedDataclasses"] = {
      DriveLane::kPlugin, [&session](const DriveArguments&) {
        return DriveAnswer{session.client().supportedDataclasses(), nullptr};
      }};
  table["currentSyncAnchor"] = {DriveLane::kPlugin, [&session](const DriveArguments&) {
                                  return DriveAnswer{session.client().currentSyncAnchor(), nullptr};
                                }};
  table["prepareForSync"] = {DriveLane::kPlugin, [&session](const DriveArguments& arguments) {
                               const std::string anchor =
                                   arguments.optionalString("hostAnchor").value_or("");
                               session.device().health().reset();
                               DriveAnswer answer;
                               answer.result = session.client().prepareForSyncWithHostAnchor(
                                   anchor, nullptr, &answer.error);
                               return answer;
                             }};
  table["reconcileSync"] = {
      DriveLane::kPlugin, [&session](const DriveArguments& arguments) {
        const auto type =
            static_cast<std::uint32_t>(arguments.integerWithin("type", 0, UINT32_MAX, 0));
        const std::string anchor = arguments.optionalString("newAnchor").value_or("");
        DriveAnswer answer;
        answer.result = session.client().reconcileSync(type, anchor, nullptr, &answer.error);
        return answer;
      }};
}

void addTransferCalls(DriveSession& session, DriveCallTable& table) {
  const auto known = std::make_shared<KnownRequests>();
  table["outstandingAssetTransfers"] = {
      DriveLane::kPlugin, [&session, known](const DriveArguments&) {
        DriveAnswer answer;
        answer.result = Json::array();
        if (known->size() > kMostKnown) known->clear();
        for (const FRAssetPtr& request : session.client().outstandingAssetTransfers()) {
          (*known)[request->identifier()] = request;
          answer.result.push_back(requestJson(*request));
        }
        return answer;
      }};
  table["assetTransfer"] = {DriveLane::kPlugin, [&session, known](const DriveArguments& arguments) {
                              return assetTransfer(session, *known, arguments);
                            }};
  table["assetTransferEnded"] = {
      DriveLane::kPlugin, [&session](const DriveArguments& arguments) {
        session.client().assetTransferEndedWithSuccess(arguments.boolean("success", true));
        return DriveAnswer();
      }};
  table["syncEnded"] = {DriveLane::kPlugin, [&session](const DriveArguments& arguments) {
                          session.client().syncEndedWithSuccess(arguments.boolean("success", true));
                          return DriveAnswer();
                        }};
  table["restoreEnded"] = {
      DriveLane::kPlugin, [&session](const DriveArguments& arguments) {
        session.client().restoreEndedWithError(arguments.optionalError("error"));
        return DriveAnswer();
      }};
}

}  // namespace

void addClientCalls(DriveSession& session, DriveCallTable& table) {
  addSyncCalls(session, table);
  addTransferCalls(session, table);
  table["pathsToBackup"] = {DriveLane::kPlugin, [&session](const DriveArguments& arguments) {
                              return pathsToBackup(session, arguments);
                            }};
  table["installedAssetMetrics"] = {
      DriveLane::kPlugin, [&session](const DriveArguments&) {
        return DriveAnswer{plistJson(session.client().installedAssetMetrics()), nullptr};
      }};
  table["prepareForSync"].waitsForSaver = true;
  for (const char* call : {"prepareForSync", "reconcileSync"}) {
    table[call].mayRunOnMainThread = true;
  }
  table["assetTransferEnded"].waitsForSaver = true;
  table["client.new"] = {DriveLane::kConsole,
                         [&session](const DriveArguments&) {
                           session.renewClient();
                           return DriveAnswer();
                         },
                         true};
}

}  // namespace kx
