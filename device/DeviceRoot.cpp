#include "device/DeviceRoot.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>

#include "device/DeviceErrors.h"

namespace kx {
namespace {

constexpr std::size_t kPathBytes = 1024;
constexpr std::size_t kComponentBytes = 255;
constexpr std::size_t kDepth = 32;
constexpr mode_t kDirectoryMode = 0700;
constexpr mode_t kFileMode = 0600;
constexpr std::string_view kTemporaryPrefix = ".kxtmp-";
constexpr std::size_t kTemporaryDigits = 16;
constexpr std::size_t kPieceBytes = std::size_t{128} << 10;

std::atomic<bool> kernelLacksOpenat2{false};

int openat2(int directory, const char* path, int flags, mode_t mode) {
  struct open_how how;
  std::memset(&how, 0, sizeof how);
  how.flags = static_cast<std::uint64_t>(flags);
  how.mode = (flags & O_CREAT) != 0 ? mode : 0;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS | RESOLVE_NO_XDEV;
  return static_cast<int>(::syscall(SYS_openat2, directory, path, &how, sizeof how));
}

// For kernels (and sandboxes) without openat2: every directory on the way is opened by itself.
int openByWalking(int root, std::string_view relative, int flags, mode_t mode, UniqueFd* out) {
  UniqueFd held;
  int directory = root;
  struct stat rootStatus;
  if (::fstat(root, &rootStatus) != 0) return errno;
  while (true) {
    const std::size_t slash = relative.find('/');
    const std::string component(relative.substr(0, slash));
    const bool last = slash == std::string_view::npos;
    const int how = last ? flags : O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    UniqueFd next(::openat(directory, component.c_str(), how, mode));
    if (!next) return errno;
    struct stat status;
    if (::fstat(next.get(), &status) != 0) return errno;
    if (status.st_dev != rootStatus.st_dev) return EXDEV;
    if (last) {
      *out = std::move(next);
      return 0;
    }
    held = std::move(next);
    directory = held.get();
    relative.remove_prefix(slash + 1);
  }
}

int writeAll(int fd, std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(fd, bytes.data(), bytes.size());
    if (count < 0) {
      if (errno == EINTR) continue;
      return errno;
    }
    bytes = bytes.subspan(static_cast<std::size_t>(count));
  }
  return 0;
}

int readSome(int fd, std::span<std::uint8_t> out, std::size_t* count) {
  ssize_t got = 0;
  do {
    got = ::read(fd, out.data(), out.size());
  } while (got < 0 && errno == EINTR);
  if (got < 0) return errno;
  *count = static_cast<std::size_t>(got);
  return 0;
}

int readAll(int fd, std::vector<std::uint8_t>* out) {
  struct stat status;
  if (::fstat(fd, &status) != 0) return errno;
  if (S_ISDIR(status.st_mode)) return EISDIR;
  if (!S_ISREG(status.st_mode)) return EINVAL;
  const auto size = static_cast<std::size_t>(status.st_size);
  out->reserve(size);
  std::size_t done = 0;
  for (std::size_t count = 1; done < size && count > 0; done += count) {
    // The vector clears what it grows by, which costs little while that is in the cache.
    out->resize(std::min(size, done + kPieceBytes));
    if (const int failed = readSome(fd, std::span(*out).subspan(done), &count); failed != 0) {
      return failed;
    }
  }
  out->resize(done);
  // It may be longer by now. Room for that in advance would have the whole buffer moved.
  std::array<std::uint8_t, 4096> more;
  for (std::size_t count = 1; count > 0;) {
    if (const int failed = readSome(fd, more, &count); failed != 0) return failed;
    out->insert(out->end(), more.begin(), more.begin() + static_cast<std::ptrdiff_t>(count));
  }
  return 0;
}

// Whether the file holds just these bytes. A file that cannot be read does not.
bool holds(int fd, std::span<const std::uint8_t> bytes) {
  std::vector<std::uint8_t> buffer(kPieceBytes);
  for (std::size_t count = 1; count > 0; bytes = bytes.subspan(count)) {
    if (readSome(fd, buffer, &count) != 0 || count > bytes.size() ||
        !std::equal(buffer.begin(), buffer.begin() + static_cast<std::ptrdiff_t>(count),
                    bytes.begin())) {
      return false;
    }
  }
  return bytes.empty();
}

}  // namespace

UniqueFd& UniqueFd::operator=(UniqueFd&& other) noexcept {
  if (this != &other) {
    reset();
    fd_ = std::exchange(other.fd_, -1);
  }
  return *this;
}

void UniqueFd::reset() {
  if (fd_ >= 0) ::close(fd_);
  fd_ = -1;
}

int UniqueFd::close() {
  if (fd_ < 0) return 0;
  return ::close(std::exchange(fd_, -1)) == 0 ? 0 : errno;
}

std::shared_ptr<DeviceRoot> DeviceRoot::open(const std::string& hostPath, bool create,
                                             ErrorPtr* error) {
  if (create && ::mkdir(hostPath.c_str(), kDirectoryMode) != 0 && errno != EEXIST) {
    setError(error, systemError("cannot make", hostPath, errno));
    return nullptr;
  }
  UniqueFd fd(::open(hostPath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!fd) {
    const int why = errno;
    if (why == ENOENT) {
      setError(error, deviceError(DeviceError::kMissing, hostPath + " does not exist"));
    } else if (why == ENOTDIR) {
      setError(error, deviceError(DeviceError::kNotOurs, hostPath + " is no directory"));
    } else {
      setError(error, systemError("cannot open", hostPath, why));
    }
    return nullptr;
  }
  struct stat status;
  if (::fstat(fd.get(), &status) != 0) {
    setError(error, systemError("cannot examine", hostPath, errno));
    return nullptr;
  }
  if (status.st_uid != ::geteuid()) {
    setError(error, deviceError(DeviceError::kNotOurs, hostPath + " belongs to another user"));
    return nullptr;
  }
  std::unique_ptr<char, decltype(&std::free)> real(::realpath(hostPath.c_str(), nullptr),
                                                   &std::free);
  if (!real) {
    setError(error, systemError("cannot resolve", hostPath, errno));
    return nullptr;
  }
  return std::shared_ptr<DeviceRoot>(new DeviceRoot(std::move(fd), real.get()));
}

std::shared_ptr<DeviceRoot> DeviceRoot::ofMissing(std::string hostPath) {
  return std::shared_ptr<DeviceRoot>(new DeviceRoot(UniqueFd(), std::move(hostPath)));
}

int DeviceRoot::checkPath(std::string_view path) {
  if (path.size() > kPathBytes) return ENAMETOOLONG;
  if (path.empty() || path.front() != '/') return EINVAL;
  if (path == "/") return 0;
  if (path.find('\0') != std::string_view::npos) return EINVAL;
  std::size_t depth = 0;
  path.remove_prefix(1);
  while (true) {
    const std::size_t slash = path.find('/');
    const std::string_view component = path.substr(0, slash);
    if (component.empty() || component == "." || component == "..") return EINVAL;
    if (component.size() > kComponentBytes || ++depth > kDepth) return ENAMETOOLONG;
    if (slash == std::string_view::npos) return 0;
    path.remove_prefix(slash + 1);
  }
}

int DeviceRoot::resolve(const std::string& path, int flags, mode_t mode, UniqueFd* out) const {
  if (const int bad = checkPath(path); bad != 0) return bad;
  if (!fd_) return ENOENT;
  flags |= O_CLOEXEC | O_NOFOLLOW;
  if (path == "/") {
    *out = UniqueFd(::openat(fd_.get(), ".", flags, mode));
    return *out ? 0 : errno;
  }
  const std::string relative = path.substr(1);
  if (!kernelLacksOpenat2.load(std::memory_order_relaxed)) {
    while (true) {
      *out = UniqueFd(openat2(fd_.get(), relative.c_str(), flags, mode));
      if (*out) return 0;
      if (errno == EAGAIN || errno == EINTR) continue;
      if (errno != ENOSYS && errno != EPERM) return errno;
      break;
    }
    if (errno == ENOSYS) kernelLacksOpenat2.store(true, std::memory_order_relaxed);
  }
  return openByWalking(fd_.get(), relative, flags, mode, out);
}

int DeviceRoot::openParent(const std::string& path, UniqueFd* parent, std::string* leaf) const {
  if (const int bad = checkPath(path); bad != 0) return bad;
  if (path == "/") return EINVAL;
  const std::size_t slash = path.rfind('/');
  *leaf = path.substr(slash + 1);
  const std::string directory = slash == 0 ? "/" : path.substr(0, slash);
  return resolve(directory, O_RDONLY | O_DIRECTORY, 0, parent);
}

int DeviceRoot::openFile(const std::string& path, int flags, UniqueFd* out) const {
  return resolve(path, flags, kFileMode, out);
}

int DeviceRoot::status(const std::string& path, struct stat* out) const {
  if (path == "/") {
    if (!fd_) return ENOENT;
    return ::fstat(fd_.get(), out) == 0 ? 0 : errno;
  }
  UniqueFd parent;
  std::string leaf;
  if (const int bad = openParent(path, &parent, &leaf); bad != 0) return bad;
  return ::fstatat(parent.get(), leaf.c_str(), out, AT_SYMLINK_NOFOLLOW) == 0 ? 0 : errno;
}

int DeviceRoot::readFile(const std::string& path, std::vector<std::uint8_t>* out) const {
  UniqueFd fd;
  if (const int bad = resolve(path, O_RDONLY | O_NONBLOCK, 0, &fd); bad != 0) return bad;
  return readAll(fd.get(), out);
}

bool DeviceRoot::fileHolds(const std::string& path, std::span<const std::uint8_t> bytes,
                           struct stat* status) const {
  struct stat present;
  const auto mayHold = [&] {
    return S_ISREG(present.st_mode) && static_cast<std::size_t>(present.st_size) == bytes.size();
  };
  UniqueFd fd;
  if (this->status(path, &present) != 0 || !mayHold()) return false;
  if (resolve(path, O_RDONLY | O_NONBLOCK, 0, &fd) != 0) return false;
  if (::fstat(fd.get(), &present) != 0 || !mayHold() || !holds(fd.get(), bytes)) return false;
  if (status != nullptr) *status = present;
  return true;
}

int DeviceRoot::makeDirectories(const std::string& path) const {
  if (const int bad = checkPath(path); bad != 0) return bad;
  for (std::size_t slash = path.find('/', 1); path != "/"; slash = path.find('/', slash + 1)) {
    UniqueFd parent;
    std::string leaf;
    if (const int bad = openParent(path.substr(0, slash), &parent, &leaf); bad != 0) return bad;
    if (::mkdirat(parent.get(), leaf.c_str(), kDirectoryMode) == 0) {
      if (::fsync(parent.get()) != 0) return errno;
    } else if (errno != EEXIST) {
      return errno;
    }
    if (slash == std::string::npos) break;
  }
  struct stat made;
  if (const int bad = status(path, &made); bad != 0) return bad;
  return S_ISDIR(made.st_mode) ? 0 : ENOTDIR;
}

void TemporaryFile::remove() {
  if (!name_.empty()) ::unlinkat(parent_.get(), name_.c_str(), 0);
  name_.clear();
}

int TemporaryFile::putInPlace() {
  if (name_.empty()) return ENOENT;
  if (::renameat(parent_.get(), name_.c_str(), parent_.get(), leaf_.c_str()) != 0) return errno;
  name_.clear();
  // The renaming has changed its status. Whatever else is there now is not what was written.
  struct stat renamed;
  const bool isSame = ::fstatat(parent_.get(), leaf_.c_str(), &renamed, AT_SYMLINK_NOFOLLOW) == 0 &&
                      renamed.st_ino == status_.st_ino && renamed.st_size == status_.st_size &&
                      renamed.st_mtim.tv_sec == status_.st_mtim.tv_sec &&
                      renamed.st_mtim.tv_nsec == status_.st_mtim.tv_nsec;
  if (isSame) status_ = renamed;
  return ::fsync(parent_.get()) == 0 ? 0 : errno;
}

int DeviceRoot::writeTemporary(const std::string& path, std::span<const std::uint8_t> bytes,
                               TemporaryFile* out) const {
  if (const int bad = openParent(path, &out->parent_, &out->leaf_); bad != 0) return bad;
  const std::string name = temporaryName();
  UniqueFd file(::openat(out->parent_.get(), name.c_str(),
                         O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC | O_NOFOLLOW, kFileMode));
  if (!file) return errno;
  out->name_ = name;
  int failed = writeAll(file.get(), bytes);
  if (failed == 0 && ::fsync(file.get()) != 0) failed = errno;
  if (failed == 0 && ::fstat(file.get(), &out->status_) != 0) failed = errno;
  if (const int closing = file.close(); failed == 0) failed = closing;
  if (failed != 0) out->remove();  // at once: where it failed there may be no room
  return failed;
}

int DeviceRoot::writeAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                                struct stat* status) const {
  if (fileHolds(path, bytes, status)) return 0;
  TemporaryFile file;
  int failed = writeTemporary(path, bytes, &file);
  if (failed == 0) failed = file.putInPlace();
  if (failed == 0 && status != nullptr) *status = file.status_;
  return failed;
}

int DeviceRoot::remove(const std::string& path) const {
  UniqueFd parent;
  std::string leaf;
  if (const int bad = openParent(path, &parent, &leaf); bad != 0) return bad;
  if (::unlinkat(parent.get(), leaf.c_str(), 0) == 0) return 0;
  if (errno != EISDIR && errno != EPERM) return errno;
  return ::unlinkat(parent.get(), leaf.c_str(), AT_REMOVEDIR) == 0 ? 0 : errno;
}

int DeviceRoot::renameNew(const std::string& from, const std::string& to) const {
  UniqueFd fromParent;
  UniqueFd toParent;
  std::string fromLeaf;
  std::string toLeaf;
  if (const int bad = openParent(from, &fromParent, &fromLeaf); bad != 0) return bad;
  if (const int bad = openParent(to, &toParent, &toLeaf); bad != 0) return bad;
  if (::renameat2(fromParent.get(), fromLeaf.c_str(), toParent.get(), toLeaf.c_str(),
                  RENAME_NOREPLACE) == 0) {
    return 0;
  }
  return errno;
}

int DeviceRoot::syncDirectory(const std::string& path) const {
  UniqueFd directory;
  if (const int bad = resolve(path, O_RDONLY | O_DIRECTORY, 0, &directory); bad != 0) return bad;
  return ::fsync(directory.get()) == 0 ? 0 : errno;
}

int DeviceRoot::list(const std::string& path, std::vector<std::string>* out) const {
  out->clear();
  UniqueFd directory;
  if (const int bad = resolve(path, O_RDONLY | O_DIRECTORY, 0, &directory); bad != 0) return bad;
  std::unique_ptr<DIR, int (*)(DIR*)> stream(::fdopendir(directory.get()), &::closedir);
  if (!stream) return errno;
  directory.release();  // the stream closes it
  errno = 0;
  while (const dirent* entry = ::readdir(stream.get())) {
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") out->emplace_back(name);
  }
  if (errno != 0) return errno;
  std::sort(out->begin(), out->end());
  return 0;
}

std::string DeviceRoot::temporaryName() {
  static std::atomic<std::uint64_t> counter{[] {
    std::random_device device;
    return (static_cast<std::uint64_t>(device()) << 32) ^ device();
  }()};
  char digits[kTemporaryDigits + 1];
  std::snprintf(digits, sizeof digits, "%016llx",
                static_cast<unsigned long long>(counter.fetch_add(0x9e3779b97f4a7c15ULL)));
  return std::string(kTemporaryPrefix) + digits;
}

bool DeviceRoot::isTemporaryName(std::string_view name) {
  if (!name.starts_with(kTemporaryPrefix)) return false;
  name.remove_prefix(kTemporaryPrefix.size());
  return name.size() == kTemporaryDigits && std::all_of(name.begin(), name.end(), [](char c) {
           return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
         });
}

}  // namespace kx
