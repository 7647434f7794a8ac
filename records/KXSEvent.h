#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "records/KXSItem.h"

namespace kx {

class KXSEvent;
using KXSEventPtr = std::shared_ptr<KXSEvent>;

// The host's automatic grouping of assets by time. Item type "Event". Threads and errors as
// KXSItem.
class KXSEvent final : public KXSItem {
 public:
  static KXSEventPtr event() { return init(); }
  static KXSEventPtr init();
  // Name "", all else null.
  static KXSEventPtr eventWithUUID(OptionalString uuid) { return initWithUUID(uuid); }
  static KXSEventPtr initWithUUID(OptionalString uuid);
  static KXSEventPtr initFromPropertyList(const Value& dictionary);
  // The same, with positions found before (RecordLayouts).
  static KXSEventPtr initFromPropertyList(Value dictionary,
                                          const RecordFields::Positions& positions);
  // Always null: the host's own form of an event is not read.
  static KXSEventPtr initWithHostPropertyList(const Value& dictionary);
  static KXSEventPtr initWithCoder(KeyedUnarchiver& coder);
  // Always false, nothing is merged.
  bool mergeWithHostPropertyList(const Value& dictionary);

  std::string description() const override;
  std::string_view archiveClassName() const override { return "KXSEvent"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;
  Value propertyList() const override;
  std::string_view _itemType() const override { return kKXSTransportEventItemType; }

  // Logs the first difference; false for null and for an item of another class. Never raises.
  bool isEqualToEvent(const KXSItem* other) const;
  bool isEqualToEvent(const KXSItemPtr& other) const { return isEqualToEvent(other.get()); }
  // The same without the rule that an event equals itself.
  bool hasEqualFields(const KXSEvent& other) const;

  OptionalString name() const { return fields_.string(kName, kKXSEventNameKey); }
  void setName(OptionalString name) { fields_.set(kName, Value::optionalString(name)); }
  OptionalString parentUUID() const { return fields_.string(kParentUUID, kKXSEventParentUUIDKey); }
  void setParentUUID(OptionalString uuid) { fields_.set(kParentUUID, Value::optionalString(uuid)); }
  OptionalString keyAssetUUID() const { return fields_.string(kKeyAssetUUID, kKXSKeyAssetUUIDKey); }
  void setKeyAssetUUID(OptionalString uuid) {
    fields_.set(kKeyAssetUUID, Value::optionalString(uuid));
  }

  // The keys that initFromPropertyList reads.
  static std::span<const FieldKey> allKeys();

  using KXSItem::KXSItem;

 private:
  static constexpr std::size_t kName = kFirstOwnSlot;
  static constexpr std::size_t kParentUUID = kFirstOwnSlot + 1;
  static constexpr std::size_t kKeyAssetUUID = kFirstOwnSlot + 2;
  static std::span<const FieldKey> ownKeys();
};

}  // namespace kx
