#include "records/KXSFace.h"

#include "platform/foundation/EntryPeek.h"
#include "platform/sync/FRLog.h"

namespace kx {

namespace {

// The value under the key, which mostly stands at the expected position; null when absent.
Value valueUnder(const Value& faceInfo, std::string_view key, std::uint32_t expected) {
  if (!EntryPeek::can(faceInfo)) return faceInfo[key];
  const std::optional<EntryPeek> entry = EntryPeek::find(faceInfo, key, expected);
  return entry ? entry->value() : Value();
}

}  // namespace

KXSFacePtr KXSFace::initWithFaceInfo(const Value& faceInfo) {
  auto face = std::make_shared<KXSFace>();
  const bool isDictionary = faceInfo.isDictionary();
  if (!isDictionary) faceInfo.asDictionary(kKXSAssetFacesKey);  // raises unless it is null
  std::optional<Rect> rect;
  if (isDictionary) {
    face->albumUUID_ = valueUnder(faceInfo, kKXSAssetFaceAlbumUUIDKey, 0);
    const Value number = valueUnder(faceInfo, kKXSAssetFaceIndexKey, 1);
    const auto index = number.asNumber(kKXSAssetFaceIndexKey);
    face->identifier_ = index ? index->int16Value() : std::int16_t{0};
    rect = rectFromDictionary(valueUnder(faceInfo, kKXSAssetFaceRectangleKey, 2));
  }
  if (rect) {
    face->relativeRect_ = *rect;
  } else {
    writeStandardLog("[KXS] Unable to construct faceRect for faceInfo: %@", {faceInfo});
  }
  return face;
}

}  // namespace kx
