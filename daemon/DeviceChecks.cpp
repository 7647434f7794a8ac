#include "daemon/DeviceChecks.h"

#include <string>

#include "daemon/FileTransfer.h"
#include "daemon/PluginHost.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr std::size_t kGuardAssets = 50;

ErrorPtr syncError(SyncErrorCode code, const std::string& message) {
  return Error::make(kSyncErrorDomain, static_cast<std::int64_t>(code),
                     escapeControlCharacters(message));
}

bool isSyncedKind(std::int32_t kind) {
  return kind == kKXAlbumKindSyncedAlbum || kind == kKXAlbumKindSyncedEvent ||
         kind == kKXAlbumKindSyncedFaceAlbum;
}

// Inside a block of the library.
void compareAssets(const CheckedSnapshot& snapshot, KXPhotoLibrary& library,
                   DeviceComparison* comparison, ErrorPtr* error) {
  AssetFetchRequest request;
  request.fetchOnlyUUID = true;
  const auto assets = library.managedObjectContext().fetchAssets(request, error);
  if (!assets) return;
  comparison->syncedAssets = assets->size();
  std::unordered_set<std::string_view> present;
  present.reserve(assets->size());
  for (const KXManagedAssetPtr& asset : *assets) {
    const OptionalString uuid = asset->uuid();
    const auto listed = uuid ? snapshot.assetUUIDs.find(*uuid) : snapshot.assetUUIDs.end();
    if (listed == snapshot.assetUUIDs.end()) {
      ++comparison->unlisted;
    } else {
      present.insert(*listed);
    }
  }
  for (const std::string_view uuid : snapshot.assetUUIDs) {
    if (!present.contains(uuid)) comparison->newAssets.push_back(uuid);
  }
}

void compareContainers(const CheckedSnapshot& snapshot, KXPhotoLibrary& library,
                       DeviceComparison* comparison) {
  for (const std::string_view uuid : snapshot.containerUUIDs) {
    const KXGenericAlbumPtr album = library.albumWithUUID(uuid);
    if (album && !isSyncedKind(album->kindValue())) {
      comparison->deviceMadeContainer = uuid;
      return;
    }
  }
}

}  // namespace

ErrorPtr compareWithDevice(const CheckedSnapshot& snapshot, Platform& platform,
                           DeviceComparison* comparison) {
  ErrorPtr error;
  std::optional<RaisedException> raised = catchRaised([&] {
    const KXPhotoLibraryPtr library = platform.photoLibrary().newPhotoLibrary();
    const auto group = std::make_shared<DispatchGroup>();
    std::optional<RaisedException> inside;
    library->withDispatchGroupPerformBlock(group, [&] {
      inside = catchRaised([&] {
        compareAssets(snapshot, *library, comparison, &error);
        if (!error) compareContainers(snapshot, *library, comparison);
      });
    });
    group->wait();
    if (inside) error = syncError(SyncErrorCode::kDevice, inside->reason);
  });
  if (raised) error = syncError(SyncErrorCode::kDevice, raised->reason);
  if (!error) return nullptr;
  return Error::make(error->domain(), error->code(),
                     "the device library cannot be read: " + error->message());
}

ErrorPtr refuseDeviceMadeContainers(const DeviceComparison& comparison) {
  if (comparison.deviceMadeContainer.empty()) return nullptr;
  return syncError(SyncErrorCode::kBadSnapshot,
                   "the host's snapshot is refused: album or event " +
                       comparison.deviceMadeContainer.substr(0, 64) +
                       " has the identifier of an album that was made on the device");
}

ErrorPtr guardAgainstDeletes(const CheckedSnapshot& snapshot, const DeviceComparison& comparison) {
  const std::string all = std::to_string(comparison.syncedAssets);
  if (snapshot.assetUUIDs.empty() && comparison.syncedAssets > 0) {
    return syncError(SyncErrorCode::kGuard,
                     "stopped: the host lists no photo at all, so all " + all +
                         " synced ones would be deleted; --allow-deletes lets it pass");
  }
  const bool isTooMuch =
      comparison.unlisted > kGuardAssets && comparison.unlisted * 2 > comparison.syncedAssets;
  if (!isTooMuch) return nullptr;
  return syncError(SyncErrorCode::kGuard,
                   "stopped: " + std::to_string(comparison.unlisted) + " of " + all +
                       " synced photos would be deleted; --allow-deletes lets it pass");
}

ErrorPtr refuseWithoutSpace(const DeviceComparison& comparison, HostLink& host,
                            const SyncOptions& options) {
  std::uint64_t needed = 0;
  for (const std::string_view uuid : comparison.newAssets) {
    const auto size = host.mediaSize(uuid);
    // What no file can have is refused when its turn comes.
    if (size && *size > 0 && *size <= kMediaFileBytes) needed += static_cast<std::uint64_t>(*size);
  }
  if (needed == 0) return nullptr;
  const std::uint64_t free = freeBytesAt(options.deviceRoot);
  const std::uint64_t wanted = needed + options.reserveBytes;
  if (wanted <= free) return nullptr;
  return syncError(SyncErrorCode::kNoSpace,
                   "no space left on the device: " + std::to_string(needed) + " bytes needed and " +
                       std::to_string(options.reserveBytes) + " kept free, " +
                       std::to_string(free) + " free, " + std::to_string(wanted - free) +
                       " missing");
}

}  // namespace kx
