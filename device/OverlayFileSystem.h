#pragma once

#include <map>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/files/FileSystem.h"

namespace kx {

// Files as they would be after changes that are never made: what is written, made or removed is
// kept in memory, everything else is read from the files below. Those are never changed; they
// outlive this object and must not change meanwhile. Any thread; handlers of enumerate may call
// back.
class OverlayFileSystem final : public FileSystem {
 public:
  explicit OverlayFileSystem(FileSystem& below) : below_(below) {}

  bool fileExists(const std::string& path) override;
  DataPtr readFile(const std::string& path, ErrorPtr* error) override;
  bool fileHolds(const std::string& path, std::span<const std::uint8_t> bytes) override;
  bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                           ErrorPtr* error) override;
  bool writeDataAtomically(const std::string& path, const DataPtr& bytes, ErrorPtr* error) override;
  bool removeItem(const std::string& path, ErrorPtr* error) override;
  bool createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) override;
  std::vector<std::string> contentsOfDirectory(const std::string& path, ErrorPtr* error) override;
  void enumerate(const std::string& path, const EntryHandler& onEntry,
                 const ErrorHandler& onError) override;
  std::string resourceIdentifier(const std::string& path) override;
  std::uint32_t blockSize(const std::string& path, ErrorPtr* error) override;
  LockAttempt tryLock(const std::string& path) override;

 private:
  enum class Kind : std::uint8_t { kFile, kDirectory, kRemoved };
  struct Entry {
    Kind kind = Kind::kRemoved;
    DataPtr bytes;  // of a file
    std::string identifier;
  };
  using Entries = std::map<std::string, Entry>;
  class HeldLock;
  // Locks of files that only this overlay has; shared with the locks that are held.
  struct LockTable {
    std::mutex mutex;
    std::set<std::string> held;
  };

  // All under mutex_.
  const Entry* find(const std::string& path) const;
  // 0, or the errno with which a path ends at what was made or removed on its way.
  int blocked(const std::string& path) const;
  bool exists(const std::string& path) const;
  // 0 for a directory, else the errno that a real one's absence gives.
  int directoryError(const std::string& path) const;
  int list(const std::string& path, std::vector<std::string>* names) const;
  void put(const std::string& path, Kind kind, DataPtr bytes);
  // Bytes that are kept already are not kept twice.
  DataPtr keep(std::span<const std::uint8_t> bytes) const;
  bool write(const std::string& path, std::span<const std::uint8_t> bytes, DataPtr data,
             ErrorPtr* error);
  std::string identifierOf(const std::string& path) const;

  struct Level;
  bool openLevel(const std::string& path, Level* level, const ErrorHandler& onError) const;

  FileSystem& below_;
  mutable std::mutex mutex_;
  Entries entries_;
  std::uint64_t made_ = 0;
  const std::shared_ptr<LockTable> locks_ = std::make_shared<LockTable>();
};

}  // namespace kx
