#include "records/KXSItem.h"

#include <array>

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/Text.h"
#include "platform/library/KXPhotoLibrary.h"

namespace kx {
namespace {

constexpr std::array<FieldKey, 2> kBaseKeys = {
    {{kKXSItemUUIDKey, 0}, {kKXSTransportUserInfoKey, 1}}};

}  // namespace

KXSItemPtr KXSItem::init() { return initWithUUID(UUIDString()); }

KXSItemPtr KXSItem::initWithUUID(OptionalString uuid) {
  auto item = std::make_shared<KXSItem>(Token(), RecordFields());
  item->setUuid(uuid);
  return item;
}

KXSItemPtr KXSItem::initFromPropertyList(const Value& dictionary) {
  return std::make_shared<KXSItem>(Token(), RecordFields(dictionary, kBaseKeys, "item"));
}

KXSItemPtr KXSItem::initWithCoder(KeyedUnarchiver& coder) { return makeWithCoder<KXSItem>(coder); }

std::string KXSItem::description() const { return "(" + fields_.value(kUUID).description() + ")"; }

void KXSItem::encodeWithCoder(KeyedArchiver& coder) const { encodeFields(coder, kBaseKeys); }

Value KXSItem::propertyList() const {
  Dictionary dictionary;
  dictionary.setIfPresent(kKXSItemUUIDKey, uuidValue());
  dictionary.set(kKXSTransportItemTypeKey, Value::string(_itemType()));
  dictionary.setIfPresent(kKXSTransportUserInfoKey, userInfo());
  return Value::dictionary(std::move(dictionary));
}

std::string_view KXSItem::_itemType() const {
  throw InternalInconsistency("Method not implemented on base class");
}

Value KXSItem::uuidValue() const {
  Value uuid = fields_.value(kUUID);
  if (!uuid.isString()) uuid.asString(kKXSItemUUIDKey);  // raises unless it is null
  return uuid;
}

Value KXSItem::hostInfo() const { return hostInfo_ ? *hostInfo_ : Value::dictionary(Dictionary()); }

void KXSItem::setHostInfo(Value hostInfo) {
  hostInfo_ = std::make_unique<Value>(std::move(hostInfo));
}

void KXSItem::decodeBase(KeyedUnarchiver& coder) { decodeFields(coder, kBaseKeys); }

void KXSItem::decodeFields(KeyedUnarchiver& coder, std::span<const FieldKey> keys) {
  for (const FieldKey& field : keys) fields_.set(field.slot, coder.decodeValue(field.key));
}

void KXSItem::encodeFields(KeyedArchiver& coder, std::span<const FieldKey> keys) const {
  for (const FieldKey& field : keys) coder.encodeValue(field.key, fields_.value(field.slot));
}

void KXSItem::writeFields(Dictionary& dictionary, std::span<const FieldKey> keys) const {
  for (const FieldKey& field : keys) {
    dictionary.setIfPresent(field.key, fields_.value(field.slot));
  }
}

}  // namespace kx
