#include "backup/BackupScan.h"

#include <dirent.h>
#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <system_error>

#include "platform/foundation/Text.h"

namespace kx {
namespace {

std::string systemText(int errorNumber) {
  return std::error_code(errorNumber, std::generic_category()).message();
}

class Walk {
 public:
  Walk(const DeviceRoot& device, BackupScan* scan) : device_(device), scan_(scan) {}

  void start(const std::string& path) {
    struct stat status;
    const int failed = device_.status(path, &status);
    if (failed == ENOENT || failed == ENOTDIR) return;
    if (failed != 0) return fail(path, failed);
    examine(path, status);
  }
  bool more() const { return !waiting_.empty(); }
  void next() {
    const std::string path = std::move(waiting_.back());
    waiting_.pop_back();
    UniqueFd fd;
    if (const int failed = device_.openFile(path, O_RDONLY | O_DIRECTORY, &fd); failed != 0) {
      if (failed != ENOENT) fail(path, failed);
      return;
    }
    std::unique_ptr<DIR, int (*)(DIR*)> stream(::fdopendir(fd.get()), &::closedir);
    if (!stream) return fail(path, errno);
    const int directory = fd.release();  // the stream closes it
    errno = 0;
    while (const dirent* entry = ::readdir(stream.get())) {
      const std::string_view name = entry->d_name;
      if (name != "." && name != ".." && !DeviceRoot::isTemporaryName(name)) {
        examineEntry(directory, path, entry->d_name);
      }
      errno = 0;
    }
    if (errno != 0) fail(path, errno);
  }

 private:
  void examineEntry(int directory, const std::string& parent, const char* name) {
    std::string path = pathByAppending(parent, name);
    struct stat status;
    if (::fstatat(directory, name, &status, AT_SYMLINK_NOFOLLOW) != 0) {
      if (errno != ENOENT) fail(path, errno);
      return;
    }
    examine(path, status);
  }
  void examine(const std::string& path, const struct stat& status) {
    if (S_ISDIR(status.st_mode)) {
      waiting_.push_back(path);
    } else if (!S_ISREG(status.st_mode)) {
      const bool link = S_ISLNK(status.st_mode);
      scan_->leftOut.push_back({path, link ? "a link, not followed" : "no regular file"});
    } else if (!isValidUtf8(path)) {
      scan_->failures.push_back({path, "its name is no UTF-8"});
    } else if (backupPathOf(path).empty()) {
      scan_->failures.push_back({path, "its path cannot be kept in a backup"});
    } else if (status.st_size > backup_limits::kFileBytes) {
      scan_->failures.push_back({path, "it is too large"});
    } else {
      scan_->files.push_back({path, status.st_size, BackupFileTime::fromUnix(status.st_mtim)});
    }
  }
  void fail(const std::string& path, int errorNumber) {
    scan_->failures.push_back({path, "cannot be read: " + systemText(errorNumber)});
  }

  const DeviceRoot& device_;
  BackupScan* const scan_;
  std::vector<std::string> waiting_;
};

}  // namespace

BackupScan scanForBackup(const DeviceRoot& device, const std::vector<std::string>& paths,
                         const std::function<bool()>& goOn) {
  BackupScan scan;
  Walk walk(device, &scan);
  for (const std::string& path : paths) walk.start(path);
  while (walk.more() && goOn()) walk.next();
  const auto byPath = [](const auto& a, const auto& b) { return a.path < b.path; };
  std::sort(scan.files.begin(), scan.files.end(), byPath);
  const auto same = [](const auto& a, const auto& b) { return a.path == b.path; };
  // Entries of the list may lie inside each other.
  scan.files.erase(std::unique(scan.files.begin(), scan.files.end(), same), scan.files.end());
  for (auto* problems : {&scan.leftOut, &scan.failures}) {
    std::sort(problems->begin(), problems->end(), byPath);
    problems->erase(std::unique(problems->begin(), problems->end(), same), problems->end());
  }
  return scan;
}

}  // namespace kx
