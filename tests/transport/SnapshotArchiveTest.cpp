#include <gtest/gtest.h>

#include "records/KXSFolder.h"
#include "tests/support/Archives.h"
#include "tests/support/PropertyLists.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

KXSLibraryChangeSnapshotPtr fullSnapshot() {
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->setLibraryUUID("L");
  snapshot->setLibraryKind("Folder");
  snapshot->setIsFolderSync(true);
  snapshot->updates()->set("B", KXSAlbum::albumWithUUID("B"));
  snapshot->updates()->set("A", KXSEvent::eventWithUUID("A"));
  snapshot->deletes()->set("F", KXSFolder::folderWithUUID("F"));
  snapshot->orderedAlbums()->push_back(*snapshot->updates()->find("B"));
  return snapshot;
}

TEST(SnapshotArchive, KeepsIdentityUpdatesAndDeletesAndLosesTheIndexedForms) {
  const auto back = throughArchive(fullSnapshot(), snapshotArchiveClasses());
  ASSERT_TRUE(back);
  EXPECT_EQ(back->libraryUUID(), "L");
  EXPECT_EQ(back->libraryKind(), "Folder");
  ASSERT_TRUE(back->updates());
  ASSERT_EQ(back->updates()->size(), 2U);
  EXPECT_EQ(back->updates()->begin()->key.stringValue(), "B");
  EXPECT_TRUE(KXSAlbum::albumWithUUID("B")->isEqualToAlbum(*back->updates()->find("B")));
  EXPECT_TRUE(KXSEvent::eventWithUUID("A")->isEqualToEvent(*back->updates()->find("A")));
  ASSERT_EQ(back->deletes()->size(), 1U);
  EXPECT_TRUE(std::dynamic_pointer_cast<KXSFolder>(*back->deletes()->find("F")));
  EXPECT_FALSE(back->isFolderSync());
  EXPECT_EQ(back->orderedAlbums(), nullptr);
  EXPECT_EQ(back->albumsAndEventsByUUID(), nullptr);
  EXPECT_EQ(back->assetsByUUID(), nullptr);
  EXPECT_TRUE(back->hasChangedObjects());
}

TEST(SnapshotArchive, HoldsItsFourKeys) {
  const Value object = archivedObjects(fullSnapshot()).arrayValue()[0];
  EXPECT_EQ(object["class"], text("KXSLibraryChangeSnapshot"));
  EXPECT_EQ(object["values"], dict({{"KXSLibraryChangeSnapshotLibraryUUIDKey", text("L")},
                                    {"KXSLibraryChangeSnapshotLibraryKindKey", text("Folder")}}));
  EXPECT_EQ(
      object["maps"],
      dict(
          {{"KXSLibrarySnapshotUpdatesKey",
            dict({{"keys", texts({"B", "A"})}, {"objects", list({Value::uid(1), Value::uid(2)})}})},
           {"KXSLibrarySnapshotDeletesKey",
            dict({{"keys", texts({"F"})}, {"objects", list({Value::uid(3)})}})}}));
}

TEST(SnapshotArchive, NullMapsStayNull) {
  const auto decoded = KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(
      dict({{"libraryUUID", text("L")}}), nullptr);
  const auto back = throughArchive(decoded, snapshotArchiveClasses());
  EXPECT_EQ(back->updates(), nullptr);
  EXPECT_TRUE(back->deletes()->empty());
  EXPECT_EQ(back->libraryUUID(), "L");
  EXPECT_EQ(back->libraryKind(), std::nullopt);
}

TEST(SnapshotArchive, AMapOfOtherObjectsIsRefused) {
  class Impostor final : public Archivable {
   public:
    std::string_view archiveClassName() const override { return "KXSLibraryChangeSnapshot"; }
    void encodeWithCoder(KeyedArchiver& coder) const override {
      ArchivableMap map;
      map.set("a", KXSAssetProperties::assetProperties());
      coder.encodeObjectMap("KXSLibrarySnapshotUpdatesKey", &map);
    }
  };
  ErrorPtr error;
  const auto bytes = archiveBytes(std::make_shared<Impostor>());
  EXPECT_EQ(KeyedUnarchiver::unarchivedObject(std::make_shared<const Data>(bytes),
                                              snapshotArchiveClasses(), &error),
            nullptr);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(PropertyListError::kArchiveShape));
}

}  // namespace
}  // namespace kx
