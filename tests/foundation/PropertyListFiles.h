#pragma once

#include <cstdint>
#include <cstdlib>
#include <functional>
#include <iterator>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/foundation/PropertyList.h"

// Builds property-list files byte by byte, good and bad ones, without the writers under test.
namespace kx::test {

inline std::string big(std::uint64_t value, unsigned size) {
  std::string bytes(size, '\0');
  for (unsigned i = size; i-- > 0; value >>= 8) bytes[i] = static_cast<char>(value & 0xFF);
  return bytes;
}

inline std::string byte(unsigned value) { return std::string(1, static_cast<char>(value)); }

// Marker with a length: 15 and more take an integer of 1, 2, 4 or 8 bytes behind the marker.
inline std::string head(unsigned marker, std::uint64_t count) {
  if (count < 15) return byte(marker | static_cast<unsigned>(count));
  if (count < 0x100) return byte(marker | 15) + byte(0x10) + big(count, 1);
  if (count < 0x10000) return byte(marker | 15) + byte(0x11) + big(count, 2);
  return byte(marker | 15) + byte(0x12) + big(count, 4);
}

inline std::string ascii(const std::string& text) { return head(0x50, text.size()) + text; }

inline std::string utf16(const std::vector<unsigned>& units) {
  std::string bytes = head(0x60, units.size());
  for (const unsigned unit : units) bytes += big(unit, 2);
  return bytes;
}

// A binary property list: objects one after the other from byte 8 on. What is set overrides what a
// well-formed file would hold.
struct BinaryFile {
  std::vector<std::string> objects;
  unsigned offsetSize = 1;
  unsigned referenceSize = 1;
  std::uint64_t root = 0;
  std::optional<std::uint64_t> count;
  std::optional<std::uint64_t> table;
  std::map<std::size_t, std::uint64_t> offsets;  // by object
  std::string magic = "bplist00";

  std::string array(const std::vector<std::uint64_t>& references) const {
    std::string bytes = head(0xA0, references.size());
    for (const std::uint64_t reference : references) bytes += big(reference, referenceSize);
    return bytes;
  }
  // Keys first, then values.
  std::string dictionary(const std::vector<std::uint64_t>& keys,
                         const std::vector<std::uint64_t>& values) const {
    std::string bytes = head(0xD0, keys.size());
    for (const std::uint64_t reference : keys) bytes += big(reference, referenceSize);
    for (const std::uint64_t reference : values) bytes += big(reference, referenceSize);
    return bytes;
  }
  std::uint64_t offsetOf(std::size_t object) const {
    std::uint64_t offset = magic.size();
    for (std::size_t i = 0; i < object; ++i) offset += objects[i].size();
    return offset;
  }
  std::uint64_t tableOffset() const { return offsetOf(objects.size()); }
  std::uint64_t trailerOffset() const { return tableOffset() + objects.size() * offsetSize; }

  std::string bytes() const {
    std::string file = magic;
    for (const std::string& object : objects) file += object;
    const std::uint64_t tableStart = file.size();
    for (std::size_t i = 0; i < objects.size(); ++i) {
      const auto found = offsets.find(i);
      file += big(found == offsets.end() ? offsetOf(i) : found->second, offsetSize);
    }
    file += std::string(6, '\0') + byte(offsetSize) + byte(referenceSize);
    file += big(count.value_or(objects.size()), 8) + big(root, 8);
    return file + big(table.value_or(tableStart), 8);
  }
};

inline DataPtr dataOf(const std::string& bytes) {
  return std::make_shared<const Data>(bytes.data(), bytes.size());
}

struct Reading {
  Value value;
  ErrorPtr error;

  PropertyListError code() const {
    return error == nullptr ? PropertyListError{} : static_cast<PropertyListError>(error->code());
  }
  std::string codeName() const {
    return error == nullptr ? "no error" : std::string(propertyListErrorName(code()));
  }
  std::optional<std::uint64_t> offset() const {
    if (error == nullptr) return std::nullopt;
    const auto number = error->userInfo()["offset"].asNumber("offset");
    return number ? std::optional(number->uint64Value()) : std::nullopt;
  }
  std::string path() const {
    if (error == nullptr) return {};
    return std::string(error->userInfo()["path"].asString("path").value_or(""));
  }
  std::string text() const { return error == nullptr ? "no error" : error->description(); }
};

inline Reading readBytes(const std::string& bytes, const PropertyListLimits& limits = {}) {
  Reading reading;
  reading.value = readPropertyList(dataOf(bytes), limits, &reading.error);
  return reading;
}

inline std::string written(const Value& value,
                           PropertyListFormat format = PropertyListFormat::kBinary) {
  ErrorPtr error;
  const std::vector<std::uint8_t> bytes = writePropertyList(value, format, &error);
  if (error != nullptr) return error->description();
  return std::string(bytes.begin(), bytes.end());
}

// The XML declaration and <plist> around a value.
inline std::string xml(const std::string& body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + body + "</plist>";
}
inline std::size_t xmlBodyOffset() { return xml("").size() - std::string("</plist>").size(); }

inline const std::string kDocumentType = std::string("<!DOC") + "TYPE";

// One malformed input: what a reader must say about it, and where when that is determined.
// Text that is made when it is asked for: every process of the suite registers all rows, and large
// inputs would make each of them slow.
class LazyText {
 public:
  LazyText(std::string text)  // NOLINT: a text is one that is ready
      : make_([ready = std::move(text)] { return ready; }) {}
  LazyText(const char* text) : LazyText(std::string(text)) {}  // NOLINT
  template <typename Make, typename = std::enable_if_t<std::is_invocable_r_v<std::string, Make>>>
  LazyText(Make make) : make_(std::move(make)) {}  // NOLINT
  std::string operator()() const { return make_(); }

 private:
  std::function<std::string()> make_;
};

struct BadInput {
  std::string name;
  LazyText bytes;
  PropertyListError code;
  std::optional<std::uint64_t> offset;
};

inline void PrintTo(const BadInput& input, std::ostream* out) { *out << input.name; }

inline std::string badInputName(const BadInput& input) {
  std::string name;
  for (const char c : input.name) {
    if (std::isalnum(static_cast<unsigned char>(c)) != 0) name += c;
  }
  return name;
}

}  // namespace kx::test
