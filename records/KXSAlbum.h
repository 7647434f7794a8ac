#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "records/KXSItem.h"

namespace kx {

class KXSAlbum;
using KXSAlbumPtr = std::shared_ptr<KXSAlbum>;

// An album of the host library: assets in an order of their own. Item type "Album". Threads and
// errors as KXSItem.
class KXSAlbum final : public KXSItem {
 public:
  static KXSAlbumPtr album() { return init(); }
  static KXSAlbumPtr init();
  // Name "", no assets, subclass 0, all else null.
  static KXSAlbumPtr albumWithUUID(OptionalString uuid) { return initWithUUID(uuid); }
  static KXSAlbumPtr initWithUUID(OptionalString uuid);
  static KXSAlbumPtr initFromPropertyList(const Value& dictionary);
  // The same, with positions found before (RecordLayouts).
  static KXSAlbumPtr initFromPropertyList(Value dictionary,
                                          const RecordFields::Positions& positions);
  static KXSAlbumPtr initWithCoder(KeyedUnarchiver& coder);

  std::string description() const override;
  std::string_view archiveClassName() const override { return "KXSAlbum"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;
  Value propertyList() const override;
  std::string_view _itemType() const override { return kKXSTransportAlbumItemType; }

  // Logs the first difference; false for null and for an item of another class. The order of the
  // assets counts. Never raises.
  bool isEqualToAlbum(const KXSItem* other) const;
  bool isEqualToAlbum(const KXSItemPtr& other) const { return isEqualToAlbum(other.get()); }
  // The same without the rule that an album equals itself: a number that is none equals nothing.
  bool hasEqualFields(const KXSAlbum& other) const;

  OptionalString name() const { return fields_.string(kName, kKXSAlbumNameKey); }
  void setName(OptionalString name) { fields_.set(kName, Value::optionalString(name)); }
  // Identifiers of the assets in album order; read an element with asString(key). Null when null.
  std::optional<ArrayView> assetUUIDs() const;
  void setAssetUUIDs(Value uuids) { fields_.set(kAssetUUIDs, std::move(uuids)); }
  OptionalString parentUUID() const { return fields_.string(kParentUUID, kKXSAlbumParentUUIDKey); }
  void setParentUUID(OptionalString uuid) { fields_.set(kParentUUID, Value::optionalString(uuid)); }
  // The kind of album at the host, an unsigned integer.
  std::optional<Number> albumSubclass() const {
    return fields_.number(kAlbumSubclass, kKXSAlbumSubclassKey);
  }
  void setAlbumSubclass(Value subclass) { fields_.set(kAlbumSubclass, std::move(subclass)); }
  std::optional<Number> albumKeyAssetFaceIndex() const {
    return fields_.number(kKeyAssetFaceIndex, kKXSAlbumKeyAssetFaceIndexKey);
  }
  void setAlbumKeyAssetFaceIndex(Value index) { fields_.set(kKeyAssetFaceIndex, std::move(index)); }
  OptionalString keyAssetUUID() const { return fields_.string(kKeyAssetUUID, kKXSKeyAssetUUIDKey); }
  void setKeyAssetUUID(OptionalString uuid) {
    fields_.set(kKeyAssetUUID, Value::optionalString(uuid));
  }

  // The keys that initFromPropertyList reads.
  static std::span<const FieldKey> allKeys();

  using KXSItem::KXSItem;

 private:
  static constexpr std::size_t kName = kFirstOwnSlot;
  static constexpr std::size_t kAssetUUIDs = kFirstOwnSlot + 1;
  static constexpr std::size_t kParentUUID = kFirstOwnSlot + 2;
  static constexpr std::size_t kAlbumSubclass = kFirstOwnSlot + 3;
  static constexpr std::size_t kKeyAssetFaceIndex = kFirstOwnSlot + 4;
  static constexpr std::size_t kKeyAssetUUID = kFirstOwnSlot + 5;
  static std::span<const FieldKey> ownKeys();
  bool hasEqualAssetUUIDs(const KXSAlbum& other) const;
};

}  // namespace kx
