#include "host/FolderSnapshot.h"

#include <algorithm>
#include <map>
#include <numeric>
#include <optional>
#include <set>
#include <utility>

#include "platform/foundation/Text.h"
#include "records/KXSAlbum.h"
#include "records/KXSAsset.h"
#include "records/KXSEvent.h"
#include "transport/KXSLibraryChangeSnapshot.h"
#include "transport/KXSTransportEncoder.h"

namespace kx {

namespace {

constexpr int kFaceAlbumSubclass = 3;
constexpr int kMasterAlbumSubclass = 5;

double modificationSeconds(const FolderAsset& asset) {
  if (asset.recorded) return asset.recorded->modified;
  const ScannedFile& file = asset.file;
  // The later one, compared to the nanosecond before it becomes a real number.
  const FileTime time =
      file.sidePath.empty() ? file.modified : std::max(file.modified, file.sideModified);
  return hostSecondsOf(time.seconds, time.nanoseconds);
}

std::string folderOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == std::string::npos ? std::string() : path.substr(0, slash);
}

// Where a person is shown, in capture order.
struct Showing {
  std::vector<Value> assets;
  std::size_t firstFaceIndex = 0;
};

class Builder {
 public:
  Builder(const HostIdentity& identity, const HostOptions& options,
          const std::vector<FolderAsset>& assets)
      : identity_(identity), options_(options), assets_(assets) {}

  Value root() {
    prepare();
    addMaster();
    addAlbums();
    addEvents();
    addPeople();
    for (const std::size_t index : captureOrder_) addAsset(index);
    const auto snapshot = KXSLibraryChangeSnapshot::librarySnapshot();
    snapshot->setLibraryUUID(identity_.library());
    snapshot->setLibraryKind(kKXSTransportLibraryKindFolderKey);
    snapshot->setUpdates(updates_);
    Dictionary root(
        KXSTransportEncoder::encoder()->encodeSnapshot(*snapshot, nullptr).dictionaryValue());
    if (!options_.userAgent.empty()) root.set("TesselUserAgent", Value::string(options_.userAgent));
    return Value::dictionary(std::move(root));
  }

 private:
  void prepare() {
    updates_->reserve(assets_.size() + 64);
    for (const FolderAsset& asset : assets_) {
      uuids_.push_back(Value::string(identity_.asset(asset.file.path)));
      modified_.push_back(modificationSeconds(asset));
      captured_.push_back(capturedSeconds(asset).value_or(modified_.back()));
      days_.push_back(dayOf(asset));
    }
    captureOrder_.resize(assets_.size());
    std::iota(captureOrder_.begin(), captureOrder_.end(), std::size_t{0});
    // Stable: photos of the same time keep the order of their paths.
    std::stable_sort(captureOrder_.begin(), captureOrder_.end(),
                     [this](std::size_t a, std::size_t b) { return captured_[a] < captured_[b]; });
  }

  std::optional<double> capturedSeconds(const FolderAsset& asset) const {
    if (asset.recorded) return asset.recorded->captured;
    const std::optional<CaptureTime>& taken = asset.metadata.captureTime;
    if (!taken) return std::nullopt;
    return taken->hostSeconds(options_.timezoneOffsetMinutes);
  }

  std::string dayOf(const FolderAsset& asset) const {
    if (asset.recorded) return asset.recorded->day;
    if (asset.metadata.captureTime) return asset.metadata.captureTime->isoDay();
    const ScannedFile& file = asset.file;
    const FileTime time =
        file.sidePath.empty() ? file.modified : std::max(file.modified, file.sideModified);
    return wallTimeOf(time.seconds, options_.timezoneOffsetMinutes).isoDay();
  }

  void addItem(const KXSItemPtr& item) { updates_->set(item->uuidValue(), item); }

  KXSAlbumPtr album(const std::string& uuid, const std::string& name, Array assets) const {
    const KXSAlbumPtr album = KXSAlbum::albumWithUUID(uuid);
    album->setName(name);
    if (!assets.empty()) album->setKeyAssetUUID(assets.front().stringValue());
    album->setAssetUUIDs(Value::array(std::move(assets)));
    return album;
  }

  void addMaster() {
    Array all;
    for (const std::size_t index : captureOrder_) all.push_back(uuids_[index]);
    const KXSAlbumPtr master = KXSAlbum::albumWithUUID(identity_.master());
    master->setName("All photos");
    master->setAlbumSubclass(Value::integer(kMasterAlbumSubclass));
    master->setAssetUUIDs(Value::array(std::move(all)));
    addItem(master);
  }

  void addAlbums() {
    std::map<std::string, Array> albums;
    for (std::size_t index = 0; index < assets_.size(); ++index) {
      const std::string folder = folderOf(assets_[index].file.path);
      if (!folder.empty()) albums[folder].push_back(uuids_[index]);
    }
    for (auto& [folder, members] : albums)
      addItem(album(identity_.album(folder), nameText(folder), std::move(members)));
  }

  void addEvents() {
    std::map<std::string, Value> firstOfDay;
    for (const std::size_t index : captureOrder_) firstOfDay.emplace(days_[index], uuids_[index]);
    for (const auto& [day, first] : firstOfDay) {
      const std::string uuid = identity_.event(day);
      const KXSEventPtr event = KXSEvent::eventWithUUID(uuid);
      event->setName(day);
      event->setKeyAssetUUID(first.stringValue());
      addItem(event);
      events_.emplace(day, Value::string(uuid));
    }
  }

  void addPeople() {
    std::map<std::string, Showing> people;
    for (const std::size_t index : captureOrder_) {
      const std::vector<FaceRegion>& faces = assets_[index].metadata.faces;
      std::set<std::string> shown;
      for (std::size_t face = 0; face < faces.size(); ++face) {
        const std::string& name = faces[face].name;
        if (name.empty() || !shown.insert(name).second) continue;
        Showing& showing = people[name];
        if (showing.assets.empty()) showing.firstFaceIndex = face;
        showing.assets.push_back(uuids_[index]);
      }
    }
    for (auto& [name, showing] : people) {
      const std::string uuid = identity_.person(name);
      const KXSAlbumPtr person = album(uuid, name, std::move(showing.assets));
      person->setAlbumSubclass(Value::integer(kFaceAlbumSubclass));
      person->setAlbumKeyAssetFaceIndex(
          Value::integer(static_cast<std::int64_t>(showing.firstFaceIndex)));
      addItem(person);
      people_.emplace(name, Value::string(uuid));
    }
  }

  void addAsset(std::size_t index) {
    const FolderAsset& from = assets_[index];
    const PhotoMetadata& metadata = from.metadata;
    const KXSAssetPtr asset = KXSAsset::assetWithUUID(uuids_[index].stringValue());
    asset->setIsVideo(from.type.isVideo);
    asset->setRating(Value::integer(metadata.rating.value_or(0)));
    if (metadata.caption.empty()) {
      asset->setCaption(std::nullopt);
    } else {
      asset->setCaption(metadata.caption);
    }
    asset->setEventUUID(events_.at(days_[index]).stringValue());
    asset->setAdjustments(Value());
    // Without one, the reader of the record takes the modification date.
    asset->setExposureDate(capturedSeconds(from) ? Value::real(captured_[index]) : Value());
    asset->setModificationDate(Value::real(modified_[index]));
    if (metadata.place) {
      asset->setLatitude(Value::real(metadata.place->latitude));
      asset->setLongitude(Value::real(metadata.place->longitude));
    }
    const std::string name = nameText(lastPathComponent(from.file.path));
    asset->setOriginalFileName(name);
    asset->setFacesInfo(metadata.faces.empty() ? Value() : facesInfo(metadata.faces));
    asset->setProperties(properties(from, name));
    addItem(asset);
  }

  Value facesInfo(const std::vector<FaceRegion>& faces) const {
    Array infos;
    for (std::size_t index = 0; index < faces.size(); ++index) {
      Dictionary face;
      if (!faces[index].name.empty())
        face.set(kKXSAssetFaceAlbumUUIDKey, people_.at(faces[index].name));
      face.set(kKXSAssetFaceIndexKey, Value::integer(static_cast<std::int64_t>(index)));
      face.set(kKXSAssetFaceRectangleKey, dictionaryFromRect(faces[index].rect));
      infos.push_back(Value::dictionary(std::move(face)));
    }
    return Value::array(std::move(infos));
  }

  static KXSAssetPropertiesPtr properties(const FolderAsset& from, const std::string& name) {
    const KXSAssetPropertiesPtr properties = KXSAssetProperties::assetProperties();
    properties->setImageProperties(from.metadata.imageProperties);
    properties->setFileSystemProperties(
        from.recorded ? from.recorded->fileProperties
                      : fileAttributesValue(from.file.sizeBytes, from.file.modified));
    properties->setFileName(name);
    return properties;
  }

  const HostIdentity& identity_;
  const HostOptions& options_;
  const std::vector<FolderAsset>& assets_;
  std::vector<Value> uuids_;
  std::vector<double> captured_;  // host time
  std::vector<double> modified_;  // host time
  std::vector<std::string> days_;
  std::vector<std::size_t> captureOrder_;
  std::map<std::string, Value> events_;
  std::map<std::string, Value> people_;
  KXSItemMapPtr updates_ = std::make_shared<KXSItemMap>();
};

}  // namespace

Value folderSnapshotRoot(const HostIdentity& identity, const HostOptions& options,
                         const std::vector<FolderAsset>& assets) {
  return Builder(identity, options, assets).root();
}

Value fileAttributesValue(std::int64_t sizeBytes, const FileTime& modified) {
  constexpr std::int64_t kReference = 978'307'200;  // 2001-01-01, in seconds since 1970
  const double seconds = static_cast<double>(modified.seconds - kReference) +
                         static_cast<double>(modified.nanoseconds) / 1e9;
  return Value::dictionary(Dictionary{{"size", Value::integer(sizeBytes)},
                                      {"modificationDate", Value::date(Date{seconds})}});
}

}  // namespace kx
