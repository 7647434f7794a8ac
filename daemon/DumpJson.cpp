#include "daemon/DumpJson.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

Json optionalText(const std::optional<std::string>& text) { return text ? Json(*text) : Json(); }

Json optionalDate(const std::optional<Date>& date) {
  return date ? Json(date->secondsSinceReference) : Json();
}

Json pendingJson(const DeviceDump::Pending& pending) {
  return Json{{"pendingItemsType", pending.type}, {"pendingItemsCount", pending.count}};
}

Json containersJson(const std::vector<DeviceDump::Container>& containers) {
  Json list = Json::array();
  for (const DeviceDump::Container& container : containers) {
    Json entry{{"uuid", container.uuid},
               {"title", optionalText(container.title)},
               {"kind", container.kind},
               {"pendingItemsType", container.pending.type},
               {"pendingItemsCount", container.pending.count}};
    entry["assets"] = container.assets;
    list.push_back(std::move(entry));
  }
  return list;
}

Json facesJson(const std::vector<DeviceDump::Face>& faces) {
  Json list = Json::array();
  for (const DeviceDump::Face& face : faces) {
    const Rect& rect = face.relativeRect;
    list.push_back(Json{{"identifier", face.identifier},
                        {"relativeRect", Json::array({rect.x, rect.y, rect.width, rect.height})},
                        {"albumUUID", optionalText(face.albumUUID)}});
  }
  return list;
}

Json assetJson(const DeviceDump::Asset& asset) {
  Json location;
  if (asset.location) {
    location = Json::array({asset.location->latitude, asset.location->longitude});
  }
  Json entry{{"savedAssetType", asset.savedAssetType},
             {"isVideo", asset.isVideo},
             {"creationDate", optionalDate(asset.creationDate)},
             {"modificationDate", optionalDate(asset.modificationDate)},
             {"sortToken", asset.sortToken ? Json(*asset.sortToken) : Json()},
             {"location", std::move(location)},
             {"originalFileName", optionalText(asset.originalFileName)},
             {"faces", facesJson(asset.faces)},
             {"path", asset.path},
             {"size", asset.size},
             {"incomplete", asset.incomplete}};
  if (asset.sha256) entry["sha256"] = *asset.sha256;
  return entry;
}

}  // namespace

Json deviceDumpJson(const DeviceDump& dump) {
  // Pushed, since looking a key up in an ordered object is linear in its size.
  Json::object_t assets;
  for (const DeviceDump::Asset& asset : dump.assets) {
    assets.push_back({asset.uuid, assetJson(asset)});
  }
  Json agent;
  if (dump.syncAgent) {
    agent = Json{{"userAgent", optionalText(dump.syncAgent->userAgent)},
                 {"libraryKind", optionalText(dump.syncAgent->libraryKind)}};
  }
  return Json{{"albums", containersJson(dump.albums)},
              {"events", containersJson(dump.events)},
              {"faceAlbums", containersJson(dump.faceAlbums)},
              {"assets", Json(std::move(assets))},
              {"camera", pendingJson(dump.camera)},
              {"syncProgress", pendingJson(dump.syncProgress)},
              {"otaRestoreProgress", pendingJson(dump.otaRestoreProgress)},
              {"currentLibraryUUID", optionalText(dump.currentLibraryUUID)},
              {"syncAgent", std::move(agent)},
              {"lastSynced", dump.lastSynced}};
}

}  // namespace kx
