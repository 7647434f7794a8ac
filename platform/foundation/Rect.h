#pragma once

#include <optional>
#include <string>

#include "platform/foundation/Value.h"

namespace kx {

// A rectangle in whatever unit its owner says; faces use fractions of the image's width and height.
// Equality is exact, component by component.
struct Rect {
  double x = 0.0;
  double y = 0.0;
  double width = 0.0;
  double height = 0.0;

  std::string description() const;
  friend bool operator==(const Rect& a, const Rect& b) = default;
};

// The rectangle dictionary form: numbers under "X", "Y", "Width" and "Height". Null when the value
// is no dictionary, or one of the four is missing or no number.
std::optional<Rect> rectFromDictionary(const Value& dictionary);
Value dictionaryFromRect(const Rect& rect);

}  // namespace kx
