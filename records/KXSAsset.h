#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/RecordBlocks.h"
#include "records/KXSAssetProperties.h"
#include "records/KXSFace.h"
#include "records/KXSItem.h"

namespace kx {

class KXSAsset;
using KXSAssetPtr = std::shared_ptr<KXSAsset>;

// One photo or video of the host library. Item type "Asset". Threads and errors as KXSItem. Times
// are host times: seconds since 1904-01-01 00:00:00 UTC (TesselDates.h).
class KXSAsset final : public KXSItem {
 public:
  static KXSAssetPtr asset() { return init(); }
  static KXSAssetPtr init();
  // Rating 0, neither flagged nor video, texts "", no adjustments and faces, dates 0.0; location,
  // file name and properties null.
  static KXSAssetPtr assetWithUUID(OptionalString uuid) { return initWithUUID(uuid); }
  static KXSAssetPtr initWithUUID(OptionalString uuid);
  // A missing exposure date is the modification date.
  static KXSAssetPtr initFromPropertyList(const Value& dictionary);
  // The same, with positions found before (RecordLayouts) and in memory of these blocks.
  static KXSAssetPtr initFromPropertyList(Value dictionary,
                                          const RecordFields::Positions& positions,
                                          RecordBlocks& blocks);
  // Dates and location are not archived: they come back null.
  static KXSAssetPtr initWithCoder(KeyedUnarchiver& coder);
  ~KXSAsset() override;

  std::string description() const override;
  std::string_view archiveClassName() const override { return "KXSAsset"; }
  void encodeWithCoder(KeyedArchiver& coder) const override;
  Value propertyList() const override;
  std::string_view _itemType() const override { return kKXSTransportAssetItemType; }

  // One face for each element of facesInfo, in its order.
  std::vector<KXSFacePtr> getFacesArray() const;
  // Same dates, location, file name and number of faces. A null latitude or longitude of this asset
  // is equivalent to nothing, not even to null. Never raises.
  bool isEquivalentTo(const KXSAsset* other) const;
  bool isEquivalentTo(const KXSAssetPtr& other) const { return isEquivalentTo(other.get()); }
  // The same without the rule that an asset is equivalent to itself.
  bool hasEquivalentFields(const KXSAsset& other) const;

  std::optional<Number> rating() const { return fields_.number(kRating, kKXSAssetRatingKey); }
  void setRating(Value rating) { fields_.set(kRating, std::move(rating)); }
  std::optional<Number> isFlagged() const {
    return fields_.number(kIsFlagged, kKXSAssetIsFlaggedKey);
  }
  void setIsFlagged(Value isFlagged) { fields_.set(kIsFlagged, std::move(isFlagged)); }
  // False when absent.
  bool isVideo() const {
    const std::optional<Number> number = fields_.number(kIsVideo, kKXSAssetIsVideoKey);
    return number && number->boolValue();
  }
  void setIsVideo(bool isVideo) { fields_.set(kIsVideo, Value::boolean(isVideo)); }
  OptionalString caption() const { return fields_.string(kCaption, kKXSAssetCaptionKey); }
  void setCaption(OptionalString caption) { fields_.set(kCaption, Value::optionalString(caption)); }
  OptionalString eventUUID() const { return fields_.string(kEventUUID, kKXSAssetEventUUIDKey); }
  void setEventUUID(OptionalString uuid) { fields_.set(kEventUUID, Value::optionalString(uuid)); }
  std::optional<ArrayView> adjustments() const;
  void setAdjustments(Value adjustments) { fields_.set(kAdjustments, std::move(adjustments)); }
  std::optional<Number> exposureDate() const {
    const bool isFallback = fields_.sharesEntry(kExposureDate, kModificationDate);
    return fields_.number(kExposureDate,
                          isFallback ? kKXSAssetModificationDateKey : kKXSAssetExposureDateKey);
  }
  void setExposureDate(Value seconds) { fields_.set(kExposureDate, std::move(seconds)); }
  std::optional<Number> modificationDate() const {
    return fields_.number(kModificationDate, kKXSAssetModificationDateKey);
  }
  void setModificationDate(Value seconds) { fields_.set(kModificationDate, std::move(seconds)); }
  // Degrees.
  std::optional<Number> longitude() const {
    return fields_.number(kLongitude, kKXSAssetLongitudeKey);
  }
  void setLongitude(Value degrees) { fields_.set(kLongitude, std::move(degrees)); }
  std::optional<Number> latitude() const { return fields_.number(kLatitude, kKXSAssetLatitudeKey); }
  void setLatitude(Value degrees) { fields_.set(kLatitude, std::move(degrees)); }
  OptionalString originalFileName() const {
    return fields_.string(kOriginalFileName, kKXSAssetOriginalFileNameKey);
  }
  void setOriginalFileName(OptionalString name) {
    fields_.set(kOriginalFileName, Value::optionalString(name));
  }
  // Face dictionaries in the host's form.
  std::optional<ArrayView> facesInfo() const;
  void setFacesInfo(Value faces) { fields_.set(kFaces, std::move(faces)); }
  // Null when absent; the same object at every call.
  KXSAssetPropertiesPtr properties() const;
  void setProperties(KXSAssetPropertiesPtr properties);

  // The keys that initFromPropertyList reads.
  static std::span<const FieldKey> allKeys();

  KXSAsset(Token, RecordFields fields);

 private:
  static constexpr std::size_t kRating = kFirstOwnSlot;
  static constexpr std::size_t kIsFlagged = kFirstOwnSlot + 1;
  static constexpr std::size_t kIsVideo = kFirstOwnSlot + 2;
  static constexpr std::size_t kCaption = kFirstOwnSlot + 3;
  static constexpr std::size_t kEventUUID = kFirstOwnSlot + 4;
  static constexpr std::size_t kAdjustments = kFirstOwnSlot + 5;
  static constexpr std::size_t kExposureDate = kFirstOwnSlot + 6;
  static constexpr std::size_t kModificationDate = kFirstOwnSlot + 7;
  static constexpr std::size_t kLongitude = kFirstOwnSlot + 8;
  static constexpr std::size_t kLatitude = kFirstOwnSlot + 9;
  static constexpr std::size_t kOriginalFileName = kFirstOwnSlot + 10;
  static constexpr std::size_t kFaces = kFirstOwnSlot + 11;
  static constexpr std::size_t kPropertiesDictionary = kFirstOwnSlot + 12;
  static std::span<const FieldKey> archivedKeys();

  // Made at the first use from the dictionary, then kept; owned.
  mutable std::atomic<KXSAssetPropertiesPtr*> properties_{nullptr};
};

}  // namespace kx
