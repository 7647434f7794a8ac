#pragma once

#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include "device/DeviceLog.h"
#include "device/DeviceRoot.h"
#include "platform/files/FileSystem.h"
#include "platform/foundation/Date.h"
#include "platform/library/KXManagedObjects.h"

namespace kx {

// One asset as the camera left it: the files of one directory whose names differ in the extension
// alone. A still comes first, then films, then side files.
struct CameraAsset {
  struct File {
    std::string path;
    std::int64_t size = 0;
  };
  std::vector<File> files;
  bool isVideo = false;  // a film without a still
  std::optional<Date> creationDate, modificationDate;
  std::optional<Coordinate> place;
};

// Looks through the camera's files for assets of which no file is in `known`, by path. Hidden files
// and folders, ".MISC" folders and side files without a photo are passed over; a file that cannot
// be read to the end still counts, with its file's time. Any thread, one at a time.
std::vector<CameraAsset> findCameraAssets(const DeviceRoot& root, FileSystem& files,
                                          const std::unordered_set<std::string>& known,
                                          const DeviceLog& log);

}  // namespace kx
