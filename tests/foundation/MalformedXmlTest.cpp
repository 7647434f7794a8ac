// XML property lists that are none: each class of damage with its exact error.
#include <gtest/gtest.h>

#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

class MalformedXml : public testing::TestWithParam<BadInput> {};

TEST_P(MalformedXml, IsRefused) {
  const Reading reading = readBytes(GetParam().bytes());
  EXPECT_EQ(reading.codeName(), propertyListErrorName(GetParam().code)) << reading.text();
  EXPECT_TRUE(reading.value.isNull());
  ASSERT_NE(reading.error, nullptr);
  EXPECT_EQ(reading.error->domain(), "com.veltro.plist");
  if (GetParam().offset) {
    EXPECT_EQ(reading.offset(), GetParam().offset) << reading.text();
  } else {
    EXPECT_TRUE(reading.offset().has_value());
  }
}

using Rows = std::vector<BadInput>;

std::string nameOf(const testing::TestParamInfo<BadInput>& info) {
  return badInputName(info.param);
}

// A row whose damage stands `at` bytes into the content of <plist>.
BadInput inBody(const char* name, const LazyText& body, PropertyListError code, std::size_t at) {
  return {name, [body] { return xml(body()); }, code, xmlBodyOffset() + at};
}

const char* const kDeclaration = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>";

Rows documentTypeRows() {
  const auto code = PropertyListError::kXmlDtd;
  const auto before = [](const std::string& text) {
    return text + "<plist version=\"1.0\"><true/></plist>";
  };
  const auto subset = [&](const std::string& inside) {
    return before(kDocumentType + " plist [" + inside + "]>");
  };
  const std::size_t bracket = kDocumentType.size() + 7;
  return {
      {"EmptyInternalSubset", subset(""), code, bracket},
      {"Entity", subset("<!ENTITY a \"b\">"), code, bracket},
      {"ParameterEntity", subset("<!ENTITY % a SYSTEM \"file:///etc/passwd\"> %a;"), code, bracket},
      {"SubsetAfterExternalName",
       before(kDocumentType + " plist PUBLIC \"a\" \"b\" [<!ELEMENT plist ANY>]>"), code,
       kDocumentType.size() + 22},
      {"Laughs",
       subset("<!ENTITY a \"aaaaaaaaaa\"><!ENTITY b \"&a;&a;&a;&a;\"><!ENTITY c \"&b;&b;\">"), code,
       bracket},
      {"EntityWithoutType", before("<!ENTITY a \"b\">"), code, 0},
      {"TwoTypes", before(kDocumentType + " plist>" + kDocumentType + " plist>"), code,
       kDocumentType.size() + 7},
      inBody("TypeInBody", kDocumentType + " plist><true/>", code, 0),
      inBody("EntityInBody", "<array><!ENTITY a \"b\"></array>", code, 7),
      inBody("UndefinedEntity", "<string>a&nbsp;b</string>", code, 9),
      inBody("UndefinedEntityInKey", "<dict><key>&a;</key><true/></dict>", code, 11),
      inBody("EntityOfOtherCase", "<string>&LT;</string>", code, 8)};
}

Rows characterRows() {
  const auto code = PropertyListError::kXmlChar;
  return {inBody("ReferenceToNul", "<string>&#0;</string>", code, 8),
          inBody("ReferenceToNulInHex", "<string>a&#x00;</string>", code, 9),
          inBody("ReferenceToSurrogate", "<string>&#xD800;</string>", code, 8),
          inBody("ReferenceToLowSurrogate", "<string>&#57343;</string>", code, 8),
          inBody("ReferenceToControl", "<string>&#1;</string>", code, 8),
          inBody("ReferenceTooLarge", "<string>&#x110000;</string>", code, 8),
          inBody("ReferenceFarTooLarge", "<string>&#99999999999999999999;</string>", code, 8),
          inBody("ReferenceToNonCharacter", "<string>&#xFFFE;</string>", code, 8),
          inBody("BareControl", "<string>a\x01</string>", code, 9),
          inBody("BareEscapeInString", "<string>\x1B[0m</string>", code, 8),
          inBody("ControlBetweenElements", "<array>\x02</array>", code, 7),
          inBody("ControlInComment", "<!-- \x03 --><true/>", code, 5)};
}

Rows structureRows() {
  const auto code = PropertyListError::kXmlSyntax;
  return {inBody("Empty", "", code, 0),
          inBody("CommentAlone", "<!-- a -->", code, 10),
          inBody("TwoValues", "<true/><true/>", code, 7),
          inBody("Text", "text", code, 0),
          inBody("TextInArray", "<array>text</array>", code, 7),
          inBody("UnknownElement", "<set/>", code, 0),
          inBody("UnknownElementInArray", "<array><null/></array>", code, 7),
          inBody("ElementOfOtherCase", "<Dict/>", code, 0),
          inBody("WrongEnd", "<array></dict>", code, 7),
          inBody("WrongEndOfString", "<string>a</key>", code, 9),
          inBody("ElementInString", "<string>a<true/></string>", code, 9),
          inBody("EndTooMany", "<true/></array>", code, 7),
          inBody("KeyOutsideDictionary", "<key>a</key>", code, 0),
          inBody("KeyInArray", "<array><key>a</key></array>", code, 7),
          inBody("KeyWithoutValue", "<dict><key>a</key></dict>", code, 18),
          inBody("TwoKeys", "<dict><key>a</key><key>b</key></dict>", code, 18),
          inBody("ValueWithoutKey", "<dict><true/></dict>", code, 6),
          inBody("SecondValueWithoutKey", "<dict><key>a</key><true/><true/></dict>", code, 25),
          inBody("Instruction", "<?php ?>", code, 0),
          inBody("UnknownMarkup", "<!a>", code, 0),
          inBody("NestedPlist", "<plist><true/></plist>", code, 0)};
}

Rows tagRows() {
  const auto code = PropertyListError::kXmlSyntax;
  const std::string good = xml("<dict><key>a</key><string>b</string></dict>");
  Rows rows = {inBody("Attribute", "<true a=\"b\"/>", code, 6),
               inBody("AttributeOfString", "<string xml:lang=\"en\">a</string>", code, 8),
               inBody("VersionOfArray", "<array version=\"1.0\"/>", code, 7),
               inBody("AttributeWithoutValue", "<true a/>", code, 6),
               inBody("AttributeWithoutQuotes", "<true a=b/>", code, 8),
               inBody("AttributeOpen", "<true a=\"b/>", code, 12),
               inBody("SpaceBeforeName", "< true/>", code, 1),
               inBody("NoName", "<>", code, 1),
               inBody("SlashInside", "<true/ >", code, 6),
               inBody("EndWithAttribute", "<array></array a=\"b\">", code, 15),
               inBody("EndWithSlash", "<array></array/>", code, 14),
               {"PlistVersion2", "<plist version=\"2.0\"><true/></plist>", code, 7},
               {"PlistAttribute", "<plist a=\"1.0\"><true/></plist>", code, 7},
               {"NoPlist", "<dict/>", code, 0},
               {"EmptyPlist", "<plist/>", code, 0},
               {"JunkAfterRoot", xml("<true/>") + "x", code, xml("<true/>").size()},
               {"ElementAfterRoot", xml("<true/>") + "<true/>", code, xml("<true/>").size()},
               {"DeclarationAfterSpace", " " + xml("<true/>"), code, 1},
               {"Xml11", "<?xml version=\"1.1\"?><plist><true/></plist>", code, 14},
               {"DeclarationWithoutVersion", "<?xml encoding=\"UTF-8\"?><plist/>", code, 6},
               {"DeclarationOpen", "<?xml version=\"1.0\"", code, {}},
               {"TypeOpen", kDocumentType + " plist", code, 0},
               {"LessThan", "<", code, {}}};
  for (const std::size_t length : {good.size() - 1, good.size() - 8, good.size() - 14,
                                   good.size() - 20, good.size() - 30, good.size() - 40}) {
    rows.push_back({"CutTo" + std::to_string(length), good.substr(0, length), code, {}});
  }
  return rows;
}

Rows scalarRows() {
  const auto code = PropertyListError::kXmlSyntax;
  const auto range = PropertyListError::kRange;
  return {inBody("Base64Letter", "<data>ab*d</data>", code, 8),
          inBody("Base64Short", "<data>abc</data>", code, 9),
          inBody("Base64PaddingFirst", "<data>=abc</data>", code, 6),
          inBody("Base64LetterAfterPadding", "<data>ab=c</data>", code, 9),
          inBody("Base64AfterPadding", "<data>abc=abcd</data>", code, 10),
          inBody("Base64LeftoverBits", "<data>ab==</data>", code, 9),
          inBody("Base64Reference", "<data>&#97;bcd</data>", code, 6),
          inBody("IntegerEmpty", "<integer/>", code, 10),
          inBody("IntegerText", "<integer>one</integer>", code, 9),
          inBody("IntegerReal", "<integer>1.5</integer>", code, 9),
          inBody("IntegerTwoSigns", "<integer>--1</integer>", code, 9),
          inBody("Integer2Pow64", "<integer>18446744073709551616</integer>", range, 9),
          inBody("IntegerBelowLowest", "<integer>-9223372036854775809</integer>", range, 9),
          inBody("RealEmpty", "<real></real>", code, 6),
          inBody("RealText", "<real>1.5x</real>", code, 6),
          inBody("RealSignOnly", "<real>-</real>", code, 6),
          inBody("RealHex", "<real>0x10</real>", code, 6),
          inBody("RealNanWithPayload", "<real>nan(1)</real>", code, 6),
          inBody("RealTooLarge", "<real>1e999</real>", range, 6),
          inBody("DateWithoutTime", "<date>2001-01-01</date>", code, 6),
          inBody("DateWithOffset", "<date>2001-01-01T00:00:00+00:00</date>", code, 6),
          inBody("DateMonth13", "<date>2001-13-01T00:00:00Z</date>", code, 6),
          inBody("DateDay30InFebruary", "<date>2000-02-30T00:00:00Z</date>", code, 6),
          inBody("DateHour24", "<date>2001-01-01T24:00:00Z</date>", code, 6),
          inBody("DateSpace", "<date>2001-01-01 00:00:00Z</date>", code, 16),
          inBody("DateYear0", "<date>0000-01-01T00:00:00Z</date>", range, 6),
          inBody("BooleanWithText", "<true>yes</true>", code, 6)};
}

Rows textRows() {
  const auto code = PropertyListError::kXmlSyntax;
  return {inBody("ReferenceOpen", "<string>a&amp</string>", code, 9),
          inBody("BareAmpersand", "<string>a & b</string>", code, 10),
          inBody("ReferenceEmpty", "<string>&;</string>", code, 8),
          inBody("ReferenceWithoutDigits", "<string>&#;</string>", code, 8),
          inBody("HexWithoutDigits", "<string>&#x;</string>", code, 8),
          inBody("ReferenceWithLetters", "<string>&#12a;</string>", code, 8),
          inBody("CdataOpen", "<string><![CDATA[a</string>", code, 8),
          inBody("CdataEndAlone", "<string>a]]>b</string>", code, 9),
          inBody("CommentOpen", "<!-- a", code, 0),
          inBody("CommentWithDashes", "<!-- a -- b --><true/>", code, 7),
          inBody("CommentWithThreeDashes", "<!-- a ---><true/>", code, 7),
          inBody("CdataBetweenElements", "<array><![CDATA[a]]></array>", code, 7)};
}

std::string utf16Text(const std::string& text, bool bigEndian) {
  std::string bytes = bigEndian ? "\xFE\xFF" : "\xFF\xFE";
  for (const char c : text) bytes += bigEndian ? byte(0) + c : c + byte(0);
  return bytes;
}

Rows encodingRows() {
  const auto code = PropertyListError::kTextEncoding;
  const std::string plist = "<plist version=\"1.0\"><true/></plist>";
  const std::string declared16 = "<?xml version=\"1.0\" encoding=\"UTF-16\"?>" + plist;
  const std::string wide = utf16Text(plist, true);
  std::string lone = wide;
  std::string utf32 = std::string("\xFF\xFE\0\0", 4);
  for (const char c : plist) utf32 += c + std::string(3, '\0');
  lone.replace(wide.size() - 4, 2, "\xD8\x01");
  return {{"DeclaredUtf16InUtf8", declared16, code, 29},
          {"DeclaredUtf16AfterUtf8Mark", "\xEF\xBB\xBF" + declared16, code, 32},
          {"DeclaredUtf8InUtf16", utf16Text(kDeclaration + plist, true), code, 2 + 2 * 29},
          {"DeclaredLatin1", "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>" + plist, code, 29},
          {"Utf16OddLength", wide + byte(0), code, wide.size()},
          {"Utf16OddLengthCut", wide.substr(0, wide.size() - 1), code, wide.size() - 2},
          {"Utf16LoneSurrogate", lone, code, wide.size() - 4},
          {"Utf16WithoutMark", utf16Text(plist, false).substr(2), code, {}},
          {"Utf32", utf32, code, 2},
          inBody("Latin1", "<string>a\xE9</string>", code, 9),
          inBody("Overlong2", "<string>\xC0\xAF</string>", code, 8),
          inBody("Overlong3", "<string>\xE0\x80\xAF</string>", code, 8),
          inBody("SurrogateInUtf8", "<string>\xED\xA0\x80</string>", code, 8),
          inBody("AboveUnicode", "<string>\xF4\x90\x80\x80</string>", code, 8),
          inBody("CutSequence", "<string>\xE2\x82</string>", code, 8),
          inBody("BadInKey", "<dict><key>\xFF</key><true/></dict>", code, 11),
          inBody("BadBetweenElements", "<array>\xFF</array>", code, 7),
          inBody("NulInString", std::string("<string>a\0b</string>", 20), code, 9),
          inBody("NulBetweenElements", std::string("<array>\0</array>", 16), code, 7),
          inBody("NulInCdata", std::string("<string><![CDATA[\0]]></string>", 30), code, 17),
          {"NulAfterRoot", xml("<true/>") + byte(0), code, xml("<true/>").size()},
          inBody("NulInName", std::string("<\0true/>", 8), code, 1)};
}

std::string repeated(const std::string& text, std::size_t times) {
  std::string result;
  result.reserve(text.size() * times);
  for (std::size_t i = 0; i < times; ++i) result += text;
  return result;
}

std::string attributes(std::size_t count) {
  std::string result;
  for (std::size_t i = 0; i < count; ++i) result += " a" + std::to_string(i) + "=\"\"";
  return result;
}

Rows limitRows() {
  const auto code = PropertyListError::kXmlLimit;
  constexpr std::size_t kMega = 1'000'000;
  return {
      inBody("TwoAttributes", "<true a=\"\" b=\"\"/>", code, 11),
      inBody(
          "AMillionAttributes", [] { return "<true" + attributes(kMega) + "/>"; }, code, 5 + 7),
      {"AMillionAttributesOfPlist",
       [] { return "<plist version=\"1.0\"" + attributes(kMega) + ">"; }, code, 21},
      inBody("NameOf65", "<" + std::string(65, 'a') + "/>", code, 1),
      inBody(
          "NameOf10Megabytes", [] { return "<" + std::string(10 * kMega, 'a') + "/>"; }, code, 1),
      inBody(
          "AttributeNameOf10Megabytes",
          [] { return "<true " + std::string(10 * kMega, 'a') + "=\"\"/>"; }, code, 6),
      inBody(
          "AttributeValueTooLong",
          [] { return "<true a=\"" + std::string(2 * kMega, 'a') + "\"/>"; }, code, 8),
      inBody(
          "TenMillionCommentOpeners", [] { return repeated("<!--", 10 * kMega); }, code, 0),
      inBody(
          "CommentTooLong", [] { return "<!--" + std::string(2 * kMega, ' ') + "-->"; }, code, 0),
      inBody(
          "StringTooLong", [] { return "<string>" + std::string(2 * kMega, 'a') + "</string>"; },
          code, 8),
      inBody(
          "StringOfReferencesTooLong",
          [] { return "<string>" + repeated("&lt;", 2 * kMega) + "</string>"; }, code, 8),
      inBody(
          "CdataTooLong", [] { return "<string><![CDATA[" + std::string(2 * kMega, ' '); }, code,
          8),
      {"TypeTooLong", [] { return kDocumentType + std::string(2 * kMega, ' ') + ">"; }, code, 0}};
}

Rows otherRows() {
  std::string deep;
  for (int i = 0; i < 65; ++i) deep += "<array>";
  const auto deeper = [] { return repeated("<dict><key>k</key>", 500'000); };
  return {inBody("Depth65", deep, PropertyListError::kDepth, 64 * 7),
          inBody("Depth500000", deeper, PropertyListError::kDepth, 64 * 18),
          inBody("DuplicateKey", "<dict><key>a</key><true/><key>a</key><true/></dict>",
                 PropertyListError::kDupKey, 25),
          inBody("DuplicateKeyOtherwiseWritten",
                 "<dict><key>a</key><true/><key>&#97;</key><true/></dict>",
                 PropertyListError::kDupKey, 25),
          inBody("DuplicateKeyAroundANestedOne",
                 "<dict><key>a</key><dict><key>a</key><true/></dict><key>a</key><true/></dict>",
                 PropertyListError::kDupKey, 50),
          inBody("DuplicateEmptyKey", "<dict><key/><true/><key></key><true/></dict>",
                 PropertyListError::kDupKey, 19),
          inBody("KeyOf257", "<dict><key>" + std::string(257, 'a') + "</key><true/></dict>",
                 PropertyListError::kLimit, 6)};
}

INSTANTIATE_TEST_SUITE_P(DocumentType, MalformedXml, testing::ValuesIn(documentTypeRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Character, MalformedXml, testing::ValuesIn(characterRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Structure, MalformedXml, testing::ValuesIn(structureRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Tag, MalformedXml, testing::ValuesIn(tagRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Scalar, MalformedXml, testing::ValuesIn(scalarRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Text, MalformedXml, testing::ValuesIn(textRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Encoding, MalformedXml, testing::ValuesIn(encodingRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Limit, MalformedXml, testing::ValuesIn(limitRows()), nameOf);
INSTANTIATE_TEST_SUITE_P(Other, MalformedXml, testing::ValuesIn(otherRows()), nameOf);

TEST(MalformedXmlPath, NamesTheKeysDownToTheValue) {
  const Reading reading = readBytes(
      xml("<dict><key>updates</key><array><true/><dict><key>rating</key><integer>x</integer>"
          "</dict></array></dict>"));
  EXPECT_EQ(reading.codeName(), "E_XML_SYNTAX");
  EXPECT_EQ(reading.path(), "updates[1].rating");
}

TEST(MalformedXmlPath, EachCutOfAGoodFileIsRefused) {
  const std::string good =
      xml("<dict><key>a</key><array><integer>1</integer><string>a&amp;b</string></array>"
          "<key>b</key><date>2001-01-01T00:00:00Z</date><key>c</key><data>YWJj</data></dict>");
  ASSERT_EQ(readBytes(good).error, nullptr) << readBytes(good).text();
  for (std::size_t length = 0; length < good.size(); ++length) {
    EXPECT_NE(readBytes(good.substr(0, length)).error, nullptr) << "cut to " << length;
  }
}

}  // namespace
}  // namespace kx::test
