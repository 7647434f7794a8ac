// Each limit at one less, itself and one more; time and memory of hostile files.
#include <gtest/gtest.h>
#include <malloc.h>

#include <functional>

#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

// Reads with the limit at one more, exactly, and one less than what the file needs.
void expectLimit(const std::string& bytes, const std::function<void(PropertyListLimits&, int)>& set,
                 const std::string& code) {
  for (const int slack : {1, 0, -1}) {
    PropertyListLimits limits;
    set(limits, slack);
    const Reading reading = readBytes(bytes, limits);
    EXPECT_EQ(reading.codeName(), slack < 0 ? code : "no error")
        << "slack " << slack << ": " << reading.text();
  }
}

std::size_t plus(std::size_t need, int slack) {
  return need + static_cast<std::size_t>(static_cast<std::ptrdiff_t>(slack));
}

Value arrayOfArrays(std::size_t levels) {
  Value value = Value::integer(1);
  for (std::size_t i = 0; i < levels; ++i) value = Value::array({std::move(value)});
  return value;
}

constexpr PropertyListFormat kFormats[] = {PropertyListFormat::kBinary, PropertyListFormat::kXml};

TEST(PropertyListLimits, FileBytes) {
  for (const PropertyListFormat format : kFormats) {
    const std::string file = written(arrayOfArrays(3), format);
    expectLimit(
        file, [&](PropertyListLimits& l, int slack) { l.fileBytes = plus(file.size(), slack); },
        "E_PLIST_LIMIT");
  }
}

TEST(PropertyListLimits, Objects) {
  for (const PropertyListFormat format : kFormats) {
    expectLimit(
        written(arrayOfArrays(3), format),
        [](PropertyListLimits& l, int slack) { l.objects = plus(4, slack); }, "E_PLIST_LIMIT");
  }
}

TEST(PropertyListLimits, NestingDepth) {
  for (const PropertyListFormat format : kFormats) {
    expectLimit(
        written(arrayOfArrays(9), format),
        [](PropertyListLimits& l, int slack) { l.nestingDepth = plus(9, slack); }, "E_PLIST_DEPTH");
  }
}

TEST(PropertyListLimits, DepthIsSixtyFourByDefault) {
  std::string inside = "<true/>";
  for (int i = 0; i < 63; ++i) inside = "<array>" + inside + "</array>";
  EXPECT_EQ(readBytes(xml(inside)).codeName(), "no error");
  inside = "<array>" + inside + "</array>";
  EXPECT_EQ(readBytes(xml(inside)).codeName(), "no error");
  inside = "<array>" + inside + "</array>";
  EXPECT_EQ(readBytes(xml(inside)).codeName(), "E_PLIST_DEPTH");
}

// An array of twice the same array of three: 1 + 2 * (1 + 3) visits.
TEST(PropertyListLimits, Visits) {
  BinaryFile file;
  file.objects = {file.array({1, 1}), file.array({2, 2, 2}), byte(0x09)};
  expectLimit(
      file.bytes(), [](PropertyListLimits& l, int slack) { l.visits = plus(9, slack); },
      "E_PLIST_EXPANSION");
  BinaryFile dictionary;
  dictionary.objects = {dictionary.dictionary({1}, {2}), ascii("k"), byte(0x09)};
  expectLimit(
      dictionary.bytes(), [](PropertyListLimits& l, int slack) { l.visits = plus(3, slack); },
      "E_PLIST_EXPANSION");
}

TEST(PropertyListLimits, StringBytes) {
  BinaryFile file;
  file.objects = {ascii(std::string(20, 'a'))};
  expectLimit(
      file.bytes(), [](PropertyListLimits& l, int slack) { l.stringBytes = plus(20, slack); },
      "E_PLIST_LIMIT");
  file.objects = {utf16({0x20AC, 0x20AC, 0xE9})};
  expectLimit(
      file.bytes(), [](PropertyListLimits& l, int slack) { l.stringBytes = plus(8, slack); },
      "E_PLIST_LIMIT");
  expectLimit(
      xml("<string>0123456789&lt;</string>"),
      [](PropertyListLimits& l, int slack) { l.stringBytes = plus(11, slack); }, "E_PLIST_LIMIT");
}

TEST(PropertyListLimits, StringOfAMebibyteByDefault) {
  constexpr std::size_t kMebibyte = std::size_t{1} << 20;
  for (const std::size_t size : {kMebibyte - 1, kMebibyte, kMebibyte + 1}) {
    BinaryFile file;
    file.offsetSize = 4;
    file.objects = {ascii(std::string(size, 'a'))};
    EXPECT_EQ(readBytes(file.bytes()).codeName(), size > kMebibyte ? "E_PLIST_LIMIT" : "no error");
    EXPECT_EQ(readBytes(xml("<string>" + std::string(size, 'a') + "</string>")).codeName(),
              size > kMebibyte ? "E_XML_LIMIT" : "no error");
  }
}

TEST(PropertyListLimits, KeyUnits) {
  for (const std::size_t length : {255U, 256U, 257U}) {
    const std::string code = length > 256 ? "E_PLIST_LIMIT" : "no error";
    BinaryFile file;
    file.offsetSize = 2;
    file.objects = {file.dictionary({1}, {1}), ascii(std::string(length, 'k'))};
    EXPECT_EQ(readBytes(file.bytes()).codeName(), code);
    file.objects = {file.dictionary({1}, {1}), utf16(std::vector<unsigned>(length, 0x20AC))};
    EXPECT_EQ(readBytes(file.bytes()).codeName(), code);
    EXPECT_EQ(readBytes(xml("<dict><key>" + std::string(length, 'k') + "</key><true/></dict>"))
                  .codeName(),
              code);
  }
}

TEST(PropertyListLimits, DataBytes) {
  const std::string bytes(30, 'd');
  const Value value =
      Value::data({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
  for (const PropertyListFormat format : kFormats) {
    expectLimit(
        written(value, format),
        [](PropertyListLimits& l, int slack) { l.dataBytes = plus(30, slack); }, "E_PLIST_LIMIT");
  }
}

TEST(PropertyListLimits, XmlTextAndComments) {
  expectLimit(
      xml("<!--0123456789--><true/>"),
      [](PropertyListLimits& l, int slack) { l.xmlTextBytes = plus(10, slack); }, "E_XML_LIMIT");
  expectLimit(
      xml("<string><![CDATA[0123456789]]></string>"),
      [](PropertyListLimits& l, int slack) { l.xmlTextBytes = plus(10, slack); }, "E_XML_LIMIT");
}

TEST(PropertyListLimits, XmlNames) {
  expectLimit(
      "<plist version=\"1.0\"><true/></plist>",
      [](PropertyListLimits& l, int slack) { l.xmlNameBytes = plus(7, slack); }, "E_XML_LIMIT");
  EXPECT_EQ(readBytes(xml("<" + std::string(64, 'a') + "/>")).codeName(), "E_XML_SYNTAX");
  EXPECT_EQ(readBytes(xml("<" + std::string(65, 'a') + "/>")).codeName(), "E_XML_LIMIT");
}

TEST(PropertyListLimits, XmlAttributes) {
  expectLimit(
      "<plist version=\"1.0\"><true/></plist>",
      [](PropertyListLimits& l, int slack) { l.xmlAttributes = plus(1, slack); }, "E_XML_LIMIT");
}

TEST(PropertyListLimits, CannotBeRaised) {
  PropertyListLimits limits;
  limits.keyUnits = 100'000;
  limits.nestingDepth = 100'000;
  BinaryFile file;
  file.offsetSize = 2;
  file.objects = {file.dictionary({1}, {1}), ascii(std::string(257, 'k'))};
  EXPECT_EQ(readBytes(file.bytes(), limits).codeName(), "E_PLIST_LIMIT");
}

TEST(PropertyListLimits, DecodeMemoryIsCheckedBeforeItIsTaken) {
  // A million objects, all at one place: 1 byte of table each.
  constexpr std::size_t kCount = 1'000'000;
  const std::string bytes = "bplist00" + byte(0x09) + std::string(kCount, '\x08') +
                            std::string(6, '\0') + byte(1) + byte(4) + big(kCount, 8) + big(0, 8) +
                            big(9, 8);
  PropertyListLimits limits;
  limits.decodeBaseBytes = 0;
  EXPECT_EQ(readBytes(bytes, limits).codeName(), "E_PLIST_LIMIT");
  EXPECT_EQ(readBytes(bytes).codeName(), "E_PLIST_OFFSET");
}

// Bytes that the allocator hands out while the file is read and refused.
std::size_t bytesTakenBy(const std::string& bytes) {
  const DataPtr data = dataOf(bytes);
  const struct mallinfo2 before = mallinfo2();
  ErrorPtr error;
  readPropertyList(data, &error);
  EXPECT_NE(error, nullptr);
  const struct mallinfo2 after = mallinfo2();
  const std::size_t grown = after.arena + after.hblkhd;
  return grown > before.arena + before.hblkhd ? grown - before.arena - before.hblkhd : 0;
}

TEST(HostileFile, HugeCountsTakeNoMemory) {
  for (const unsigned marker : {0x4FU, 0x5FU, 0x6FU, 0xAFU, 0xDFU}) {
    for (const std::uint64_t count :
         {std::uint64_t{1} << 31, std::uint64_t{1} << 62, (std::uint64_t{1} << 63) - 1}) {
      BinaryFile file;
      file.objects = {byte(marker) + byte(0x13) + big(count, 8) + std::string(20, '\0')};
      ASSERT_EQ(file.bytes().size(), 71U);
      EXPECT_EQ(readBytes(file.bytes()).codeName(), "E_PLIST_LENGTH");
      EXPECT_LT(bytesTakenBy(file.bytes()), std::size_t{1} << 20);
    }
  }
}

// Work that grew with the square of the size would run into the time limit of the test programs.
TEST(HostileFile, TimeIsLinear) {
  constexpr std::size_t kCount = 1'000'000;
  std::string comments;
  std::string keys = "<dict>";
  std::string references = "<string>";
  for (std::size_t i = 0; i < kCount; ++i) {
    comments += "<!---->";
    keys += "<key>" + std::to_string(i) + "</key><true/>";
    references += "&#65;";
  }
  EXPECT_EQ(readBytes(xml(comments + "<true/>")).codeName(), "no error");
  EXPECT_EQ(readBytes(xml(keys + "</dict>")).value.dictionaryValue().size(), kCount);
  EXPECT_EQ(readBytes(xml(references + "</string>")).value.stringValue().size(), kCount);
  const std::string padding(10 * kCount, '=');
  EXPECT_EQ(readBytes(xml("<data>" + padding + "</data>")).codeName(), "E_XML_SYNTAX");
  // An array that lists one long string again and again.
  BinaryFile file;
  file.referenceSize = 4;
  file.offsetSize = 4;
  file.objects = {file.array(std::vector<std::uint64_t>(kCount, 1)),
                  ascii(std::string(kCount, 'a'))};
  EXPECT_EQ(readBytes(file.bytes()).value.arrayValue().size(), kCount);
}

TEST(HostileFile, OverlappingLongStringsAreRefused) {
  constexpr std::size_t kCount = 5000;
  BinaryFile file;
  file.referenceSize = 2;
  file.offsetSize = 4;
  std::vector<std::uint64_t> all;
  for (std::size_t i = 1; i <= kCount; ++i) all.push_back(i);
  file.objects = {file.array(all), ascii(std::string(1'000'000, 'a'))};
  file.objects.resize(kCount + 1);
  for (std::size_t i = 2; i <= kCount; ++i) file.offsets[i] = 8 + file.objects[0].size();
  const Reading reading = readBytes(file.bytes());
  EXPECT_EQ(reading.codeName(), "E_PLIST_OFFSET") << reading.text();
}

}  // namespace
}  // namespace kx::test
