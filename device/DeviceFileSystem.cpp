#include "device/DeviceFileSystem.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "device/DeviceErrors.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

std::string identifierOf(const struct stat& status) {
  return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

class HeldLock : public FileLock {
 public:
  explicit HeldLock(UniqueFd fd) : fd_(std::move(fd)) {}

 private:
  UniqueFd fd_;
};

struct Level {
  std::string path;
  std::string identifier;
  std::vector<std::string> names;  // sorted from the end, so that the next one is the last
};

// One directory of a walk; null when it cannot be listed.
std::unique_ptr<Level> openLevel(const DeviceRoot& root, const std::string& path,
                                 const FileSystem::ErrorHandler& onError) {
  auto level = std::make_unique<Level>();
  level->path = path;
  struct stat status;
  int failed = root.status(path, &status);
  if (failed == 0) failed = root.list(path, &level->names);
  if (failed != 0) {
    onError(path, posixError(path, failed));
    return nullptr;
  }
  level->identifier = identifierOf(status);
  std::reverse(level->names.begin(), level->names.end());
  return level;
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
  std::vector<std::uint8_t> bytes;
  if (!done(path, root_->readFile(path, &bytes), error)) return nullptr;
  return std::make_shared<const Data>(std::move(bytes));
}

bool DeviceFileSystem::writeFileAtomically(const std::string& path,
                                           std::span<const std::uint8_t> bytes, ErrorPtr* error) {
  return done(path, readOnly_ ? EROFS : root_->writeAtomically(path, bytes), error);
}

bool DeviceFileSystem::removeItem(const std::string& path, ErrorPtr* error) {
  return done(path, readOnly_ ? EROFS : root_->remove(path), error);
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
  std::vector<std::unique_ptr<Level>> levels;
  if (auto top = openLevel(*root_, path, onError)) levels.push_back(std::move(top));
  while (!levels.empty()) {
    Level& level = *levels.back();
    if (level.names.empty()) {
      levels.pop_back();
      continue;
    }
    FileProperties entry;
    entry.name = std::move(level.names.back());
    level.names.pop_back();
    entry.path = pathByAppending(level.path, entry.name);
    entry.parentPath = level.path;
    entry.parentResourceIdentifier = level.identifier;
    struct stat status;
    if (const int failed = root_->status(entry.path, &status); failed != 0) {
      entry.error = posixError(entry.path, failed);
    } else {
      entry.fileSize = status.st_size;
      entry.isDirectory = S_ISDIR(status.st_mode);
    }
    const EnumerationChoice choice = onEntry(entry);
    if (!entry.isDirectory || choice == EnumerationChoice::kSkipDescendants) continue;
    if (auto next = openLevel(*root_, entry.path, onError)) levels.push_back(std::move(next));
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
