#pragma once

#include <stdexcept>
#include <string>
#include <string_view>

namespace kx {

// A programming error, or an input that must not be worked on: the call ends with it.
class InternalInconsistency : public std::logic_error {
 public:
  explicit InternalInconsistency(const std::string& reason) : std::logic_error(reason) {}
};

// A value of another type than its reader needs. The text names key, expected and found type.
class TypeError : public std::runtime_error {
 public:
  TypeError(std::string_view key, std::string_view expected, std::string_view found)
      : std::runtime_error("wrong type under \"" + std::string(key) + "\": expected " +
                           std::string(expected) + ", found " + std::string(found)) {}
};

}  // namespace kx
