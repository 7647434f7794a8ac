#include "transport/KXSTransportDecoder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/foundation/Limits.h"
#include "testing/InMemoryFileSystem.h"
#include "tests/support/PropertyLists.h"

namespace kx {
namespace {

const char* const kPath = "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist";

Value item(std::string_view type, std::string_view uuid) {
  return dict({{"itemType", text(type)}, {"uuid", text(uuid)}});
}
Value album(std::string_view uuid, std::string_view name) {
  return dict({{"uuid", text(uuid)}, {"itemType", text("Album")}, {"albumName", text(name)}});
}
Value event(std::string_view uuid, std::string_view name) {
  return dict({{"uuid", text(uuid)}, {"itemType", text("Event")}, {"eventName", text(name)}});
}
Value root(Array updates, std::string_view kind = "Cassock") {
  return dict({{"libraryUUID", text("library")},
               {"libraryKind", text(kind)},
               {"updates", list(std::move(updates))}});
}

KXSLibraryChangeSnapshotPtr decode(const Value& value) {
  return KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(value, nullptr);
}
std::vector<std::string> orderOf(const KXSLibraryChangeSnapshot& snapshot) {
  std::vector<std::string> uuids;
  for (const KXSItemPtr& entry : *snapshot.orderedAlbums()) {
    uuids.push_back(std::string(entry->uuid().value_or("(null)")));
  }
  return uuids;
}
std::vector<std::string> keysOf(const auto& map) {
  std::vector<std::string> keys;
  for (const auto& entry : map) keys.push_back(std::string(entry.key.stringValue()));
  return keys;
}

using testing::ElementsAre;

TEST(KXSTransportDecoder, ARootWithoutListsDecodesToEmptyCollections) {
  const auto snapshot =
      decode(dict({{"libraryUUID", text("L")}, {"libraryKind", text("Brindle")}}));
  EXPECT_EQ(snapshot->libraryUUID(), "L");
  EXPECT_EQ(snapshot->libraryKind(), "Brindle");
  EXPECT_TRUE(snapshot->assetsByUUID()->empty());
  EXPECT_TRUE(snapshot->albumsAndEventsByUUID()->empty());
  EXPECT_TRUE(snapshot->orderedAlbums()->empty());
  EXPECT_TRUE(snapshot->deletes()->empty());
  EXPECT_EQ(snapshot->updates(), nullptr);
}

TEST(KXSTransportDecoder, NullAndOtherRootsDecodeToAnEmptySnapshot) {
  for (const Value& other : {Value(), list({text("x")}), text("x"), Value::integer(1)}) {
    ErrorPtr error;
    const auto snapshot =
        KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(other, &error);
    ASSERT_TRUE(snapshot);
    EXPECT_EQ(error, nullptr);
    EXPECT_EQ(snapshot->libraryUUID(), std::nullopt);
    EXPECT_EQ(snapshot->libraryKind(), std::nullopt);
    EXPECT_FALSE(snapshot->isFolderSync());
    EXPECT_TRUE(snapshot->assetsByUUID()->empty());
    EXPECT_TRUE(snapshot->albumsAndEventsByUUID()->empty());
    EXPECT_TRUE(snapshot->orderedAlbums()->empty());
    EXPECT_TRUE(snapshot->deletes()->empty());
  }
}

TEST(KXSTransportDecoder, AlbumsAndEventsKeepTheFilesOrder) {
  const Value mixed = root({album("3", "c"), event("1", "a"), item("Asset", "x"), album("2", "b")});
  for (const Value& source : {mixed, throughFile(mixed)}) {
    const auto snapshot = decode(source);
    EXPECT_THAT(orderOf(*snapshot), ElementsAre("3", "1", "2"));
    EXPECT_THAT(keysOf(*snapshot->albumsAndEventsByUUID()), ElementsAre("3", "1", "2"));
    EXPECT_THAT(keysOf(*snapshot->assetsByUUID()), ElementsAre("x"));
    EXPECT_EQ((*snapshot->orderedAlbums())[0], *snapshot->albumsAndEventsByUUID()->find("3"))
        << "one object in both";
  }
}

TEST(KXSTransportDecoder, FolderKindSortsContainersByName) {
  Dictionary unnamed;
  unnamed.set("uuid", text("null"));
  unnamed.set("itemType", text("Album"));
  const Value mixed =
      root({album("1", "trip 10"), event("2", "Trip 2"), album("3", "trip 2"), event("4", "apple"),
            album("5", ""), Value::dictionary(unnamed), album("6", "Zoo")},
           "Folder");
  for (const Value& source : {mixed, throughFile(mixed)}) {
    const auto snapshot = decode(source);
    EXPECT_TRUE(snapshot->isFolderSync());
    EXPECT_THAT(orderOf(*snapshot), ElementsAre("null", "5", "4", "2", "3", "1", "6"));
    EXPECT_THAT(keysOf(*snapshot->albumsAndEventsByUUID()),
                ElementsAre("1", "2", "3", "4", "5", "null", "6"));
  }
}

TEST(KXSTransportDecoder, OnlyTheKindFolderIsAFolderSync) {
  EXPECT_FALSE(decode(root({}, "folder"))->isFolderSync());
  EXPECT_FALSE(decode(root({}, "DovetailStudio"))->isFolderSync());
  EXPECT_FALSE(decode(dict({}))->isFolderSync());
  const auto odd = decode(dict({{"libraryKind", Value::integer(1)}}));
  EXPECT_FALSE(odd->isFolderSync());
  EXPECT_THROW(odd->libraryKind(), TypeError);
}

TEST(KXSTransportDecoder, ALaterItemReplacesAnEarlierOneButNotInTheOrder) {
  const auto snapshot = decode(throughFile(
      root({album("A", "first"), album("B", "b"), album("A", "second"), item("Asset", "x")})));
  EXPECT_THAT(orderOf(*snapshot), ElementsAre("A", "B", "A"));
  EXPECT_THAT(keysOf(*snapshot->albumsAndEventsByUUID()), ElementsAre("A", "B"));
  const auto* kept = snapshot->albumsAndEventsByUUID()->find("A");
  EXPECT_EQ(dynamic_cast<const KXSAlbum&>(**kept).name(), "second");
  EXPECT_EQ(*kept, (*snapshot->orderedAlbums())[2]);
}

TEST(KXSTransportDecoder, AssetsKeepTheirOrderAndTheLastOfEachIdentifier) {
  // Repetitions near and far, more and fewer than are inserted at once.
  for (const std::size_t count : {1U, 15U, 16U, 17U, 40U, 500U}) {
    Array updates;
    std::vector<std::string> expected;
    const auto asset = [](std::size_t number, std::string_view caption) {
      return dict({{"uuid", text("asset " + std::to_string(number))},
                   {"itemType", text("Asset")},
                   {"caption", text(caption)}});
    };
    for (std::size_t i = 0; i < count; ++i) {
      expected.push_back("asset " + std::to_string(i));
      updates.push_back(asset(i, "first"));
      if (i % 3 == 0) updates.push_back(asset(i, "again"));
      if (i % 3 == 1) updates.push_back(event("E" + std::to_string(i), "e"));
      if (i % 5 == 4) updates.push_back(asset(i / 2, "late"));
    }
    const Value source = root(std::move(updates));
    for (const Value& value :
         {source, throughFile(source), throughFile(source, PropertyListFormat::kXml)}) {
      const auto snapshot = decode(value);
      EXPECT_EQ(keysOf(*snapshot->assetsByUUID()), expected);
      for (const auto& entry : *snapshot->assetsByUUID()) {
        EXPECT_EQ(entry.value->uuid(), entry.key.stringValue());
        EXPECT_EQ(snapshot->assetsByUUID()->find(entry.key.stringValue()), &entry.value);
      }
      EXPECT_EQ((*snapshot->assetsByUUID()->find("asset 0"))->caption(), "again");
      if (count > 4) {
        EXPECT_EQ((*snapshot->assetsByUUID()->find("asset 2"))->caption(), "late");
      }
      EXPECT_EQ(snapshot->orderedAlbums()->size(), (count + 1) / 3);
    }
  }
}

TEST(KXSTransportDecoder, DeletesHoldItemsOfEveryKind) {
  const Value source = dict({{"deletes", list({item("Asset", "a"), item("Album", "b"),
                                               item("Event", "c"), item("Asset", "b")})}});
  const auto snapshot = decode(source);
  EXPECT_THAT(keysOf(*snapshot->deletes()), ElementsAre("a", "b", "c"));
  EXPECT_EQ((*snapshot->deletes()->find("b"))->_itemType(), "Asset");
  EXPECT_TRUE(snapshot->hasChangedObjects());
  EXPECT_TRUE(snapshot->assetsByUUID()->empty());
}

TEST(KXSTransportDecoder, AnUnknownItemTypeRaises) {
  Array unknown = {item("Folder", "f"), item("asset", "f"), dict({{"uuid", text("f")}}),
                   dict({{"uuid", text("f")}, {"itemType", Value::integer(1)}})};
  for (const Value& wrong : unknown) {
    for (const char* listKey : {"updates", "deletes"}) {
      const Value source = dict({{listKey, list({item("Asset", "a"), wrong})}});
      for (const Value& value : {source, throughFile(source)}) {
        try {
          decode(value);
          FAIL() << wrong.description();
        } catch (const UnknownObjectType& e) {
          EXPECT_STREQ(e.what(), "Unknown object type");
          EXPECT_STREQ(e.sourceFile(), "KXSTransportDecoder");
          EXPECT_EQ(e.line(), 137);
        }
      }
    }
  }
  EXPECT_THROW(decode(root({item("Folder", "f")})), InternalInconsistency);
}

TEST(KXSTransportDecoder, AnItemWithoutIdentifierRaises) {
  for (const char* type : {"Asset", "Album", "Event"}) {
    const Value anonymous = dict({{"itemType", text(type)}});
    EXPECT_EQ(KXSTransportDecoder::decoder()->_itemFromPropertyList(anonymous)->uuid(),
              std::nullopt);
    EXPECT_THROW(decode(root({anonymous})), InternalInconsistency);
    EXPECT_THROW(decode(throughFile(root({anonymous}))), InternalInconsistency);
    EXPECT_THROW(decode(dict({{"deletes", list({anonymous})}})), InternalInconsistency);
  }
}

TEST(KXSTransportDecoder, ListsAndItemsOfOtherTypesRaise) {
  EXPECT_THROW(decode(dict({{"updates", text("x")}})), TypeError);
  EXPECT_THROW(decode(dict({{"deletes", dict({})}})), TypeError);
  EXPECT_THROW(decode(throughFile(root({text("x")}))), TypeError);
  EXPECT_THROW(decode(root({dict({{"itemType", text("Asset")}, {"uuid", Value::integer(1)}})})),
               TypeError);
}

TEST(KXSTransportDecoder, ItemsAreBuiltByTheirType) {
  const auto decoder = KXSTransportDecoder::decoder();
  EXPECT_TRUE(
      std::dynamic_pointer_cast<KXSAlbum>(decoder->_itemFromPropertyList(item("Album", "u"))));
  EXPECT_TRUE(std::dynamic_pointer_cast<KXSAsset>(
      decoder->_itemFromPropertyList(throughFile(item("Asset", "u")))));
  EXPECT_TRUE(
      std::dynamic_pointer_cast<KXSEvent>(decoder->_itemFromPropertyList(item("Event", "u"))));
}

TEST(KXSTransportDecoder, AMissingExposureDateIsTheModificationDate) {
  const Value dated = dict(
      {{"uuid", text("a")}, {"itemType", text("Asset")}, {"modificationDate", Value::real(100.0)}});
  for (const Value& source : {root({dated}), throughFile(root({dated}))}) {
    const auto snapshot = decode(source);
    const KXSAssetPtr asset = *snapshot->assetsByUUID()->find("a");
    EXPECT_EQ(asset->exposureDate(), Number::real(100.0));
    EXPECT_EQ(asset->modificationDate(), Number::real(100.0));
  }
}

TEST(KXSTransportDecoder, ItemsOfManyLayoutsAreReadRight) {
  Array updates;
  const char* keys[] = {"caption", "eventUUID", "originalFileName"};
  for (int i = 0; i < 3000; ++i) {
    Dictionary entries;
    entries.set("key" + std::to_string(i % 1500), Value::integer(i));
    for (int k = 0; k < 3; ++k) {
      if ((i >> k & 1) != 0) entries.set(keys[(k + i) % 3], text(std::to_string(i)));
    }
    entries.set("uuid", text("asset" + std::to_string(i)));
    entries.set("itemType", text("Asset"));
    updates.push_back(Value::dictionary(std::move(entries)));
  }
  const auto snapshot = decode(throughFile(root(std::move(updates))));
  ASSERT_EQ(snapshot->assetsByUUID()->size(), 3000U);
  for (int i = 0; i < 3000; ++i) {
    const KXSAssetPtr* asset = snapshot->assetsByUUID()->find("asset" + std::to_string(i));
    ASSERT_NE(asset, nullptr);
    OptionalString fields[] = {(*asset)->caption(), (*asset)->eventUUID(),
                               (*asset)->originalFileName()};
    for (int k = 0; k < 3; ++k) {
      const bool isSet = (i >> k & 1) != 0;
      EXPECT_EQ(fields[(k + i) % 3], isSet ? OptionalString(std::to_string(i)) : std::nullopt);
    }
  }
}

TEST(KXSTransportDecoder, ContainersBeyondTheLimitAreRefused) {
  const Value one = throughFile(dict({{"updates", list({album("A", "a")})}}));
  Array updates(limits::kContainers, one["updates"].arrayValue()[0]);
  EXPECT_EQ(decode(root(updates))->orderedAlbums()->size(), limits::kContainers);
  updates.push_back(updates[0]);
  EXPECT_THROW(decode(root(std::move(updates))), InternalInconsistency);
}

TEST(KXSTransportDecoder, ReadsAFileOfEitherFormat) {
  const Value source = root({album("A", "a"), item("Asset", "x")});
  for (const auto format : {PropertyListFormat::kBinary, PropertyListFormat::kXml}) {
    InMemoryFileSystem files;
    ErrorPtr error;
    const auto bytes = writePropertyList(source, format, &error);
    ASSERT_TRUE(files.writeFileAtomically(kPath, bytes, &error));
    const auto snapshot =
        KXSTransportDecoder::decoder()->decodeSnapshotFromFile(files, kPath, &error);
    EXPECT_EQ(error, nullptr);
    EXPECT_EQ(snapshot->libraryUUID(), "library");
    EXPECT_EQ(snapshot->assetsByUUID()->size(), 1U);
    EXPECT_TRUE(snapshot->isEqualToSnapshot(snapshot));
  }
}

void expectEmptyWithError(FileSystem& files, PropertyListError code) {
  ErrorPtr error;
  const auto snapshot =
      KXSTransportDecoder::decoder()->decodeSnapshotFromFile(files, kPath, &error);
  ASSERT_TRUE(snapshot);
  EXPECT_EQ(snapshot->libraryUUID(), std::nullopt);
  EXPECT_EQ(snapshot->libraryKind(), std::nullopt);
  EXPECT_FALSE(snapshot->isFolderSync());
  EXPECT_TRUE(snapshot->assetsByUUID()->empty());
  EXPECT_TRUE(snapshot->albumsAndEventsByUUID()->empty());
  EXPECT_TRUE(snapshot->orderedAlbums()->empty());
  EXPECT_TRUE(snapshot->deletes()->empty());
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), "com.veltro.plist");
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(code));
  EXPECT_TRUE(KXSTransportDecoder::decoder()->decodeSnapshotFromFile(files, kPath, nullptr));
}

TEST(KXSTransportDecoder, AMissingFileLeavesTheErrorAndAnEmptySnapshot) {
  InMemoryFileSystem files;
  expectEmptyWithError(files, PropertyListError::kIo);
}

TEST(KXSTransportDecoder, AFileThatIsNoPropertyListLeavesTheReadersError) {
  InMemoryFileSystem files;
  files.putText(kPath, "not a property list");
  expectEmptyWithError(files, PropertyListError::kMagic);
}

}  // namespace
}  // namespace kx
