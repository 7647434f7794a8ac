#include <array>
#include <cerrno>
#include <cmath>

#include "device/DeviceErrors.h"
#include "device/DeviceLayout.h"
#include "device/QuarrydJobs.h"
#include "platform/foundation/Exceptions.h"

namespace kx {
namespace {

ErrorPtr badJob(const std::string& what) { return deviceError(DeviceError::kBadJob, what); }

bool isFinite(const Rect& rect) {
  return std::isfinite(rect.x) && std::isfinite(rect.y) && std::isfinite(rect.width) &&
         std::isfinite(rect.height);
}

// The faces in the host's dictionary form. Null, and why, when one makes no sense.
std::optional<std::vector<FaceRow>> facesFrom(const Value& facesInfo, std::string* why) {
  std::vector<FaceRow> faces;
  try {
    const std::optional<ArrayView> list = facesInfo.asArray("facesInfo");
    if (!list) return faces;
    for (const Value& info : *list) {
      if (!info.isDictionary()) {
        *why = "a face that is no dictionary";
        return std::nullopt;
      }
      FaceRow face;
      if (const OptionalString album = info["faceAlbumUUID"].asString("faceAlbumUUID")) {
        face.albumUUID = std::string(*album);
      }
      if (const auto index = info["faceIndex"].asNumber("faceIndex")) {
        face.identifier = static_cast<std::uint16_t>(index->int16Value());
      }
      face.relativeRect = rectFromDictionary(info["faceRectangle"]).value_or(Rect{});
      if (!isFinite(face.relativeRect)) {
        *why = "a face rectangle that is not finite";
        return std::nullopt;
      }
      faces.push_back(std::move(face));
    }
    return faces;
  } catch (const TypeError& error) {
    *why = error.what();
    return std::nullopt;
  }
}

std::optional<double> secondsOf(const std::optional<Date>& date) {
  if (!date) return std::nullopt;
  return date->secondsSinceReference;
}

bool isFinite(const std::optional<double>& number) { return !number || std::isfinite(*number); }

// Files that are not to be moved away whatever a job says: the library's own.
bool isOwnFile(const std::string& path) {
  using namespace device_paths;
  constexpr std::array kOwn = {kDatabase,      kLock,     kAssetOrder,        kSyncInfo,
                               kRestoreMarker, kSnapshot, kCurrentLibraryUUID};
  constexpr std::array kOwnTrees = {kCaches, kSyncedAssets, kFaceThumbnails};
  for (const char* own : kOwn) {
    if (path.starts_with(own)) return true;
  }
  for (const char* tree : kOwnTrees) {
    if (path.starts_with(std::string(tree) + "/")) return true;
  }
  return false;
}

}  // namespace

void Quarryd::fail(const Import& import, const ErrorPtr& why) {
  parts_.store->health().noteImportFailure(import.fields.uuid.value_or(std::string()), why);
}

ErrorPtr Quarryd::checkSource(const std::string& path) {
  using namespace device_paths;
  if (DeviceRoot::checkPath(path) != 0 || !path.starts_with(std::string(kMedia) + "/")) {
    return deviceError(DeviceError::kBadFile, path + " is no file that a sync may move");
  }
  bool own = isOwnFile(path);
  const bool among = path.starts_with(std::string(kDcim) + "/") ||
                     path.starts_with(std::string(kPhotoData) + "/") ||
                     path.starts_with(std::string(kCascades) + "/");
  if (!own && among) {
    parts_.store->queue().sync([&] {
      SqliteStatement row(parts_.store->database(),
                          "SELECT 1 FROM assets WHERE path = ?1 "
                          "UNION ALL SELECT 1 FROM asset_files WHERE path = ?1");
      row.text(path);
      own = row.step();
    });
  }
  if (own) return deviceError(DeviceError::kBadFile, path + " belongs to the library");
  return nullptr;
}

ErrorPtr Quarryd::prepare(Import& import) {
  const KXSyncSaveJob::Fields& fields = import.fields;
  if (!fields.uuid) return badJob("an import without identifier");
  if (!fields.originalAssetPath) return badJob("an import without file");
  import.row.asset.uuid = *fields.uuid;
  import.row.asset.savedType = kKXSavedAssetTypeSynced;
  import.row.asset.isVideo = fields.isVideo;
  import.row.asset.modificationDate = secondsOf(fields.modificationDate);
  import.row.asset.sortToken = fields.sortToken;
  import.row.asset.location = fields.location;
  import.row.creationDate = secondsOf(fields.creationDate);
  import.row.originalFileName = fields.originalFileName;
  if (!isFinite(import.row.asset.modificationDate) || !isFinite(import.row.creationDate) ||
      !isFinite(fields.sortToken)) {
    return badJob("a date or sort token that is not finite");
  }
  if (fields.location &&
      !(std::isfinite(fields.location->latitude) && std::isfinite(fields.location->longitude))) {
    return badJob("a place that is not finite");
  }
  std::string why;
  std::optional<std::vector<FaceRow>> faces = facesFrom(fields.facesInfo, &why);
  if (!faces) return badJob(why);
  import.faces = std::move(*faces);
  for (const std::string& uri : fields.albumURIs.value_or(std::vector<std::string>())) {
    if (const std::optional<RowId> album = parts_.store->albumOfURI(uri)) {
      import.albums.push_back(*album);
    }
  }
  if (ErrorPtr refused = checkSource(import.source())) return refused;
  ErrorPtr error;
  const std::optional<MediaStore::Arrived> arrived = parts_.media->inspect(import.source(), &error);
  if (!arrived) return error;
  import.row.size = arrived->size;
  import.extension = arrived->extension;
  return nullptr;
}

ErrorPtr Quarryd::findRows(std::vector<Import>& imports) {
  ErrorPtr failure;
  parts_.store->queue().sync([&] {
    try {
      for (Import& import : imports) {
        SqliteStatement row(parts_.store->database(),
                            "SELECT pk, saved_type, path FROM assets WHERE uuid = ?");
        row.text(import.uuid());
        if (!row.step()) continue;
        import.replaced = row.integerAt(0);
        import.replacedPath = row.textAt(2);
        import.foreign = row.integerAt(1) != kKXSavedAssetTypeSynced;
      }
    } catch (const SqliteError& error) {
      failure = error.asError();
    }
  });
  return failure;
}

ErrorPtr Quarryd::placeFile(Import& import) {
  if (import.foreign) {
    return deviceError(DeviceError::kForeignAsset,
                       import.uuid() + " is an asset that the device made itself");
  }
  const std::string name = MediaFolders::fileName(import.uuid(), import.extension);
  if (const int failed = folders_.place(name, &import.row.path); failed != 0) {
    return systemError("no place for", name, failed);
  }
  ErrorPtr error;
  if (parts_.media->place(import.source(), import.row.path, &error)) return nullptr;
  folders_.release(import.row.path);
  return error;
}

namespace {

bool isNoSpace(const ErrorPtr& error) {
  return error && error->domain() == kDeviceErrorDomain &&
         error->code() == static_cast<std::int64_t>(DeviceError::kNoSpace);
}

}  // namespace

void Quarryd::importAll(HandOver& handOver) {
  std::vector<Import> imports = std::exchange(handOver.waiting, {});
  handOver.waitingBytes = 0;
  handOver.waitingUUIDs.clear();
  if (imports.empty()) return;
  // A full disk ends the hand-over's imports: none of the others would fare better.
  ErrorPtr ended = isNoSpace(handOver.outcome) ? handOver.outcome : findRows(imports);
  std::vector<Import> placed;
  std::vector<std::string> paths;
  for (Import& import : imports) {
    const ErrorPtr why = ended ? ended : placeFile(import);
    if (isNoSpace(why)) ended = why;
    if (why) {
      fail(import, why);
      continue;
    }
    paths.push_back(import.row.path);
    placed.push_back(std::move(import));
  }
  if (ended && !handOver.outcome) handOver.outcome = ended;
  if (placed.empty()) return;
  ErrorPtr failure;
  if (parts_.media->makeDurable(paths, &failure)) failure = commit(placed);
  if (!failure) {
    handOver.imported += placed.size();
    return;
  }
  if (!handOver.outcome) handOver.outcome = failure;
  for (const Import& import : placed) fail(import, failure);
  removeFiles(std::move(paths));
}

ErrorPtr Quarryd::commit(std::vector<Import>& imports) {
  ErrorPtr failure;
  LibraryStore& store = *parts_.store;
  store.queue().sync([&] {
    failure = store.write([&](LibraryWriter& writer) {
      std::map<RowId, std::uint32_t> arrived;
      for (const Import& import : imports) writeImport(writer, import, arrived);
      for (const auto& [album, count] : arrived) writer.lowerPendingCount(album, count);
      SqliteStatement progress(writer.database(),
                               "SELECT pk FROM albums WHERE role = 'syncProgress'");
      if (progress.step()) {
        writer.lowerPendingCount(progress.integerAt(0), static_cast<std::uint32_t>(imports.size()));
      }
    });
  });
  return failure;
}

void Quarryd::writeImport(LibraryWriter& writer, const Import& import,
                          std::map<RowId, std::uint32_t>& arrived) {
  RowId pk = 0;
  if (import.replaced) {
    pk = *import.replaced;
    writer.replaceAsset(pk, import.row);
    if (import.replacedPath != import.row.path) writer.releaseFile(import.replacedPath);
  } else {
    pk = writer.insertAsset(import.row);
  }
  writer.setOriginalFileSize(pk, import.row.size);
  for (const FaceRow& face : import.faces) {
    writer.insertFace(parts_.store->newFaceId(), pk, face);
  }
  for (const RowId album : import.albums) {
    auto known = arrived.find(album);
    if (known == arrived.end()) {
      // The device's own albums are not a sync's to fill.
      SqliteStatement row(writer.database(), "SELECT kind FROM albums WHERE pk = ?");
      row.integer(album);
      if (!row.step() || !isSyncedKind(static_cast<std::int32_t>(row.integerAt(0)))) continue;
      known = arrived.emplace(album, 0).first;
    }
    ++known->second;
    writer.addMembership(album, pk, import.uuid());
  }
  writer.changes().importedAssets.insert(import.uuid());
}

}  // namespace kx
