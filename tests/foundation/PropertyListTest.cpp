#include "platform/foundation/PropertyList.h"

#include <gtest/gtest.h>

#include <bit>
#include <limits>

#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

Value onlyObject(const std::string& object) {
  BinaryFile file;
  file.objects = {object};
  const Reading reading = readBytes(file.bytes());
  EXPECT_EQ(reading.error, nullptr) << reading.text();
  return reading.value;
}

void expectNumber(const std::string& object, const Number& number) {
  const Value value = onlyObject(object);
  ASSERT_TRUE(value.isNumber());
  EXPECT_EQ(value.numberValue(), number);
  EXPECT_EQ(value.numberValue().type(), number.type());
}

TEST(BinaryReader, IntegersOfAllWidths) {
  expectNumber(byte(0x10) + big(0xFF, 1), Number::integer(255));
  expectNumber(byte(0x11) + big(0xFFFF, 2), Number::integer(65535));
  expectNumber(byte(0x12) + big(0xFFFFFFFF, 4), Number::integer(4294967295));
  expectNumber(byte(0x13) + big(~0ULL, 8), Number::integer(-1));
  expectNumber(byte(0x13) + big(1ULL << 63, 8),
               Number::integer(std::numeric_limits<std::int64_t>::min()));
  expectNumber(byte(0x14) + big(0, 8) + big(~0ULL, 8), Number::unsignedInteger(~0ULL));
  expectNumber(byte(0x14) + big(0, 8) + big(5, 8), Number::integer(5));
  expectNumber(byte(0x14) + big(~0ULL, 8) + big(~0ULL, 8), Number::integer(-1));
}

TEST(BinaryReader, OtherScalars) {
  expectNumber(byte(0x08), Number::boolean(false));
  expectNumber(byte(0x09), Number::boolean(true));
  expectNumber(byte(0x22) + big(std::bit_cast<std::uint32_t>(0.1F), 4), Number::real32(0.1F));
  expectNumber(byte(0x23) + big(std::bit_cast<std::uint64_t>(0.1), 8), Number::real(0.1));
  const double infinity = std::numeric_limits<double>::infinity();
  expectNumber(byte(0x23) + big(std::bit_cast<std::uint64_t>(infinity), 8), Number::real(infinity));
  EXPECT_EQ(onlyObject(byte(0x33) + big(std::bit_cast<std::uint64_t>(-1.5), 8)).dateValue(),
            Date{-1.5});
  EXPECT_EQ(onlyObject(byte(0x80) + byte(7)).uidValue(), 7U);
  EXPECT_EQ(onlyObject(byte(0x81) + big(0x1234, 2)).uidValue(), 0x1234U);
  EXPECT_EQ(onlyObject(byte(0x83) + big(0xFFFFFFFF, 4)).uidValue(), 0xFFFFFFFFU);
  EXPECT_EQ(onlyObject(byte(0x87) + big(9, 8)).uidValue(), 9U);
}

TEST(BinaryReader, DatesAtTheEdges) {
  for (const double seconds :
       {-63113904000.0, 252423993599.0, 0.0, -0.0, std::numeric_limits<double>::min()}) {
    EXPECT_EQ(onlyObject(byte(0x33) + big(std::bit_cast<std::uint64_t>(seconds), 8)).dateValue(),
              Date{seconds});
  }
}

TEST(BinaryReader, Strings) {
  EXPECT_EQ(onlyObject(ascii("")).stringValue(), "");
  for (const std::size_t length : {1U, 7U, 8U, 9U, 14U, 15U, 16U, 255U, 256U, 70'000U}) {
    const std::string text(length, 'x');
    EXPECT_EQ(onlyObject(ascii(text)).stringValue(), text);
  }
  EXPECT_EQ(onlyObject(ascii("\x01\x1F\x7F")).stringValue(), "\x01\x1F\x7F");
  EXPECT_EQ(onlyObject(utf16({})).stringValue(), "");
  EXPECT_EQ(onlyObject(utf16({'a', 0x7F, 0x80, 0x7FF, 0x800, 0xFFFF})).stringValue(),
            "a\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80\xEF\xBF\xBF");
  EXPECT_EQ(onlyObject(utf16({0xD834, 0xDD1E})).stringValue(), "\xF0\x9D\x84\x9E");
  EXPECT_EQ(onlyObject(utf16({0xD800, 0xDC00, 0xDBFF, 0xDFFF})).stringValue(),
            "\xF0\x90\x80\x80\xF4\x8F\xBF\xBF");
}

TEST(BinaryReader, ReferenceAndOffsetSizesFromOneToEight) {
  for (unsigned size = 1; size <= 8; ++size) {
    BinaryFile file;
    file.offsetSize = size;
    file.referenceSize = 9 - size;
    file.objects = {file.dictionary({1, 2}, {3, 4}), ascii("a"), utf16({0xE9}), byte(0x09),
                    file.array({3, 1})};
    const Reading reading = readBytes(file.bytes());
    ASSERT_EQ(reading.error, nullptr) << reading.text();
    EXPECT_EQ(reading.value,
              Value::dictionary({{"a", Value::boolean(true)},
                                 {"é", Value::array({Value::boolean(true), Value::string("a")})}}));
  }
}

TEST(BinaryReader, LongLengthForms) {
  EXPECT_EQ(onlyObject(byte(0x5F) + byte(0x10) + byte(2) + "ab").stringValue(), "ab");
  EXPECT_EQ(onlyObject(byte(0x5F) + byte(0x13) + big(2, 8) + "ab").stringValue(), "ab");
  EXPECT_EQ(onlyObject(byte(0x4F) + byte(0x12) + big(0, 4)).dataValue().size(), 0U);
}

TEST(BinaryReader, RootAnywhereAndGapsAllowed) {
  BinaryFile file;
  file.objects = {byte(0x09), ascii("unreferenced"), file.array({0, 0})};
  file.root = 2;
  const Reading reading = readBytes(file.bytes());
  ASSERT_EQ(reading.error, nullptr) << reading.text();
  EXPECT_EQ(reading.value, Value::array({Value::boolean(true), Value::boolean(true)}));
}

TEST(BinaryReader, SharedContainersAreNotCycles) {
  BinaryFile file;
  file.objects = {file.array({1, 1, 2}), file.array({3}), file.array({1, 3}), byte(0x09)};
  const Reading reading = readBytes(file.bytes());
  ASSERT_EQ(reading.error, nullptr) << reading.text();
  const Value inner = Value::array({Value::boolean(true)});
  EXPECT_EQ(reading.value,
            Value::array({inner, inner, Value::array({inner, Value::boolean(true)})}));
}

TEST(BinaryReader, UnreferencedObjectsAreCheckedToo) {
  BinaryFile file;
  file.objects = {byte(0x09), byte(0x00)};
  EXPECT_EQ(readBytes(file.bytes()).codeName(), "E_PLIST_MARKER");
  file.objects = {byte(0x09), ascii("ok"), file.array({0, 1})};
  EXPECT_EQ(readBytes(file.bytes()).error, nullptr);
}

TEST(BinaryReader, ErrorMayBeUnwanted) {
  EXPECT_TRUE(readPropertyList(dataOf("x"), nullptr).isNull());
  EXPECT_TRUE(readPropertyList(nullptr, nullptr).isNull());
}

// The bytes that docs/formats/property-list.md shows.
TEST(BinaryWriter, WritesTheDocumentedExample) {
  const Value value = Value::dictionary(
      {{"name", Value::string("Été")},
       {"sizes", Value::array({Value::integer(1), Value::integer(-1), Value::integer(1)})}});
  const std::string expected = "bplist00" + byte(0xD2) + byte(1) + byte(2) + byte(3) + byte(4) +
                               ascii("name") + ascii("sizes") + utf16({0xC9, 't', 0xE9}) +
                               byte(0xA3) + byte(5) + byte(6) + byte(5) + byte(0x10) + byte(1) +
                               byte(0x13) + big(~0ULL, 8) + byte(8) + byte(13) + byte(18) +
                               byte(24) + byte(31) + byte(35) + byte(37) + std::string(6, '\0') +
                               byte(1) + byte(1) + big(7, 8) + big(0, 8) + big(46, 8);
  EXPECT_EQ(written(value), expected);
}

std::string singleObject(const Value& value) {
  const std::string bytes = written(value);
  return bytes.substr(8, bytes.size() - 8 - 1 - 32);
}

TEST(BinaryWriter, SmallestForms) {
  EXPECT_EQ(singleObject(Value::boolean(true)), byte(0x09));
  EXPECT_EQ(singleObject(Value::integer(0)), byte(0x10) + byte(0));
  EXPECT_EQ(singleObject(Value::integer(255)), byte(0x10) + byte(255));
  EXPECT_EQ(singleObject(Value::integer(256)), byte(0x11) + big(256, 2));
  EXPECT_EQ(singleObject(Value::integer(65536)), byte(0x12) + big(65536, 4));
  EXPECT_EQ(singleObject(Value::integer(1LL << 32)), byte(0x13) + big(1ULL << 32, 8));
  EXPECT_EQ(singleObject(Value::integer(-1)), byte(0x13) + big(~0ULL, 8));
  EXPECT_EQ(singleObject(Value::unsignedInteger(~0ULL)), byte(0x14) + big(0, 8) + big(~0ULL, 8));
  EXPECT_EQ(singleObject(Value(Number::real32(0.5F))), byte(0x22) + big(0x3F000000, 4));
  EXPECT_EQ(singleObject(Value::real(0.5)), byte(0x23) + big(0x3FE0000000000000, 8));
  EXPECT_EQ(singleObject(Value::uid(255)), byte(0x80) + byte(255));
  EXPECT_EQ(singleObject(Value::uid(256)), byte(0x81) + big(256, 2));
  EXPECT_EQ(singleObject(Value::uid(65536)), byte(0x83) + big(65536, 4));
  EXPECT_EQ(singleObject(Value::string("")), byte(0x50));
  EXPECT_EQ(singleObject(Value::string(std::string(15, 'a'))),
            byte(0x5F) + byte(0x10) + byte(15) + std::string(15, 'a'));
  EXPECT_EQ(singleObject(Value::string("𝄞")), byte(0x62) + big(0xD834DD1E, 4));
  EXPECT_EQ(singleObject(Value::array({})), byte(0xA0));
  EXPECT_EQ(singleObject(Value::dictionary({})), byte(0xD0));
}

TEST(BinaryWriter, EqualValuesAreWrittenOnceEachType) {
  const std::uint8_t bytes[] = {'a'};
  const auto values = [&] {
    return Array{Value::string("a"),
                 Value::data(bytes),
                 Value::integer(1),
                 Value::boolean(true),
                 Value::real(1),
                 Value(Number::real32(1)),
                 Value::uid(1),
                 Value::date(Date{1}),
                 Value::real(-0.0),
                 Value::real(0.0),
                 Value::unsignedInteger(~0ULL)};
  };
  Array twice = values();
  for (Value& value : values()) twice.push_back(value);
  const std::string file = written(Value::array(twice));
  EXPECT_EQ(file.substr(file.size() - 24, 8), big(1 + values().size(), 8));
  const Reading reading = readBytes(file);
  ASSERT_EQ(reading.error, nullptr) << reading.text();
  for (std::size_t i = 0; i < twice.size(); ++i) {
    const Value value = reading.value.arrayValue()[i];
    ASSERT_EQ(value.kind(), twice[i].kind());
    EXPECT_EQ(value, twice[i]);
    if (value.isNumber()) {
      EXPECT_EQ(value.numberValue().type(), twice[i].numberValue().type());
    }
  }
}

TEST(BinaryWriter, SharedContainersAreWrittenOnce) {
  Value value = Value::integer(1);
  for (int i = 0; i < 20; ++i) value = Value::array({value, value});
  const std::string file = written(value);
  EXPECT_LT(file.size(), 200U);
  EXPECT_EQ(readBytes(file).value, value);
}

TEST(BinaryWriter, ReferencesGrowWithTheNumberOfObjects) {
  for (const int count : {255, 256, 65535, 65536}) {
    Array array;
    for (int i = 0; i < count; ++i) array.push_back(Value::integer(i));
    const Value value = Value::array(std::move(array));
    const std::string file = written(value);
    EXPECT_EQ(file[file.size() - 25], count < 256 ? 1 : count < 65536 ? 2 : 4);
    EXPECT_EQ(readBytes(file).value, value);
  }
}

void expectWriteError(const Value& value, PropertyListFormat format, PropertyListError code,
                      const std::string& path) {
  ErrorPtr error;
  EXPECT_TRUE(writePropertyList(value, format, &error).empty());
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(propertyListErrorName(static_cast<PropertyListError>(error->code())),
            propertyListErrorName(code))
      << error->description();
  EXPECT_EQ(error->userInfo()["path"].asString("path").value_or(""), path);
}

TEST(Writers, RefuseWhatNoReaderWouldTake) {
  const auto under = [](const Value& value) {
    return Value::dictionary({{"a", Value::array({Value::integer(1), value})}});
  };
  for (const PropertyListFormat format : {PropertyListFormat::kBinary, PropertyListFormat::kXml}) {
    expectWriteError(Value(), format, PropertyListError::kWrite, "");
    expectWriteError(under(Value()), format, PropertyListError::kWrite, "a[1]");
    expectWriteError(under(Value::string("a\xFF")), format, PropertyListError::kWrite, "a[1]");
    expectWriteError(under(Value::string(std::string_view("a\0", 2))), format,
                     PropertyListError::kWrite, "a[1]");
    expectWriteError(under(Value::string(std::string((1U << 20) + 1, 'a'))), format,
                     PropertyListError::kLimit, "a[1]");
    expectWriteError(under(Value::date(Date{1e300})), format, PropertyListError::kRange, "a[1]");
    expectWriteError(under(Value::date(Date{std::numeric_limits<double>::quiet_NaN()})), format,
                     PropertyListError::kRange, "a[1]");
    expectWriteError(Value::dictionary({{std::string(257, 'k'), Value::integer(1)}}), format,
                     PropertyListError::kLimit,
                     format == PropertyListFormat::kXml ? std::string(257, 'k') : "");
  }
  expectWriteError(under(Value::uid(1)), PropertyListFormat::kXml, PropertyListError::kWrite,
                   "a[1]");
  expectWriteError(under(Value::string("\x01")), PropertyListFormat::kXml,
                   PropertyListError::kWrite, "a[1]");
  expectWriteError(under(Value::string("\xEF\xBF\xBE")), PropertyListFormat::kXml,
                   PropertyListError::kWrite, "a[1]");
}

TEST(Writers, DepthLimit) {
  Value value = Value::integer(1);
  for (int i = 0; i < 64; ++i) value = Value::array({value});
  EXPECT_EQ(readBytes(written(value)).value, value);
  EXPECT_EQ(readBytes(written(value, PropertyListFormat::kXml)).value, value);
  value = Value::array({value});
  expectWriteError(value, PropertyListFormat::kBinary, PropertyListError::kDepth, [] {
    std::string path;
    for (int i = 0; i < 64; ++i) path += "[0]";
    return path;
  }());
  // A tower that was written already stands again deeper down.
  Value tower = Value::integer(1);
  for (int i = 0; i < 60; ++i) tower = Value::array({tower});
  Value deeper = tower;
  for (int i = 0; i < 4; ++i) deeper = Value::array({deeper});
  expectWriteError(Value::array({tower, deeper}), PropertyListFormat::kBinary,
                   PropertyListError::kDepth, "[1][0][0][0][0]");
}

TEST(XmlReader, AllKinds) {
  const Reading reading = readBytes(xml(
      "<dict>\n<key>b</key><true/><key>f</key><false></false><key>i</key><integer> -12 </integer>"
      "<key>u</key><integer>18446744073709551615</integer><key>r</key><real>+1.5e3</real>"
      "<key>n</key><real>nan</real><key>m</key><real>-infinity</real>"
      "<key>d</key><date>2001-01-01T00:00:01Z</date><key>a</key><array><dict/><array/></array>"
      "<key>x</key><data>\n\tYWJj\n\tZA==\n</data><key>s</key><string>t</string>"
      "<key>e</key><string/><key>z</key><data/></dict>"));
  ASSERT_EQ(reading.error, nullptr) << reading.text();
  const std::uint8_t bytes[] = {'a', 'b', 'c', 'd'};
  const double infinity = std::numeric_limits<double>::infinity();
  EXPECT_EQ(reading.value,
            Value::dictionary({{"b", Value::boolean(true)},
                               {"f", Value::boolean(false)},
                               {"i", Value::integer(-12)},
                               {"u", Value::unsignedInteger(~0ULL)},
                               {"r", Value::real(1500)},
                               {"n", Value::real(std::numeric_limits<double>::quiet_NaN())},
                               {"m", Value::real(-infinity)},
                               {"d", Value::date(Date{1})},
                               {"a", Value::array({Value::dictionary({}), Value::array({})})},
                               {"x", Value::data(bytes)},
                               {"s", Value::string("t")},
                               {"e", Value::string("")},
                               {"z", Value::data({})}}));
  EXPECT_EQ(reading.value["b"].numberValue().type(), Number::Type::kBoolean);
  EXPECT_EQ(reading.value["u"].numberValue().type(), Number::Type::kUnsigned);
  EXPECT_EQ(reading.value.dictionaryValue().keyAt(3), "u");
}

TEST(XmlReader, TextForms) {
  const std::pair<const char*, const char*> rows[] = {
      {"a&lt;&gt;&amp;&quot;&apos;b", "a<>&\"'b"},
      {"&#65;&#x42;&#x20AC;&#x1D11E;", "AB€𝄞"},
      {"a\r\nb\rc\n", "a\nb\nc\n"},
      {"&#13;", "\r"},
      {"<![CDATA[<a>&amp;]]>", "<a>&amp;"},
      {"x<![CDATA[]]>y<![CDATA[a\r\nb]]>", "xya\nb"},
      {"a<!-- no text -->b", "ab"},
      {"  spaces  ", "  spaces  "},
      {"é 日本", "é 日本"},
      {"a]b]]c", "a]b]]c"}};
  for (const auto& [text, expected] : rows) {
    const Reading reading = readBytes(xml("<string>" + std::string(text) + "</string>"));
    ASSERT_EQ(reading.error, nullptr) << reading.text() << text;
    EXPECT_EQ(reading.value.stringValue(), expected);
  }
}

TEST(XmlReader, Prologs) {
  const std::string body = "<plist version='1.0'><!-- c --><true/> </plist>";
  const std::string outside = kDocumentType + " plist PUBLIC \"-//X//Y [EN]>\" \"http://x/y.dtd\">";
  for (const std::string& file :
       {body, "<plist><true/></plist>" + std::string("\n<!-- end -->\n"),
        "<?xml version=\"1.0\"?>" + body, "<?xml version='1.0' encoding='utf-8' ?>\n" + body,
        "<?xml version=\"1.0\" encoding=\"US-ASCII\" standalone=\"yes\"?>" + body,
        "\xEF\xBB\xBF<?xml version=\"1.0\" encoding=\"UTF-8\"?>" + body, "\n\t " + body,
        "<?xml version=\"1.0\"?><!-- a -->" + outside + "\n" + body, outside + body}) {
    const Reading reading = readBytes(file);
    EXPECT_EQ(reading.error, nullptr) << reading.text() << "\n" << file;
    EXPECT_EQ(reading.value, Value::boolean(true));
  }
}

TEST(XmlReader, Utf16WithMark) {
  const std::string text =
      "<?xml version=\"1.0\" encoding=\"utf-16\"?><plist><string>aXY</string>"
      "</plist>";
  for (const bool bigEndian : {true, false}) {
    std::string bytes = bigEndian ? "\xFE\xFF" : "\xFF\xFE";
    for (const char c : text) {
      const unsigned unit = c == 'X' ? 0xD834 : c == 'Y' ? 0xDD1E : static_cast<unsigned char>(c);
      bytes += bigEndian ? big(unit, 2) : byte(unit & 0xFF) + byte(unit >> 8);
    }
    const Reading reading = readBytes(bytes);
    ASSERT_EQ(reading.error, nullptr) << reading.text();
    EXPECT_EQ(reading.value.stringValue(), "a𝄞");
  }
}

TEST(XmlReader, KeysSharedAmongDictionariesHaveOneIndex) {
  const Reading reading = readBytes(
      xml("<array><dict><key>a</key><true/></dict><dict><key>&#97;</key><true/></dict></array>"));
  ASSERT_EQ(reading.error, nullptr) << reading.text();
  const ArrayView list = reading.value.arrayValue();
  EXPECT_EQ(list[0].dictionaryValue().keyObjectIndexAt(0),
            list[1].dictionaryValue().keyObjectIndexAt(0));
}

TEST(XmlWriter, WritesTheDocumentedExampleWithoutADocumentType) {
  const std::uint8_t bytes[] = {1, 2, 3, 4};
  const Value value = Value::dictionary(
      {{"a<b", Value::array({Value::boolean(true), Value::integer(-5), Value::real(0.5)})},
       {"d", Value::data(bytes)},
       {"e", Value::dictionary({})},
       {"t", Value::date(Date{86399.75})},
       {"s", Value::string("x & y\r")}});
  const std::string expected =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
      "\t<key>a&lt;b</key>\n\t<array>\n\t\t<true/>\n\t\t<integer>-5</integer>\n"
      "\t\t<real>0.5</real>\n\t</array>\n\t<key>d</key>\n\t<data>AQIDBA==</data>\n"
      "\t<key>e</key>\n\t<dict>\n\t</dict>\n\t<key>t</key>\n"
      "\t<date>2001-01-01T23:59:59Z</date>\n\t<key>s</key>\n"
      "\t<string>x &amp; y&#13;</string>\n</dict>\n</plist>\n";
  EXPECT_EQ(written(value, PropertyListFormat::kXml), expected);
}

}  // namespace
}  // namespace kx::test
