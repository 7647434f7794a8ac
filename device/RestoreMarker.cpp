#include "device/RestoreMarker.h"

#include <algorithm>
#include <cerrno>

#include "device/DeviceLayout.h"
#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

constexpr const char* kIdentity = "identity";
constexpr const char* kAlbums = "albums";
constexpr const char* kUuid = "uuid";
constexpr const char* kTitle = "title";
constexpr const char* kKind = "kind";
constexpr const char* kList = "list";
constexpr const char* kPosition = "position";
constexpr const char* kMembers = "members";

std::optional<std::string> textOf(const Value& value) {
  if (!value.isString()) return std::nullopt;
  return std::string(value.stringValue());
}

std::int64_t integerOf(const Value& value) {
  return value.isNumber() ? value.numberValue().int64Value() : 0;
}

RestoredAlbum albumFrom(const Value& entry) {
  RestoredAlbum album;
  album.uuid = textOf(entry[kUuid]);
  album.title = textOf(entry[kTitle]);
  album.kind = static_cast<std::int32_t>(integerOf(entry[kKind]));
  const std::int64_t list = integerOf(entry[kList]);
  album.list = list >= 1 && list <= kListCount ? static_cast<ListId>(list) : ListId::kAlbums;
  album.position = static_cast<std::size_t>(std::max<std::int64_t>(0, integerOf(entry[kPosition])));
  if (!entry[kMembers].isArray()) return album;
  for (const Value& path : entry[kMembers].arrayValue()) {
    if (path.isString()) album.members.emplace_back(path.stringValue());
  }
  return album;
}

Value entryOf(const RestoredAlbum& album) {
  Dictionary entry;
  if (album.uuid) entry.set(kUuid, Value::string(*album.uuid));
  if (album.title) entry.set(kTitle, Value::string(*album.title));
  entry.set(kKind, Value::integer(album.kind));
  entry.set(kList, Value::integer(static_cast<int>(album.list)));
  entry.set(kPosition, Value::integer(static_cast<std::int64_t>(album.position)));
  Array members;
  members.reserve(album.members.size());
  for (const std::string& path : album.members) members.push_back(Value::string(path));
  entry.set(kMembers, Value::array(std::move(members)));
  return Value::dictionary(std::move(entry));
}

}  // namespace

std::optional<RestoreMarker> readRestoreMarker(const DeviceRoot& root) {
  std::vector<std::uint8_t> bytes;
  const int failed = root.readFile(device_paths::kRestoreMarker, &bytes);
  if (failed == ENOENT || failed == ENOTDIR) return std::nullopt;
  RestoreMarker marker;
  if (failed != 0) return marker;
  ErrorPtr ignored;
  const Value content = readPropertyList(std::make_shared<const Data>(std::move(bytes)), &ignored);
  if (!content.isDictionary()) return marker;
  marker.identity = textOf(content[kIdentity]).value_or("");
  if (!content[kAlbums].isArray()) return marker;
  for (const Value& entry : content[kAlbums].arrayValue()) {
    if (entry.isDictionary()) marker.albums.push_back(albumFrom(entry));
  }
  std::stable_sort(
      marker.albums.begin(), marker.albums.end(),
      [](const RestoredAlbum& a, const RestoredAlbum& b) { return a.position < b.position; });
  return marker;
}

int writeRestoreMarker(const DeviceRoot& root, const RestoreMarker& marker) {
  Dictionary content;
  content.set(kIdentity, Value::string(marker.identity));
  Array albums;
  for (const RestoredAlbum& album : marker.albums) albums.push_back(entryOf(album));
  content.set(kAlbums, Value::array(std::move(albums)));
  ErrorPtr error;
  const auto bytes =
      writePropertyList(Value::dictionary(std::move(content)), PropertyListFormat::kBinary, &error);
  if (error) return EINVAL;
  return root.writeAtomically(device_paths::kRestoreMarker, bytes);
}

}  // namespace kx
