#include "records/KXSAsset.h"

#include <array>

#include "records/KXSUUID.h"

namespace kx {

std::span<const FieldKey> KXSAsset::allKeys() {
  static constexpr std::array<FieldKey, 15> kKeys = {{
      {kKXSItemUUIDKey, kUUID},
      {kKXSTransportUserInfoKey, kUserInfo},
      {kKXSAssetRatingKey, kRating},
      {kKXSAssetIsFlaggedKey, kIsFlagged},
      {kKXSAssetIsVideoKey, kIsVideo},
      {kKXSAssetCaptionKey, kCaption},
      {kKXSAssetEventUUIDKey, kEventUUID},
      {kKXSAssetAdjustmentsKey, kAdjustments},
      {kKXSAssetExposureDateKey, kExposureDate},
      {kKXSAssetModificationDateKey, kModificationDate},
      {kKXSAssetLongitudeKey, kLongitude},
      {kKXSAssetLatitudeKey, kLatitude},
      {kKXSAssetOriginalFileNameKey, kOriginalFileName},
      {kKXSAssetFacesKey, kFaces},
      {kKXSAssetPropertiesKey, kPropertiesDictionary},
  }};
  return kKeys;
}

// "isVideo" and "assetProperties" are archived in a form of their own.
std::span<const FieldKey> KXSAsset::archivedKeys() {
  static constexpr std::array<FieldKey, 7> kKeys = {{
      {kKXSAssetRatingKey, kRating},
      {kKXSAssetIsFlaggedKey, kIsFlagged},
      {kKXSAssetAdjustmentsKey, kAdjustments},
      {kKXSAssetCaptionKey, kCaption},
      {kKXSAssetEventUUIDKey, kEventUUID},
      {kKXSAssetOriginalFileNameKey, kOriginalFileName},
      {kKXSAssetFacesKey, kFaces},
  }};
  return kKeys;
}

KXSAsset::KXSAsset(Token token, RecordFields fields) : KXSItem(token, std::move(fields)) {
  fields_.fallBack(kExposureDate, kModificationDate);
}

KXSAsset::~KXSAsset() { delete properties_.load(std::memory_order_acquire); }

KXSAssetPtr KXSAsset::init() { return initWithUUID(KXSUUID::generateUUIDAsString()); }

KXSAssetPtr KXSAsset::initWithUUID(OptionalString uuid) {
  auto asset = std::make_shared<KXSAsset>(Token(), RecordFields());
  asset->setUuid(uuid);
  asset->setRating(Value::integer(0));
  asset->setIsFlagged(Value::boolean(false));
  asset->setIsVideo(false);
  asset->setCaption("");
  asset->setEventUUID("");
  asset->setAdjustments(Value::array({}));
  asset->setExposureDate(Value::real(0.0));
  asset->setModificationDate(Value::real(0.0));
  asset->setFacesInfo(Value::array({}));
  return asset;
}

KXSAssetPtr KXSAsset::initFromPropertyList(const Value& dictionary) {
  return std::make_shared<KXSAsset>(Token(), RecordFields(dictionary, allKeys(), "item"));
}

KXSAssetPtr KXSAsset::initFromPropertyList(Value dictionary,
                                           const RecordFields::Positions& positions,
                                           RecordBlocks& blocks) {
  return blocks.make<KXSAsset>(Token(), RecordFields(std::move(dictionary), positions));
}

KXSAssetPtr KXSAsset::initWithCoder(KeyedUnarchiver& coder) {
  auto asset = makeWithCoder<KXSAsset>(coder);
  asset->decodeFields(coder, archivedKeys());
  asset->fields_.set(kIsVideo, coder.decodeValue(kKXSAssetIsVideoKey));
  asset->setProperties(std::dynamic_pointer_cast<KXSAssetProperties>(
      coder.decodeObject(kKXSAssetPropertiesKey, "KXSAssetProperties")));
  return asset;
}

std::string KXSAsset::description() const {
  const auto text = [this](std::size_t slot) { return fields_.value(slot).description(); };
  const Value video = fields_.value(kIsVideo);
  const bool videoFlag = video.isNumber() && video.numberValue().boolValue();
  return "Asset - " + KXSItem::description() + ", rating: " + text(kRating) +
         ", isFlagged: " + text(kIsFlagged) + ", isVideo:" + (videoFlag ? "YES" : "NO") +
         ", caption: " + text(kCaption) + ", eventUUID: " + text(kEventUUID) +
         ", adjustments: " + text(kAdjustments) + ", exposureDate: " + text(kExposureDate) +
         ", modificationDate: " + text(kModificationDate) + ", latitude: " + text(kLatitude) +
         ", longitude: " + text(kLongitude) + ", originalFileName: " + text(kOriginalFileName) +
         ", facesInfo: " + text(kFaces);
}

void KXSAsset::encodeWithCoder(KeyedArchiver& coder) const {
  encodeFields(coder, archivedKeys());
  coder.encodeValue(kKXSAssetIsVideoKey, Value::boolean(isVideo()));
  coder.encodeObject(kKXSAssetPropertiesKey, properties());
  KXSItem::encodeWithCoder(coder);
}

Value KXSAsset::propertyList() const {
  Dictionary dictionary(KXSItem::propertyList().dictionaryValue());
  for (const FieldKey& field : allKeys().subspan(kFirstOwnSlot)) {
    if (field.slot == kIsVideo) {
      dictionary.set(field.key, Value::boolean(isVideo()));
    } else if (field.slot == kPropertiesDictionary) {
      const KXSAssetPropertiesPtr record = properties();
      if (record) dictionary.set(field.key, record->propertyList());
    } else {
      dictionary.setIfPresent(field.key, fields_.value(field.slot));
    }
  }
  return Value::dictionary(std::move(dictionary));
}

std::vector<KXSFacePtr> KXSAsset::getFacesArray() const {
  std::vector<KXSFacePtr> faces;
  if (fields_.isNull(kFaces)) return faces;
  const std::optional<ArrayView> infos = facesInfo();
  if (!infos) return faces;
  faces.reserve(infos->size());
  for (const Value& info : *infos) faces.push_back(KXSFace::initWithFaceInfo(info));
  return faces;
}

bool KXSAsset::isEquivalentTo(const KXSAsset* other) const {
  if (other == this) return true;
  return other != nullptr && hasEquivalentFields(*other);
}

bool KXSAsset::hasEquivalentFields(const KXSAsset& other) const {
  const auto equal = [this, &other](std::size_t slot) {
    return RecordFields::equal(fields_, other.fields_, slot);
  };
  if (!equal(kExposureDate) || !equal(kModificationDate)) return false;
  // No null rule here: the comparison is asked of this asset's number, and a null one says no.
  if (fields_.isNull(kLatitude) || !equal(kLatitude)) return false;
  if (fields_.isNull(kLongitude) || !equal(kLongitude)) return false;
  if (!equal(kOriginalFileName)) return false;
  return fields_.count(kFaces) == other.fields_.count(kFaces);
}

std::optional<ArrayView> KXSAsset::adjustments() const {
  if (fields_.isNull(kAdjustments)) return std::nullopt;
  return fields_.value(kAdjustments).asArray(kKXSAssetAdjustmentsKey);
}

std::optional<ArrayView> KXSAsset::facesInfo() const {
  if (fields_.isNull(kFaces)) return std::nullopt;
  return fields_.value(kFaces).asArray(kKXSAssetFacesKey);
}

KXSAssetPropertiesPtr KXSAsset::properties() const {
  if (const auto* made = properties_.load(std::memory_order_acquire)) return *made;
  if (fields_.isNull(kPropertiesDictionary)) return nullptr;
  auto made = std::make_unique<KXSAssetPropertiesPtr>(
      KXSAssetProperties::initFromPropertyList(fields_.value(kPropertiesDictionary)));
  KXSAssetPropertiesPtr* present = nullptr;
  if (properties_.compare_exchange_strong(present, made.get(), std::memory_order_acq_rel)) {
    return *made.release();
  }
  return *present;  // another thread was first
}

void KXSAsset::setProperties(KXSAssetPropertiesPtr properties) {
  fields_.set(kPropertiesDictionary, Value());
  delete properties_.exchange(
      properties ? new KXSAssetPropertiesPtr(std::move(properties)) : nullptr,
      std::memory_order_acq_rel);
}

}  // namespace kx
