#include "records/KXSFolder.h"

#include <array>

#include "records/KXSUUID.h"

namespace kx {

std::span<const FieldKey> KXSFolder::allKeys() {
  static constexpr std::array<FieldKey, 4> kKeys = {{{kKXSItemUUIDKey, kUUID},
                                                     {kKXSTransportUserInfoKey, kUserInfo},
                                                     {kKXSFolderNameKey, kName},
                                                     {kKXSFolderParentUuidKey, kParentUUID}}};
  return kKeys;
}

// The base's two come first.
std::span<const FieldKey> KXSFolder::ownKeys() { return allKeys().subspan(kFirstOwnSlot); }

KXSFolderPtr KXSFolder::init() { return initWithUUID(KXSUUID::generateUUIDAsString()); }

KXSFolderPtr KXSFolder::initWithUUID(OptionalString uuid) {
  auto folder = std::make_shared<KXSFolder>(Token(), RecordFields());
  folder->setUuid(uuid);
  folder->setName("");
  return folder;
}

KXSFolderPtr KXSFolder::initFromPropertyList(const Value& dictionary) {
  return std::make_shared<KXSFolder>(Token(), RecordFields(dictionary, allKeys(), "item"));
}

KXSFolderPtr KXSFolder::initWithHostPropertyList(const Value& /*dictionary*/) { return nullptr; }

bool KXSFolder::mergeWithHostPropertyList(const Value& /*dictionary*/) { return false; }

KXSFolderPtr KXSFolder::initWithCoder(KeyedUnarchiver& coder) {
  auto folder = makeWithCoder<KXSFolder>(coder);
  folder->decodeFields(coder, ownKeys());
  return folder;
}

std::string KXSFolder::description() const {
  return "Folder - " + KXSItem::description() + ", name: " + fields_.value(kName).description();
}

void KXSFolder::encodeWithCoder(KeyedArchiver& coder) const {
  encodeFields(coder, ownKeys());
  KXSItem::encodeWithCoder(coder);
}

Value KXSFolder::propertyList() const {
  Dictionary dictionary(KXSItem::propertyList().dictionaryValue());
  writeFields(dictionary, ownKeys());
  return Value::dictionary(std::move(dictionary));
}

}  // namespace kx
