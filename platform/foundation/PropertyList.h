#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Value.h"

namespace kx {

// Reader and writer for the published property-list formats: binary version 1.0 and XML 1.0.
// Formats are documented in docs/formats/property-list.md. All operations are safe from any thread.

// The domain and closed table of codes of property-list errors; the message says what and at which
// byte, and the user information holds "offset" and, where known, "path" (the keys down to the
// value).
inline constexpr const char* kPropertyListErrorDomain = "com.veltro.plist";

// Codes; names in messages are the enumerators without the k, in capitals (E_PLIST_MAGIC, ...).
enum class PropertyListError : std::int64_t {
  kIo = 1,     // the file could not be read (message names the system error)
  kMagic = 2,  // empty, too short, unknown magic or version: no property list
  kTrailer = 3,
  kTable = 4,
  kOffset = 5,
  kMarker = 6,
  kLength = 7,
  kRef = 8,
  kCycle = 9,
  kDepth = 10,
  kExpansion = 11,
  kDupKey = 12,
  kKeyType = 13,
  kTextEncoding = 14,
  kRange = 15,
  kXmlDtd = 16,
  kXmlChar = 17,
  kXmlSyntax = 18,
  kXmlLimit = 19,
  kArchiveClass = 20,
  kArchiveShape = 21,
  kArchiveCycle = 22,
  kLimit = 23,  // a size limit of Limits.h (message names it)
  kWrite = 24,  // a value that no property list can hold (null, invalid text)
};

// Finds the format by itself, checks the whole input before anything is returned, and never
// recurses over its depth. The bytes are shared with the values read. Null and an error when it is
// malformed.
Value readPropertyList(DataPtr bytes, ErrorPtr* error);

enum class PropertyListFormat { kBinary, kXml };

// The written bytes; equal strings and numbers are written once (binary). Reals keep their width,
// integers take the smallest width that holds them. Empty and an error when the value holds a null
// or text that is not valid UTF-8.
std::vector<std::uint8_t> writePropertyList(const Value& root, PropertyListFormat format,
                                            ErrorPtr* error);

}  // namespace kx
