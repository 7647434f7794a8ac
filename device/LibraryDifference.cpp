#include "device/LibraryDifference.h"

#include <algorithm>
#include <tuple>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "device/ReferenceDevice.h"
#include "device/Sqlite.h"

namespace kx {
namespace {

using Fate = LibraryDifference::Fate;
using RowSet = std::unordered_set<RowId>;

struct AssetState {
  RowId pk = 0;
  std::optional<std::string> originalFileName;
  bool isVideo = false;
  std::int64_t size = 0;
  std::optional<double> sortToken, latitude, longitude;
};

struct ContainerState {
  RowId pk = 0;
  std::int32_t kind = 0;
  std::optional<std::string> title;
  std::optional<std::int64_t> orderTag;
};

// Synced containers with an identifier, by it and in row order.
struct Containers {
  std::unordered_map<std::string, ContainerState> byUUID;
  std::vector<std::string> inOrder;
};

// One of the two readings.
class Side {
 public:
  explicit Side(SqliteDatabase& database) : database_(database) {}

  std::optional<AssetState> asset(const std::string& uuid) {
    SqliteStatement row(database_,
                        "SELECT pk, original_file_name, is_video, size, sort_token, latitude, "
                        "longitude FROM assets WHERE uuid = ?");
    row.text(uuid);
    if (!row.step()) return std::nullopt;
    return AssetState{row.integerAt(0),     row.optionalTextAt(1), row.integerAt(2) != 0,
                      row.integerAt(3),     row.optionalRealAt(4), row.optionalRealAt(5),
                      row.optionalRealAt(6)};
  }

  using FaceState = std::tuple<std::int64_t, double, double, double, double, std::string>;
  std::vector<FaceState> faces(RowId asset) {
    std::vector<FaceState> found;
    SqliteStatement row(database_,
                        "SELECT identifier, x, y, width, height, coalesce(album_uuid, '') "
                        "FROM faces WHERE asset = ?");
    row.integer(asset);
    while (row.step()) {
      found.emplace_back(row.integerAt(0), row.realAt(1), row.realAt(2), row.realAt(3),
                         row.realAt(4), row.textAt(5));
    }
    std::sort(found.begin(), found.end());
    return found;
  }

  std::vector<RowId> albumsOf(RowId asset) {
    std::vector<RowId> found;
    SqliteStatement row(database_, "SELECT album FROM memberships WHERE asset = ? ORDER BY album");
    row.integer(asset);
    while (row.step()) found.push_back(row.integerAt(0));
    return found;
  }

  Containers containers() {
    Containers found;
    SqliteStatement row(database_,
                        "SELECT pk, kind, title, order_tag, uuid FROM albums "
                        "WHERE kind IN (15, 1550, 1551) AND uuid IS NOT NULL ORDER BY pk");
    while (row.step()) {
      ContainerState state{row.integerAt(0), static_cast<std::int32_t>(row.integerAt(1)),
                           row.optionalTextAt(2), row.optionalIntegerAt(3)};
      std::string uuid = row.textAt(4);
      if (found.byUUID.emplace(uuid, std::move(state)).second) {
        found.inOrder.push_back(std::move(uuid));
      }
    }
    return found;
  }

  // The rows of the members, in the album's order.
  std::vector<RowId> members(RowId album) {
    std::vector<std::pair<std::int64_t, RowId>> placed;
    {
      SqliteStatement row(database_, "SELECT position, asset FROM memberships WHERE album = ?");
      row.integer(album);
      while (row.step()) {
        if (row.isNull(0)) return membersByTheirAssets(album);
        placed.emplace_back(row.integerAt(0), row.integerAt(1));
      }
    }
    std::sort(placed.begin(), placed.end());
    std::vector<RowId> found;
    found.reserve(placed.size());
    for (std::size_t i = 0; i < placed.size(); ++i) {
      if (i > 0 && placed[i].first == placed[i - 1].first) return membersByTheirAssets(album);
      found.push_back(placed[i].second);
    }
    return found;
  }

  std::size_t memberCount(RowId album) {
    SqliteStatement row(database_, "SELECT count(*) FROM memberships WHERE album = ?");
    row.integer(album);
    return row.step() ? static_cast<std::size_t>(row.integerAt(0)) : 0;
  }

  std::vector<std::string> list(ListId list) {
    std::vector<std::string> found;
    SqliteStatement row(database_,
                        "SELECT a.uuid FROM list_entries e JOIN albums a ON a.pk = e.album "
                        "WHERE e.list = ? AND a.uuid IS NOT NULL ORDER BY e.position, e.album");
    row.integer(static_cast<int>(list));
    while (row.step()) found.push_back(row.textAt(0));
    return found;
  }

 private:
  // Where positions alone do not say the order.
  std::vector<RowId> membersByTheirAssets(RowId album) {
    std::vector<RowId> found;
    SqliteStatement row(database_,
                        "SELECT a.pk FROM memberships m JOIN assets a ON a.pk = m.asset "
                        "WHERE m.album = ? ORDER BY m.position IS NULL, m.position, "
                        "iif(m.position IS NULL, a.sort_token IS NULL, 0), "
                        "iif(m.position IS NULL, a.sort_token, 0), a.uuid");
    row.integer(album);
    while (row.step()) found.push_back(row.integerAt(0));
    return found;
  }

  SqliteDatabase& database_;
};

// What is in one of two lists alone, and whether what both have stands in another order.
struct ListDifference {
  std::size_t added = 0, removed = 0;
  bool reordered = false;
};

template <typename Member>
ListDifference compare(const std::vector<Member>& before, const std::vector<Member>& after) {
  ListDifference difference;
  if (before == after) return difference;
  const std::unordered_set<Member> inBefore(before.begin(), before.end());
  const std::unordered_set<Member> inAfter(after.begin(), after.end());
  std::vector<Member> stayed;
  for (const Member& member : before) {
    if (inAfter.contains(member)) {
      stayed.push_back(member);
    } else {
      ++difference.removed;
    }
  }
  auto next = stayed.begin();
  for (const Member& member : after) {
    if (!inBefore.contains(member)) {
      ++difference.added;
    } else if (next == stayed.end() || *next++ != member) {
      difference.reordered = true;
    }
  }
  return difference;
}

class Comparison {
 public:
  Comparison(SqliteDatabase* before, SqliteDatabase& after, const LibraryChanges& changes)
      : after_(after), changes_(changes) {
    if (before != nullptr) before_.emplace(*before);
  }

  LibraryDifference run() {
    for (const std::string& uuid : changes_.deletedAssets) {
      if (!changes_.importedAssets.contains(uuid)) addAsset(uuid);
    }
    for (const std::string& uuid : changes_.importedAssets) addAsset(uuid);
    for (const std::string& uuid : changes_.updatedAssets) {
      if (!changes_.importedAssets.contains(uuid) && !changes_.deletedAssets.contains(uuid)) {
        addAsset(uuid);
      }
    }
    std::stable_sort(assets_.begin(), assets_.end(), [](const auto& a, const auto& b) {
      const auto key = [](const auto& each) {
        return std::pair(each.second.fate != Fate::kGone, each.first);
      };
      return key(a) < key(b);
    });
    for (auto& [pk, asset] : assets_) difference_.assets.push_back(std::move(asset));
    compareContainers();
    compareLists();
    return std::move(difference_);
  }

 private:
  void addAsset(const std::string& uuid) {
    const std::optional<AssetState> old = before_ ? before_->asset(uuid) : std::nullopt;
    const std::optional<AssetState> now = after_.asset(uuid);
    if (!old && !now) return;
    LibraryDifference::Asset asset;
    asset.uuid = uuid;
    asset.originalFileName = (now ? now : old)->originalFileName;
    asset.isVideo = (now ? now : old)->isVideo;
    asset.sizeBefore = old ? old->size : 0;
    asset.fate = !old ? Fate::kNew : now ? Fate::kKept : Fate::kGone;
    asset.content = old && now && changes_.importedAssets.contains(uuid);
    const std::vector<RowId> oldAlbums = old ? before_->albumsOf(old->pk) : std::vector<RowId>();
    const std::vector<RowId> nowAlbums = now ? after_.albumsOf(now->pk) : std::vector<RowId>();
    if (now && changes_.importedAssets.contains(uuid))
      rowsBefore_[now->pk] = old ? old->pk : -now->pk;
    if (old && now) {
      asset.place = old->latitude != now->latitude || old->longitude != now->longitude;
      asset.sortToken = old->sortToken != now->sortToken;
      asset.faces = before_->faces(old->pk) != after_.faces(now->pk);
      asset.memberships = oldAlbums != nowAlbums;
    }
    touchedBefore_.insert(oldAlbums.begin(), oldAlbums.end());
    touchedAfter_.insert(nowAlbums.begin(), nowAlbums.end());
    assets_.emplace_back((now ? now : old)->pk, std::move(asset));
  }

  void compareContainers() {
    const Containers old = before_ ? before_->containers() : Containers();
    const Containers now = after_.containers();
    for (const std::string& uuid : old.inOrder) {
      const auto kept = now.byUUID.find(uuid);
      if (kept == now.byUUID.end()) {
        LibraryDifference::Container gone = describe(uuid, old.byUUID.at(uuid), Fate::kGone);
        gone.left = before_->memberCount(old.byUUID.at(uuid).pk);
        difference_.containers.push_back(std::move(gone));
      } else {
        compareContainer(uuid, old.byUUID.at(uuid), kept->second);
      }
    }
    for (const std::string& uuid : now.inOrder) {
      if (old.byUUID.contains(uuid)) continue;
      LibraryDifference::Container made = describe(uuid, now.byUUID.at(uuid), Fate::kNew);
      made.joined = after_.memberCount(now.byUUID.at(uuid).pk);
      difference_.containers.push_back(std::move(made));
    }
  }

  static LibraryDifference::Container describe(const std::string& uuid, const ContainerState& state,
                                               Fate fate) {
    LibraryDifference::Container container;
    container.uuid = uuid;
    container.kind = state.kind;
    container.title = state.title;
    container.fate = fate;
    return container;
  }

  void compareContainer(const std::string& uuid, const ContainerState& old,
                        const ContainerState& now) {
    LibraryDifference::Container container = describe(uuid, now, Fate::kKept);
    container.titleBefore = old.title;
    container.renamed = changes_.renamedContainers.contains(uuid) &&
                        !changes_.createdContainers.contains(uuid) &&
                        !changes_.deletedContainers.contains(uuid);
    const bool touched = old.pk != now.pk || old.orderTag != now.orderTag ||
                         touchedBefore_.contains(old.pk) || touchedAfter_.contains(now.pk);
    if (touched) {
      std::vector<RowId> members = after_.members(now.pk);
      for (RowId& member : members) member = rowBefore(member);
      const ListDifference difference = compare(before_->members(old.pk), members);
      container.joined = difference.added;
      container.left = difference.removed;
      container.reordered = difference.reordered;
    }
    if (container.renamed || old.title != now.title || container.joined + container.left > 0 ||
        container.reordered) {
      difference_.containers.push_back(std::move(container));
    }
  }

  // The row that the asset had before; one that no row of before has for a new asset.
  RowId rowBefore(RowId now) const {
    const auto found = rowsBefore_.find(now);
    return found == rowsBefore_.end() ? now : found->second;
  }

  void compareLists() {
    if (!before_) return;
    for (const ListId list : {ListId::kAlbums, ListId::kEvents, ListId::kFaceAlbums}) {
      if (compare(before_->list(list), after_.list(list)).reordered) {
        difference_.reorderedLists.push_back(list);
      }
    }
  }

  std::optional<Side> before_;
  Side after_;
  const LibraryChanges& changes_;
  LibraryDifference difference_;
  std::vector<std::pair<RowId, LibraryDifference::Asset>> assets_;
  RowSet touchedBefore_, touchedAfter_;
  std::unordered_map<RowId, RowId> rowsBefore_;  // of imported assets, whose row may be a used one
};

}  // namespace

LibraryDifference differenceOf(SqliteDatabase* before, SqliteDatabase& after,
                               const LibraryChanges& changes) {
  return Comparison(before, after, changes).run();
}

}  // namespace kx
