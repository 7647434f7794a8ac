#include <sys/stat.h>
#include <unistd.h>

#include <cmath>

#include "device/DeviceErrors.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

namespace fs = std::filesystem;
using Texts = std::vector<std::string>;

using QuarrydTest = DeviceTest;

TEST_F(QuarrydTest, ImportsAFileWithEverythingItsJobSays) {
  const std::string album = makeContainer("ALBUM", kKXAlbumKindSyncedAlbum, 3);
  const std::string event = makeContainer("EVENT", kKXAlbumKindSyncedEvent, 1);
  transaction([&] { library().syncProgressAlbum()->setPendingItemsCount(5); });
  const KXSyncSaveJobPtr job =
      importJob(kUUID1, kJpeg, {album, event, "kxlibrary://other/Album/p1"});
  job->setIsVideo(true);
  job->setLocation({48.25, -0.0});
  job->setCreationDate(Date{-0.0});
  job->setModificationDate(Date{0.1 + 0.2});
  job->setSortToken(1.0 / 3.0);
  job->setOriginalFileName("Käse\n.jpg");
  job->setFacesInfo(Value::array(
      {Value::dictionary({{"faceIndex", Value::integer(70000)},
                          {"faceAlbumUUID", Value::string("PERSON")},
                          {"faceRectangle", dictionaryFromRect(Rect{-0.0, 0.1, 0.2, 1e-300})}}),
       Value::dictionary({})}));
  const Result result = save({job});
  EXPECT_EQ(result.first, 1U);
  EXPECT_EQ(result.second, nullptr);
  const DeviceDump all = dump(true);
  ASSERT_EQ(all.assets.size(), 1U);
  const DeviceDump::Asset& asset = all.assets[0];
  EXPECT_EQ(asset.uuid, kUUID1);
  EXPECT_EQ(asset.savedAssetType, kKXSavedAssetTypeSynced);
  EXPECT_TRUE(asset.isVideo);
  EXPECT_FALSE(asset.incomplete);
  EXPECT_EQ(asset.path, std::string(device_paths::kSyncedAssets) + "/100SYNCA/" + kUUID1 + ".JPG");
  EXPECT_EQ(content(asset.path), kJpeg);
  EXPECT_EQ(asset.size, static_cast<std::int64_t>(kJpeg.size()));
  EXPECT_EQ(asset.sha256, "c12470f1946c8ab60eef41870d5a4bb5678228ebc8eb9d58de06b2c3536af40f");
  EXPECT_EQ(asset.modificationDate, Date{0.1 + 0.2});
  EXPECT_TRUE(std::signbit(asset.creationDate->secondsSinceReference));
  EXPECT_EQ(asset.sortToken, 1.0 / 3.0);
  ASSERT_TRUE(asset.location.has_value());
  EXPECT_EQ(asset.location->latitude, 48.25);
  EXPECT_TRUE(std::signbit(asset.location->longitude));
  EXPECT_EQ(asset.originalFileName, "Käse\n.jpg");
  ASSERT_EQ(asset.faces.size(), 2U);
  EXPECT_EQ(asset.faces[0].identifier, 0);
  EXPECT_EQ(asset.faces[0].relativeRect, Rect{});
  EXPECT_EQ(asset.faces[1].identifier, 70000 & 0xffff);
  EXPECT_EQ(asset.faces[1].albumUUID, "PERSON");
  EXPECT_TRUE(std::signbit(asset.faces[1].relativeRect.x));
  EXPECT_EQ(asset.faces[1].relativeRect.height, 1e-300);
  ASSERT_EQ(all.albums.size(), 1U);
  EXPECT_EQ(all.albums[0].assets, (Texts{kUUID1}));
  EXPECT_EQ(all.albums[0].pending.count, 2U);
  EXPECT_EQ(all.albums[0].pending.type, kKXPendingItemsSync);
  ASSERT_EQ(all.events.size(), 1U);
  EXPECT_EQ(all.events[0].assets, (Texts{kUUID1}));
  EXPECT_EQ(all.events[0].pending.count, 0U);
  EXPECT_EQ(all.syncProgress.count, 4U);
  EXPECT_EQ(device().takeChanges().importedAssets, (std::set<std::string>{kUUID1}));
  read([&] {
    const auto sizes = library().managedObjectContext().originalFileSizes({}, nullptr);
    EXPECT_EQ(sizes, std::vector<std::int64_t>{static_cast<std::int64_t>(kJpeg.size())});
  });
}

TEST_F(QuarrydTest, NullsStayNull) {
  const KXSyncSaveJobPtr job = platform().sharedAssetsSaver().newSyncSaveJob();
  putFile("/var/mobile/Media/Downloads/a", "anything");
  job->setOriginalAssetURL("/var/mobile/Media/Downloads/a");
  job->setUuid("no UUID/../at all");
  EXPECT_EQ(save({job}).first, 1U);
  const DeviceDump::Asset asset = dump().assets.at(0);
  EXPECT_EQ(asset.uuid, "no UUID/../at all");
  EXPECT_EQ(asset.originalFileName, std::nullopt);
  EXPECT_EQ(asset.sortToken, std::nullopt);
  EXPECT_EQ(asset.location, std::nullopt);
  EXPECT_EQ(asset.creationDate, std::nullopt);
  EXPECT_EQ(asset.modificationDate, std::nullopt);
  // A name of our own making: sixty-four digits of a hash, and no known content.
  const std::string folder = std::string(device_paths::kSyncedAssets) + "/100SYNCA/";
  ASSERT_TRUE(asset.path.starts_with(folder));
  EXPECT_EQ(asset.path.size(), folder.size() + 64 + 4);
  EXPECT_TRUE(asset.path.ends_with(".DAT"));
}

TEST_F(QuarrydTest, NamesNeverLeadOutOfTheSyncedAssetsDirectory) {
  std::vector<KXSyncSaveJobPtr> jobs;
  const Texts names = {"../../x",
                       "/etc/passwd",

                       "a\nb",
                       std::string(5000, 'u'),
                       "..",
                       ".",
                       "",
                       "a/b",
                       kUUID1 + "/..",
                       "aaaaaaaa-aaaa-4aaa-8aaa-aaaaaaaaaaaa"};
  for (const std::string& name : names) jobs.push_back(importJob(name, kJpeg));
  EXPECT_EQ(save(jobs).first, names.size());
  const Texts files = mediaFiles();
  EXPECT_EQ(files.size(), names.size());
  std::set<std::string> uuids;
  for (const DeviceDump::Asset& asset : dump().assets) {
    uuids.insert(asset.uuid);
    EXPECT_TRUE(std::binary_search(files.begin(), files.end(), asset.path)) << asset.path;
  }
  EXPECT_EQ(uuids, std::set<std::string>(names.begin(), names.end()));
}

TEST_F(QuarrydTest, ABadFileFailsItsOwnAssetAlone) {
  const KXSyncSaveJobPtr missing = importJob("MISSING", kJpeg);
  fs::remove(at(*missing->fields().originalAssetPath));
  const KXSyncSaveJobPtr empty = importJob("EMPTY", "");
  const KXSyncSaveJobPtr link = importJob("LINK", kJpeg);
  fs::remove(at(*link->fields().originalAssetPath));
  fs::create_symlink("/etc/passwd", at(*link->fields().originalAssetPath));
  const KXSyncSaveJobPtr second = importJob("HARDLINK", kJpeg);
  fs::create_hard_link(at(*second->fields().originalAssetPath), at("/var/mobile/Media/other"));
  const KXSyncSaveJobPtr fifo = importJob("FIFO", kJpeg);
  fs::remove(at(*fifo->fields().originalAssetPath));
  ASSERT_EQ(::mkfifo(at(*fifo->fields().originalAssetPath).c_str(), 0600), 0);
  const KXSyncSaveJobPtr directory = importJob("DIRECTORY", kJpeg);
  fs::remove(at(*directory->fields().originalAssetPath));
  fs::create_directory(at(*directory->fields().originalAssetPath));
  const KXSyncSaveJobPtr outside = importJob("OUTSIDE", kJpeg);
  outside->setOriginalAssetURL("/var/mobile/Media/../../../etc/passwd");
  const Result result = save({missing, empty, link, importJob(kUUID1, kJpeg), second, fifo,
                              directory, outside, importJob(kUUID2, kJpeg)});
  EXPECT_EQ(result.first, 2U);
  EXPECT_EQ(result.second, nullptr);
  for (const char* name :
       {"MISSING", "EMPTY", "LINK", "HARDLINK", "FIFO", "DIRECTORY", "OUTSIDE"}) {
    EXPECT_EQ(failureOf(name), DeviceError::kBadFile) << name;
  }
  EXPECT_EQ(device().health().importFailures().size(), 7U);
  EXPECT_EQ(dump().assets.size(), 2U);
}

TEST_F(QuarrydTest, AJobThatMakesNoSenseFailsAlone) {
  const KXSyncSaveJobPtr infinite = importJob("INFINITE", kJpeg);
  infinite->setSortToken(INFINITY);
  const auto garbage = std::make_shared<const Data>("garbage", 7);
  const Result result = saveData(
      {garbage, nullptr, importJob(kUUID1, kJpeg)->serializedData(), infinite->serializedData()});
  EXPECT_EQ(result.first, 1U);
  EXPECT_EQ(dump().assets.size(), 1U);
  ASSERT_NE(device().health().firstFailure(), nullptr);
  EXPECT_EQ(device().health().firstFailure()->code(),
            static_cast<std::int64_t>(DeviceError::kBadJob));
}

TEST_F(QuarrydTest, FacesOfWrongTypeFailTheirAsset) {
  const KXSyncSaveJobPtr face = importJob("FACE", kJpeg);
  face->setFacesInfo(Value::array({Value::string("no dictionary")}));
  const KXSyncSaveJobPtr index = importJob("INDEX", kJpeg);
  index->setFacesInfo(
      Value::array({Value::dictionary({{"faceIndex", Value::string("no number")}})}));
  EXPECT_EQ(save({face, index}).first, 0U);
  EXPECT_EQ(failureOf("FACE"), DeviceError::kBadJob);
  EXPECT_EQ(failureOf("INDEX"), DeviceError::kBadJob);
}

TEST_F(QuarrydTest, TheDevicesOwnAssetIsNeverTouched) {
  putFile("/var/mobile/Media/DCIM/100CAMRA/IMG_0001.JPG", "own");
  NewDeviceAsset own;
  own.uuid = kUUID1;
  own.path = "/var/mobile/Media/DCIM/100CAMRA/IMG_0001.JPG";
  ASSERT_TRUE(device().admin().addAsset(own, nullptr));
  const KXSyncSaveJobPtr thief = importJob(kUUID2, kJpeg);
  thief->setOriginalAssetURL(own.path);
  const KXSyncSaveJobPtr database = importJob(kUUID3, kJpeg);
  database->setOriginalAssetURL(device_paths::kDatabase);
  EXPECT_EQ(save({importJob(kUUID1, kJpeg), thief, database}).first, 0U);
  EXPECT_EQ(failureOf(kUUID1), DeviceError::kForeignAsset);
  EXPECT_EQ(failureOf(kUUID2), DeviceError::kBadFile);
  EXPECT_EQ(failureOf(kUUID3), DeviceError::kBadFile);
  EXPECT_EQ(content(own.path), "own");
  EXPECT_EQ(dump().assets.size(), 1U);
  EXPECT_EQ(dump().assets[0].savedAssetType, 0);
}

TEST_F(QuarrydTest, AnAlbumOfTheUsersIsNotFilled) {
  NewDeviceAlbum album;
  album.uuid = "MINE";
  album.kind = 2;
  album.pendingItemsCount = 9;
  ASSERT_TRUE(device().admin().addAlbum(album, nullptr));
  std::string uri;
  read([&] { uri = library().albumWithUUID("MINE")->objectID().URIRepresentation(); });
  EXPECT_EQ(save({importJob(kUUID1, kJpeg, {uri})}).first, 1U);
  EXPECT_TRUE(dump().albums.at(0).assets.empty());
  EXPECT_EQ(dump().albums.at(0).pending.count, 9U);
}

TEST_F(QuarrydTest, ReplacesAnAssetAndItsFile) {
  const std::string first = makeContainer("FIRST");
  const std::string second = makeContainer("SECOND");
  ASSERT_EQ(save({importJob(kUUID1, kJpeg, {first})}).first, 1U);
  KXManagedAssetPtr held;
  read([&] {
    held = library().assetWithUUID(kUUID1);
    EXPECT_EQ(held->albums().size(), 1U);
  });
  const KXSyncSaveJobPtr again = importJob(kUUID1, "\x89PNG\r\n\x1A\n...", {second});
  again->setSortToken(7.0);
  ASSERT_EQ(save({again}).first, 1U);
  const DeviceDump all = dump();
  ASSERT_EQ(all.assets.size(), 1U);
  EXPECT_EQ(mediaFiles(), (Texts{all.assets[0].path}));
  EXPECT_TRUE(all.assets[0].path.ends_with(".PNG"));
  EXPECT_TRUE(all.albums[0].assets.empty());
  EXPECT_EQ(all.albums[1].assets, (Texts{kUUID1}));
  // The open library sees the new row in the object it holds.
  read([&] {
    EXPECT_EQ(held->sortToken(), 7.0);
    ASSERT_EQ(held->albums().size(), 1U);
    EXPECT_EQ(held->albums()[0]->uuid(), "SECOND");
  });
}

TEST_F(QuarrydTest, TheSameAssetTwiceInAHandOverEndsAsTheSecond) {
  const KXSyncSaveJobPtr second = importJob(kUUID1, kJpeg + "second");
  EXPECT_EQ(save({importJob(kUUID1, kJpeg), second}).first, 2U);
  EXPECT_EQ(mediaFiles().size(), 1U);
  EXPECT_EQ(content(dump().assets.at(0).path), kJpeg + "second");
}

TEST_F(QuarrydTest, UnsavedChangesOutliveARefresh) {
  makeContainer("ALBUM", kKXAlbumKindSyncedAlbum, 3);
  KXGenericAlbumPtr album;
  std::string uri;
  read([&] {
    album = library().albumWithUUID("ALBUM");
    album->setTitle("unsaved");
    uri = album->objectID().URIRepresentation();
  });
  ASSERT_EQ(save({importJob(kUUID1, kJpeg, {uri})}).first, 1U);
  read([&] {
    EXPECT_EQ(album->title(), "unsaved");
    EXPECT_EQ(album->pendingItemsCount(), 2U);
    EXPECT_TRUE(album->hasChanges());
  });
}

TEST_F(QuarrydTest, FoldersRollOverAtTheirLimit) {
  close();
  DeviceOptions wanted = options();
  wanted.filesPerFolder = 3;
  open(wanted);
  std::vector<KXSyncSaveJobPtr> jobs;
  for (int i = 0; i < 7; ++i) jobs.push_back(importJob("A" + std::to_string(i), kJpeg));
  ASSERT_EQ(save(jobs).first, 7U);
  close();
  open(wanted);
  ASSERT_EQ(save({importJob("B", kJpeg), importJob("C", kJpeg), importJob("D", kJpeg)}).first, 3U);
  std::map<std::string, int> counts;
  for (const std::string& file : mediaFiles()) ++counts[file.substr(0, file.rfind('/'))];
  const std::string base = std::string(device_paths::kSyncedAssets) + "/";
  const std::map<std::string, int> expected = {{base + "100SYNCA", 3},
                                               {base + "101SYNCA", 3},
                                               {base + "102SYNCA", 3},
                                               {base + "103SYNCA", 1}};
  EXPECT_EQ(counts, expected);
}

TEST_F(QuarrydTest, ADeletedAssetsFileGoesAfterTheCommit) {
  ASSERT_EQ(save({importJob(kUUID1, kJpeg), importJob(kUUID2, kJpeg)}).first, 2U);
  transaction([&] { library().assetWithUUID(kUUID1)->deleteObject(); });
  device().drain();
  const DeviceDump all = dump();
  ASSERT_EQ(all.assets.size(), 1U);
  EXPECT_EQ(mediaFiles(), (Texts{all.assets[0].path}));
  // Its place is free again.
  ASSERT_EQ(save({importJob(kUUID1, kJpeg)}).first, 1U);
  EXPECT_EQ(mediaFiles().size(), 2U);
  EXPECT_EQ(mediaFiles()[0],
            std::string(device_paths::kSyncedAssets) + "/100SYNCA/" + kUUID1 + ".JPG");
}

TEST_F(QuarrydTest, CleanUpRemovesWhatOlderSyncsLeft) {
  const std::string staging = device_paths::kStaging;
  putFile(staging + "/old", "x");
  putFile(staging + "/deep/old", "x");
  EXPECT_EQ(save({cleanupJob(Date{-1e9})}).second, nullptr);
  EXPECT_TRUE(exists(staging + "/old"));
  const KXSyncSaveJobPtr failing = importJob("EMPTY", "");
  EXPECT_EQ(save({failing, cleanupJob(std::nullopt)}).second, nullptr);
  EXPECT_FALSE(exists(staging + "/old"));
  EXPECT_FALSE(exists(staging + "/deep"));
  // An earlier job of the hand-over names it.
  EXPECT_TRUE(exists(*failing->fields().originalAssetPath));
  EXPECT_EQ(save({cleanupJob(std::nullopt)}).second, nullptr);
  EXPECT_FALSE(exists(*failing->fields().originalAssetPath));
  fs::remove_all(at(staging));
  EXPECT_EQ(save({cleanupJob(std::nullopt)}).second, nullptr);
}

TEST_F(QuarrydTest, ARestoredAssetIsCompleteWhenAllItsFilesAreThere) {
  NewDeviceAsset asset;
  asset.uuid = "OWN";
  asset.path = "/var/mobile/Media/DCIM/100CAMRA/IMG_0001.JPG";
  asset.files = {asset.path, "/var/mobile/Media/DCIM/100CAMRA/IMG_0001.MOV"};
  asset.incomplete = true;
  ASSERT_TRUE(device().admin().addAsset(asset, nullptr));
  KXPorterClient& porter = platform().porterClient();
  porter.updateRestoredAssetWithUUID(std::nullopt, {});
  porter.updateRestoredAssetWithUUID("OWN", {});
  putFile(asset.files[0], "picture");
  porter.updateRestoredAssetWithUUID("OWN", {asset.files[0]});
  device().drain();
  EXPECT_TRUE(dump().assets.at(0).incomplete);
  putFile(asset.files[1], "film");
  porter.updateRestoredAssetWithUUID("OWN", asset.files);
  device().drain();
  EXPECT_FALSE(dump().assets.at(0).incomplete);
}

}  // namespace
}  // namespace kx
