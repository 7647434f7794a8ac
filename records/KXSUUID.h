#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Data.h"
#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/Value.h"

namespace kx {

class KXSUUID;
using KXSUUIDPtr = std::shared_ptr<KXSUUID>;

// The identifier of a record: 16 bytes for every one that the program makes. Immutable, a data
// object itself, safe from any thread. Constructors give null for null or invalid arguments and log
// nothing.
class KXSUUID final : public Data, public Archivable {
 public:
  // The size of an identifier in bytes.
  static constexpr std::size_t numberBytes() { return 16; }

  // A new random identifier.
  static KXSUUIDPtr uuid() { return init(); }
  static KXSUUIDPtr init();
  // A copy of the bytes, whatever their length.
  static KXSUUIDPtr uuidWithData(const DataPtr& data) { return initWithData(data); }
  static KXSUUIDPtr initWithData(const DataPtr& data);
  static KXSUUIDPtr initWithBytesLength(const void* bytes, std::size_t length);
  // From canonical text, digits of either case; null for any other text.
  static KXSUUIDPtr uuidWithString(OptionalString text) { return initWithString(text); }
  static KXSUUIDPtr initWithString(OptionalString text);
  // From the 22-character photo form; any other length gives null.
  static KXSUUIDPtr initWithPhotoBase64String(OptionalString text);
  static KXSUUIDPtr initWithCoder(KeyedUnarchiver& coder);

  // stringValue of a new random identifier.
  static std::string generateUUIDAsString();
  // The photo forms of canonical texts, in their order. Text that is no identifier raises
  // InternalInconsistency.
  static std::vector<std::string> photoBase64UUIDsFromUUIDs(const std::vector<std::string>& uuids);

  const std::uint8_t* bytes() const override { return data_->bytes(); }
  std::size_t length() const override { return data_->length(); }

  // Canonical upper-case text of 36 characters. Fewer than 16 bytes raise InternalInconsistency.
  std::string stringValue() const;
  std::string description() const { return stringValue(); }
  std::string photoBase64String() const;

  // Any data object with the same bytes.
  bool isEqualToData(const Data& other) const override;
  // Only an identifier with the same bytes.
  bool isEqual(const Data& other) const override;

  // An archive restores an identifier, not a plain data object.
  std::string_view classForCoder() const { return "KXSUUID"; }
  std::string_view classForArchiver() const { return "KXSUUID"; }
  std::string_view classForPortCoder() const { return "KXSUUID"; }
  std::string_view archiveClassName() const override { return classForArchiver(); }
  void encodeWithCoder(KeyedArchiver& coder) const override;

  explicit KXSUUID(DataPtr data) : data_(std::move(data)) {}

 private:
  DataPtr data_;  // never null
};

}  // namespace kx
