#include <gtest/gtest.h>

#include <regex>

#include "platform/foundation/Exceptions.h"
#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"
#include "records/KXSFolder.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/PropertyLists.h"

namespace kx {
namespace {

const char* const kA1 = "A1000000-0000-4000-8000-000000000001";
const char* const kA2 = "A2000000-0000-4000-8000-000000000002";
const char* const kX = "F0000000-0000-4000-8000-00000000000F";

bool isRandomIdentifier(OptionalString uuid) {
  static const std::regex form(
      "[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}");
  return uuid && std::regex_match(std::string(*uuid), form);
}

KXSAlbumPtr fullAlbum() {
  const KXSAlbumPtr album = KXSAlbum::albumWithUUID(kX);
  album->setName("Trip");
  album->setAssetUUIDs(texts({kA1, kA2}));
  album->setParentUUID("parent");
  album->setAlbumSubclass(Value::integer(3));
  album->setAlbumKeyAssetFaceIndex(Value::integer(7));
  album->setKeyAssetUUID(kA2);
  return album;
}

KXSEventPtr fullEvent() {
  const KXSEventPtr event = KXSEvent::eventWithUUID(kX);
  event->setName("2020-01-02");
  event->setParentUUID("parent");
  event->setKeyAssetUUID(kA1);
  return event;
}

TEST(KXSItem, MakesIdentifiersAndDefaults) {
  const KXSItemPtr item = KXSItem::init();
  EXPECT_TRUE(isRandomIdentifier(item->uuid()));
  EXPECT_NE(item->uuid(), KXSItem::init()->uuid());
  EXPECT_TRUE(item->userInfo().isNull());
  EXPECT_EQ(item->hostInfo(), dict({}));
  EXPECT_EQ(KXSItem::initWithUUID(kX)->uuid(), kX);
  EXPECT_EQ(KXSItem::initWithUUID(std::nullopt)->uuid(), std::nullopt);
}

TEST(KXSItem, DescribesItselfByIdentifier) {
  EXPECT_EQ(KXSItem::initWithUUID(kX)->description(), "(" + std::string(kX) + ")");
  EXPECT_EQ(KXSItem::initWithUUID(std::nullopt)->description(), "((null))");
}

TEST(KXSItem, BaseHasNoItemType) {
  const KXSItemPtr item = KXSItem::init();
  try {
    item->_itemType();
    FAIL();
  } catch (const InternalInconsistency& e) {
    EXPECT_STREQ(e.what(), "Method not implemented on base class");
  }
  EXPECT_THROW(item->propertyList(), InternalInconsistency);
}

TEST(KXSItem, HostInfoStaysWithTheItem) {
  const KXSAlbumPtr album = KXSAlbum::albumWithUUID(kX);
  album->setHostInfo(dict({{"k", text("v")}}));
  EXPECT_EQ(album->hostInfo(), dict({{"k", text("v")}}));
  EXPECT_TRUE(album->propertyList()["hostInfo"].isNull());
  album->setHostInfo(Value());
  EXPECT_TRUE(album->hostInfo().isNull());
  const Value dictionary = dict({{"uuid", text(kX)}, {"hostInfo", dict({{"k", text("v")}})}});
  EXPECT_EQ(KXSAlbum::initFromPropertyList(dictionary)->hostInfo(), dict({}));
}

TEST(KXSItem, UserInfoIsCarriedUnchanged) {
  const Value userInfo = dict({{"n", Value::real(1.5)}, {"l", texts({"a", ""})}});
  const Value dictionary = dict({{"uuid", text(kX)}, {"userInfo", userInfo}});
  const KXSEventPtr event = KXSEvent::initFromPropertyList(throughFile(dictionary));
  EXPECT_EQ(event->userInfo(), userInfo);
  EXPECT_EQ(event->propertyList()["userInfo"], userInfo);
}

TEST(KXSItem, NullDictionaryLeavesEveryFieldNull) {
  const KXSItemPtr item = KXSItem::initFromPropertyList(Value());
  EXPECT_EQ(item->uuid(), std::nullopt);
  EXPECT_TRUE(item->userInfo().isNull());
  EXPECT_EQ(item->hostInfo(), dict({}));
}

TEST(KXSItem, IdentifierOutlivesTheItem) {
  Value uuid;
  {
    const Value read = throughFile(dict({{"uuid", text(kX)}}));
    uuid = KXSItem::initFromPropertyList(read)->uuidValue();
  }
  EXPECT_EQ(uuid.stringValue(), kX);
}

TEST(KXSAlbum, HasDefaults) {
  const KXSAlbumPtr album = KXSAlbum::albumWithUUID(kX);
  EXPECT_EQ(album->uuid(), kX);
  EXPECT_EQ(album->name(), "");
  ASSERT_TRUE(album->assetUUIDs());
  EXPECT_EQ(album->assetUUIDs()->size(), 0U);
  EXPECT_EQ(album->parentUUID(), std::nullopt);
  EXPECT_EQ(album->albumSubclass(), Number::integer(0));
  EXPECT_EQ(album->albumKeyAssetFaceIndex(), std::nullopt);
  EXPECT_EQ(album->keyAssetUUID(), std::nullopt);
  EXPECT_TRUE(isRandomIdentifier(KXSAlbum::album()->uuid()));
  EXPECT_EQ(album->_itemType(), "Album");
}

TEST(KXSAlbum, DecodedFromIdentifierAndTypeAloneHasNullFields) {
  const Value dictionary = dict({{"uuid", text(kX)}, {"itemType", text("Album")}});
  for (const Value& source : {dictionary, throughFile(dictionary)}) {
    const KXSAlbumPtr album = KXSAlbum::initFromPropertyList(source);
    EXPECT_EQ(album->uuid(), kX);
    EXPECT_EQ(album->name(), std::nullopt);
    EXPECT_FALSE(album->assetUUIDs());
    EXPECT_EQ(album->parentUUID(), std::nullopt);
    EXPECT_EQ(album->albumSubclass(), std::nullopt);
    EXPECT_EQ(album->albumKeyAssetFaceIndex(), std::nullopt);
    EXPECT_EQ(album->keyAssetUUID(), std::nullopt);
    EXPECT_TRUE(album->userInfo().isNull());
  }
}

TEST(KXSAlbum, PropertyListHoldsEverySetField) {
  const Value expected = dict({{"uuid", text(kX)},
                               {"itemType", text("Album")},
                               {"albumName", text("Trip")},
                               {"assetUUIDs", texts({kA1, kA2})},
                               {"parentUUID", text("parent")},
                               {"subclass", Value::integer(3)},
                               {"keyAssetFaceIndex", Value::integer(7)},
                               {"keyAssetUUID", text(kA2)}});
  EXPECT_EQ(fullAlbum()->propertyList(), expected);
  for (const auto format : {PropertyListFormat::kBinary, PropertyListFormat::kXml}) {
    const KXSAlbumPtr album = KXSAlbum::initFromPropertyList(throughFile(expected, format));
    EXPECT_EQ(album->propertyList(), expected);
    EXPECT_TRUE(album->isEqualToAlbum(fullAlbum()));
  }
}

TEST(KXSAlbum, NullFieldsAreNotWritten) {
  const KXSAlbumPtr album = KXSAlbum::initFromPropertyList(dict({}));
  EXPECT_EQ(album->propertyList(), dict({{"itemType", text("Album")}}));
}

TEST(KXSAlbum, SettersReplaceWhatTheFileHeld) {
  const KXSAlbumPtr album =
      KXSAlbum::initFromPropertyList(throughFile(fullAlbum()->propertyList()));
  album->setName(std::nullopt);
  album->setParentUUID("elsewhere");
  EXPECT_EQ(album->name(), std::nullopt);
  EXPECT_EQ(album->parentUUID(), "elsewhere");
  EXPECT_EQ(album->keyAssetUUID(), kA2);
  EXPECT_EQ(album->assetUUIDs()->size(), 2U);
}

TEST(KXSAlbum, DescribesItself) {
  EXPECT_EQ(fullAlbum()->description(),
            "Album - (" + std::string(kX) + "), name: Trip subclass type:(3)");
  EXPECT_EQ(KXSAlbum::initFromPropertyList(dict({}))->description(),
            "Album - ((null)), name: (null) subclass type:((null))");
}

TEST(KXSAlbum, EqualAlbumsLogNothing) {
  CapturedLog log;
  const KXSAlbumPtr album = fullAlbum();
  EXPECT_TRUE(album->isEqualToAlbum(album));
  EXPECT_TRUE(album->isEqualToAlbum(fullAlbum()));
  EXPECT_FALSE(album->isEqualToAlbum(static_cast<const KXSItem*>(nullptr)));
  EXPECT_EQ(log.lines(), "");
}

TEST(KXSAlbum, AnEventIsNoAlbum) {
  CapturedLog log;
  EXPECT_FALSE(fullAlbum()->isEqualToAlbum(fullEvent()));
  EXPECT_EQ(log.lines(), "3 KXSAlbum isEqualToAlbum otherAlbum isn't an album\n");
  EXPECT_EQ(log.messages()[0].facility, "com.veltro.kxsyncbundle");
}

TEST(KXSAlbum, EachDifferenceIsLogged) {
  struct Case {
    const char* message;
    std::function<void(KXSAlbum&)> change;
  };
  const std::vector<Case> cases = {
      {"album name not equal", [](KXSAlbum& a) { a.setName("Other"); }},
      {"album albumSubclass not equal", [](KXSAlbum& a) { a.setAlbumSubclass(Value::integer(4)); }},
      {"album albumKeyAssetFaceIndex not equal",
       [](KXSAlbum& a) { a.setAlbumKeyAssetFaceIndex(Value()); }},
      {"album parentUUID not equal", [](KXSAlbum& a) { a.setParentUUID(std::nullopt); }},
      {"album keyAssetUUID not equal", [](KXSAlbum& a) { a.setKeyAssetUUID(""); }},
      {"album assetUUIDs count not equal", [](KXSAlbum& a) { a.setAssetUUIDs(texts({kA1})); }},
      {"album assetUUID not equal",
       [](KXSAlbum& a) {
         a.setAssetUUIDs(texts({kA2, kA1}));
       }},
  };
  for (const Case& test : cases) {
    for (const bool changeFirst : {true, false}) {
      const KXSAlbumPtr first = fullAlbum();
      const KXSAlbumPtr second = fullAlbum();
      test.change(changeFirst ? *first : *second);
      CapturedLog log;
      EXPECT_FALSE(first->isEqualToAlbum(second)) << test.message;
      EXPECT_EQ(log.lines(), std::string("7 KXSAlbum isEqualToAlbum ") + test.message + "\n");
    }
  }
}

TEST(KXSAlbum, TheFirstDifferenceInOrderIsTheOneLogged) {
  const KXSAlbumPtr other = fullAlbum();
  other->setAssetUUIDs(Value());
  other->setKeyAssetUUID("k");
  other->setParentUUID("p");
  CapturedLog log;
  EXPECT_FALSE(fullAlbum()->isEqualToAlbum(other));
  EXPECT_EQ(log.lines(), "7 KXSAlbum isEqualToAlbum album parentUUID not equal\n");
}

TEST(KXSAlbum, NullNameEqualsNullNameButNotAnEmptyOne) {
  const KXSAlbumPtr null = KXSAlbum::initFromPropertyList(dict({{"uuid", text(kX)}}));
  const KXSAlbumPtr alsoNull =
      KXSAlbum::initFromPropertyList(throughFile(dict({{"uuid", text(kX)}})));
  const KXSAlbumPtr empty =
      KXSAlbum::initFromPropertyList(dict({{"uuid", text(kX)}, {"albumName", text("")}}));
  EXPECT_TRUE(null->isEqualToAlbum(alsoNull));
  CapturedLog log;
  EXPECT_FALSE(null->isEqualToAlbum(empty));
  EXPECT_FALSE(empty->isEqualToAlbum(null));
  EXPECT_EQ(log.count(LogLevel::kDebug, "album name not equal"), 2U);
}

TEST(KXSAlbum, NullAndEmptyAssetListsAreEqual) {
  const KXSAlbumPtr none = KXSAlbum::albumWithUUID(kX);
  none->setAssetUUIDs(Value());
  EXPECT_TRUE(none->isEqualToAlbum(KXSAlbum::albumWithUUID(kX)));
  EXPECT_TRUE(KXSAlbum::albumWithUUID(kX)->isEqualToAlbum(none));
}

TEST(KXSAlbum, SameAssetsInAnotherOrderAreADifferenceLoggedOnce) {
  const KXSAlbumPtr first =
      KXSAlbum::initFromPropertyList(throughFile(dict({{"assetUUIDs", texts({"a", "b", "c"})}})));
  const KXSAlbumPtr second =
      KXSAlbum::initFromPropertyList(throughFile(dict({{"assetUUIDs", texts({"b", "c", "a"})}})));
  CapturedLog log;
  EXPECT_FALSE(first->isEqualToAlbum(second));
  EXPECT_EQ(log.lines(), "7 KXSAlbum isEqualToAlbum album assetUUID not equal\n");
}

TEST(KXSAlbum, NumbersAreComparedByValue) {
  const KXSAlbumPtr first = KXSAlbum::albumWithUUID(kX);
  const KXSAlbumPtr second = KXSAlbum::albumWithUUID(kX);
  first->setAlbumSubclass(Value::real(1.0));
  second->setAlbumSubclass(Value::boolean(true));
  EXPECT_TRUE(first->isEqualToAlbum(second));
}

TEST(KXSAlbum, ComparingWrongTypesNeverRaises) {
  const Value wrong = throughFile(dict(
      {{"albumName", Value::integer(1)}, {"assetUUIDs", text("x")}, {"subclass", texts({"s"})}}));
  const KXSAlbumPtr album = KXSAlbum::initFromPropertyList(wrong);
  EXPECT_FALSE(album->isEqualToAlbum(fullAlbum()));
  EXPECT_FALSE(fullAlbum()->isEqualToAlbum(album));
}

TEST(KXSEvent, HasDefaults) {
  const KXSEventPtr event = KXSEvent::eventWithUUID(kX);
  EXPECT_EQ(event->uuid(), kX);
  EXPECT_EQ(event->name(), "");
  EXPECT_EQ(event->parentUUID(), std::nullopt);
  EXPECT_EQ(event->keyAssetUUID(), std::nullopt);
  EXPECT_TRUE(isRandomIdentifier(KXSEvent::event()->uuid()));
  EXPECT_EQ(event->_itemType(), "Event");
}

TEST(KXSEvent, PropertyListHoldsEverySetField) {
  const Value expected = dict({{"uuid", text(kX)},
                               {"itemType", text("Event")},
                               {"eventName", text("2020-01-02")},
                               {"parentUUID", text("parent")},
                               {"keyAssetUUID", text(kA1)}});
  EXPECT_EQ(fullEvent()->propertyList(), expected);
  EXPECT_EQ(KXSEvent::initFromPropertyList(throughFile(expected))->propertyList(), expected);
  EXPECT_EQ(KXSEvent::initFromPropertyList(dict({}))->name(), std::nullopt);
}

TEST(KXSEvent, DescribesItself) {
  EXPECT_EQ(fullEvent()->description(),
            "Event - (" + std::string(kX) + "), name: 2020-01-02, key asset: " + std::string(kA1));
}

TEST(KXSEvent, HostPropertyListsAreNotRead) {
  EXPECT_EQ(KXSEvent::initWithHostPropertyList(dict({{"uuid", text(kX)}})), nullptr);
  const KXSEventPtr event = fullEvent();
  EXPECT_FALSE(event->mergeWithHostPropertyList(dict({{"eventName", text("new")}})));
  EXPECT_EQ(event->name(), "2020-01-02");
}

TEST(KXSEvent, EqualEventsLogNothing) {
  CapturedLog log;
  const KXSEventPtr event = fullEvent();
  EXPECT_TRUE(event->isEqualToEvent(event));
  EXPECT_TRUE(event->isEqualToEvent(fullEvent()));
  EXPECT_FALSE(event->isEqualToEvent(static_cast<const KXSItem*>(nullptr)));
  EXPECT_EQ(log.lines(), "");
}

TEST(KXSEvent, AnAlbumIsNoEvent) {
  CapturedLog log;
  EXPECT_FALSE(fullEvent()->isEqualToEvent(fullAlbum()));
  EXPECT_EQ(log.lines(), "3 KXSEvent isEqualToEvent otherEvent isn't an event\n");
}

TEST(KXSEvent, EachDifferenceIsLogged) {
  struct Case {
    const char* message;
    std::function<void(KXSEvent&)> change;
  };
  const std::vector<Case> cases = {
      {"event name not equal", [](KXSEvent& e) { e.setName(std::nullopt); }},
      {"event parentUUID not equal", [](KXSEvent& e) { e.setParentUUID("other"); }},
      {"event keyAssetUUID not equal", [](KXSEvent& e) { e.setKeyAssetUUID("other"); }},
  };
  for (const Case& test : cases) {
    for (const bool changeFirst : {true, false}) {
      const KXSEventPtr first = fullEvent();
      const KXSEventPtr second = fullEvent();
      test.change(changeFirst ? *first : *second);
      CapturedLog log;
      EXPECT_FALSE(first->isEqualToEvent(second)) << test.message;
      EXPECT_EQ(log.lines(), std::string("7 KXSEvent isEqualToEvent ") + test.message + "\n");
    }
  }
}

TEST(KXSFolder, HasDefaultsAndAForm) {
  const KXSFolderPtr folder = KXSFolder::folderWithUUID(kX);
  EXPECT_EQ(folder->name(), "");
  EXPECT_EQ(folder->parentUUID(), std::nullopt);
  EXPECT_TRUE(isRandomIdentifier(KXSFolder::folder()->uuid()));
  EXPECT_EQ(folder->description(), "Folder - (" + std::string(kX) + "), name: ");
  const KXSFolderPtr read = KXSFolder::initFromPropertyList(
      dict({{"KXSFolderNameKey", text("All")}, {"KXSFolderParentUuidKey", text("p")}}));
  EXPECT_EQ(read->name(), "All");
  EXPECT_EQ(read->parentUUID(), "p");
}

TEST(KXSFolder, IsNeverTransported) {
  try {
    KXSFolder::folder()->propertyList();
    FAIL();
  } catch (const InternalInconsistency& e) {
    EXPECT_STREQ(e.what(), "Method not implemented on base class");
  }
}

TEST(KXSFolder, HostPropertyListsAreNotRead) {
  EXPECT_EQ(KXSFolder::initWithHostPropertyList(dict({})), nullptr);
  EXPECT_FALSE(KXSFolder::folder()->mergeWithHostPropertyList(dict({})));
}

}  // namespace
}  // namespace kx
