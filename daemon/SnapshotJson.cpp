#include "daemon/SnapshotJson.h"

#include <string>
#include <utility>

#include "daemon/PlistJson.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

Json textJson(OptionalString text) { return text ? Json(std::string(*text)) : Json(); }

}  // namespace

template <typename Map>
Json itemMapJson(const std::shared_ptr<Map>& items) {
  if (!items) return nullptr;
  // Keys of a map differ, so each goes to the end without a look-up.
  Json::object_t entries;
  entries.reserve(items->size());
  for (const auto& entry : *items) {
    entries.std::vector<Json::object_t::value_type>::emplace_back(
        std::string(entry.key.stringValue()), plistJson(entry.value->propertyList()));
  }
  return entries;
}

template Json itemMapJson(const std::shared_ptr<KXSItemMap>& items);
template Json itemMapJson(const std::shared_ptr<KXSAssetMap>& items);

Json snapshotJson(const KXSLibraryChangeSnapshot& snapshot) {
  Json ordered;
  if (const KXSItemListPtr& albums = snapshot.orderedAlbums()) {
    ordered = Json::array();
    for (const KXSItemPtr& item : *albums) ordered.push_back(plistJson(item->propertyList()));
  }
  Json json;
  json["libraryUUID"] = textJson(snapshot.libraryUUID());
  json["libraryKind"] = textJson(snapshot.libraryKind());
  json["isFolderSync"] = snapshot.isFolderSync();
  json["orderedAlbums"] = std::move(ordered);
  json["assets"] = itemMapJson(snapshot.assetsByUUID());
  json["deletes"] = itemMapJson(snapshot.deletes());
  return json;
}

}  // namespace kx
