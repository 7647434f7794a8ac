#include "backup/BackupTaker.h"

#include <fcntl.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <exception>
#include <functional>
#include <system_error>
#include <unordered_map>
#include <unordered_set>

#include "backup/BackupAlbums.h"
#include "backup/BackupErrors.h"
#include "backup/BackupFolder.h"
#include "backup/BackupReader.h"
#include "backup/FileCopy.h"
#include "backup/FileHash.h"
#include "backup/RunningLock.h"
#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/LibraryBackup.h"
#include "device/Sha256.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

using Outcome = FileCopy::Outcome;

constexpr std::size_t kGuardFiles = 50;
constexpr std::size_t kFewFiles = 20;  // synced one by one
constexpr std::uint64_t kReserveBytes = 1U << 20;
constexpr std::size_t kNoteFiles = 200;
constexpr std::uint64_t kNoteBytes = 1ULL << 30;

// What ends the taking of a backup early.
struct Ending {
  ErrorPtr error;
};

void endWith(ErrorPtr error) {
  if (error) throw Ending{std::move(error)};
}

bool isFull(const ErrorPtr& error) {
  return error->domain() == kBackupErrorDomain &&
         error->code() == static_cast<std::int64_t>(BackupError::kNoSpace);
}

ErrorPtr libraryError(const ErrorPtr& error) {
  const bool full = error->domain() == kDeviceErrorDomain &&
                    error->code() == static_cast<std::int64_t>(DeviceError::kNoSpace);
  return full ? backupError(BackupError::kNoSpace, "no space left on the backup's disk") : error;
}

std::string systemText(int errorNumber) {
  return std::error_code(errorNumber, std::generic_category()).message();
}

// The files from a path on, of a list that is sorted by path.
template <typename File>
auto from(const std::vector<File>& files, std::string_view path) {
  return std::lower_bound(files.begin(), files.end(), path,
                          [](const File& file, std::string_view key) { return file.path < key; });
}

class Taking {
 public:
  Taking(ReferenceDevice& device, const BackupRequest& request,
         const BackupProgressCallback& progress, BackupResult* result)
      : device_(device), request_(request), callback_(progress), result_(*result) {}

  void run();

 private:
  void readIdentity();
  void plan(const BackupScan& scan);
  void planOne(const BackupCandidate& candidate);
  void keepWhatFailed();
  void guard() const;
  std::size_t lostFiles() const;
  void begin();
  bool isWanted(const BackupFile& file) const;
  void checkSpace() const;
  void gather();
  void copyAll();
  void copyOne(const BackupCandidate& candidate, bool sync);
  void noteNow();
  void commit();
  void copyTheLibrary();
  void writeAlbums();
  bool goOn();
  void report();
  ErrorPtr writeFailure(const std::string& path, int errorNumber) const;
  void fail(const std::string& path, const std::string& reason);
  const BackupFile* oldFile(const std::string& path) const {
    return folder_->previous() == nullptr ? nullptr : folder_->previous()->find(path);
  }

  ReferenceDevice& device_;
  const BackupRequest& request_;
  const BackupProgressCallback& callback_;
  BackupResult& result_;
  BackupProgress progress_;
  bool stopped_ = false;
  std::unique_ptr<RunningLock> running_;
  std::unique_ptr<BackupFolder> folder_;
  BackupManifest manifest_;
  std::vector<std::string> devicePaths_;
  std::vector<BackupCandidate> toCopy_;  // by path
  std::vector<BackupFile> kept_;  // of the old backup, though not seen on the device as they are
  std::unordered_map<std::string, BackupFile> resumed_;  // copied by a taking that was cut off
  std::vector<BackupFile> copied_;                       // in .incoming
  std::size_t notedFiles_ = 0;
  std::uint64_t notedBytes_ = 0;
};

bool Taking::goOn() {
  progress_.failures = result_.failures.size();
  stopped_ = stopped_ || (callback_ && !callback_(progress_));
  return !stopped_;
}

void Taking::report() {
  if (!goOn()) {
    throw Ending{backupError(BackupError::kCancelled,
                             "ended early; the backup before is untouched, and the same command "
                             "goes on from here")};
  }
}

ErrorPtr Taking::writeFailure(const std::string& path, int errorNumber) const {
  return backupSystemError("cannot write", folder_->root().hostPath() + path, errorNumber);
}

void Taking::fail(const std::string& path, const std::string& reason) {
  result_.failures.push_back({path, reason});
}

void Taking::readIdentity() {
  struct stat status;
  if (device_.root().status(device_paths::kRestoreMarker, &status) == 0) {
    throw Ending{backupError(BackupError::kGuard,
                             "a restore of this device has not ended, so files may be missing on "
                             "it: end it with \"kxsync restore\" first")};
  }
  ErrorPtr error;
  const std::string identity = libraryIdentity(device_.root(), &error);
  endWith(error);
  if (!identity.empty()) manifest_.device = identity;
  manifest_.identity = UUIDString();
  manifest_.takenAt = device_.platform().clock().now();
  for (const std::string& entry : request_.paths) {
    std::string path = devicePathOfEntry(entry);
    if (path.empty()) {
      throw Ending{backupError(BackupError::kUnusable,
                               "the plug-in names \"" + entry + "\", which cannot be backed up")};
    }
    manifest_.paths.push_back(entry);
    devicePaths_.push_back(std::move(path));
  }
}

void Taking::plan(const BackupScan& scan) {
  result_.leftOut = scan.leftOut;
  result_.failures = scan.failures;
  if (scan.files.size() > backup_limits::kFiles) {
    throw Ending{backupError(BackupError::kIo, "there are more files than a backup can hold")};
  }
  for (const BackupCandidate& candidate : scan.files) planOne(candidate);
  keepWhatFailed();
}

void Taking::planOne(const BackupCandidate& candidate) {
  const std::string path = backupPathOf(candidate.path);
  const BackupFile* old = oldFile(candidate.path);
  const bool unchanged =
      old != nullptr && old->size == candidate.size && old->modified == candidate.modified;
  if (unchanged && folder_->holds(path, *old)) {
    manifest_.files.push_back(*old);
    return;
  }
  endWith(folder_->checkVacant(path));
  toCopy_.push_back(candidate);
}

// What cannot be looked at may be there as it was.
void Taking::keepWhatFailed() {
  if (folder_->previous() == nullptr) return;
  const std::vector<BackupFile>& files = folder_->previous()->files;
  for (const BackupProblem& failure : result_.failures) {
    const std::string beneath = failure.path + "/";
    const auto seen = from(toCopy_, beneath);
    const bool isDirectory = seen != toCopy_.end() && seen->path.starts_with(beneath);
    const BackupFile* old = oldFile(failure.path);
    if (old != nullptr && !isDirectory) kept_.push_back(*old);
    for (auto file = from(files, beneath); file != files.end() && file->path.starts_with(beneath);
         ++file) {
      kept_.push_back(*file);
    }
  }
}

std::size_t Taking::lostFiles() const {
  if (folder_->previous() == nullptr) return 0;
  std::unordered_set<std::string_view> present;
  for (const BackupFile& file : manifest_.files) present.insert(file.path);
  for (const BackupCandidate& file : toCopy_) present.insert(file.path);
  for (const BackupFile& file : kept_) present.insert(file.path);
  const std::vector<BackupFile>& files = folder_->previous()->files;
  return static_cast<std::size_t>(
      std::count_if(files.begin(), files.end(),
                    [&](const BackupFile& file) { return !present.contains(file.path); }));
}

void Taking::guard() const {
  const std::size_t lost = result_.removedFiles;
  if (lost == 0 || request_.allowLosses) return;
  const BackupManifest& old = *folder_->previous();
  const bool sameDevice = old.device == manifest_.device;
  const bool isMost =
      lost == old.files.size() || (lost > kGuardFiles && lost * 2 > old.files.size());
  if (sameDevice && !isMost) return;
  throw Ending{backupError(
      BackupError::kGuard,
      std::to_string(lost) + " of the " + std::to_string(old.files.size()) +
          " files of the backup " +
          (sameDevice ? "are not on the device any more"
                      : "are not on this device, whose library is another than the backup's,") +
          " and would be lost; --allow-deletes lets it pass")};
}

bool Taking::isWanted(const BackupFile& file) const {
  const auto found = from(toCopy_, file.path);
  return found != toCopy_.end() && found->path == file.path && found->size == file.size &&
         found->modified == file.modified;
}

void Taking::begin() {
  std::vector<BackupFile> resumed;
  endWith(folder_->begin([this](const BackupFile& file) { return isWanted(file); }, &resumed));
  for (BackupFile& file : resumed) {
    std::string path = file.path;
    resumed_.emplace(std::move(path), std::move(file));
  }
}

void Taking::checkSpace() const {
  struct statvfs disk;
  if (::fstatvfs(folder_->root().fd(), &disk) != 0) {
    throw Ending{backupSystemError("cannot examine", folder_->root().hostPath(), errno)};
  }
  const std::uint64_t block = std::max<std::uint64_t>(disk.f_frsize, 1);
  std::uint64_t needed = kReserveBytes;
  for (const BackupCandidate& file : toCopy_) {
    if (resumed_.contains(file.path)) continue;
    needed += (static_cast<std::uint64_t>(file.size) + block - 1) / block * block;
  }
  struct stat library;
  if (request_.withLibrary && device_.root().status(device_paths::kDatabase, &library) == 0) {
    needed += static_cast<std::uint64_t>(library.st_size);
  }
  const std::uint64_t free = block * disk.f_bavail;
  const bool fewNodes = disk.f_files > 0 && disk.f_favail < toCopy_.size() - resumed_.size();
  if (needed <= free && !fewNodes) return;
  throw Ending{backupError(BackupError::kNoSpace,
                           fewNodes
                               ? "no space left on the backup's disk: it can take " +
                                     std::to_string(disk.f_favail) + " more files"
                               : "no space left on the backup's disk: " + std::to_string(needed) +
                                     " bytes are needed, " + std::to_string(free) + " are free")};
}

void Taking::copyAll() {
  progress_.phase = BackupPhase::kCopying;
  progress_.filesTotal = toCopy_.size();
  for (const BackupCandidate& file : toCopy_) {
    progress_.bytesTotal += static_cast<std::uint64_t>(file.size);
  }
  report();
  const bool sync = toCopy_.size() <= kFewFiles;
  for (const BackupCandidate& candidate : toCopy_) {
    const auto resumed = resumed_.find(candidate.path);
    if (resumed != resumed_.end()) {
      copied_.push_back(resumed->second);
      manifest_.files.push_back(resumed->second);
      progress_.bytesDone += static_cast<std::uint64_t>(candidate.size);
    } else {
      copyOne(candidate, sync);
    }
    ++progress_.filesDone;
    report();
    const std::size_t files = copied_.size() - notedFiles_;
    if (files >= std::max(kNoteFiles, copied_.size() / 4) ||
        result_.copiedBytes - notedBytes_ >= kNoteBytes) {
      noteNow();
    }
  }
}

void Taking::noteNow() {
  endWith(folder_->note(copied_));
  notedFiles_ = copied_.size();
  notedBytes_ = result_.copiedBytes;
}

void Taking::copyOne(const BackupCandidate& candidate, bool sync) {
  const std::string path = backupPathOf(candidate.path);
  const std::string target = incomingPath(path);
  if (const int failed = folder_->prepare(path); failed != 0) {
    throw Ending{writeFailure(target, failed)};
  }
  const std::uint64_t before = progress_.bytesDone;
  const auto onBytes = [this](std::int64_t bytes) {
    progress_.bytesDone += static_cast<std::uint64_t>(bytes);
    return goOn();
  };
  FileCopy copy =
      copyFile({device_.root(), candidate.path, folder_->root(), target, sync, onBytes});
  progress_.bytesDone = before + static_cast<std::uint64_t>(candidate.size);
  switch (copy.outcome) {
    case Outcome::kCopied:
      ++result_.copiedFiles;
      result_.copiedBytes += static_cast<std::uint64_t>(copy.file.size);
      copied_.push_back(copy.file);
      manifest_.files.push_back(std::move(copy.file));
      return;
    case Outcome::kGone:
      return;
    case Outcome::kStopped:
      return report();  // raises
    case Outcome::kNotWritable:
      throw Ending{writeFailure(target, copy.error)};
    case Outcome::kUnreadable:
      fail(candidate.path, "cannot be read: " + systemText(copy.error));
      break;
    case Outcome::kChanging:
      fail(candidate.path, "it changes while it is read");
      break;
  }
  if (const BackupFile* old = oldFile(candidate.path)) kept_.push_back(*old);
}

void Taking::copyTheLibrary() {
  if (!request_.withLibrary) return;
  progress_.phase = BackupPhase::kLibrary;
  report();
  const std::string path = incomingPath(backup_names::kLibrary);
  // Made here, so that it is nobody else's to read; SQLite fills it.
  UniqueFd made;
  if (const int failed = folder_->root().openFile(path, O_WRONLY | O_CREAT | O_EXCL, &made);
      failed != 0) {
    throw Ending{writeFailure(path, failed)};
  }
  made.reset();
  ErrorPtr error;
  if (!copyLibrary(
          device_.root(), folder_->root().hostPath() + path, [this] { return goOn(); }, &error)) {
    report();
    throw Ending{libraryError(error)};
  }
  BackupPart part;
  if (const int failed = hashFile(
          folder_->root(), path, [this] { return goOn(); }, &part);
      failed != 0) {
    report();
    throw Ending{backupSystemError("cannot read", folder_->root().hostPath() + path, failed)};
  }
  manifest_.library = part;
}

void Taking::writeAlbums() {
  ErrorPtr error;
  const DeviceDump dump = device_.dump(false, &error);
  endWith(error);
  const std::vector<BackupAlbum> albums = ownAlbums(dump);
  const std::string text = serializeAlbums(albums);
  const std::string path = incomingPath(backup_names::kAlbums);
  const std::span<const std::uint8_t> bytes(reinterpret_cast<const std::uint8_t*>(text.data()),
                                            text.size());
  if (const int failed = folder_->root().writeAtomically(path, bytes); failed != 0) {
    throw Ending{writeFailure(path, failed)};
  }
  Sha256 hash;
  hash.update(bytes);
  manifest_.albums = {static_cast<std::int64_t>(text.size()), hash.hexDigest()};
  result_.albums = albums.size();
}

void Taking::commit() {
  progress_.phase = BackupPhase::kFinishing;
  report();
  std::vector<BackupFile>& files = manifest_.files;
  files.insert(files.end(), kept_.begin(), kept_.end());
  std::stable_sort(files.begin(), files.end(),
                   [](const BackupFile& a, const BackupFile& b) { return a.path < b.path; });
  const auto same = [](const BackupFile& a, const BackupFile& b) { return a.path == b.path; };
  files.erase(std::unique(files.begin(), files.end(), same), files.end());
  endWith(folder_->commit(manifest_));
  result_.manifest = std::move(manifest_);
}

void Taking::gather() {
  try {
    checkSpace();
    copyAll();
    copyTheLibrary();
    writeAlbums();
    commit();
  } catch (const Ending& ending) {
    if (isFull(ending.error)) {
      folder_->giveUp();
    } else if (copied_.size() > notedFiles_) {
      static_cast<void>(folder_->note(copied_));  // the next taking begins anew without it
    }
    throw;
  }
}

void Taking::run() {
  readIdentity();
  ErrorPtr error;
  running_ = RunningLock::take(device_.root(), device_.platform().clock(), &error);
  endWith(error);
  folder_ = BackupFolder::open(request_.backupPath, &error);
  endWith(error);
  report();
  const BackupScan scan = scanForBackup(device_.root(), devicePaths_, [this] { return goOn(); });
  report();
  plan(scan);
  result_.removedFiles = lostFiles();
  guard();
  begin();
  gather();
}

}  // namespace

BackupResult takeBackup(ReferenceDevice& device, const BackupRequest& request,
                        const BackupProgressCallback& progress) {
  BackupResult result;
  try {
    Taking(device, request, progress, &result).run();
  } catch (const Ending& ending) {
    result.error = ending.error;
  } catch (const std::exception& failure) {
    result.error = backupError(BackupError::kIo, failure.what());
  }
  return result;
}

}  // namespace kx
