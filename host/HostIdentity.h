#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kx {

using UUIDBytes = std::array<std::uint8_t, 16>;

// The SHA-1 digest, which version 5 identifiers are made of. Not for anything that needs security.
std::array<std::uint8_t, 20> sha1(std::string_view bytes);

// The version 5 identifier of a name in a namespace (RFC 4122).
UUIDBytes uuidVersion5(const UUIDBytes& nameSpace, std::string_view name);

// Canonical upper-case text, and back; nothing for other text.
std::string uuidText(const UUIDBytes& uuid);
std::optional<UUIDBytes> uuidFromText(std::string_view text);

// The identifiers of a folder read as a library. They depend on the library's identifier and on
// what they stand for alone, so that they stay the same from one reading to the next.
class HostIdentity {
 public:
  explicit HostIdentity(const UUIDBytes& library) : library_(library) {}
  // The library's identifier: version 5 of the folder's canonical path, in the namespace of URLs.
  static UUIDBytes libraryOfFolder(std::string_view canonicalPath);

  std::string library() const { return uuidText(library_); }
  // A photo or video by its path below the folder.
  std::string asset(std::string_view path) const { return of(path); }
  // No path ends in "/" or starts with NUL, so none of these meets an asset's identifier.
  std::string album(std::string_view path) const { return of(std::string(path) + "/"); }
  std::string master() const { return of(std::string_view("\0master", 7)); }
  std::string event(std::string_view isoDay) const {
    return of(std::string("\0event\0", 7) + std::string(isoDay));
  }
  std::string person(std::string_view name) const {
    return of(std::string("\0person\0", 8) + std::string(name));
  }

 private:
  std::string of(std::string_view name) const { return uuidText(uuidVersion5(library_, name)); }

  UUIDBytes library_;
};

}  // namespace kx
