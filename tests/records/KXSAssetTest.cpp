#include "records/KXSAsset.h"

#include <gtest/gtest.h>

#include <thread>

#include "records/TesselDates.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/PropertyLists.h"

namespace kx {
namespace {

const char* const kX = "F0000000-0000-4000-8000-00000000000F";

Value face(Value index, const Value& rectangle) {
  return dict(
      {{"faceAlbumUUID", text("person")}, {"faceIndex", index}, {"faceRectangle", rectangle}});
}
Value rectangle(double x, double y, double width, double height) {
  return dict({{"X", Value::real(x)},
               {"Y", Value::real(y)},
               {"Width", Value::real(width)},
               {"Height", Value::real(height)}});
}

Value fullDictionary() {
  return dict({{"uuid", text(kX)},
               {"itemType", text("Asset")},
               {"userInfo", text("opaque")},
               {"rating", Value::integer(4)},
               {"isFlagged", Value::boolean(true)},
               {"caption", text("By the sea")},
               {"eventUUID", text("event")},
               {"adjustments", list({dict({{"rotation", Value::real(90)}})})},
               {"exposureDate", Value::real(3.4e9)},
               {"modificationDate", Value::real(3.5e9)},
               {"longitude", Value::real(13.5)},
               {"latitude", Value::real(-45.25)},
               {"originalFileName", text("IMG_1.JPG")},
               {"faces", list({face(Value::integer(1), rectangle(0.1, 0.2, 0.3, 0.4))})},
               {"isVideo", Value::boolean(true)},
               {"assetProperties", dict({{"imageProperties", dict({{"MQFileUTType", text("t")}})},
                                         {"fileProperties", dict({{"size", Value::integer(9)}})},
                                         {"fileName", text("a.jpg")}})}});
}

KXSAssetPtr assetOf(const Value& dictionary) { return KXSAsset::initFromPropertyList(dictionary); }

KXSAssetPtr located() { return assetOf(throughFile(fullDictionary())); }

TEST(KXSAsset, HasDefaults) {
  const KXSAssetPtr asset = KXSAsset::assetWithUUID(kX);
  EXPECT_EQ(asset->uuid(), kX);
  EXPECT_EQ(asset->rating(), Number::integer(0));
  EXPECT_EQ(asset->isFlagged(), Number::boolean(false));
  EXPECT_FALSE(asset->isVideo());
  EXPECT_EQ(asset->caption(), "");
  EXPECT_EQ(asset->eventUUID(), "");
  EXPECT_EQ(asset->adjustments()->size(), 0U);
  EXPECT_EQ(asset->exposureDate(), Number::real(0.0));
  EXPECT_EQ(asset->modificationDate(), Number::real(0.0));
  EXPECT_EQ(asset->longitude(), std::nullopt);
  EXPECT_EQ(asset->latitude(), std::nullopt);
  EXPECT_EQ(asset->originalFileName(), std::nullopt);
  EXPECT_EQ(asset->facesInfo()->size(), 0U);
  EXPECT_EQ(asset->properties(), nullptr);
  EXPECT_EQ(asset->hostInfo(), dict({}));
  EXPECT_TRUE(asset->userInfo().isNull());
  EXPECT_EQ(asset->_itemType(), "Asset");
  EXPECT_EQ(KXSAsset::asset()->uuid()->size(), 36U);
  EXPECT_NE(KXSAsset::asset()->uuid(), KXSAsset::init()->uuid());
}

TEST(KXSAsset, DecodedFromIdentifierAloneHasNullFields) {
  for (const Value& source :
       {dict({{"uuid", text(kX)}}), throughFile(dict({{"uuid", text(kX)}}))}) {
    const KXSAssetPtr asset = assetOf(source);
    EXPECT_EQ(asset->uuid(), kX);
    EXPECT_EQ(asset->rating(), std::nullopt);
    EXPECT_EQ(asset->isFlagged(), std::nullopt);
    EXPECT_FALSE(asset->isVideo());
    EXPECT_EQ(asset->caption(), std::nullopt);
    EXPECT_EQ(asset->eventUUID(), std::nullopt);
    EXPECT_FALSE(asset->adjustments());
    EXPECT_EQ(asset->exposureDate(), std::nullopt);
    EXPECT_EQ(asset->modificationDate(), std::nullopt);
    EXPECT_EQ(asset->longitude(), std::nullopt);
    EXPECT_EQ(asset->latitude(), std::nullopt);
    EXPECT_EQ(asset->originalFileName(), std::nullopt);
    EXPECT_FALSE(asset->facesInfo());
    EXPECT_EQ(asset->properties(), nullptr);
  }
}

TEST(KXSAsset, ReadsEveryFieldFromEveryKindOfDictionary) {
  for (const Value& source : {fullDictionary(), throughFile(fullDictionary()),
                              throughFile(fullDictionary(), PropertyListFormat::kXml)}) {
    const KXSAssetPtr asset = assetOf(source);
    EXPECT_EQ(asset->uuid(), kX);
    EXPECT_EQ(asset->userInfo(), text("opaque"));
    EXPECT_EQ(asset->rating(), Number::integer(4));
    EXPECT_EQ(asset->isFlagged(), Number::boolean(true));
    EXPECT_TRUE(asset->isVideo());
    EXPECT_EQ(asset->caption(), "By the sea");
    EXPECT_EQ(asset->eventUUID(), "event");
    EXPECT_EQ((*asset->adjustments())[0]["rotation"], Value::real(90));
    EXPECT_EQ(asset->exposureDate(), Number::real(3.4e9));
    EXPECT_EQ(asset->modificationDate(), Number::real(3.5e9));
    EXPECT_EQ(asset->longitude(), Number::real(13.5));
    EXPECT_EQ(asset->latitude(), Number::real(-45.25));
    EXPECT_EQ(asset->originalFileName(), "IMG_1.JPG");
    EXPECT_EQ(asset->facesInfo()->size(), 1U);
    ASSERT_TRUE(asset->properties());
    EXPECT_EQ(asset->properties()->fileName(), "a.jpg");
    EXPECT_EQ(asset->properties(), asset->properties());
    EXPECT_EQ(asset->propertyList(), fullDictionary());
  }
}

TEST(KXSAsset, ViewsOutliveTheValueThatWasDecoded) {
  KXSAssetPtr asset;
  {
    const Value source = throughFile(fullDictionary());
    asset = assetOf(source);
  }
  EXPECT_EQ(asset->caption(), "By the sea");
}

TEST(KXSAsset, ADictionaryTooLargeForPositionsIsReadAllTheSame) {
  Dictionary large;
  for (int i = 0; i < 300; ++i) large.set("other" + std::to_string(i), Value::integer(i));
  const DictionaryView view = fullDictionary().dictionaryValue();
  for (std::size_t i = 0; i < view.size(); ++i) large.set(view.keyAt(i), view.valueAt(i));
  large.remove("exposureDate");
  const KXSAssetPtr asset = assetOf(throughFile(Value::dictionary(std::move(large))));
  EXPECT_EQ(asset->caption(), "By the sea");
  EXPECT_EQ(asset->exposureDate(), Number::real(3.5e9));
  EXPECT_EQ(asset->properties()->fileName(), "a.jpg");
}

TEST(KXSAsset, ModificationDateStandsInForAMissingExposureDate) {
  for (const Value& source : {dict({{"modificationDate", Value::real(100.0)}}),
                              throughFile(dict({{"modificationDate", Value::real(100.0)}}))}) {
    const KXSAssetPtr asset = assetOf(source);
    EXPECT_EQ(asset->exposureDate(), Number::real(100.0));
    EXPECT_EQ(asset->modificationDate(), Number::real(100.0));
    EXPECT_EQ(asset->propertyList()["exposureDate"], Value::real(100.0));
    asset->setModificationDate(Value::real(200.0));
    EXPECT_EQ(asset->exposureDate(), Number::real(100.0));
  }
  const KXSAssetPtr exposed = assetOf(dict({{"exposureDate", Value::real(7.0)}}));
  EXPECT_EQ(exposed->exposureDate(), Number::real(7.0));
  EXPECT_EQ(exposed->modificationDate(), std::nullopt);
}

TEST(KXSAsset, PropertyListAlwaysSaysWhetherItIsAVideo) {
  const Value written = assetOf(dict({{"uuid", text(kX)}}))->propertyList();
  EXPECT_EQ(
      written,
      dict({{"uuid", text(kX)}, {"itemType", text("Asset")}, {"isVideo", Value::boolean(false)}}));
  EXPECT_EQ(written["isVideo"].numberValue().type(), Number::Type::kBoolean);
}

TEST(KXSAsset, PropertyListOfANewAssetHoldsTheDefaults) {
  EXPECT_EQ(KXSAsset::assetWithUUID(kX)->propertyList(),
            dict({{"uuid", text(kX)},
                  {"itemType", text("Asset")},
                  {"rating", Value::integer(0)},
                  {"isFlagged", Value::boolean(false)},
                  {"isVideo", Value::boolean(false)},
                  {"caption", text("")},
                  {"eventUUID", text("")},
                  {"adjustments", list({})},
                  {"exposureDate", Value::real(0.0)},
                  {"modificationDate", Value::real(0.0)},
                  {"faces", list({})}}));
}

TEST(KXSAsset, SettersReplaceWhatTheFileHeld) {
  const KXSAssetPtr asset = located();
  const KXSAssetPropertiesPtr before = asset->properties();
  asset->setCaption("new");
  asset->setIsVideo(false);
  asset->setLatitude(Value());
  EXPECT_EQ(asset->caption(), "new");
  EXPECT_FALSE(asset->isVideo());
  EXPECT_EQ(asset->latitude(), std::nullopt);
  EXPECT_EQ(asset->originalFileName(), "IMG_1.JPG");
  EXPECT_EQ(asset->properties(), before);
  const auto properties = KXSAssetProperties::assetProperties();
  asset->setProperties(properties);
  EXPECT_EQ(asset->properties(), properties);
  EXPECT_EQ(asset->propertyList()["assetProperties"], dict({}));
  asset->setProperties(nullptr);
  EXPECT_EQ(asset->properties(), nullptr);
  EXPECT_TRUE(asset->propertyList()["assetProperties"].isNull());
}

TEST(KXSAssetConcurrency, PropertiesAreOneObjectForEveryThread) {
  const KXSAssetPtr asset = located();
  KXSAssetPropertiesPtr seen[2];
  std::thread other([&] { seen[0] = asset->properties(); });
  seen[1] = asset->properties();
  other.join();
  EXPECT_EQ(seen[0], seen[1]);
  EXPECT_EQ(seen[0]->fileName(), "a.jpg");
}

TEST(KXSAsset, DescribesItself) {
  EXPECT_EQ(assetOf(dict({{"uuid", text(kX)}}))->description(),
            "Asset - (" + std::string(kX) +
                "), rating: (null), isFlagged: (null), isVideo:NO, caption: (null), eventUUID: "
                "(null), adjustments: (null), exposureDate: (null), modificationDate: (null), "
                "latitude: (null), longitude: (null), originalFileName: (null), facesInfo: (null)");
  const KXSAssetPtr asset = located();
  asset->setAdjustments(Value());
  asset->setFacesInfo(Value());
  EXPECT_EQ(asset->description(),
            "Asset - (" + std::string(kX) +
                "), rating: 4, isFlagged: 1, isVideo:YES, caption: By the sea, eventUUID: event, "
                "adjustments: (null), exposureDate: 3.4e+09, modificationDate: 3.5e+09, "
                "latitude: -45.25, longitude: 13.5, originalFileName: IMG_1.JPG, facesInfo: "
                "(null)");
}

TEST(KXSAssetEquivalence, SameAssetIsEquivalentAndNullIsNot) {
  const KXSAssetPtr nowhere = assetOf(dict({}));
  EXPECT_TRUE(nowhere->isEquivalentTo(nowhere));
  EXPECT_FALSE(nowhere->isEquivalentTo(static_cast<const KXSAsset*>(nullptr)));
}

TEST(KXSAssetEquivalence, CopiesWithALocationAreEquivalent) {
  EXPECT_TRUE(located()->isEquivalentTo(located()));
  EXPECT_TRUE(located()->isEquivalentTo(assetOf(fullDictionary())));
  EXPECT_TRUE(assetOf(fullDictionary())->isEquivalentTo(located()));
}

TEST(KXSAssetEquivalence, TwoAssetsWithoutLocationAreNotEquivalent) {
  const KXSAssetPtr first = located();
  const KXSAssetPtr second = located();
  for (const KXSAssetPtr& asset : {first, second}) {
    asset->setLatitude(Value());
    asset->setLongitude(Value());
  }
  EXPECT_FALSE(first->isEquivalentTo(second));
  for (const KXSAssetPtr& asset : {first, second}) asset->setLatitude(Value::real(1.0));
  EXPECT_FALSE(first->isEquivalentTo(second)) << "longitude still null in both";
  for (const KXSAssetPtr& asset : {first, second}) asset->setLongitude(Value::real(1.0));
  EXPECT_TRUE(first->isEquivalentTo(second));
  second->setLatitude(Value());
  EXPECT_FALSE(first->isEquivalentTo(second));
  EXPECT_FALSE(second->isEquivalentTo(first));
}

TEST(KXSAssetEquivalence, TwoNullDatesAreEqual) {
  const KXSAssetPtr first = located();
  const KXSAssetPtr second = located();
  first->setExposureDate(Value());
  EXPECT_FALSE(first->isEquivalentTo(second));
  EXPECT_FALSE(second->isEquivalentTo(first));
  second->setExposureDate(Value());
  EXPECT_TRUE(first->isEquivalentTo(second));
  first->setModificationDate(Value());
  EXPECT_FALSE(first->isEquivalentTo(second));
  second->setModificationDate(Value());
  EXPECT_TRUE(first->isEquivalentTo(second));
}

TEST(KXSAssetEquivalence, FileNamesFollowTheNullTolerantRule) {
  const KXSAssetPtr first = located();
  const KXSAssetPtr second = located();
  first->setOriginalFileName(std::nullopt);
  EXPECT_FALSE(first->isEquivalentTo(second));
  EXPECT_FALSE(second->isEquivalentTo(first));
  second->setOriginalFileName(std::nullopt);
  EXPECT_TRUE(first->isEquivalentTo(second));
  second->setOriginalFileName("");
  EXPECT_FALSE(first->isEquivalentTo(second));
}

TEST(KXSAssetEquivalence, FacesCountButAreNotCompared) {
  const KXSAssetPtr first = located();
  const KXSAssetPtr second = located();
  second->setFacesInfo(list({dict({})}));
  EXPECT_TRUE(first->isEquivalentTo(second));
  second->setFacesInfo(list({}));
  EXPECT_FALSE(first->isEquivalentTo(second));
  first->setFacesInfo(Value());
  EXPECT_TRUE(first->isEquivalentTo(second)) << "no list counts as an empty one";
}

TEST(KXSAssetEquivalence, OtherFieldsDoNotCount) {
  const KXSAssetPtr other = located();
  other->setRating(Value());
  other->setIsFlagged(Value::boolean(false));
  other->setIsVideo(false);
  other->setCaption("other");
  other->setEventUUID(std::nullopt);
  other->setAdjustments(list({}));
  other->setProperties(nullptr);
  other->setUuid("other");
  EXPECT_TRUE(located()->isEquivalentTo(other));
  other->setExposureDate(Value::real(3.4e9 + 0.001));
  EXPECT_FALSE(located()->isEquivalentTo(other));
}

TEST(KXSAssetEquivalence, ComparingWrongTypesNeverRaises) {
  const KXSAssetPtr wrong = assetOf(throughFile(dict({{"exposureDate", text("yesterday")},
                                                      {"modificationDate", Value::real(3.5e9)},
                                                      {"latitude", text("north")},
                                                      {"longitude", list({})},
                                                      {"faces", text("none")}})));
  EXPECT_FALSE(wrong->isEquivalentTo(located()));
  EXPECT_FALSE(located()->isEquivalentTo(wrong));
}

TEST(KXSFace, FacesComeInOrderEvenWithABadRectangle) {
  CapturedLog log;
  const KXSAssetPtr asset =
      assetOf(dict({{"faces", list({face(Value::integer(3), rectangle(0.5, 0.25, 0.125, 1)),
                                    face(Value::integer(1), text("no rectangle")),
                                    face(Value::integer(2), rectangle(0, 0, 1, 1))})}}));
  const auto faces = asset->getFacesArray();
  ASSERT_EQ(faces.size(), 3U);
  EXPECT_EQ(faces[0]->identifier(), 3);
  EXPECT_EQ(faces[0]->albumUUID(), "person");
  EXPECT_EQ(faces[0]->relativeRect(), (Rect{0.5, 0.25, 0.125, 1}));
  EXPECT_EQ(faces[1]->identifier(), 1);
  EXPECT_EQ(faces[1]->relativeRect(), Rect());
  EXPECT_EQ(faces[2]->identifier(), 2);
  EXPECT_EQ(log.lines(), "") << "not in the sync log";
  ASSERT_EQ(log.standardMessages().size(), 1U);
  EXPECT_EQ(log.standardMessages()[0],
            "[KXS] Unable to construct faceRect for faceInfo: " +
                face(Value::integer(1), text("no rectangle")).description());
}

TEST(KXSFace, KeysMayStandInAnyOrderAndBesideOthers) {
  const Value source = dict(
      {{"faces",
        list({dict({{"other", text("x")},
                    {"faceRectangle", dict({{"Height", Value::real(0.5)},
                                            {"Width", Value::integer(1)},
                                            {"Z", text("z")},
                                            {"Y", Value::real(0.25)},
                                            {"X", Value::boolean(true)}})},
                    {"faceIndex", Value::integer(7)},
                    {"faceAlbumUUID", text("person")}}),
              dict({{"faceRectangle", rectangle(0, 0, 1, 1)}, {"faceIndex", Value::real(2)}})})}});
  for (const Value& value :
       {source, throughFile(source), throughFile(source, PropertyListFormat::kXml)}) {
    const auto faces = assetOf(value)->getFacesArray();
    ASSERT_EQ(faces.size(), 2U);
    EXPECT_EQ(faces[0]->albumUUID(), "person");
    EXPECT_EQ(faces[0]->identifier(), 7);
    EXPECT_EQ(faces[0]->relativeRect(), (Rect{1, 0.25, 1, 0.5}));
    EXPECT_EQ(faces[1]->albumUUID(), std::nullopt);
    EXPECT_EQ(faces[1]->identifier(), 2);
    EXPECT_EQ(faces[1]->relativeRect(), (Rect{0, 0, 1, 1}));
  }
}

TEST(KXSFace, ARectangleThatIsNoneInAFileIsAllZero) {
  CapturedLog log;
  const Array wrong = {text("no rectangle"), list({}), dict({{"X", Value::real(1)}}),
                       dict({{"X", Value::real(1)},
                             {"Y", text("2")},
                             {"Width", Value::real(3)},
                             {"Height", Value::real(4)}})};
  for (const Value& value : wrong) {
    const KXSAssetPtr asset =
        assetOf(throughFile(dict({{"faces", list({face(Value::integer(1), value)})}})));
    EXPECT_EQ(asset->getFacesArray().at(0)->relativeRect(), Rect());
  }
  EXPECT_EQ(log.standardMessages().size(), wrong.size());
}

TEST(KXSFace, NoListOfFacesGivesNoFaces) {
  EXPECT_TRUE(assetOf(dict({}))->getFacesArray().empty());
  EXPECT_TRUE(KXSAsset::asset()->getFacesArray().empty());
}

TEST(KXSFace, MissingFieldsGiveZeroAndNull) {
  CapturedLog log;
  const KXSFacePtr face = KXSFace::initWithFaceInfo(dict({}));
  EXPECT_EQ(face->identifier(), 0);
  EXPECT_EQ(face->albumUUID(), std::nullopt);
  EXPECT_EQ(face->relativeRect(), Rect());
  EXPECT_EQ(log.standardMessages().size(), 1U);
}

TEST(KXSFace, IdentifierKeepsSixteenBits) {
  CapturedLog log;
  const auto identifier = [](Value index) {
    return KXSFace::initWithFaceInfo(face(index, rectangle(0, 0, 1, 1)))->identifier();
  };
  EXPECT_EQ(identifier(Value::integer(32767)), 32767);
  EXPECT_EQ(identifier(Value::integer(32768)), -32768);
  EXPECT_EQ(identifier(Value::integer(65536 + 5)), 5);
  EXPECT_EQ(identifier(Value::integer(-1)), -1);
  EXPECT_EQ(identifier(Value::real(2.9)), 2);
}

TEST(TesselDates, HostTimeStartsIn1904) {
  EXPECT_EQ(dateWithTesselTimeInterval(3061152000.0), Date{0.0});
  EXPECT_EQ(dateWithTesselTimeInterval(3061152000.0).description(), "2001-01-01 00:00:00 +0000");
  EXPECT_EQ(dateWithTesselTimeInterval(0.0).description(), "1904-01-01 00:00:00 +0000");
  EXPECT_EQ(dateWithTesselTimeInterval(3061152000.25), Date{0.25});
  EXPECT_EQ(kTesselEpochOffsetSeconds, 35430.0 * 86400.0);
}

}  // namespace
}  // namespace kx
