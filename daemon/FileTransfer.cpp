#include "daemon/FileTransfer.h"

#include <dirent.h>
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstring>

#include "platform/sync/FRAsset.h"

namespace kx {
namespace {

// Small enough to notice a cancellation in time on a slow disk.
constexpr std::size_t kChunkBytes = 4U << 20;

bool sameFileState(const struct stat& before, const struct stat& after) {
  return before.st_size == after.st_size && before.st_mtim.tv_sec == after.st_mtim.tv_sec &&
         before.st_mtim.tv_nsec == after.st_mtim.tv_nsec;
}

// How a copy ended: `code` 0, an errno or kFileChanged; `writing` says which side failed.
struct CopyEnd {
  int code = 0;
  bool writing = false;
  bool cancelled = false;
};

bool isUnsupported(int code) {
  return code == EXDEV || code == EINVAL || code == ENOSYS || code == EOPNOTSUPP || code == EPERM ||
         code == ENOTTY || code == EBADF || code == ETXTBSY;
}

CopyEnd writeAll(int to, const std::uint8_t* bytes, std::size_t length) {
  while (length > 0) {
    const ssize_t written = ::write(to, bytes, length);
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return {errno, true, false};
    bytes += written;
    length -= static_cast<std::size_t>(written);
  }
  return {};
}

// By read and write, from the present offsets on.
CopyEnd copyByHand(int from, int to, std::uint64_t left, const Staging::OnBytes& onBytes) {
  std::vector<std::uint8_t> buffer(std::min<std::uint64_t>(left, 1U << 20));
  while (left > 0) {
    const ssize_t got = ::read(from, buffer.data(), std::min<std::uint64_t>(left, buffer.size()));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return {errno, false, false};
    if (got == 0) return {kFileChanged, false, false};
    const auto length = static_cast<std::size_t>(got);
    if (const CopyEnd end = writeAll(to, buffer.data(), length); end.code != 0) return end;
    left -= length;
    if (!onBytes(length)) return {0, false, true};
  }
  return {};
}

CopyEnd copyBytes(int from, int to, std::uint64_t size, const Staging::OnBytes& onBytes) {
  if (size == 0) return {};
  if (::ioctl(to, FICLONE, from) == 0) {
    return onBytes(size) ? CopyEnd{} : CopyEnd{0, false, true};
  }
  std::uint64_t left = size;
  while (left > 0) {
    const ssize_t moved = ::copy_file_range(from, nullptr, to, nullptr,
                                            std::min<std::uint64_t>(left, kChunkBytes), 0);
    if (moved < 0 && errno == EINTR) continue;
    // Nothing moved on the first try is what some virtual file systems answer instead of an error.
    if ((moved < 0 && isUnsupported(errno)) || (moved == 0 && left == size)) {
      return copyByHand(from, to, left, onBytes);
    }
    // A failure may be of either side; one of the disk being full can only be of the writing side.
    if (moved < 0) return {errno, errno == ENOSPC || errno == EDQUOT, false};
    if (moved == 0) return {kFileChanged, false, false};
    left -= static_cast<std::uint64_t>(moved);
    if (!onBytes(static_cast<std::uint64_t>(moved))) return {0, false, true};
  }
  return {};
}

ErrorPtr transferError(int code, const std::string& reason) {
  return Error::make(kFRErrorDomain, code, reason);
}

ErrorPtr errorOf(const CopyEnd& end) {
  if (end.code == kFileChanged) {
    return transferError(kFRErrorReadOrWrite, "the file changed while it was read");
  }
  const char* text = std::strerror(end.code);
  if (end.writing && (end.code == ENOSPC || end.code == EDQUOT)) {
    return transferError(kFRErrorDiskFull, text);
  }
  return transferError(kFRErrorReadOrWrite,
                       std::string(end.writing ? "writing: " : "reading: ") + text);
}

ErrorPtr refusalOf(const struct stat& status) {
  if (!S_ISREG(status.st_mode)) {
    return transferError(kFRErrorReadOrWrite, "it is no regular file");
  }
  if (status.st_size > kMediaFileBytes) {
    return transferError(kFRErrorReadOrWrite,
                         "it is larger than " + std::to_string(kMediaFileBytes) + " bytes");
  }
  return nullptr;
}

}  // namespace

int readWhole(int file, std::vector<std::uint8_t>& bytes) {
  std::size_t done = 0;
  while (done < bytes.size()) {
    const ssize_t got =
        ::pread(file, bytes.data() + done, bytes.size() - done, static_cast<off_t>(done));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return errno;
    if (got == 0) return kFileChanged;
    done += static_cast<std::size_t>(got);
  }
  std::uint8_t more = 0;
  return ::pread(file, &more, 1, static_cast<off_t>(done)) == 0 ? 0 : kFileChanged;
}

FileDescriptor openDirectoryBeneath(int root, const std::string& path, bool create) {
  FileDescriptor here(::fcntl(root, F_DUPFD_CLOEXEC, 0));
  for (std::size_t begin = 0; here.valid() && begin < path.size();) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    const std::string name = path.substr(begin, end - begin);
    begin = end + 1;
    if (create && ::mkdirat(here.get(), name.c_str(), 0700) == 0) {
      // A new directory is as durable as its parent's list of entries.
      if (::fsync(here.get()) != 0) return {};
    }
    here = FileDescriptor(
        ::openat(here.get(), name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  }
  return here;
}

std::unique_ptr<Staging> Staging::open(const std::string& deviceRoot, ErrorPtr* error) {
  std::unique_ptr<Staging> staging(new Staging());
  FileDescriptor root(::open(deviceRoot.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (root.valid()) {
    staging->directory_ =
        openDirectoryBeneath(root.get(), std::string("var/mobile/Media/") + kStagingPath, true);
  }
  if (!staging->directory_.valid()) {
    const int code = errno;
    setError(error,
             Error::make(kPosixErrorDomain, code,
                         "cannot make the staging directory: " + std::string(std::strerror(code))));
    return nullptr;
  }
  return staging;
}

FileDescriptor Staging::create(std::string* name) {
  for (;;) {
    std::array<char, 24> text{};
    std::snprintf(text.data(), text.size(), "t%08" PRIu64, ++counter_);
    FileDescriptor file(::openat(directory_.get(), text.data(),
                                 O_CREAT | O_EXCL | O_WRONLY | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (file.valid() || errno != EEXIST) {
      *name = text.data();
      return file;
    }
  }
}

// A disk filled to the last byte with staged files could not take in one of them.
bool Staging::hasRoomFor(std::uint64_t bytes) const {
  struct statvfs status {};
  if (::fstatvfs(directory_.get(), &status) != 0) return true;  // the copy will tell
  return static_cast<std::uint64_t>(status.f_bavail) * status.f_frsize >= bytes + kWorkingBytes;
}

Staging::Result Staging::take(const FileDescriptor& source, const OnBytes& onBytes) {
  Result result;
  struct stat before {};
  if (::fstat(source.get(), &before) != 0) {
    result.error = errorOf({errno, false, false});
    return result;
  }
  result.error = refusalOf(before);
  if (!result.error && !hasRoomFor(static_cast<std::uint64_t>(before.st_size))) {
    result.error = errorOf({ENOSPC, true, false});
    result.ofDevice = true;
  }
  if (result.error) return result;

  std::string name;
  FileDescriptor target = create(&name);
  if (!target.valid()) {
    result.error = errorOf({errno, true, false});
    result.ofDevice = true;
    return result;
  }
  const auto size = static_cast<std::uint64_t>(before.st_size);
  CopyEnd end = copyBytes(source.get(), target.get(), size, onBytes);
  struct stat after {};
  struct stat written {};
  if (end.code == 0 && !end.cancelled) {
    if (::fstat(source.get(), &after) != 0) {
      end = {errno, false, false};
    } else if (::fstat(target.get(), &written) != 0) {
      end = {errno, true, false};
    } else if (!sameFileState(before, after) || written.st_size != before.st_size) {
      end = {kFileChanged, false, false};
    }
  }
  if (!target.reset() && end.code == 0) end = {errno, true, false};
  if (end.code == 0 && !end.cancelled) {
    result.path = std::string(kStagingPath) + "/" + name;
    result.bytes = size;
    return result;
  }
  ::unlinkat(directory_.get(), name.c_str(), 0);
  result.cancelled = end.cancelled;
  result.ofDevice = end.writing;
  if (!end.cancelled) result.error = errorOf(end);
  return result;
}

void Staging::drop(const std::string& path) {
  const std::string name = path.substr(path.rfind('/') + 1);
  ::unlinkat(directory_.get(), name.c_str(), 0);
}

void Staging::clear() {
  const int listed = ::openat(directory_.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  DIR* directory = listed < 0 ? nullptr : ::fdopendir(listed);
  if (directory == nullptr) {
    if (listed >= 0) ::close(listed);
    return;
  }
  std::vector<std::string> names;
  while (const dirent* entry = ::readdir(directory)) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
  ::closedir(directory);
  for (const std::string& name : names) {
    if (::unlinkat(directory_.get(), name.c_str(), 0) != 0) {
      ::unlinkat(directory_.get(), name.c_str(), AT_REMOVEDIR);
    }
  }
}

std::uint64_t freeBytesAt(const std::string& directory) {
  struct statvfs status {};
  std::string there = directory.empty() ? "." : directory;
  while (::statvfs(there.c_str(), &status) != 0) {
    if (errno != ENOENT || there == "." || there == "/") return 0;
    while (there.size() > 1 && there.back() == '/') there.pop_back();
    const std::size_t slash = there.rfind('/');
    there = slash == std::string::npos ? "." : there.substr(0, slash + 1);
  }
  return static_cast<std::uint64_t>(status.f_bavail) * status.f_frsize;
}

}  // namespace kx
