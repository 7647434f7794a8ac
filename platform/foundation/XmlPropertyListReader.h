#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/PropertyList.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/PropertyListFailure.h"

namespace kx {

// Reads an XML property list into a document of the same form as a binary one: text without
// references stays a view of the file's bytes, equal keys are one object. One pass, time linear in
// the file; a document type declaration is skipped unread and one with an internal subset refused,
// so nothing expands. Internal to platform/foundation; throws PropertyListFailure.
class XmlPropertyListReader {
 public:
  XmlPropertyListReader(DataPtr bytes, const PropertyListLimits& limits);
  Value read();

  // Whether the bytes, after a byte order mark and white space, begin with markup.
  static bool isXml(const std::uint8_t* bytes, std::size_t length);
};

}  // namespace kx
