#include "daemon/SnapshotChecker.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "daemon/SyncRunner.h"
#include "platform/foundation/PropertyList.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

using testing::HasSubstr;

const Value kText = Value::string("text");
const Value kNumber = Value::integer(7);
const Value kNan = Value::real(std::nan(""));

struct Refused {
  std::string name;
  Value root;
  std::string text;
};

Value face(const std::map<std::string, Value>& fields) {
  Dictionary face;
  for (const auto& [key, value] : fields) face.set(key, value);
  return Value::dictionary(std::move(face));
}

Value rectangle(const Value& x) {
  return face({{"X", x}, {"Y", kNumber}, {"Width", kNumber}, {"Height", kNumber}});
}

Value withItem(const std::map<std::string, Value>& fields) {
  return snapshotRoot({assetItem("A0"), assetItem("A1", fields)});
}

std::string refusalOf(const DataPtr& bytes) {
  ErrorPtr error;
  const auto checked = checkSnapshot(bytes, &error);
  EXPECT_FALSE(checked.has_value());
  return error ? error->message() : "no error";
}

class SnapshotRefusalTest : public testing::TestWithParam<Refused> {};

TEST_P(SnapshotRefusalTest, NamesPlaceExpectedAndFound) {
  // Both forms, since a binary file's keys are recognised by object and an XML file's by text.
  ErrorPtr error;
  EXPECT_THAT(refusalOf(plistBytes(GetParam().root)), HasSubstr(GetParam().text));
  auto xml = writePropertyList(GetParam().root, PropertyListFormat::kXml, &error);
  if (error) return;  // no XML text for it: a number that is not finite
  EXPECT_THAT(refusalOf(std::make_shared<const Data>(std::move(xml))), HasSubstr(GetParam().text));
}

std::vector<Refused> wrongTypes() {
  const std::string in = "in updates[1] (A1): wrong type under ";
  std::vector<Refused> rows;
  for (const char* key : {"caption", "eventUUID", "originalFileName"}) {
    rows.push_back(
        {key, withItem({{key, kNumber}}), in + "\"" + key + "\": expected string, found number"});
  }
  for (const char* key : {"rating", "isFlagged", "isVideo", "exposureDate", "modificationDate",
                          "longitude", "latitude"}) {
    rows.push_back(
        {key, withItem({{key, kText}}), in + "\"" + key + "\": expected number, found string"});
  }
  rows.push_back({"adjustments", withItem({{"adjustments", kText}}),
                  in + "\"adjustments\": expected array, found string"});
  rows.push_back({"assetProperties", withItem({{"assetProperties", kText}}),
                  in + "\"assetProperties\": expected dictionary, found string"});
  rows.push_back(
      {"faces", withItem({{"faces", kText}}), in + "\"faces\": expected array, found string"});
  rows.push_back({"face", withItem({{"faces", Value::array({kText})}}),
                  in + "\"faces\": expected array of dictionaries, found string"});
  const auto oneFace = [](const std::map<std::string, Value>& fields) {
    return withItem({{"faces", Value::array({face(fields)})}});
  };
  rows.push_back({"faceAlbumUUID", oneFace({{"faceAlbumUUID", kNumber}}),
                  in + "\"faceAlbumUUID\": expected string, found number"});
  rows.push_back({"faceIndex", oneFace({{"faceIndex", kText}}),
                  in + "\"faceIndex\": expected number, found string"});
  rows.push_back({"faceRectangle", oneFace({{"faceRectangle", kText}}),
                  in + "\"faceRectangle\": expected dictionary, found string"});
  rows.push_back({"X", oneFace({{"faceRectangle", rectangle(kText)}}),
                  in + "\"X\": expected number, found string"});
  return rows;
}

std::vector<Refused> wrongContainersAndRoots() {
  const auto album = [](const char* key, const Value& value) {
    Dictionary item(albumItem("B0").dictionaryValue());
    item.set(key, value);
    return snapshotRoot({Value::dictionary(std::move(item))});
  };
  const std::string in = "in updates[0] (B0): wrong type under ";
  return {
      {"albumName", album("albumName", kNumber), in + "\"albumName\": expected string"},
      {"eventName", album("eventName", kNumber), in + "\"eventName\": expected string"},
      {"parentUUID", album("parentUUID", kNumber), in + "\"parentUUID\": expected string"},
      {"keyAssetUUID", album("keyAssetUUID", kNumber), in + "\"keyAssetUUID\": expected string"},
      {"subclass", album("subclass", kText), in + "\"subclass\": expected number"},
      {"keyAssetFaceIndex", album("keyAssetFaceIndex", kText),
       in + "\"keyAssetFaceIndex\": expected number"},
      {"assetUUIDs", album("assetUUIDs", kText), in + "\"assetUUIDs\": expected array"},
      {"member", album("assetUUIDs", Value::array({kText, kNumber})),
       in + "\"assetUUIDs\": expected array of strings, found number"},
      {"rootKind", Value::array({}), "its root is no dictionary but array"},
      {"libraryUUID", snapshotRoot({}, {{"libraryUUID", kNumber}}),
       "in the root: wrong type under \"libraryUUID\": expected string, found number"},
      {"noLibraryUUID", Value::dictionary(Dictionary{{"updates", Value::array({})}}),
       "it has no \"libraryUUID\""},
      {"libraryKind", snapshotRoot({}, {{"libraryKind", kNumber}}), "\"libraryKind\""},
      {"userAgent", snapshotRoot({}, {{"TesselUserAgent", kNumber}}), "\"TesselUserAgent\""},
      {"updates", snapshotRoot({}, {{"updates", kText}}),
       "\"updates\": expected array, found string"},
      {"deletes", snapshotRoot({}, {{"deletes", kText}}),
       "\"deletes\": expected array, found string"},
      {"deletedItem", snapshotRoot({}, {{"deletes", Value::array({kText})}}),
       "in deletes[0]: expected dictionary, found string"},
      {"item", snapshotRoot({kText}), "in updates[0]: expected dictionary, found string"},
      {"folder", snapshotRoot({assetItem("A", {{"itemType", Value::string("Folder")}})}),
       "unknown \"itemType\" \"Folder\""},
      {"noType", snapshotRoot({Value::dictionary(Dictionary{{"uuid", kText}})}),
       "it has no \"itemType\""},
      {"noUuid",
       snapshotRoot({Value::dictionary(Dictionary{{"itemType", Value::string("Event")}})}),
       "in updates[0]: it has no \"uuid\""},
      {"uuid", withItem({{"uuid", kNumber}}), "\"uuid\": expected string, found number"},
  };
}

std::vector<Refused> notFinite() {
  std::vector<Refused> rows;
  int index = 0;
  for (const Value& value : {kNan, Value::real(std::numeric_limits<double>::infinity()),
                             Value(Number::real32(-std::numeric_limits<float>::infinity()))}) {
    const std::string suffix = std::to_string(index++);
    for (const char* key : {"exposureDate", "modificationDate", "longitude", "latitude"}) {
      rows.push_back(
          {key + suffix, withItem({{key, value}}),
           "in updates[1] (A1): the number under \"" + std::string(key) + "\" is not finite"});
    }
    rows.push_back(
        {"X" + suffix,
         withItem({{"faces", Value::array({face({{"faceRectangle", rectangle(value)}})})}}),
         "the number under \"X\" is not finite"});
  }
  return rows;
}

std::string rowName(const testing::TestParamInfo<Refused>& info) { return info.param.name; }
INSTANTIATE_TEST_SUITE_P(Types, SnapshotRefusalTest, testing::ValuesIn(wrongTypes()), rowName);
INSTANTIATE_TEST_SUITE_P(Roots, SnapshotRefusalTest, testing::ValuesIn(wrongContainersAndRoots()),
                         rowName);
INSTANTIATE_TEST_SUITE_P(Numbers, SnapshotRefusalTest, testing::ValuesIn(notFinite()), rowName);

TEST(SnapshotCheckerTest, KeepsTheReadersOwnError) {
  ErrorPtr error;
  const std::string junk = "this is no property list, but it is long enough for a trailer to fit";
  EXPECT_FALSE(checkSnapshot(std::make_shared<const Data>(junk.data(), junk.size()), &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), kPropertyListErrorDomain);
  EXPECT_THAT(error->message(), HasSubstr("the host's snapshot is no property list"));
}

TEST(SnapshotCheckerTest, ListsIdentifiersOnceAndLeavesOutEmptyOnes) {
  const Value root =
      snapshotRoot({albumItem("B1", {"A1", "unknown"}), assetItem("A1"), assetItem(""),
                    assetItem("A1"), assetItem("\xc3\xa4sset"), albumItem("B1")});
  ErrorPtr error;
  const auto checked = checkSnapshot(plistBytes(root), &error);
  ASSERT_TRUE(checked) << error->description();
  EXPECT_EQ(checked->libraryUUID, "11111111-1111-1111-1111-111111111111");
  EXPECT_THAT(checked->assetUUIDs.texts(), testing::ElementsAre("A1", "\xc3\xa4sset"));
  EXPECT_THAT(checked->containerUUIDs, testing::ElementsAre("B1", "B1"));
}

TEST(SnapshotCheckerTest, TakesWhatIsOddButCanBeSynced) {
  Dictionary event{{"uuid", Value::string("E")},
                   {"itemType", Value::string("Event")},
                   {"parentUUID", Value::string("E")},
                   {"userInfo", Value::data({})}};
  const Value root = snapshotRoot(
      {Value::dictionary(std::move(event)),
       assetItem("A", {{"unheard of", kText},
                       {"faces", Value::array({face({{"faceRectangle", face({{"X", kNumber}})}})})},
                       {"exposureDate", Value::integer(0)}})});
  ErrorPtr error;
  EXPECT_TRUE(checkSnapshot(plistBytes(root), &error)) << error->description();
}

TEST(SnapshotCheckerTest, EscapesControlCharactersOfAnIdentifier) {
  EXPECT_THAT(refusalOf(plistBytes(snapshotRoot(
                  {assetItem("\x1b[31m\nB", {{"caption", kNumber}, {"zzz", kText}})}))),
              testing::AllOf(testing::Not(HasSubstr("\x1b")), testing::Not(HasSubstr("\n"))));
}

}  // namespace
}  // namespace kx::test
