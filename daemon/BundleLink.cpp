#include "daemon/BundleLink.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <vector>

#include "daemon/FileTransfer.h"
#include "daemon/SyncRunner.h"
#include "platform/foundation/Limits.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr const char* kSnapshotName = "PhotoLibrary.plist";

ErrorPtr hostError(const std::string& message) {
  return Error::make(kSyncErrorDomain, static_cast<std::int64_t>(SyncErrorCode::kHostUnreadable),
                     escapeControlCharacters(message));
}

}  // namespace

std::unique_ptr<BundleLink> BundleLink::open(const std::string& directory, ErrorPtr* error) {
  std::unique_ptr<BundleLink> link(new BundleLink());
  link->directory_ = directory;
  // The directory itself may be reached through a link; nothing inside it may be one.
  link->root_ = FileDescriptor(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!link->root_.valid()) {
    setError(error,
             hostError("cannot open the host bundle " + directory + ": " + std::strerror(errno)));
    return nullptr;
  }
  struct stat status {};
  if (::fstatat(link->root_.get(), kSnapshotName, &status, AT_SYMLINK_NOFOLLOW) != 0 ||
      !S_ISREG(status.st_mode)) {
    setError(error, hostError(directory + " is no host bundle: it has no file " + kSnapshotName));
    return nullptr;
  }
  return link;
}

DataPtr BundleLink::snapshot(ErrorPtr* error) {
  const std::string name = directory_ + "/" + kSnapshotName;
  FileDescriptor file(
      ::openat(root_.get(), kSnapshotName, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  struct stat status {};
  if (!file.valid() || ::fstat(file.get(), &status) != 0) {
    setError(error, hostError("cannot read " + name + ": " + std::strerror(errno)));
    return nullptr;
  }
  if (!S_ISREG(status.st_mode)) {
    setError(error, hostError(name + " is no regular file"));
    return nullptr;
  }
  const auto size = static_cast<std::uint64_t>(status.st_size);
  if (size > limits::kSnapshotFileBytes) {
    setError(error, hostError(name + " is larger than " +
                              std::to_string(limits::kSnapshotFileBytes) + " bytes"));
    return nullptr;
  }
  std::vector<std::uint8_t> bytes(size);
  if (const int code = readWhole(file.get(), bytes)) {
    setError(error,
             hostError("cannot read " + name + ": " +
                       (code == kFileChanged ? "it changed meanwhile" : std::strerror(code))));
    return nullptr;
  }
  return std::make_shared<const Data>(std::move(bytes));
}

void BundleLink::readNames() {
  namesRead_ = true;
  media_ = FileDescriptor(
      ::openat(root_.get(), "media", O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!media_.valid()) return;
  const int listed = ::dup(media_.get());
  DIR* directory = listed < 0 ? nullptr : ::fdopendir(listed);
  if (directory == nullptr) {
    if (listed >= 0) ::close(listed);
    return;
  }
  while (const dirent* entry = ::readdir(directory)) {
    const std::string name = entry->d_name;
    if (name == "." || name == "..") continue;
    byName_.emplace(name, name);
    const std::string stem(pathByDeletingExtension(name));
    const auto [place, added] = byStem_.emplace(stem, name);
    if (!added && name < place->second) place->second = name;
  }
  ::closedir(directory);
}

const std::string* BundleLink::nameOf(std::string_view identifier) {
  if (!namesRead_) readNames();
  if (const auto exact = byName_.find(identifier); exact != byName_.end()) return &exact->second;
  const auto stem = byStem_.find(identifier);
  return stem == byStem_.end() ? nullptr : &stem->second;
}

std::optional<std::int64_t> BundleLink::mediaSize(std::string_view identifier) {
  const std::string* name = nameOf(identifier);
  struct stat status {};
  if (name == nullptr ||
      ::fstatat(media_.get(), name->c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
      !S_ISREG(status.st_mode)) {
    return std::nullopt;
  }
  return status.st_size;
}

FileDescriptor BundleLink::openMedia(std::string_view identifier, ErrorPtr* error) {
  const std::string* name = nameOf(identifier);
  if (name == nullptr) {
    setError(error, Error::make(kPosixErrorDomain, ENOENT, "the host does not have the file"));
    return {};
  }
  FileDescriptor file(
      ::openat(media_.get(), name->c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  if (!file.valid()) setError(error, Error::make(kPosixErrorDomain, errno, std::strerror(errno)));
  return file;
}

}  // namespace kx
