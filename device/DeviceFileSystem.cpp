#include "device/DeviceFileSystem.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "device/DeviceErrors.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

std::string identifierOf(const struct stat& status) {
  return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

// Smaller files are not worth it.
constexpr std::size_t kLeastShared = std::size_t{1} << 20;

bool isSame(const timespec& a, const timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

// Whether nothing can have changed the file between the two.
bool isSame(const struct stat& a, const struct stat& b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_size == b.st_size &&
         isSame(a.st_mtim, b.st_mtim) && isSame(a.st_ctim, b.st_ctim);
}

class HeldLock : public FileLock {
 public:
  explicit HeldLock(UniqueFd fd) : fd_(std::move(fd)) {}

 private:
  UniqueFd fd_;
};

// A directory on the way of a walk, held open.
struct Level {
  std::unique_ptr<DIR, int (*)(DIR*)> stream{nullptr, &::closedir};
  FileProperties entry;            // what its entries have in common, and the entry in hand
  std::string text;                // the names, each with its NUL
  std::vector<std::size_t> names;  // where they begin, sorted from the end: the next is the last
};

int openLevel(const DeviceRoot& root, const std::string& path, Level* level) {
  UniqueFd fd;
  if (const int failed = root.openFile(path, O_RDONLY | O_DIRECTORY, &fd); failed != 0) {
    return failed;
  }
  struct stat status;
  if (::fstat(fd.get(), &status) != 0) return errno;
  level->stream.reset(::fdopendir(fd.get()));
  if (!level->stream) return errno;
  fd.release();  // the stream closes it
  errno = 0;
  while (const dirent* found = ::readdir(level->stream.get())) {
    const std::string_view name = found->d_name;
    if (name != "." && name != "..") {
      level->names.push_back(level->text.size());
      level->text.append(name).push_back('\0');
    }
    errno = 0;
  }
  if (errno != 0) return errno;
  const char* text = level->text.c_str();
  std::sort(level->names.begin(), level->names.end(),
            [text](std::size_t a, std::size_t b) { return std::strcmp(text + a, text + b) > 0; });
  level->entry.parentPath = path;
  level->entry.parentResourceIdentifier = identifierOf(status);
  return 0;
}

}  // namespace

bool DeviceFileSystem::done(const std::string& path, int errorNumber, ErrorPtr* error) const {
  if (errorNumber == 0) return true;
  setError(error, posixError(path, errorNumber));
  return false;
}

bool DeviceFileSystem::fileExists(const std::string& path) {
  struct stat status;
  return root_->status(path, &status) == 0;
}

DataPtr DeviceFileSystem::readFile(const std::string& path, ErrorPtr* error) {
  if (DataPtr bytes = shared(path)) return bytes;
  struct stat status;
  const bool isThere = root_->status(path, &status) == 0;
  std::vector<std::uint8_t> bytes;
  if (!done(path, root_->readFile(path, &bytes), error)) return nullptr;
  auto data = std::make_shared<const Data>(std::move(bytes));
  if (isThere) share(path, status, data);
  return data;
}

DataPtr DeviceFileSystem::shared(const std::string& path) const {
  const std::lock_guard<std::mutex> lock(sharedMutex_);
  const auto known = shared_.find(path);
  DataPtr bytes = known == shared_.end() ? nullptr : known->second.bytes.lock();
  struct stat status;
  if (!bytes || root_->status(path, &status) != 0) return nullptr;
  return isSame(status, known->second.status) ? bytes : nullptr;
}

// The status is one that the file had not later than with these bytes.
void DeviceFileSystem::share(const std::string& path, const struct stat& status,
                             const DataPtr& bytes) {
  if (bytes->length() < kLeastShared) return;
  const std::lock_guard<std::mutex> lock(sharedMutex_);
  std::erase_if(shared_, [](const auto& entry) { return entry.second.bytes.expired(); });
  shared_[path] = {status, bytes};
}

bool DeviceFileSystem::fileHolds(const std::string& path, std::span<const std::uint8_t> bytes) {
  return root_->fileHolds(path, bytes);
}

bool DeviceFileSystem::writeFileAtomically(const std::string& path,
                                           std::span<const std::uint8_t> bytes, ErrorPtr* error) {
  return done(path, readOnly_ ? EROFS : root_->writeAtomically(path, bytes), error);
}

bool DeviceFileSystem::writeDataAtomically(const std::string& path, const DataPtr& bytes,
                                           ErrorPtr* error) {
  struct stat status;
  const int failed = readOnly_ ? EROFS : root_->writeAtomically(path, bytes->span(), &status);
  if (!done(path, failed, error)) return false;
  share(path, status, bytes);
  return true;
}

class DeviceFileSystem::Prepared : public PreparedFile {
 public:
  Prepared(DeviceFileSystem& files, std::string path, DataPtr bytes)
      : files_(files), path_(std::move(path)), bytes_(std::move(bytes)) {
    isReady_ = files_.root_->writeTemporary(path_, bytes_->span(), &file_) == 0;
  }
  bool putInPlace(ErrorPtr* error) override {
    if (!isReady_) return files_.writeDataAtomically(path_, bytes_, error);
    return files_.done(path_, file_.putInPlace(), error);
  }

 private:
  DeviceFileSystem& files_;
  const std::string path_;
  const DataPtr bytes_;
  TemporaryFile file_;
  bool isReady_ = false;
};

std::unique_ptr<FileSystem::PreparedFile> DeviceFileSystem::prepareFile(const std::string& path,
                                                                        DataPtr bytes) {
  if (readOnly_) return FileSystem::prepareFile(path, std::move(bytes));
  return std::make_unique<Prepared>(*this, path, std::move(bytes));
}

bool DeviceFileSystem::removeItem(const std::string& path, ErrorPtr* error) {
  if (!done(path, readOnly_ ? EROFS : root_->remove(path), error)) return false;
  if (onRemoved_) onRemoved_(path);
  return true;
}

bool DeviceFileSystem::createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) {
  struct stat status;
  if (readOnly_ && root_->status(path, &status) == 0 && S_ISDIR(status.st_mode)) return true;
  return done(path, readOnly_ ? EROFS : root_->makeDirectories(path), error);
}

std::vector<std::string> DeviceFileSystem::contentsOfDirectory(const std::string& path,
                                                               ErrorPtr* error) {
  std::vector<std::string> names;
  if (!done(path, root_->list(path, &names), error)) names.clear();
  return names;
}

void DeviceFileSystem::enumerate(const std::string& path, const EntryHandler& onEntry,
                                 const ErrorHandler& onError) {
  std::vector<Level> levels;
  const auto descend = [&](const std::string& directory) {
    Level level;
    if (const int failed = openLevel(*root_, directory, &level); failed != 0) {
      onError(directory, posixError(directory, failed));
    } else {
      levels.push_back(std::move(level));
    }
  };
  descend(path);
  while (!levels.empty()) {
    Level& level = levels.back();
    if (level.names.empty()) {
      levels.pop_back();
      continue;
    }
    FileProperties& entry = level.entry;
    entry.name.assign(level.text.c_str() + level.names.back());
    level.names.pop_back();
    entry.path.assign(entry.parentPath);
    if (entry.path.back() != '/') entry.path += '/';
    entry.path += entry.name;
    struct stat status;
    const bool found = ::fstatat(::dirfd(level.stream.get()), entry.name.c_str(), &status,
                                 AT_SYMLINK_NOFOLLOW) == 0;
    const int failed = found ? 0 : errno;
    if (failed == ENOENT) {
      onError(entry.path, posixError(entry.path, failed));
      continue;
    }
    entry.error = found ? nullptr : posixError(entry.path, failed);
    entry.fileSize = found ? status.st_size : 0;
    entry.isDirectory = found && S_ISDIR(status.st_mode);
    const EnumerationChoice choice = onEntry(entry);
    if (entry.isDirectory && choice == EnumerationChoice::kDescend) {
      const std::string directory = entry.path;  // the levels move
      descend(directory);
    }
  }
}

std::string DeviceFileSystem::resourceIdentifier(const std::string& path) {
  struct stat status;
  return root_->status(path, &status) == 0 ? identifierOf(status) : std::string();
}

std::uint32_t DeviceFileSystem::blockSize(const std::string& path, ErrorPtr* error) {
  UniqueFd fd;
  if (!done(path, root_->openFile(path, O_PATH, &fd), error)) return 0;
  struct statfs answer;
  if (::fstatfs(fd.get(), &answer) != 0) {
    setError(error, posixError(path, errno));
    return 0;
  }
  const auto fragment = answer.f_frsize != 0 ? answer.f_frsize : answer.f_bsize;
  return static_cast<std::uint32_t>(fragment);
}

FileSystem::LockAttempt DeviceFileSystem::tryLock(const std::string& path) {
  LockAttempt attempt;
  UniqueFd fd;
  if (root_->openFile(path, O_RDONLY | O_NONBLOCK, &fd) != 0) return attempt;
  if (::flock(fd.get(), LOCK_EX | LOCK_NB) != 0) {
    attempt.outcome = LockOutcome::kHeldElsewhere;
    return attempt;
  }
  attempt.outcome = LockOutcome::kTaken;
  attempt.lock = std::make_unique<HeldLock>(std::move(fd));
  return attempt;
}

}  // namespace kx
