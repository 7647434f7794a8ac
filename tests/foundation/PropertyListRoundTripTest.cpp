#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include "tests/foundation/PropertyListFiles.h"
#include "tests/foundation/RandomValues.h"

namespace kx::test {
namespace {

// The same kinds, number types and order too, which equality alone does not ask for.
void requireSame(const Value& a, const Value& b) {
  RC_ASSERT(a.kind() == b.kind());
  RC_ASSERT(a == b);
  if (a.isNumber()) RC_ASSERT(a.numberValue().type() == b.numberValue().type());
  if (a.isArray()) {
    for (std::size_t i = 0; i < a.arrayValue().size(); ++i) {
      requireSame(a.arrayValue()[i], b.arrayValue()[i]);
    }
  }
  if (a.isDictionary()) {
    const DictionaryView x = a.dictionaryValue();
    const DictionaryView y = b.dictionaryValue();
    for (std::size_t i = 0; i < x.size(); ++i) {
      RC_ASSERT(x.keyAt(i) == y.keyAt(i));
      requireSame(x.valueAt(i), y.valueAt(i));
    }
  }
}

Value readBack(const std::string& bytes) {
  const Reading reading = readBytes(bytes);
  if (reading.error != nullptr) RC_FAIL(reading.text());
  return reading.value;
}

RC_GTEST_PROP(PropertyListRoundTrip, BinaryKeepsEverything, ()) {
  const Value value = randomValue({}, 4);
  const std::string file = written(value);
  const Value read = readBack(file);
  requireSame(value, read);
  // Values read from a file are written like those built in memory.
  RC_ASSERT(written(read) == file);
}

RC_GTEST_PROP(PropertyListRoundTrip, XmlKeepsWhatItHasForms, ()) {
  ValueOptions options;
  options.uids = false;
  options.real32 = false;
  options.wholeSeconds = true;
  options.controlCharacters = false;
  const Value value = randomValue(options, 4);
  const std::string file = written(value, PropertyListFormat::kXml);
  const Value read = readBack(file);
  requireSame(value, read);
  RC_ASSERT(written(read, PropertyListFormat::kXml) == file);
  requireSame(read, readBack(written(read)));
}

RC_GTEST_PROP(PropertyListRoundTrip, DamagedFilesAreReadOrRefused,
              (std::size_t place, std::uint8_t change)) {
  std::string file = written(randomValue({}, 3));
  file[place % file.size()] = static_cast<char>(change);
  const Reading reading = readBytes(file);
  if (reading.error != nullptr) {
    RC_ASSERT(reading.value.isNull());
    RC_ASSERT(reading.offset().has_value());
    RC_ASSERT(*reading.offset() <= file.size());
  } else {
    requireSame(reading.value, readBack(written(reading.value)));
  }
}

RC_GTEST_PROP(PropertyListRoundTrip, LookUpFindsEachEntry, ()) {
  const Value built = randomValue({}, 4);
  RC_PRE(built.isDictionary());
  const DictionaryView view = readBack(written(built)).dictionaryValue();
  for (std::size_t i = 0; i < view.size(); ++i) {
    RC_ASSERT(view.find(view.keyAt(i)) == view.valueAt(i));
    RC_ASSERT(view.contains(view.keyAt(i)));
  }
  RC_ASSERT(view.find("no such key").isNull());
}

}  // namespace
}  // namespace kx::test
