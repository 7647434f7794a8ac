#include "daemon/RestoreLoop.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "backup/FileHash.h"
#include "daemon/RunErrors.h"
#include "daemon/TransferLoop.h"
#include "device/DeviceLayout.h"

namespace kx {
namespace {

constexpr std::size_t kBatchFiles = 200;
constexpr std::uint64_t kBatchBytes = std::uint64_t{512} << 20;
constexpr double kBatchSeconds = 2.0;
// From this many files on, one syncfs costs less than an fsync of each.
constexpr std::size_t kSyncWholeFrom = 20;

ErrorPtr transferError(int code, const std::string& reason) {
  return Error::make(kFRErrorDomain, code, reason);
}

ErrorPtr deviceError(const std::string& doing, int code) {
  const bool full = code == ENOSPC || code == EDQUOT;
  return transferError(full ? kFRErrorDiskFull : kFRErrorReadOrWrite,
                       full ? kNoSpaceText : doing + ": " + std::strerror(code));
}

std::string directoryOf(const std::string& path) { return path.substr(0, path.rfind('/')); }

bool isFullDisk(const ErrorPtr& error) { return error && error->code() == kFRErrorDiskFull; }

}  // namespace

ErrorPtr RestoreLoop::run(const std::vector<FRAssetPtr>& outstanding) {
  std::vector<Item> items;
  items.reserve(outstanding.size());
  for (const FRAssetPtr& request : outstanding) {
    if (!request || !request->isRestore()) continue;
    Item item;
    item.request = request;
    item.path = request->path().value_or(request->identifier());
    item.file = context_.backup.manifest().find(item.path);
    asked_.insert(item.path);
    items.push_back(std::move(item));
  }
  result_.requested = items.size();
  if (ErrorPtr tooMuch = refuseWithoutSpace(items)) return tooMuch;
  work(std::move(items));
  return nullptr;
}

void RestoreLoop::bringRest() {
  std::vector<Item> items;
  for (const BackupFile& file : context_.backup.manifest().files) {
    if (asked_.contains(file.path)) continue;
    struct stat status;
    const bool isThere = context_.device.root().status(file.path, &status) == 0 &&
                         S_ISREG(status.st_mode) && status.st_size == file.size &&
                         BackupFileTime::fromUnix(status.st_mtim) == file.modified;
    if (isThere) continue;
    Item item;
    item.path = file.path;
    item.file = &file;
    items.push_back(std::move(item));
  }
  work(std::move(items));
}

ErrorPtr RestoreLoop::refuseWithoutSpace(const std::vector<Item>& items) const {
  std::uint64_t needed = 0;
  for (const Item& item : items) {
    struct stat status;
    if (item.file == nullptr || context_.device.root().status(item.path, &status) == 0) continue;
    needed += static_cast<std::uint64_t>(item.file->size);
  }
  if (needed == 0) return nullptr;
  const std::uint64_t free = freeBytesAt(context_.options.deviceRoot);
  const std::uint64_t wanted = needed + context_.options.reserveBytes;
  if (wanted <= free) return nullptr;
  return syncError(SyncErrorCode::kNoSpace, std::string(kNoSpaceText) + ": " +
                                                std::to_string(needed) + " bytes needed and " +
                                                std::to_string(context_.options.reserveBytes) +
                                                " kept free, " + std::to_string(free) + " free, " +
                                                std::to_string(wanted - free) + " missing");
}

void RestoreLoop::work(std::vector<Item> items) {
  progress_.phase = SyncPhase::kTransferring;
  progress_.filesTotal += items.size();
  for (const Item& item : items) {
    if (item.file != nullptr) progress_.bytesTotal += static_cast<std::uint64_t>(item.file->size);
  }
  tell();
  Clock& clock = context_.device.platform().clock();
  std::vector<Item> batch;
  std::uint64_t bytes = 0;
  double begun = clock.absoluteTime();
  const auto settleBatch = [&] {
    settle(batch);
    batch.clear();
    bytes = 0;
    begun = clock.absoluteTime();
  };
  for (Item& item : items) {
    if (context_.cancel.isCancelled()) cancelled_ = true;
    if (cancelled_ || deviceFailure_) break;
    fetch(item);
    if (cancelled_) break;
    ++progress_.filesDone;
    tell();
    if (item.file != nullptr) bytes += static_cast<std::uint64_t>(item.file->size);
    batch.push_back(std::move(item));
    if (batch.size() >= kBatchFiles || bytes >= kBatchBytes ||
        clock.absoluteTime() - begun >= kBatchSeconds) {
      settleBatch();
    }
  }
  settleBatch();
}

// What cannot be brought whatever is tried.
ErrorPtr RestoreLoop::refusalOf(const Item& item) const {
  if (item.file == nullptr) {
    return transferError(kFRErrorFileMissingAtHost, "the backup does not hold it");
  }
  const std::string camera = std::string(device_paths::kDcim) + "/";
  if (DeviceRoot::checkPath(item.path) != 0 || !item.path.starts_with(camera)) {
    return transferError(kFRErrorDamagedInBackup, "it is no path of a camera file");
  }
  return nullptr;
}

void RestoreLoop::fetch(Item& item) {
  if (!diskFull_ && isNoSpaceError(context_.device.health().firstFailure())) diskFull_ = true;
  item.error = diskFull_ ? transferError(kFRErrorDiskFull, kNoSpaceText) : refusalOf(item);
  if (item.error) return;
  const std::uint64_t before = progress_.bytesDone;
  switch (presenceOf(*item.file)) {
    case Presence::kSame:
      item.present = true;
      break;
    case Presence::kOther:
      item.error = transferError(kFRErrorOtherFileThere,
                                 "the device has another file of this name, which stays");
      break;
    case Presence::kMissing:
      for (int attempt = 0; attempt < kTransferAttempts && !cancelled_; ++attempt) {
        progress_.bytesDone = before;
        item.error = fetchOnce(item);
        if (!item.error || item.error->code() != kFRErrorReadOrWrite || deviceFailure_) break;
      }
      break;
  }
  // What was looked at then may not have been looked at to its end.
  if (context_.cancel.isCancelled()) cancelled_ = true;
  // A file of the backup that can never be read is as good as damaged.
  if (item.error && item.error->code() == kFRErrorReadOrWrite && !deviceFailure_) {
    item.error = transferError(kFRErrorDamagedInBackup, item.error->message());
  }
  if (isFullDisk(item.error)) diskFull_ = true;
  progress_.bytesDone = before + static_cast<std::uint64_t>(item.file->size);
}

ErrorPtr RestoreLoop::fetchOnce(Item& item) {
  UniqueFd opened;
  const int failed = context_.backup.openFile(item.path, &opened);
  if (failed == ENOENT || failed == ENOTDIR) {
    return transferError(kFRErrorFileMissingAtHost, "it is missing in the backup");
  }
  if (failed != 0) {
    return transferError(kFRErrorReadOrWrite,
                         "it cannot be opened in the backup: " + std::string(strerror(failed)));
  }
  const FileDescriptor source(opened.release());
  struct stat status;
  if (::fstat(source.get(), &status) != 0 || status.st_size != item.file->size) {
    return transferError(kFRErrorDamagedInBackup,
                         "it is damaged in the backup: it has another size");
  }
  Staging::Result taken = context_.staging.take(source, [this](std::uint64_t bytes) {
    progress_.bytesDone += bytes;
    tell();
    return !context_.cancel.isCancelled();
  });
  if (taken.cancelled) {
    cancelled_ = true;
    return nullptr;
  }
  if (taken.error) {
    if (taken.ofDevice && !isFullDisk(taken.error)) deviceFailure_ = taken.error;
    return taken.error;
  }
  item.staged = std::string(device_paths::kMedia) + "/" + taken.path;
  ErrorPtr error = checkStaged(item);
  if (!error) return nullptr;
  if (error->code() == kFRErrorReadOrWrite) deviceFailure_ = error;
  context_.staging.drop(taken.path);
  item.staged.clear();
  return error;
}

// The copy on the device is what counts, and it gets the time of the file that was backed up.
ErrorPtr RestoreLoop::checkStaged(const Item& item) const {
  UniqueFd file;
  const int failed = context_.device.root().openFile(item.staged, O_RDWR | O_NONBLOCK, &file);
  if (failed != 0) return deviceError("the copy cannot be opened", failed);
  if (!isSame(file.get(), *item.file)) {
    return transferError(kFRErrorDamagedInBackup,
                         "it is damaged in the backup: it is not what the manifest says");
  }
  const struct timespec modified = item.file->modified.unixTime();
  const struct timespec times[2] = {modified, modified};
  if (::futimens(file.get(), times) == 0) return nullptr;
  return deviceError("the copy's time cannot be set", errno);
}

bool RestoreLoop::isSame(int file, const BackupFile& wanted) const {
  struct stat status;
  if (::fstat(file, &status) != 0 || !S_ISREG(status.st_mode) || status.st_size != wanted.size) {
    return false;
  }
  BackupPart content;
  const auto goOn = [this] { return !context_.cancel.isCancelled(); };
  return hashFile(file, goOn, &content) == 0 && content.sha256 == wanted.sha256;
}

RestoreLoop::Presence RestoreLoop::presenceOf(const BackupFile& file) const {
  UniqueFd opened;
  const int failed = context_.device.root().openFile(file.path, O_RDONLY | O_NONBLOCK, &opened);
  if (failed == ENOENT || failed == ENOTDIR) return Presence::kMissing;
  return failed == 0 && isSame(opened.get(), file) ? Presence::kSame : Presence::kOther;
}

void RestoreLoop::settle(std::vector<Item>& batch) {
  if (const ErrorPtr failed = makeContentsDurable(batch)) {
    if (isFullDisk(failed)) {
      diskFull_ = true;
    } else {
      deviceFailure_ = failed;
    }
    for (Item& item : batch) {
      if (!item.error) item.error = failed;
    }
  }
  for (Item& item : batch) place(item);
  syncDirectories(batch);
  for (const Item& item : batch) report(item);
  tell();
}

// Files that were there already count too: an earlier run may have been cut off before it came to
// this.
ErrorPtr RestoreLoop::makeContentsDurable(const std::vector<Item>& batch) const {
  std::vector<const std::string*> paths;
  for (const Item& item : batch) {
    if (!item.error) paths.push_back(item.present ? &item.path : &item.staged);
  }
  DeviceRoot& root = context_.device.root();
  if (paths.size() >= kSyncWholeFrom) {
    return ::syncfs(root.fd()) == 0 ? nullptr : deviceError("files cannot be synced", errno);
  }
  for (const std::string* path : paths) {
    UniqueFd file;
    int failed = root.openFile(*path, O_RDONLY | O_NONBLOCK, &file);
    if (failed == 0 && ::fsync(file.get()) != 0) failed = errno;
    if (failed != 0) return deviceError("a file cannot be synced", failed);
  }
  return nullptr;
}

void RestoreLoop::place(Item& item) {
  if (item.staged.empty()) return;
  DeviceRoot& root = context_.device.root();
  if (!item.error) {
    int failed = root.renameNew(item.staged, item.path);
    if (failed == ENOENT || failed == ENOTDIR) {
      failed = root.makeDirectories(directoryOf(item.path));
      if (failed == 0) failed = root.renameNew(item.staged, item.path);
    }
    if (failed == 0) return;
    item.error = failed == EEXIST || failed == ENOTDIR || failed == ELOOP || failed == EXDEV
                     ? transferError(kFRErrorOtherFileThere,
                                     "the device has something else where it belongs, which stays")
                     : deviceError("it cannot be put in its place", failed);
    if (isFullDisk(item.error)) diskFull_ = true;
    if (item.error->code() == kFRErrorReadOrWrite) deviceFailure_ = item.error;
  }
  context_.staging.drop(item.staged);
}

void RestoreLoop::syncDirectories(std::vector<Item>& batch) {
  std::set<std::string> failedDirectories;
  std::set<std::string> directories;
  for (const Item& item : batch) {
    if (!item.error) directories.insert(directoryOf(item.path));
  }
  for (const std::string& directory : directories) {
    const int failed = context_.device.root().syncDirectory(directory);
    if (failed == 0) continue;
    deviceFailure_ = deviceError("a folder cannot be synced", failed);
    failedDirectories.insert(directory);
  }
  if (failedDirectories.empty()) return;
  for (Item& item : batch) {
    if (!item.error && failedDirectories.contains(directoryOf(item.path))) {
      item.error = deviceFailure_;
    }
  }
}

void RestoreLoop::report(const Item& item) {
  if (item.error) {
    fail(item, item.error);
  } else {
    ++(item.present ? result_.present : result_.restored);
  }
  if (!item.request) return;
  const auto raised = context_.plugin.call([&](FRClient& client) {
    client.assetTransfer(item.request, item.error == nullptr, item.error);
  });
  if (raised && !item.error) fail(item, raisedError("reporting it failed", *raised));
}

void RestoreLoop::fail(const Item& item, const ErrorPtr& error) {
  ++progress_.failures;
  result_.failed.push_back({item.path, error->domain(), error->code(), error->message()});
}

void RestoreLoop::tell() {
  if (context_.progress) context_.progress(progress_);
}

}  // namespace kx
