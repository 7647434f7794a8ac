#include "records/KXSUUID.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <regex>

#include "platform/foundation/Exceptions.h"
#include "records/KXSBase64.h"

namespace kx {
namespace {

constexpr const char* kText = "0F1E2D3C-4B5A-6978-8796-A5B4C3D2E1F0";
const std::vector<std::uint8_t> kBytes = {0x0F, 0x1E, 0x2D, 0x3C, 0x4B, 0x5A, 0x69, 0x78,
                                          0x87, 0x96, 0xA5, 0xB4, 0xC3, 0xD2, 0xE1, 0xF0};

DataPtr dataOf(std::vector<std::uint8_t> bytes) {
  return std::make_shared<const Data>(std::move(bytes));
}
DataPtr repeated(std::uint8_t byte, std::size_t count) {
  return dataOf(std::vector<std::uint8_t>(count, byte));
}

TEST(KXSUUID, IsSixteenBytesLong) {
  EXPECT_EQ(KXSUUID::numberBytes(), 16U);
  EXPECT_EQ(KXSUUID::uuid()->length(), 16U);
}

TEST(KXSUUID, RandomIdentifiersAreVersionFourAndDiffer) {
  const std::regex form("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}");
  const std::string first = KXSUUID::generateUUIDAsString();
  EXPECT_TRUE(std::regex_match(first, form)) << first;
  EXPECT_NE(first, KXSUUID::generateUUIDAsString());
  EXPECT_FALSE(KXSUUID::uuid()->isEqual(*KXSUUID::init()));
}

TEST(KXSUUID, CanonicalTextGivesTheBytesAndBack) {
  const KXSUUIDPtr uuid = KXSUUID::uuidWithString(kText);
  ASSERT_TRUE(uuid);
  EXPECT_EQ(std::vector<std::uint8_t>(uuid->bytes(), uuid->bytes() + uuid->length()), kBytes);
  EXPECT_EQ(uuid->stringValue(), kText);
  EXPECT_EQ(uuid->description(), kText);
}

TEST(KXSUUID, LowerCaseTextIsReadAndWrittenUpperCase) {
  const KXSUUIDPtr uuid = KXSUUID::initWithString("0f1e2d3c-4b5a-6978-8796-a5b4c3d2e1f0");
  ASSERT_TRUE(uuid);
  EXPECT_EQ(uuid->stringValue(), kText);
}

TEST(KXSUUID, InvalidCanonicalTextGivesNull) {
  for (const char* wrong :
       {"", "0F1E2D3C", "0F1E2D3C-4B5A-6978-8796-A5B4C3D2E1F",
        "0F1E2D3C-4B5A-6978-8796-A5B4C3D2E1F00", "0F1E2D3C4B5A-6978-8796-A5B4C3D2E1F0-",
        "0F1E2D3G-4B5A-6978-8796-A5B4C3D2E1F0", "{F1E2D3C-4B5A-6978-8796-A5B4C3D2E1F0",
        "0F1E2D3C 4B5A 6978 8796 A5B4C3D2E1F0"}) {
    EXPECT_FALSE(KXSUUID::uuidWithString(wrong)) << wrong;
  }
}

TEST(KXSUUID, NullArgumentsGiveNull) {
  EXPECT_FALSE(KXSUUID::uuidWithData(nullptr));
  EXPECT_FALSE(KXSUUID::initWithData(nullptr));
  EXPECT_FALSE(KXSUUID::initWithBytesLength(nullptr, 16));
  EXPECT_FALSE(KXSUUID::uuidWithString(std::nullopt));
  EXPECT_FALSE(KXSUUID::initWithPhotoBase64String(std::nullopt));
}

TEST(KXSUUID, DataOfAnyLengthIsCopied) {
  EXPECT_EQ(KXSUUID::uuidWithData(repeated(7, 3))->length(), 3U);
  EXPECT_EQ(KXSUUID::initWithData(dataOf({}))->length(), 0U);
  EXPECT_EQ(KXSUUID::initWithBytesLength(kBytes.data(), 5)->length(), 5U);
}

TEST(KXSUUID, OtherLengthsAreNeverFormatted) {
  EXPECT_THROW(KXSUUID::uuidWithData(repeated(7, 3))->stringValue(), InternalInconsistency);
}

TEST(KXSUUID, ZeroBytesAreTwentyTwoLettersA) {
  const DataPtr zeros = repeated(0, 16);
  EXPECT_EQ(KXSUUID::uuidWithData(zeros)->photoBase64String(), std::string(22, 'A'));
  EXPECT_EQ(KXSBase64Encoder::encoder().encodeData(*zeros), std::string(22, 'A') + "==");
}

TEST(KXSUUID, BytesOfOnesArePercentSignsAndComeBack) {
  const KXSUUIDPtr ones = KXSUUID::uuidWithData(repeated(0xFF, 16));
  EXPECT_EQ(ones->photoBase64String(), std::string(21, '%') + "w");
  const KXSUUIDPtr back = KXSUUID::initWithPhotoBase64String(std::string(21, '%') + "w");
  ASSERT_TRUE(back);
  EXPECT_TRUE(back->isEqual(*ones));
}

TEST(KXSUUID, PhotoTextOfAnotherLengthGivesNull) {
  EXPECT_FALSE(KXSUUID::initWithPhotoBase64String(std::string(21, 'A')));
  EXPECT_FALSE(KXSUUID::initWithPhotoBase64String(std::string(23, 'A')));
  EXPECT_FALSE(KXSUUID::initWithPhotoBase64String(""));
}

TEST(KXSUUID, PhotoTextLengthCountsCharactersNotBytes) {
  // 22 bytes but 21 characters.
  EXPECT_FALSE(KXSUUID::initWithPhotoBase64String(std::string(20, 'A') + "\xC3\xA9"));
  // 22 characters that are not ASCII decode to no bytes.
  const KXSUUIDPtr empty = KXSUUID::initWithPhotoBase64String(std::string(21, 'A') + "\xC3\xA9");
  ASSERT_TRUE(empty);
  EXPECT_EQ(empty->length(), 0U);
}

TEST(KXSUUID, PhotoCharacterOutsideTheAlphabetReadsAsA) {
  const KXSUUIDPtr odd = KXSUUID::initWithPhotoBase64String("-" + std::string(20, '%') + "w");
  const KXSUUIDPtr plain = KXSUUID::initWithPhotoBase64String("A" + std::string(20, '%') + "w");
  ASSERT_TRUE(odd);
  EXPECT_TRUE(odd->isEqual(*plain));
}

TEST(KXSUUID, PhotoTextPaddedToTwentyTwoCharactersFailsWithItsDecoder) {
  // One character in the last group.
  EXPECT_FALSE(KXSUUID::initWithPhotoBase64String(std::string(21, 'A') + "="));
}

TEST(KXSUUID, EqualityAsksForTheClassAndDataEqualityDoesNot) {
  const KXSUUIDPtr uuid = KXSUUID::uuidWithString(kText);
  const Data plain(kBytes);
  EXPECT_FALSE(uuid->isEqual(plain));
  EXPECT_TRUE(uuid->isEqualToData(plain));
  EXPECT_TRUE(uuid->isEqual(*KXSUUID::uuidWithString(kText)));
  EXPECT_TRUE(plain.isEqualToData(*uuid));
  EXPECT_FALSE(
      uuid->isEqualToData(Data(std::vector<std::uint8_t>(kBytes.begin(), kBytes.end() - 1))));
  EXPECT_FALSE(uuid->isEqual(*KXSUUID::uuid()));
}

TEST(KXSUUID, PhotoFormsFollowTheOrderOfTheTexts) {
  EXPECT_TRUE(KXSUUID::photoBase64UUIDsFromUUIDs({}).empty());
  const std::string zeros = "00000000-0000-0000-0000-000000000000";
  const std::string ones = "ffffffff-ffff-ffff-ffff-ffffffffffff";
  EXPECT_THAT(KXSUUID::photoBase64UUIDsFromUUIDs({ones, zeros, ones}),
              testing::ElementsAre(std::string(21, '%') + "w", std::string(22, 'A'),
                                   std::string(21, '%') + "w"));
  EXPECT_THROW(KXSUUID::photoBase64UUIDsFromUUIDs({zeros, "no identifier"}), InternalInconsistency);
}

TEST(KXSUUID, ReportsItsOwnClassForArchiving) {
  const KXSUUIDPtr uuid = KXSUUID::uuid();
  EXPECT_EQ(uuid->classForCoder(), "KXSUUID");
  EXPECT_EQ(uuid->classForArchiver(), "KXSUUID");
  EXPECT_EQ(uuid->classForPortCoder(), "KXSUUID");
  EXPECT_EQ(uuid->archiveClassName(), "KXSUUID");
}

}  // namespace
}  // namespace kx
