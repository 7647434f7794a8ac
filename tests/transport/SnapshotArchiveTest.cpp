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

TEST(SnapshotArchive, IsTheseVeryBytes) {
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->setLibraryUUID("L");
  snapshot->setLibraryKind("Folder");
  snapshot->setDeletes(nullptr);
  const KXSEventPtr event = KXSEvent::eventWithUUID("E");
  event->setName("Day");
  snapshot->updates()->set("E", event);
  EXPECT_EQ(hexOf(archiveBytes(snapshot)),
            "62706c6973743030d401020304050607085861726368697665725776657273696f6e5472"
            "6f6f74576f626a656374735f100f4b584b65796564417263686976657210018000a2091b"
            "d30a0b0c0d0e1355636c6173735676616c756573546d6170735f10184b58534c69627261"
            "72794368616e6765536e617073686f74d20f1011125f10264b58534c6962726172794368"
            "616e6765536e617073686f744c696272617279555549444b65795f10264b58534c696272"
            "6172794368616e6765536e617073686f744c6962726172794b696e644b6579514c56466f"
            "6c646572d114155f101c4b58534c696272617279536e617073686f74557064617465734b"
            "6579d216041719546b657973a1185145a11a8001d20a0b1c1d584b58534576656e74d21e"
            "1f2018596576656e744e616d6554757569645344617900080011001a00220027002f0041"
            "004300450048004f0055005c0061007c008100aa00d300d500dc00df00fe01030108010a"
            "010c010e01100115011e0123012d01320000000000000201000000000000002100000000"
            "000000000000000000000136");
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
