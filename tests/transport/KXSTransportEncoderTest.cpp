#include "transport/KXSTransportEncoder.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include "platform/foundation/Exceptions.h"
#include "records/KXSFolder.h"
#include "testing/InMemoryFileSystem.h"
#include "tests/support/PropertyLists.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

const char* const kPath = "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist";

KXSLibraryChangeSnapshotPtr snapshotOf(const std::vector<KXSItemPtr>& updates,
                                       std::string_view kind = "Cassock") {
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->setLibraryUUID("library");
  snapshot->setLibraryKind(kind);
  for (const KXSItemPtr& item : updates) snapshot->updates()->set(item->uuidValue(), item);
  return snapshot;
}

Value encode(const KXSLibraryChangeSnapshot& snapshot) {
  return KXSTransportEncoder::encoder()->encodeSnapshot(snapshot, nullptr);
}

KXSAssetPtr locatedAsset(std::string_view uuid) {
  const KXSAssetPtr asset = KXSAsset::assetWithUUID(uuid);
  asset->setLatitude(Value::real(1.5));
  asset->setLongitude(Value::real(-2.5));
  asset->setOriginalFileName("IMG.JPG");
  return asset;
}

TEST(KXSTransportEncoder, WritesTheFourKeysInOrder) {
  const auto snapshot = snapshotOf({KXSEvent::eventWithUUID("E"), locatedAsset("A")});
  snapshot->deletes()->set("D", KXSAlbum::albumWithUUID("D"));
  const Value root = encode(*snapshot);
  const DictionaryView view = root.dictionaryValue();
  ASSERT_EQ(view.size(), 4U);
  EXPECT_EQ(view.keyAt(0), "libraryUUID");
  EXPECT_EQ(view.keyAt(1), "libraryKind");
  EXPECT_EQ(view.keyAt(2), "updates");
  EXPECT_EQ(view.keyAt(3), "deletes");
  EXPECT_EQ(root["updates"], list({KXSEvent::eventWithUUID("E")->propertyList(),
                                   locatedAsset("A")->propertyList()}));
  EXPECT_EQ(root["deletes"], list({KXSAlbum::albumWithUUID("D")->propertyList()}));
}

TEST(KXSTransportEncoder, IndexedFormsAreNotWritten) {
  const auto snapshot = snapshotOf({});
  snapshot->setUpdates(nullptr);
  snapshot->setDeletes(nullptr);
  snapshot->setIsFolderSync(true);
  snapshot->orderedAlbums()->push_back(KXSAlbum::albumWithUUID("A"));
  snapshot->assetsByUUID()->set("B", KXSAsset::assetWithUUID("B"));
  EXPECT_EQ(encode(*snapshot), dict({{"libraryUUID", text("library")},
                                     {"libraryKind", text("Cassock")},
                                     {"updates", list({})},
                                     {"deletes", list({})}}));
}

TEST(KXSTransportEncoder, NullIdentifierOrKindRaises) {
  const auto snapshot = snapshotOf({});
  snapshot->setLibraryUUID(std::nullopt);
  EXPECT_THROW(encode(*snapshot), InternalInconsistency);
  snapshot->setLibraryUUID("library");
  snapshot->setLibraryKind(std::nullopt);
  EXPECT_THROW(encode(*snapshot), InternalInconsistency);
}

TEST(KXSTransportEncoder, AFolderRaises) {
  const auto updated = snapshotOf({KXSFolder::folderWithUUID("F")});
  try {
    encode(*updated);
    FAIL();
  } catch (const InternalInconsistency& e) {
    EXPECT_STREQ(e.what(), "Method not implemented on base class");
  }
  const auto deleted = snapshotOf({});
  deleted->deletes()->set("F", KXSFolder::folderWithUUID("F"));
  EXPECT_THROW(encode(*deleted), InternalInconsistency);
}

TEST(KXSTransportEncoder, EncodedUpdatesComeBackInTheIndexedForms) {
  const KXSAlbumPtr album = KXSAlbum::albumWithUUID("B");
  album->setName("Trip");
  album->setAssetUUIDs(texts({"A"}));
  const KXSEventPtr event = KXSEvent::eventWithUUID("E");
  event->setName("Day");
  const KXSAssetPtr asset = locatedAsset("A");
  for (const char* kind : {"Cassock", "Folder"}) {
    const auto written = snapshotOf({album, event, asset}, kind);
    written->deletes()->set("D", locatedAsset("D"));
    const auto read = KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(
        throughFile(encode(*written)), nullptr);
    EXPECT_EQ(read->updates(), nullptr);
    EXPECT_EQ(read->libraryUUID(), "library");
    EXPECT_EQ(read->libraryKind(), kind);
    EXPECT_EQ(read->isFolderSync(), std::string(kind) == "Folder");
    ASSERT_EQ(read->albumsAndEventsByUUID()->size(), 2U);
    EXPECT_TRUE(album->isEqualToAlbum(*read->albumsAndEventsByUUID()->find("B")));
    EXPECT_TRUE(event->isEqualToEvent(*read->albumsAndEventsByUUID()->find("E")));
    ASSERT_EQ(read->assetsByUUID()->size(), 1U);
    EXPECT_TRUE((*read->assetsByUUID()->find("A"))->isEquivalentTo(asset));
    EXPECT_EQ((*read->assetsByUUID()->find("A"))->propertyList(), asset->propertyList());
    EXPECT_EQ(read->deletes()->size(), 1U);
  }
}

TEST(KXSTransportEncoder, WritesABinaryFileThatComesBack) {
  InMemoryFileSystem files;
  ErrorPtr error;
  const auto snapshot = snapshotOf({locatedAsset("A")});
  EXPECT_TRUE(
      KXSTransportEncoder::encoder()->encodeSnapshotToFile(*snapshot, files, kPath, &error));
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(files.text(kPath)->substr(0, 8), "bplist00");
  const auto read = KXSTransportDecoder::decoder()->decodeSnapshotFromFile(files, kPath, &error);
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(read->assetsByUUID()->size(), 1U);
}

TEST(KXSTransportEncoder, ReplacesTheFile) {
  InMemoryFileSystem files;
  files.putText(kPath,
                "something much longer than the snapshot that is written over it, so that "
                "appending or leaving an end would be seen ......................");
  EXPECT_TRUE(
      KXSTransportEncoder::encoder()->encodeSnapshotToFile(*snapshotOf({}), files, kPath, nullptr));
  ErrorPtr error;
  KXSTransportDecoder::decoder()->decodeSnapshotFromFile(files, kPath, &error);
  EXPECT_EQ(error, nullptr);
}

TEST(KXSTransportEncoder, TextThatNoFileCanHoldIsAnError) {
  InMemoryFileSystem files;
  const auto snapshot = snapshotOf({});
  snapshot->setLibraryUUID("\xFF\xFE");
  ErrorPtr error;
  EXPECT_FALSE(
      KXSTransportEncoder::encoder()->encodeSnapshotToFile(*snapshot, files, kPath, &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(PropertyListError::kWrite));
  EXPECT_FALSE(files.fileExists(kPath));
}

// A random item of any kind, with any of its fields.
KXSItemPtr arbitraryItem(std::size_t index) {
  const auto maybeText = [] { return *rc::gen::element<std::string>("", "a", "Trip 10", "é日"); };
  const std::string uuid = "item" + std::to_string(index);
  const int kind = *rc::gen::inRange(0, 3);
  if (kind == 0) {
    const KXSAlbumPtr album = KXSAlbum::albumWithUUID(uuid);
    album->setName(maybeText());
    Array members;
    for (int i = *rc::gen::inRange(0, 5); i > 0; --i) members.push_back(text(maybeText()));
    album->setAssetUUIDs(list(std::move(members)));
    if (*rc::gen::arbitrary<bool>()) album->setAlbumSubclass(Value());
    return album;
  }
  if (kind == 1) {
    const KXSEventPtr event = KXSEvent::eventWithUUID(uuid);
    if (*rc::gen::arbitrary<bool>()) event->setName(std::nullopt);
    event->setKeyAssetUUID(maybeText());
    return event;
  }
  const KXSAssetPtr asset = KXSAsset::assetWithUUID(uuid);
  asset->setRating(Value::integer(*rc::gen::arbitrary<int>()));
  asset->setExposureDate(Value::real(*rc::gen::inRange(-1000000, 1000000) / 8.0));
  if (*rc::gen::arbitrary<bool>()) {
    asset->setLatitude(Value::real(*rc::gen::inRange(-90, 90) + 0.125));
    asset->setLongitude(Value::real(*rc::gen::inRange(-180, 180) + 0.375));
  }
  asset->setOriginalFileName(maybeText());
  asset->setIsVideo(*rc::gen::arbitrary<bool>());
  return asset;
}

RC_GTEST_PROP(SnapshotRoundTrip, EveryItemComesBackEqual, ()) {
  std::vector<KXSItemPtr> items;
  const int count = *rc::gen::inRange(0, 30);
  for (int i = 0; i < count; ++i) items.push_back(arbitraryItem(static_cast<std::size_t>(i)));
  const auto written = snapshotOf(items);
  const Value root = encode(*written);
  const auto fromFile =
      KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(throughFile(root), nullptr);
  const auto fromMemory =
      KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, nullptr);
  RC_ASSERT(fromFile->orderedAlbums()->size() + fromFile->assetsByUUID()->size() == items.size());
  bool everyAssetHasALocation = true;
  for (const KXSItemPtr& item : items) {
    if (const auto asset = std::dynamic_pointer_cast<KXSAsset>(item)) {
      const KXSAssetPtr* read = fromFile->assetsByUUID()->find(*item->uuid());
      RC_ASSERT(read != nullptr);
      RC_ASSERT((*read)->propertyList() == item->propertyList());
      RC_ASSERT((*read)->isEquivalentTo(asset) == asset->latitude().has_value());
      everyAssetHasALocation = everyAssetHasALocation && asset->latitude().has_value();
    } else {
      const KXSItemPtr* read = fromFile->albumsAndEventsByUUID()->find(*item->uuid());
      RC_ASSERT(read != nullptr);
      RC_ASSERT((*read)->propertyList() == item->propertyList());
    }
  }
  RC_ASSERT(fromFile->isEqualToSnapshot(fromMemory) == everyAssetHasALocation);
  RC_ASSERT(fromMemory->isEqualToSnapshot(fromFile) == everyAssetHasALocation);
}

}  // namespace
}  // namespace kx
