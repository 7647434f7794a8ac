#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/files/FileSystem.h"
#include "platform/library/KXPhotoLibrary.h"
#include "testing/InMemoryContext.h"

namespace kx {

// A photo library that lives in memory and keeps the contract of the real one: one queue for all
// library objects, transactions that roll back, one object per row and context. Any thread; every
// library object must be gone before it goes.
class InMemoryPhotoLibraryFramework final : public KXPhotoLibraryFramework {
 public:
  // The asset order file is read from `files`, which must outlive this object.
  explicit InMemoryPhotoLibraryFramework(FileSystem& files);
  ~InMemoryPhotoLibraryFramework() override;

  KXPhotoLibraryPtr newPhotoLibrary() override;
  std::string dcimDirectory() override { return "/var/mobile/Media/DCIM"; }
  std::string photoDataDirectory() override { return "/var/mobile/Media/PhotoData"; }
  std::string photoDataCachesDirectory() override { return "/var/mobile/Media/PhotoData/Caches"; }
  std::string cascadesDataDirectory() override { return "/var/mobile/Media/CascadesData"; }
  std::string tesselSyncedAssetsDirectory() override { return "/var/mobile/Media/PhotoData/Sync"; }
  std::string tesselSyncedFaceAlbumThumbnailsDirectory() override {
    return "/var/mobile/Media/PhotoData/FaceAlbumThumbnails";
  }
  std::string syncInfoPath() override { return "/var/mobile/Media/PhotoData/SyncInfo.plist"; }
  std::string pathToAssetAlbumOrderStructure() override {
    return "/var/mobile/Media/PhotoData/AssetOrder.plist";
  }
  void clearAssetOrderByAbumUUIDs() override;

  // For tests. Runs the block on the library's queue and waits.
  void perform(const std::function<void(InMemoryLibraryState&)>& block);
  std::int64_t addAsset(const AssetSeed& seed);
  std::int64_t addAlbum(const AlbumSeed& seed);
  // The error that each library operation named so fails with, or null (see InMemoryLibraryState).
  void setFault(InMemoryLibraryState::Fault fault);
  // The next commits, after `skip` others, fail.
  void failCommits(std::size_t count, std::size_t skip = 0);
  std::size_t failedCommits();
  // What blocks have thrown so far.
  std::vector<std::string> blockExceptions() const;
  // Libraries that are open now, and that have been opened.
  std::size_t openLibraries() const;
  std::size_t openedLibraries() const;
  std::size_t rowsWritten();
  std::size_t listSorts();
  const DispatchQueuePtr& queue() const;

 private:
  class Library;
  struct Shared;
  std::shared_ptr<Shared> shared_;
};

}  // namespace kx
