#include "records/KXSEvent.h"

#include <array>

#include "platform/sync/FRLog.h"
#include "records/KXSUUID.h"

namespace kx {

std::span<const FieldKey> KXSEvent::allKeys() {
  static constexpr std::array<FieldKey, 5> kKeys = {{{kKXSItemUUIDKey, kUUID},
                                                     {kKXSTransportUserInfoKey, kUserInfo},
                                                     {kKXSEventNameKey, kName},
                                                     {kKXSEventParentUUIDKey, kParentUUID},
                                                     {kKXSKeyAssetUUIDKey, kKeyAssetUUID}}};
  return kKeys;
}

// The base's two come first.
std::span<const FieldKey> KXSEvent::ownKeys() { return allKeys().subspan(kFirstOwnSlot); }

KXSEventPtr KXSEvent::init() { return initWithUUID(KXSUUID::generateUUIDAsString()); }

KXSEventPtr KXSEvent::initWithUUID(OptionalString uuid) {
  auto event = std::make_shared<KXSEvent>(Token(), RecordFields());
  event->setUuid(uuid);
  event->setName("");
  return event;
}

KXSEventPtr KXSEvent::initFromPropertyList(const Value& dictionary) {
  return std::make_shared<KXSEvent>(Token(), RecordFields(dictionary, allKeys(), "item"));
}

KXSEventPtr KXSEvent::initFromPropertyList(Value dictionary,
                                           const RecordFields::Positions& positions) {
  return std::make_shared<KXSEvent>(Token(), RecordFields(std::move(dictionary), positions));
}

KXSEventPtr KXSEvent::initWithHostPropertyList(const Value& /*dictionary*/) { return nullptr; }

bool KXSEvent::mergeWithHostPropertyList(const Value& /*dictionary*/) { return false; }

KXSEventPtr KXSEvent::initWithCoder(KeyedUnarchiver& coder) {
  auto event = makeWithCoder<KXSEvent>(coder);
  event->decodeFields(coder, ownKeys());
  return event;
}

std::string KXSEvent::description() const {
  return "Event - " + KXSItem::description() + ", name: " + fields_.value(kName).description() +
         ", key asset: " + fields_.value(kKeyAssetUUID).description();
}

void KXSEvent::encodeWithCoder(KeyedArchiver& coder) const {
  encodeFields(coder, ownKeys());
  KXSItem::encodeWithCoder(coder);
}

Value KXSEvent::propertyList() const {
  Dictionary dictionary(KXSItem::propertyList().dictionaryValue());
  writeFields(dictionary, ownKeys());
  return Value::dictionary(std::move(dictionary));
}

bool KXSEvent::isEqualToEvent(const KXSItem* other) const {
  if (other == nullptr) return false;
  if (other == this) return true;
  const auto* event = dynamic_cast<const KXSEvent*>(other);
  if (event == nullptr) {
    KX_LOG("KXSEvent", "isEqualToEvent", LogLevel::kError, "otherEvent isn't an event");
    return false;
  }
  return hasEqualFields(*event);
}

bool KXSEvent::hasEqualFields(const KXSEvent& other) const {
  struct Comparison {
    std::size_t slot;
    const char* message;
  };
  static constexpr std::array<Comparison, 3> kComparisons = {{
      {kName, "event name not equal"},
      {kParentUUID, "event parentUUID not equal"},
      {kKeyAssetUUID, "event keyAssetUUID not equal"},
  }};
  for (const Comparison& comparison : kComparisons) {
    if (!RecordFields::equal(fields_, other.fields_, comparison.slot)) {
      KX_LOG("KXSEvent", "isEqualToEvent", LogLevel::kDebug, comparison.message);
      return false;
    }
  }
  return true;
}

}  // namespace kx
