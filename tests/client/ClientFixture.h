#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "client/KXSyncClient.h"
#include "platform/foundation/PropertyList.h"
#include "records/TesselDates.h"
#include "testing/LibraryText.h"
#include "testing/SnapshotBuilder.h"
#include "testing/TestPlatform.h"

namespace kx {

// A client on a device in memory, with the verbs of a sync. The calling thread stands for the
// daemon's plug-in queue.
class ClientTest : public ::testing::Test {
 protected:
  static constexpr double kHostTime = 3200000000.0;  // of SnapshotBuilder's assets
  static constexpr const char* kSource = "KXSyncClient";

  static Date deviceTime(double hostTime = kHostTime) {
    return dateWithTesselTimeInterval(hostTime);
  }
  // A synced device asset as the import of a plain snapshot asset makes it.
  static AssetSeed syncedAsset(const std::string& uuid) {
    AssetSeed seed;
    seed.uuid = uuid;
    seed.creationDate = seed.modificationDate = deviceTime();
    seed.sortToken = deviceTime().secondsSinceReference;
    seed.location = Coordinate{48.0, 11.0};
    return seed;
  }
  void addSynced(const std::string& uuid) { platform.library.addAsset(syncedAsset(uuid)); }
  void addAlbum(const std::string& uuid, const std::string& title,
                std::vector<std::string> assets = {}, std::int32_t kind = kKXAlbumKindSyncedAlbum) {
    AlbumSeed seed;
    seed.uuid = uuid;
    seed.title = title;
    seed.kind = kind;
    seed.list = kind == kKXAlbumKindSyncedFaceAlbum ? SeedList::kFaceAlbums
                : kind == kKXAlbumKindSyncedEvent   ? SeedList::kEvents
                                                    : SeedList::kAlbums;
    seed.assets = std::move(assets);
    platform.library.addAlbum(seed);
  }

  // The device's library is the one of the snapshot, so that the sync is no resync.
  void knowLibrary(const std::string& uuid = "LIBRARY") {
    const auto bytes = writePropertyList(Value::dictionary({{"libraryUUID", Value::string(uuid)}}),
                                         PropertyListFormat::kBinary, nullptr);
    platform.memoryFiles.writeFileAtomically(kKXCurrentLibraryUUIDPath, bytes, nullptr);
  }
  bool prepare() { return client->prepareForSyncWithHostAnchor("1", {}, nullptr); }
  bool reconcile(const SnapshotBuilder& snapshot, ErrorPtr* error = nullptr) {
    snapshot.write(platform.memoryFiles, kKXSnapshotPath);
    return client->reconcileSync(1, "1", {}, error);
  }
  std::vector<std::string> outstanding() {
    std::vector<std::string> identifiers;
    if (const auto list = client->outstandingAssets()) {
      for (const FRAssetPtr& request : *list) identifiers.push_back(request->identifier());
    }
    return identifiers;
  }
  FRAssetPtr request(const std::string& identifier) {
    if (const auto list = client->outstandingAssets()) {
      for (const FRAssetPtr& request : *list) {
        if (request->identifier() == identifier) return request;
      }
    }
    return nullptr;
  }
  void arrive(const FRAssetPtr& request) {
    request->setPath("Incoming/" + request->identifier());
    client->assetTransfer(request, true, nullptr);
  }
  void arriveAll() {
    for (const FRAssetPtr& request : client->outstandingAssetTransfers()) arrive(request);
  }
  // Everything that a daemon does for one sync, without a failure.
  void wholeSync(const SnapshotBuilder& snapshot) {
    ASSERT_TRUE(prepare());
    ASSERT_TRUE(reconcile(snapshot));
    arriveAll();
    client->assetTransferEndedWithSuccess(true);
    client->syncEndedWithSuccess(true);
  }
  void drain() {
    platform.saver.drain();
    platform.library.queue()->drain();
  }
  // Runs a block on the library's queue inside a transaction of the client's library.
  void inTransaction(const Block& block) {
    const auto group = std::make_shared<DispatchGroup>();
    client->library()->withDispatchGroupPerformTransaction(group, block);
    group->wait();
  }

  static ErrorPtr frError(std::int64_t code) { return Error::make(kFRErrorDomain, code); }
  static ErrorPtr posixError(std::int64_t code) { return Error::make(kPosixErrorDomain, code); }

  bool logged(LogLevel level, const std::string& text) const {
    return platform.captured.has(level, text);
  }
  // The texts of one function, oldest first.
  std::vector<std::string> loggedBy(const std::string& function) const {
    std::vector<std::string> texts;
    for (const CapturedMessage& message : platform.captured.messages()) {
      if (message.function == function) texts.push_back(message.text);
    }
    return texts;
  }
  std::string albums() { return textOfList(platform.library, SeedList::kAlbums); }
  std::string events() { return textOfList(platform.library, SeedList::kEvents); }
  std::string faceAlbums() { return textOfList(platform.library, SeedList::kFaceAlbums); }
  std::string assets() { return textOfSyncedAssets(platform.library); }
  enum class OwnAlbum { kShoebox, kSyncProgress, kRestoreProgress };
  std::string pending(OwnAlbum which) {
    std::int64_t row = 0;
    platform.library.perform([&](InMemoryLibraryState& state) {
      row = which == OwnAlbum::kShoebox        ? state.store.shoebox
            : which == OwnAlbum::kSyncProgress ? state.store.syncProgress
                                               : state.store.otaRestoreProgress;
    });
    return textOfPending(platform.library, row);
  }
  void setPending(OwnAlbum which, std::int32_t type, std::uint32_t count) {
    platform.library.perform([&](InMemoryLibraryState& state) {
      const std::int64_t row = which == OwnAlbum::kShoebox        ? state.store.shoebox
                               : which == OwnAlbum::kSyncProgress ? state.store.syncProgress
                                                                  : state.store.otaRestoreProgress;
      state.store.albums[row].pendingItemsType = type;
      state.store.albums[row].pendingItemsCount = count;
    });
  }
  Value readPlist(const std::string& path) {
    const DataPtr bytes = platform.memoryFiles.readFile(path, nullptr);
    return bytes ? readPropertyList(bytes, nullptr) : Value();
  }

  TestPlatform platform;
  std::unique_ptr<KXSyncClient> client = std::make_unique<KXSyncClient>(platform);
};

using Texts = std::vector<std::string>;

}  // namespace kx
