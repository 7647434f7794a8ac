#pragma once

#include <algorithm>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"

namespace kx {

// What an enumeration tells about one entry. A property that could not be read leaves `error` set.
struct FileProperties {
  std::string path;           // absolute device path
  std::string name;           // last component
  std::int64_t fileSize = 0;  // bytes; of the entry itself, links not followed
  bool isDirectory = false;
  std::string parentPath;
  std::string parentResourceIdentifier;
  ErrorPtr error;
};

enum class EnumerationChoice { kDescend, kSkipDescendants };

// An advisory lock that is held until this object goes away.
class FileLock {
 public:
  virtual ~FileLock() = default;
};

// The device's files, by absolute device path ("/var/mobile/Media/..."). An implementation resolves
// every path beneath its root and never follows a link out of it. Any thread. Errors have the
// domain "POSIX" and errno as code, unless said otherwise.
class FileSystem {
 public:
  virtual ~FileSystem() = default;

  virtual bool fileExists(const std::string& path) = 0;
  // Whole content; null and an error when it cannot be read.
  virtual DataPtr readFile(const std::string& path, ErrorPtr* error) = 0;
  // Whether the file can be read and holds exactly these bytes. An implementation may do with less
  // than the whole file in memory.
  virtual bool fileHolds(const std::string& path, std::span<const std::uint8_t> bytes) {
    const DataPtr held = readFile(path, nullptr);
    return held && std::ranges::equal(held->span(), bytes);
  }
  // Replaces the file whole: temporary file in the same directory, synced, renamed, directory
  // synced. A file that already holds exactly these bytes is left as it is.
  virtual bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                                   ErrorPtr* error) = 0;
  // The same with a data object. An implementation may answer reads with it as long as the file is
  // as it was written.
  virtual bool writeDataAtomically(const std::string& path, const DataPtr& bytes, ErrorPtr* error) {
    return writeFileAtomically(path, bytes->span(), error);
  }

  // Bytes that are about to become a file. Without putInPlace nothing of them stays. One thread at
  // a time; the file system outlives it.
  class PreparedFile {
   public:
    virtual ~PreparedFile() = default;
    // As writeFileAtomically. Once.
    virtual bool putInPlace(ErrorPtr* error) = 0;
  };
  // Does what can be done of writeDataAtomically before the file is to change. What fails is left
  // to putInPlace.
  virtual std::unique_ptr<PreparedFile> prepareFile(const std::string& path, DataPtr bytes) {
    return std::make_unique<UnpreparedFile>(*this, path, std::move(bytes));
  }
  // Removes a file or an empty directory; a missing one is an error (ENOENT).
  virtual bool removeItem(const std::string& path, ErrorPtr* error) = 0;
  virtual bool createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) = 0;
  // Names of the entries, sorted by bytes; empty and an error on failure.
  virtual std::vector<std::string> contentsOfDirectory(const std::string& path,
                                                       ErrorPtr* error) = 0;

  using EntryHandler = std::function<EnumerationChoice(const FileProperties&)>;
  // Called for a directory that cannot be listed; the walk goes on.
  using ErrorHandler = std::function<void(const std::string& path, const ErrorPtr&)>;
  // Walks the tree below `path` (without `path` itself), parents before children, links not
  // followed.
  virtual void enumerate(const std::string& path, const EntryHandler& onEntry,
                         const ErrorHandler& onError) = 0;
  // A text that is the same exactly for paths of one and the same file or directory; empty when it
  // cannot be read.
  virtual std::string resourceIdentifier(const std::string& path) = 0;

  // Fundamental block size (statfs) of the file system that holds the path, in bytes; 0 and an
  // error on failure.
  virtual std::uint32_t blockSize(const std::string& path, ErrorPtr* error) = 0;

  enum class LockOutcome { kNoFile, kHeldElsewhere, kTaken };
  struct LockAttempt {
    LockOutcome outcome = LockOutcome::kNoFile;
    std::unique_ptr<FileLock> lock;  // set when kTaken
  };
  // Opens the file read-only and tries to take an exclusive lock on it without waiting.
  virtual LockAttempt tryLock(const std::string& path) = 0;

 protected:
  // Leaves everything to putInPlace.
  class UnpreparedFile : public PreparedFile {
   public:
    UnpreparedFile(FileSystem& files, std::string path, DataPtr bytes)
        : files_(files), path_(std::move(path)), bytes_(std::move(bytes)) {}
    bool putInPlace(ErrorPtr* error) override {
      return files_.writeDataAtomically(path_, bytes_, error);
    }

   private:
    FileSystem& files_;
    const std::string path_;
    const DataPtr bytes_;
  };
};

}  // namespace kx
