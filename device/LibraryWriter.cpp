#include "device/LibraryWriter.h"

#include <algorithm>

namespace kx {
namespace {

void bindAsset(SqliteStatement& statement, const WholeAssetRow& row) {
  const auto latitude =
      row.asset.location ? std::optional(row.asset.location->latitude) : std::optional<double>();
  const auto longitude =
      row.asset.location ? std::optional(row.asset.location->longitude) : std::optional<double>();
  statement.text(row.asset.uuid)
      .integer(row.asset.savedType)
      .integer(row.asset.isVideo ? 1 : 0)
      .integer(row.asset.incomplete ? 1 : 0)
      .optionalReal(row.asset.modificationDate)
      .optionalReal(row.asset.sortToken)
      .optionalReal(latitude)
      .optionalReal(longitude)
      .optionalReal(row.creationDate)
      .optionalText(row.originalFileName)
      .text(row.path)
      .integer(row.size);
}

std::optional<double> seconds(const std::optional<Date>& date) {
  if (!date) return std::nullopt;
  return date->secondsSinceReference;
}

}  // namespace

void LibraryWriter::insertAlbum(RowId pk, const AlbumRow& album, std::optional<ListId> list) {
  SqliteStatement(database_,
                  "INSERT INTO albums(pk, uuid, kind, title, pending_type, pending_count, managed) "
                  "VALUES(?, ?, ?, ?, ?, ?, ?)")
      .integer(pk)
      .optionalText(album.uuid)
      .integer(album.kind)
      .optionalText(album.title)
      .integer(album.pendingType)
      .integer(album.pendingCount)
      .integer(album.managed ? 1 : 0)
      .run();
  if (list) {
    SqliteStatement(database_,
                    "INSERT INTO list_entries(album, list, position) VALUES(?1, ?2, "
                    "(SELECT coalesce(max(position) + 1, 0) FROM list_entries WHERE list = ?2))")
        .integer(pk)
        .integer(static_cast<int>(*list))
        .run();
    rows_.lists = true;
  }
  rows_.albums.insert(pk);
  if (album.uuid && isSyncedKind(album.kind)) changes_.createdContainers.insert(*album.uuid);
}

void LibraryWriter::updateAlbum(RowId pk, const AlbumRow& old, const AlbumRow& after) {
  if (old == after) return;
  SqliteStatement(database_,
                  "UPDATE albums SET uuid = ?, kind = ?, title = ?, pending_type = ?, "
                  "pending_count = ? WHERE pk = ?")
      .optionalText(after.uuid)
      .integer(after.kind)
      .optionalText(after.title)
      .integer(after.pendingType)
      .integer(after.pendingCount)
      .integer(pk)
      .run();
  if (old.uuid != after.uuid) forgetPositions(pk);
  rows_.albums.insert(pk);
  if (after.uuid && old.title != after.title && isSyncedKind(after.kind)) {
    changes_.renamedContainers.insert(*after.uuid);
  }
}

void LibraryWriter::deleteAlbum(RowId pk, const AlbumRow& album) {
  SqliteStatement(database_, "DELETE FROM albums WHERE pk = ?").integer(pk).run();
  forgetPositions(pk);
  rows_.deletedAlbums.insert(pk);
  rows_.lists = true;
  if (album.uuid && isSyncedKind(album.kind)) changes_.deletedContainers.insert(*album.uuid);
}

void LibraryWriter::lowerPendingCount(RowId album, std::uint32_t by) {
  SqliteStatement(database_,
                  "UPDATE albums SET pending_count = max(0, pending_count - ?1) "
                  "WHERE pk = ?2 AND pending_count > 0")
      .integer(by)
      .integer(album)
      .run();
  rows_.albums.insert(album);
}

RowId LibraryWriter::insertAsset(const WholeAssetRow& asset) {
  SqliteStatement statement(
      database_,
      "INSERT INTO assets(uuid, saved_type, is_video, incomplete, modification_date, sort_token, "
      "latitude, longitude, creation_date, original_file_name, path, size) "
      "VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?) RETURNING pk");
  bindAsset(statement, asset);
  if (!statement.step()) throw SqliteError(SQLITE_ERROR, "an inserted asset has no row");
  const RowId pk = statement.integerAt(0);
  statement.run();
  rows_.assets.insert(pk);
  return pk;
}

void LibraryWriter::replaceAsset(RowId pk, const WholeAssetRow& asset) {
  SqliteStatement(database_, "DELETE FROM faces WHERE asset = ?").integer(pk).run();
  SqliteStatement(database_, "DELETE FROM memberships WHERE asset = ?").integer(pk).run();
  SqliteStatement(database_, "DELETE FROM sidecar_files WHERE asset = ?").integer(pk).run();
  SqliteStatement(database_, "DELETE FROM asset_files WHERE asset = ?").integer(pk).run();
  SqliteStatement statement(
      database_,
      "UPDATE assets SET uuid = ?, saved_type = ?, is_video = ?, incomplete = ?, "
      "modification_date = ?, sort_token = ?, latitude = ?, longitude = ?, creation_date = ?, "
      "original_file_name = ?, path = ?, size = ? WHERE pk = ?");
  bindAsset(statement, asset);
  statement.integer(pk).run();
  rows_.assets.insert(pk);
}

void LibraryWriter::updateAsset(RowId pk, const DeviceAssetFields& fields) {
  const auto set = [&](const char* sql, const auto& bind) {
    SqliteStatement statement(database_, sql);
    bind(statement);
    statement.integer(pk).run();
    rows_.assets.insert(pk);
  };
  using Statement = SqliteStatement;
  if (fields.uuid) {
    set("UPDATE assets SET uuid = ? WHERE pk = ?", [&](Statement& s) { s.text(*fields.uuid); });
    forgetPlaces(pk);
  }
  if (fields.path)
    set("UPDATE assets SET path = ? WHERE pk = ?", [&](Statement& s) { s.text(*fields.path); });
  if (fields.savedAssetType)
    set("UPDATE assets SET saved_type = ? WHERE pk = ?",
        [&](Statement& s) { s.integer(*fields.savedAssetType); });
  if (fields.isVideo)
    set("UPDATE assets SET is_video = ? WHERE pk = ?",
        [&](Statement& s) { s.integer(*fields.isVideo ? 1 : 0); });
  if (fields.incomplete)
    set("UPDATE assets SET incomplete = ? WHERE pk = ?",
        [&](Statement& s) { s.integer(*fields.incomplete ? 1 : 0); });
  if (fields.creationDate)
    set("UPDATE assets SET creation_date = ? WHERE pk = ?",
        [&](Statement& s) { s.optionalReal(seconds(*fields.creationDate)); });
  if (fields.modificationDate)
    set("UPDATE assets SET modification_date = ? WHERE pk = ?",
        [&](Statement& s) { s.optionalReal(seconds(*fields.modificationDate)); });
  if (fields.sortToken)
    set("UPDATE assets SET sort_token = ? WHERE pk = ?",
        [&](Statement& s) { s.optionalReal(*fields.sortToken); });
  if (fields.location)
    set("UPDATE assets SET latitude = ?, longitude = ? WHERE pk = ?", [&](Statement& s) {
      const std::optional<Coordinate>& place = *fields.location;
      if (place) {
        s.real(place->latitude).real(place->longitude);
      } else {
        s.null().null();
      }
    });
  if (fields.originalFileName)
    set("UPDATE assets SET original_file_name = ? WHERE pk = ?",
        [&](Statement& s) { s.optionalText(*fields.originalFileName); });
}

void LibraryWriter::deleteAsset(RowId pk) {
  SqliteStatement(database_, "DELETE FROM assets WHERE pk = ?").integer(pk).run();
  rows_.assets.erase(pk);
  rows_.deletedAssets.insert(pk);
}

void LibraryWriter::setOriginalFileSize(RowId asset, std::int64_t bytes) {
  SqliteStatement(database_,
                  "INSERT INTO additional_attributes(asset, original_file_size) VALUES(?, ?) "
                  "ON CONFLICT(asset) DO UPDATE SET original_file_size = "
                  "excluded.original_file_size")
      .integer(asset)
      .integer(bytes)
      .run();
}

void LibraryWriter::insertSidecar(RowId asset, std::int64_t compressedBytes) {
  SqliteStatement(database_, "INSERT INTO sidecar_files(asset, compressed_size) VALUES(?, ?)")
      .integer(asset)
      .integer(compressedBytes)
      .run();
}

void LibraryWriter::insertAssetFile(RowId asset, std::int64_t ordinal, const std::string& path) {
  SqliteStatement(database_, "INSERT INTO asset_files(asset, ordinal, path) VALUES(?, ?, ?)")
      .integer(asset)
      .integer(ordinal)
      .text(path)
      .run();
}

void LibraryWriter::insertFace(RowId pk, RowId asset, const FaceRow& face) {
  SqliteStatement(database_,
                  "INSERT INTO faces(pk, asset, identifier, x, y, width, height, album_uuid) "
                  "VALUES(?, ?, ?, ?, ?, ?, ?, ?)")
      .integer(pk)
      .integer(asset)
      .integer(face.identifier)
      .real(face.relativeRect.x)
      .real(face.relativeRect.y)
      .real(face.relativeRect.width)
      .real(face.relativeRect.height)
      .optionalText(face.albumUUID)
      .run();
  rows_.assets.insert(asset);
}

void LibraryWriter::deleteFace(RowId pk, RowId asset) {
  SqliteStatement(database_, "DELETE FROM faces WHERE pk = ?").integer(pk).run();
  rows_.assets.insert(asset);
}

std::vector<RowId> LibraryWriter::listMembers(ListId list) {
  std::vector<RowId> members;
  SqliteStatement row(database_,
                      "SELECT album FROM list_entries WHERE list = ? ORDER BY position, album");
  row.integer(static_cast<int>(list));
  while (row.step()) members.push_back(row.integerAt(0));
  return members;
}

void LibraryWriter::setListOrder(ListId list, const std::vector<RowId>& order) {
  for (std::size_t position = 0; position < order.size(); ++position) {
    SqliteStatement(database_,
                    "UPDATE list_entries SET position = ?1 "
                    "WHERE album = ?2 AND list = ?3 AND position <> ?1")
        .integer(static_cast<std::int64_t>(position))
        .integer(order[position])
        .integer(static_cast<int>(list))
        .run();
  }
  rows_.lists = true;
}

void LibraryWriter::moveInList(ListId list, RowId album, std::size_t index) {
  std::vector<RowId> order = listMembers(list);
  std::erase(order, album);
  order.insert(order.begin() + static_cast<std::ptrdiff_t>(std::min(index, order.size())), album);
  setListOrder(list, order);
}

}  // namespace kx
