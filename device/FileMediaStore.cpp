#include "device/FileMediaStore.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <set>

#include "device/ContentType.h"
#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"

namespace kx {
namespace {

// From this many files on, one syncfs costs less than an fsync of each.
constexpr std::size_t kSyncWholeFrom = 20;
constexpr std::size_t kCopyBytes = std::size_t{1} << 20;

std::string directoryOf(const std::string& path) { return path.substr(0, path.rfind('/')); }

int copyContents(int from, int to) {
  std::vector<std::uint8_t> buffer;
  bool inKernel = true;
  while (true) {
    ssize_t count = 0;
    if (inKernel) {
      count = ::copy_file_range(from, nullptr, to, nullptr, kCopyBytes * 64, 0);
      if (count < 0 && errno == EINTR) continue;
      if (count < 0 &&
          (errno == EXDEV || errno == EINVAL || errno == ENOSYS || errno == EOPNOTSUPP)) {
        inKernel = false;
        continue;
      }
    } else {
      buffer.resize(kCopyBytes);
      count = ::read(from, buffer.data(), buffer.size());
      if (count < 0 && errno == EINTR) continue;
      for (ssize_t done = 0; done < count;) {
        const ssize_t written =
            ::write(to, buffer.data() + done, static_cast<std::size_t>(count - done));
        if (written < 0 && errno != EINTR) return errno;
        if (written > 0) done += written;
      }
    }
    if (count < 0) return errno;
    if (count == 0) return 0;
  }
}

}  // namespace

std::optional<MediaStore::Arrived> FileMediaStore::inspect(const std::string& path,
                                                           ErrorPtr* error) {
  const auto bad = [&](const char* what) {
    setError(error, deviceError(DeviceError::kBadFile, path + ": " + what));
    return std::nullopt;
  };
  UniqueFd fd;
  if (const int failed = root_->openFile(path, O_RDONLY | O_NONBLOCK, &fd); failed != 0) {
    if (failed == EIO || failed == EMFILE || failed == ENFILE || failed == ENOMEM) {
      setError(error, systemError("cannot open", path, failed));
      return std::nullopt;
    }
    return bad(failed == ENOENT ? "the file is missing" : "the file cannot be opened");
  }
  struct stat status;
  if (::fstat(fd.get(), &status) != 0) return bad("the file cannot be examined");
  if (!S_ISREG(status.st_mode)) return bad("no regular file");
  if (status.st_nlink != 1) return bad("the file has other names");
  if (status.st_size <= 0) return bad("the file is empty");
  std::array<std::uint8_t, kContentTypeBytes> first;
  const ssize_t count = ::pread(fd.get(), first.data(), first.size(), 0);
  if (count < 0) return bad("the file cannot be read");
  if (::fchmod(fd.get(), 0600) != 0) return bad("the file's mode cannot be set");
  Arrived arrived;
  arrived.size = status.st_size;
  arrived.extension = extensionForContent({first.data(), static_cast<std::size_t>(count)});
  return arrived;
}

bool FileMediaStore::copy(const std::string& from, const std::string& to, ErrorPtr* error) {
  UniqueFd source;
  UniqueFd target;
  const std::string temporary = directoryOf(to) + "/" + DeviceRoot::temporaryName();
  int failed = root_->openFile(from, O_RDONLY | O_NONBLOCK, &source);
  if (failed == 0) failed = root_->openFile(temporary, O_WRONLY | O_CREAT | O_EXCL, &target);
  if (failed != 0) {
    setError(error, systemError("cannot copy", from, failed));
    return false;
  }
  failed = copyContents(source.get(), target.get());
  if (failed == 0 && ::fsync(target.get()) != 0) failed = errno;
  if (const int closing = target.close(); failed == 0) failed = closing;
  if (failed == 0) failed = root_->renameNew(temporary, to);
  if (failed != 0) {
    static_cast<void>(root_->remove(temporary));  // the failure to tell of is the first one
    setError(error, systemError("cannot copy", from, failed));
    return false;
  }
  return remove(from, error);
}

bool FileMediaStore::place(const std::string& from, const std::string& to, ErrorPtr* error) {
  int failed = root_->renameNew(from, to);
  if (failed == EXDEV) return copy(from, to, error);
  if (failed == ENOENT) {
    failed = root_->makeDirectories(directoryOf(to));
    if (failed == 0) failed = root_->renameNew(from, to);
    if (failed == EXDEV) return copy(from, to, error);
  }
  if (failed == 0) return true;
  setError(error, systemError("cannot move to", to, failed));
  return false;
}

int FileMediaStore::syncContents(const std::vector<std::string>& paths) {
  if (paths.size() >= kSyncWholeFrom) {
    UniqueFd directory;
    if (const int failed = root_->openFile(directoryOf(paths.front()), O_RDONLY, &directory);
        failed != 0) {
      return failed;
    }
    return ::syncfs(directory.get()) == 0 ? 0 : errno;
  }
  for (const std::string& path : paths) {
    UniqueFd file;
    if (const int failed = root_->openFile(path, O_RDONLY | O_NONBLOCK, &file); failed != 0) {
      return failed;
    }
    if (::fsync(file.get()) != 0) return errno;
  }
  return 0;
}

bool FileMediaStore::makeDurable(const std::vector<std::string>& paths, ErrorPtr* error) {
  if (paths.empty()) return true;
  int failed = syncContents(paths);
  std::set<std::string> directories;
  for (const std::string& path : paths) directories.insert(directoryOf(path));
  for (const std::string& directory : directories) {
    if (failed == 0) failed = root_->syncDirectory(directory);
  }
  if (failed == 0) return true;
  setError(error, systemError("cannot sync", directoryOf(paths.front()), failed));
  return false;
}

bool FileMediaStore::remove(const std::string& path, ErrorPtr* error) {
  const int failed = root_->remove(path);
  if (failed == 0 || failed == ENOENT) return true;
  setError(error, systemError("cannot remove", path, failed));
  return false;
}

}  // namespace kx
