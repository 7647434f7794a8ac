#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "device/DeviceRoot.h"

namespace kx {

// Gives each imported file its place below the synced-assets directory: folders 100SYNCA to
// 999SYNCA, then 100SYNCB and on to 999SYNCZ, each with a limited number of files. Used on
// quarryd's thread alone.
class MediaFolders {
 public:
  MediaFolders(std::shared_ptr<DeviceRoot> root, std::size_t filesPerFolder)
      : root_(std::move(root)), filesPerFolder_(filesPerFolder) {}

  // A path that no file has, taken from now on. ENOSPC when every folder is full, else 0.
  [[nodiscard]] int place(const std::string& name, std::string* path);

  // The path is free again.
  void release(const std::string& path);

  // The file's name: the asset's UUID where that is a canonical one, else a hash of it.
  static std::string fileName(const std::string& assetUUID, const std::string& extension);
  // 100SYNCA is 0.
  static std::string folderName(std::size_t number);
  static std::optional<std::size_t> folderNumber(std::string_view name);
  static std::size_t folderCount();

 private:
  [[nodiscard]] int start();
  [[nodiscard]] int names(std::size_t folder, std::set<std::string>** found);

  const std::shared_ptr<DeviceRoot> root_;
  const std::size_t filesPerFolder_;
  std::optional<std::size_t> current_;
  std::map<std::size_t, std::set<std::string>> names_;  // of the folders looked into
};

}  // namespace kx
