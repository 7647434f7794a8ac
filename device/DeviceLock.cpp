#include "device/DeviceLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <sstream>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/MediaFolders.h"

namespace kx {
namespace {

constexpr std::string_view kClean = "clean";

std::int64_t nanoseconds(const struct timespec& time) {
  return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

std::string textOf(const CleanState& state) {
  std::ostringstream text;
  text << kClean << "\ndatabase " << state.databaseSize << ' ' << state.databaseTime << '\n';
  for (const auto& [folder, time] : state.folderTimes) text << folder << ' ' << time << '\n';
  text << "end\n";
  return text.str();
}

std::optional<CleanState> stateFrom(const std::string& content) {
  std::istringstream text(content);
  std::string word;
  CleanState state;
  if (!(text >> word) || word != kClean) return std::nullopt;
  if (!(text >> word >> state.databaseSize >> state.databaseTime) || word != "database") {
    return std::nullopt;
  }
  while (text >> word) {
    if (word == "end") return state;
    if (!(text >> state.folderTimes[word])) break;
  }
  return std::nullopt;  // cut short
}

std::string contentOf(int fd) {
  std::string content;
  char buffer[4096];
  while (true) {
    const ssize_t count = ::pread(fd, buffer, sizeof buffer, static_cast<off_t>(content.size()));
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return content;
    content.append(buffer, static_cast<std::size_t>(count));
  }
}

// The process that has the lock of an open file, as the kernel lists it; 0 when it does not say.
std::int64_t holderOf(int fd) {
  struct stat status;
  if (::fstat(fd, &status) != 0) return 0;
  const std::string inode = ":" + std::to_string(status.st_ino);
  std::ifstream locks("/proc/locks");
  std::string line;
  while (std::getline(locks, line)) {
    // "1: FLOCK  ADVISORY  READ 1234 fe:01:5678 0 EOF"
    std::istringstream words(line);
    std::string number, kind, mode, access, file;
    std::int64_t pid = 0;
    if (!(words >> number >> kind >> mode >> access >> pid >> file) || kind != "FLOCK") continue;
    if (file.ends_with(inode) && pid > 0) return pid;
  }
  return 0;
}

// The holder's pid stands in the file unless it only reads.
ErrorPtr lockedBy(int fd, const std::string& content) {
  std::int64_t pid = 0;
  if (!(std::istringstream(content) >> pid)) pid = holderOf(fd);
  Dictionary info;
  info.set(kErrorMessageKey,
           Value::string("another process holds the device (pid " + std::to_string(pid) + ")"));
  info.set("pid", Value::integer(pid));
  return std::make_shared<const Error>(kDeviceErrorDomain,
                                       static_cast<std::int64_t>(DeviceError::kLocked),
                                       Value::dictionary(std::move(info)));
}

}  // namespace

CleanState CleanState::of(const DeviceRoot& root) {
  CleanState state;
  struct stat status;
  if (root.status(device_paths::kDatabase, &status) == 0) {
    state.databaseSize = status.st_size;
    state.databaseTime = nanoseconds(status.st_mtim);
  }
  std::vector<std::string> names;
  if (root.list(device_paths::kSyncedAssets, &names) != 0) return state;
  for (const std::string& name : names) {
    if (!MediaFolders::folderNumber(name)) continue;
    const std::string path = std::string(device_paths::kSyncedAssets) + "/" + name;
    if (root.status(path, &status) == 0) state.folderTimes[name] = nanoseconds(status.st_mtim);
  }
  return state;
}

std::unique_ptr<DeviceLock> DeviceLock::take(const std::shared_ptr<DeviceRoot>& root,
                                             ErrorPtr* error) {
  UniqueFd fd;
  if (const int failed = root->openFile(device_paths::kLock, O_RDWR | O_CREAT, &fd); failed != 0) {
    setError(error, systemError("cannot open", device_paths::kLock, failed));
    return nullptr;
  }
  if (::flock(fd.get(), LOCK_EX | LOCK_NB) != 0) {
    const int why = errno;
    setError(error, why == EWOULDBLOCK ? lockedBy(fd.get(), contentOf(fd.get()))
                                       : systemError("cannot lock", device_paths::kLock, why));
    return nullptr;
  }
  std::unique_ptr<DeviceLock> lock(new DeviceLock(std::move(fd)));
  lock->lastState_ = stateFrom(contentOf(lock->fd_.get()));
  return lock;
}

std::unique_ptr<DeviceLock> DeviceLock::share(const std::shared_ptr<DeviceRoot>& root,
                                              ErrorPtr* error) {
  UniqueFd fd;
  const int failed = root->openFile(device_paths::kLock, O_RDONLY, &fd);
  if (failed == ENOENT || failed == ENOTDIR) return nullptr;
  if (failed != 0) {
    setError(error, systemError("cannot open", device_paths::kLock, failed));
    return nullptr;
  }
  if (::flock(fd.get(), LOCK_SH | LOCK_NB) != 0) {
    const int why = errno;
    setError(error, why == EWOULDBLOCK ? lockedBy(fd.get(), contentOf(fd.get()))
                                       : systemError("cannot lock", device_paths::kLock, why));
    return nullptr;
  }
  std::unique_ptr<DeviceLock> lock(new DeviceLock(std::move(fd)));
  lock->lastState_ = stateFrom(contentOf(lock->fd_.get()));
  return lock;
}

int DeviceLock::write(const std::string& text) {
  std::size_t done = 0;
  while (done < text.size()) {
    const ssize_t count =
        ::pwrite(fd_.get(), text.data() + done, text.size() - done, static_cast<off_t>(done));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    done += static_cast<std::size_t>(count);
  }
  if (::ftruncate(fd_.get(), static_cast<off_t>(text.size())) != 0) return errno;
  return ::fdatasync(fd_.get()) == 0 ? 0 : errno;
}

int DeviceLock::markInUse() { return write(std::to_string(::getpid()) + "\n"); }

int DeviceLock::markClean(const CleanState& state) { return write(textOf(state)); }

}  // namespace kx
