#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

#include "platform/foundation/Rect.h"
#include "platform/foundation/Value.h"
#include "records/TransportKeys.h"

namespace kx {

class KXSFace;
using KXSFacePtr = std::shared_ptr<KXSFace>;

// One face region of an asset, built from the host's face dictionary. Shared by reference; read
// from any thread, set on one thread at a time.
class KXSFace {
 public:
  // A missing "faceIndex" gives 0; a rectangle that cannot be read is all zero and goes to the
  // standard log. Raises TypeError when the index, or the whole face, has another type.
  static KXSFacePtr initWithFaceInfo(const Value& faceInfo);

  OptionalString albumUUID() const { return albumUUID_.asString(kKXSAssetFaceAlbumUUIDKey); }
  void setAlbumUUID(OptionalString uuid) { albumUUID_ = Value::optionalString(uuid); }
  // The face's index within the asset.
  std::int16_t identifier() const { return identifier_; }
  void setIdentifier(std::int16_t identifier) { identifier_ = identifier; }
  // Relative to the image's width and height.
  const Rect& relativeRect() const { return relativeRect_; }
  void setRelativeRect(const Rect& rect) { relativeRect_ = rect; }

 private:
  Value albumUUID_;
  std::int16_t identifier_ = 0;
  Rect relativeRect_;
};

}  // namespace kx
