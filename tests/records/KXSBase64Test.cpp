#include "records/KXSBase64.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace kx {
namespace {

using Bytes = std::vector<std::uint8_t>;

std::string encode(const Bytes& bytes) {
  return KXSBase64Encoder::encoder().encodeData(Data(bytes));
}
std::string encodePhoto(const Bytes& bytes) {
  return KXSBase64Encoder::encoderForPhotoUUID().encodeData(Data(bytes));
}
std::optional<Bytes> decodeWith(const KXSBase64Decoder& decoder, std::string_view text) {
  const DataPtr data = decoder.decodeString(text);
  if (!data) return std::nullopt;
  return Bytes(data->bytes(), data->bytes() + data->length());
}
std::optional<Bytes> decode(std::string_view text) {
  return decodeWith(KXSBase64Decoder::decoder(), text);
}
std::optional<Bytes> decodePhoto(std::string_view text) {
  return decodeWith(KXSBase64Decoder::decoderForPhotoUUID(), text);
}

TEST(KXSBase64, ModesAreThoseOfTheFactories) {
  EXPECT_FALSE(KXSBase64Encoder::init().photoUUID());
  EXPECT_FALSE(KXSBase64Encoder::encoder().photoUUID());
  EXPECT_TRUE(KXSBase64Encoder::initForPhotoUUID().photoUUID());
  EXPECT_TRUE(KXSBase64Encoder::encoderForPhotoUUID().photoUUID());
  EXPECT_FALSE(KXSBase64Decoder::init().photoUUID());
  EXPECT_FALSE(KXSBase64Decoder::decoder().photoUUID());
  EXPECT_TRUE(KXSBase64Decoder::initForPhotoUUID().photoUUID());
  EXPECT_TRUE(KXSBase64Decoder::decoderForPhotoUUID().photoUUID());
}

TEST(KXSBase64, EncodesGroupsAndRemainders) {
  EXPECT_EQ(encode({}), "");
  EXPECT_EQ(encode({0x41}), "QQ==");
  EXPECT_EQ(encode({0x41, 0x42}), "QUI=");
  EXPECT_EQ(encode({0x41, 0x42, 0x43}), "QUJD");
  EXPECT_EQ(encodePhoto({}), "");
  EXPECT_EQ(encodePhoto({0x41}), "QQ");
  EXPECT_EQ(encodePhoto({0x41, 0x42}), "QUI");
  EXPECT_EQ(encodePhoto({0x41, 0x42, 0x43}), "QUJD");
}

TEST(KXSBase64, LastCharacterOfTheAlphabetIsAPercentSign) {
  EXPECT_EQ(encode({0xFB, 0xFF, 0xBF}), "+%+%");
}

TEST(KXSBase64, EncodesEveryValueOfTheAlphabetInOrder) {
  Bytes bytes;
  for (unsigned value = 0; value < 64; value += 4) {
    const unsigned group = value << 18 | (value + 1) << 12 | (value + 2) << 6 | (value + 3);
    bytes.push_back(static_cast<std::uint8_t>(group >> 16));
    bytes.push_back(static_cast<std::uint8_t>(group >> 8 & 0xFF));
    bytes.push_back(static_cast<std::uint8_t>(group & 0xFF));
  }
  EXPECT_EQ(encode(bytes), "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+%");
}

TEST(KXSBase64, DecodesStandardText) {
  EXPECT_EQ(decode(""), Bytes());
  EXPECT_EQ(decode("QQ=="), Bytes({0x41}));
  EXPECT_EQ(decode("QUI="), Bytes({0x41, 0x42}));
  EXPECT_EQ(decode("QUJD"), Bytes({0x41, 0x42, 0x43}));
}

TEST(KXSBase64, ALoneCharacterFails) {
  EXPECT_EQ(decode("Q"), std::nullopt);
  EXPECT_EQ(decode("QUJDQ"), std::nullopt);
  EXPECT_EQ(decode("Q="), std::nullopt);
  EXPECT_EQ(decodePhoto("Q"), std::nullopt);
}

TEST(KXSBase64, AWrongPadAtTheEndFails) {
  EXPECT_EQ(decode("QQ="), std::nullopt);
  EXPECT_EQ(decode("QUI=="), std::nullopt);
}

TEST(KXSBase64, AWrongPadFollowedByMoreTextDecodes) {
  EXPECT_EQ(decode("QQ=Q"), Bytes({0x41}));
  EXPECT_EQ(decode("QUI==Q"), Bytes({0x41, 0x42}));
}

TEST(KXSBase64, NothingBehindThePadIsRead) {
  EXPECT_EQ(decode("QQ==QUJD"), Bytes({0x41}));
  EXPECT_EQ(decode("=QUJD"), Bytes());
}

TEST(KXSBase64, UnpaddedStandardTextDecodesShifted) {
  // 'Q', 'Q' are 010000 010000; without the shift bits 17 to 10 hold the top two bits alone.
  EXPECT_EQ(decode("QQ"), Bytes({0x01}));
  EXPECT_EQ(decode("QUI"), Bytes({0x01, 0x05}));
}

TEST(KXSBase64, PhotoTextNeedsNoPad) {
  EXPECT_EQ(decodePhoto("QQ"), Bytes({0x41}));
  EXPECT_EQ(decodePhoto("QUI"), Bytes({0x41, 0x42}));
  EXPECT_EQ(decodePhoto("QUJD"), Bytes({0x41, 0x42, 0x43}));
}

TEST(KXSBase64, CharactersOutsideTheAlphabetReadAsA) {
  EXPECT_EQ(decode("-/!\n"), decode("AAAA"));
  EXPECT_EQ(decode("Q-=="), decode("QA=="));
}

TEST(KXSBase64, TextThatIsNotAsciiDecodesToNothing) {
  EXPECT_EQ(decode("QUJD\xC3\xA9"), Bytes());
  EXPECT_EQ(decodePhoto("\xC3\xA9"), Bytes());
}

RC_GTEST_PROP(KXSBase64Property, PhotoTextComesBack, (const Bytes& bytes)) {
  const std::string text = encodePhoto(bytes);
  RC_ASSERT(text.size() ==
            bytes.size() / 3 * 4 + (bytes.size() % 3 == 0 ? 0 : bytes.size() % 3 + 1));
  RC_ASSERT(decodePhoto(text) == bytes);
}

RC_GTEST_PROP(KXSBase64Property, PaddedTextComesBack, (const Bytes& bytes)) {
  const std::string text = encode(bytes);
  RC_ASSERT(text.size() == (bytes.size() + 2) / 3 * 4);
  RC_ASSERT(decode(text) == bytes);
}

RC_GTEST_PROP(KXSBase64Property, AnyTextDecodesOrFailsWithoutHarm, (const std::string& text)) {
  const auto bytes = decode(text);
  RC_ASSERT(!bytes || bytes->size() <= text.size());
  const auto photoBytes = decodePhoto(text);
  RC_ASSERT(!photoBytes || photoBytes->size() <= text.size());
}

}  // namespace
}  // namespace kx
