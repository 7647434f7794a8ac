#include "platform/foundation/Rect.h"

namespace kx {

std::string Rect::description() const {
  const auto text = [](double value) { return Number::real(value).description(); };
  return "{{" + text(x) + ", " + text(y) + "}, {" + text(width) + ", " + text(height) + "}}";
}

std::optional<Rect> rectFromDictionary(const Value& dictionary) {
  if (!dictionary.isDictionary()) return std::nullopt;
  Rect rect;
  const std::pair<const char*, double*> fields[] = {
      {"X", &rect.x}, {"Y", &rect.y}, {"Width", &rect.width}, {"Height", &rect.height}};
  for (const auto& [key, target] : fields) {
    const Value value = dictionary[key];
    if (!value.isNumber()) return std::nullopt;
    *target = value.numberValue().doubleValue();
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
