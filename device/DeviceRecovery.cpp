#include "device/DeviceRecovery.h"

#include <algorithm>
#include <cerrno>
#include <unordered_map>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/LibrarySchema.h"
#include "device/MediaFolders.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

// The folder of a path below the synced-assets directory; "" for any other path.
std::string folderOf(const std::string& path) {
  const std::string below = std::string(device_paths::kSyncedAssets) + "/";
  if (!path.starts_with(below)) return {};
  const std::size_t end = path.find('/', below.size());
  return end == std::string::npos ? std::string() : path.substr(below.size(), end - below.size());
}

// Folders that look otherwise than they were left.
std::set<std::string> changedSince(const CleanState& last, const CleanState& now) {
  std::set<std::string> changed;
  for (const auto& [folder, time] : now.folderTimes) {
    const auto before = last.folderTimes.find(folder);
    if (before == last.folderTimes.end() || before->second != time) changed.insert(folder);
  }
  for (const auto& [folder, time] : last.folderTimes) {
    if (!now.folderTimes.contains(folder)) changed.insert(folder);
  }
  return changed;
}

}  // namespace

ErrorPtr DeviceRecovery::run(const std::optional<CleanState>& last) {
  const CleanState now = CleanState::of(*root_);
  const bool orderly =
      last && last->databaseSize == now.databaseSize && last->databaseTime == now.databaseTime;
  if (orderly) {
    const std::set<std::string> changed = changedSince(*last, now);
    return changed.empty() ? nullptr : checkFolders(&changed);
  }
  if (ErrorPtr damaged = quickCheck(store_.database())) return damaged;
  sweepTemporaryFiles();
  if (ErrorPtr failed = checkFolders(nullptr)) return failed;
  return checkOwnAssets();
}

void DeviceRecovery::remove(const std::string& path) {
  ErrorPtr error;
  if (files_.removeItem(path, &error) || (error && error->code() == ENOENT)) return;
  store_.log().failure("a file stays behind", error);
}

void DeviceRecovery::sweepTemporaryFiles() {
  using namespace device_paths;
  for (const char* directory : {kMedia, kSync, kPhotoData, kCaches, kTemporary, kMobileHome}) {
    std::vector<std::string> names;
    if (root_->list(directory, &names) != 0) continue;
    for (const std::string& name : names) {
      if (DeviceRoot::isTemporaryName(name)) remove(pathByAppending(directory, name));
    }
  }
}

bool DeviceRecovery::isWhole(const Row& row) const {
  struct stat status;
  return root_->status(row.path, &status) == 0 && S_ISREG(status.st_mode) && status.st_size > 0 &&
         (row.size == 0 || status.st_size == row.size);
}

// All folders, or those named.
ErrorPtr DeviceRecovery::checkFolders(const std::set<std::string>* changed) {
  std::unordered_map<std::string, std::set<std::string>> named;  // files by folder
  std::vector<RowId> broken;
  try {
    SqliteStatement row(store_.database(),
                        "SELECT pk, path, size FROM assets WHERE saved_type = 256");
    while (row.step()) {
      const Row asset{row.integerAt(0), row.textAt(1), row.integerAt(2)};
      const std::string folder = folderOf(asset.path);
      if (changed != nullptr && !changed->contains(folder)) continue;
      if (!isWhole(asset)) {
        broken.push_back(asset.pk);
      } else if (!folder.empty()) {
        named[folder].insert(std::string(lastPathComponent(asset.path)));
      }
    }
  } catch (const SqliteError& error) {
    return error.asError();
  }
  std::vector<std::string> folders;
  if (changed != nullptr) {
    folders.assign(changed->begin(), changed->end());
  } else if (const int failed = root_->list(device_paths::kSyncedAssets, &folders);
             failed != 0 && failed != ENOENT) {
    return systemError("cannot list", device_paths::kSyncedAssets, failed);
  }
  // Rows go first: a file of theirs that is not whole is then one that no row names.
  if (ErrorPtr failed = removeRows(broken)) return failed;
  for (const std::string& folder : folders) sweepFolder(folder, named[folder]);
  return nullptr;
}

void DeviceRecovery::sweepFolder(const std::string& folder, const std::set<std::string>& named) {
  const std::string path = pathByAppending(device_paths::kSyncedAssets, folder);
  struct stat status;
  if (root_->status(path, &status) != 0) return;
  if (!S_ISDIR(status.st_mode)) {
    remove(path);
    return;
  }
  std::vector<std::string> doomed;
  files_.enumerate(
      path,
      [&](const FileProperties& entry) {
        if (entry.parentPath != path || !named.contains(entry.name)) doomed.push_back(entry.path);
        return EnumerationChoice::kDescend;
      },
      [&](const std::string& where, const ErrorPtr& error) {
        store_.log().failure("cannot look into " + where, error);
      });
  std::for_each(doomed.rbegin(), doomed.rend(), [&](const std::string& file) { remove(file); });
}

ErrorPtr DeviceRecovery::removeRows(const std::vector<RowId>& rows) {
  if (rows.empty()) return nullptr;
  ErrorPtr error;
  if (!files_.removeItem(device_paths::kLastSynced, &error) && error && error->code() != ENOENT) {
    return systemError("cannot remove", device_paths::kLastSynced, static_cast<int>(error->code()));
  }
  store_.log().write(LogLevel::kWarning,
                     std::to_string(rows.size()) + " synced assets have lost their files");
  return store_.write([&](LibraryWriter& writer) {
    for (const RowId pk : rows) writer.deleteAsset(pk);
  });
}

ErrorPtr DeviceRecovery::checkOwnAssets() {
  std::vector<RowId> lost;
  try {
    SqliteStatement row(store_.database(),
                        "SELECT pk, path FROM assets WHERE saved_type <> 256 AND incomplete = 0");
    while (row.step()) {
      if (!isWhole({row.integerAt(0), row.textAt(1), 0})) lost.push_back(row.integerAt(0));
    }
  } catch (const SqliteError& error) {
    return error.asError();
  }
  if (lost.empty()) return nullptr;
  DeviceAssetFields incomplete;
  incomplete.incomplete = true;
  return store_.write([&](LibraryWriter& writer) {
    for (const RowId pk : lost) writer.updateAsset(pk, incomplete);
  });
}

}  // namespace kx
