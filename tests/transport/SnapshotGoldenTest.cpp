#include <gtest/gtest.h>

#include <fstream>
#include <sstream>

#include "tests/support/PropertyLists.h"
#include "transport/KXSTransportDecoder.h"
#include "transport/KXSTransportEncoder.h"

namespace kx {
namespace {

// The example of docs/formats/snapshot.md.
constexpr const char* kExample =
    "62706c6973743030d4010203040506071b5b6c696272617279555549445b6c6962726172794b696e"
    "6457757064617465735764656c65746573514c57436173736f636ba20814d5090a0b0c0d0e0f1011"
    "135475756964586974656d5479706559616c62756d4e616d655a6173736574555549447358737562"
    "636c617373514255416c62756d5454726970a11251411000d5090a1516171218191a1a5769735669"
    "64656f5c6578706f73757265446174655f10106d6f64696669636174696f6e446174655541737365"
    "74092341e6ceaf20100000a008111d2931393b434651565f69747d7f858a8c8e909ba3b0c3c9cad3"
    "0000000000000101000000000000001c000000000000000000000000000000d4";

KXSLibraryChangeSnapshotPtr example() {
  const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
  snapshot->setLibraryUUID("L");
  snapshot->setLibraryKind("Cassock");
  const KXSAlbumPtr album = KXSAlbum::albumWithUUID("B");
  album->setName("Trip");
  album->setAssetUUIDs(texts({"A"}));
  snapshot->updates()->set("B", album);
  const Value video = dict({{"uuid", text("A")},
                            {"isVideo", Value::boolean(true)},
                            {"modificationDate", Value::real(3061152000.5)}});
  snapshot->updates()->set("A", KXSAsset::initFromPropertyList(video));
  return snapshot;
}

TEST(SnapshotGolden, EncodesToTheVeryBytes) {
  ErrorPtr error;
  const Value root = KXSTransportEncoder::encoder()->encodeSnapshot(*example(), &error);
  EXPECT_EQ(hexOf(writePropertyList(root, PropertyListFormat::kBinary, &error)), kExample);
  EXPECT_EQ(error, nullptr);
}

TEST(SnapshotGolden, DecodesFromTheVeryBytes) {
  ErrorPtr error;
  const Value root = readPropertyList(std::make_shared<const Data>(bytesOfHex(kExample)), &error);
  ASSERT_EQ(error, nullptr);
  const auto snapshot =
      KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, &error);
  EXPECT_EQ(snapshot->libraryUUID(), "L");
  EXPECT_EQ(snapshot->libraryKind(), "Cassock");
  ASSERT_EQ(snapshot->orderedAlbums()->size(), 1U);
  const auto album = std::dynamic_pointer_cast<KXSAlbum>(snapshot->orderedAlbums()->front());
  ASSERT_TRUE(album);
  EXPECT_EQ(album->name(), "Trip");
  EXPECT_EQ((*album->assetUUIDs())[0], text("A"));
  const KXSAssetPtr* video = snapshot->assetsByUUID()->find("A");
  ASSERT_NE(video, nullptr);
  EXPECT_TRUE((*video)->isVideo());
  EXPECT_EQ((*video)->exposureDate(), Number::real(3061152000.5));
  EXPECT_EQ((*video)->latitude(), std::nullopt);
}

// The page's example: indented lines that begin with two hexadecimal digits and a space, bytes up
// to two spaces in a row.
std::string hexOnThePage() {
  std::ifstream page(std::string(KX_TEST_SOURCE_DIR) + "/docs/formats/snapshot.md");
  std::string hex;
  bool inExample = false;
  for (std::string line; std::getline(page, line);) {
    inExample = inExample || line.find("bplist00") != std::string::npos;
    if (!inExample || line.size() < 6) continue;
    const std::string bytes = line.substr(4, line.find("  ", 4) - 4);
    for (const char c : bytes) {
      if (c != ' ') hex += c;
    }
  }
  return hex;
}

TEST(SnapshotGolden, ThePageShowsTheSameBytes) { EXPECT_EQ(hexOnThePage(), kExample); }

}  // namespace
}  // namespace kx
