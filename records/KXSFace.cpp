#include "records/KXSFace.h"

#include "platform/sync/FRLog.h"

namespace kx {

KXSFacePtr KXSFace::initWithFaceInfo(const Value& faceInfo) {
  auto face = std::make_shared<KXSFace>();
  const auto view = faceInfo.asDictionary(kKXSAssetFacesKey);
  if (view) {
    face->albumUUID_ = view->find(kKXSAssetFaceAlbumUUIDKey);
    const auto index = view->find(kKXSAssetFaceIndexKey).asNumber(kKXSAssetFaceIndexKey);
    face->identifier_ = index ? index->int16Value() : std::int16_t{0};
  }
  const std::optional<Rect> rect =
      rectFromDictionary(view ? view->find(kKXSAssetFaceRectangleKey) : Value());
  if (rect) {
    face->relativeRect_ = *rect;
  } else {
    writeStandardLog("[KXS] Unable to construct faceRect for faceInfo: %@", {faceInfo});
  }
  return face;
}

}  // namespace kx
