#include "transport/KXSLibraryChangeSnapshot.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>

#include "records/KXSFolder.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/PropertyLists.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

KXSLibraryChangeSnapshotPtr decode(const Value& root) {
  return KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, nullptr);
}

Value asset(std::string_view uuid, double latitude = 1.0) {
  return dict({{"uuid", text(uuid)},
               {"itemType", text("Asset")},
               {"modificationDate", Value::real(5.0)},
               {"latitude", Value::real(latitude)},
               {"longitude", Value::real(2.0)}});
}
Value unlocated(std::string_view uuid) {
  return dict({{"uuid", text(uuid)}, {"itemType", text("Asset")}});
}
Value album(std::string_view uuid, std::string_view name = "Album") {
  return dict({{"uuid", text(uuid)}, {"itemType", text("Album")}, {"albumName", text(name)}});
}
Value event(std::string_view uuid) {
  return dict({{"uuid", text(uuid)}, {"itemType", text("Event")}, {"eventName", text("Event")}});
}
Value root(Array updates, std::string_view kind = "Cassock", std::string_view uuid = "library") {
  return dict({{"libraryUUID", text(uuid)},
               {"libraryKind", text(kind)},
               {"updates", list(std::move(updates))},
               {"deletes", list({})}});
}

// Compares two snapshots both as built in memory and as read from files; returns the log.
std::string differenceLogged(const Value& first, const Value& second, bool expectEqual = false) {
  CapturedLog log;
  EXPECT_EQ(decode(first)->isEqualToSnapshot(decode(second)), expectEqual);
  const std::string lines = log.lines();
  log.clear();
  EXPECT_EQ(decode(throughFile(first))->isEqualToSnapshot(decode(throughFile(second))),
            expectEqual);
  EXPECT_EQ(log.lines(), lines);
  return lines;
}

const std::string kLogged = "7 KXSLibraryChangeSnapshot isEqualToSnapshot ";

TEST(KXSLibraryChangeSnapshot, HasDefaults) {
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  EXPECT_TRUE(snapshot->updates()->empty());
  EXPECT_TRUE(snapshot->deletes()->empty());
  EXPECT_EQ(snapshot->libraryUUID(), "");
  EXPECT_EQ(snapshot->libraryKind(), "");
  EXPECT_FALSE(snapshot->isFolderSync());
  EXPECT_TRUE(snapshot->orderedAlbums()->empty());
  EXPECT_TRUE(snapshot->albumsAndEventsByUUID()->empty());
  EXPECT_TRUE(snapshot->assetsByUUID()->empty());
}

TEST(KXSLibraryChangeSnapshot, FreshOnesAreEqualAndUnchanged) {
  const auto first = KXSLibraryChangeSnapshot::librarySnapshot();
  const auto second = KXSLibraryChangeSnapshot::init();
  EXPECT_TRUE(first->isEqualToSnapshot(second));
  EXPECT_FALSE(first->hasChangedObjects());
  EXPECT_FALSE(second->hasChangedObjects());
}

TEST(KXSLibraryChangeSnapshot, ChangedObjectsAreUpdatesOrDeletes) {
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->updates()->set("u", KXSAsset::assetWithUUID("u"));
  EXPECT_TRUE(snapshot->hasChangedObjects());
  snapshot->setUpdates(nullptr);
  EXPECT_FALSE(snapshot->hasChangedObjects());
  snapshot->deletes()->set("d", KXSFolder::folderWithUUID("d"));
  EXPECT_TRUE(snapshot->hasChangedObjects());
  snapshot->setDeletes(nullptr);
  EXPECT_FALSE(snapshot->hasChangedObjects());
}

TEST(KXSLibraryChangeSnapshot, DecodedUpdatesAreNoChangedObjects) {
  const auto snapshot = decode(root({asset("a")}));
  EXPECT_EQ(snapshot->assetsByUUID()->size(), 1U);
  EXPECT_FALSE(snapshot->hasChangedObjects());
}

TEST(KXSLibraryChangeSnapshot, ChangedObjectsDependOnUpdatesAndDeletes) {
  EXPECT_THAT(KXSLibraryChangeSnapshot::keyPathsForValuesAffectingValueForKey("hasChangedObjects"),
              testing::ElementsAre("updates", "deletes"));
  EXPECT_THAT(KXSLibraryChangeSnapshot::keyPathsForValuesAffectingValueForKey("libraryUUID"),
              testing::IsEmpty());
}

TEST(KXSLibraryChangeSnapshot, StringsAreComparedNullTolerantly) {
  using S = KXSLibraryChangeSnapshot;
  EXPECT_TRUE(S::stringEqualsString(std::nullopt, std::nullopt));
  EXPECT_FALSE(S::stringEqualsString(std::nullopt, ""));
  EXPECT_FALSE(S::stringEqualsString("", std::nullopt));
  EXPECT_TRUE(S::stringEqualsString("a", "a"));
  EXPECT_FALSE(S::stringEqualsString("a", "A"));
}

TEST(KXSLibraryChangeSnapshot, NumbersAreComparedNullTolerantly) {
  using S = KXSLibraryChangeSnapshot;
  EXPECT_TRUE(S::numberEqualsNumber(std::nullopt, std::nullopt));
  EXPECT_FALSE(S::numberEqualsNumber(std::nullopt, Number::integer(0)));
  EXPECT_FALSE(S::numberEqualsNumber(Number::integer(0), std::nullopt));
  EXPECT_TRUE(S::numberEqualsNumber(Number::integer(1), Number::real(1.0)));
  EXPECT_TRUE(S::numberEqualsNumber(Number::integer(1), Number::boolean(true)));
  EXPECT_FALSE(S::numberEqualsNumber(Number::integer(1), Number::real(1.5)));
}

TEST(SnapshotEquality, NullAndTheVerySameSnapshotLogNothing) {
  CapturedLog log;
  const auto snapshot = decode(root({unlocated("a")}));
  EXPECT_FALSE(snapshot->isEqualToSnapshot(static_cast<const KXSLibraryChangeSnapshot*>(nullptr)));
  EXPECT_TRUE(snapshot->isEqualToSnapshot(snapshot));
  EXPECT_EQ(log.lines(), "");
}

TEST(SnapshotEquality, EqualFilesAreEqual) {
  const Value full = root({album("A"), event("E"), asset("1"), asset("2")});
  EXPECT_EQ(differenceLogged(full, full, true), "");
}

TEST(SnapshotEquality, AnswersForATwinWhatItAnswersForASecondDecoding) {
  const Value notANumber = Value::real(std::numeric_limits<double>::quiet_NaN());
  const Value oddAlbum =
      dict({{"uuid", text("A")}, {"itemType", text("Album")}, {"subclass", notANumber}});
  const Value oddEvent =
      dict({{"uuid", text("E")}, {"itemType", text("Event")}, {"eventName", notANumber}});
  const Value members = dict({{"uuid", text("M")},
                              {"itemType", text("Album")},
                              {"assetUUIDs", list({text("1"), notANumber})}});
  const std::pair<Value, bool> cases[] = {
      {root({}), true},
      {root({album("A"), event("E"), asset("1"), asset("2")}), true},
      {root({album("A"), asset("1"), unlocated("2")}), false},
      {root({asset("1", std::numeric_limits<double>::quiet_NaN())}), true},
      {root({oddAlbum, asset("1")}), true},
      {root({oddEvent, asset("1")}), true},
      {root({members, asset("1")}), true},
      {dict({{"libraryKind", notANumber}}), true},
      {dict({{"libraryUUID", notANumber}}), true},
  };
  for (const auto& [value, isEqual] : cases) {
    for (const Value& form : {value, throughFile(value)}) {
      EXPECT_EQ(decode(form)->isEqualToTwin(), isEqual) << value.description();
      EXPECT_EQ(decode(form)->isEqualToSnapshot(decode(form)), isEqual) << value.description();
    }
  }
}

TEST(SnapshotEquality, OrderOfAssetsDoesNotCount) {
  EXPECT_EQ(differenceLogged(root({asset("1"), asset("2"), asset("3")}),
                             root({asset("3"), asset("1"), asset("2")}), true),
            "");
}

TEST(SnapshotEquality, LibraryKindDiffers) {
  EXPECT_EQ(differenceLogged(root({}, "Cassock"), root({}, "Brindle", "other")),
            kLogged + "snapshot libraryKind not equal\n");
}

TEST(SnapshotEquality, LibraryUUIDDiffers) {
  EXPECT_EQ(differenceLogged(root({}, "Cassock", "a"), root({album("A")}, "Cassock", "b")),
            kLogged + "snapshot libraryUUID not equal\n");
}

TEST(SnapshotEquality, NullAndEmptyTextsDiffer) {
  EXPECT_EQ(differenceLogged(dict({}), root({}, "")), kLogged + "snapshot libraryKind not equal\n");
  EXPECT_EQ(differenceLogged(root({}, ""), dict({})), kLogged + "snapshot libraryKind not equal\n");
  EXPECT_EQ(differenceLogged(dict({}), dict({}), true), "");
}

TEST(SnapshotEquality, CountOfAlbumsDiffers) {
  EXPECT_EQ(differenceLogged(root({album("A")}), root({album("A"), event("E")})),
            kLogged + "snapshot orderedAlbums count not equal\n");
}

TEST(SnapshotEquality, AnAlbumAgainstAnEventDiffers) {
  EXPECT_EQ(differenceLogged(root({album("A")}), root({event("A")})),
            kLogged + "snapshot albums not equal\n");
  EXPECT_EQ(differenceLogged(root({event("A")}), root({album("A")})),
            kLogged + "snapshot albums not equal\n");
}

TEST(SnapshotEquality, AnAlbumsDifferenceIsLoggedBeforeTheSnapshots) {
  EXPECT_EQ(
      differenceLogged(root({album("A", "x"), album("B", "x")}),
                       root({album("A", "y"), album("B", "y")})),
      "7 KXSAlbum isEqualToAlbum album name not equal\n" + kLogged + "snapshot albums not equal\n");
}

TEST(SnapshotEquality, OrderOfAlbumsCounts) {
  EXPECT_THAT(differenceLogged(root({album("A", "x"), album("B", "y")}),
                               root({album("B", "y"), album("A", "x")})),
              testing::EndsWith(kLogged + "snapshot albums not equal\n"));
}

TEST(SnapshotEquality, CountOfAssetsDiffers) {
  EXPECT_EQ(differenceLogged(root({asset("1")}), root({asset("1"), asset("2")})),
            kLogged + "snapshot assetsByUUID count not equal\n");
}

TEST(SnapshotEquality, AnAssetThatIsMissingOrDiffersIsLoggedByNoMessage) {
  EXPECT_EQ(differenceLogged(root({asset("1")}), root({asset("2")})), "");
  EXPECT_EQ(differenceLogged(root({asset("1", 1.0)}), root({asset("1", 1.5)})), "");
}

TEST(SnapshotEquality, CopiesOfAnAssetWithoutLocationAreADifference) {
  EXPECT_EQ(differenceLogged(root({unlocated("1")}), root({unlocated("1")})), "");
}

TEST(SnapshotEquality, ComparesNeitherUpdatesNorDeletesNorTheFolderFlag) {
  const auto first = decode(root({asset("1")}));
  const auto second = decode(root({asset("1")}));
  second->setUpdates(std::make_shared<KXSItemMap>());
  second->deletes()->set("d", KXSAsset::assetWithUUID("d"));
  second->setAlbumsAndEventsByUUID(nullptr);
  second->setIsFolderSync(true);
  EXPECT_TRUE(first->isEqualToSnapshot(second));
  EXPECT_TRUE(second->isEqualToSnapshot(first));
}

TEST(SnapshotEquality, MissingCollectionsCountAsEmpty) {
  const auto bare = std::make_shared<KXSLibraryChangeSnapshot>();
  const auto fresh = decode(dict({}));
  EXPECT_TRUE(bare->isEqualToSnapshot(fresh));
  EXPECT_TRUE(fresh->isEqualToSnapshot(bare));
}

TEST(SnapshotEquality, WrongTypesNeverRaise) {
  const Value wrong = dict({{"libraryKind", Value::integer(1)}, {"libraryUUID", list({})}});
  EXPECT_EQ(differenceLogged(wrong, root({})), kLogged + "snapshot libraryKind not equal\n");
}

TEST(KXSLibraryChangeSnapshot, DescribesItself) {
  EXPECT_EQ(decode(dict({}))->description(),
            "KXSLibraryChangeSnapshot, libraryUUID: (null) libraryKind:(null)\nupdates: "
            "(null)\ndeletes: {\n}");
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->setLibraryUUID("L");
  snapshot->setLibraryKind("Folder");
  snapshot->updates()->set("E", KXSEvent::eventWithUUID("E"));
  EXPECT_EQ(snapshot->description(),
            "KXSLibraryChangeSnapshot, libraryUUID: L libraryKind:Folder\nupdates: {\n    \"E\" = "
            "Event - (E), name: , key asset: (null);\n}\ndeletes: {\n}");
}

}  // namespace
}  // namespace kx
