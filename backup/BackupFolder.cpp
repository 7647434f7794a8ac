#include "backup/BackupFolder.h"

#include <fcntl.h>
#include <stdio.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "backup/BackupErrors.h"
#include "backup/BackupReader.h"
#include "device/DeviceLayout.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

using namespace backup_names;

constexpr const char* kLostAndFound = "lost+found";  // at the top of a whole file system
// One by one, a few files are synced faster than a whole file system.
constexpr std::size_t kFewDirectories = 50;

// Calls `visit` for all that lies beneath a directory, what a directory holds before itself; paths
// of files and whether it is a directory. Gives the first errno; a missing directory is none.
int walkTree(const DeviceRoot& root, const std::string& directory,
             const std::function<int(const std::string&, bool)>& visit) {
  std::vector<std::string> names;
  int failed = root.list(directory, &names);
  if (failed == ENOENT) return 0;
  for (const std::string& name : names) {
    const std::string path = pathByAppending(directory, name);
    struct stat status;
    if (failed == 0) failed = root.status(path, &status);
    const bool isDirectory = failed == 0 && S_ISDIR(status.st_mode);
    if (failed == 0 && isDirectory) failed = walkTree(root, path, visit);
    if (failed == 0) failed = visit(path, isDirectory);
    if (failed != 0) return failed;
  }
  return failed;
}

}  // namespace

std::string parentOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == 0 ? "/" : path.substr(0, slash);
}

bool namesFile(const BackupManifest& manifest, const std::string& path) {
  if (path == kAlbums) return true;
  if (path == kLibrary) return manifest.library.has_value();
  return manifest.find(device_paths::kMedia + path) != nullptr;
}

ErrorPtr BackupFolder::failure(const std::string& what, const std::string& path,
                               int errorNumber) const {
  return backupSystemError(what, root_->hostPath() + path, errorNumber);
}

std::unique_ptr<BackupFolder> BackupFolder::open(const std::string& hostPath, ErrorPtr* error) {
  std::shared_ptr<DeviceRoot> root = openBackupRoot(hostPath, true, error);
  if (!root) return nullptr;
  UniqueFd lock = lockBackup(*root, LOCK_EX, error);
  if (!lock) return nullptr;
  std::unique_ptr<BackupFolder> folder(new BackupFolder(std::move(root), std::move(lock)));
  if (ErrorPtr failed = folder->load()) {
    setError(error, std::move(failed));
    return nullptr;
  }
  return folder;
}

ErrorPtr BackupFolder::load() {
  ErrorPtr error;
  previous_ = readBackupManifest(*root_, kManifest, &error);
  const std::optional<BackupManifest> committed =
      error ? std::nullopt : readBackupManifest(*root_, incomingPath(kManifest), &error);
  if (error) {
    return backupError(static_cast<BackupError>(error->code()),
                       root_->hostPath() + ": " + error->message() +
                           "; it is left as it is, take the backup to another directory");
  }
  if (committed) {
    if (ErrorPtr failed = endCommit(*committed)) return failed;
  }
  return previous_ ? nullptr : checkOurs();
}

// Without a manifest: empty, or the beginning of a first backup.
ErrorPtr BackupFolder::checkOurs() {
  std::vector<std::string> names;
  if (const int failed = root_->list("/", &names); failed != 0)
    return failure("cannot list", "", failed);
  std::erase(names, kLostAndFound);
  struct stat status;
  if (root_->status(kJournal, &status) == 0) return nullptr;
  std::string foreign;
  for (const std::string& name : names) {
    if ("/" + name != kIncoming) foreign = name;
  }
  if (foreign.empty() && !names.empty()) {
    if (root_->list(kIncoming, &names) != 0) foreign = names.front();
    for (const std::string& name : names) {
      if (!DeviceRoot::isTemporaryName(name)) foreign = pathByAppending(kIncoming, name).substr(1);
    }
  }
  if (foreign.empty()) return nullptr;
  return backupError(BackupError::kNotOurs, root_->hostPath() +
                                                " holds something else than a "
                                                "backup (" +
                                                foreign + ")");
}

bool BackupFolder::holds(const std::string& path, const BackupFile& file) const {
  struct stat status;
  return root_->status(path, &status) == 0 && S_ISREG(status.st_mode) &&
         status.st_size == file.size && BackupFileTime::fromUnix(status.st_mtim) == file.modified;
}

ErrorPtr BackupFolder::checkVacant(const std::string& path) const {
  std::size_t slash = 0;
  while (slash != std::string::npos) {
    slash = path.find('/', slash + 1);
    const std::string part = path.substr(0, slash);
    struct stat status;
    const int failed = root_->status(part, &status);
    if (failed == ENOENT) return nullptr;
    if (failed != 0) return failure("cannot examine", part, failed);
    if (previous_ && namesFile(*previous_, part)) return nullptr;  // goes away or is replaced
    if (!S_ISDIR(status.st_mode)) return inTheWay(part);
  }
  // A directory has the name: its files have to be the backup's.
  ErrorPtr wrong;
  const int failed = walkTree(*root_, path, [&](const std::string& inside, bool isDirectory) {
    if (isDirectory || (previous_ && namesFile(*previous_, inside))) return 0;
    wrong = inTheWay(inside);
    return EEXIST;
  });
  if (wrong || failed == 0) return wrong;
  return failure("cannot examine", path, failed);
}

ErrorPtr BackupFolder::inTheWay(const std::string& path) const {
  return backupError(
      BackupError::kNotOurs,
      root_->hostPath() + path + " is no part of the backup and in its way: move it elsewhere");
}

ErrorPtr BackupFolder::begin(const std::function<bool(const BackupFile&)>& wanted,
                             std::vector<BackupFile>* copied) {
  copied->clear();
  std::set<std::string, std::less<>> kept;
  if (const auto journal = readBackupManifest(*root_, kJournal, nullptr)) {
    for (const BackupFile& file : journal->files) {
      const std::string path = incomingPath(backupPathOf(file.path));
      if (!holds(path, file) || !wanted(file)) continue;
      copied->push_back(file);
      kept.insert(path);
    }
    kept.insert(kJournal);
  }
  if (const int failed = clearIncoming(kept); failed != 0) {
    return failure("cannot clear", kIncoming, failed);
  }
  if (!kept.empty()) return nullptr;
  if (const int failed = root_->makeDirectories(kIncoming); failed != 0) {
    return failure("cannot make", kIncoming, failed);
  }
  return note({});
}

int BackupFolder::prepare(const std::string& path) {
  const std::string directory = parentOf(incomingPath(path));
  if (directory == preparedDirectory_) return 0;
  const int failed = root_->makeDirectories(directory);
  if (failed == 0) preparedDirectory_ = directory;
  return failed;
}

int BackupFolder::syncAll() const { return ::syncfs(root_->fd()) == 0 ? 0 : errno; }

ErrorPtr BackupFolder::note(const std::vector<BackupFile>& copied) {
  BackupManifest journal;
  journal.identity = "journal";
  journal.albums.sha256 = std::string(64, '0');
  journal.files = copied;
  std::sort(journal.files.begin(), journal.files.end(),
            [](const BackupFile& a, const BackupFile& b) { return a.path < b.path; });
  for (const BackupFile& file : journal.files) {
    std::string path = backupPathOf(file.path);
    path = path.substr(1, path.find('/', 1) - 1);
    if (std::find(journal.paths.begin(), journal.paths.end(), path) == journal.paths.end()) {
      journal.paths.push_back(path);
    }
  }
  int failed = copied.empty() ? 0 : syncAll();
  const std::string text = serializeManifest(journal);
  if (failed == 0) {
    failed = root_->writeAtomically(
        kJournal, {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
  }
  return failed == 0 ? nullptr : failure("cannot write", kJournal, failed);
}

ErrorPtr BackupFolder::commit(const BackupManifest& manifest) {
  if (const int failed = syncAll(); failed != 0) return failure("cannot write", kIncoming, failed);
  const std::string text = serializeManifest(manifest);
  const std::string path = incomingPath(kManifest);
  const int failed = root_->writeAtomically(
      path, {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
  if (failed != 0) return failure("cannot write", path, failed);
  return endCommit(manifest);
}

ErrorPtr BackupFolder::endCommit(const BackupManifest& manifest) {
  touched_.clear();
  if (const int failed = removeOld(manifest); failed != 0) {
    return failure("cannot remove old files in", "", failed);
  }
  std::string at;
  if (const int failed = moveAll(manifest, &at); failed != 0) {
    return failure("cannot move into place", at, failed);
  }
  int failed = syncTouched();
  if (failed == 0) failed = moveOne(kManifest);
  if (failed == 0) failed = root_->syncDirectory("/");
  if (failed == 0) failed = root_->syncDirectory(kIncoming);
  if (failed == 0) failed = clearIncoming({});
  if (failed != 0) return failure("cannot put in place", kManifest, failed);
  previous_ = manifest;
  return nullptr;
}

// What the old manifest names and the new one does not, and directories that are empty without it.
int BackupFolder::removeOld(const BackupManifest& manifest) {
  if (!previous_) return 0;
  std::vector<std::string> gone;
  for (const BackupFile& file : previous_->files) {
    if (manifest.find(file.path) == nullptr) gone.push_back(backupPathOf(file.path));
  }
  if (previous_->library && !manifest.library) gone.emplace_back(kLibrary);
  for (const std::string& path : gone) {
    if (const int failed = removeOne(path); failed != 0) return failed;
  }
  return 0;
}

int BackupFolder::removeOne(const std::string& path) {
  struct stat status;
  int failed = root_->status(path, &status);
  // When something else has taken the name, that stays.
  if (failed == 0 && !S_ISDIR(status.st_mode)) failed = root_->remove(path);
  if (failed != 0 && failed != ENOENT && failed != ENOTDIR) return failed;
  std::string directory = parentOf(path);
  touched_.insert(directory);
  while (directory != "/" && root_->status(directory, &status) == 0 && S_ISDIR(status.st_mode) &&
         root_->remove(directory) == 0) {
    touched_.erase(directory);
    directory = parentOf(directory);
    touched_.insert(directory);
  }
  return 0;
}

int BackupFolder::moveAll(const BackupManifest& manifest, std::string* at) {
  const std::size_t prefix = std::string_view(kIncoming).size();
  return walkTree(*root_, kIncoming, [&](const std::string& incoming, bool isDirectory) {
    const std::string path = incoming.substr(prefix);
    if (isDirectory || path == kManifest || !namesFile(manifest, path)) return 0;
    *at = path;
    return moveOne(path);
  });
}

int BackupFolder::moveOne(const std::string& path) {
  const std::string from = incomingPath(path);
  const std::string directory = parentOf(path);
  if (const int failed = root_->makeDirectories(directory); failed != 0) return failed;
  UniqueFd fromParent;
  UniqueFd toParent;
  constexpr int kFlags = O_RDONLY | O_DIRECTORY;
  if (const int failed = root_->openFile(parentOf(from), kFlags, &fromParent); failed != 0) {
    return failed;
  }
  if (const int failed = root_->openFile(directory, kFlags, &toParent); failed != 0) return failed;
  const std::string leaf(lastPathComponent(path));
  if (const int failed = removeEmptyDirectories(path); failed != 0) return failed;
  // Nothing that is not the backup's own is replaced.
  const bool replaces = path == kManifest || (previous_ && namesFile(*previous_, path));
  if (::renameat2(fromParent.get(), leaf.c_str(), toParent.get(), leaf.c_str(),
                  replaces ? 0 : RENAME_NOREPLACE) != 0) {
    return errno;
  }
  touched_.insert(directory);
  touched_.insert(parentOf(from));
  return 0;
}

// What files of the old backup have left in the place of a file of the new one.
int BackupFolder::removeEmptyDirectories(const std::string& path) {
  struct stat status;
  if (root_->status(path, &status) != 0 || !S_ISDIR(status.st_mode)) return 0;
  const int failed = walkTree(*root_, path, [&](const std::string& inside, bool isDirectory) {
    return isDirectory ? root_->remove(inside) : EEXIST;
  });
  return failed != 0 ? failed : root_->remove(path);
}

int BackupFolder::syncTouched() {
  if (touched_.size() > kFewDirectories) return syncAll();
  for (const std::string& directory : touched_) {
    const int failed = root_->syncDirectory(directory);
    if (failed != 0 && failed != ENOENT && failed != ENOTDIR) return failed;
  }
  return 0;
}

int BackupFolder::clearIncoming(const std::set<std::string, std::less<>>& kept) {
  preparedDirectory_.clear();
  struct stat status;
  if (root_->status(kIncoming, &status) == ENOENT) return 0;
  const int failed = walkTree(*root_, kIncoming, [&](const std::string& path, bool isDirectory) {
    if (path == kJournal || kept.contains(path)) return 0;
    const int refused = root_->remove(path);
    return isDirectory && refused == ENOTEMPTY ? 0 : refused;
  });
  if (failed != 0 || !kept.empty()) return failed;
  // The journal goes last: it says that the directory is ours.
  for (const char* path : {kJournal, kIncoming}) {
    const int refused = root_->remove(path);
    if (refused != 0 && refused != ENOENT) return refused;
  }
  return root_->syncDirectory("/");
}

void BackupFolder::giveUp() {
  struct stat status;
  if (root_->status(incomingPath(kManifest), &status) != ENOENT) return;
  // What is left is cleared by the next taking.
  static_cast<void>(clearIncoming({}));
}

}  // namespace kx
