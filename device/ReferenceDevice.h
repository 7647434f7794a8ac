#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "device/DeviceAdmin.h"
#include "device/DeviceRoot.h"
#include "device/LibraryDifference.h"
#include "device/MediaStore.h"
#include "platform/Platform.h"

namespace kx {

// What has failed on the device since the last reset: the proof that a sync was whole. Fetches,
// library transactions, save batches and imports note their failures here. Any thread.
class DeviceHealth {
 public:
  struct ImportFailure {
    std::string uuid;
    ErrorPtr error;
  };
  virtual ~DeviceHealth() = default;
  // Forgets everything; the daemon calls it before prepareForSync.
  virtual void reset() = 0;
  virtual void noteFailure(std::string what, ErrorPtr error) = 0;
  virtual void noteImportFailure(std::string uuid, ErrorPtr error) = 0;
  virtual bool anyFailure() const = 0;
  virtual std::vector<ImportFailure> importFailures() const = 0;
  // First failure that was no import's, null when there was none.
  virtual ErrorPtr firstFailure() const = 0;
};

// What the library's transactions have changed since the last reset, by UUID. Any thread.
struct LibraryChanges {
  std::set<std::string> importedAssets, deletedAssets, updatedAssets;
  std::set<std::string> createdContainers, deletedContainers, renamedContainers;
};

// The library's content as a value, for `dump` and `status` (docs/formats/dump.md).
struct DeviceDump {
  struct Pending {
    std::int32_t type = 1;
    std::uint32_t count = 0;
  };
  struct Container {
    std::string uuid;
    std::optional<std::string> title;
    std::int32_t kind = 0;
    Pending pending;
    std::vector<std::string> assets;  // in the album's order
  };
  struct Face {
    std::uint16_t identifier = 0;
    Rect relativeRect;
    std::optional<std::string> albumUUID;
  };
  struct Asset {
    std::string uuid;
    std::int32_t savedAssetType = 0;
    bool isVideo = false;
    std::optional<Date> creationDate, modificationDate;
    std::optional<double> sortToken;
    std::optional<Coordinate> location;
    std::optional<std::string> originalFileName;
    std::vector<Face> faces;  // by identifier
    std::string path;
    std::int64_t size = 0;
    bool incomplete = false;
    std::optional<std::string> sha256;
  };
  std::vector<Container> albums, events, faceAlbums;  // in list order
  std::vector<Asset> assets;                          // in row order
  Pending camera, syncProgress, otaRestoreProgress;
  std::optional<std::string> currentLibraryUUID;
  struct SyncAgent {
    std::optional<std::string> userAgent, libraryKind;
  };
  std::optional<SyncAgent> syncAgent;
  bool lastSynced = false;
};

struct DeviceOptions {
  std::string root;       // the directory that stands for the device's root
  bool create = false;    // make it, and the library, when missing
  bool readOnly = false;  // for status, dump and metrics: takes no lock, changes nothing
  // The device as it would be: a directory that is missing stands for an empty one, every change to
  // library and files is kept in memory and forgotten, imports take no file. Nobody can write
  // meanwhile.
  bool planOnly = false;
  LogSinks logs;
  Clock* clock = nullptr;             // null: the real one; must outlive the device
  MediaStoreDecorator decorateMedia;  // null: the media store as it is
  std::size_t filesPerFolder = 1000;  // of the synced-assets directory
  // Called when the device has been locked for writing, before its library is opened; an error ends
  // the opening. With it the device is looked through as after an unclean stop.
  std::function<ErrorPtr(const std::shared_ptr<DeviceRoot>&)> beforeLibrary;
};

// What the library has done since the last call.
struct DeviceCounters {
  std::uint64_t statements = 0;   // SQL statements run
  std::uint64_t rowsWritten = 0;  // rows inserted, updated or deleted
  std::uint64_t listSorts = 0;    // album lists that were reordered
};

// The reference device: a photo library on SQLite with its asset daemon quarryd and real files, all
// beneath one directory (its paths: DeviceLayout.h). Opening for writing takes the device's lock
// (an error names the holder's pid), recovers from an unclean stop and starts quarryd; destruction
// ends quarryd and closes. Threads: open and destroy on one thread; accessors from any.
class ReferenceDevice {
 public:
  // Null and an error. Domain "com.veltro.kxdevice"; see the codes below.
  static std::unique_ptr<ReferenceDevice> open(const DeviceOptions& options, ErrorPtr* error);
  virtual ~ReferenceDevice() = default;

  virtual Platform& platform() = 0;
  virtual DeviceHealth& health() = 0;
  virtual LibraryChanges takeChanges() = 0;  // since the last call
  virtual DeviceCounters takeCounters() = 0;
  virtual DeviceAdmin& admin() = 0;
  virtual DeviceRoot& root() = 0;
  // What the backup manager answers from now on: these files while a restore brings them back (no
  // sync is sealed meanwhile), an empty list for nothing, as in the beginning.
  virtual void setRestoreFiles(std::optional<std::vector<QBFile>> files) = 0;
  // Hints. A sync is about to look at every synced asset: they are read meanwhile. Until the hint
  // is taken back a library object may take over what one before it has read, whose objects live
  // on.
  virtual void readAhead() = 0;
  virtual void stopReadingAhead() = 0;
  // What sets the library apart from what the device really holds; of a device for planning alone.
  virtual LibraryDifference difference(const LibraryChanges& changes, ErrorPtr* error) = 0;
  // Waits until quarryd and the library's queue have nothing to do.
  virtual void drain() = 0;
  // One consistent reading; works in a read-only device too. `hash` adds SHA-256 of the files.
  virtual DeviceDump dump(bool hash, ErrorPtr* error) = 0;
};

inline constexpr const char* kDeviceErrorDomain = "com.veltro.kxdevice";
enum class DeviceError : std::int64_t {
  kMissing = 1,       // no such directory (and create is false)
  kNotOurs = 2,       // not a directory of ours: other owner, or no device where one is needed
  kLocked = 3,        // another process holds the device; userInfo "pid"
  kNewerSchema = 4,   // the library was written by a newer version
  kDamaged = 5,       // the database fails its check
  kNoSpace = 6,       // ENOSPC, EDQUOT or SQLITE_FULL
  kIo = 7,            // any other system error; userInfo "errno"
  kBadFile = 8,       // an import: missing, no regular file, wrong size
  kForeignAsset = 9,  // an import whose UUID is a device-made asset's
  kBadJob = 10,       // a save job that does not decode
};

}  // namespace kx
