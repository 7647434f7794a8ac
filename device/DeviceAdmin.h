#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/library/KXPhotoLibrary.h"

namespace kx {

struct DeviceFace {
  std::uint16_t identifier = 0;
  Rect relativeRect;
  std::optional<std::string> albumUUID;
};

// An asset of the device's own camera (or, with type 256, one as a sync would have made it). No
// file is written.
struct NewDeviceAsset {
  std::string uuid;
  std::string path;  // device path of the main file
  std::int32_t savedAssetType = 0;
  bool isVideo = false;
  std::optional<Date> creationDate, modificationDate;
  std::optional<double> sortToken;
  std::optional<Coordinate> location;
  std::vector<DeviceFace> faces;
  std::optional<std::string> originalFileName;
  std::optional<std::int64_t> originalFileSize;
  std::vector<std::int64_t> sidecarSizes;
  std::vector<std::string> files;  // all files but thumbnails; empty: `path` alone
  bool incomplete = false;
};

struct NewDeviceAlbum {
  std::string uuid;
  std::optional<std::string> title;
  std::int32_t kind = 2;             // an album that the user made
  std::vector<std::string> assets;   // by UUID, in the album's order
  std::optional<std::size_t> index;  // position in the list of its kind; last when absent
  bool inList = true;
  bool managed = true;  // false: one that is no KXManagedAlbum
  std::int32_t pendingItemsType = 1;
  std::uint32_t pendingItemsCount = 0;
};

// Fields of an asset to change: those that are set. The inner null clears the field.
struct DeviceAssetFields {
  template <typename T>
  using Field = std::optional<std::optional<T>>;
  std::optional<std::string> uuid, path;
  std::optional<std::int32_t> savedAssetType;
  std::optional<bool> isVideo, incomplete;
  Field<Date> creationDate, modificationDate;
  Field<double> sortToken;
  Field<Coordinate> location;
  Field<std::string> originalFileName;
  std::optional<std::vector<DeviceFace>> faces;
};

// What the device's user and its own camera do with the library. add and remove commit before they
// return and refresh every open context; any thread but the library's queue. Errors: kBadFile for
// a path or number that cannot be stored, kMissing for an asset that is not there.
class DeviceAdmin {
 public:
  virtual ~DeviceAdmin() = default;
  virtual bool addAsset(const NewDeviceAsset& asset, ErrorPtr* error) = 0;
  virtual bool addAlbum(const NewDeviceAlbum& album, ErrorPtr* error) = 0;
  // The row and everything that hangs on it; its files stay.
  virtual bool removeAsset(const std::string& uuid, ErrorPtr* error) = 0;
  // Changes an asset in the library object's context: inside a block of that library, saved or not
  // as any other change. False when there is no such asset. (Albums have setters of their own.)
  virtual bool setAssetFields(KXPhotoLibrary& library, const std::string& uuid,
                              const DeviceAssetFields& fields) = 0;
};

}  // namespace kx
