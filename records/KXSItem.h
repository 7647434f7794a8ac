#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/foundation/KeyedArchive.h"
#include "platform/foundation/Value.h"
#include "records/RecordFields.h"
#include "records/TransportKeys.h"

namespace kx {

class KXSItem;
using KXSItemPtr = std::shared_ptr<KXSItem>;

// The transport coding of a record: to a dictionary of the snapshot file. The other direction is
// the factory initFromPropertyList of each class.
class KXSTransportCoding {
 public:
  virtual ~KXSTransportCoding() = default;
  // A new dictionary of the transport keys.
  virtual Value propertyList() const = 0;
};

// What every item of the host library has in common. Shared by reference; read from any thread,
// set on one thread at a time. Null, absent and empty are different: a field that was not in the
// property list is null. Getters raise TypeError when the file holds another type under their key;
// the views that they return live as long as the item and the field's value.
class KXSItem : public Archivable, public KXSTransportCoding {
 public:
  // An item with a new identifier from the photo library framework.
  static KXSItemPtr init();
  static KXSItemPtr initWithUUID(OptionalString uuid);
  // Reads the keys as they stand; absent ones, and all of a null dictionary, leave null.
  static KXSItemPtr initFromPropertyList(const Value& dictionary);
  static KXSItemPtr initWithCoder(KeyedUnarchiver& coder);

  virtual std::string description() const;
  std::string_view archiveClassName() const override { return "KXSItem"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;
  Value propertyList() const override;
  // "Album", "Event" or "Asset"; raises InternalInconsistency for an item without a type.
  virtual std::string_view _itemType() const;

  OptionalString uuid() const { return fields_.string(kUUID, kKXSItemUUIDKey); }
  // The same as a value that keeps the text alive by itself; null when null.
  Value uuidValue() const;
  void setUuid(OptionalString uuid) { fields_.set(kUUID, Value::optionalString(uuid)); }
  // Kept for the host; an empty dictionary at first, neither archived nor transported.
  Value hostInfo() const;
  void setHostInfo(Value hostInfo);
  // Opaque host data: any property-list value or null.
  Value userInfo() const { return fields_.value(kUserInfo); }
  void setUserInfo(Value userInfo) { fields_.set(kUserInfo, std::move(userInfo)); }

 protected:
  // Only the factories make records; make_shared needs a public constructor.
  struct Token {
    explicit Token() = default;
  };
  static constexpr std::size_t kUUID = 0;
  static constexpr std::size_t kUserInfo = 1;
  static constexpr std::size_t kFirstOwnSlot = 2;

  // Makes a record and decodes what the base archives.
  template <typename T>
  static std::shared_ptr<T> makeWithCoder(KeyedUnarchiver& coder) {
    auto item = std::make_shared<T>(Token(), RecordFields());
    item->KXSItem::decodeBase(coder);
    return item;
  }
  void decodeBase(KeyedUnarchiver& coder);
  void decodeFields(KeyedUnarchiver& coder, std::span<const FieldKey> keys);
  // Archives or transports the fields of `keys` that are not null.
  void encodeFields(KeyedArchiver& coder, std::span<const FieldKey> keys) const;
  void writeFields(Dictionary& dictionary, std::span<const FieldKey> keys) const;

  RecordFields fields_;

 public:
  KXSItem(Token, RecordFields fields) : fields_(std::move(fields)) {}

 private:
  std::unique_ptr<Value> hostInfo_;  // not set: an empty dictionary
};

}  // namespace kx
