#include "backup/RunningLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <string>

#include "backup/BackupErrors.h"
#include "device/DeviceLayout.h"

namespace kx {
namespace {

constexpr int kAttempts = 50;
constexpr double kSecondsBetween = 0.02;

ErrorPtr heldElsewhere(int fd) {
  char text[32] = {};
  const ssize_t count = ::pread(fd, text, sizeof text - 1, 0);
  const long pid = count > 0 ? std::strtol(text, nullptr, 10) : 0;
  Dictionary info;
  std::string message = "another backup of the device is running";
  if (pid > 0) {
    message += " (pid " + std::to_string(pid) + ")";
    info.set("pid", Value::integer(pid));
  }
  info.set(kErrorMessageKey, Value::string(message));
  return std::make_shared<const Error>(kBackupErrorDomain,
                                       static_cast<std::int64_t>(BackupError::kInUse),
                                       Value::dictionary(std::move(info)));
}

}  // namespace

std::unique_ptr<RunningLock> RunningLock::take(const DeviceRoot& device, Clock& clock,
                                               ErrorPtr* error) {
  UniqueFd fd;
  int failed = device.makeDirectories(device_paths::kTemporary);
  if (failed == 0) failed = device.openFile(kBackupRunningPath, O_RDWR | O_CREAT, &fd);
  DispatchSemaphore never(0);
  for (int attempt = 0; failed == 0 && ::flock(fd.get(), LOCK_EX | LOCK_NB) != 0; ++attempt) {
    if (errno == EWOULDBLOCK && attempt < kAttempts) {
      clock.wait(never, kSecondsBetween);
    } else if (errno != EINTR) {
      failed = errno;
    }
  }
  const std::string pid = std::to_string(::getpid()) + "\n";
  if (failed == 0 &&
      (::ftruncate(fd.get(), 0) != 0 || ::pwrite(fd.get(), pid.data(), pid.size(), 0) < 0)) {
    failed = errno;
  }
  if (failed == 0) return std::unique_ptr<RunningLock>(new RunningLock(std::move(fd)));
  setError(error, failed == EWOULDBLOCK
                      ? heldElsewhere(fd.get())
                      : backupSystemError("cannot lock", kBackupRunningPath, failed));
  return nullptr;
}

}  // namespace kx
