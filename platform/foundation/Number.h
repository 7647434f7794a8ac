#pragma once

#include <bit>
#include <cstdint>
#include <string>

namespace kx {

// A property-list number. Keeps apart how it was written (boolean, integer, unsigned beyond int64,
// single- or double-precision real), so that writing it again gives the same bytes; equality is
// numeric across all of them (true == 1 == 1.0) and exact: no integer is rounded to compare it. NaN
// equals NaN, so that equality is an equivalence.
// Plain value, safe to copy between threads.
class Number {
 public:
  enum class Type : std::uint8_t { kBoolean, kInteger, kUnsigned, kReal32, kReal64 };

  static Number boolean(bool value);
  static Number integer(std::int64_t value);
  // Becomes kInteger when the value fits in 63 bits.
  static Number unsignedInteger(std::uint64_t value);
  static Number real32(float value);
  static Number real(double value);

  Type type() const { return type_; }
  bool isReal() const { return type_ == Type::kReal32 || type_ == Type::kReal64; }

  // Conversions read the value in another type. Reals are truncated towards zero and saturate (a
  // negative real reads unsigned as its 64-bit two's complement, as a negative integer does);
  // NaN reads as 0. int32Value and int16Value take the low bits of the 64-bit integer reading.
  bool boolValue() const { return isReal() ? doubleValue() != 0 : bits_ != 0; }
  std::int64_t int64Value() const;
  std::uint64_t uint64Value() const;
  std::int32_t int32Value() const { return static_cast<std::int32_t>(int64Value()); }
  std::int16_t int16Value() const { return static_cast<std::int16_t>(int64Value()); }
  double doubleValue() const {
    if (isReal()) return std::bit_cast<double>(bits_);
    if (type_ == Type::kUnsigned) return static_cast<double>(bits_);
    return static_cast<double>(static_cast<std::int64_t>(bits_));
  }

  // Booleans print as 1 and 0, reals with the shortest text that reads back the same.
  std::string description() const;

  friend bool operator==(const Number& a, const Number& b);

 private:
  friend class Value;
  friend struct ValueAccess;
  Number(Type type, std::uint64_t bits) : type_(type), bits_(bits) {}

  Type type_;
  std::uint64_t bits_;  // int64, uint64, or the bits of a double
};

}  // namespace kx
