#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <regex>
#include <set>

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyList.h"
#include "platform/library/KXPhotoLibrary.h"
#include "platform/library/KXSyncSaveJob.h"
#include "platform/sync/FRAsset.h"
#include "platform/sync/FRClient.h"

namespace kx {
namespace {

TEST(CanUseCoordinate, RefusesExactlyTheUnusable) {
  const double inf = std::numeric_limits<double>::infinity();
  const double nan = std::numeric_limits<double>::quiet_NaN();
  EXPECT_FALSE(canUseCoordinate(std::nullopt));
  EXPECT_FALSE(canUseCoordinate(Coordinate{0, 0}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{-0.0, 0}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{std::nextafter(90.0, 91.0), 0}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{-90.1, 0}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{0, std::nextafter(180.0, 181.0)}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{0, -180.1}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{nan, 1}));
  EXPECT_FALSE(canUseCoordinate(Coordinate{1, inf}));
  EXPECT_TRUE(canUseCoordinate(Coordinate{90, 180}));
  EXPECT_TRUE(canUseCoordinate(Coordinate{-90, -180}));
  EXPECT_TRUE(canUseCoordinate(Coordinate{0, 0.5}));
  EXPECT_TRUE(canUseCoordinate(Coordinate{1e-300, 0}));
}

TEST(UUIDStringTest, MakesDistinctVersionFourTexts) {
  const std::regex form("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}");
  std::set<std::string> seen;
  for (int i = 0; i < 1000; ++i) {
    const std::string text = UUIDString();
    EXPECT_TRUE(std::regex_match(text, form)) << text;
    EXPECT_TRUE(seen.insert(text).second) << text;
  }
}

KXSyncSaveJob::Fields roundTrip(const KXSyncSaveJob& job) {
  ErrorPtr error;
  const auto fields = KXSyncSaveJob::fieldsFromSerializedData(job.serializedData(), &error);
  if (!fields) throw std::runtime_error(error ? error->description() : "no fields, no error");
  return *fields;
}

TEST(KXSyncSaveJobTest, EveryFieldSurvivesSerialisationBitForBit) {
  KXSyncSaveJob job;
  job.setOriginalAssetURL("/var/mobile/Media/Staging/1");
  job.setIsVideo(true);
  job.setUuid("U");
  job.setLocation({0.1, -179.99999999999997});
  Dictionary face;
  face.set("faceIndex", Value::integer(3));
  job.setFacesInfo(Value::array({Value::dictionary(face)}));
  job.setCreationDate(Date{0.1 + 0.2});
  job.setModificationDate(Date{-3061152000.0});
  job.setSortToken(5e-324);
  job.setOriginalFileName("");
  job.setAlbumURIs({"b", "a"});
  const KXSyncSaveJob::Fields fields = roundTrip(job);
  EXPECT_EQ(fields.originalAssetPath, "/var/mobile/Media/Staging/1");
  EXPECT_TRUE(fields.isVideo);
  EXPECT_EQ(fields.uuid, "U");
  EXPECT_EQ(fields.location, (Coordinate{0.1, -179.99999999999997}));
  EXPECT_EQ(fields.facesInfo, job.fields().facesInfo);
  EXPECT_EQ(fields.creationDate, Date{0.1 + 0.2});
  EXPECT_EQ(fields.modificationDate, Date{-3061152000.0});
  EXPECT_EQ(fields.sortToken, 5e-324);
  EXPECT_EQ(fields.originalFileName, "");
  EXPECT_EQ(fields.albumURIs, (std::vector<std::string>{"b", "a"}));
  EXPECT_FALSE(fields.isSyncComplete);
  EXPECT_FALSE(fields.cleanupSyncState);
  EXPECT_EQ(fields.cleanupBeforeDate, std::nullopt);
}

TEST(KXSyncSaveJobTest, FieldsNeverSetComeBackNull) {
  KXSyncSaveJob job;
  job.setCleanupSyncState(true);
  job.setCleanupBeforeDate(Date{1.5});
  const KXSyncSaveJob::Fields fields = roundTrip(job);
  EXPECT_TRUE(fields.cleanupSyncState);
  EXPECT_EQ(fields.cleanupBeforeDate, Date{1.5});
  EXPECT_EQ(fields.uuid, std::nullopt);
  EXPECT_EQ(fields.originalAssetPath, std::nullopt);
  EXPECT_EQ(fields.location, std::nullopt);
  EXPECT_TRUE(fields.facesInfo.isNull());
  EXPECT_EQ(fields.sortToken, std::nullopt);
  EXPECT_EQ(fields.originalFileName, std::nullopt);
  EXPECT_EQ(fields.albumURIs, std::nullopt);
}

TEST(KXSyncSaveJobTest, BytesThatAreNoJobGiveAnErrorThatNamesTheField) {
  ErrorPtr error;
  Dictionary root;
  root.set("uuid", Value::integer(1));
  const auto bytes = std::make_shared<Data>(
      writePropertyList(Value::dictionary(root), PropertyListFormat::kBinary, nullptr));
  EXPECT_FALSE(KXSyncSaveJob::fieldsFromSerializedData(bytes, &error));
  ASSERT_TRUE(error);
  EXPECT_NE(error->message().find("\"uuid\": expected string, found number"), std::string::npos)
      << error->message();
  error = nullptr;
  const std::string junk = "no property list";
  EXPECT_FALSE(KXSyncSaveJob::fieldsFromSerializedData(
      std::make_shared<Data>(junk.data(), junk.size()), &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain(), kPropertyListErrorDomain);
}

TEST(FRAssetTest, DescribesItselfWithNulls) {
  const FRAssetPtr asset = FRAsset::downloadAssetWithIdentifier("U", "Photo", std::nullopt);
  EXPECT_EQ(asset->description(), "<FRAsset: U (Photo), name: (null), path: (null)>");
  EXPECT_TRUE(asset->isDownload());
  EXPECT_FALSE(asset->isRestore());
  asset->setIsRestore(true);
  asset->setPath("/p");
  EXPECT_EQ(asset->description(), "<FRAsset: U (Photo), name: (null), path: /p, restore>");
  EXPECT_FALSE(FRAsset::uploadAssetWithIdentifier("U", "Photo", "n")->isDownload());
}

TEST(FRClientTest, CallingAnAbsentOperationRaises) {
  class Bare final : public FRClient {
   public:
    bool respondsTo(FROperation) const override { return false; }
  };
  Bare client;
  EXPECT_THROW(client.clearSyncData(), InternalInconsistency);
  EXPECT_THROW(client.prepareForBackup(), InternalInconsistency);
  EXPECT_THROW(static_cast<void>(client.currentSyncAnchor()), InternalInconsistency);
}

}  // namespace
}  // namespace kx
