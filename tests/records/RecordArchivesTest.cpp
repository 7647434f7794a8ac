#include "records/RecordArchives.h"

#include <gtest/gtest.h>

#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"
#include "records/KXSFolder.h"
#include "records/KXSImageAdjustment.h"
#include "records/KXSUUID.h"
#include "tests/support/Archives.h"
#include "tests/support/PropertyLists.h"

namespace kx {
namespace {

const char* const kX = "F0000000-0000-4000-8000-00000000000F";

template <typename T>
std::shared_ptr<T> restored(const std::shared_ptr<T>& object) {
  return throughArchive(object, recordArchiveClasses());
}

// The only object of an archive.
Value soleObject(const ArchivablePtr& object) {
  const Value objects = archivedObjects(object);
  EXPECT_EQ(objects.arrayValue().size(), 1U);
  return objects.arrayValue()[0];
}

Value archived(std::string_view className, Value values) {
  return dict({{"class", text(className)}, {"values", std::move(values)}});
}

TEST(RecordArchives, AnIdentifierComesBackAsAnIdentifier) {
  const KXSUUIDPtr uuid = KXSUUID::uuidWithString(kX);
  EXPECT_EQ(soleObject(uuid),
            archived("KXSUUID", dict({{"KXSUUIDDataKey", Value::data(uuid->span())}})));
  const KXSUUIDPtr back = restored(uuid);
  ASSERT_TRUE(back);
  EXPECT_TRUE(back->isEqual(*uuid));
}

TEST(RecordArchives, AnItemKeepsIdentifierAndUserInfo) {
  const KXSItemPtr item = KXSItem::initWithUUID(kX);
  item->setUserInfo(texts({"a"}));
  item->setHostInfo(dict({{"k", text("v")}}));
  EXPECT_EQ(soleObject(item),
            archived("KXSItem", dict({{"uuid", text(kX)}, {"userInfo", texts({"a"})}})));
  const KXSItemPtr back = restored(item);
  EXPECT_EQ(back->uuid(), kX);
  EXPECT_EQ(back->userInfo(), texts({"a"}));
  EXPECT_EQ(back->hostInfo(), dict({}));
}

TEST(RecordArchives, AnAlbumKeepsAllItsFields) {
  const KXSAlbumPtr album = KXSAlbum::albumWithUUID(kX);
  album->setName("Trip");
  album->setAssetUUIDs(texts({"a", "b"}));
  album->setParentUUID("p");
  album->setAlbumSubclass(Value::integer(3));
  album->setAlbumKeyAssetFaceIndex(Value::integer(7));
  album->setKeyAssetUUID("k");
  EXPECT_EQ(soleObject(album), archived("KXSAlbum", dict({{"albumName", text("Trip")},
                                                          {"assetUUIDs", texts({"a", "b"})},
                                                          {"parentUUID", text("p")},
                                                          {"subclass", Value::integer(3)},
                                                          {"keyAssetFaceIndex", Value::integer(7)},
                                                          {"keyAssetUUID", text("k")},
                                                          {"uuid", text(kX)}})));
  EXPECT_TRUE(restored(album)->isEqualToAlbum(album));
  EXPECT_EQ(restored(album)->propertyList(), album->propertyList());
}

TEST(RecordArchives, NullFieldsStayNull) {
  const KXSAlbumPtr album = KXSAlbum::initFromPropertyList(dict({{"uuid", text(kX)}}));
  const KXSAlbumPtr back = restored(album);
  EXPECT_EQ(back->name(), std::nullopt);
  EXPECT_FALSE(back->assetUUIDs());
  EXPECT_EQ(back->albumSubclass(), std::nullopt);
}

TEST(RecordArchives, AnEventKeepsAllItsFields) {
  const KXSEventPtr event = KXSEvent::eventWithUUID(kX);
  event->setName("Day");
  event->setParentUUID("p");
  event->setKeyAssetUUID("k");
  EXPECT_EQ(soleObject(event), archived("KXSEvent", dict({{"eventName", text("Day")},
                                                          {"parentUUID", text("p")},
                                                          {"keyAssetUUID", text("k")},
                                                          {"uuid", text(kX)}})));
  EXPECT_TRUE(restored(event)->isEqualToEvent(event));
}

TEST(RecordArchives, AFolderKeepsAllItsFields) {
  const KXSFolderPtr folder = KXSFolder::folderWithUUID(kX);
  folder->setName("All");
  folder->setParentUUID("p");
  EXPECT_EQ(soleObject(folder), archived("KXSFolder", dict({{"KXSFolderNameKey", text("All")},
                                                            {"KXSFolderParentUuidKey", text("p")},
                                                            {"uuid", text(kX)}})));
  EXPECT_EQ(restored(folder)->name(), "All");
  EXPECT_EQ(restored(folder)->parentUUID(), "p");
}

KXSAssetPtr fullAsset() {
  const KXSAssetPtr asset = KXSAsset::assetWithUUID(kX);
  asset->setUserInfo(text("info"));
  asset->setRating(Value::integer(4));
  asset->setIsFlagged(Value::boolean(true));
  asset->setIsVideo(true);
  asset->setCaption("sea");
  asset->setEventUUID("e");
  asset->setAdjustments(texts({"turn"}));
  asset->setExposureDate(Value::real(1.0));
  asset->setModificationDate(Value::real(2.0));
  asset->setLatitude(Value::real(3.0));
  asset->setLongitude(Value::real(4.0));
  asset->setOriginalFileName("IMG.JPG");
  asset->setFacesInfo(list({dict({{"faceIndex", Value::integer(1)}})}));
  const auto properties = KXSAssetProperties::assetProperties();
  properties->setFileName("f.jpg");
  properties->setImageProperties(dict({{"w", Value::integer(2)}}));
  properties->setFileSystemProperties(dict({{"size", Value::integer(3)}}));
  asset->setProperties(properties);
  return asset;
}

TEST(RecordArchives, AnAssetLosesDatesAndLocation) {
  const KXSAssetPtr back = restored(fullAsset());
  EXPECT_EQ(back->exposureDate(), std::nullopt);
  EXPECT_EQ(back->modificationDate(), std::nullopt);
  EXPECT_EQ(back->latitude(), std::nullopt);
  EXPECT_EQ(back->longitude(), std::nullopt);
  EXPECT_EQ(back->uuid(), kX);
  EXPECT_EQ(back->userInfo(), text("info"));
  EXPECT_EQ(back->rating(), Number::integer(4));
  EXPECT_EQ(back->isFlagged(), Number::boolean(true));
  EXPECT_TRUE(back->isVideo());
  EXPECT_EQ(back->caption(), "sea");
  EXPECT_EQ(back->eventUUID(), "e");
  EXPECT_EQ(back->adjustments()->size(), 1U);
  EXPECT_EQ(back->originalFileName(), "IMG.JPG");
  EXPECT_EQ(back->facesInfo()->size(), 1U);
  ASSERT_TRUE(back->properties());
  EXPECT_EQ(back->properties()->propertyList(), fullAsset()->properties()->propertyList());
}

TEST(RecordArchives, AnAssetsFormNamesItsPropertiesAsAnObject) {
  const Value objects = archivedObjects(fullAsset());
  ASSERT_EQ(objects.arrayValue().size(), 2U);
  EXPECT_EQ(objects.arrayValue()[0],
            dict({{"class", text("KXSAsset")},
                  {"values", dict({{"rating", Value::integer(4)},
                                   {"isFlagged", Value::boolean(true)},
                                   {"isVideo", Value::boolean(true)},
                                   {"adjustments", texts({"turn"})},
                                   {"caption", text("sea")},
                                   {"eventUUID", text("e")},
                                   {"originalFileName", text("IMG.JPG")},
                                   {"faces", list({dict({{"faceIndex", Value::integer(1)}})})},
                                   {"uuid", text(kX)},
                                   {"userInfo", text("info")}})},
                  {"references", dict({{"assetProperties", Value::uid(1)}})}}));
  EXPECT_EQ(objects.arrayValue()[1],
            archived("KXSAssetProperties",
                     dict({{"fileName", text("f.jpg")},
                           {"imageProperties", dict({{"w", Value::integer(2)}})},
                           {"fileProperties", dict({{"size", Value::integer(3)}})}})));
}

TEST(RecordArchives, AnAdjustmentKeepsItsRotation) {
  const auto adjustment = KXSImageAdjustment::imageAdjustment();
  adjustment->setRotation(Value::real(90.5));
  EXPECT_EQ(soleObject(adjustment),
            archived("KXSImageAdjustment", dict({{"rotation", Value::real(90.5)}})));
  EXPECT_EQ(restored(adjustment)->rotation(), Number::real(90.5));
}

TEST(RecordArchives, AreTheseVeryBytes) {
  const KXSUUIDPtr uuid = KXSUUID::uuidWithString("0F1E2D3C-4B5A-6978-8796-A5B4C3D2E1F0");
  EXPECT_EQ(hexOf(archiveBytes(uuid)),
            "62706c6973743030d401020304050607085861726368697665725776657273696f6e5472"
            "6f6f74576f626a656374735f100f4b584b65796564417263686976657210018000a109d2"
            "0a0b0c0d55636c6173735676616c756573574b585355554944d10e0f5e4b585355554944"
            "446174614b65794f10100f1e2d3c4b5a69788796a5b4c3d2e1f008111a22272f41434547"
            "4c5259616473000000000000010100000000000000100000000000000000000000000000"
            "0086");
  const KXSEventPtr event = KXSEvent::eventWithUUID("E");
  event->setName("Day");
  EXPECT_EQ(hexOf(archiveBytes(event)),
            "62706c6973743030d401020304050607085861726368697665725776657273696f6e5472"
            "6f6f74576f626a656374735f100f4b584b65796564417263686976657210018000a109d2"
            "0a0b0c0d55636c6173735676616c756573584b58534576656e74d20e0f1011596576656e"
            "744e616d65547575696453446179514508111a22272f414345474c5259626771767a0000"
            "00000000010100000000000000120000000000000000000000000000007c");
}

TEST(RecordArchives, ClassesThatAreNotRecordsAreRefused) {
  class Stranger final : public Archivable {
   public:
    std::string_view archiveClassName() const override { return "Stranger"; }
    void encodeWithCoder(KeyedArchiver&) const override {}
  };
  ErrorPtr error;
  const auto bytes = archiveBytes(std::make_shared<Stranger>());
  EXPECT_EQ(KeyedUnarchiver::unarchivedObject(std::make_shared<const Data>(bytes),
                                              recordArchiveClasses(), &error),
            nullptr);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(PropertyListError::kArchiveClass));
}

}  // namespace
}  // namespace kx
