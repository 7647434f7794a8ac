#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "device/DeviceRoot.h"
#include "device/LibraryRows.h"

namespace kx {

// One of the device's own albums as a backup knows it.
struct RestoredAlbum {
  std::optional<std::string> uuid;
  std::optional<std::string> title;
  std::int32_t kind = 0;
  ListId list = ListId::kAlbums;
  std::size_t position = 0;          // in its list
  std::vector<std::string> members;  // device paths of the assets' main files, in order
  friend bool operator==(const RestoredAlbum&, const RestoredAlbum&) = default;
};

// What stands on the device (device_paths::kRestoreMarker) from the beginning of a restore until
// quarryd has finalised it: which backup it brings back, and the albums to recreate.
struct RestoreMarker {
  std::string identity;
  std::vector<RestoredAlbum> albums;  // by position
};

// Nothing when there is no marker. One that makes no sense reads as one without identity and
// albums.
std::optional<RestoreMarker> readRestoreMarker(const DeviceRoot& root);
// 0 or an errno. A marker that says the same already is left as it is.
[[nodiscard]] int writeRestoreMarker(const DeviceRoot& root, const RestoreMarker& marker);

}  // namespace kx
