#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "device/CameraRoll.h"
#include "device/DeviceRoot.h"
#include "device/LibraryStore.h"
#include "device/MediaFolders.h"
#include "device/MediaStore.h"
#include "device/RestoreMarker.h"
#include "platform/dispatch/Dispatch.h"
#include "platform/files/FileSystem.h"
#include "platform/library/KXAssetsSaver.h"

namespace kx {

class SnapshotAssets;

// The asset daemon: works the jobs it is handed one hand-over after the other on a thread of its
// own; its transactions run on the library's queue, its completions on a third. Public operations
// from any thread, they return at once.
class Quarryd {
 public:
  struct Parts {
    std::shared_ptr<DeviceRoot> root;
    std::shared_ptr<LibraryStore> store;
    std::unique_ptr<MediaStore> media;
    FileSystem* files = nullptr;  // for everything but media files; outlives quarryd
    std::size_t filesPerFolder = 1000;
  };
  explicit Quarryd(Parts parts);
  ~Quarryd();

  void save(std::vector<DataPtr> jobs, KXAssetsSaver::Completion completion);
  void updateRestoredAsset(std::optional<std::string> uuid, std::vector<std::string> paths);
  // Ends a restore that a marker tells of: completes what is there; with `recreateAlbums` it also
  // takes in the camera's files that the library does not know, and the albums of the backup.
  void finalizeRestore(bool recreateAlbums);
  // A hint: the snapshot in place will have to be proved. What that takes of the snapshot is read
  // meanwhile, and the seal is written beside its place.
  void expectSeal();
  // While a restore runs no sync is sealed.
  void setRestoring(bool restoring) { restoring_ = restoring; }
  // Files below the synced-assets directory that no row names any more.
  void removeFiles(std::vector<std::string> paths);
  // Whether a file that had to go is still there.
  bool leftFilesBehind() const { return leftFilesBehind_; }
  // Waits until there is nothing to do.
  void drain();

 private:
  struct Import;
  struct HandOver;
  struct Expected;

  void work(HandOver& handOver, const std::vector<DataPtr>& jobs);
  void workJob(HandOver& handOver, const DataPtr& job);

  // Imports.
  void importAll(HandOver& handOver);
  [[nodiscard]] ErrorPtr prepare(Import& import);
  [[nodiscard]] ErrorPtr checkSource(const std::string& path);
  [[nodiscard]] ErrorPtr findRows(std::vector<Import>& imports);
  [[nodiscard]] ErrorPtr placeFile(Import& import);
  [[nodiscard]] ErrorPtr commit(std::vector<Import>& imports);
  void writeImport(LibraryWriter& writer, const Import& import,
                   std::map<RowId, std::uint32_t>& arrived);
  void fail(const Import& import, const ErrorPtr& why);

  // Clean-up and seal.
  [[nodiscard]] ErrorPtr cleanUp(const HandOver& handOver, const std::optional<Date>& before);
  [[nodiscard]] ErrorPtr seal(const std::string& snapshotPath);
  [[nodiscard]] std::optional<std::string> whyNotWhole(const DataPtr& snapshot, Expected* expected);
  [[nodiscard]] std::optional<std::string> whyNotInLibrary(SnapshotAssets wanted);

  // Restores.
  [[nodiscard]] ErrorPtr completeAssets(const std::vector<std::string>& uuids);
  void endRestore(bool recreateAlbums);
  [[nodiscard]] ErrorPtr registerCameraFiles(const std::vector<RestoredAlbum>& albums);
  std::vector<CameraAsset> unknownCameraAssets();
  void recreateAlbum(LibraryWriter& writer, const RestoredAlbum& album,
                     const std::unordered_map<std::string, RowId>& rows);

  Parts parts_;
  FileSystem& files_;
  MediaFolders folders_;
  std::atomic<bool> leftFilesBehind_{false};
  std::atomic<bool> restoring_{false};
  std::mutex restoredMutex_;
  std::shared_ptr<Expected> expected_;  // read ahead for the next seal; on the work queue
  std::vector<std::string> restored_;   // assets with new files that nobody has looked at yet
  DispatchQueuePtr completions_;
  DispatchQueuePtr work_;  // last: its blocks use the rest
};

}  // namespace kx
