#pragma once

#include <string>
#include <string_view>

namespace kx {

// What is wrong with an XMP packet or side file before anything parses it: a document type
// declaration or entity, elements nested deeper than hostlimits::kXmpDepth, a size beyond
// hostlimits::kXmpBytes, or an encoding other than UTF-8. "" when it may be parsed. Linear, without
// recursion; it does not judge whether the XML is well formed.
std::string xmpObjection(std::string_view packet);

}  // namespace kx
