#pragma once

#include <rapidcheck.h>

#include <bit>
#include <string>

#include "platform/foundation/Utf8.h"
#include "platform/foundation/Value.h"

// Random property-list values of every kind, with the edges of each more often than chance has
// them.
namespace kx::test {

struct ValueOptions {
  bool uids = true;           // XML has no form for them
  bool real32 = true;         // XML does not keep their width
  bool wholeSeconds = false;  // XML drops fractions
  bool controlCharacters = true;
  bool notANumber = true;
};

inline std::string randomText(const ValueOptions& options) {
  const auto length = *rc::gen::weightedElement<std::size_t>({{8, 4}, {2, 0}, {1, 20}, {1, 300}});
  const bool isAscii = *rc::gen::arbitrary<bool>();
  std::string text;
  for (std::size_t i = 0; i < length; ++i) {
    std::uint32_t point = *rc::gen::inRange<std::uint32_t>(1, 0x80);
    if (!isAscii && *rc::gen::arbitrary<bool>()) {
      point = *rc::gen::element<std::uint32_t>(0x80, 0xE9, 0x7FF, 0x800, 0x20AC, 0xD7FF, 0xE000,
                                               0xFFFD, 0x10000, 0x1F600, 0x10FFFF);
    }
    const bool isControl = point < 0x20 && point != '\t' && point != '\n' && point != '\r';
    if (isControl && !options.controlCharacters) point = 'c';
    appendUtf8(text, point);
  }
  return text;
}

inline Number randomNumber(const ValueOptions& options) {
  const auto bits = *rc::gen::arbitrary<std::uint64_t>();
  const auto shift = *rc::gen::inRange(0, 64);
  switch (*rc::gen::inRange(0, 5)) {
    case 0:
      return Number::boolean((bits & 1) != 0);
    case 1:
      return Number::integer(std::bit_cast<std::int64_t>(bits >> shift));
    case 2:
      return Number::unsignedInteger(bits);
    case 3:
      if (options.real32) return Number::real32(*rc::gen::arbitrary<float>());
      return Number::real(*rc::gen::arbitrary<double>());
    default: {
      const auto value = std::bit_cast<double>(bits);
      if (value != value && !options.notANumber) return Number::real(0.5);
      return Number::real(value);
    }
  }
}

inline Value randomScalar(const ValueOptions& options) {
  switch (*rc::gen::inRange(0, options.uids ? 6 : 5)) {
    case 0:
    case 1:
      return Value(randomNumber(options));
    case 2: {
      auto seconds =
          static_cast<double>(*rc::gen::inRange<std::int64_t>(-63113904000, 252423993600));
      if (!options.wholeSeconds) seconds += *rc::gen::element(0.0, 0.5, 0.25);
      return Value::date(Date{seconds});
    }
    case 3: {
      const auto bytes = *rc::gen::arbitrary<std::vector<std::uint8_t>>();
      return Value::data(bytes);
    }
    case 4:
      return Value::string(randomText(options));
    default:
      return Value::uid(*rc::gen::arbitrary<std::uint32_t>());
  }
}

inline Value randomValue(const ValueOptions& options, int depth) {
  const int choice = depth == 0 ? 9 : *rc::gen::inRange(0, 10);
  if (choice > 5) return randomScalar(options);
  const auto count = *rc::gen::weightedElement<std::size_t>({{8, 3}, {2, 0}, {1, 30}});
  if (choice > 2) {
    Array elements;
    for (std::size_t i = 0; i < count; ++i) {
      const bool repeats = i > 0 && *rc::gen::inRange(0, 4) == 0;
      elements.push_back(repeats ? elements.front() : randomValue(options, depth - 1));
    }
    return Value::array(std::move(elements));
  }
  Dictionary entries;
  for (std::size_t i = 0; i < count; ++i) {
    const std::string suffix = *rc::gen::element<std::string>("", "é", " &<", "\U0001F600");
    entries.set("key" + std::to_string(i) + suffix, randomValue(options, depth - 1));
  }
  return Value::dictionary(std::move(entries));
}

}  // namespace kx::test
