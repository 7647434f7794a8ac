#include "backup/BackupReader.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>

#include "backup/BackupErrors.h"
#include "device/ReferenceDevice.h"
#include "device/Sha256.h"

namespace kx {
namespace {

std::string_view textOf(const std::vector<std::uint8_t>& bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

// A document of the backup: 0, or EFBIG or another errno.
int readDocument(const DeviceRoot& root, const std::string& path, std::vector<std::uint8_t>* out) {
  struct stat status;
  if (const int failed = root.status(path, &status); failed != 0) return failed;
  if (S_ISREG(status.st_mode) && status.st_size > backup_limits::kDocumentBytes) return EFBIG;
  return root.readFile(path, out);
}

}  // namespace

std::string incomingPath(const std::string& path) { return backup_names::kIncoming + path; }

std::shared_ptr<DeviceRoot> openBackupRoot(const std::string& hostPath, bool create,
                                           ErrorPtr* error) {
  ErrorPtr failure;
  std::shared_ptr<DeviceRoot> root = DeviceRoot::open(hostPath, create, &failure);
  if (root) return root;
  const auto code = static_cast<DeviceError>(failure->code());
  const BackupError own = code == DeviceError::kMissing   ? BackupError::kMissing
                          : code == DeviceError::kNotOurs ? BackupError::kNotOurs
                          : code == DeviceError::kNoSpace ? BackupError::kNoSpace
                                                          : BackupError::kIo;
  setError(error, backupError(own, failure->message()));
  return nullptr;
}

UniqueFd lockBackup(const DeviceRoot& root, int operation, ErrorPtr* error) {
  UniqueFd fd(::openat(root.fd(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  int failed = fd ? 0 : errno;
  while (failed == 0 && ::flock(fd.get(), operation | LOCK_NB) != 0) {
    if (errno != EINTR) failed = errno;
  }
  if (failed == 0) return fd;
  setError(error, failed == EWOULDBLOCK
                      ? backupError(BackupError::kInUse,
                                    "another process uses the backup " + root.hostPath())
                      : backupSystemError("cannot lock", root.hostPath(), failed));
  return {};
}

std::optional<BackupManifest> readBackupManifest(const DeviceRoot& root, const std::string& path,
                                                 ErrorPtr* error) {
  std::vector<std::uint8_t> bytes;
  const int failed = readDocument(root, path, &bytes);
  if (failed == ENOENT || failed == ENOTDIR) return std::nullopt;
  if (failed == EFBIG) {
    setError(error, backupError(BackupError::kUnusable,
                                "manifest.json cannot be used: it is too "
                                "large"));
    return std::nullopt;
  }
  if (failed != 0) {
    setError(error, backupSystemError("cannot read", root.hostPath() + path, failed));
    return std::nullopt;
  }
  return parseManifest(textOf(bytes), error);
}

std::unique_ptr<BackupReader> BackupReader::open(const std::string& hostPath, ErrorPtr* error) {
  std::shared_ptr<DeviceRoot> root = openBackupRoot(hostPath, false, error);
  if (!root) return nullptr;
  UniqueFd lock = lockBackup(*root, LOCK_SH, error);
  if (!lock) return nullptr;
  std::unique_ptr<BackupReader> reader(new BackupReader(std::move(root), std::move(lock)));
  if (ErrorPtr failed = reader->readManifest()) {
    setError(error, std::move(failed));
    return nullptr;
  }
  return reader;
}

ErrorPtr BackupReader::readManifest() {
  ErrorPtr error;
  if (auto found = readBackupManifest(*root_, incomingPath(backup_names::kManifest), &error)) {
    manifest_ = std::move(*found);
    isCommittedJournal_ = true;
    return nullptr;
  }
  // A damaged journal is none: what is left of the backup before it is checked file by file.
  if (error && error->code() != static_cast<std::int64_t>(BackupError::kUnusable)) return error;
  error = nullptr;
  if (auto found = readBackupManifest(*root_, backup_names::kManifest, &error)) {
    manifest_ = std::move(*found);
    return nullptr;
  }
  if (error) return error;
  return backupError(BackupError::kMissing, root_->hostPath() + " holds no whole backup");
}

int BackupReader::openInside(const std::string& path, UniqueFd* out) const {
  int failed = ENOENT;
  if (isCommittedJournal_) {
    failed = root_->openFile(incomingPath(path), O_RDONLY | O_NONBLOCK, out);
  }
  if (failed == ENOENT || failed == ENOTDIR) {
    failed = root_->openFile(path, O_RDONLY | O_NONBLOCK, out);
  }
  if (failed != 0) return failed;
  struct stat status;
  if (::fstat(out->get(), &status) != 0) return errno;
  if (S_ISREG(status.st_mode)) return 0;
  out->reset();
  return EINVAL;
}

int BackupReader::openFile(const std::string& devicePath, UniqueFd* out) const {
  if (manifest_.find(devicePath) == nullptr) return ENOENT;
  return openInside(backupPathOf(devicePath), out);
}

int BackupReader::openLibrary(UniqueFd* out) const {
  if (!manifest_.library) return ENOENT;
  return openInside(backup_names::kLibrary, out);
}

std::optional<std::vector<BackupAlbum>> BackupReader::albums(ErrorPtr* error) const {
  std::vector<std::uint8_t> bytes;
  int failed = ENOENT;
  if (isCommittedJournal_) {
    failed = readDocument(*root_, incomingPath(backup_names::kAlbums), &bytes);
  }
  if (failed == ENOENT) failed = readDocument(*root_, backup_names::kAlbums, &bytes);
  if (failed != 0) {
    setError(error, backupSystemError("cannot read", hostPath() + backup_names::kAlbums, failed));
    return std::nullopt;
  }
  Sha256 hash;
  hash.update(bytes);
  if (static_cast<std::int64_t>(bytes.size()) != manifest_.albums.size ||
      hash.hexDigest() != manifest_.albums.sha256) {
    setError(error, backupError(BackupError::kDamagedFile,
                                "albums.json is not what the manifest says: it is damaged"));
    return std::nullopt;
  }
  return parseAlbums(textOf(bytes), error);
}

}  // namespace kx
