#include "backup/BackupAlbums.h"

#include <string_view>
#include <unordered_map>

#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr std::int32_t kSyncedAssetType = 256;

void add(const std::vector<DeviceDump::Container>& containers, BackupAlbumList list,
         const std::unordered_map<std::string_view, std::string_view>& paths,
         std::vector<BackupAlbum>* albums) {
  for (std::size_t position = 0; position < containers.size(); ++position) {
    const DeviceDump::Container& container = containers[position];
    if (isSyncedAlbumKind(container.kind)) continue;
    BackupAlbum album{container.uuid, container.title, container.kind, list, position, {}};
    for (const std::string& uuid : container.assets) {
      const auto found = paths.find(uuid);
      if (found != paths.end()) album.members.emplace_back(found->second);
    }
    albums->push_back(std::move(album));
  }
}

}  // namespace

std::vector<BackupAlbum> ownAlbums(const DeviceDump& dump) {
  std::unordered_map<std::string_view, std::string_view> paths;
  for (const DeviceDump::Asset& asset : dump.assets) {
    if (asset.savedAssetType == kSyncedAssetType) continue;
    if (backupPathOf(asset.path).empty() || !isValidUtf8(asset.path)) continue;
    paths.emplace(asset.uuid, asset.path);
  }
  std::vector<BackupAlbum> albums;
  add(dump.albums, BackupAlbumList::kAlbums, paths, &albums);
  add(dump.events, BackupAlbumList::kEvents, paths, &albums);
  add(dump.faceAlbums, BackupAlbumList::kFaceAlbums, paths, &albums);
  return albums;
}

}  // namespace kx
