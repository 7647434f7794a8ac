#include "device/DumpReader.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <unordered_map>

#include "device/DeviceLayout.h"
#include "device/Sha256.h"
#include "platform/foundation/PropertyList.h"

namespace kx {
namespace {

std::optional<Date> dateAt(const SqliteStatement& row, int column) {
  const std::optional<double> seconds = row.optionalRealAt(column);
  if (!seconds) return std::nullopt;
  return Date{*seconds};
}

struct AssetRows {
  std::unordered_map<RowId, std::size_t> indexes;  // into the dump's assets
};

void readAssets(SqliteDatabase& database, DeviceDump* dump, AssetRows* rows) {
  SqliteStatement row(database,
                      "SELECT pk, uuid, saved_type, is_video, incomplete, modification_date, "
                      "sort_token, latitude, longitude, creation_date, original_file_name, path, "
                      "size FROM assets ORDER BY pk");
  while (row.step()) {
    DeviceDump::Asset asset;
    AssetRow common = readAssetRow(row, 1);
    asset.uuid = std::move(common.uuid);
    asset.savedAssetType = common.savedType;
    asset.isVideo = common.isVideo;
    asset.incomplete = common.incomplete;
    asset.modificationDate = dateAt(row, 5);
    asset.sortToken = common.sortToken;
    asset.location = common.location;
    asset.creationDate = dateAt(row, 9);
    asset.originalFileName = row.optionalTextAt(10);
    asset.path = row.textAt(11);
    asset.size = row.integerAt(12);
    rows->indexes.emplace(row.integerAt(0), dump->assets.size());
    dump->assets.push_back(std::move(asset));
  }
}

void readFaces(SqliteDatabase& database, DeviceDump* dump, const AssetRows& rows) {
  SqliteStatement row(database,
                      "SELECT asset, identifier, x, y, width, height, album_uuid FROM faces "
                      "ORDER BY asset, identifier, pk");
  while (row.step()) {
    FaceRow face = readFaceRow(row, 1);
    dump->assets[rows.indexes.at(row.integerAt(0))].faces.push_back(
        {face.identifier, face.relativeRect, std::move(face.albumUUID)});
  }
}

// The members of every album, in order.
std::unordered_map<RowId, std::vector<std::string>> readMembers(SqliteDatabase& database) {
  std::unordered_map<RowId, std::vector<std::string>> members;
  SqliteStatement row(database,
                      "SELECT m.album, a.uuid FROM memberships m JOIN assets a ON a.pk = m.asset "
                      "ORDER BY m.album, m.position IS NULL, m.position, "
                      "iif(m.position IS NULL, a.sort_token IS NULL, 0), "
                      "iif(m.position IS NULL, a.sort_token, 0), a.uuid");
  while (row.step()) members[row.integerAt(0)].push_back(row.textAt(1));
  return members;
}

void readContainers(SqliteDatabase& database, DeviceDump* dump) {
  std::unordered_map<RowId, std::vector<std::string>> members = readMembers(database);
  SqliteStatement row(database,
                      "SELECT e.list, e.album, a.uuid, a.kind, a.title, a.pending_type, "
                      "a.pending_count, a.managed FROM list_entries e JOIN albums a "
                      "ON a.pk = e.album ORDER BY e.list, e.position, e.album");
  while (row.step()) {
    AlbumRow album = readAlbumRow(row, 2);
    DeviceDump::Container container;
    container.uuid = album.uuid.value_or(std::string());
    container.title = std::move(album.title);
    container.kind = album.kind;
    container.pending = {album.pendingType, album.pendingCount};
    container.assets = std::move(members[row.integerAt(1)]);
    switch (static_cast<ListId>(row.integerAt(0))) {
      case ListId::kAlbums:
        dump->albums.push_back(std::move(container));
        break;
      case ListId::kEvents:
        dump->events.push_back(std::move(container));
        break;
      case ListId::kFaceAlbums:
        dump->faceAlbums.push_back(std::move(container));
        break;
    }
  }
}

DeviceDump::Pending readPending(SqliteDatabase& database, std::string_view role) {
  SqliteStatement row(database, "SELECT pending_type, pending_count FROM albums WHERE role = ?");
  row.text(role);
  DeviceDump::Pending pending;
  if (row.step()) {
    pending.type = static_cast<std::int32_t>(row.integerAt(0));
    pending.count = static_cast<std::uint32_t>(row.integerAt(1));
  }
  return pending;
}

// A state file as a dictionary; null when it is none.
Value readState(const DeviceRoot& root, const char* path) {
  std::vector<std::uint8_t> bytes;
  if (root.readFile(path, &bytes) != 0) return {};
  ErrorPtr ignored;  // a state file that makes no sense counts as missing
  const Value state = readPropertyList(std::make_shared<const Data>(std::move(bytes)), &ignored);
  return state.isDictionary() ? state : Value();
}

std::optional<std::string> textOf(const Value& value) {
  if (!value.isString()) return std::nullopt;
  return std::string(value.stringValue());
}

std::optional<std::string> hashOf(const DeviceRoot& root, const std::string& path) {
  UniqueFd file;
  if (root.openFile(path, O_RDONLY | O_NONBLOCK, &file) != 0) return std::nullopt;
  struct stat status;
  if (::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
  Sha256 hash;
  std::vector<std::uint8_t> buffer(std::size_t{1} << 18);
  while (true) {
    const ssize_t count = ::read(file.get(), buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return std::nullopt;
    if (count == 0) return hash.hexDigest();
    hash.update({buffer.data(), static_cast<std::size_t>(count)});
  }
}

}  // namespace

DeviceDump readDump(SqliteDatabase& database) {
  DeviceDump dump;
  // One reading, also inside of a transaction that is open already.
  database.execute("SAVEPOINT dump");
  try {
    AssetRows rows;
    readAssets(database, &dump, &rows);
    readFaces(database, &dump, rows);
    readContainers(database, &dump);
    dump.camera = readPending(database, "camera");
    dump.syncProgress = readPending(database, "syncProgress");
    dump.otaRestoreProgress = readPending(database, "otaRestoreProgress");
    database.execute("RELEASE dump");
  } catch (...) {
    database.execute("ROLLBACK TO dump; RELEASE dump");
    throw;
  }
  return dump;
}

void addFilesToDump(const DeviceRoot& root, bool hash, DeviceDump* dump) {
  dump->currentLibraryUUID =
      textOf(readState(root, device_paths::kCurrentLibraryUUID)["libraryUUID"]);
  const Value agent = readState(root, device_paths::kSyncInfo);
  if (agent.isDictionary()) {
    dump->syncAgent =
        DeviceDump::SyncAgent{textOf(agent["userAgent"]), textOf(agent["libraryKind"])};
  }
  struct stat status;
  dump->lastSynced = root.status(device_paths::kLastSynced, &status) == 0;
  if (!hash) return;
  for (DeviceDump::Asset& asset : dump->assets) asset.sha256 = hashOf(root, asset.path);
}

}  // namespace kx
