// The XML reader over any bytes. What it accepts reads the same from the binary file written from
// it and from the XML file written from it, and no file holds more values than its bytes have room
// for.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <vector>

#include "platform/foundation/PropertyList.h"

namespace {

constexpr std::size_t kMostBytes = std::size_t{64} << 10;
constexpr std::size_t kSmallestElement = 6;

void require(bool holds) {
  if (!holds) std::abort();
}

// Values below and including this one; XML shares nothing, so the walk is as long as the file.
std::size_t valuesIn(const kx::Value& root) {
  std::vector<kx::Value> stack{root};
  std::size_t count = 0;
  while (!stack.empty()) {
    const kx::Value value = std::move(stack.back());
    stack.pop_back();
    ++count;
    if (value.isArray()) {
      for (const kx::Value& element : value.arrayValue()) stack.push_back(element);
    } else if (value.isDictionary()) {
      const kx::DictionaryView view = value.dictionaryValue();
      for (std::size_t i = 0; i < view.size(); ++i) {
        require(view.find(view.keyAt(i)) == view.valueAt(i));
        stack.push_back(view.valueAt(i));
        ++count;
      }
    }
  }
  return count;
}

void requireSameAfter(const kx::Value& value, kx::PropertyListFormat format) {
  kx::ErrorPtr error;
  const auto bytes = kx::writePropertyList(value, format, &error);
  require(error == nullptr);
  const kx::Value again = kx::readPropertyList(std::make_shared<kx::Data>(bytes), &error);
  require(error == nullptr && again == value);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size > kMostBytes || (size > 0 && data[0] == 'b')) return 0;
  kx::ErrorPtr error;
  const kx::Value value = kx::readPropertyList(std::make_shared<kx::Data>(data, size), &error);
  if (error != nullptr) {
    require(value.isNull());
    const auto offset = error->userInfo()["offset"].asNumber("offset");
    require(offset.has_value() && offset->uint64Value() <= size);
    return 0;
  }
  require(valuesIn(value) <= size / kSmallestElement + 1);
  requireSameAfter(value, kx::PropertyListFormat::kBinary);
  requireSameAfter(value, kx::PropertyListFormat::kXml);
  return 0;
}
