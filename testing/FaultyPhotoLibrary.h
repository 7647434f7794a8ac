#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/library/KXPhotoLibrary.h"
#include "testing/FaultScript.h"

namespace kx {

// Passes everything on to another photo library framework, except what a script makes fail: the
// points "fetchAssets", "assetCount" and "sizeFetch" of its contexts, "transaction" of its
// libraries (the block runs, then everything is rolled back). Each such failure of a fetch is told
// to `onFailure`; transactions are counted by the library itself. Any thread, as the one within.
class FaultyPhotoLibraryFramework final : public KXPhotoLibraryFramework {
 public:
  using FailureHandler = std::function<void(const std::string& what, const ErrorPtr& error)>;

  // Both outlive this object and every library that it opens.
  FaultyPhotoLibraryFramework(KXPhotoLibraryFramework& inner, FaultScript& script,
                              FailureHandler onFailure);

  KXPhotoLibraryPtr newPhotoLibrary() override;
  std::string dcimDirectory() override { return inner_.dcimDirectory(); }
  std::string photoDataDirectory() override { return inner_.photoDataDirectory(); }
  std::string photoDataCachesDirectory() override { return inner_.photoDataCachesDirectory(); }
  std::string cascadesDataDirectory() override { return inner_.cascadesDataDirectory(); }
  std::string tesselSyncedAssetsDirectory() override {
    return inner_.tesselSyncedAssetsDirectory();
  }
  std::string tesselSyncedFaceAlbumThumbnailsDirectory() override {
    return inner_.tesselSyncedFaceAlbumThumbnailsDirectory();
  }
  std::string syncInfoPath() override { return inner_.syncInfoPath(); }
  std::string pathToAssetAlbumOrderStructure() override {
    return inner_.pathToAssetAlbumOrderStructure();
  }
  void clearAssetOrderByAbumUUIDs() override { inner_.clearAssetOrderByAbumUUIDs(); }

  // The library that was opened last of those that are still open, as the framework within made
  // it; null when none is open.
  KXPhotoLibraryPtr lastOpenLibrary() const;

 private:
  KXPhotoLibraryFramework& inner_;
  FaultScript& script_;
  FailureHandler onFailure_;
  mutable std::mutex mutex_;
  std::vector<std::weak_ptr<KXPhotoLibrary>> opened_;  // the inner ones
};

}  // namespace kx
