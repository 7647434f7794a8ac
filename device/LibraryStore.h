#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/AssetOrder.h"
#include "device/DeviceLog.h"
#include "device/HealthRecord.h"
#include "device/LibraryRows.h"
#include "device/LibraryWriter.h"
#include "device/ReferenceDevice.h"
#include "device/Sqlite.h"
#include "platform/dispatch/Dispatch.h"

namespace kx {

class LibraryContext;

// The library's tables behind one writing connection and one serial queue, and the contexts that
// look at them. Everything but queue, takeChanges and takeCounters is used on that queue alone.
class LibraryStore {
 public:
  struct Parts {
    std::unique_ptr<SqliteDatabase> database;
    FileSystem* files = nullptr;     // outlives the store
    HealthRecord* health = nullptr;  // outlives the store
    const DeviceLog* log = nullptr;  // outlives the store
    bool readOnly = false;
    // A transaction is open that is never committed: each write is a savepoint in it.
    bool planOnly = false;
  };
  explicit LibraryStore(Parts parts);
  ~LibraryStore();

  DispatchQueue& queue() { return *queue_; }
  SqliteDatabase& database() { return *parts_.database; }
  AssetOrder& assetOrder() { return order_; }
  HealthRecord& health() { return *parts_.health; }
  const DeviceLog& log() { return *parts_.log; }

  // What is read until endReading, or the next write, takes the database's lock once. Both only
  // tune: a failure shows at the next statement.
  void beginReading();
  void endReading();

  // Another connection, for reading on another thread what this one sees until endReading. Null
  // when that cannot be: nothing is being read, a plan has changed something, there is no file, or
  // it cannot be opened.
  std::unique_ptr<SqliteDatabase> openBeside();

  using Work = std::function<void(LibraryWriter&)>;
  // One write transaction: all of the work or, with an error, nothing of it. A failure is noted in
  // the device's health. After the commit every open context but `origin` has been refreshed.
  ErrorPtr write(const Work& work, const LibraryContext* origin = nullptr);
  // Called, on the queue, after a commit that left files without a row.
  void setFileReleaser(std::function<void(std::vector<std::string>)> releaser) {
    releaser_ = std::move(releaser);
  }

  // Another number as soon as another program has changed the database.
  std::int64_t dataVersion();
  // As LibraryContext, of the first context that can.
  bool showRowsReadAhead(const std::function<bool(const AssetRow&)>& visit);

  // Called, on the queue, after every commit.
  void setOnCommit(std::function<void()> onCommit) { onCommit_ = std::move(onCommit); }

  RowId newAlbumId() { return ++lastAlbum_; }
  RowId newFaceId() { return ++lastFace_; }
  ObjectID objectID(const char* entity, RowId pk) const;
  // The row of an album's URI of this library; null for any other text.
  std::optional<RowId> albumOfURI(std::string_view uri) const;

  void open(LibraryContext* context) { contexts_.push_back(context); }
  void close(LibraryContext* context) { std::erase(contexts_, context); }
  // For list reorderings.
  void countListSort() { ++listSorts_; }

  LibraryChanges takeChanges();
  DeviceCounters takeCounters();

 private:
  std::optional<LibraryWriter::AssetAtHand> savedAtHand(RowId asset,
                                                        const RowChanges& changed) const;
  void published(LibraryWriter& writer, const LibraryContext* origin);
  void onQueue(const Block& block);

  Parts parts_;
  AssetOrder order_;
  KnownAlbumPositions positions_;
  std::string storeUUID_;
  RowId lastAlbum_ = 0;
  RowId lastFace_ = 0;
  ErrorPtr broken_;  // what made the connection unfit for writing
  std::vector<LibraryContext*> contexts_;
  std::function<void(std::vector<std::string>)> releaser_;
  std::function<void()> onCommit_;
  std::uint64_t listSorts_ = 0;
  bool isReading_ = false;
  DeviceCounters counted_;
  std::mutex changesMutex_;
  LibraryChanges changes_;
  DispatchQueuePtr queue_;  // last: its blocks use the rest
};

}  // namespace kx
