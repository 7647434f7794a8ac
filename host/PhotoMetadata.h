#pragma once

#include <optional>
#include <string>
#include <vector>

#include "host/ByteSource.h"
#include "host/CaptureTime.h"
#include "host/ContentType.h"
#include "host/FaceRegions.h"
#include "host/MetadataText.h"
#include "platform/foundation/Value.h"

namespace kx {

// What a photo or video and its side file say. Where several say it, the side file comes before the
// file's own XMP, Exif and IPTC; the order for each field stands in PhotoMetadata.cpp.
struct PhotoMetadata {
  std::optional<CaptureTime> captureTime;
  std::optional<Place> place;
  std::optional<int> rating;  // -1 (rejected) to 5
  std::string caption;
  std::vector<FaceRegion> faces;
  // One dictionary for each metadata family that has something, "Exif", "Iptc", "Xmp", "GPS", keys
  // and texts as the metadata library names and prints them, and "MQFileUTType".
  Value imageProperties;
  std::vector<std::string> problems;  // blocks that were left out
};

struct MetadataRequest {
  ContentType type;
  std::optional<std::string> sideFile;  // the XMP side file's bytes
  int timezoneOffsetMinutes = 0;        // for a video whose header knows UTC alone
};

// Never fails for damaged metadata: that becomes a problem. ReadError when the file's bytes cannot
// be read. Any thread.
PhotoMetadata readPhotoMetadata(const ByteSource& source, const MetadataRequest& request);

}  // namespace kx
