#pragma once

#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "device/DeviceLock.h"
#include "device/DeviceRoot.h"
#include "device/LibraryStore.h"

namespace kx {

// Brings files and rows in line again when the device is opened: files that no row names and left
// over temporary files go; a synced row whose file is missing, empty or of another size goes,
// together with the last-synced snapshot; an asset of the device's own without its file becomes
// incomplete. After an orderly stop only folders that have changed since are looked into. Runs on
// the opening thread, before anything else works on the device.
class DeviceRecovery {
 public:
  // What is removed goes through `files`, what is looked at through `root`.
  DeviceRecovery(std::shared_ptr<DeviceRoot> root, FileSystem& files, LibraryStore& store)
      : root_(std::move(root)), files_(files), store_(store) {}

  // Null, or why the device is not to be worked on.
  [[nodiscard]] ErrorPtr run(const std::optional<CleanState>& last);

 private:
  struct Row {
    RowId pk = 0;
    std::string path;
    std::int64_t size = 0;
  };

  void sweepTemporaryFiles();
  [[nodiscard]] ErrorPtr checkFolders(const std::set<std::string>* changed);
  void sweepFolder(const std::string& folder, const std::set<std::string>& named);
  [[nodiscard]] ErrorPtr checkOwnAssets();
  [[nodiscard]] ErrorPtr removeRows(const std::vector<RowId>& rows);
  bool isWhole(const Row& row) const;
  void remove(const std::string& path);

  const std::shared_ptr<DeviceRoot> root_;
  FileSystem& files_;
  LibraryStore& store_;
};

}  // namespace kx
