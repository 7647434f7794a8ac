#include <map>
#include <random>
#include <set>

#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

// What a sync reads ahead is never but a quicker way to what the library holds.
class ReadAheadTest : public DeviceTest {
 protected:
  struct Seen {
    std::optional<double> sortToken;
    std::vector<std::uint16_t> faces;
    std::set<std::string> albums;
    bool operator==(const Seen&) const = default;
  };
  using Library = std::map<std::string, Seen>;

  void makeAssets(int count) {
    std::vector<KXSyncSaveJobPtr> jobs;
    for (int i = 0; i < count; ++i) jobs.push_back(importJob(name(i), kJpeg));
    save(jobs);
  }
  static std::string name(int number) { return "ASSET-" + std::to_string(number); }

  static AssetFetchRequest everything() {
    AssetFetchRequest request;
    request.prefetchFaces = true;
    request.prefetchAlbums = true;
    return request;
  }
  std::vector<KXManagedAssetPtr> fetch() {
    return *library().managedObjectContext().fetchAssets(everything(), nullptr);
  }
  // As a library object shows it.
  Library shown() {
    Library all;
    read([&] {
      for (const KXManagedAssetPtr& asset : fetch()) {
        Seen& seen = all[std::string(*asset->uuid())];
        seen.sortToken = asset->sortToken();
        for (const KXManagedFacePtr& face : asset->faces()) {
          seen.faces.push_back(face->identifier());
        }
        for (const KXGenericAlbumPtr& album : asset->albums()) {
          seen.albums.insert(std::string(*album->uuid()));
        }
      }
    });
    return all;
  }
  // As the rows have it.
  Library held() {
    Library all;
    const DeviceDump content = dump();
    for (const DeviceDump::Asset& asset : content.assets) {
      Seen& seen = all[asset.uuid];
      seen.sortToken = asset.sortToken;
      for (const DeviceDump::Face& face : asset.faces) seen.faces.push_back(face.identifier);
    }
    for (const auto* list : {&content.albums, &content.events, &content.faceAlbums}) {
      for (const DeviceDump::Container& album : *list) {
        for (const std::string& member : album.assets) all[member].albums.insert(album.uuid);
      }
    }
    return all;
  }
  void readAhead() {
    device().readAhead();
    device().drain();
  }
};

TEST_F(ReadAheadTest, AFetchFindsAllAtHand) {
  makeAssets(20);
  const std::string uri = makeContainer("ALBUM");
  transaction([&] {
    const KXManagedAssetPtr asset = library().assetWithUUID(name(3));
    asset->addFace(Rect{0.1, 0.2, 0.3, 0.4}, 7, std::nullopt);
    library().albumWithUUID("ALBUM")->asManagedAlbum()->addAssetUsingTesselAlbumOrder(asset);
  });
  library_.reset();
  readAhead();
  read([&] {
    device().takeCounters();
    const std::vector<KXManagedAssetPtr> assets = fetch();
    ASSERT_EQ(assets.size(), 20U);
    EXPECT_EQ(*assets[3]->uuid(), name(3));
    EXPECT_EQ(assets[3]->faces().size(), 1U);
    EXPECT_EQ(assets[3]->albums().size(), 1U);
    EXPECT_EQ(device().takeCounters().statements, 0U);
  });
  EXPECT_EQ(shown(), held());
}

// The library's connection reads the asset rows alone: version, assets, albums.
TEST_F(ReadAheadTest, RelationsAreReadBesideTheAssets) {
  makeAssets(3);
  library_.reset();
  device().drain();
  device().takeCounters();
  readAhead();
  EXPECT_EQ(device().takeCounters().statements, 3U);
}

// What a plan has done is nowhere but in its own connection.
TEST_F(ReadAheadTest, RelationsThatArePlannedAreSeen) {
  makeAssets(3);
  makeContainer("ALBUM");
  close();
  DeviceOptions plan = options();
  plan.planOnly = true;
  open(plan);
  transaction([&] {
    const KXManagedAssetPtr asset = library().assetWithUUID(name(1));
    asset->addFace(Rect{0.1, 0.2, 0.3, 0.4}, 7, std::nullopt);
    library().albumWithUUID("ALBUM")->asManagedAlbum()->addAssetUsingTesselAlbumOrder(asset);
  });
  library_.reset();
  device().drain();
  readAhead();
  const Library all = shown();
  EXPECT_EQ(all.size(), 3U);
  EXPECT_EQ(all.at(name(1)).faces, std::vector<std::uint16_t>{7});
  EXPECT_EQ(all.at(name(1)).albums, std::set<std::string>{"ALBUM"});
}

TEST_F(ReadAheadTest, WhatIsImportedMeanwhileIsSeen) {
  makeAssets(2);
  readAhead();
  save({importJob(kUUID1, kJpeg)});
  EXPECT_EQ(shown().size(), 3U);
}

TEST_F(ReadAheadTest, ALibraryObjectTakesOverWhatTheOneBeforeHasRead) {
  makeAssets(2);
  readAhead();
  read([&] { fetch(); });
  library_.reset();
  device().drain();
  read([&] {
    device().takeCounters();
    EXPECT_EQ(fetch().size(), 2U);
    EXPECT_EQ(device().takeCounters().statements, 0U);
  });
}

TEST_F(ReadAheadTest, NothingUnsavedIsTakenOver) {
  makeAssets(1);
  readAhead();
  read([&] { fetch().front()->setSortToken(5.0); });
  library_.reset();
  device().drain();
  EXPECT_EQ(shown(), held());
  EXPECT_EQ(shown().at(name(0)).sortToken, std::nullopt);
}

TEST_F(ReadAheadTest, WhenItIsOverObjectsEndWithTheirLibrary) {
  makeAssets(1);
  readAhead();
  KXManagedAssetPtr kept;
  read([&] { kept = fetch().front(); });
  device().stopReadingAhead();
  library_.reset();
  device().drain();
  read([&] {
    EXPECT_EQ(kept->uuid(), std::nullopt);
    EXPECT_EQ(fetch().size(), 1U);
  });
}

TEST_F(ReadAheadTest, RandomHistoriesShowWhatTheRowsHold) {
  const auto seed = std::random_device()();
  RecordProperty("seed", std::to_string(seed));
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const auto below = [&](int count) {
    return static_cast<int>(random() % static_cast<unsigned>(count));
  };
  constexpr int kAssets = 12, kAlbums = 3, kSteps = 300;
  const auto album = [](int number) { return "ALBUM-" + std::to_string(number); };
  for (int step = 0; step < kSteps; ++step) {
    const std::string asset = name(below(kAssets));
    const std::string container = album(below(kAlbums));
    const int kind = below(9);
    if (kind == 0) save({importJob(asset, kJpeg)});
    if (kind == 1) device().readAhead();
    if (kind == 2 && below(3) == 0) device().stopReadingAhead();
    if (kind == 3) library_.reset();
    if (kind == 4 && held().contains(asset)) makeContainer(container + "-" + std::to_string(step));
    if (kind >= 5) {
      transaction([&] {
        const KXManagedAssetPtr found = library().assetWithUUID(asset);
        const auto albums = library().albumsOfKinds({kKXAlbumKindSyncedAlbum});
        const KXGenericAlbumPtr any =
            albums.empty() ? nullptr
                           : albums[static_cast<std::size_t>(below(kAlbums)) % albums.size()];
        if (kind == 5 && any && below(3) == 0) any->deleteObject();
        if (!found) return;
        if (kind == 6) found->setSortToken(step);
        if (kind == 6) found->addFace(Rect{}, static_cast<std::uint16_t>(step), std::nullopt);
        if (kind == 7 && any) any->asManagedAlbum()->addAssetUsingTesselAlbumOrder(found);
        if (kind == 8 && below(2) == 0) found->deleteObject();
      });
    }
    ASSERT_EQ(shown(), held()) << "step " << step << " kind " << kind;
  }
}

}  // namespace
}  // namespace kx
