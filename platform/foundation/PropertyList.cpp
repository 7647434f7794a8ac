#include "platform/foundation/PropertyList.h"

#include <algorithm>

#include "platform/foundation/BinaryPropertyListReader.h"
#include "platform/foundation/PropertyListFailure.h"
#include "platform/foundation/PropertyListWriters.h"
#include "platform/foundation/Text.h"
#include "platform/foundation/XmlPropertyListReader.h"

namespace kx {
namespace {

constexpr std::string_view kErrorNames[] = {
    "E_PLIST_IO",        "E_PLIST_MAGIC",   "E_PLIST_TRAILER", "E_PLIST_TABLE",   "E_PLIST_OFFSET",
    "E_PLIST_MARKER",    "E_PLIST_LENGTH",  "E_PLIST_REF",     "E_PLIST_CYCLE",   "E_PLIST_DEPTH",
    "E_PLIST_EXPANSION", "E_PLIST_DUPKEY",  "E_PLIST_KEYTYPE", "E_TEXT_ENCODING", "E_PLIST_RANGE",
    "E_XML_DTD",         "E_XML_CHAR",      "E_XML_SYNTAX",    "E_XML_LIMIT",     "E_ARCHIVE_CLASS",
    "E_ARCHIVE_SHAPE",   "E_ARCHIVE_CYCLE", "E_PLIST_LIMIT",   "E_PLIST_WRITE",
};
static_assert(std::size(kErrorNames) == static_cast<std::size_t>(PropertyListError::kWrite));

// Callers can ask for less than the limits of this build, never for more: places and counts inside
// a document have room for these.
PropertyListLimits capped(PropertyListLimits limits) {
  const PropertyListLimits most;
  limits.fileBytes = std::min(limits.fileBytes, most.fileBytes);
  limits.objects = std::min(limits.objects, most.objects);
  limits.nestingDepth = std::min(limits.nestingDepth, most.nestingDepth);
  limits.visits = std::min(limits.visits, most.visits);
  limits.stringBytes = std::min(limits.stringBytes, most.stringBytes);
  limits.keyUnits = std::min(limits.keyUnits, most.keyUnits);
  limits.dataBytes = std::min(limits.dataBytes, most.dataBytes);
  limits.decodeBaseBytes = std::min(limits.decodeBaseBytes, most.decodeBaseBytes);
  limits.xmlTextBytes = std::min(limits.xmlTextBytes, most.xmlTextBytes);
  limits.xmlNameBytes = std::min(limits.xmlNameBytes, most.xmlNameBytes);
  limits.xmlAttributes = std::min(limits.xmlAttributes, most.xmlAttributes);
  return limits;
}

Value read(DataPtr bytes, const PropertyListLimits& limits) {
  if (bytes == nullptr || bytes->length() == 0) {
    throw PropertyListFailure(PropertyListError::kMagic, "the file is empty", 0);
  }
  const std::uint8_t* base = bytes->bytes();
  const std::size_t length = bytes->length();
  if (length > limits.fileBytes) {
    throw PropertyListFailure(
        PropertyListError::kLimit,
        "the file has more than " + std::to_string(limits.fileBytes) + " bytes", limits.fileBytes);
  }
  if (BinaryPropertyListReader::isBinary(base, length)) {
    return BinaryPropertyListReader(std::move(bytes), limits).read();
  }
  if (XmlPropertyListReader::isXml(base, length)) {
    return XmlPropertyListReader(std::move(bytes), limits).read();
  }
  throw PropertyListFailure(PropertyListError::kMagic, "no property list begins like this", 0);
}

std::string readable(const std::string& text) {
  constexpr std::size_t kMost = 1024;
  std::string result = escapeControlCharacters(std::string_view(text).substr(0, kMost));
  if (text.size() > kMost) result += "...";
  return result;
}

}  // namespace

std::string_view propertyListErrorName(PropertyListError code) {
  const auto index = static_cast<std::size_t>(code) - 1;
  return index < std::size(kErrorNames) ? kErrorNames[index] : "E_PLIST";
}

// Texts from the file stand in messages: control characters are escaped, long ones cut.
ErrorPtr PropertyListFailure::toError() const {
  std::string message = std::string(propertyListErrorName(code_)) + ": " + readable(what_);
  Dictionary info;
  if (!path_.empty()) message += ", under " + readable(path_);
  if (offset_ != kNoOffset) message += " at byte " + std::to_string(offset_);
  info.set(kErrorMessageKey, Value::string(message));
  if (offset_ != kNoOffset) info.set("offset", Value::unsignedInteger(offset_));
  if (!path_.empty()) info.set("path", Value::string(path_));
  return std::make_shared<const Error>(kPropertyListErrorDomain, static_cast<std::int64_t>(code_),
                                       Value::dictionary(std::move(info)));
}

Value readPropertyList(DataPtr bytes, ErrorPtr* error) {
  return readPropertyList(std::move(bytes), PropertyListLimits(), error);
}

Value readPropertyList(DataPtr bytes, const PropertyListLimits& limits, ErrorPtr* error) {
  try {
    return read(std::move(bytes), capped(limits));
  } catch (const PropertyListFailure& failure) {
    setError(error, failure.toError());
    return Value();
  }
}

std::vector<std::uint8_t> writePropertyList(const Value& root, PropertyListFormat format,
                                            ErrorPtr* error) {
  try {
    return format == PropertyListFormat::kBinary ? writeBinaryPropertyList(root)
                                                 : writeXmlPropertyList(root);
  } catch (const PropertyListFailure& failure) {
    setError(error, failure.toError());
    return {};
  }
}

}  // namespace kx
