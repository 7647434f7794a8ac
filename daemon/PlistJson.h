#pragma once

#include <cstdint>
#include <nlohmann/json.hpp>
#include <span>
#include <string>

#include "platform/foundation/Value.h"

namespace kx {

// A property-list value as JSON: data as {"base64": text}, a date as {"date": seconds since
// 2001-01-01 00:00:00 UTC}, a UID as {"uid": number}, null as null; everything else as itself,
// dictionaries in their order. Numbers keep their type: reals round-trip, booleans stay booleans.
// The value's depth is that of a property list that was read, so at most limits::kNestingDepth.
nlohmann::ordered_json plistJson(const Value& value);

// Plain Base64 with padding, without line breaks.
std::string base64Text(std::span<const std::uint8_t> bytes);

}  // namespace kx
