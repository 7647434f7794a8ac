#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/files/FileSystem.h"

namespace kx {

// A device file system that is a map. Directories exist as soon as something lies in them or they
// were made. Any thread; handlers of enumerate may call back.
class InMemoryFileSystem final : public FileSystem {
 public:
  bool fileExists(const std::string& path) override;
  DataPtr readFile(const std::string& path, ErrorPtr* error) override;
  bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                           ErrorPtr* error) override;
  bool removeItem(const std::string& path, ErrorPtr* error) override;
  bool createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) override;
  std::vector<std::string> contentsOfDirectory(const std::string& path, ErrorPtr* error) override;
  void enumerate(const std::string& path, const EntryHandler& onEntry,
                 const ErrorHandler& onError) override;
  std::string resourceIdentifier(const std::string& path) override;
  std::uint32_t blockSize(const std::string& path, ErrorPtr* error) override;
  LockAttempt tryLock(const std::string& path) override;

  // For tests.
  void putText(const std::string& path, std::string_view text);
  // A file of that many bytes that cannot be read; only its size counts.
  void putSize(const std::string& path, std::int64_t bytes);
  std::optional<std::string> text(const std::string& path);
  // Every file below the path, sorted.
  std::vector<std::string> files(const std::string& path = "/");
  void setBlockSize(std::uint32_t bytes);
  void setDirectorySize(std::int64_t bytes);
  // Another process holds a lock on that path.
  void setLockedElsewhere(const std::string& path, bool locked);
  // Number of files replaced with other bytes, and removed.
  std::size_t writes() const;

 private:
  struct File {
    DataPtr bytes;  // null: of `size` alone
    std::int64_t size = 0;
  };
  bool isDirectoryLocked(const std::string& path) const;
  std::vector<std::string> childrenLocked(const std::string& path) const;
  void enumerateBelow(const std::string& path, const EntryHandler& onEntry,
                      const ErrorHandler& onError);

  mutable std::mutex mutex_;
  std::map<std::string, File> files_;
  std::set<std::string> directories_ = {"/"};
  std::set<std::string> lockedElsewhere_;
  std::uint32_t blockSize_ = 4096;
  std::int64_t directorySize_ = 0;
  std::size_t writes_ = 0;
};

}  // namespace kx
