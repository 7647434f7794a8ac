#include <utility>

#include "daemon/DumpJson.h"
#include "daemon/PlistJson.h"
#include "daemon/drive/DriveSession.h"
#include "device/DeviceLayout.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

template <typename T>
Json orNull(const std::optional<T>& value) {
  return value ? Json(*value) : Json();
}

Json orNull(const std::optional<Date>& date) {
  return date ? Json(date->secondsSinceReference) : Json();
}

DriveAnswer dump(DriveSession& session, const DriveArguments& arguments) {
  const bool hash = arguments.boolean("hash", false);
  if (!session.platform().saver().isHolding()) session.device().drain();
  ErrorPtr error;
  const DeviceDump content = session.device().dump(hash, &error);
  if (error) return {Json(), error};
  return {deviceDumpJson(content), nullptr};
}

DriveAnswer paths(DriveSession& session) {
  KXPhotoLibraryFramework& framework = session.platform().photoLibrary();
  return {{{"dcim", framework.dcimDirectory()},
           {"photoData", framework.photoDataDirectory()},
           {"caches", framework.photoDataCachesDirectory()},
           {"cascades", framework.cascadesDataDirectory()},
           {"syncedAssets", framework.tesselSyncedAssetsDirectory()},
           {"faceThumbnails", framework.tesselSyncedFaceAlbumThumbnailsDirectory()},
           {"assetOrder", framework.pathToAssetAlbumOrderStructure()},
           {"syncInfo", framework.syncInfoPath()},
           {"restoreContext", device_paths::kRestoreContext},
           {"currentLibraryUUID", device_paths::kCurrentLibraryUUID},
           {"lastSynced", device_paths::kLastSynced},
           {"snapshot", device_paths::kSnapshot}},
          nullptr};
}

// Album URIs as the UUIDs of their containers; a URI without one stays as it is.
std::map<std::string, std::string> containersByURI(DriveSession& session) {
  std::map<std::string, std::string> containers;
  session.inLibrary(false, [&](KXPhotoLibrary& library) {
    for (const KXGenericAlbumPtr& album : library.albumsOfKinds(
             {kKXAlbumKindSyncedAlbum, kKXAlbumKindSyncedEvent, kKXAlbumKindSyncedFaceAlbum})) {
      if (const OptionalString uuid = album->uuid()) {
        containers[album->objectID().URIRepresentation()] = std::string(*uuid);
      }
    }
  });
  return containers;
}

Json albumsJson(const std::optional<std::vector<std::string>>& uris,
                const std::map<std::string, std::string>& containers) {
  if (!uris) return Json();
  Json albums = Json::array();
  for (const std::string& uri : *uris) {
    const auto found = containers.find(uri);
    albums.push_back(found == containers.end() ? uri : found->second);
  }
  return albums;
}

Json jobJson(const FaultySaver::Job& job, const std::map<std::string, std::string>& containers) {
  const KXSyncSaveJob::Fields& fields = job.fields;
  return {
      {"originalAssetURL",
       fields.originalAssetPath ? Json("file://" + *fields.originalAssetPath) : Json()},
      {"isVideo", fields.isVideo},
      {"uuid", orNull(fields.uuid)},
      {"location",
       fields.location ? Json({fields.location->latitude, fields.location->longitude}) : Json()},
      {"facesInfo", plistJson(fields.facesInfo)},
      {"creationDate", orNull(fields.creationDate)},
      {"modificationDate", orNull(fields.modificationDate)},
      {"sortToken", orNull(fields.sortToken)},
      {"originalFileName", orNull(fields.originalFileName)},
      {"albumURIs", albumsJson(fields.albumURIs, containers)},
      {"isSyncComplete", fields.isSyncComplete},
      {"cleanupSyncState", fields.cleanupSyncState},
      {"cleanupBeforeDate", orNull(fields.cleanupBeforeDate)},
      {"hasFinishedBlock", job.hasFinishedBlock}};
}

// A list with a gap would say what never happened.
void refuseGaps(std::size_t forgotten, const char* what) {
  if (forgotten == 0) return;
  throw DriveException("TooManyKept",
                       "nobody took the record for too long: " + std::to_string(forgotten) + " " +
                           what + " have left it, and it begins anew");
}

DriveAnswer jobs(DriveSession& session) {
  const FaultySaver::Record taken = session.platform().saver().takeBatches();
  refuseGaps(taken.forgotten, "batches");
  const std::map<std::string, std::string> containers = containersByURI(session);
  Json batches = Json::array();
  for (const FaultySaver::Batch& batch : taken.batches) {
    Json list = Json::array();
    for (const FaultySaver::Job& job : batch) list.push_back(jobJson(job, containers));
    batches.push_back(std::move(list));
  }
  return {std::move(batches), nullptr};
}

DriveAnswer porterCalls(DriveSession& session) {
  const ObservedPorter::Record taken = session.platform().porter().takeCalls();
  refuseGaps(taken.forgotten, "calls");
  Json calls = Json::array();
  for (const ObservedPorter::Call& call : taken.calls) {
    if (call.isUpdate) {
      calls.push_back({"updateRestoredAsset", orNull(call.uuid), call.paths});
    } else {
      calls.push_back({"finalizeOTARestore", call.recreateAlbums});
    }
  }
  return {std::move(calls), nullptr};
}

DriveAnswer counters(DriveSession& session) {
  const DeviceCounters counted = session.device().takeCounters();
  return {{{"listSorts", counted.listSorts},
           {"rowsWritten", counted.rowsWritten},
           {"statements", counted.statements}},
          nullptr};
}

}  // namespace

void addDeviceCalls(DriveSession& session, DriveCallTable& table) {
  table["device.dump"] = {DriveLane::kConsole, [&session](const DriveArguments& arguments) {
                            return dump(session, arguments);
                          }};
  table["device.paths"] = {DriveLane::kConsole,
                           [&session](const DriveArguments&) { return paths(session); }};
  table["device.jobs"] = {DriveLane::kConsole,
                          [&session](const DriveArguments&) { return jobs(session); }};
  table["device.porterCalls"] = {
      DriveLane::kConsole, [&session](const DriveArguments&) { return porterCalls(session); }};
  table["device.counters"] = {DriveLane::kConsole,
                              [&session](const DriveArguments&) { return counters(session); }};
  addDeviceFileCalls(session, table);
  addDeviceLibraryCalls(session, table);
}

}  // namespace kx
