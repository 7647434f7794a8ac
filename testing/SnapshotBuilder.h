#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/FileSystem.h"
#include "platform/foundation/Value.h"
#include "records/TransportKeys.h"

namespace kx {

// Puts a host snapshot together as the property list that a host writes. The list is built from
// plain dictionaries, not by the encoder, so that a fault there cannot hide. Used on one thread.
class SnapshotBuilder {
 public:
  static constexpr std::int64_t kPlainAlbum = 0;
  static constexpr std::int64_t kFaceAlbum = 3;
  static constexpr std::int64_t kEventAlbum = 4;
  static constexpr std::int64_t kMasterAlbum = 5;

  struct Face {
    std::int64_t index = 0;
    double x = 0.0, y = 0.0, width = 0.0, height = 0.0;
    std::optional<std::string> albumUUID;
  };
  // Times are host times: seconds since 1904-01-01.
  struct Asset {
    std::string uuid;
    std::optional<double> exposureDate = 3200000000.0;
    std::optional<double> modificationDate = 3200000000.0;
    std::optional<double> latitude = 48.0;
    std::optional<double> longitude = 11.0;
    std::optional<std::string> caption = "";
    std::optional<std::string> eventUUID;
    std::optional<std::string> originalFileName;
    std::vector<Face> faces;
    bool isVideo = false;
  };

  SnapshotBuilder& library(std::optional<std::string> uuid,
                           std::optional<std::string> kind = "Cassock");
  SnapshotBuilder& userAgent(std::string agent);
  SnapshotBuilder& asset(const Asset& asset);
  SnapshotBuilder& asset(std::string uuid);
  SnapshotBuilder& album(std::string uuid, std::optional<std::string> name,
                         std::vector<std::string> assets, std::int64_t subclass = kPlainAlbum);
  SnapshotBuilder& event(std::string uuid, std::optional<std::string> name);
  // The album of all assets in master order.
  SnapshotBuilder& masterAlbum(std::vector<std::string> assets, std::string uuid = "MASTER");
  // Any item dictionary.
  SnapshotBuilder& item(Value dictionary);

  Value root() const;
  // As a binary property list.
  std::vector<std::uint8_t> bytes() const;
  void write(FileSystem& files, const std::string& path) const;

 private:
  std::optional<std::string> libraryUUID_ = "LIBRARY";
  std::optional<std::string> libraryKind_ = "Cassock";
  std::optional<std::string> userAgent_;
  Array updates_;
};

}  // namespace kx
