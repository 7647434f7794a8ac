#include "platform/foundation/Rect.h"

#include <string_view>

#include "platform/foundation/EntryPeek.h"

namespace kx {
namespace {

// The number under the key, which mostly stands at the expected position.
std::optional<Number> numberUnder(const Value& dictionary, std::string_view key,
                                  std::uint32_t expected) {
  if (EntryPeek::can(dictionary)) {
    const std::optional<EntryPeek> entry = EntryPeek::find(dictionary, key, expected);
    if (!entry || entry->kind() != Kind::kNumber) return std::nullopt;
    return entry->number();
  }
  const Value value = dictionary[key];
  if (!value.isNumber()) return std::nullopt;
  return value.numberValue();
}

}  // namespace

std::string Rect::description() const {
  const auto text = [](double value) { return Number::real(value).description(); };
  return "{{" + text(x) + ", " + text(y) + "}, {" + text(width) + ", " + text(height) + "}}";
}

std::optional<Rect> rectFromDictionary(const Value& dictionary) {
  if (!dictionary.isDictionary()) return std::nullopt;
  Rect rect;
  const std::pair<std::string_view, double*> fields[] = {
      {"X", &rect.x}, {"Y", &rect.y}, {"Width", &rect.width}, {"Height", &rect.height}};
  std::uint32_t expected = 0;
  for (const auto& [key, target] : fields) {
    const std::optional<Number> number = numberUnder(dictionary, key, expected++);
    if (!number) return std::nullopt;
    *target = number->doubleValue();
  }
  return rect;
}

Value dictionaryFromRect(const Rect& rect) {
  return Value::dictionary({{"X", Value::real(rect.x)},
                            {"Y", Value::real(rect.y)},
                            {"Width", Value::real(rect.width)},
                            {"Height", Value::real(rect.height)}});
}

}  // namespace kx
