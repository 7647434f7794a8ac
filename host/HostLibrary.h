#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"

namespace kx {

// The domain and closed table of codes of errors that concern a host library as a whole. Errors of
// one media file have the domain "POSIX" and errno as code.
inline constexpr const char* kHostErrorDomain = "com.veltro.kxsync.host";

enum class HostError : std::int64_t {
  kUsage = 1,       // an option that makes no sense (library identifier, time zone, target folder)
  kMissing = 2,     // there is no such folder
  kEmpty = 3,       // no photo or video below the folder
  kUnreadable = 4,  // the folder, or one below it, or the snapshot could not be read to the end
  kChanged = 5,     // the folder kept changing while it was read
  kLimit = 6,       // more files, or deeper folders, than HostLimits.h allows
  kCancelled = 7,   // the progress callback said so
  kNotABundle = 8,  // the target exists and is no host bundle
  kWrite = 9,       // a bundle could not be written (the user information's "errno" says why)
};

// Owns one open file descriptor.
class FileHandle {
 public:
  FileHandle() = default;
  explicit FileHandle(int fd) : fd_(fd) {}
  FileHandle(FileHandle&& other) noexcept : fd_(other.release()) {}
  FileHandle& operator=(FileHandle&& other) noexcept;
  ~FileHandle();

  int get() const { return fd_; }
  explicit operator bool() const { return fd_ >= 0; }
  int release() {
    const int fd = fd_;
    fd_ = -1;
    return fd;
  }

 private:
  int fd_ = -1;
};

// A media file of the host, opened read-only and found to be a regular file. Its content may still
// change under the reader: whoever copies it checks the size that arrived against sizeBytes.
struct HostMedia {
  FileHandle file;
  std::int64_t sizeBytes = 0;
  std::int64_t modifiedSeconds = 0;  // since 1970-01-01 UTC
  std::int32_t modifiedNanoseconds = 0;
  std::string path;  // below the host folder, for messages; may hold any byte but NUL
};

// Something that was passed over or read without its metadata. `path` is below the host folder and
// may hold any byte but NUL: escape it before it reaches a terminal.
struct HostProblem {
  std::string path;
  std::string text;
};

struct HostProgress {
  enum class Phase { kListing, kReading, kCopying };
  Phase phase = Phase::kListing;
  std::uint64_t filesDone = 0;
  std::uint64_t filesTotal = 0;  // 0 while it is not known
  std::uint64_t bytesDone = 0;   // while copying
};

// Called now and then from the thread that opened or writes the library; false cancels.
using HostProgressCallback = std::function<bool(const HostProgress&)>;

struct HostOptions {
  std::string libraryID;          // UUID text; "" derives it from the canonical folder path
  int timezoneOffsetMinutes = 0;  // of capture times that state no offset; +60 is one hour east
  unsigned threads = 2;           // that read metadata; 0 counts as 1
  std::string userAgent;          // "kxsync/VERSION", the snapshot's "TesselUserAgent"
  HostProgressCallback progress;  // may be empty
  // The folder's snapshot that a device got last, null for none. Asked for when files cannot be
  // read: they stay as they were then. May be empty.
  std::function<DataPtr()> previousSnapshot;
};

// A host library: a folder of photos and videos, read as a library of kind "Folder", or a host
// bundle (PhotoLibrary.plist and media/). Its snapshot is fixed once it is open; the media files
// are opened when asked for, below a directory that is held open, and no link is ever followed.
// Threads: any, once open. Lifetime: handed-out media outlive it.
class HostLibrary {
 public:
  virtual ~HostLibrary() = default;

  enum class Form { kFolder, kBundle };
  virtual Form form() const = 0;
  // The canonical path of the folder or bundle.
  virtual const std::string& path() const = 0;
  // As the snapshot states them; "" when it does not, or (a bundle) can not be read.
  virtual std::string libraryUUID() const = 0;
  virtual std::string libraryKind() const = 0;

  // The snapshot: a property list. A folder's has the same bytes whenever the folder is unchanged.
  // A bundle's is the file as it stands, unchecked.
  virtual DataPtr snapshotBytes() const = 0;
  // The same, which the library keeps no longer: snapshotBytes is null from then on, and a bundle
  // knows neither UUID nor kind.
  virtual DataPtr takeSnapshotBytes() = 0;

  // A hint: media files are going to be asked for. Returns at once; what it begins has ended when
  // the library goes, and a failure shows in the operations that need it.
  virtual void expectMedia() const {}

  // The file of an asset. Null and an error: ENOENT when the host has no file for it, ELOOP for a
  // link, EINVAL for what is no regular file, else what the system said.
  virtual std::optional<HostMedia> openMedia(std::string_view uuid, ErrorPtr* error) const = 0;
  // The size of that file now, in bytes; nothing when openMedia would fail to find it.
  virtual std::optional<std::int64_t> mediaSize(std::string_view uuid) const = 0;

  // Every media file: its asset's UUID and the name that it has in a bundle ("UUID.jpg"), sorted by
  // bytes.
  struct MediaName {
    std::string uuid;
    std::string bundleName;
  };
  virtual std::vector<MediaName> mediaNames() const = 0;

  // In the order of their paths.
  virtual const std::vector<HostProblem>& problems() const = 0;
};

// Opens a host: a bundle when the directory holds PhotoLibrary.plist and media/, else a folder,
// which is read whole. Null and an error (kHostErrorDomain) when that fails; a folder that is
// empty or could not be read to the end is an error, never an empty library.
std::unique_ptr<HostLibrary> openHostLibrary(const std::string& path, const HostOptions& options,
                                             ErrorPtr* error);

// Writes the library as a host bundle: built beside `bundlePath` and put in its place whole. An
// existing bundle or empty directory there is replaced, anything else refused. Files that vanished
// since the library was opened are left out and appended to `problems`, which may be null.
bool writeHostBundle(const HostLibrary& library, const std::string& bundlePath,
                     const HostOptions& options, std::vector<HostProblem>* problems,
                     ErrorPtr* error);

}  // namespace kx
