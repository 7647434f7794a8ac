#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "backup/BackupManifest.h"
#include "device/DeviceRoot.h"

namespace kx {

// The directory of a backup, opened for putting a new backup in the place of the old one. New files
// gather in .incoming; the manifest that is written there last is the commit, after which they are
// moved into place. Whatever cuts this off: before the commit the old backup is untouched, after it
// the next opening ends the moving. Only files that a manifest or the journal names, and what lies
// in .incoming, are ever removed. Held by one process (an exclusive flock on the directory). One
// thread; paths are within the backup ("/DCIM/x").
class BackupFolder {
 public:
  // Makes the directory when it is missing, and ends a commit that was cut off. Null and kNotOurs,
  // kUnusable, kNewerForm, kInUse, kNoSpace or kIo.
  static std::unique_ptr<BackupFolder> open(const std::string& hostPath, ErrorPtr* error);

  const DeviceRoot& root() const { return *root_; }
  // The whole backup that is there; null before the first one.
  const BackupManifest* previous() const { return previous_ ? &*previous_ : nullptr; }
  // Whether there is a regular file of that size and time at a path.
  bool holds(const std::string& path, const BackupFile& file) const;
  // Null when a file may be put at the path: nothing but files of the backup is in its way.
  ErrorPtr checkVacant(const std::string& path) const;

  // Makes .incoming, or takes over what a taking that was cut off has copied: those of its files
  // that are `wanted` stand in `copied`, the rest of .incoming is gone.
  ErrorPtr begin(const std::function<bool(const BackupFile&)>& wanted,
                 std::vector<BackupFile>* copied);
  // Makes the directory in .incoming that the file of the path goes to.
  [[nodiscard]] int prepare(const std::string& path);
  // Makes what .incoming holds durable; notes the files in the journal, for a later begin().
  ErrorPtr note(const std::vector<BackupFile>& copied);
  // The commit and, after it, the moving; .incoming holds all that the manifest names and that is
  // not in place. An error after the commit leaves the moving to the next opening.
  ErrorPtr commit(const BackupManifest& manifest);
  // Takes .incoming away, unless the commit was made.
  void giveUp();

 private:
  BackupFolder(std::shared_ptr<DeviceRoot> root, UniqueFd lock)
      : root_(std::move(root)), lock_(std::move(lock)) {}
  ErrorPtr inTheWay(const std::string& path) const;
  ErrorPtr load();
  ErrorPtr checkOurs();
  [[nodiscard]] int syncAll() const;
  ErrorPtr endCommit(const BackupManifest& manifest);
  [[nodiscard]] int removeOld(const BackupManifest& manifest);
  [[nodiscard]] int removeOne(const std::string& path);
  [[nodiscard]] int moveAll(const BackupManifest& manifest, std::string* conflict);
  [[nodiscard]] int moveOne(const std::string& path);
  [[nodiscard]] int removeEmptyDirectories(const std::string& path);
  [[nodiscard]] int syncTouched();
  [[nodiscard]] int clearIncoming(const std::set<std::string, std::less<>>& kept);
  ErrorPtr failure(const std::string& what, const std::string& path, int errorNumber) const;

  const std::shared_ptr<DeviceRoot> root_;
  const UniqueFd lock_;
  std::optional<BackupManifest> previous_;
  std::string preparedDirectory_;
  std::set<std::string> touched_;  // directories whose entries have changed
};

// Whether the manifest says that the path within the backup is one of its files.
bool namesFile(const BackupManifest& manifest, const std::string& path);
// "/a/b" of "/a/b/c", "/" of "/a".
std::string parentOf(const std::string& path);

}  // namespace kx
