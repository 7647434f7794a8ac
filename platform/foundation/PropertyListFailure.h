#pragma once

#include <cstdint>
#include <exception>
#include <string>

#include "platform/foundation/PropertyList.h"

// How the readers and writers of this folder end early. Internal: never leaves platform/foundation.
namespace kx {

class PropertyListFailure : public std::exception {
 public:
  static constexpr std::uint64_t kNoOffset = ~std::uint64_t{0};

  PropertyListFailure(PropertyListError code, std::string what, std::uint64_t offset = kNoOffset,
                      std::string path = {})
      : code_(code), what_(std::move(what)), offset_(offset), path_(std::move(path)) {}

  const char* what() const noexcept override { return what_.c_str(); }
  PropertyListError code() const { return code_; }
  std::uint64_t offset() const { return offset_; }
  const std::string& path() const { return path_; }
  void setPath(std::string path) { path_ = std::move(path); }
  void setOffset(std::uint64_t offset) { offset_ = offset; }
  // "E_PLIST_REF: reference to object 9 of 4 at byte 17"; user information: message, offset, path.
  ErrorPtr toError() const;

 private:
  PropertyListError code_;
  std::string what_;
  std::uint64_t offset_;
  std::string path_;
};

}  // namespace kx
