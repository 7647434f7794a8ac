#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/Platform.h"
#include "platform/foundation/PropertyList.h"
#include "testing/LibrarySeeds.h"

// What every device library must do, whatever it is made of. A test program includes this header
// once, provides a ContractDevice and instantiates the suite:
//
//   INSTANTIATE_TEST_SUITE_P(InMemory, PhotoLibraryContract, ::testing::Values(&makeMyDevice));
namespace kx {

// One fresh, empty device.
class ContractDevice {
 public:
  virtual ~ContractDevice() = default;
  virtual Platform& platform() = 0;
  // Put rows in place before any library is open.
  virtual void addAsset(const AssetSeed& seed) = 0;
  virtual void addAlbum(const AlbumSeed& seed) = 0;
  // UUIDs of the album's assets in the album's order, as saved.
  virtual std::vector<std::string> assetsOfAlbum(const std::string& uuid) = 0;
  // Whether a new library object may know objects that nobody has touched.
  virtual bool readsAhead() const { return false; }
  // The next transaction fails to commit.
  virtual void failNextCommit() = 0;
};

using ContractDeviceMaker = std::function<std::unique_ptr<ContractDevice>()>;

class PhotoLibraryContract : public ::testing::TestWithParam<ContractDeviceMaker> {
 protected:
  void SetUp() override { device_ = GetParam()(); }
  void TearDown() override {
    library_ = nullptr;
    device_ = nullptr;
  }

  Platform& platform() { return device_->platform(); }
  KXPhotoLibrary& library() {
    if (!library_) library_ = platform().photoLibrary().newPhotoLibrary();
    return *library_;
  }

  void transaction(const Block& block) { transactionIn(library(), block); }
  static void transactionIn(KXPhotoLibrary& library, const Block& block) {
    const auto group = std::make_shared<DispatchGroup>();
    library.withDispatchGroupPerformTransaction(group, block);
    group->wait();
  }
  void read(const Block& block) { readIn(library(), block); }
  static void readIn(KXPhotoLibrary& library, const Block& block) {
    const auto group = std::make_shared<DispatchGroup>();
    library.withDispatchGroupPerformBlock(group, block);
    group->wait();
  }

  void addAsset(const std::string& uuid, std::optional<double> sortToken = std::nullopt) {
    AssetSeed seed;
    seed.uuid = uuid;
    seed.sortToken = sortToken;
    device_->addAsset(seed);
  }
  void addAlbum(const std::string& uuid, std::vector<std::string> assets = {},
                std::int32_t kind = kKXAlbumKindSyncedAlbum) {
    AlbumSeed seed;
    seed.uuid = uuid;
    seed.title = uuid;
    seed.kind = kind;
    seed.list = kind == kKXAlbumKindSyncedFaceAlbum ? SeedList::kFaceAlbums
                : kind == kKXAlbumKindSyncedEvent   ? SeedList::kEvents
                                                    : SeedList::kAlbums;
    seed.assets = std::move(assets);
    device_->addAlbum(seed);
  }

  // UUIDs of the album list, "-" for null.
  static std::vector<std::string> uuids(std::span<const KXGenericAlbumPtr> albums) {
    std::vector<std::string> all;
    for (const KXGenericAlbumPtr& album : albums) {
      all.emplace_back(album->uuid().value_or("-"));
    }
    return all;
  }
  std::vector<std::string> albumList() {
    std::vector<std::string> all;
    read([&] { all = uuids(library().albumList()->albums()); });
    return all;
  }
  std::vector<std::string> albumsOf(const std::string& asset) {
    std::vector<std::string> all;
    read([&] { all = uuids(library().assetWithUUID(asset)->albums()); });
    return all;
  }
  std::vector<std::string> fetchedAssets(const AssetFetchRequest& request = {}) {
    std::vector<std::string> all;
    read([&] {
      const auto assets = library().managedObjectContext().fetchAssets(request, nullptr);
      ASSERT_TRUE(assets.has_value());
      for (const KXManagedAssetPtr& asset : *assets) all.emplace_back(asset->uuid().value_or("-"));
    });
    return all;
  }
  KXManagedAlbum* managed(const std::string& uuid) {
    return library().albumWithUUID(uuid)->asManagedAlbum();
  }
  void writeAssetOrder(const std::string& album, const std::vector<std::string>& assets) {
    Dictionary order;
    std::uint64_t index = 0;
    for (const std::string& asset : assets) order.set(asset, Value::unsignedInteger(index++));
    Dictionary root;
    root.set(album, Value::dictionary(std::move(order)));
    KXPhotoLibraryFramework& framework = platform().photoLibrary();
    const std::string path = framework.pathToAssetAlbumOrderStructure();
    const std::size_t slash = path.rfind('/');
    platform().files().createDirectoryWithIntermediates(path.substr(0, slash), nullptr);
    ASSERT_TRUE(platform().files().writeFileAtomically(
        path,
        writePropertyList(Value::dictionary(std::move(root)), PropertyListFormat::kBinary, nullptr),
        nullptr));
    framework.clearAssetOrderByAbumUUIDs();
  }

  std::unique_ptr<ContractDevice> device_;
  KXPhotoLibraryPtr library_;
};

using Texts = std::vector<std::string>;

TEST_P(PhotoLibraryContract, FetchesSyncedAssetsInRowOrder) {
  addAsset("B");
  addAsset("A");
  AssetSeed own;
  own.uuid = "OWN";
  own.savedAssetType = 0;
  device_->addAsset(own);
  addAsset("C");
  EXPECT_EQ(fetchedAssets(), (Texts{"B", "A", "C"}));
  AssetFetchRequest others;
  others.predicate.comparison = AssetPredicate::Comparison::kSavedAssetTypeDiffers;
  EXPECT_EQ(fetchedAssets(others), (Texts{"OWN"}));
}

TEST_P(PhotoLibraryContract, PrefetchingFetchGivesFacesAndAlbums) {
  AssetSeed seed;
  seed.uuid = "A";
  seed.faces = {{7, Rect{0.1, 0.2, 0.3, 0.4}, "PERSON"}, {9, Rect{}, std::nullopt}};
  device_->addAsset(seed);
  addAlbum("ONE", {"A"});
  addAlbum("TWO", {"A"}, kKXAlbumKindSyncedEvent);
  read([&] {
    AssetFetchRequest request;
    request.prefetchFaces = request.prefetchAlbums = request.fetchOnlyUUID = true;
    const auto assets = library().managedObjectContext().fetchAssets(request, nullptr);
    ASSERT_EQ(assets->size(), 1U);
    const auto faces = assets->front()->faces();
    ASSERT_EQ(faces.size(), 2U);
    EXPECT_EQ(faces[0]->identifier(), 7);
    EXPECT_EQ(faces[0]->relativeRect(), (Rect{0.1, 0.2, 0.3, 0.4}));
    EXPECT_EQ(faces[0]->albumUUID(), "PERSON");
    EXPECT_EQ(faces[1]->identifier(), 9);
    EXPECT_EQ(faces[1]->albumUUID(), std::nullopt);
    EXPECT_EQ(uuids(assets->front()->albums()), (Texts{"ONE", "TWO"}));
  });
}

TEST_P(PhotoLibraryContract, CountsAndSizesFollowThePredicate) {
  AssetSeed synced;
  synced.uuid = "A";
  synced.originalFilesize = 5'000'000'000;
  synced.sidecarSizes = {1, 2};
  device_->addAsset(synced);
  AssetSeed own;
  own.uuid = "B";
  own.savedAssetType = 3;
  own.originalFilesize = 7;
  device_->addAsset(own);
  AssetSeed unsized;
  unsized.uuid = "C";
  device_->addAsset(unsized);
  read([&] {
    KXManagedObjectContext& context = library().managedObjectContext();
    AssetPredicate predicate;
    EXPECT_EQ(context.countAssets(predicate, nullptr), 2U);
    EXPECT_EQ(context.originalFileSizes(predicate, nullptr),
              (std::vector<std::int64_t>{5'000'000'000}));
    EXPECT_EQ(context.sidecarFileSizes(predicate, nullptr), (std::vector<std::int64_t>{1, 2}));
    predicate.comparison = AssetPredicate::Comparison::kSavedAssetTypeDiffers;
    EXPECT_EQ(context.countAssets(predicate, nullptr), 1U);
    EXPECT_EQ(context.originalFileSizes(predicate, nullptr), (std::vector<std::int64_t>{7}));
    EXPECT_TRUE(context.sidecarFileSizes(predicate, nullptr)->empty());
  });
}

TEST_P(PhotoLibraryContract, OneObjectPerRowAndContext) {
  addAsset("A");
  addAlbum("ALBUM", {"A"});
  const KXPhotoLibraryPtr other = platform().photoLibrary().newPhotoLibrary();
  KXGenericAlbumPtr seenByOther;
  readIn(*other, [&] { seenByOther = other->albumWithUUID("ALBUM"); });
  read([&] {
    const KXGenericAlbumPtr album = library().albumWithUUID("ALBUM");
    EXPECT_EQ(album, library().albumList()->albums()[0]);
    EXPECT_EQ(album, library().assetWithUUID("A")->albums()[0]);
    EXPECT_EQ(album, library().albumsOfKinds({kKXAlbumKindSyncedAlbum})[0]);
    EXPECT_EQ(library().assetWithUUID("A"), library().assetWithUUID("A"));
    EXPECT_NE(album, seenByOther);
    EXPECT_EQ(album->objectID(), seenByOther->objectID());
  });
  readIn(*other, [&] { seenByOther = nullptr; });
}

TEST_P(PhotoLibraryContract, AbsentObjectsAreNull) {
  read([&] {
    EXPECT_EQ(library().albumWithUUID("NONE"), nullptr);
    EXPECT_EQ(library().assetWithUUID("NONE"), nullptr);
    EXPECT_EQ(library().assetWithUUID(""), nullptr);
  });
}

TEST_P(PhotoLibraryContract, CommittedChangesAreSeenByALibraryOpenedBefore) {
  addAlbum("ALBUM");
  const KXPhotoLibraryPtr other = platform().photoLibrary().newPhotoLibrary();
  std::string before;
  readIn(*other, [&] { before = other->albumWithUUID("ALBUM")->title().value_or("-"); });
  EXPECT_EQ(before, "ALBUM");
  transaction([&] { library().albumWithUUID("ALBUM")->setTitle("New"); });
  std::string after;
  readIn(*other, [&] { after = other->albumWithUUID("ALBUM")->title().value_or("-"); });
  EXPECT_EQ(after, "New");
}

TEST_P(PhotoLibraryContract, BlocksRunInTheOrderSubmitted) {
  std::vector<int> order;
  const auto group = std::make_shared<DispatchGroup>();
  const KXPhotoLibraryPtr other = platform().photoLibrary().newPhotoLibrary();
  library().withDispatchGroupPerformTransaction(group, [&] { order.push_back(1); });
  other->withDispatchGroupPerformBlock(group, [&] { order.push_back(2); });
  library().withDispatchGroupPerformBlock(group, [&] { order.push_back(3); });
  group->wait();
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST_P(PhotoLibraryContract, ANewAlbumIsCommittedWithAllItsFields) {
  transaction([&] {
    const KXGenericAlbumPtr album = library().insertNewAlbum();
    ASSERT_NE(album, nullptr);
    ASSERT_NE(album->asManagedAlbum(), nullptr);
    album->setTitle("Trip");
    album->setUuid("ALBUM");
    album->setKindValue(kKXAlbumKindSyncedAlbum);
    album->setPendingItemsType(2);
    album->setPendingItemsCount(3);
  });
  library_ = nullptr;
  read([&] {
    const KXGenericAlbumPtr album = library().albumWithUUID("ALBUM");
    ASSERT_NE(album, nullptr);
    EXPECT_EQ(album->title(), "Trip");
    EXPECT_EQ(album->kindValue(), kKXAlbumKindSyncedAlbum);
    EXPECT_EQ(album->pendingItemsType(), 2);
    EXPECT_EQ(album->pendingItemsCount(), 3U);
    EXPECT_FALSE(album->objectID().URIRepresentation().empty());
  });
}

TEST_P(PhotoLibraryContract, NewContainersGoToTheEndOfTheirList) {
  addAlbum("OLD");
  addAlbum("OLD EVENT", {}, kKXAlbumKindSyncedEvent);
  transaction([&] {
    library().insertNewAlbum()->setUuid("ALBUM");
    library().insertNewSyncedEvent()->setUuid("EVENT");
    library().insertNewFaceAlbum()->setUuid("FACES");
    EXPECT_EQ(uuids(library().albumList()->albums()), (Texts{"OLD", "ALBUM"}));
  });
  read([&] {
    EXPECT_EQ(uuids(library().albumList()->albums()), (Texts{"OLD", "ALBUM"}));
    EXPECT_EQ(uuids(library().eventList()->albums()), (Texts{"OLD EVENT", "EVENT"}));
    EXPECT_EQ(uuids(library().facesAlbumList()->albums()), (Texts{"FACES"}));
  });
}

TEST_P(PhotoLibraryContract, ANullTitleStaysNullAndAnEmptyOneEmpty) {
  transaction([&] {
    const KXGenericAlbumPtr none = library().insertNewSyncedEvent();
    none->setUuid("NULL");
    none->setTitle(std::nullopt);
    const KXGenericAlbumPtr empty = library().insertNewSyncedEvent();
    empty->setUuid("EMPTY");
    empty->setTitle("");
  });
  library_ = nullptr;
  read([&] {
    EXPECT_EQ(library().albumWithUUID("NULL")->title(), std::nullopt);
    EXPECT_EQ(library().albumWithUUID("EMPTY")->title(), "");
  });
}

TEST_P(PhotoLibraryContract, AFailedCommitLeavesEverythingAsItWas) {
  addAsset("A");
  addAlbum("ALBUM", {"A"});
  library();
  device_->failNextCommit();
  transaction([&] {
    library().albumWithUUID("ALBUM")->setTitle("Changed");
    library().insertNewAlbum()->setUuid("NEW");
    library().assetWithUUID("A")->deleteObject();
  });
  read([&] {
    EXPECT_EQ(library().albumWithUUID("ALBUM")->title(), "ALBUM");
    EXPECT_EQ(library().albumWithUUID("NEW"), nullptr);
    ASSERT_NE(library().assetWithUUID("A"), nullptr);
    EXPECT_FALSE(library().assetWithUUID("A")->isDeleted());
    EXPECT_FALSE(library().assetWithUUID("A")->hasChanges());
  });
  EXPECT_EQ(albumList(), (Texts{"ALBUM"}));
  EXPECT_EQ(albumsOf("A"), (Texts{"ALBUM"}));
}

TEST_P(PhotoLibraryContract, AnExceptionRollsTheTransactionBackAndLeavesTheGroup) {
  addAlbum("ALBUM");
  transaction([&] {
    library().albumWithUUID("ALBUM")->setTitle("Changed");
    throw std::runtime_error("out of the block");
  });
  read([&] { EXPECT_EQ(library().albumWithUUID("ALBUM")->title(), "ALBUM"); });
  transaction([&] { library().albumWithUUID("ALBUM")->setTitle("Later"); });
  read([&] { EXPECT_EQ(library().albumWithUUID("ALBUM")->title(), "Later"); });
}

TEST_P(PhotoLibraryContract, AnExceptionInABlockDropsItsChanges) {
  addAlbum("ALBUM");
  read([&] {
    library().albumWithUUID("ALBUM")->setTitle("Changed");
    throw std::runtime_error("out of the block");
  });
  read([&] { EXPECT_EQ(library().albumWithUUID("ALBUM")->title(), "ALBUM"); });
}

TEST_P(PhotoLibraryContract, ChangesOfAPlainBlockStayUnsavedInTheContext) {
  addAlbum("ALBUM");
  read([&] {
    library().albumWithUUID("ALBUM")->setTitle("Unsaved");
    EXPECT_TRUE(library().albumWithUUID("ALBUM")->hasChanges());
  });
  read([&] { EXPECT_EQ(library().albumWithUUID("ALBUM")->title(), "Unsaved"); });
  const KXPhotoLibraryPtr other = platform().photoLibrary().newPhotoLibrary();
  readIn(*other, [&] { EXPECT_EQ(other->albumWithUUID("ALBUM")->title(), "ALBUM"); });
}

TEST_P(PhotoLibraryContract, RefreshingWithMergeKeepsUnsavedChanges) {
  addAlbum("ALBUM");
  read([&] {
    KXManagedObjectContext& context = library().managedObjectContext();
    const KXGenericAlbumPtr album = library().albumWithUUID("ALBUM");
    album->setTitle("Unsaved");
    context.refreshObject(album, true);
    EXPECT_EQ(album->title(), "Unsaved");
    EXPECT_TRUE(album->hasChanges());
    EXPECT_EQ(album->uuid(), "ALBUM");
    context.refreshObject(album, false);
    EXPECT_EQ(album->title(), "ALBUM");
    EXPECT_FALSE(album->hasChanges());
  });
}

TEST_P(PhotoLibraryContract, EveryTouchedObjectIsRegistered) {
  addAsset("A");
  addAlbum("ALBUM", {"A"});
  read([&] {
    if (!device_->readsAhead()) {
      EXPECT_TRUE(library().managedObjectContext().registeredObjects().empty());
    }
    const KXGenericAlbumPtr album = library().albumWithUUID("ALBUM");
    const KXManagedAssetPtr asset = library().assetWithUUID("A");
    const auto objects = library().managedObjectContext().registeredObjects();
    EXPECT_NE(std::find(objects.begin(), objects.end(), album), objects.end());
    EXPECT_NE(std::find(objects.begin(), objects.end(), asset), objects.end());
    for (const auto& object : objects) {
      library().managedObjectContext().refreshObject(object, object->hasChanges());
    }
    EXPECT_EQ(asset->uuid(), "A");
  });
}

TEST_P(PhotoLibraryContract, SettingWhatIsThereAlreadyIsNoChange) {
  addAsset("A", 5.0);
  addAlbum("ALBUM", {"A"});
  transaction([&] {
    const KXGenericAlbumPtr album = library().albumWithUUID("ALBUM");
    album->setTitle("ALBUM");
    album->setUuid("ALBUM");
    album->setKindValue(kKXAlbumKindSyncedAlbum);
    album->setPendingItemsCount(0);
    album->setPendingItemsType(kKXPendingItemsNone);
    album->asManagedAlbum()->sortAssetsUsingTesselAlbumOrder();
    EXPECT_FALSE(album->hasChanges());
    const KXManagedAssetPtr asset = library().assetWithUUID("A");
    asset->setSortToken(5.0);
    asset->setLocation(std::nullopt);
    EXPECT_FALSE(asset->hasChanges());
  });
}

TEST_P(PhotoLibraryContract, DeletingAnAssetTakesItOutOfItsAlbumsAndItsFacesAway) {
  AssetSeed seed;
  seed.uuid = "A";
  seed.faces = {{1, Rect{}, std::nullopt}};
  device_->addAsset(seed);
  addAsset("B");
  addAlbum("ALBUM", {"A", "B"});
  transaction([&] {
    const KXManagedAssetPtr asset = library().assetWithUUID("A");
    asset->deleteObject();
    EXPECT_TRUE(asset->isDeleted());
  });
  EXPECT_EQ(fetchedAssets(), (Texts{"B"}));
  read([&] { EXPECT_EQ(library().assetWithUUID("A"), nullptr); });
  transaction([&] { library().assetWithUUID("B")->deleteObject(); });
  read([&] {
    const auto empty =
        library().managedObjectContext().fetchEmptyAlbums({kKXAlbumKindSyncedAlbum}, nullptr);
    EXPECT_EQ(uuids(*empty), (Texts{"ALBUM"}));
  });
}

TEST_P(PhotoLibraryContract, DeletingAnAlbumTakesItOutOfItsListAndLeavesItsAssets) {
  addAsset("A");
  addAlbum("ONE", {"A"});
  addAlbum("TWO", {"A"});
  transaction([&] {
    library().albumWithUUID("ONE")->deleteObject();
    EXPECT_EQ(uuids(library().albumList()->albums()), (Texts{"TWO"}));
  });
  EXPECT_EQ(albumList(), (Texts{"TWO"}));
  EXPECT_EQ(albumsOf("A"), (Texts{"TWO"}));
}

TEST_P(PhotoLibraryContract, FacesAreAddedAndDeleted) {
  AssetSeed seed;
  seed.uuid = "A";
  seed.faces = {{1, Rect{0, 0, 1, 1}, std::nullopt}, {2, Rect{}, std::nullopt}};
  device_->addAsset(seed);
  transaction([&] {
    const KXManagedAssetPtr asset = library().assetWithUUID("A");
    asset->faces()[0]->deleteObject();
    EXPECT_EQ(asset->faces().size(), 1U);
    asset->addFace(Rect{0.5, 0.5, 0.25, 0.125}, 65535, "PERSON");
    EXPECT_EQ(asset->faces().size(), 2U);
  });
  library_ = nullptr;
  read([&] {
    const auto faces = library().assetWithUUID("A")->faces();
    ASSERT_EQ(faces.size(), 2U);
    EXPECT_EQ(faces[0]->identifier(), 2);
    EXPECT_EQ(faces[1]->identifier(), 65535);
    EXPECT_EQ(faces[1]->relativeRect(), (Rect{0.5, 0.5, 0.25, 0.125}));
    EXPECT_EQ(faces[1]->albumUUID(), "PERSON");
  });
}

TEST_P(PhotoLibraryContract, LocationsAreComparedExactly) {
  AssetSeed located;
  located.uuid = "A";
  located.location = Coordinate{48.137, 11.575};
  device_->addAsset(located);
  addAsset("B");
  read([&] {
    const KXManagedAssetPtr a = library().assetWithUUID("A");
    const KXManagedAssetPtr b = library().assetWithUUID("B");
    EXPECT_TRUE(a->isLocatedAtCoordinates(Coordinate{48.137, 11.575}));
    EXPECT_FALSE(a->isLocatedAtCoordinates(Coordinate{48.137, 11.5750001}));
    EXPECT_FALSE(a->isLocatedAtCoordinates(std::nullopt));
    EXPECT_TRUE(b->isLocatedAtCoordinates(std::nullopt));
    EXPECT_FALSE(b->isLocatedAtCoordinates(Coordinate{0, 0}));
  });
  transaction([&] {
    library().assetWithUUID("A")->setLocation(std::nullopt);
    library().assetWithUUID("B")->setLocation(Coordinate{-1.5, 2.25});
  });
  read([&] {
    EXPECT_TRUE(library().assetWithUUID("A")->isLocatedAtCoordinates(std::nullopt));
    EXPECT_TRUE(library().assetWithUUID("B")->isLocatedAtCoordinates(Coordinate{-1.5, 2.25}));
  });
}

TEST_P(PhotoLibraryContract, SortTokensAndDatesAreKeptBitForBit) {
  AssetSeed seed;
  seed.uuid = "A";
  seed.modificationDate = Date{138848000.12345678};
  device_->addAsset(seed);
  read([&] {
    const KXManagedAssetPtr asset = library().assetWithUUID("A");
    EXPECT_EQ(asset->sortToken(), std::nullopt);
    EXPECT_EQ(asset->modificationDate(), Date{138848000.12345678});
  });
  const double token = 138848000.0 + 1 / 100000.0;
  transaction([&] { library().assetWithUUID("A")->setSortToken(token); });
  library_ = nullptr;
  read([&] { EXPECT_EQ(library().assetWithUUID("A")->sortToken(), token); });
}

TEST_P(PhotoLibraryContract, PendingCountsAreReducedNotBelowZero) {
  transaction([&] {
    const KXGenericAlbumPtr progress = library().syncProgressAlbum();
    progress->setPendingItemsCount(2);
    progress->setPendingItemsType(kKXPendingItemsSync);
    progress->reducePendingItemsCountBy(1);
    EXPECT_EQ(progress->pendingItemsCount(), 1U);
    progress->reducePendingItemsCountBy(5);
  });
  read([&] {
    EXPECT_EQ(library().syncProgressAlbum()->pendingItemsCount(), 0U);
    EXPECT_EQ(library().syncProgressAlbum()->pendingItemsType(), kKXPendingItemsSync);
  });
}

TEST_P(PhotoLibraryContract, TheLibrarysOwnAlbumsAreThereAndInNoList) {
  read([&] {
    ASSERT_NE(library().shoeboxAlbum(), nullptr);
    ASSERT_NE(library().syncProgressAlbum(), nullptr);
    ASSERT_NE(library().otaRestoreProgressAlbum(), nullptr);
    EXPECT_EQ(library().shoeboxAlbum()->pendingItemsType(), kKXPendingItemsNone);
    EXPECT_EQ(library().shoeboxAlbum(), library().shoeboxAlbum());
  });
  EXPECT_EQ(albumList(), Texts{});
}

TEST_P(PhotoLibraryContract, EmptyAlbumsAreFoundByKind) {
  addAsset("A");
  addAlbum("FULL", {"A"});
  addAlbum("EMPTY");
  addAlbum("EMPTY EVENT", {}, kKXAlbumKindSyncedEvent);
  addAlbum("EMPTY FACES", {}, kKXAlbumKindSyncedFaceAlbum);
  read([&] {
    const auto albums = library().managedObjectContext().fetchEmptyAlbums(
        {kKXAlbumKindSyncedAlbum, kKXAlbumKindSyncedEvent}, nullptr);
    EXPECT_EQ(uuids(*albums), (Texts{"EMPTY", "EMPTY EVENT"}));
  });
}

TEST_P(PhotoLibraryContract, AlbumsOfKindsComeInRowOrder) {
  addAlbum("FACES", {}, kKXAlbumKindSyncedFaceAlbum);
  addAlbum("ALBUM");
  addAlbum("OWN", {}, 2);
  addAlbum("EVENT", {}, kKXAlbumKindSyncedEvent);
  read([&] {
    EXPECT_EQ(uuids(library().albumsOfKinds({1550, 1551, 15})), (Texts{"FACES", "ALBUM", "EVENT"}));
  });
}

TEST_P(PhotoLibraryContract, AListKeepsTheOrderThatItIsGiven) {
  for (const char* uuid : {"A", "B", "C"}) addAlbum(uuid);
  transaction([&] {
    const auto list = library().albumList();
    const std::vector<KXGenericAlbumPtr> albums(list->albums().begin(), list->albums().end());
    list->reorder({albums[2], albums[0], albums[1]});
    EXPECT_EQ(uuids(list->albums()), (Texts{"C", "A", "B"}));
  });
  library_ = nullptr;
  EXPECT_EQ(albumList(), (Texts{"C", "A", "B"}));
}

TEST_P(PhotoLibraryContract, AssetsAreSortedByIndexThenTokenThenUUID) {
  addAsset("LATE TOKEN", 9.0);
  addAsset("NO TOKEN B");
  addAsset("NO TOKEN A");
  addAsset("EARLY TOKEN", 1.0);
  addAsset("SECOND", 0.5);
  addAsset("FIRST");
  addAlbum("ALBUM", {"LATE TOKEN", "NO TOKEN B", "NO TOKEN A", "EARLY TOKEN", "SECOND", "FIRST"});
  writeAssetOrder("ALBUM", {"FIRST", "SECOND"});
  transaction([&] { managed("ALBUM")->sortAssetsUsingTesselAlbumOrder(); });
  EXPECT_EQ(device_->assetsOfAlbum("ALBUM"),
            (Texts{"FIRST", "SECOND", "EARLY TOKEN", "LATE TOKEN", "NO TOKEN A", "NO TOKEN B"}));
}

TEST_P(PhotoLibraryContract, AnAssetIsAddedWhereTheOrderFilePutsIt) {
  for (const char* uuid : {"A", "B", "C", "LOOSE"}) addAsset(uuid);
  addAlbum("ALBUM", {"A", "C", "LOOSE"});
  writeAssetOrder("ALBUM", {"A", "B", "C"});
  transaction([&] {
    const KXManagedAssetPtr b = library().assetWithUUID("B");
    managed("ALBUM")->addAssetUsingTesselAlbumOrder(b);
    managed("ALBUM")->addAssetUsingTesselAlbumOrder(b);
  });
  EXPECT_EQ(device_->assetsOfAlbum("ALBUM"), (Texts{"A", "B", "C", "LOOSE"}));
  EXPECT_EQ(albumsOf("B"), (Texts{"ALBUM"}));
}

TEST_P(PhotoLibraryContract, RemovingAnAssetThatIsNotInTheAlbumDoesNothing) {
  addAsset("A");
  addAsset("B");
  addAlbum("ALBUM", {"A"});
  transaction([&] {
    managed("ALBUM")->removeAsset(library().assetWithUUID("B"));
    EXPECT_FALSE(library().albumWithUUID("ALBUM")->hasChanges());
    managed("ALBUM")->removeAsset(library().assetWithUUID("A"));
  });
  EXPECT_EQ(albumsOf("A"), Texts{});
}

TEST_P(PhotoLibraryContract, IncompleteAssetsAreListedWithTheirMainFile) {
  AssetSeed seed;
  seed.uuid = "A";
  seed.savedAssetType = 0;
  seed.files = {"/var/mobile/Media/DCIM/100AB/1.JPG", "/var/mobile/Media/DCIM/100AB/1.MOV"};
  seed.incomplete = true;
  device_->addAsset(seed);
  addAsset("COMPLETE");
  read([&] {
    const auto paths = library().pathsForAllIncompleteAssets();
    ASSERT_EQ(paths.size(), 1U);
    EXPECT_EQ(paths[0].first, "A");
    EXPECT_EQ(paths[0].second, "/var/mobile/Media/DCIM/100AB/1.JPG");
    EXPECT_EQ(library().assetWithUUID("A")->filePathsWithoutThumbs(), seed.files);
  });
}

TEST_P(PhotoLibraryContract, AnUnmanagedContainerSaysSo) {
  AlbumSeed seed;
  seed.uuid = "GENERIC";
  seed.managed = false;
  device_->addAlbum(seed);
  read([&] {
    const KXGenericAlbumPtr album = library().albumWithUUID("GENERIC");
    ASSERT_NE(album, nullptr);
    EXPECT_EQ(album->asManagedAlbum(), nullptr);
  });
}

}  // namespace kx
