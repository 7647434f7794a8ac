#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backup/BackupManifest.h"
#include "device/DeviceRoot.h"

namespace kx {

// A whole backup, opened for reading. As long as it lives nobody else can change the backup (a
// shared flock on its directory). A backup whose taking was cut off after its commit is read as the
// new one, before it the old one is. Nothing is followed through links. Any thread.
class BackupReader {
 public:
  // Null and an error of the domain kBackupErrorDomain: kMissing, kNotOurs, kUnusable, kNewerForm,
  // kInUse or kIo.
  static std::unique_ptr<BackupReader> open(const std::string& hostPath, ErrorPtr* error);

  const BackupManifest& manifest() const { return manifest_; }
  // Where the backup is on the host, without links.
  const std::string& hostPath() const { return root_->hostPath(); }

  // Opens a file of the backup by its device path, for reading: 0 or an errno, ENOENT also for one
  // that the manifest does not name, EINVAL for what is no regular file. Its content is not
  // checked.
  [[nodiscard]] int openFile(const std::string& devicePath, UniqueFd* out) const;
  // The library database; ENOENT when the backup has none.
  [[nodiscard]] int openLibrary(UniqueFd* out) const;
  // The device's own albums, checked against the manifest; nothing and kDamagedFile or kUnusable.
  std::optional<std::vector<BackupAlbum>> albums(ErrorPtr* error) const;

 private:
  BackupReader(std::shared_ptr<DeviceRoot> root, UniqueFd lock)
      : root_(std::move(root)), lock_(std::move(lock)) {}
  ErrorPtr readManifest();
  [[nodiscard]] int openInside(const std::string& path, UniqueFd* out) const;

  const std::shared_ptr<DeviceRoot> root_;
  const UniqueFd lock_;
  BackupManifest manifest_;
  bool isCommittedJournal_ = false;  // files are looked for in .incoming first
};

// Reads a manifest of a backup: nothing without an error when there is none.
std::optional<BackupManifest> readBackupManifest(const DeviceRoot& root, const std::string& path,
                                                 ErrorPtr* error);
// The manifest of a committed journal.
std::string incomingPath(const std::string& path);

// Opens the directory of a backup: kMissing, kNotOurs or kIo.
std::shared_ptr<DeviceRoot> openBackupRoot(const std::string& hostPath, bool create,
                                           ErrorPtr* error);
// A lock on that directory: LOCK_SH or LOCK_EX. Nothing and kInUse or kIo.
UniqueFd lockBackup(const DeviceRoot& root, int operation, ErrorPtr* error);

}  // namespace kx
