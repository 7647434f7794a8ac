#include "device/DeviceLibrary.h"

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "platform/foundation/Exceptions.h"

namespace kx {
namespace {

constexpr std::int32_t kUserAlbumKind = 2;

}  // namespace

DeviceLibrary::~DeviceLibrary() {
  // Its context belongs to the queue, whoever lets go of the library last.
  if (!context_) return;
  store_->queue().async([context = std::move(context_), readAhead = readAhead_]() mutable {
    readAhead->giveBack(std::move(context));
    context.reset();
  });
}

void DeviceLibrary::submit(const DispatchGroupPtr& group, Block block, Running how) {
  auto self = std::static_pointer_cast<DeviceLibrary>(shared_from_this());
  store_->queue().async(group, [self, block = std::move(block), how] { self->run(block, how); });
}

void DeviceLibrary::withDispatchGroupPerformTransaction(const DispatchGroupPtr& group,
                                                        Block block) {
  submit(group, std::move(block), Running::kTransaction);
}

void DeviceLibrary::withDispatchGroupPerformBlock(const DispatchGroupPtr& group, Block block) {
  submit(group, std::move(block), Running::kBlock);
}

void DeviceLibrary::performBlock(Block block) {
  submit(nullptr, std::move(block), Running::kBlock);
}

void DeviceLibrary::run(const Block& block, Running how) {
  if (!context_) context_ = readAhead_->take();
  if (!context_) context_ = std::make_shared<LibraryContext>(store_);
  running_ = how;
  store_->beginReading();
  try {
    block();
    store_->endReading();
    if (how == Running::kTransaction) context_->save();
  } catch (const std::exception& exception) {
    store_->endReading();
    context_->dropChanges();
    store_->health().noteFailure(
        how == Running::kTransaction ? "a library transaction ended with an exception"
                                     : "a library block ended with an exception",
        Error::make(kDeviceErrorDomain, static_cast<std::int64_t>(DeviceError::kIo),
                    exception.what()));
  }
  running_ = Running::kNothing;
}

LibraryContext& DeviceLibrary::context() {
  if (running_ == Running::kNothing || !store_->queue().isCurrent()) {
    throw InternalInconsistency("the photo library is used outside its blocks");
  }
  return *context_;
}

LibraryContext& DeviceLibrary::contextOfTransaction() {
  LibraryContext& present = context();
  if (running_ != Running::kTransaction) {
    throw InternalInconsistency("an album is inserted outside a transaction");
  }
  return present;
}

KXManagedObjectContext& DeviceLibrary::managedObjectContext() { return context(); }

KXGenericAlbumPtr DeviceLibrary::syncProgressAlbum() {
  return context().albumWithRole("syncProgress");
}

KXGenericAlbumPtr DeviceLibrary::otaRestoreProgressAlbum() {
  return context().albumWithRole("otaRestoreProgress");
}

KXGenericAlbumPtr DeviceLibrary::shoeboxAlbum() { return context().albumWithRole("camera"); }

KXGenericAlbumPtr DeviceLibrary::insertNewAlbum() {
  return contextOfTransaction().insertAlbum(kUserAlbumKind, ListId::kAlbums);
}

KXGenericAlbumPtr DeviceLibrary::insertNewFaceAlbum() {
  return contextOfTransaction().insertAlbum(kKXAlbumKindSyncedFaceAlbum, ListId::kFaceAlbums);
}

KXGenericAlbumPtr DeviceLibrary::insertNewSyncedEvent() {
  return contextOfTransaction().insertAlbum(kKXAlbumKindSyncedEvent, ListId::kEvents);
}

std::vector<KXGenericAlbumPtr> DeviceLibrary::albumsOfKinds(const std::vector<int>& kinds) {
  return context().albumsOfKinds(kinds);
}

KXGenericAlbumPtr DeviceLibrary::albumWithUUID(std::string_view uuid) {
  return context().albumWithUUID(uuid);
}

KXManagedAssetPtr DeviceLibrary::assetWithUUID(std::string_view uuid) {
  return context().assetWithUUID(uuid);
}

std::vector<std::pair<std::string, std::string>> DeviceLibrary::pathsForAllIncompleteAssets() {
  return context().pathsForAllIncompleteAssets();
}

std::shared_ptr<KXManagedAlbumList> DeviceLibrary::albumList() {
  return context().list(ListId::kAlbums);
}

std::shared_ptr<KXManagedAlbumList> DeviceLibrary::eventList() {
  return context().list(ListId::kEvents);
}

std::shared_ptr<KXManagedAlbumList> DeviceLibrary::facesAlbumList() {
  return context().list(ListId::kFaceAlbums);
}

std::string DeviceLibrary::description() const { return "KXPhotoLibrary"; }

KXPhotoLibraryPtr DeviceLibraryFramework::newPhotoLibrary() {
  return std::make_shared<DeviceLibrary>(store_, readAhead_);
}

std::string DeviceLibraryFramework::dcimDirectory() { return device_paths::kDcim; }
std::string DeviceLibraryFramework::photoDataDirectory() { return device_paths::kPhotoData; }
std::string DeviceLibraryFramework::photoDataCachesDirectory() { return device_paths::kCaches; }
std::string DeviceLibraryFramework::cascadesDataDirectory() { return device_paths::kCascades; }

std::string DeviceLibraryFramework::tesselSyncedAssetsDirectory() {
  return device_paths::kSyncedAssets;
}

std::string DeviceLibraryFramework::tesselSyncedFaceAlbumThumbnailsDirectory() {
  return device_paths::kFaceThumbnails;
}

std::string DeviceLibraryFramework::syncInfoPath() { return device_paths::kSyncInfo; }

std::string DeviceLibraryFramework::pathToAssetAlbumOrderStructure() {
  return device_paths::kAssetOrder;
}

void DeviceLibraryFramework::clearAssetOrderByAbumUUIDs() { store_->assetOrder().clear(); }

}  // namespace kx
