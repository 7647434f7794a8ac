#include "host/HostFiles.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <system_error>
#include <utility>

namespace kx {

namespace {

constexpr std::size_t kReadBytes = std::size_t{128} << 10;
constexpr int kSafeFlags = O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;

// A handle on a path alone is never waited for, and openat2 refuses to be told so.
int safe(int flags) {
  return (flags & O_PATH) != 0 ? flags | O_NOFOLLOW | O_CLOEXEC : flags | kSafeFlags;
}

int openAt(int folder, const std::string& name, int flags, FileHandle* file) {
  int fd = -1;
  do {
    fd = ::openat(folder, name.c_str(), flags);
  } while (fd < 0 && errno == EINTR);
  if (fd < 0) return errno;
  *file = FileHandle(fd);
  return 0;
}

// A socket cannot be opened at all.
int asRegularError(int error) { return error == ENXIO || error == EISDIR ? EINVAL : error; }

int takeRegular(FileHandle opened, FileHandle* file, struct stat* status) {
  if (::fstat(opened.get(), status) != 0) return errno;
  if (!S_ISREG(status->st_mode)) return EINVAL;
  *file = std::move(opened);
  return 0;
}

}  // namespace

FileHandle& FileHandle::operator=(FileHandle&& other) noexcept {
  std::swap(fd_, other.fd_);
  return *this;
}

FileHandle::~FileHandle() {
  // Nothing was written through handles that end here unclosed: the result says nothing.
  if (fd_ >= 0) ::close(fd_);
}

int openFolder(const std::string& path, FileHandle* folder) {
  return openAt(AT_FDCWD, path, O_RDONLY | O_DIRECTORY | O_CLOEXEC, folder);
}

int openBeneath(int folder, const std::string& relativePath, int flags, FileHandle* file) {
  struct open_how how = {};
  how.flags = static_cast<std::uint64_t>(static_cast<unsigned>(safe(flags)));
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  const std::string& path = relativePath.empty() ? std::string(".") : relativePath;
  long fd = -1;
  do {
    fd = ::syscall(SYS_openat2, folder, path.c_str(), &how, sizeof how);
    // EAGAIN: a rename elsewhere kept the kernel from proving that the path stays below.
  } while (fd < 0 && (errno == EINTR || errno == EAGAIN));
  if (fd >= 0) {
    *file = FileHandle(static_cast<int>(fd));
    return 0;
  }
  if (errno != ENOSYS && errno != EPERM) return errno;
  return openBeneathByComponents(folder, relativePath, flags, file);
}

int openBeneathByComponents(int folder, const std::string& relativePath, int flags,
                            FileHandle* file) {
  if (relativePath.empty()) return openAt(folder, ".", safe(flags), file);
  FileHandle held;
  int current = folder;
  std::size_t start = 0;
  while (true) {
    const std::size_t slash = relativePath.find('/', start);
    const std::string name = relativePath.substr(start, slash - start);
    if (!isOneComponent(name)) return EXDEV;
    if (slash == std::string::npos) return openAt(current, name, safe(flags), file);
    FileHandle next;
    const int error = openAt(current, name, safe(O_PATH | O_DIRECTORY), &next);
    if (error != 0) return error;
    held = std::move(next);
    current = held.get();
    start = slash + 1;
  }
}

int openRegularBeneath(int folder, const std::string& relativePath, FileHandle* file,
                       struct stat* status) {
  FileHandle opened;
  const int error = openBeneath(folder, relativePath, O_RDONLY, &opened);
  return error != 0 ? asRegularError(error) : takeRegular(std::move(opened), file, status);
}

int openRegularPath(const std::string& path, FileHandle* file, struct stat* status) {
  FileHandle opened;
  const int error = openAt(AT_FDCWD, path, O_RDONLY | kSafeFlags, &opened);
  return error != 0 ? asRegularError(error) : takeRegular(std::move(opened), file, status);
}

int forEachName(int folder, const std::function<void(std::string_view)>& visit) {
  FileHandle own;
  const int error = openAt(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC, &own);
  if (error != 0) return error;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(::fdopendir(own.get()), &::closedir);
  if (stream == nullptr) return errno;
  (void)own.release();  // the stream closes it
  while (true) {
    errno = 0;
    const dirent* entry = ::readdir(stream.get());
    if (entry == nullptr) break;
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") visit(name);
  }
  return errno;
}

int listNames(int folder, std::vector<std::string>* names) {
  names->clear();
  const int error =
      forEachName(folder, [names](std::string_view name) { names->emplace_back(name); });
  std::sort(names->begin(), names->end());
  return error;
}

int readWhole(int file, std::uint64_t limitBytes, std::vector<std::uint8_t>* bytes) {
  struct stat status = {};
  if (::fstat(file, &status) != 0) return errno;
  if (static_cast<std::uint64_t>(status.st_size) > limitBytes) return EFBIG;
  const auto size = static_cast<std::size_t>(status.st_size);
  bytes->clear();
  bytes->reserve(size);
  std::size_t done = 0;
  while (done < size) {
    // The vector clears what it grows by, which costs little while that is in the cache.
    bytes->resize(std::min(size, done + kReadBytes));
    const ssize_t got =
        ::pread(file, bytes->data() + done, bytes->size() - done, static_cast<off_t>(done));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return errno;
    if (got == 0) return EIO;
    done += static_cast<std::size_t>(got);
  }
  return 0;
}

int writeAll(int file, const void* bytes, std::size_t size) {
  const auto* next = static_cast<const std::uint8_t*>(bytes);
  while (size > 0) {
    const ssize_t written = ::write(file, next, size);
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return errno;
    next += written;
    size -= static_cast<std::size_t>(written);
  }
  return 0;
}

bool isOneComponent(std::string_view name) {
  return !name.empty() && name.size() <= 255 && name != "." && name != ".." &&
         name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

std::string systemErrorText(int error) { return std::generic_category().message(error); }

ErrorPtr posixError(int error, const std::string& what) {
  return Error::make(kPosixErrorDomain, error, what + ": " + systemErrorText(error));
}

}  // namespace kx
