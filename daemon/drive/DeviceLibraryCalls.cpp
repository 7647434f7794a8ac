#include <limits>
#include <utility>

#include "daemon/drive/DriveSession.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;
constexpr std::int64_t kInt32Max = std::numeric_limits<std::int32_t>::max();
constexpr std::int64_t kInt32Min = std::numeric_limits<std::int32_t>::min();
constexpr std::int64_t kUint32Max = std::numeric_limits<std::uint32_t>::max();

std::int32_t int32(const DriveArguments& arguments, const char* key, std::int64_t fallback) {
  return static_cast<std::int32_t>(arguments.integerWithin(key, kInt32Min, kInt32Max, fallback));
}

std::optional<Date> dateOf(const std::optional<double>& seconds) {
  if (!seconds) return std::nullopt;
  return Date{*seconds};
}

std::optional<Coordinate> coordinate(const DriveArguments& arguments) {
  const auto numbers = arguments.optionalReals("location", 2);
  if (!numbers) return std::nullopt;
  return Coordinate{(*numbers)[0], (*numbers)[1]};
}

std::vector<DeviceFace> faces(const DriveArguments& arguments) {
  std::vector<DeviceFace> list;
  const Json* array = arguments.optionalArray("faces");
  if (array == nullptr) return list;
  for (const Json& element : *array) {
    if (!element.is_object()) throw DriveException(kBadArgument, "a face must be an object");
    const DriveArguments face(element, "faces");
    DeviceFace made;
    made.identifier = static_cast<std::uint16_t>(
        face.integerWithin("identifier", 0, std::numeric_limits<std::uint16_t>::max(), 0));
    if (const auto rect = face.optionalReals("relativeRect", 4)) {
      made.relativeRect = {(*rect)[0], (*rect)[1], (*rect)[2], (*rect)[3]};
    }
    made.albumUUID = face.optionalString("albumUUID");
    list.push_back(std::move(made));
  }
  return list;
}

std::vector<std::int64_t> integers(const DriveArguments& arguments, const char* key) {
  std::vector<std::int64_t> numbers;
  const Json* array = arguments.optionalArray(key);
  if (array == nullptr) return numbers;
  for (const Json& element : *array) {
    const bool fits = element.is_number_integer() &&
                      !(element.is_number_unsigned() &&
                        element.get<std::uint64_t>() >
                            static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()));
    if (!fits) {
      throw DriveException(
          kBadArgument, "argument \"" + std::string(key) + "\": expected array of 64-bit integers");
    }
    numbers.push_back(element.get<std::int64_t>());
  }
  return numbers;
}

void raise(const ErrorPtr& error) {
  throw DriveException("DeviceError", error ? error->description() : "the device refused");
}

DriveAnswer addAsset(DriveSession& session, const DriveArguments& arguments) {
  NewDeviceAsset asset;
  asset.uuid = arguments.string("uuid");
  asset.path = arguments.string("path");
  asset.savedAssetType = int32(arguments, "savedAssetType", 0);
  asset.isVideo = arguments.boolean("isVideo", false);
  asset.creationDate = dateOf(arguments.optionalReal("creationDate"));
  asset.modificationDate = dateOf(arguments.optionalReal("modificationDate"));
  asset.sortToken = arguments.optionalReal("sortToken");
  asset.location = coordinate(arguments);
  asset.faces = faces(arguments);
  asset.originalFileName = arguments.optionalString("originalFileName");
  asset.originalFileSize = arguments.optionalInteger("originalFilesize");
  asset.sidecarSizes = integers(arguments, "sidecarSizes");
  asset.files = arguments.optionalStrings("files").value_or(std::vector<std::string>());
  asset.incomplete = arguments.boolean("incomplete", false);
  ErrorPtr error;
  if (!session.device().admin().addAsset(asset, &error)) raise(error);
  return {};
}

DriveAnswer addAlbum(DriveSession& session, const DriveArguments& arguments) {
  NewDeviceAlbum album;
  album.uuid = arguments.string("uuid");
  album.title = arguments.optionalString("title");
  album.kind = int32(arguments, "kind", album.kind);
  album.assets = arguments.optionalStrings("assets").value_or(std::vector<std::string>());
  if (arguments.has("index")) {
    album.index = static_cast<std::size_t>(arguments.integerWithin("index", 0, kInt32Max, 0));
  }
  album.inList = arguments.boolean("inList", true);
  album.managed = arguments.boolean("managed", true);
  album.pendingItemsType = int32(arguments, "pendingItemsType", 1);
  album.pendingItemsCount =
      static_cast<std::uint32_t>(arguments.integerWithin("pendingItemsCount", 0, kUint32Max, 0));
  ErrorPtr error;
  if (!session.device().admin().addAlbum(album, &error)) raise(error);
  return {};
}

DriveAnswer removeAsset(DriveSession& session, const DriveArguments& arguments) {
  ErrorPtr error;
  if (!session.device().admin().removeAsset(arguments.string("uuid"), &error)) raise(error);
  return {};
}

DeviceAssetFields assetFields(const DriveArguments& fields) {
  DeviceAssetFields set;
  set.uuid = fields.optionalString("uuid");
  set.path = fields.optionalString("path");
  if (set.path && DeviceRoot::checkPath(*set.path) != 0) {
    throw DriveException(kBadArgument, "argument \"fields.path\" is no device path");
  }
  if (fields.has("savedAssetType")) set.savedAssetType = int32(fields, "savedAssetType", 0);
  if (fields.has("isVideo")) set.isVideo = fields.boolean("isVideo", false);
  if (fields.has("incomplete")) set.incomplete = fields.boolean("incomplete", false);
  if (fields.names("creationDate")) set.creationDate = dateOf(fields.optionalReal("creationDate"));
  if (fields.names("modificationDate")) {
    set.modificationDate = dateOf(fields.optionalReal("modificationDate"));
  }
  if (fields.names("sortToken")) set.sortToken = fields.optionalReal("sortToken");
  if (fields.names("location")) set.location = coordinate(fields);
  if (fields.names("originalFileName")) {
    set.originalFileName = fields.optionalString("originalFileName");
  }
  if (fields.has("faces")) set.faces = faces(fields);
  return set;
}

void setAlbumFields(KXGenericAlbum& album, const DriveArguments& fields) {
  if (fields.names("title")) {
    const std::optional<std::string> title = fields.optionalString("title");
    album.setTitle(title ? OptionalString(*title) : OptionalString());
  }
  if (fields.has("uuid")) album.setUuid(fields.string("uuid"));
  if (fields.has("kind")) album.setKindValue(int32(fields, "kind", 0));
  if (fields.has("pendingItemsType")) {
    album.setPendingItemsType(int32(fields, "pendingItemsType", 1));
  }
  if (fields.has("pendingItemsCount")) {
    album.setPendingItemsCount(
        static_cast<std::uint32_t>(fields.integerWithin("pendingItemsCount", 0, kUint32Max, 0)));
  }
}

KXGenericAlbumPtr albumNamed(KXPhotoLibrary& library, const std::string& entity,
                             const std::string& uuid) {
  if (entity == "album") return library.albumWithUUID(uuid);
  if (entity == "camera") return library.shoeboxAlbum();
  if (entity == "syncProgress") return library.syncProgressAlbum();
  if (entity == "otaRestoreProgress") return library.otaRestoreProgressAlbum();
  throw DriveException(kBadArgument, "unknown entity \"" + entity + "\"");
}

DriveAnswer set(DriveSession& session, const DriveArguments& arguments) {
  const std::string entity = arguments.string("entity");
  const bool hasUUID = entity == "asset" || entity == "album";
  const std::string uuid = hasUUID ? arguments.string("uuid") : std::string();
  const DriveArguments fields(arguments.object("fields"), "fields");
  session.inLibrary(arguments.boolean("save", true), [&](KXPhotoLibrary& library) {
    if (entity == "asset") {
      const DeviceAssetFields changed = assetFields(fields);
      if (session.device().admin().setAssetFields(library, uuid, changed)) return;
    } else if (const KXGenericAlbumPtr album = albumNamed(library, entity, uuid)) {
      setAlbumFields(*album, fields);
      return;
    }
    throw DriveException(kBadArgument, "no " + entity + " \"" + uuid + "\"");
  });
  return {};
}

DriveAnswer touch(DriveSession& session, const DriveArguments& arguments) {
  const std::string entity = arguments.string("entity");
  const std::vector<std::string> uuids = arguments.strings("uuids");
  if (entity != "asset" && entity != "album") {
    throw DriveException(kBadArgument, "unknown entity \"" + entity + "\"");
  }
  session.inLibrary(false, [&](KXPhotoLibrary& library) {
    for (const std::string& uuid : uuids) {
      const bool found = entity == "asset" ? library.assetWithUUID(uuid) != nullptr
                                           : library.albumWithUUID(uuid) != nullptr;
      if (!found) throw DriveException(kBadArgument, "no " + entity + " \"" + uuid + "\"");
    }
  });
  return {};
}

}  // namespace

void addDeviceLibraryCalls(DriveSession& session, DriveCallTable& table) {
  using LibraryCall = DriveAnswer (*)(DriveSession&, const DriveArguments&);
  const std::pair<const char*, LibraryCall> calls[] = {{"device.addAsset", addAsset},
                                                       {"device.addAlbum", addAlbum},
                                                       {"device.removeAsset", removeAsset},
                                                       {"device.set", set},
                                                       {"device.touch", touch}};
  for (const auto& entry : calls) {
    const LibraryCall run = entry.second;
    table[entry.first] = {DriveLane::kConsole, [&session, run](const DriveArguments& arguments) {
                            return run(session, arguments);
                          }};
  }
}

}  // namespace kx
