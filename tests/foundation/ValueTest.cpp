#include "platform/foundation/Value.h"

#include <gtest/gtest.h>

#include "platform/foundation/Exceptions.h"
#include "tests/foundation/PropertyListFiles.h"

namespace kx::test {
namespace {

std::string messageOf(const auto& action) {
  try {
    action();
  } catch (const std::exception& error) {
    return error.what();
  }
  return "no exception";
}

Value sample() {
  return Value::dictionary({{"name", Value::string("Trip")},
                            {"count", Value::integer(3)},
                            {"list", Value::array({Value::boolean(true), Value::real(0.5)})}});
}

// The same content, read from a file.
Value sampleFromFile() { return readBytes(written(sample())).value; }

TEST(Value, NullDefaultAndAbsentAreDifferent) {
  const Value value = sample();
  EXPECT_TRUE(value["missing"].isNull());
  EXPECT_FALSE(value["name"].isNull());
  EXPECT_NE(Value::string(""), Value());
  EXPECT_NE(Value::integer(0), Value());
  EXPECT_EQ(Value(), Value());
  EXPECT_EQ(value["missing"].asString("missing"), std::nullopt);
  EXPECT_EQ(Value::optionalString(std::nullopt), Value());
  EXPECT_EQ(Value::optionalString(""), Value::string(""));
  EXPECT_EQ(Value::optionalNumber(std::nullopt), Value());
}

TEST(Value, ReadingsOfAnotherTypeNameKeyExpectedAndFound) {
  const Value text = Value::string("x");
  EXPECT_EQ(messageOf([&] { text.asNumber("rating"); }),
            "wrong type under \"rating\": expected number, found string");
  EXPECT_EQ(messageOf([&] { Value::integer(1).asString("uuid"); }),
            "wrong type under \"uuid\": expected string, found number");
  EXPECT_THROW(text.asDate("k"), TypeError);
  EXPECT_THROW(text.asData("k"), TypeError);
  EXPECT_THROW(text.asArray("k"), TypeError);
  EXPECT_THROW(text.asDictionary("k"), TypeError);
  EXPECT_THROW(Value().stringValue(), TypeError);
  EXPECT_THROW(text.numberValue(), TypeError);
  EXPECT_THROW(text.dateValue(), TypeError);
  EXPECT_THROW(text.dataValue(), TypeError);
  EXPECT_THROW(text.uidValue(), TypeError);
  EXPECT_THROW(text.arrayValue(), TypeError);
  EXPECT_THROW(text.dictionaryValue(), TypeError);
}

TEST(Value, ReadsWhatWasStored) {
  const std::uint8_t bytes[] = {1, 0, 255};
  EXPECT_EQ(Value::string(std::string_view("a\0b", 3)).stringValue().size(), 3U);
  EXPECT_EQ(Value::data(bytes).dataValue().size(), 3U);
  EXPECT_EQ(Value::data(bytes).dataValue()[2], 255);
  EXPECT_EQ(Value::uid(0xFFFFFFFF).uidValue(), 0xFFFFFFFF);
  EXPECT_EQ(Value::date(Date{-0.25}).dateValue(), Date{-0.25});
  EXPECT_EQ(Value::real(2.5).numberValue().type(), Number::Type::kReal64);
  EXPECT_EQ(Value::string("").stringValue(), "");
  EXPECT_TRUE(Value::array({}).arrayValue().empty());
  EXPECT_TRUE(Value::dictionary({}).dictionaryValue().empty());
}

TEST(Value, CopiesShareAndSurviveTheirSource) {
  Value copy;
  std::string_view view;
  {
    const Value value = sampleFromFile();
    copy = value["name"];
    view = copy.stringValue();
  }
  EXPECT_EQ(view, "Trip");
  Value moved = std::move(copy);
  EXPECT_EQ(moved.stringValue().data(), view.data());
  EXPECT_TRUE(copy.isNull());  // NOLINT: a moved-from value is null
  moved = *&moved;
  EXPECT_EQ(moved.stringValue(), "Trip");
}

TEST(Value, ViewsKeepTheirStorage) {
  const ArrayView list = sampleFromFile()["list"].arrayValue();
  EXPECT_EQ(list[1], Value::real(0.5));
  const DictionaryView fields = sampleFromFile().dictionaryValue();
  EXPECT_EQ(fields.find("count"), Value::integer(3));
}

TEST(Value, TextsOfAnArrayAreReadWithoutValues) {
  const Value built = Value::dictionary(
      {{"list", Value::array({Value::string("a"), Value::string(""), Value::integer(1)})}});
  const Value read = readBytes(written(built)).value;
  for (const Value& value : {built, read}) {
    const ArrayView list = value["list"].arrayValue();
    EXPECT_EQ(list.stringAt(0, "list"), OptionalString("a"));
    EXPECT_EQ(list.stringAt(1, "list"), OptionalString(""));
    EXPECT_THROW(list.stringAt(2, "list"), TypeError);
    EXPECT_THROW(list.stringAt(3, "list"), InternalInconsistency);
  }
}

TEST(Value, EqualWhateverItIsMadeOf) {
  EXPECT_EQ(sample(), sampleFromFile());
  EXPECT_EQ(sampleFromFile(), sample());
  EXPECT_EQ(Value::dictionary({{"a", Value::integer(1)}, {"b", Value::integer(2)}}),
            Value::dictionary({{"b", Value::real(2)}, {"a", Value::boolean(true)}}));
  EXPECT_NE(Value::dictionary({{"a", Value::integer(1)}}),
            Value::dictionary({{"b", Value::integer(1)}}));
  EXPECT_NE(Value::array({Value::integer(1)}),
            Value::array({Value::integer(1), Value::integer(1)}));
  EXPECT_NE(Value::string("1"), Value::integer(1));
  EXPECT_NE(Value::uid(1), Value::integer(1));
  const std::uint8_t bytes[] = {'a'};
  EXPECT_NE(Value::data(bytes), Value::string("a"));
  EXPECT_EQ(Value::array({sample(), sample()}), Value::array({sample(), sampleFromFile()}));
}

TEST(Value, SubscriptOfWhatIsNoDictionaryIsNull) {
  EXPECT_TRUE(Value()["a"].isNull());
  EXPECT_TRUE(Value::integer(1)["a"].isNull());
  EXPECT_TRUE(Value::array({})["a"].isNull());
}

TEST(Value, IndexOutOfBoundsRaises) {
  EXPECT_THROW(sample()["list"].arrayValue()[2], InternalInconsistency);
  EXPECT_THROW(sampleFromFile()["list"].arrayValue()[2], InternalInconsistency);
  EXPECT_THROW(sample().dictionaryValue().keyAt(3), InternalInconsistency);
  EXPECT_THROW(sampleFromFile().dictionaryValue().valueAt(3), InternalInconsistency);
}

TEST(Value, Description) {
  EXPECT_EQ(Value().description(), "(null)");
  EXPECT_EQ(Value::string("a \"b\"").description(), "a \"b\"");
  EXPECT_EQ(Value::integer(7).description(), "7");
  EXPECT_EQ(Value::uid(7).description(), "UID(7)");
  EXPECT_EQ(Value::date(Date{0}).description(), "2001-01-01 00:00:00 +0000");
  const std::uint8_t bytes[] = {0x0A, 0xFF};
  EXPECT_EQ(Value::data(bytes).description(), "<0aff>");
  EXPECT_EQ(Value::array({}).description(), "(\n)");
  const std::string text =
      "{\n    name = \"Trip\";\n    count = 3;\n    list = (\n        1,\n        0.5\n    );\n}";
  EXPECT_EQ(sample().description(), text);
  EXPECT_EQ(sampleFromFile().description(), text);
  EXPECT_EQ(Value::dictionary({{"two words", Value::string("a\"b")}}).description(),
            "{\n    \"two words\" = \"a\\\"b\";\n}");
}

Value deepArray(std::size_t levels) {
  Value value = Value::integer(1);
  for (std::size_t i = 0; i < levels; ++i) value = Value::array({std::move(value)});
  return value;
}

Value deepDictionary(std::size_t levels) {
  Value value = Value::integer(1);
  const Value key = Value::string("k");
  for (std::size_t i = 0; i < levels; ++i) {
    Dictionary dictionary;
    dictionary.set(key, std::move(value));
    value = Value::dictionary(std::move(dictionary));
  }
  return value;
}

constexpr std::size_t kMillion = 1'000'000;

TEST(DeepValue, DestructionComparisonAndDescriptionDoNotRecurse) {
  for (const auto& make : {deepArray, deepDictionary}) {
    const Value a = make(kMillion);
    const Value b = make(kMillion);
    EXPECT_TRUE(a == b);
    EXPECT_FALSE(a == make(kMillion - 1));
    EXPECT_LT(a.description().size(), std::size_t{2} << 20);
    Value copy = a;
    copy = Value();
  }
}

TEST(DeepValue, WritersRefuseWithoutRecursion) {
  for (const PropertyListFormat format : {PropertyListFormat::kBinary, PropertyListFormat::kXml}) {
    ErrorPtr error;
    EXPECT_TRUE(writePropertyList(deepArray(kMillion), format, &error).empty());
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->code(), static_cast<std::int64_t>(PropertyListError::kDepth));
  }
}

TEST(DeepValue, DictionaryAndArrayBeingBuiltAreReleasedWithoutRecursion) {
  Dictionary dictionary;
  dictionary.set("deep", deepArray(kMillion));
  Array array{deepDictionary(kMillion), deepArray(kMillion)};
  array.clear();
  dictionary.remove("deep");
  EXPECT_TRUE(dictionary.empty());
}

// 2^60 leaves when shared containers are counted each time.
TEST(DeepValue, ComparisonOfSharedContainersStaysCheap) {
  const auto make = [] {
    Value value = Value::integer(1);
    for (int i = 0; i < 60; ++i) value = Value::array({value, value});
    return value;
  };
  EXPECT_TRUE(make() == make());
  EXPECT_FALSE(make() == Value::array({make(), make()}));
  EXPECT_LT(make().description().size(), std::size_t{2} << 20);
}

TEST(Dictionary, RoomForManyChangesNothing) {
  for (const std::size_t room : {0U, 1U, 13U, 1000U}) {
    Dictionary dictionary;
    for (int i = 0; i < 20; ++i) {
      if (i == 5 || i == 15) dictionary.reserve(room);
      dictionary.set(Value::string("key " + std::to_string(i)), Value::integer(i));
      if (i > 3) dictionary.set("key 3", Value::integer(-3));
      dictionary.remove("key 4");
    }
    ASSERT_EQ(dictionary.size(), 19U) << room;
    for (int i = 0; i < 19; ++i) {
      const int number = i < 4 ? i : i + 1;
      const std::string key = "key " + std::to_string(number);
      EXPECT_EQ(dictionary.keyAt(static_cast<std::size_t>(i)), key);
      EXPECT_EQ(dictionary.find(key), Value::integer(number == 3 ? -3 : number));
    }
    EXPECT_FALSE(dictionary.contains("key 4"));
  }
}

TEST(Dictionary, KeepsInsertionOrderAndPlaceOfReplacedKeys) {
  Dictionary dictionary{{"b", Value::integer(1)}, {"a", Value::integer(2)}};
  dictionary.set("c", Value::integer(3));
  dictionary.set("b", Value::integer(4));
  EXPECT_EQ(dictionary.keyAt(0), "b");
  EXPECT_EQ(dictionary.valueAt(0), Value::integer(4));
  dictionary.remove("b");
  dictionary.remove("missing");
  dictionary.set("b", Value::integer(5));
  EXPECT_EQ(dictionary.keyAt(0), "a");
  EXPECT_EQ(dictionary.keyAt(2), "b");
  EXPECT_EQ(dictionary.size(), 3U);
  EXPECT_THROW(dictionary.keyAt(3), InternalInconsistency);
}

TEST(Dictionary, NullIsRefusedAndLeftOut) {
  Dictionary dictionary;
  EXPECT_THROW(dictionary.set("a", Value()), InternalInconsistency);
  EXPECT_THROW(dictionary.set(Value::string("a"), Value()), InternalInconsistency);
  EXPECT_THROW(dictionary.set(Value::integer(1), Value::integer(1)), TypeError);
  dictionary.setIfPresent("a", Value());
  EXPECT_TRUE(dictionary.empty());
  EXPECT_FALSE(dictionary.contains("a"));
}

TEST(Dictionary, CopiesAreIndependentAndMovedFromOnesUsable) {
  Dictionary first{{"a", Value::integer(1)}};
  Dictionary second(first);
  second.set("b", Value::integer(2));
  EXPECT_EQ(first.size(), 1U);
  const Value value = Value::dictionary(std::move(first));
  first.set("c", Value::integer(3));  // NOLINT: moved-from dictionaries are empty
  EXPECT_EQ(first.size(), 1U);
  EXPECT_EQ(value.dictionaryValue().size(), 1U);
  const Dictionary third(value.dictionaryValue());
  EXPECT_EQ(third.find("a"), Value::integer(1));
  EXPECT_EQ(Dictionary(first).size(), 1U);
}

TEST(Dictionary, ManyKeysAreFound) {
  constexpr int kCount = 2000;
  Dictionary dictionary;
  for (int i = 0; i < kCount; ++i) dictionary.set("key" + std::to_string(i), Value::integer(i));
  for (int i = 0; i < kCount; i += 3) dictionary.remove("key" + std::to_string(i));
  const Value built = Value::dictionary(dictionary);
  const Value read = readBytes(written(built)).value;
  EXPECT_EQ(built, read);
  for (const Value& value : {built, read}) {
    for (int i = 0; i < kCount; ++i) {
      const Value found = value["key" + std::to_string(i)];
      EXPECT_EQ(found, i % 3 == 0 ? Value() : Value::integer(i));
    }
    EXPECT_FALSE(value.dictionaryValue().contains("missing"));
    EXPECT_TRUE(value.dictionaryValue().contains("key1"));
  }
}

TEST(DictionaryView, KeyIndexesRecogniseEqualKeys) {
  const Value file = readBytes(written(Value::array({sample(), sample()}))).value;
  const ArrayView list = file.arrayValue();
  const DictionaryView first = list[0].dictionaryValue();
  const DictionaryView second = list[1].dictionaryValue();
  for (std::size_t i = 0; i < first.size(); ++i) {
    ASSERT_TRUE(first.keyObjectIndexAt(i).has_value());
    EXPECT_EQ(first.keyObjectIndexAt(i), second.keyObjectIndexAt(i));
    EXPECT_LT(*first.keyObjectIndexAt(i), first.documentObjectCount());
    EXPECT_EQ(first.keyAt(i), first.keyValueAt(i).stringValue());
  }
  const DictionaryView built = sample().dictionaryValue();
  EXPECT_EQ(built.keyObjectIndexAt(0), std::nullopt);
  EXPECT_EQ(built.documentObjectCount(), 0U);
  EXPECT_EQ(built.keyValueAt(1).stringValue(), "count");
}

}  // namespace
}  // namespace kx::test
