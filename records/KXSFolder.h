#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "records/KXSItem.h"

namespace kx {

class KXSFolder;
using KXSFolderPtr = std::shared_ptr<KXSFolder>;

// A container of albums. It has an archived form but is never transported: it has no item type, so
// propertyList raises InternalInconsistency. Threads and errors as KXSItem.
class KXSFolder final : public KXSItem {
 public:
  static KXSFolderPtr folder() { return init(); }
  static KXSFolderPtr init();
  // Name "", no parent.
  static KXSFolderPtr folderWithUUID(OptionalString uuid) { return initWithUUID(uuid); }
  static KXSFolderPtr initWithUUID(OptionalString uuid);
  static KXSFolderPtr initFromPropertyList(const Value& dictionary);
  // Always null: the host's own form of a folder is not read.
  static KXSFolderPtr initWithHostPropertyList(const Value& dictionary);
  static KXSFolderPtr initWithCoder(KeyedUnarchiver& coder);
  // Always false, nothing is merged.
  bool mergeWithHostPropertyList(const Value& dictionary);

  std::string description() const override;
  std::string_view archiveClassName() const override { return "KXSFolder"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;
  Value propertyList() const override;

  OptionalString name() const { return fields_.string(kName, kKXSFolderNameKey); }
  void setName(OptionalString name) { fields_.set(kName, Value::optionalString(name)); }
  OptionalString parentUUID() const { return fields_.string(kParentUUID, kKXSFolderParentUuidKey); }
  void setParentUUID(OptionalString uuid) { fields_.set(kParentUUID, Value::optionalString(uuid)); }

  using KXSItem::KXSItem;

 private:
  static constexpr std::size_t kName = kFirstOwnSlot;
  static constexpr std::size_t kParentUUID = kFirstOwnSlot + 1;
  static std::span<const FieldKey> ownKeys();
  static std::span<const FieldKey> allKeys();
};

}  // namespace kx
