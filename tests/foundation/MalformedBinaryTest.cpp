// Binary property lists that are no property lists: each class of damage with its exact error.
#include <gtest/gtest.h>

#include <bit>
#include <limits>

#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

class MalformedBinary : public testing::TestWithParam<BadInput> {};

TEST_P(MalformedBinary, IsRefused) {
  const Reading reading = readBytes(GetParam().bytes());
  EXPECT_EQ(reading.codeName(), propertyListErrorName(GetParam().code)) << reading.text();
  EXPECT_TRUE(reading.value.isNull());
  ASSERT_NE(reading.error, nullptr);
  EXPECT_EQ(reading.error->domain(), "com.veltro.plist");
  EXPECT_EQ(reading.error->message().rfind(propertyListErrorName(GetParam().code), 0), 0U);
  if (GetParam().offset) {
    EXPECT_EQ(reading.offset(), GetParam().offset) << reading.text();
  }
}

using Rows = std::vector<BadInput>;

std::string nameOf(const testing::TestParamInfo<BadInput>& info) {
  return badInputName(info.param);
}

BinaryFile oneObject(const std::string& object) {
  BinaryFile file;
  file.objects = {object};
  return file;
}

Rows magicRows() {
  const auto code = PropertyListError::kMagic;
  const std::string good = oneObject(ascii("text")).bytes();
  BinaryFile other = oneObject(ascii("text"));
  other.magic = "bplist01";
  BinaryFile fifteen = oneObject(ascii("text"));
  fifteen.magic = "bplist15";
  return {{"Empty", "", code, 0},
          {"MagicAlone", "bplist00", code, 0},
          {"ThirtyNineBytes", good.substr(0, 39), code, 0},
          {"HalfAMagic", "bpl", code, 0},
          {"Version01", other.bytes(), code, 6},
          {"Version15", fifteen.bytes(), code, 6},
          {"OtherMagic", "xplist00" + good.substr(8), code, 0},
          {"PlainText", "just some text, long enough for a trailer and more", code, 0},
          {"WhiteSpace", "  \n\t ", code, 0},
          {"Zeros", std::string(64, '\0'), code, 0}};
}

Rows trailerRows() {
  const auto code = PropertyListError::kTrailer;
  Rows rows;
  for (const unsigned size : {0U, 9U, 255U}) {
    BinaryFile file = oneObject(byte(0x09));
    const std::uint64_t trailer = file.trailerOffset();
    std::string bytes = file.bytes();
    bytes[static_cast<std::size_t>(trailer + 6)] = static_cast<char>(size);
    rows.push_back({"OffsetSize" + std::to_string(size), bytes, code, trailer + 6});
    bytes = file.bytes();
    bytes[static_cast<std::size_t>(trailer + 7)] = static_cast<char>(size);
    rows.push_back({"ReferenceSize" + std::to_string(size), bytes, code, trailer + 7});
  }
  // Without its last bytes a file's trailer is read from too far ahead: zeros where sizes stand.
  const std::string good = oneObject(ascii("some longer text")).bytes();
  for (const std::size_t cut : {1U, 2U, 5U}) {
    rows.push_back({"CutBy" + std::to_string(cut), good.substr(0, good.size() - cut), code,
                    good.size() - cut - 32 + 6});
  }
  return rows;
}

Rows tableRows() {
  const auto code = PropertyListError::kTable;
  const BinaryFile good = oneObject(ascii("text"));
  const std::uint64_t trailer = good.trailerOffset();
  const auto with = [&](auto change) {
    BinaryFile file = good;
    change(file);
    return file.bytes();
  };
  return {
      {"CountZero", with([](BinaryFile& f) { f.count = 0; }), code, trailer + 8},
      {"CountAboveBytes", with([](BinaryFile& f) { f.count = 1000; }), code, trailer + 8},
      {"Count2Pow31", with([](BinaryFile& f) { f.count = 1ULL << 31; }), code, trailer + 8},
      {"Count2Pow63", with([](BinaryFile& f) { f.count = 1ULL << 63; }), code, trailer + 8},
      {"CountAllOnes", with([](BinaryFile& f) { f.count = ~0ULL; }), code, trailer + 8},
      {"RootIsCount", with([](BinaryFile& f) { f.root = 1; }), code, trailer + 16},
      {"RootHuge", with([](BinaryFile& f) { f.root = ~0ULL; }), code, trailer + 16},
      {"TableAtZero", with([](BinaryFile& f) { f.table = 0; }), code, trailer + 24},
      {"TableInHeader", with([](BinaryFile& f) { f.table = 8; }), code, trailer + 24},
      {"TablePastTrailer", with([&](BinaryFile& f) { f.table = trailer + 1; }), code, trailer + 24},
      {"TableEndsInTrailer", with([&](BinaryFile& f) { f.table = trailer; }), code, trailer + 24},
      {"TableHuge", with([](BinaryFile& f) { f.table = ~0ULL; }), code, trailer + 24},
      {"TableTooSmall", with([](BinaryFile& f) { f.count = 2; }), code, trailer + 24}};
}

Rows offsetRows() {
  const auto code = PropertyListError::kOffset;
  const auto at = [](std::uint64_t offset, unsigned size) {
    BinaryFile file = oneObject(ascii("text"));
    file.offsetSize = size;
    file.offsets[0] = offset;
    return file;
  };
  Rows rows;
  const BinaryFile good = oneObject(ascii("text"));
  for (const std::uint64_t offset :
       {std::uint64_t{0}, std::uint64_t{7}, good.tableOffset(), good.trailerOffset(),
        good.trailerOffset() + 31, good.trailerOffset() + 32, std::uint64_t{255}}) {
    const BinaryFile file = at(offset, 1);
    rows.push_back({"At" + std::to_string(offset), file.bytes(), code, file.tableOffset()});
  }
  rows.push_back({"At2Pow63", at(1ULL << 63, 8).bytes(), code, good.tableOffset()});
  rows.push_back({"AtAllOnes", at(~0ULL, 8).bytes(), code, good.tableOffset()});
  const std::pair<const char*, std::string> cut[] = {
      {"IntegerCut", byte(0x13) + big(1, 7)}, {"WideIntegerCut", byte(0x14) + big(1, 15)},
      {"Real32Cut", byte(0x22) + big(1, 3)},  {"Real64Cut", byte(0x23) + big(1, 7)},
      {"DateCut", byte(0x33) + big(1, 7)},    {"UidCut", byte(0x83) + big(1, 3)},
      {"OneByteIntegerCut", byte(0x10)}};
  for (const auto& [name, object] : cut) rows.push_back({name, oneObject(object).bytes(), code, 8});
  BinaryFile overlap;
  overlap.objects = {overlap.array({1, 2, 3}), ascii("0123456789"), byte(0x09), byte(0x08)};
  overlap.offsets[2] = overlap.offsetOf(1);
  overlap.offsets[3] = overlap.offsetOf(1);
  rows.push_back({"ObjectsOverlap", overlap.bytes(), code, overlap.offsetOf(1)});
  return rows;
}

Rows markerRows() {
  Rows rows;
  for (const unsigned marker :
       {0x00U, 0x01U, 0x07U, 0x0AU, 0x0CU, 0x0FU, 0x15U, 0x1FU, 0x20U, 0x21U, 0x24U, 0x2FU,
        0x30U, 0x32U, 0x34U, 0x70U, 0x7FU, 0x90U, 0x9FU, 0xB0U, 0xC0U, 0xCFU, 0xE0U, 0xFFU}) {
    rows.push_back({"Marker" + std::to_string(marker), oneObject(byte(marker)).bytes(),
                    PropertyListError::kMarker, 8});
  }
  return rows;
}

Rows lengthRows() {
  const auto code = PropertyListError::kLength;
  Rows rows;
  const auto add = [&](const char* name, const std::string& object, std::uint64_t offset) {
    rows.push_back({name, oneObject(object).bytes(), code, offset});
  };
  add("AsciiCut", byte(0x55) + "abcd", 8);
  add("DataCut", byte(0x45) + "abcd", 8);
  add("Utf16CutByHalfAUnit", byte(0x62) + std::string("\0a\0", 3), 8);
  add("ArrayCut", byte(0xA2) + byte(0), 8);
  add("DictionaryWithoutItsValues", byte(0xD1) + byte(0), 8);
  add("LengthIsAString", byte(0x5F) + ascii("a"), 9);
  add("LengthIsAReal", byte(0x5F) + byte(0x22) + big(0, 4), 9);
  add("LengthIsABoolean", byte(0xAF) + byte(0x09), 9);
  add("LengthOf16Bytes", byte(0x5F) + byte(0x14) + big(0, 8) + big(1, 8), 9);
  add("LengthMissing", byte(0x5F), 9);
  add("LengthCut", byte(0x5F) + byte(0x13) + big(0, 4), 9);
  add("LengthNegative", byte(0x5F) + byte(0x13) + big(~0ULL, 8), 9);
  add("LengthLowest", byte(0x4F) + byte(0x13) + big(1ULL << 63, 8), 9);
  add("LongAscii", byte(0x5F) + byte(0x10) + byte(200) + std::string(20, 'a'), 8);
  add("ArrayOf2Pow31", byte(0xAF) + byte(0x12) + big(1ULL << 31, 4), 8);
  add("ArrayOf2Pow62", byte(0xAF) + byte(0x13) + big(1ULL << 62, 8), 8);
  add("ArrayOf2Pow63Less1", byte(0xAF) + byte(0x13) + big((1ULL << 63) - 1, 8), 8);
  add("DictionaryOf2Pow63Less1", byte(0xDF) + byte(0x13) + big((1ULL << 63) - 1, 8), 8);
  add("Utf16Of2Pow63Less1", byte(0x6F) + byte(0x13) + big((1ULL << 63) - 1, 8), 8);
  return rows;
}

Rows referenceRows() {
  const auto code = PropertyListError::kRef;
  Rows rows;
  const auto add = [&](const char* name, const BinaryFile& file, std::uint64_t offset) {
    rows.push_back({name, file.bytes(), code, offset});
  };
  BinaryFile file;
  file.objects = {file.array({1, 2}), byte(0x09)};
  add("ElementIsCount", file, 8 + 2);
  file.objects[0] = file.array({255, 1});
  add("ElementIs255", file, 8 + 1);
  file.objects = {file.dictionary({2}, {1}), ascii("k")};
  add("KeyIsCount", file, 8 + 1);
  file.objects = {file.dictionary({1}, {2}), ascii("k")};
  add("DictionaryValueIsCount", file, 8 + 2);
  file.referenceSize = 8;
  file.objects = {file.array({1ULL << 63}), byte(0x09)};
  add("EightByteReference", file, 8 + 1);
  file.referenceSize = 3;
  file.objects = {file.array({0x10000}), byte(0x09)};
  add("ThreeByteReference", file, 8 + 1);
  file.referenceSize = 1;
  file.objects = {byte(0x09), file.array({7})};
  add("InsideAnUnreferencedArray", file, 8 + 1 + 1);
  return rows;
}

Rows cycleRows() {
  const auto code = PropertyListError::kCycle;
  Rows rows;
  const auto add = [&](const std::string& name, const BinaryFile& file, std::uint64_t offset) {
    rows.push_back({name, file.bytes(), code, offset});
  };
  BinaryFile file;
  file.objects = {file.array({0})};
  add("ArrayHoldsItself", file, 9);
  file.objects = {file.dictionary({1}, {0}), ascii("k")};
  add("DictionaryHoldsItself", file, 10);
  file.objects = {file.array({1}), file.array({0})};
  add("TwoSteps", file, 11);
  file.objects = {file.array({1}), file.dictionary({2}, {0}), ascii("k")};
  add("TwoStepsThroughADictionary", file, 12);
  file.objects = {file.array({1}), file.array({2}), file.array({1})};
  add("BelowTheRoot", file, 13);
  for (const std::size_t steps : {10U, 64U}) {
    BinaryFile ring;
    for (std::size_t i = 0; i < steps; ++i) ring.objects.push_back(ring.array({(i + 1) % steps}));
    add("Ring" + std::to_string(steps), ring, ring.offsetOf(steps - 1) + 1);
  }
  return rows;
}

// `levels` arrays inside one another around a boolean.
BinaryFile nested(std::size_t levels, bool dictionaries) {
  BinaryFile file;
  file.offsetSize = 4;
  file.referenceSize = 4;
  for (std::size_t i = 0; i < levels; ++i) {
    file.objects.push_back(dictionaries ? file.dictionary({levels + 1}, {i + 1})
                                        : file.array({i + 1}));
  }
  file.objects.push_back(byte(0x09));
  file.objects.push_back(ascii("k"));
  return file;
}

// For many objects: offsets without a search for each.
std::string nestedBytes(std::size_t levels) {
  std::string bytes = "bplist00";
  std::string table;
  for (std::size_t i = 0; i < levels; ++i) {
    table += big(bytes.size(), 4);
    bytes += byte(0xA1) + big(i + 1, 4);
  }
  table += big(bytes.size(), 4);
  bytes += byte(0x09);
  const std::uint64_t tableStart = bytes.size();
  return bytes + table + std::string(6, '\0') + byte(4) + byte(4) + big(levels + 1, 8) + big(0, 8) +
         big(tableStart, 8);
}

Rows depthRows() {
  const auto code = PropertyListError::kDepth;
  Rows rows;
  rows.push_back({"Arrays65", nestedBytes(65), code, 8 + 64 * 5});
  rows.push_back({"Arrays66", nestedBytes(66), code, 8 + 64 * 5});
  rows.push_back({"Arrays5000", nestedBytes(5000), code, 8 + 64 * 5});
  rows.push_back({"Arrays500000", [] { return nestedBytes(500'000); }, code, 8 + 64 * 5});
  rows.push_back({"Dictionaries65", nested(65, true).bytes(), code, 8 + 64 * 9});
  // A tower of 60 that was already walked stands again below 5 more.
  BinaryFile shared;
  shared.objects.push_back(shared.array({1, 61}));
  for (std::size_t i = 1; i < 60; ++i) shared.objects.push_back(shared.array({i + 1}));
  shared.objects.push_back(byte(0x09));
  for (std::size_t i = 61; i < 65; ++i) shared.objects.push_back(shared.array({i + 1}));
  shared.objects.push_back(shared.array({1}));
  rows.push_back({"SharedTower", shared.bytes(), code, shared.offsetOf(65) + 1});
  return rows;
}

BinaryFile bomb(std::size_t levels, std::size_t copies, bool dictionaries) {
  BinaryFile file;
  if (copies > 20) file.offsetSize = 2;
  std::vector<std::uint64_t> keys;
  for (std::size_t i = 0; i < copies; ++i) keys.push_back(levels + 1 + i);
  for (std::size_t i = 0; i < levels; ++i) {
    const std::vector<std::uint64_t> same(copies, i + 1);
    file.objects.push_back(dictionaries ? file.dictionary(keys, same) : file.array(same));
  }
  file.objects.push_back(byte(0x09));
  for (std::size_t i = 0; dictionaries && i < copies; ++i) {
    file.objects.push_back(ascii(std::string(1, static_cast<char>('a' + i))));
  }
  return file;
}

Rows expansionRows() {
  const auto code = PropertyListError::kExpansion;
  const BinaryFile smallest = bomb(40, 2, false);
  EXPECT_LE(smallest.bytes().size(), 202U);
  return {{"TwoPow40In202Bytes", smallest.bytes(), code, {}},
          {"TwoPow63", bomb(63, 2, false).bytes(), code, {}},
          {"FourPow20", bomb(20, 4, false).bytes(), code, {}},
          {"TenPow10", bomb(10, 10, false).bytes(), code, {}},
          {"Dictionaries", bomb(30, 2, true).bytes(), code, {}},
          {"Wide", bomb(4, 200, false).bytes(), code, {}}};
}

Rows duplicateKeyRows() {
  const auto code = PropertyListError::kDupKey;
  Rows rows;
  const auto add = [&](const char* name, const BinaryFile& file, std::uint64_t offset) {
    rows.push_back({name, file.bytes(), code, offset});
  };
  BinaryFile file;
  file.objects = {file.dictionary({1, 1}, {2, 2}), ascii("k"), byte(0x09)};
  add("SameObject", file, 10);
  file.objects = {file.dictionary({1, 2}, {3, 3}), ascii("key"), ascii("key"), byte(0x09)};
  add("EqualText", file, 10);
  file.objects = {file.dictionary({1, 2}, {3, 3}), ascii("k"), utf16({'k'}), byte(0x09)};
  add("EqualTextInUtf16", file, 10);
  file.objects = {file.dictionary({1, 2}, {3, 3}), ascii(""), utf16({}), byte(0x09)};
  add("EmptyText", file, 10);
  file.objects = {file.array({1}), file.dictionary({2, 3, 2}, {4, 4, 4}), ascii("a"), ascii("b"),
                  byte(0x09)};
  add("InsideAnArray", file, file.offsetOf(1) + 3);
  BinaryFile large;
  std::vector<std::uint64_t> keys;
  for (std::uint64_t i = 0; i < 100; ++i) keys.push_back(i + 1);
  large.objects.push_back(std::string());
  for (int i = 0; i < 100; ++i) large.objects.push_back(ascii("key" + std::to_string(i % 99)));
  large.objects[0] = large.dictionary(keys, keys);
  large.offsetSize = 2;
  add("FirstAndLastOf100", large, 8 + 3 + 99);
  return rows;
}

Rows keyTypeRows() {
  Rows rows;
  BinaryFile empty;
  const std::pair<const char*, std::string> keys[] = {
      {"Integer", byte(0x10) + byte(1)}, {"Boolean", byte(0x09)},
      {"Real", byte(0x23) + big(0, 8)},  {"Date", byte(0x33) + big(0, 8)},
      {"Data", byte(0x41) + "a"},        {"Uid", byte(0x80) + byte(1)},
      {"Array", empty.array({})},        {"Dictionary", empty.dictionary({}, {})}};
  for (const auto& [name, key] : keys) {
    BinaryFile file;
    file.objects = {file.dictionary({1, 2}, {1, 1}), ascii("good"), key};
    rows.push_back({name, file.bytes(), PropertyListError::kKeyType, 10});
  }
  BinaryFile itself;
  itself.objects = {itself.dictionary({0}, {0})};
  rows.push_back({"TheDictionaryItself", itself.bytes(), PropertyListError::kKeyType, 9});
  return rows;
}

Rows encodingRows() {
  const auto code = PropertyListError::kTextEncoding;
  Rows rows;
  const auto add = [&](const std::string& name, const std::string& object, std::uint64_t offset) {
    rows.push_back({name, oneObject(object).bytes(), code, offset});
  };
  add("LoneHighSurrogateAtEnd", utf16({'a', 0xD800}), 8 + 1 + 2);
  add("LoneHighSurrogate", utf16({0xDBFF, 'a'}), 8 + 1);
  add("LoneLowSurrogate", utf16({'a', 'b', 0xDC00}), 8 + 1 + 4);
  add("SwappedPair", utf16({0xDC00, 0xD800}), 8 + 1);
  add("TwoHighSurrogates", utf16({0xD800, 0xD800, 0xDC00}), 8 + 1);
  add("NulInUtf16", utf16({'a', 0, 'b'}), 8 + 1 + 2);
  for (const std::size_t length : {1U, 7U, 8U, 9U, 16U, 23U}) {
    for (const std::size_t at : {std::size_t{0}, length - 1}) {
      for (const char bad : {'\0', '\x80', '\xFF'}) {
        std::string text(length, 'a');
        text[at] = bad;
        const std::string name = "Ascii" + std::to_string(length) + "At" + std::to_string(at) +
                                 "Byte" + std::to_string(static_cast<unsigned char>(bad));
        add(name, ascii(text), 8 + head(0x50, length).size() + at);
      }
      if (length == 1) break;
    }
  }
  return rows;
}

Rows rangeRows() {
  const auto code = PropertyListError::kRange;
  Rows rows;
  const auto add = [&](const std::string& name, const std::string& object) {
    rows.push_back({name, oneObject(object).bytes(), code, 8});
  };
  const std::pair<const char*, double> dates[] = {
      {"DateNaN", std::numeric_limits<double>::quiet_NaN()},
      {"DateInfinity", std::numeric_limits<double>::infinity()},
      {"DateMinusInfinity", -std::numeric_limits<double>::infinity()},
      {"DateSubnormal", std::numeric_limits<double>::denorm_min()},
      {"Date1e300", 1e300},
      {"DateMinus1e300", -1e300},
      {"DateYear10000", 252423993600.0},
      {"DateYear0", -63113904000.5}};
  for (const auto& [name, seconds] : dates) {
    add(name, byte(0x33) + big(std::bit_cast<std::uint64_t>(seconds), 8));
  }
  add("Integer2Pow64", byte(0x14) + big(1, 8) + big(0, 8));
  add("IntegerLargest", byte(0x14) + big(~0ULL >> 1, 8) + big(~0ULL, 8));
  add("IntegerBelowLowest", byte(0x14) + big(~0ULL, 8) + big((1ULL << 63) - 1, 8));
  add("IntegerLowestOf128", byte(0x14) + big(1ULL << 63, 8) + big(0, 8));
  add("Uid2Pow32", byte(0x84) + big(1ULL << 32, 5));
  add("UidOf8Bytes", byte(0x87) + big(~0ULL, 8));
  add("UidOf16Bytes", byte(0x8F) + big(1, 8) + big(0, 8));
  return rows;
}

INSTANTIATE_TEST_SUITE_P(Magic, MalformedBinary, testing::ValuesIn(magicRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Trailer, MalformedBinary, testing::ValuesIn(trailerRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Table, MalformedBinary, testing::ValuesIn(tableRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Offset, MalformedBinary, testing::ValuesIn(offsetRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Marker, MalformedBinary, testing::ValuesIn(markerRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Length, MalformedBinary, testing::ValuesIn(lengthRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Reference, MalformedBinary, testing::ValuesIn(referenceRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Cycle, MalformedBinary, testing::ValuesIn(cycleRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Depth, MalformedBinary, testing::ValuesIn(depthRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Expansion, MalformedBinary, testing::ValuesIn(expansionRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(DuplicateKey, MalformedBinary, testing::ValuesIn(duplicateKeyRows()),
                         nameOf);
INSTANTIATE_TEST_SUITE_P(KeyType, MalformedBinary, testing::ValuesIn(keyTypeRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Encoding, MalformedBinary, testing::ValuesIn(encodingRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Range, MalformedBinary, testing::ValuesIn(rangeRows()), nameOf);

// Text is tested several bytes at once: whatever its length, each byte counts and none behind it.
TEST(MalformedBinaryText, EachByteOfAnAsciiStringIsTested) {
  for (std::size_t length = 0; length <= 50; ++length) {
    BinaryFile file;
    file.objects = {file.array({1, 2}), ascii(std::string(length, 'x')), utf16({0xFFFF, 0x80})};
    ASSERT_EQ(readBytes(file.bytes()).error, nullptr) << length;
    for (std::size_t at = 0; at < length; ++at) {
      for (const char wrong : {'\0', '\x80', '\xFF'}) {
        std::string content(length, '\x01');
        content[at] = wrong;
        content.back() = at + 1 < length ? '\x7F' : wrong;
        file.objects[1] = ascii(content);
        const Reading reading = readBytes(file.bytes());
        ASSERT_EQ(reading.codeName(), "E_TEXT_ENCODING") << length << " " << at;
        ASSERT_EQ(reading.offset(), file.offsetOf(2) - length + at);
      }
    }
  }
}

TEST(MalformedBinaryPath, NamesTheKeysDownToTheValue) {
  BinaryFile file;
  file.objects = {file.dictionary({1}, {2}),
                  ascii("updates"),
                  file.array({3, 3, 4}),
                  byte(0x09),
                  file.dictionary({5}, {6}),
                  ascii("uuid"),
                  byte(0x00)};
  const Reading reading = readBytes(file.bytes());
  EXPECT_EQ(reading.codeName(), "E_PLIST_MARKER");
  EXPECT_EQ(reading.path(), "updates[2].uuid");
  EXPECT_EQ(reading.error->message(),
            "E_PLIST_MARKER: unknown marker 0x00, under updates[2].uuid at byte " +
                std::to_string(file.offsetOf(6)));
}

TEST(MalformedBinaryPath, EachCutOfAGoodFileIsRefused) {
  BinaryFile file;
  file.objects = {file.dictionary({1, 2}, {3, 4}), ascii("a"), utf16({0x20AC}), file.array({1, 4}),
                  byte(0x33) + big(0, 8)};
  const std::string good = file.bytes();
  ASSERT_EQ(readBytes(good).error, nullptr);
  for (std::size_t length = 0; length < good.size(); ++length) {
    const Reading reading = readBytes(good.substr(0, length));
    EXPECT_NE(reading.error, nullptr) << "cut to " << length;
    EXPECT_TRUE(reading.value.isNull());
  }
}

}  // namespace
}  // namespace kx::test
