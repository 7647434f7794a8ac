#include <utility>

#include "daemon/PlistJson.h"
#include "daemon/SnapshotJson.h"
#include "daemon/drive/DriveSession.h"
#include "platform/foundation/KeyedArchive.h"
#include "records/KXSAlbum.h"
#include "records/KXSBase64.h"
#include "records/KXSEvent.h"
#include "records/KXSUUID.h"
#include "records/RecordArchives.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

Data dataFrom(const std::vector<std::uint8_t>& bytes) { return Data(bytes); }

DriveAnswer uuid(const DriveArguments& arguments) {
  const KXSUUIDPtr made = arguments.has("photoBase64")
                              ? KXSUUID::initWithPhotoBase64String(arguments.string("photoBase64"))
                              : KXSUUID::initWithString(arguments.string("string"));
  return {made ? Json(made->stringValue()) : Json(), nullptr};
}

DriveAnswer base64Encode(const DriveArguments& arguments) {
  const KXSBase64Encoder encoder = arguments.boolean("photo", false)
                                       ? KXSBase64Encoder::encoderForPhotoUUID()
                                       : KXSBase64Encoder::encoder();
  if (!arguments.has("base64") && arguments.has("text")) {
    const std::string text = arguments.string("text");
    return {encoder.encodeData(Data(text.data(), text.size())), nullptr};
  }
  return {encoder.encodeData(dataFrom(bytesFromBase64(arguments.string("base64")))), nullptr};
}

DriveAnswer base64Decode(const DriveArguments& arguments) {
  const KXSBase64Decoder decoder = arguments.boolean("photo", false)
                                       ? KXSBase64Decoder::decoderForPhotoUUID()
                                       : KXSBase64Decoder::decoder();
  const DataPtr decoded = decoder.decodeString(arguments.string("text"));
  if (!decoded) return {};
  return {{{"base64", base64Text(decoded->span())}}, nullptr};
}

DriveAnswer photoBase64UUIDs(const DriveArguments& arguments) {
  return {KXSUUID::photoBase64UUIDsFromUUIDs(arguments.strings("uuids")), nullptr};
}

DriveAnswer isEqual(const DriveArguments& arguments) {
  const std::string text = arguments.string("uuid");
  const KXSUUIDPtr identifier = KXSUUID::initWithString(text);
  if (!identifier) throw DriveException(kBadArgument, "\"" + text + "\" is no UUID");
  const Data plain(identifier->bytes(), identifier->length());
  return {{{"isEqual", identifier->isEqual(plain)},
           {"isEqualToData", identifier->isEqualToData(plain)}},
          nullptr};
}

KXSItemPtr itemFrom(const DriveArguments& arguments, const char* key) {
  return KXSTransportDecoder::decoder()->_itemFromPropertyList(
      plistFromJson(arguments.object(key)));
}

// The object after a way through an archive.
ArchivablePtr throughArchive(const ArchivablePtr& object, const ArchiveClasses& classes) {
  ErrorPtr error;
  const auto bytes = std::make_shared<Data>(KeyedArchiver::archivedData(object, &error));
  ArchivablePtr restored =
      error ? nullptr : KeyedUnarchiver::unarchivedObject(bytes, classes, &error);
  if (!restored) throw DriveException("ArchiveError", error ? error->message() : "no object");
  return restored;
}

DriveAnswer archive(const DriveArguments& arguments) {
  const auto item = std::dynamic_pointer_cast<KXSItem>(
      throughArchive(itemFrom(arguments, "item"), recordArchiveClasses()));
  if (!item) throw DriveException("ArchiveError", "the archive held no item");
  return {plistJson(item->propertyList()), nullptr};
}

DriveAnswer isEqualItems(const DriveArguments& arguments) {
  const KXSItemPtr a = itemFrom(arguments, "a");
  const KXSItemPtr b = arguments.has("b") ? itemFrom(arguments, "b") : nullptr;
  bool equal = false;
  if (const auto* album = dynamic_cast<const KXSAlbum*>(a.get())) {
    equal = album->isEqualToAlbum(b);
  } else if (const auto* event = dynamic_cast<const KXSEvent*>(a.get())) {
    equal = event->isEqualToEvent(b);
  } else {
    throw DriveException(kBadArgument, "argument \"a\": expected an album or an event");
  }
  return {{{"isEqual", equal}}, nullptr};
}

DriveAnswer snapshot(const DriveArguments& arguments) {
  KXSLibraryChangeSnapshotPtr decoded =
      KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(
          plistFromJson(arguments.object("plist")), nullptr);
  if (arguments.boolean("archive", false)) {
    decoded = std::dynamic_pointer_cast<KXSLibraryChangeSnapshot>(
        throughArchive(decoded, snapshotArchiveClasses()));
    if (!decoded) throw DriveException("ArchiveError", "the archive held no snapshot");
  }
  Json json = snapshotJson(*decoded);
  json["hasChangedObjects"] = decoded->hasChangedObjects();
  json["updates"] = itemMapJson(decoded->updates());
  return {std::move(json), nullptr};
}

}  // namespace

void addRecordCalls(DriveCallTable& table) {
  using RecordCall = DriveAnswer (*)(const DriveArguments&);
  const std::pair<const char*, RecordCall> calls[] = {
      {"records.uuid", uuid},
      {"records.base64Encode", base64Encode},
      {"records.base64Decode", base64Decode},
      {"records.photoBase64UUIDs", photoBase64UUIDs},
      {"records.isEqual", isEqual},
      {"records.archive", archive},
      {"records.isEqualItems", isEqualItems},
      {"records.snapshot", snapshot}};
  for (const auto& entry : calls) table[entry.first] = {DriveLane::kConsole, entry.second};
}

}  // namespace kx
