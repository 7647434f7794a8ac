#include "device/LibraryWriter.h"

#include <algorithm>
#include <tuple>

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

struct Member {
  RowId asset = 0;
  std::string uuid;
  std::optional<double> sortToken;
  std::optional<std::int64_t> stored;
  std::optional<std::int64_t> wanted;
};

// The order inside an album: by position, those without one after the others by sort token (null
// last), then by UUID.
bool before(const Member& a, const Member& b, std::optional<std::int64_t> Member::*position) {
  const auto key = [&](const Member& m) {
    const bool placed = (m.*position).has_value();
    return std::make_tuple(!placed, placed ? *(m.*position) : 0, !placed && !m.sortToken,
                           placed ? 0.0 : m.sortToken.value_or(0.0));
  };
  const auto keyA = key(a);
  const auto keyB = key(b);
  return keyA != keyB ? keyA < keyB : a.uuid < b.uuid;
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
  if (old.uuid != after.uuid) orderStates_.erase(pk);
  rows_.albums.insert(pk);
  if (after.uuid && old.title != after.title && isSyncedKind(after.kind)) {
    changes_.renamedContainers.insert(*after.uuid);
  }
}

void LibraryWriter::deleteAlbum(RowId pk, const AlbumRow& album) {
  SqliteStatement(database_, "DELETE FROM albums WHERE pk = ?").integer(pk).run();
  orderStates_.erase(pk);
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
  if (fields.uuid)
    set("UPDATE assets SET uuid = ? WHERE pk = ?", [&](Statement& s) { s.text(*fields.uuid); });
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

LibraryWriter::AlbumOrderState& LibraryWriter::orderState(RowId album) {
  const auto [entry, isNew] = orderStates_.try_emplace(album);
  if (isNew) {
    SqliteStatement row(database_, "SELECT uuid, order_tag FROM albums WHERE pk = ?");
    row.integer(album);
    if (!row.step()) throw SqliteError(SQLITE_CONSTRAINT, "an album is gone");
    entry->second.order = order_.album(row.optionalTextAt(0));
    entry->second.current = row.optionalIntegerAt(1) == entry->second.order->tag();
  }
  return entry->second;
}

void LibraryWriter::addMembership(RowId album, RowId asset, std::string_view assetUUID) {
  AlbumOrderState& state = orderState(album);
  if (!state.current) {
    renumber(album, *state.order);
    state.current = true;
  }
  SqliteStatement(database_,
                  "INSERT OR IGNORE INTO memberships(album, asset, position) "
                  "VALUES(?, ?, ?)")
      .integer(album)
      .integer(asset)
      .optionalInteger(state.order->indexOf(assetUUID))
      .run();
  rows_.assets.insert(asset);
}

void LibraryWriter::appendMembership(RowId album, RowId asset, std::int64_t position) {
  SqliteStatement(database_,
                  "INSERT INTO memberships(album, asset, position) VALUES(?, ?, ?) "
                  "ON CONFLICT(album, asset) DO NOTHING")
      .integer(album)
      .integer(asset)
      .integer(position)
      .run();
  rows_.assets.insert(asset);
}

void LibraryWriter::removeMembership(RowId album, RowId asset) {
  SqliteStatement(database_, "DELETE FROM memberships WHERE album = ? AND asset = ?")
      .integer(album)
      .integer(asset)
      .run();
  rows_.assets.insert(asset);
}

namespace {

std::vector<Member> membersOf(SqliteDatabase& database, RowId album,
                              const AssetOrder::Album& order) {
  std::vector<Member> members;
  SqliteStatement row(database,
                      "SELECT m.asset, a.uuid, a.sort_token, m.position FROM memberships m "
                      "JOIN assets a ON a.pk = m.asset WHERE m.album = ?");
  row.integer(album);
  while (row.step()) {
    Member member;
    member.asset = row.integerAt(0);
    member.uuid = row.textAt(1);
    member.sortToken = row.optionalRealAt(2);
    member.stored = row.optionalIntegerAt(3);
    member.wanted = order.indexOf(member.uuid);
    members.push_back(std::move(member));
  }
  return members;
}

}  // namespace

void LibraryWriter::renumber(RowId album, const AssetOrder::Album& order) {
  const std::vector<Member> members = membersOf(database_, album, order);
  for (const Member& member : members) {
    if (member.stored == member.wanted) continue;
    SqliteStatement(database_, "UPDATE memberships SET position = ? WHERE album = ? AND asset = ?")
        .optionalInteger(member.wanted)
        .integer(album)
        .integer(member.asset)
        .run();
  }
  SqliteStatement(database_, "UPDATE albums SET order_tag = ? WHERE pk = ?")
      .integer(order.tag())
      .integer(album)
      .run();
}

void LibraryWriter::sortAlbum(RowId album) {
  AlbumOrderState& state = orderState(album);
  if (state.current) return;
  std::vector<Member> members = membersOf(database_, album, *state.order);
  std::sort(members.begin(), members.end(),
            [](const Member& a, const Member& b) { return before(a, b, &Member::stored); });
  const bool inOrder = std::is_sorted(
      members.begin(), members.end(),
      [](const Member& a, const Member& b) { return before(a, b, &Member::wanted); });
  if (inOrder) return;
  renumber(album, *state.order);
  state.current = true;
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
