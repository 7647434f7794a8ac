#include "daemon/DeviceChecks.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <functional>
#include <string>

#include "daemon/FileTransfer.h"
#include "daemon/PluginHost.h"
#include "daemon/RunErrors.h"

namespace kx {
namespace {

constexpr std::size_t kGuardAssets = 50;

std::string counted(std::size_t count, const std::string& what) {
  return std::to_string(count) + " " + what + (count == 1 ? "" : "s");
}

// "12345678 bytes needed (12.3 MB)"
std::string bytes(std::uint64_t count, const std::string& role) {
  constexpr std::array<const char*, 6> kUnits = {"kB", "MB", "GB", "TB", "PB", "EB"};
  std::string text = std::to_string(count) + " bytes " + role;
  if (count < 1000) return text;
  double value = static_cast<double>(count) / 1000.0;
  std::size_t unit = 0;
  for (; value >= 999.95 && unit + 1 < kUnits.size(); ++unit) value /= 1000.0;
  std::array<char, 32> readable{};
  std::snprintf(readable.data(), readable.size(), " (%.1f %s)", value, kUnits[unit]);
  return text + readable.data();
}

// The synced assets that the snapshot does not list, each with all that the device knows of it.
// Costs a reading of the whole library: only for a sync that is about to be stopped. What cannot be
// read is left out, since the figures alone say enough.
void forEachUnlisted(const CheckedSnapshot& snapshot, ReferenceDevice& device,
                     const std::function<void(const DeviceDump::Asset&)>& visit) {
  ErrorPtr ignored;
  const DeviceDump dump = device.dump(false, &ignored);
  for (const DeviceDump::Asset& asset : dump.assets) {
    const bool isSynced = asset.savedAssetType == kKXSavedAssetTypeSynced;
    if (isSynced && !snapshot.assetUUIDs.contains(asset.uuid)) visit(asset);
  }
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
  std::vector<bool> isPresent(snapshot.assetUUIDs.size());
  std::uint32_t next = 0;
  for (const KXManagedAssetPtr& asset : *assets) {
    const OptionalString uuid = asset->uuid();
    const std::uint32_t listed = uuid ? snapshot.assetUUIDs.find(*uuid, next) : TextNumbers::kNone;
    if (listed == TextNumbers::kNone) {
      ++comparison->unlisted;
    } else {
      isPresent[listed] = true;
      next = listed + 1;
    }
  }
  for (std::size_t number = 0; number < isPresent.size(); ++number) {
    if (!isPresent[number]) comparison->newAssets.push_back(snapshot.assetUUIDs.texts()[number]);
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

std::optional<GuardFacts> guardAgainstDeletes(const CheckedSnapshot& snapshot,
                                              const DeviceComparison& comparison,
                                              ReferenceDevice& device) {
  GuardFacts facts;
  facts.syncedAssets = comparison.syncedAssets;
  facts.deletes = comparison.unlisted;
  facts.listsNone = snapshot.assetUUIDs.empty() && comparison.syncedAssets > 0;
  const bool isTooMuch =
      comparison.unlisted > kGuardAssets && comparison.unlisted * 2 > comparison.syncedAssets;
  if (!facts.listsNone && !isTooMuch) return std::nullopt;
  forEachUnlisted(snapshot, device, [&facts](const DeviceDump::Asset& asset) {
    ++(asset.isVideo ? facts.videos : facts.photos);
  });
  return facts;
}

ErrorPtr guardError(const GuardFacts& facts) {
  const std::string all = std::to_string(facts.syncedAssets);
  const std::string kinds =
      facts.photos + facts.videos == facts.deletes
          ? " (" + counted(facts.photos, "photo") + ", " + counted(facts.videos, "video") + ")"
          : std::string();
  if (facts.listsNone) {
    return syncError(SyncErrorCode::kGuard, "stopped: the host lists no photo at all, so all " +
                                                all + " synced ones would be deleted" + kinds +
                                                "; --allow-deletes lets it pass");
  }
  return syncError(SyncErrorCode::kGuard, "stopped: " + std::to_string(facts.deletes) + " of " +
                                              all + " synced photos would be deleted" + kinds +
                                              ", more than half of them and " + "more than " +
                                              std::to_string(kGuardAssets) +
                                              "; --allow-deletes lets it pass");
}

std::optional<SpaceFacts> refuseWithoutSpace(const CheckedSnapshot& snapshot,
                                             const DeviceComparison& comparison, HostLink& host,
                                             ReferenceDevice& device, const SyncOptions& options) {
  std::uint64_t needed = 0;
  for (const std::string_view uuid : comparison.newAssets) {
    const auto size = host.mediaSize(uuid);
    // What no file can have is refused when its turn comes.
    if (size && *size > 0 && *size <= kMediaFileBytes) needed += static_cast<std::uint64_t>(*size);
  }
  if (needed == 0) return std::nullopt;
  std::uint64_t free = freeBytesAt(options.deviceRoot);
  if (!shortage(needed, options.reserveBytes, free)) return std::nullopt;
  forEachUnlisted(snapshot, device, [&free](const DeviceDump::Asset& asset) {
    free += static_cast<std::uint64_t>(std::max<std::int64_t>(asset.size, 0));
  });
  return shortage(needed, options.reserveBytes, free);
}

std::optional<SpaceFacts> shortage(std::uint64_t needed, std::uint64_t kept, std::uint64_t free) {
  if (needed + kept <= free) return std::nullopt;
  return SpaceFacts{needed, kept, free, needed + kept - free};
}

ErrorPtr spaceError(const SpaceFacts& facts) {
  return syncError(SyncErrorCode::kNoSpace,
                   "no space left on the device: " + bytes(facts.needed, "needed") + " and " +
                       bytes(facts.kept, "kept free") + ", " + bytes(facts.free, "free") + ", " +
                       bytes(facts.missing, "missing"));
}

}  // namespace kx
