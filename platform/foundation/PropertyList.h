#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"
#include "platform/foundation/Limits.h"
#include "platform/foundation/Value.h"

namespace kx {

// Reader and writer for the published property-list formats: binary version 1.0 and XML 1.0.
// Formats are documented in docs/formats/property-list.md. All operations are safe from any thread.

// The domain and closed table of codes of property-list errors; the message says what and at which
// byte, and the user information holds "offset" and, where known, "path" (the keys down to the
// value).
inline constexpr const char* kPropertyListErrorDomain = "com.veltro.plist";

// Codes; the message begins with the code's name, see propertyListErrorName.
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

// "E_PLIST_MAGIC", "E_TEXT_ENCODING", "E_XML_DTD", "E_ARCHIVE_CYCLE", ...
std::string_view propertyListErrorName(PropertyListError code);

// What a reading accepts at most; the values of Limits.h unless a caller wants less.
struct PropertyListLimits {
  std::uint64_t fileBytes = limits::kSnapshotFileBytes;
  std::uint64_t objects = limits::kObjects;
  std::size_t nestingDepth = limits::kNestingDepth;  // containers around a value, itself included
  std::uint64_t visits = limits::kVisits;
  std::size_t stringBytes = limits::kStringBytes;  // as UTF-8
  std::size_t keyUnits = limits::kKeyUnits;
  std::size_t dataBytes = limits::kDataBytes;
  std::uint64_t decodeBaseBytes = limits::kDecodeBaseBytes;
  std::size_t xmlTextBytes = limits::kXmlTextBytes;
  std::size_t xmlNameBytes = limits::kXmlNameBytes;
  std::size_t xmlAttributes = limits::kXmlAttributes;
};

// Finds the format by itself, checks the whole input before anything is returned, and never
// recurses over its depth. The bytes are shared with the values read. Null and an error when it is
// malformed.
Value readPropertyList(DataPtr bytes, ErrorPtr* error);
Value readPropertyList(DataPtr bytes, const PropertyListLimits& limits, ErrorPtr* error);

enum class PropertyListFormat { kBinary, kXml };

// The written bytes; equal strings, numbers, dates and data are written once (binary), and so is a
// container that occurs several times. Reals keep their width, integers take the smallest width
// that holds them. Whatever is written can be read again: empty and an error when the value holds a
// null, text that is not UTF-8 or holds a NUL, a date out of range, or more than the limits of
// reading. XML has no form for UIDs and control characters (errors) nor for fractions of a second
// (dropped).
std::vector<std::uint8_t> writePropertyList(const Value& root, PropertyListFormat format,
                                            ErrorPtr* error);

}  // namespace kx
