#include "records/KXSAlbum.h"

#include <array>

#include "platform/sync/FRLog.h"
#include "records/KXSUUID.h"

namespace kx {

std::span<const FieldKey> KXSAlbum::allKeys() {
  static constexpr std::array<FieldKey, 8> kKeys = {
      {{kKXSItemUUIDKey, kUUID},
       {kKXSTransportUserInfoKey, kUserInfo},
       {kKXSAlbumNameKey, kName},
       {kKXSAlbumAssetUUIDsKey, kAssetUUIDs},
       {kKXSAlbumParentUUIDKey, kParentUUID},
       {kKXSAlbumSubclassKey, kAlbumSubclass},
       {kKXSAlbumKeyAssetFaceIndexKey, kKeyAssetFaceIndex},
       {kKXSKeyAssetUUIDKey, kKeyAssetUUID}}};
  return kKeys;
}

// The base's two come first.
std::span<const FieldKey> KXSAlbum::ownKeys() { return allKeys().subspan(kFirstOwnSlot); }

KXSAlbumPtr KXSAlbum::init() { return initWithUUID(KXSUUID::generateUUIDAsString()); }

KXSAlbumPtr KXSAlbum::initWithUUID(OptionalString uuid) {
  auto album = std::make_shared<KXSAlbum>(Token(), RecordFields());
  album->setUuid(uuid);
  album->setName("");
  album->setAssetUUIDs(Value::array({}));
  album->setAlbumSubclass(Value::integer(0));
  return album;
}

KXSAlbumPtr KXSAlbum::initFromPropertyList(const Value& dictionary) {
  return std::make_shared<KXSAlbum>(Token(), RecordFields(dictionary, allKeys(), "item"));
}

KXSAlbumPtr KXSAlbum::initFromPropertyList(Value dictionary,
                                           const RecordFields::Positions& positions) {
  return std::make_shared<KXSAlbum>(Token(), RecordFields(std::move(dictionary), positions));
}

KXSAlbumPtr KXSAlbum::initWithCoder(KeyedUnarchiver& coder) {
  auto album = makeWithCoder<KXSAlbum>(coder);
  album->decodeFields(coder, ownKeys());
  return album;
}

std::string KXSAlbum::description() const {
  return "Album - " + KXSItem::description() + ", name: " + fields_.value(kName).description() +
         " subclass type:(" + fields_.value(kAlbumSubclass).description() + ")";
}

void KXSAlbum::encodeWithCoder(KeyedArchiver& coder) const {
  encodeFields(coder, ownKeys());
  KXSItem::encodeWithCoder(coder);
}

Value KXSAlbum::propertyList() const {
  Dictionary dictionary(KXSItem::propertyList().dictionaryValue());
  writeFields(dictionary, ownKeys());
  return Value::dictionary(std::move(dictionary));
}

std::optional<ArrayView> KXSAlbum::assetUUIDs() const {
  return fields_.value(kAssetUUIDs).asArray(kKXSAlbumAssetUUIDsKey);
}

bool KXSAlbum::isEqualToAlbum(const KXSItem* other) const {
  if (other == nullptr) return false;
  const auto* album = dynamic_cast<const KXSAlbum*>(other);
  if (album == nullptr) {
    KX_LOG("KXSAlbum", "isEqualToAlbum", LogLevel::kError, "otherAlbum isn't an album");
    return false;
  }
  return album == this || hasEqualFields(*album);
}

bool KXSAlbum::hasEqualFields(const KXSAlbum& other) const {
  struct Comparison {
    std::size_t slot;
    const char* message;
  };
  static constexpr std::array<Comparison, 5> kComparisons = {{
      {kName, "album name not equal"},
      {kAlbumSubclass, "album albumSubclass not equal"},
      {kKeyAssetFaceIndex, "album albumKeyAssetFaceIndex not equal"},
      {kParentUUID, "album parentUUID not equal"},
      {kKeyAssetUUID, "album keyAssetUUID not equal"},
  }};
  for (const Comparison& comparison : kComparisons) {
    if (!RecordFields::equal(fields_, other.fields_, comparison.slot)) {
      KX_LOG("KXSAlbum", "isEqualToAlbum", LogLevel::kDebug, comparison.message);
      return false;
    }
  }
  return hasEqualAssetUUIDs(other);
}

bool KXSAlbum::hasEqualAssetUUIDs(const KXSAlbum& other) const {
  const std::size_t count = fields_.count(kAssetUUIDs);
  if (count != other.fields_.count(kAssetUUIDs)) {
    KX_LOG("KXSAlbum", "isEqualToAlbum", LogLevel::kDebug, "album assetUUIDs count not equal");
    return false;
  }
  if (!RecordFields::equalElements(fields_, other.fields_, kAssetUUIDs)) {
    KX_LOG("KXSAlbum", "isEqualToAlbum", LogLevel::kDebug, "album assetUUID not equal");
    return false;
  }
  return true;
}

}  // namespace kx
