#pragma once

#include <cstdint>
#include <span>
#include <string_view>

namespace kx {

// How many first bytes of a file decide about its type.
inline constexpr std::size_t kContentTypeBytes = 64;

// The extension, in capitals and without dot, that fits what the file begins with; "DAT" when it is
// nothing that is known.
std::string_view extensionForContent(std::span<const std::uint8_t> firstBytes);

}  // namespace kx
