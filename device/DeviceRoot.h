#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/Error.h"

namespace kx {

// A file descriptor that is closed when it goes.
class UniqueFd {
 public:
  UniqueFd() = default;
  explicit UniqueFd(int fd) : fd_(fd) {}
  UniqueFd(UniqueFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept;
  ~UniqueFd() { reset(); }
  int get() const { return fd_; }
  explicit operator bool() const { return fd_ >= 0; }
  void reset();
  // Gives the descriptor away unclosed.
  int release() { return std::exchange(fd_, -1); }
  // Closes and tells whether that went well: errno, or 0.
  [[nodiscard]] int close();

 private:
  int fd_ = -1;
};

// A file that is written and synced beside the place where it is to be; removed when it goes before
// it is put there. One thread at a time; it needs the root no longer.
class TemporaryFile {
 public:
  TemporaryFile() = default;
  TemporaryFile(const TemporaryFile&) = delete;
  TemporaryFile& operator=(const TemporaryFile&) = delete;
  ~TemporaryFile() { remove(); }
  // Renames it and syncs the directory: 0, or an errno. Once.
  [[nodiscard]] int putInPlace();

 private:
  friend class DeviceRoot;
  void remove();

  UniqueFd parent_;
  std::string name_;  // empty: there is none
  std::string leaf_;
  struct stat status_ = {};  // as it was written; once in place, as it was put there
};

// The directory that stands for the device's root, held open. Every device path is resolved beneath
// it, component by component or by the kernel, and no link is ever followed on the way, not even by
// the last component. Results of type int are 0 or an errno; paths are absolute device paths,
// anything else is EINVAL. New directories have mode 0700, new files 0600. Any thread.
class DeviceRoot {
 public:
  // Opens, or with `create` makes, the directory. Null and kMissing, kNotOurs or kIo.
  static std::shared_ptr<DeviceRoot> open(const std::string& hostPath, bool create,
                                          ErrorPtr* error);
  // Stands for a directory that is missing: nothing is there and nothing can be made (ENOENT).
  static std::shared_ptr<DeviceRoot> ofMissing(std::string hostPath);

  // Where it is on the host, without links.
  const std::string& hostPath() const { return hostPath_; }
  int fd() const { return fd_.get(); }

  // As open(2) with O_CLOEXEC and O_NOFOLLOW added.
  [[nodiscard]] int openFile(const std::string& path, int flags, UniqueFd* out) const;
  [[nodiscard]] int status(const std::string& path, struct stat* out) const;  // of a link itself
  [[nodiscard]] int readFile(const std::string& path, std::vector<std::uint8_t>* out) const;
  // Whether a regular file is there that can be read and holds just these bytes, and its status
  // before they were compared.
  bool fileHolds(const std::string& path, std::span<const std::uint8_t> bytes,
                 struct stat* status = nullptr) const;
  // Makes missing directories and syncs what they lie in.
  [[nodiscard]] int makeDirectories(const std::string& path) const;
  // The one way to replace a state file: temporary file in the same directory, fsync, rename, fsync
  // of the directory. The first two by themselves:
  [[nodiscard]] int writeTemporary(const std::string& path, std::span<const std::uint8_t> bytes,
                                   TemporaryFile* out) const;
  // All of them. Nothing is written when the file holds these bytes already. The status is that of
  // a file that held them.
  [[nodiscard]] int writeAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                                    struct stat* status = nullptr) const;
  // A file or an empty directory.
  [[nodiscard]] int remove(const std::string& path) const;
  // Fails with EEXIST when `to` is there.
  [[nodiscard]] int renameNew(const std::string& from, const std::string& to) const;
  [[nodiscard]] int syncDirectory(const std::string& path) const;
  // Names sorted by bytes, without "." and "..".
  [[nodiscard]] int list(const std::string& path, std::vector<std::string>* out) const;

  // A name that sweeps know as left over by an interrupted write.
  static std::string temporaryName();
  static bool isTemporaryName(std::string_view name);
  // 0, or why the text is no path that may be resolved: EINVAL, ENAMETOOLONG.
  [[nodiscard]] static int checkPath(std::string_view path);

 private:
  DeviceRoot(UniqueFd fd, std::string hostPath)
      : fd_(std::move(fd)), hostPath_(std::move(hostPath)) {}
  [[nodiscard]] int resolve(const std::string& path, int flags, mode_t mode, UniqueFd* out) const;
  [[nodiscard]] int openParent(const std::string& path, UniqueFd* parent, std::string* leaf) const;

  const UniqueFd fd_;
  const std::string hostPath_;
};

}  // namespace kx
