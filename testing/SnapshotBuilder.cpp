#include "testing/SnapshotBuilder.h"

#include <stdexcept>

#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

Value optionalText(const std::optional<std::string>& text) {
  return text ? Value::string(*text) : Value();
}

Value optionalReal(const std::optional<double>& number) {
  return number ? Value::real(*number) : Value();
}

Value texts(const std::vector<std::string>& all) {
  Array array;
  for (const std::string& text : all) array.push_back(Value::string(text));
  return Value::array(std::move(array));
}

Value faceDictionary(const SnapshotBuilder::Face& face) {
  Dictionary dictionary;
  dictionary.setIfPresent(kKXSAssetFaceAlbumUUIDKey, optionalText(face.albumUUID));
  dictionary.set(kKXSAssetFaceIndexKey, Value::integer(face.index));
  dictionary.set(kKXSAssetFaceRectangleKey,
                 Value::dictionary({{"X", Value::real(face.x)},
                                    {"Y", Value::real(face.y)},
                                    {"Width", Value::real(face.width)},
                                    {"Height", Value::real(face.height)}}));
  return Value::dictionary(std::move(dictionary));
}

}  // namespace

SnapshotBuilder& SnapshotBuilder::library(std::optional<std::string> uuid,
                                          std::optional<std::string> kind) {
  libraryUUID_ = std::move(uuid);
  libraryKind_ = std::move(kind);
  return *this;
}

SnapshotBuilder& SnapshotBuilder::userAgent(std::string agent) {
  userAgent_ = std::move(agent);
  return *this;
}

SnapshotBuilder& SnapshotBuilder::asset(const Asset& asset) {
  Dictionary dictionary;
  dictionary.set(kKXSItemUUIDKey, Value::string(asset.uuid));
  dictionary.set(kKXSTransportItemTypeKey, Value::string(kKXSTransportAssetItemType));
  dictionary.set(kKXSAssetIsVideoKey, Value::boolean(asset.isVideo));
  dictionary.setIfPresent(kKXSAssetExposureDateKey, optionalReal(asset.exposureDate));
  dictionary.setIfPresent(kKXSAssetModificationDateKey, optionalReal(asset.modificationDate));
  dictionary.setIfPresent(kKXSAssetLatitudeKey, optionalReal(asset.latitude));
  dictionary.setIfPresent(kKXSAssetLongitudeKey, optionalReal(asset.longitude));
  dictionary.setIfPresent(kKXSAssetCaptionKey, optionalText(asset.caption));
  dictionary.setIfPresent(kKXSAssetEventUUIDKey, optionalText(asset.eventUUID));
  dictionary.setIfPresent(kKXSAssetOriginalFileNameKey, optionalText(asset.originalFileName));
  Array faces;
  for (const Face& face : asset.faces) faces.push_back(faceDictionary(face));
  dictionary.set(kKXSAssetFacesKey, Value::array(std::move(faces)));
  return item(Value::dictionary(std::move(dictionary)));
}

SnapshotBuilder& SnapshotBuilder::asset(std::string uuid) {
  Asset plain;
  plain.uuid = std::move(uuid);
  return asset(plain);
}

SnapshotBuilder& SnapshotBuilder::album(std::string uuid, std::optional<std::string> name,
                                        std::vector<std::string> assets, std::int64_t subclass) {
  Dictionary dictionary;
  dictionary.set(kKXSItemUUIDKey, Value::string(uuid));
  dictionary.set(kKXSTransportItemTypeKey, Value::string(kKXSTransportAlbumItemType));
  dictionary.setIfPresent(kKXSAlbumNameKey, optionalText(name));
  dictionary.set(kKXSAlbumAssetUUIDsKey, texts(assets));
  dictionary.set(kKXSAlbumSubclassKey, Value::integer(subclass));
  return item(Value::dictionary(std::move(dictionary)));
}

SnapshotBuilder& SnapshotBuilder::event(std::string uuid, std::optional<std::string> name) {
  Dictionary dictionary;
  dictionary.set(kKXSItemUUIDKey, Value::string(uuid));
  dictionary.set(kKXSTransportItemTypeKey, Value::string(kKXSTransportEventItemType));
  dictionary.setIfPresent(kKXSEventNameKey, optionalText(name));
  return item(Value::dictionary(std::move(dictionary)));
}

SnapshotBuilder& SnapshotBuilder::masterAlbum(std::vector<std::string> assets, std::string uuid) {
  return album(std::move(uuid), "Library", std::move(assets), kMasterAlbum);
}

SnapshotBuilder& SnapshotBuilder::item(Value dictionary) {
  updates_.push_back(std::move(dictionary));
  return *this;
}

Value SnapshotBuilder::root() const {
  Dictionary root;
  root.setIfPresent(kKXSTransportLibraryUUIDKey, optionalText(libraryUUID_));
  root.setIfPresent(kKXSTransportLibraryKindKey, optionalText(libraryKind_));
  root.setIfPresent("TesselUserAgent", optionalText(userAgent_));
  root.set(kKXSTransportUpdatesKey, Value::array(updates_));
  root.set(kKXSTransportDeletesKey, Value::array({}));
  return Value::dictionary(std::move(root));
}

std::vector<std::uint8_t> SnapshotBuilder::bytes() const {
  ErrorPtr error;
  std::vector<std::uint8_t> written =
      writePropertyList(root(), PropertyListFormat::kBinary, &error);
  if (written.empty()) throw std::runtime_error(error ? error->description() : "no bytes");
  return written;
}

void SnapshotBuilder::write(FileSystem& files, const std::string& path) const {
  files.writeFileAtomically(path, bytes(), nullptr);
}

}  // namespace kx
