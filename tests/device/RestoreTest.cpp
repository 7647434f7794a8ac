#include "device/RestoreMarker.h"
#include "tests/device/CameraFiles.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

using Texts = std::vector<std::string>;

constexpr const char* kFolder = "/var/mobile/Media/DCIM/100CAMRA/";

// What the asset daemon does for a restore.
class RestoreTest : public DeviceTest {
 protected:
  static std::string camera(const std::string& name) { return kFolder + name; }

  void addIncomplete(const std::string& uuid, const std::string& name) {
    NewDeviceAsset asset;
    asset.uuid = uuid;
    asset.path = camera(name);
    asset.incomplete = true;
    ASSERT_TRUE(device().admin().addAsset(asset, nullptr));
  }
  void mark(std::vector<RestoredAlbum> albums = {}) {
    ASSERT_EQ(writeRestoreMarker(device().root(), {"BACKUP", std::move(albums)}), 0);
    putFile(device_paths::kRestoreContext, "context");
  }
  static RestoredAlbum album(const std::string& uuid, std::size_t position, Texts names) {
    RestoredAlbum album;
    album.uuid = uuid;
    album.title = "Title of " + uuid;
    album.kind = 2;
    album.position = position;
    for (const std::string& name : names) album.members.push_back(camera(name));
    return album;
  }
  void finalize(bool recreateAlbums) {
    platform().porterClient().finalizeOTARestoreRecreatingAlbums(recreateAlbums);
    device().drain();
  }
  // "Title[file file]" of each album of the list, in order.
  Texts albums() {
    const DeviceDump all = dump();
    Texts texts;
    for (const DeviceDump::Container& album : all.albums) {
      std::string text = album.title.value_or("(null)") + "[";
      for (const std::string& member : album.assets) {
        for (const DeviceDump::Asset& asset : all.assets) {
          if (asset.uuid != member) continue;
          text += (text.back() == '[' ? "" : " ") + asset.path.substr(asset.path.rfind('/') + 1);
        }
      }
      texts.push_back(text + "]");
    }
    return texts;
  }
  bool isUnderWay() const {
    return exists(device_paths::kRestoreMarker) || exists(device_paths::kRestoreContext);
  }
};

TEST_F(RestoreTest, WithoutAMarkerNothingIsFinalized) {
  addIncomplete("OWN", "IMG_0001.JPG");
  putFile(camera("IMG_0001.JPG"), kJpeg);
  putFile(camera("IMG_0002.JPG"), kJpeg);
  putFile(device_paths::kRestoreContext, "context");
  for (const bool recreate : {true, false}) {
    finalize(recreate);
    ASSERT_EQ(dump().assets.size(), 1U);
    EXPECT_TRUE(dump().assets[0].incomplete);
    EXPECT_TRUE(exists(device_paths::kRestoreContext));
  }
}

TEST_F(RestoreTest, WithTheDatabaseAssetsAreCompletedAndNothingElse) {
  addIncomplete("THERE", "IMG_0001.JPG");
  addIncomplete("MISSING", "IMG_0003.JPG");
  putFile(camera("IMG_0001.JPG"), kJpeg);
  putFile(camera("IMG_0002.JPG"), kJpeg);
  mark({album("AL", 0, {"IMG_0001.JPG"})});
  finalize(false);
  const DeviceDump all = dump();
  ASSERT_EQ(all.assets.size(), 2U);
  EXPECT_FALSE(all.assets[0].incomplete);
  EXPECT_TRUE(all.assets[1].incomplete);
  EXPECT_TRUE(all.albums.empty());
  EXPECT_FALSE(isUnderWay());
}

TEST_F(RestoreTest, WithoutTheDatabaseCameraFilesAndAlbumsAreTakenIn) {
  putFile(camera("IMG_0001.JPG"),
          cameraJpeg(cameraTiff({"2020:01:02 03:04:05", "", 48.5, 11.25}, true)));
  putFile(camera("IMG_0001.MOV"), cameraFilm(3660771845U, "+10.0000+020.0000/"));
  putFile(camera("IMG_0002.MOV"), cameraFilm(3660771845U, "+10.0000+020.0000/"));
  putFile(camera("IMG_0003.JPG"), "junk");
  mark({album("SECOND", 5, {"IMG_0003.JPG", "IMG_0001.JPG"}), album("FIRST", 1, {"IMG_0002.MOV"}),
        album("THIRD", 9, {"IMG_0099.JPG", "IMG_0002.MOV"})});
  device().takeChanges();
  finalize(true);
  const DeviceDump all = dump();
  ASSERT_EQ(all.assets.size(), 3U);
  const DeviceDump::Asset& both = all.assets[0];
  EXPECT_EQ(both.path, camera("IMG_0001.JPG"));
  EXPECT_EQ(both.creationDate->secondsSinceReference, 599627045.0);
  EXPECT_EQ(both.location, (Coordinate{48.5, 11.25}));
  EXPECT_EQ(both.originalFileName, "IMG_0001.JPG");
  EXPECT_EQ(both.savedAssetType, 0);
  EXPECT_FALSE(both.isVideo);
  EXPECT_FALSE(both.incomplete);
  read([&] {
    EXPECT_EQ(library().assetWithUUID(both.uuid)->filePathsWithoutThumbs(),
              (Texts{camera("IMG_0001.JPG"), camera("IMG_0001.MOV")}));
  });
  EXPECT_TRUE(all.assets[1].isVideo);
  EXPECT_EQ(all.assets[1].location, (Coordinate{10.0, 20.0}));
  EXPECT_EQ(all.assets[2].path, camera("IMG_0003.JPG"));
  EXPECT_EQ(albums(),
            (Texts{"Title of FIRST[IMG_0002.MOV]", "Title of SECOND[IMG_0003.JPG IMG_0001.JPG]",
                   "Title of THIRD[IMG_0002.MOV]"}));
  const LibraryChanges changes = device().takeChanges();
  EXPECT_EQ(changes.importedAssets.size(), 3U);
  EXPECT_EQ(changes.createdContainers.size(), 3U);
  EXPECT_FALSE(isUnderWay());
}

TEST_F(RestoreTest, WhatIsThereStaysAndASecondTimeAddsNothing) {
  NewDeviceAsset own;
  own.uuid = "OWN";
  own.path = camera("IMG_0001.JPG");
  putFile(own.path, kJpeg);
  ASSERT_TRUE(device().admin().addAsset(own, nullptr));
  NewDeviceAlbum present;
  present.uuid = "AL";
  present.title = "Renamed";
  ASSERT_TRUE(device().admin().addAlbum(present, nullptr));
  putFile(camera("IMG_0002.JPG"), kJpeg);
  const std::vector<RestoredAlbum> restored = {album("AL", 0, {"IMG_0001.JPG"}),
                                               album("NEW", 1, {"IMG_0001.JPG"})};
  for (int round = 0; round < 2; ++round) {
    mark(restored);
    finalize(true);
    EXPECT_EQ(dump().assets.size(), 2U);
    EXPECT_EQ(dump().assets[0].uuid, "OWN");
    EXPECT_EQ(albums(), (Texts{"Renamed[]", "Title of NEW[IMG_0001.JPG]"}));
  }
  device().takeCounters();
  mark(restored);
  finalize(true);
  EXPECT_EQ(device().takeCounters().rowsWritten, 0U);
}

TEST_F(RestoreTest, AlbumsOfASyncAndTwinsWithoutIdentifierAreNotMade) {
  RestoredAlbum synced = album("SYNCED", 0, {});
  synced.kind = kKXAlbumKindSyncedAlbum;
  RestoredAlbum nameless = album("", 0, {});
  nameless.uuid = std::nullopt;
  for (int round = 0; round < 2; ++round) {
    mark({synced, nameless});
    finalize(true);
    EXPECT_EQ(albums(), (Texts{"Title of []"}));
  }
}

TEST_F(RestoreTest, AMarkerThatMakesNoSenseStillMarks) {
  for (const char* text : {"", "junk"}) {
    addIncomplete(std::string("OWN") + text, "IMG_0001.JPG");
    putFile(camera("IMG_0001.JPG"), kJpeg);
    putFile(device_paths::kRestoreMarker, text);
    finalize(true);
    EXPECT_FALSE(dump().assets.back().incomplete);
    EXPECT_FALSE(isUnderWay());
  }
}

TEST_F(RestoreTest, TheMarkerKeepsWhatItIsGiven) {
  EXPECT_FALSE(readRestoreMarker(device().root()).has_value());
  RestoredAlbum plain = album("A", 3, {"IMG_0001.JPG", "IMG_0002.JPG"});
  plain.list = ListId::kEvents;
  RestoredAlbum bare;
  bare.kind = 7;
  mark({plain, bare});
  const auto marker = readRestoreMarker(device().root());
  ASSERT_TRUE(marker.has_value());
  EXPECT_EQ(marker->identity, "BACKUP");
  EXPECT_EQ(marker->albums, (std::vector<RestoredAlbum>{bare, plain}));  // by position
}

TEST_F(RestoreTest, AnAssetWhoseFileHasAnotherSizeStaysIncomplete) {
  putFile(camera("IMG_0001.JPG"), kJpeg);
  addIncomplete("OWN", "IMG_0001.JPG");  // notes the size
  putFile(camera("IMG_0001.JPG"), kJpeg + "longer");
  KXPorterClient& porter = platform().porterClient();
  porter.updateRestoredAssetWithUUID("OWN", {camera("IMG_0001.JPG")});
  device().drain();
  EXPECT_TRUE(dump().assets[0].incomplete);
  putFile(camera("IMG_0001.JPG"), kJpeg);
  porter.updateRestoredAssetWithUUID("UNKNOWN", {camera("IMG_0001.JPG")});
  porter.updateRestoredAssetWithUUID("OWN", {camera("IMG_0001.JPG")});
  device().drain();
  EXPECT_FALSE(dump().assets[0].incomplete);
}

TEST_F(RestoreTest, OneTransactionCompletesWhatWasToldOfTogether) {
  for (int i = 0; i < 50; ++i) {
    const std::string name = "IMG_" + std::to_string(1000 + i) + ".JPG";
    putFile(camera(name), kJpeg);
    addIncomplete("OWN" + std::to_string(i), name);
  }
  device().takeCounters();
  mark();
  finalize(false);
  for (const DeviceDump::Asset& asset : dump().assets) EXPECT_FALSE(asset.incomplete);
  EXPECT_EQ(device().takeCounters().rowsWritten, 50U);
}

TEST_F(RestoreTest, TheBackupManagerAnswersTheFilesOfTheRestoreUnderWay) {
  const auto answer = [&] {
    Texts paths;
    ErrorPtr error;
    const auto files =
        platform().newBackupManager()->restoreFilesForDomain(kQBShoeboxDomain, &error);
    EXPECT_EQ(error, nullptr);
    EXPECT_TRUE(files.has_value());
    for (const QBFile& file : files.value_or(std::vector<QBFile>{})) paths.push_back(file.path);
    return paths;
  };
  EXPECT_EQ(answer(), Texts{});
  device().setRestoreFiles(std::vector<QBFile>{{"/a"}, {"/b"}});
  EXPECT_EQ(answer(), (Texts{"/a", "/b"}));
  device().setRestoreFiles(std::nullopt);
  EXPECT_EQ(answer(), Texts{});
}

TEST_F(RestoreTest, NoSyncIsSealedWhileARestoreRuns) {
  putSnapshot({});
  device().setRestoreFiles(std::vector<QBFile>{});
  save({sealJob()});
  EXPECT_FALSE(exists(device_paths::kLastSynced));
  device().setRestoreFiles(std::nullopt);
  save({sealJob()});
  EXPECT_TRUE(exists(device_paths::kLastSynced));
}

TEST_F(RestoreTest, AFullLibraryKeepsTheRestoreUnderWay) {
  putFile(camera("IMG_0001.JPG"), kJpeg);
  mark({album("AL", 0, {"IMG_0001.JPG"})});
  close();
  // A database that cannot be written: its journal's place is taken by a directory.
  open();
  std::filesystem::create_directory(at(device_paths::kDatabase) + "-journal");
  finalize(true);
  EXPECT_TRUE(device().health().anyFailure());
  EXPECT_TRUE(exists(device_paths::kRestoreMarker));
  close();
  std::filesystem::remove(at(device_paths::kDatabase) + "-journal");
  open();
  finalize(true);
  EXPECT_EQ(albums(), (Texts{"Title of AL[IMG_0001.JPG]"}));
  EXPECT_FALSE(isUnderWay());
}

}  // namespace
}  // namespace kx
