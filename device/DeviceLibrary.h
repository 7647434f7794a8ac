#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "device/LibraryContext.h"
#include "device/LibraryStore.h"
#include "device/ReadAhead.h"
#include "platform/library/KXPhotoLibrary.h"

namespace kx {

// The reference device's photo library as one of its users sees it.
class DeviceLibrary : public KXPhotoLibrary {
 public:
  DeviceLibrary(std::shared_ptr<LibraryStore> store, std::shared_ptr<ReadAhead> readAhead)
      : store_(std::move(store)), readAhead_(std::move(readAhead)) {}
  ~DeviceLibrary() override;

  void withDispatchGroupPerformTransaction(const DispatchGroupPtr& group, Block block) override;
  void withDispatchGroupPerformBlock(const DispatchGroupPtr& group, Block block) override;
  void performBlock(Block block) override;
  KXManagedObjectContext& managedObjectContext() override;
  KXGenericAlbumPtr syncProgressAlbum() override;
  KXGenericAlbumPtr otaRestoreProgressAlbum() override;
  KXGenericAlbumPtr shoeboxAlbum() override;
  KXGenericAlbumPtr insertNewAlbum() override;
  KXGenericAlbumPtr insertNewFaceAlbum() override;
  KXGenericAlbumPtr insertNewSyncedEvent() override;
  std::vector<KXGenericAlbumPtr> albumsOfKinds(const std::vector<int>& kinds) override;
  KXGenericAlbumPtr albumWithUUID(std::string_view uuid) override;
  KXManagedAssetPtr assetWithUUID(std::string_view uuid) override;
  std::vector<std::pair<std::string, std::string>> pathsForAllIncompleteAssets() override;
  std::shared_ptr<KXManagedAlbumList> albumList() override;
  std::shared_ptr<KXManagedAlbumList> eventList() override;
  std::shared_ptr<KXManagedAlbumList> facesAlbumList() override;
  std::string description() const override;

  // Only inside a block.
  LibraryContext& context();

 private:
  enum class Running : std::uint8_t { kNothing, kBlock, kTransaction };
  void submit(const DispatchGroupPtr& group, Block block, Running how);
  void run(const Block& block, Running how);
  LibraryContext& contextOfTransaction();

  const std::shared_ptr<LibraryStore> store_;
  const std::shared_ptr<ReadAhead> readAhead_;
  std::shared_ptr<LibraryContext> context_;  // had by the first block
  Running running_ = Running::kNothing;
};

// The class operations of the library framework.
class DeviceLibraryFramework : public KXPhotoLibraryFramework {
 public:
  DeviceLibraryFramework(std::shared_ptr<LibraryStore> store, std::shared_ptr<ReadAhead> readAhead)
      : store_(std::move(store)), readAhead_(std::move(readAhead)) {}
  KXPhotoLibraryPtr newPhotoLibrary() override;
  std::string dcimDirectory() override;
  std::string photoDataDirectory() override;
  std::string photoDataCachesDirectory() override;
  std::string cascadesDataDirectory() override;
  std::string tesselSyncedAssetsDirectory() override;
  std::string tesselSyncedFaceAlbumThumbnailsDirectory() override;
  std::string syncInfoPath() override;
  std::string pathToAssetAlbumOrderStructure() override;
  void clearAssetOrderByAbumUUIDs() override;

 private:
  const std::shared_ptr<LibraryStore> store_;
  const std::shared_ptr<ReadAhead> readAhead_;
};

}  // namespace kx
