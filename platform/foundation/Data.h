#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <utility>
#include <vector>

namespace kx {

// An immutable byte buffer object. Shared by reference (std::shared_ptr<const Data>), safe from any
// thread. Specialisations may override bytes() and length() and stay usable wherever a data object
// is.
class Data {
 public:
  Data() = default;
  explicit Data(std::vector<std::uint8_t> bytes) : bytes_(std::move(bytes)) {}
  Data(const void* bytes, std::size_t length);
  virtual ~Data() = default;

  virtual const std::uint8_t* bytes() const { return bytes_.data(); }
  virtual std::size_t length() const { return bytes_.size(); }
  std::span<const std::uint8_t> span() const { return {bytes(), length()}; }

  // Equal length and equal bytes.
  virtual bool isEqualToData(const Data& other) const;
  // Object equality: for a plain data object, any data object with equal bytes.
  virtual bool isEqual(const Data& other) const { return isEqualToData(other); }

 private:
  std::vector<std::uint8_t> bytes_;
};

using DataPtr = std::shared_ptr<const Data>;

}  // namespace kx
