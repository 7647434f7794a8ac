#include "device/Sqlite.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

// The last-synced snapshot is written on proof alone.
class SealTest : public DeviceTest {
 protected:
  bool sealed() const { return exists(device_paths::kLastSynced); }
  // Why the last seal job was left undone, as the library's log has it.
  std::string reason() const {
    std::string text;
    for (const CapturedMessage& message : logs_.libraryMessages()) {
      if (message.text.starts_with("the sync is not sealed")) text = message.text;
    }
    return text;
  }
};

TEST_F(SealTest, WritesACopyWhenEveryAssetIsThere) {
  putSnapshot({kUUID1, kUUID2});
  const Result result = save({importJob(kUUID1, kJpeg), importJob(kUUID2, kJpeg), sealJob()});
  EXPECT_EQ(result.first, 2U);
  EXPECT_EQ(result.second, nullptr);
  ASSERT_TRUE(sealed()) << reason();
  EXPECT_TRUE(exists(device_paths::kSnapshot));
  EXPECT_EQ(content(device_paths::kLastSynced), content(device_paths::kSnapshot));
  EXPECT_TRUE(dump().lastSynced);
}

TEST_F(SealTest, LeavesAnEqualCopyAlone) {
  putSnapshot({});
  save({sealJob()});
  ASSERT_TRUE(sealed());
  const auto written = std::filesystem::last_write_time(at(device_paths::kLastSynced));
  device().takeCounters();
  save({sealJob()});
  EXPECT_EQ(std::filesystem::last_write_time(at(device_paths::kLastSynced)), written);
  EXPECT_EQ(device().takeCounters().rowsWritten, 0U);
}

// The first commit after it is gone makes the device read what the next proof takes.
TEST_F(SealTest, AfterItIsGoneTheSnapshotInPlaceThenIsProved) {
  int albums = 0;
  const auto unseal = [&] {
    ASSERT_TRUE(platform().files().removeItem(device_paths::kLastSynced, nullptr));
    makeContainer("ALBUM-" + std::to_string(++albums));
    device().drain();
  };
  putSnapshot({kUUID1});
  save({importJob(kUUID1, kJpeg), sealJob()});
  ASSERT_TRUE(sealed()) << reason();
  unseal();
  save({sealJob()});
  EXPECT_EQ(content(device_paths::kLastSynced), content(device_paths::kSnapshot)) << reason();

  unseal();
  putSnapshot({kUUID1, kUUID2});
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find(kUUID2 + " is not in the library"), std::string::npos) << reason();

  putSnapshot({kUUID1});
  save({sealJob()});
  unseal();
  transaction([&] { library().assetWithUUID(kUUID1)->deleteObject(); });
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find(kUUID1 + " is not in the library"), std::string::npos) << reason();
}

// Rows that were read ahead prove as much as the table, as long as it is as it was.
TEST_F(SealTest, RowsThatWereReadAheadProve) {
  save({importJob(kUUID1, kJpeg), importJob(kUUID2, kJpeg)});
  device().readAhead();
  device().drain();
  read([&] { library().managedObjectContext().fetchAssets({}, nullptr); });
  putSnapshot({kUUID1, kUUID2, kUUID3});
  save({sealJob()});
  EXPECT_NE(reason().find(kUUID3 + " is not in the library"), std::string::npos) << reason();
  putSnapshot({kUUID1, kUUID2}, 7.0);
  save({sealJob()});
  EXPECT_NE(reason().find("another modification date"), std::string::npos) << reason();
  EXPECT_FALSE(sealed());
  putSnapshot({kUUID1, kUUID2});
  device().takeCounters();
  save({sealJob()});
  EXPECT_TRUE(sealed()) << reason();
  EXPECT_EQ(device().takeCounters().statements, 1U);

  ASSERT_TRUE(platform().files().removeItem(device_paths::kLastSynced, nullptr));
  transaction([&] { library().assetWithUUID(kUUID2)->deleteObject(); });
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find(kUUID2 + " is not in the library"), std::string::npos) << reason();
}

// Of the other rows nothing is read again.
TEST_F(SealTest, RowsThatHaveChangedSinceAreReadFromTheTable) {
  std::vector<KXSyncSaveJobPtr> jobs;
  std::vector<std::string> uuids;
  for (int i = 0; i < 20; ++i) {
    uuids.push_back(std::string("00000000-0000-0000-0000-0000000000") + std::to_string(10 + i));
    jobs.push_back(importJob(uuids.back(), kJpeg));
  }
  save(jobs);
  device().readAhead();
  device().drain();
  read([&] { library().managedObjectContext().fetchAssets({}, nullptr); });

  const auto edit = [&](double modified) {
    DeviceAssetFields fields;
    fields.modificationDate = Date{modified};
    EXPECT_TRUE(device().admin().setAssetFields(library(), uuids[1], fields));
  };

  // One is new, another one is gone, and one is another now.
  save({importJob(kUUID1, kJpeg)});
  transaction([&] {
    library().assetWithUUID(uuids[0])->deleteObject();
    edit(7.0);
  });
  uuids[0] = kUUID1;
  putSnapshot(uuids);
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find(uuids[1] + " has another modification date"), std::string::npos)
      << reason();

  transaction([&] { edit(100.0); });
  device().takeCounters();
  save({sealJob()});
  EXPECT_TRUE(sealed()) << reason();
  EXPECT_EQ(device().takeCounters().statements, 4U);  // is it as it was, and three rows
}

TEST_F(SealTest, WhatAnotherProgramHasWrittenIsSeen) {
  putSnapshot({kUUID1});
  save({importJob(kUUID1, kJpeg)});
  device().readAhead();
  device().drain();
  read([&] { library().managedObjectContext().fetchAssets({}, nullptr); });
  {
    SqliteDatabase other(at(device_paths::kDatabase), SqliteDatabase::Access::kReadWrite);
    other.execute("UPDATE assets SET incomplete = 1");
  }
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find("is incomplete"), std::string::npos) << reason();
}

TEST_F(SealTest, IsWithheldForAMissingAsset) {
  putSnapshot({kUUID1, kUUID2});
  save({importJob(kUUID1, kJpeg), sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find(kUUID2 + " is not in the library"), std::string::npos) << reason();
}

TEST_F(SealTest, IsWithheldForAnotherModificationDate) {
  putSnapshot({kUUID1}, 100.5);
  save({importJob(kUUID1, kJpeg), sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find("another modification date"), std::string::npos) << reason();
}

// Assets whose fields do not stand as those of the item before.
TEST_F(SealTest, ReadsItemsOfAnyShape) {
  const auto item = [](const std::string& uuid, double modified) {
    return Dictionary{{"itemType", Value::string("Asset")},
                      {"modificationDate", Value::real(3061152000.0 + modified)},
                      {"uuid", Value::string(uuid)}};
  };
  const auto put = [&](Array updates) {
    const Value root = Value::dictionary({{"updates", Value::array(std::move(updates))}});
    const auto bytes = writePropertyList(root, PropertyListFormat::kBinary, nullptr);
    ASSERT_TRUE(platform().files().writeFileAtomically(device_paths::kSnapshot, bytes, nullptr));
  };
  save({importJob(kUUID1, kJpeg), importJob(kUUID2, kJpeg)});
  Dictionary album{{"uuid", Value::string(kUUID3)}, {"itemType", Value::string("Album")}};
  Dictionary nameless{{"itemType", Value::string("Asset")}};
  Dictionary dateless{{"uuid", Value::string(kUUID2)}, {"itemType", Value::string("Asset")}};
  const Value first = Value::dictionary(item(kUUID1, 100));
  const Value second = Value::dictionary(item(kUUID2, 100));
  put({first, Value::dictionary(album), second, Value::dictionary(dateless)});
  save({sealJob()});
  EXPECT_NE(reason().find(kUUID2 + " has another modification date"), std::string::npos);
  put({first, second, Value::dictionary(item(kUUID1, 7))});
  save({sealJob()});
  EXPECT_NE(reason().find(kUUID1 + " has another modification date"), std::string::npos);
  EXPECT_FALSE(sealed());
  Dictionary wrong = item(kUUID2, 100);
  wrong.set("uuid", Value::integer(1));
  put({first, Value::dictionary(wrong)});
  save({sealJob()});
  EXPECT_FALSE(sealed());
  // The last of several with one identifier counts.
  put({Value::dictionary(item(kUUID1, 7)), Value::dictionary(dateless), first, second,
       Value::dictionary(nameless), Value::dictionary(album)});
  save({sealJob()});
  EXPECT_TRUE(sealed()) << reason();
}

TEST_F(SealTest, IsWithheldForAnIncompleteAsset) {
  putSnapshot({kUUID1});
  save({importJob(kUUID1, kJpeg)});
  transaction([&] {
    DeviceAssetFields fields;
    fields.incomplete = true;
    EXPECT_TRUE(device().admin().setAssetFields(library(), kUUID1, fields));
  });
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find("is incomplete"), std::string::npos) << reason();
}

TEST_F(SealTest, IsWithheldForAnAssetOfTheDevicesOwn) {
  putSnapshot({kUUID1});
  NewDeviceAsset own;
  own.uuid = kUUID1;
  own.path = "/var/mobile/Media/DCIM/1";
  own.modificationDate = Date{100.0};
  ASSERT_TRUE(device().admin().addAsset(own, nullptr));
  save({sealJob()});
  EXPECT_FALSE(sealed());
}

TEST_F(SealTest, IsWithheldWhenSomethingHasFailed) {
  putSnapshot({kUUID1});
  save({importJob(kUUID1, kJpeg), importJob("EMPTY", ""), sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find("something failed"), std::string::npos) << reason();
  device().health().reset();
  save({sealJob()});
  EXPECT_TRUE(sealed());
}

TEST_F(SealTest, IsWithheldAfterATransactionThatFailed) {
  putSnapshot({});
  transaction([] { throw std::runtime_error("no"); });
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_TRUE(device().health().anyFailure());
}

TEST_F(SealTest, IsWithheldWithoutASnapshotThatMakesSense) {
  save({sealJob()});
  EXPECT_FALSE(sealed());
  EXPECT_NE(reason().find("cannot read"), std::string::npos) << reason();
  putFile(device_paths::kSnapshot, "no property list");
  save({sealJob()});
  EXPECT_FALSE(sealed());
}

TEST_F(SealTest, GoesWhenASyncedFileIsLost) {
  putSnapshot({kUUID1, kUUID2});
  save({importJob(kUUID1, kJpeg), importJob(kUUID2, kJpeg), sealJob()});
  ASSERT_TRUE(sealed());
  reopen();
  EXPECT_TRUE(sealed());
  const std::string lost = dump().assets.at(0).path;
  close();
  std::filesystem::remove(at(lost));
  open();
  EXPECT_FALSE(sealed());
  ASSERT_EQ(dump().assets.size(), 1U);
  EXPECT_EQ(dump().assets[0].uuid, kUUID2);
}

TEST_F(SealTest, GoesWithTheDatabase) {
  putSnapshot({});
  save({sealJob()});
  close();
  std::filesystem::remove(at(device_paths::kDatabase));
  open();
  EXPECT_FALSE(sealed());
}

}  // namespace
}  // namespace kx
