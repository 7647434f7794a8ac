#include "host/PreviousSnapshot.h"

#include <cmath>
#include <exception>
#include <utility>

#include "platform/foundation/PropertyList.h"
#include "records/TransportKeys.h"

namespace kx {

namespace {

std::string textAt(const Value& dictionary, std::string_view key) {
  return std::string(dictionary[key].asString(key).value_or(""));
}

std::optional<double> realAt(const Value& dictionary, std::string_view key) {
  const std::optional<Number> number = dictionary[key].asNumber(key);
  if (!number || !std::isfinite(number->doubleValue())) return std::nullopt;
  return number->doubleValue();
}

}  // namespace

PreviousSnapshot::PreviousSnapshot(const DataPtr& bytes, const std::string& libraryUUID,
                                   const std::unordered_set<std::string>& assetUUIDs) {
  if (bytes == nullptr) return;
  try {
    const Value root = readPropertyList(bytes, nullptr);
    if (!root.isDictionary() || textAt(root, kKXSTransportLibraryUUIDKey) != libraryUUID) return;
    const auto updates = root[kKXSTransportUpdatesKey].asArray(kKXSTransportUpdatesKey);
    if (!updates) return;
    for (std::size_t index = 0; index < updates->size(); ++index)
      take((*updates)[index], assetUUIDs);
  } catch (const std::exception&) {
    assets_.clear();
  }
}

void PreviousSnapshot::take(const Value& item, const std::unordered_set<std::string>& assetUUIDs) {
  std::string uuid = textAt(item, kKXSItemUUIDKey);
  const std::string type = textAt(item, kKXSTransportItemTypeKey);
  if (type == kKXSTransportAssetItemType) {
    if (assetUUIDs.contains(uuid)) assets_.emplace(std::move(uuid), item);
    return;
  }
  const std::string_view name =
      type == kKXSTransportEventItemType ? kKXSEventNameKey : kKXSAlbumNameKey;
  names_.emplace(std::move(uuid), textAt(item, name));
}

std::optional<FolderAsset> PreviousSnapshot::asset(const std::string& uuid,
                                                   const ScannedFile& file) const {
  const auto found = assets_.find(uuid);
  if (found == assets_.end()) return std::nullopt;
  try {
    return recorded(found->second, file);
  } catch (const std::exception&) {
    return std::nullopt;
  }
}

std::optional<FolderAsset> PreviousSnapshot::recorded(const Value& record,
                                                      const ScannedFile& file) const {
  const std::optional<double> modified = realAt(record, kKXSAssetModificationDateKey);
  const auto event = names_.find(textAt(record, kKXSAssetEventUUIDKey));
  if (!modified || event == names_.end()) return std::nullopt;
  const Value properties = record[kKXSAssetPropertiesKey];

  FolderAsset asset;
  asset.file = file;
  asset.type = contentTypeOfName(file.path);
  if (!asset.type.isMedia()) asset.type = contentTypeOfName("");
  asset.type.isVideo = record[kKXSAssetIsVideoKey]
                           .asNumber(kKXSAssetIsVideoKey)
                           .value_or(Number::boolean(false))
                           .boolValue();
  asset.recorded = RecordedFacts{*modified, realAt(record, kKXSAssetExposureDateKey), event->second,
                                 properties[kKXSAssetPropertiesFilePropertiesKey]};
  const auto latitude = realAt(record, kKXSAssetLatitudeKey);
  const auto longitude = realAt(record, kKXSAssetLongitudeKey);
  if (latitude && longitude) asset.metadata.place = Place{*latitude, *longitude};
  if (const auto rating = realAt(record, kKXSAssetRatingKey); rating && std::abs(*rating) <= 5)
    asset.metadata.rating = static_cast<int>(*rating);
  asset.metadata.caption = textAt(record, kKXSAssetCaptionKey);
  asset.metadata.imageProperties = properties[kKXSAssetPropertiesImagePropertiesKey];
  if (const auto faces = record[kKXSAssetFacesKey].asArray(kKXSAssetFacesKey)) {
    for (std::size_t index = 0; index < faces->size(); ++index) {
      const Value face = (*faces)[index];
      const auto rect = rectFromDictionary(face[kKXSAssetFaceRectangleKey]);
      if (!rect) return std::nullopt;
      const auto person = names_.find(textAt(face, kKXSAssetFaceAlbumUUIDKey));
      asset.metadata.faces.push_back({person == names_.end() ? "" : person->second, *rect});
    }
  }
  return asset;
}

}  // namespace kx
