#include <gtest/gtest.h>

#include <functional>

#include "platform/foundation/Exceptions.h"
#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"
#include "records/KXSFolder.h"
#include "records/KXSImageAdjustment.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/PropertyLists.h"

namespace kx {
namespace {

// One field under a key whose value has a wrong type, and the call that needs it.
struct WrongField {
  const char* key;
  const char* expected;
  std::function<void(const Value& dictionary)> read;
};

template <typename Record>
WrongField field(const char* key, const char* expected, std::function<void(const Record&)> use) {
  return {key, expected,
          [use](const Value& source) { use(*Record::initFromPropertyList(source)); }};
}

std::string messageOf(const std::function<void()>& call) {
  try {
    call();
  } catch (const TypeError& e) {
    return e.what();
  }
  return "nothing raised";
}

// Decoding must pass; the accessor must name key, expected and found type.
void expectTypeErrors(const std::vector<WrongField>& fields) {
  for (const WrongField& wrong : fields) {
    const bool wantsString = std::string(wrong.expected) == "string";
    const Value value = wantsString ? Value::integer(5) : text("five");
    const Value dictionary = dict({{wrong.key, value}});
    for (const Value& source :
         {dictionary, throughFile(dictionary), throughFile(dictionary, PropertyListFormat::kXml)}) {
      EXPECT_EQ(messageOf([&] { wrong.read(source); }),
                std::string("wrong type under \"") + wrong.key + "\": expected " + wrong.expected +
                    ", found " + (wantsString ? "number" : "string"));
    }
  }
}

TEST(WrongTypes, OfAlbumFieldsSurfaceInTheAccessor) {
  using A = KXSAlbum;
  expectTypeErrors({
      field<A>("uuid", "string", [](const A& a) { a.uuid(); }),
      field<A>("uuid", "string", [](const A& a) { a.uuidValue(); }),
      field<A>("albumName", "string", [](const A& a) { a.name(); }),
      field<A>("assetUUIDs", "array", [](const A& a) { a.assetUUIDs(); }),
      field<A>("parentUUID", "string", [](const A& a) { a.parentUUID(); }),
      field<A>("subclass", "number", [](const A& a) { a.albumSubclass(); }),
      field<A>("keyAssetFaceIndex", "number", [](const A& a) { a.albumKeyAssetFaceIndex(); }),
      field<A>("keyAssetUUID", "string", [](const A& a) { a.keyAssetUUID(); }),
  });
}

TEST(WrongTypes, OfEventAndFolderFieldsSurfaceInTheAccessor) {
  using E = KXSEvent;
  using F = KXSFolder;
  expectTypeErrors({
      field<E>("eventName", "string", [](const E& e) { e.name(); }),
      field<E>("parentUUID", "string", [](const E& e) { e.parentUUID(); }),
      field<E>("keyAssetUUID", "string", [](const E& e) { e.keyAssetUUID(); }),
      field<F>("KXSFolderNameKey", "string", [](const F& f) { f.name(); }),
      field<F>("KXSFolderParentUuidKey", "string", [](const F& f) { f.parentUUID(); }),
  });
}

TEST(WrongTypes, OfAssetFieldsSurfaceInTheAccessor) {
  using A = KXSAsset;
  expectTypeErrors({
      field<A>("rating", "number", [](const A& a) { a.rating(); }),
      field<A>("isFlagged", "number", [](const A& a) { a.isFlagged(); }),
      field<A>("isVideo", "number", [](const A& a) { a.isVideo(); }),
      field<A>("caption", "string", [](const A& a) { a.caption(); }),
      field<A>("eventUUID", "string", [](const A& a) { a.eventUUID(); }),
      field<A>("adjustments", "array", [](const A& a) { a.adjustments(); }),
      field<A>("exposureDate", "number", [](const A& a) { a.exposureDate(); }),
      field<A>("modificationDate", "number", [](const A& a) { a.modificationDate(); }),
      field<A>("modificationDate", "number", [](const A& a) { a.exposureDate(); }),
      field<A>("longitude", "number", [](const A& a) { a.longitude(); }),
      field<A>("latitude", "number", [](const A& a) { a.latitude(); }),
      field<A>("originalFileName", "string", [](const A& a) { a.originalFileName(); }),
      field<A>("faces", "array", [](const A& a) { a.facesInfo(); }),
      field<A>("faces", "array", [](const A& a) { a.getFacesArray(); }),
      field<A>("assetProperties", "dictionary", [](const A& a) { a.properties(); }),
  });
}

TEST(WrongTypes, OfAssetPropertiesSurfaceInTheAccessor) {
  using P = KXSAssetProperties;
  expectTypeErrors({
      field<P>("imageProperties", "dictionary", [](const P& p) { p.imageProperties(); }),
      field<P>("fileProperties", "dictionary", [](const P& p) { p.fileSystemProperties(); }),
      field<P>("fileName", "string", [](const P& p) { p.fileName(); }),
  });
}

TEST(WrongTypes, OfFacesSurfaceWhereTheyAreUsed) {
  CapturedLog log;
  EXPECT_EQ(messageOf([] {
              KXSFace::initWithFaceInfo(dict({{"faceIndex", text("1")}}));
            }),
            "wrong type under \"faceIndex\": expected number, found string");
  EXPECT_EQ(messageOf([] { KXSFace::initWithFaceInfo(text("face")); }),
            "wrong type under \"faces\": expected dictionary, found string");
  const KXSFacePtr face = KXSFace::initWithFaceInfo(dict({{"faceAlbumUUID", list({})}}));
  EXPECT_EQ(messageOf([&] { face->albumUUID(); }),
            "wrong type under \"faceAlbumUUID\": expected string, found array");
}

TEST(WrongTypes, OfAdjustmentsSurfaceInTheAccessor) {
  const auto adjustment = KXSImageAdjustment::imageAdjustment();
  adjustment->setRotation(text("left"));
  EXPECT_EQ(messageOf([&] { adjustment->rotation(); }),
            "wrong type under \"rotation\": expected number, found string");
}

TEST(WrongTypes, AreKeptAndWrittenAgain) {
  const Value dictionary =
      dict({{"uuid", text("u")}, {"itemType", text("Album")}, {"albumName", Value::integer(5)}});
  EXPECT_EQ(KXSAlbum::initFromPropertyList(dictionary)->propertyList(), dictionary);
}

TEST(WrongTypes, OfSetFieldsSurfaceToo) {
  const KXSAlbumPtr album = KXSAlbum::album();
  album->setAlbumSubclass(text("five"));
  EXPECT_EQ(messageOf([&] { album->albumSubclass(); }),
            "wrong type under \"subclass\": expected number, found string");
}

TEST(WrongTypes, ARecordThatIsNoDictionaryIsRefused) {
  EXPECT_EQ(messageOf([] { KXSAsset::initFromPropertyList(list({})); }),
            "wrong type under \"item\": expected dictionary, found array");
}

}  // namespace
}  // namespace kx
