#include "platform/library/KXSyncSaveJob.h"

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyList.h"
#include "platform/sync/FRLog.h"

namespace kx {
namespace {

constexpr const char* kUrl = "originalAssetURL";
constexpr const char* kIsVideo = "isVideo";
constexpr const char* kUuid = "uuid";
constexpr const char* kLatitude = "latitude";
constexpr const char* kLongitude = "longitude";
constexpr const char* kFacesInfo = "facesInfo";
constexpr const char* kCreationDate = "creationDate";
constexpr const char* kModificationDate = "modificationDate";
constexpr const char* kSortToken = "sortToken";
constexpr const char* kOriginalFileName = "originalFileName";
constexpr const char* kAlbumURIs = "albumURIs";
constexpr const char* kIsSyncComplete = "isSyncComplete";
constexpr const char* kCleanupSyncState = "cleanupSyncState";
constexpr const char* kCleanupBeforeDate = "cleanupBeforeDate";

// Dates travel as reals: a property-list date would do, but any double must survive bit for bit.
void setDate(Dictionary& out, const char* key, const std::optional<Date>& date) {
  if (date) out.set(key, Value::real(date->secondsSinceReference));
}

std::optional<Date> dateUnder(const Value& root, const char* key) {
  const std::optional<Number> seconds = root[key].asNumber(key);
  if (!seconds) return std::nullopt;
  return Date{seconds->doubleValue()};
}

std::optional<std::string> textUnder(const Value& root, const char* key) {
  const Value value = root[key];
  const OptionalString text = value.asString(key);
  if (!text) return std::nullopt;
  return std::string(*text);
}

bool flagUnder(const Value& root, const char* key) {
  const std::optional<Number> flag = root[key].asNumber(key);
  return flag && flag->boolValue();
}

std::optional<double> realUnder(const Value& root, const char* key) {
  const std::optional<Number> number = root[key].asNumber(key);
  if (!number) return std::nullopt;
  return number->doubleValue();
}

KXSyncSaveJob::Fields fieldsFrom(const Value& root) {
  KXSyncSaveJob::Fields fields;
  fields.originalAssetPath = textUnder(root, kUrl);
  fields.isVideo = flagUnder(root, kIsVideo);
  fields.uuid = textUnder(root, kUuid);
  const std::optional<double> latitude = realUnder(root, kLatitude);
  const std::optional<double> longitude = realUnder(root, kLongitude);
  if (latitude && longitude) fields.location = Coordinate{*latitude, *longitude};
  fields.facesInfo = root[kFacesInfo];
  static_cast<void>(fields.facesInfo.asArray(kFacesInfo));
  fields.creationDate = dateUnder(root, kCreationDate);
  fields.modificationDate = dateUnder(root, kModificationDate);
  fields.sortToken = realUnder(root, kSortToken);
  fields.originalFileName = textUnder(root, kOriginalFileName);
  const Value uris = root[kAlbumURIs];
  if (const auto list = uris.asArray(kAlbumURIs)) {
    fields.albumURIs.emplace();
    for (const Value& uri : *list) fields.albumURIs->emplace_back(uri.stringValue());
  }
  fields.isSyncComplete = flagUnder(root, kIsSyncComplete);
  fields.cleanupSyncState = flagUnder(root, kCleanupSyncState);
  fields.cleanupBeforeDate = dateUnder(root, kCleanupBeforeDate);
  return fields;
}

}  // namespace

DataPtr KXSyncSaveJob::serializedData() const {
  Dictionary root;
  if (fields_.originalAssetPath) root.set(kUrl, Value::string(*fields_.originalAssetPath));
  root.set(kIsVideo, Value::boolean(fields_.isVideo));
  if (fields_.uuid) root.set(kUuid, Value::string(*fields_.uuid));
  if (fields_.location) {
    root.set(kLatitude, Value::real(fields_.location->latitude));
    root.set(kLongitude, Value::real(fields_.location->longitude));
  }
  root.setIfPresent(kFacesInfo, fields_.facesInfo);
  setDate(root, kCreationDate, fields_.creationDate);
  setDate(root, kModificationDate, fields_.modificationDate);
  if (fields_.sortToken) root.set(kSortToken, Value::real(*fields_.sortToken));
  if (fields_.originalFileName)
    root.set(kOriginalFileName, Value::string(*fields_.originalFileName));
  if (fields_.albumURIs) {
    Array uris;
    for (const std::string& uri : *fields_.albumURIs) uris.push_back(Value::string(uri));
    root.set(kAlbumURIs, Value::array(std::move(uris)));
  }
  root.set(kIsSyncComplete, Value::boolean(fields_.isSyncComplete));
  root.set(kCleanupSyncState, Value::boolean(fields_.cleanupSyncState));
  setDate(root, kCleanupBeforeDate, fields_.cleanupBeforeDate);
  std::vector<std::uint8_t> bytes =
      writePropertyList(Value::dictionary(std::move(root)), PropertyListFormat::kBinary, nullptr);
  if (bytes.empty()) return nullptr;
  return std::make_shared<Data>(std::move(bytes));
}

std::optional<KXSyncSaveJob::Fields> KXSyncSaveJob::fieldsFromSerializedData(const DataPtr& data,
                                                                             ErrorPtr* error) {
  const Value root = readPropertyList(data, error);
  if (root.isNull()) return std::nullopt;
  try {
    static_cast<void>(root.dictionaryValue());
    return fieldsFrom(root);
  } catch (const TypeError& typeError) {
    setError(error, Error::make(kPropertyListErrorDomain,
                                static_cast<std::int64_t>(PropertyListError::kArchiveShape),
                                std::string("E_ARCHIVE_SHAPE: save job: ") + typeError.what()));
    return std::nullopt;
  }
}

std::string KXSyncSaveJob::description() const {
  if (fields_.cleanupSyncState) return "<KXSyncSaveJob: clean-up>";
  return formatMessage(
      "<KXSyncSaveJob: %@%@, file: %@>",
      {fields_.uuid, fields_.isSyncComplete ? ", sync complete" : "", fields_.originalAssetPath});
}

}  // namespace kx
