#include "testing/LibraryText.h"

namespace kx {
namespace {

std::string pendingText(const InMemoryAlbumRow& album) {
  return "t" + std::to_string(album.pendingItemsType) + " n" +
         std::to_string(album.pendingItemsCount);
}

std::string albumText(const InMemoryStore& store, const InMemoryAlbumRow& album) {
  std::string text = album.title ? *album.title : "<" + album.uuid.value_or("") + ">";
  const bool atRest = album.pendingItemsType == kKXPendingItemsNone && album.pendingItemsCount == 0;
  if (!atRest) text += "(" + pendingText(album) + ")";
  text += "[";
  const char* separator = "";
  for (const std::int64_t asset : album.assets) {
    text += separator + store.assets.at(asset).uuid.value_or("(null)");
    separator = " ";
  }
  return text + "]";
}

}  // namespace

std::string textOfList(InMemoryPhotoLibraryFramework& library, SeedList which) {
  std::string text;
  library.perform([&](InMemoryLibraryState& state) {
    for (const std::int64_t row : state.store.lists[static_cast<std::size_t>(which)]) {
      if (!text.empty()) text += " ";
      text += albumText(state.store, state.store.albums.at(row));
    }
  });
  return text;
}

std::string textOfSyncedAssets(InMemoryPhotoLibraryFramework& library) {
  std::string text;
  library.perform([&](InMemoryLibraryState& state) {
    for (const auto& entry : state.store.assets) {
      if (entry.second.savedAssetType != kKXSavedAssetTypeSynced) continue;
      if (!text.empty()) text += " ";
      text += entry.second.uuid.value_or("(null)");
    }
  });
  return text;
}

std::string textOfPending(InMemoryPhotoLibraryFramework& library, std::int64_t row) {
  std::string text;
  library.perform(
      [&](InMemoryLibraryState& state) { text = pendingText(state.store.albums.at(row)); });
  return text;
}

}  // namespace kx
