#include "records/KXSAssetProperties.h"

#include <gtest/gtest.h>

#include "records/KXSImageAdjustment.h"
#include "tests/support/PropertyLists.h"

namespace kx {
namespace {

// Answers every file with the same source.
class FixedImageReader final : public ImageReader {
 public:
  Source open(const std::string& path) override {
    opened = path;
    return source;
  }
  Value fileAttributes(const std::string& path) override {
    attributesOf = path;
    return attributes;
  }
  Source source;
  Value attributes;
  std::string opened;
  std::string attributesOf;
};

TEST(KXSAssetProperties, NewRecordIsEmpty) {
  const auto properties = KXSAssetProperties::assetProperties();
  EXPECT_TRUE(properties->imageProperties().isNull());
  EXPECT_TRUE(properties->fileSystemProperties().isNull());
  EXPECT_EQ(properties->fileName(), std::nullopt);
  EXPECT_EQ(properties->propertyList(), dict({}));
}

TEST(KXSAssetProperties, ReadsImageAttributesAndName) {
  FixedImageReader reader;
  reader.source = {true, dict({{"PixelWidth", Value::integer(640)}}), "image/jpeg"};
  reader.attributes = dict({{"size", Value::integer(1234)}});
  const auto properties = KXSAssetProperties::assetProperties();
  ErrorPtr error;
  EXPECT_TRUE(properties->readPropertiesFromAssetURL(reader, "/var/mobile/Media/a/b.jpg", &error));
  EXPECT_EQ(reader.opened, "/var/mobile/Media/a/b.jpg");
  EXPECT_EQ(reader.attributesOf, "/var/mobile/Media/a/b.jpg");
  EXPECT_EQ(properties->imageProperties(),
            dict({{"PixelWidth", Value::integer(640)}, {"MQFileUTType", text("image/jpeg")}}));
  EXPECT_EQ(properties->fileSystemProperties(), reader.attributes);
  EXPECT_EQ(properties->fileName(), "b.jpg");
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(reader.source.properties, dict({{"PixelWidth", Value::integer(640)}}))
      << "the reader's own dictionary is left alone";
}

TEST(KXSAssetProperties, AFileThatIsNoImageChangesNothing) {
  FixedImageReader reader;
  const auto properties = KXSAssetProperties::assetProperties();
  properties->setFileName("before");
  ErrorPtr error;
  EXPECT_FALSE(properties->readPropertiesFromAssetURL(reader, "/a.txt", &error));
  reader.source.isImage = true;  // but without properties
  EXPECT_FALSE(properties->readPropertiesFromAssetURL(reader, "/a.txt", &error));
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(properties->fileName(), "before");
  EXPECT_TRUE(properties->imageProperties().isNull());
}

TEST(KXSAssetProperties, UnreadableAttributesStayNull) {
  FixedImageReader reader;
  reader.source = {true, dict({}), "image/png"};
  const auto properties = KXSAssetProperties::assetProperties();
  EXPECT_TRUE(properties->readPropertiesFromAssetURL(reader, "/a.png", nullptr));
  EXPECT_TRUE(properties->fileSystemProperties().isNull());
  EXPECT_EQ(properties->propertyList(),
            dict({{"imageProperties", dict({{"MQFileUTType", text("image/png")}})},
                  {"fileName", text("a.png")}}));
}

TEST(KXSAssetProperties, PropertyListComesBack) {
  const Value form = dict({{"imageProperties", dict({{"a", Value::real(0.5)}})},
                           {"fileProperties", dict({{"b", texts({"c"})}})},
                           {"fileName", text("n")}});
  EXPECT_EQ(KXSAssetProperties::initFromPropertyList(throughFile(form))->propertyList(), form);
  EXPECT_EQ(KXSAssetProperties::initFromPropertyList(Value())->propertyList(), dict({}));
}

TEST(KXSImageAdjustment, HasARotation) {
  const auto adjustment = KXSImageAdjustment::imageAdjustment();
  EXPECT_EQ(adjustment->rotation(), Number::real(0.0));
  EXPECT_EQ(adjustment->description(), "rotation: 0");
  adjustment->setRotation(Value::integer(90));
  EXPECT_EQ(adjustment->description(), "rotation: 90");
  adjustment->setRotation(Value());
  EXPECT_EQ(adjustment->description(), "rotation: (null)");
}

}  // namespace
}  // namespace kx
