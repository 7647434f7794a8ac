#include "platform/foundation/Number.h"

#include <bit>
#include <charconv>
#include <cmath>
#include <limits>

namespace kx {
namespace {

constexpr double kTwo63 = 9223372036854775808.0;
constexpr double kTwo64 = 18446744073709551616.0;

template <typename Real>
std::string shortest(Real value) {
  if (std::isnan(value)) return "nan";
  if (std::isinf(value)) return value > 0 ? "inf" : "-inf";
  char buffer[64];
  const auto result = std::to_chars(buffer, buffer + sizeof(buffer), value);
  return std::string(buffer, result.ptr);
}

// Whether the real is exactly the integer of the given sign and magnitude.
bool equalsInteger(double real, bool negative, std::uint64_t magnitude) {
  if (!(std::fabs(real) < kTwo64) || real != std::trunc(real)) return false;
  if (magnitude == 0) return real == 0;
  return std::signbit(real) == negative && static_cast<std::uint64_t>(std::fabs(real)) == magnitude;
}

}  // namespace

Number Number::boolean(bool value) { return Number(Type::kBoolean, value ? 1 : 0); }

Number Number::integer(std::int64_t value) {
  return Number(Type::kInteger, static_cast<std::uint64_t>(value));
}

Number Number::unsignedInteger(std::uint64_t value) {
  const bool fits = value <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  return Number(fits ? Type::kInteger : Type::kUnsigned, value);
}

Number Number::real32(float value) {
  return Number(Type::kReal32, std::bit_cast<std::uint64_t>(static_cast<double>(value)));
}

Number Number::real(double value) {
  return Number(Type::kReal64, std::bit_cast<std::uint64_t>(value));
}

std::int64_t Number::int64Value() const {
  if (!isReal()) return static_cast<std::int64_t>(bits_);
  const double value = doubleValue();
  if (std::isnan(value)) return 0;
  if (value >= kTwo63) return std::numeric_limits<std::int64_t>::max();
  if (value < -kTwo63) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(value);
}

std::uint64_t Number::uint64Value() const {
  if (!isReal()) return bits_;
  const double value = doubleValue();
  if (std::isnan(value)) return 0;
  if (value >= kTwo64) return std::numeric_limits<std::uint64_t>::max();
  if (value < 0) return static_cast<std::uint64_t>(int64Value());
  return static_cast<std::uint64_t>(value);
}

std::string Number::description() const {
  switch (type_) {
    case Type::kBoolean:
      return bits_ != 0 ? "1" : "0";
    case Type::kInteger:
      return std::to_string(static_cast<std::int64_t>(bits_));
    case Type::kUnsigned:
      return std::to_string(bits_);
    case Type::kReal32:
      return shortest(static_cast<float>(doubleValue()));
    case Type::kReal64:
      return shortest(doubleValue());
  }
  return {};
}

bool operator==(const Number& a, const Number& b) {
  if (a.isReal() && b.isReal()) {
    const double x = a.doubleValue();
    const double y = b.doubleValue();
    return x == y || (std::isnan(x) && std::isnan(y));
  }
  const auto isNegative = [](const Number& n) {
    return n.type_ == Number::Type::kInteger && static_cast<std::int64_t>(n.bits_) < 0;
  };
  if (!a.isReal() && !b.isReal()) {
    return a.bits_ == b.bits_ && isNegative(a) == isNegative(b);
  }
  const Number& integer = a.isReal() ? b : a;
  const Number& real = a.isReal() ? a : b;
  const bool negative = isNegative(integer);
  const std::uint64_t magnitude = negative ? 0 - integer.bits_ : integer.bits_;
  return equalsInteger(real.doubleValue(), negative, magnitude);
}

}  // namespace kx
