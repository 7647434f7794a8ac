#include "testing/FaultyPhotoLibrary.h"

#include <algorithm>
#include <stdexcept>
#include <utility>

namespace kx {
namespace {

class FaultyContext final : public KXManagedObjectContext {
 public:
  FaultyContext(FaultScript& script, FaultyPhotoLibraryFramework::FailureHandler onFailure)
      : script_(script), onFailure_(std::move(onFailure)) {}

  // The context within is known only inside a block of its library.
  void setInner(KXManagedObjectContext& inner) { inner_ = &inner; }

  std::optional<std::vector<KXManagedAssetPtr>> fetchAssets(const AssetFetchRequest& request,
                                                            ErrorPtr* error) override {
    if (fails("fetchAssets", error)) return std::nullopt;
    return inner_->fetchAssets(request, error);
  }
  std::optional<std::uint64_t> countAssets(const AssetPredicate& predicate,
                                           ErrorPtr* error) override {
    if (fails("assetCount", error)) return std::nullopt;
    return inner_->countAssets(predicate, error);
  }
  std::optional<std::vector<std::int64_t>> originalFileSizes(const AssetPredicate& predicate,
                                                             ErrorPtr* error) override {
    if (fails("sizeFetch", error)) return std::nullopt;
    return inner_->originalFileSizes(predicate, error);
  }
  std::optional<std::vector<std::int64_t>> sidecarFileSizes(const AssetPredicate& predicate,
                                                            ErrorPtr* error) override {
    if (fails("sizeFetch", error)) return std::nullopt;
    return inner_->sidecarFileSizes(predicate, error);
  }
  std::optional<std::vector<KXGenericAlbumPtr>> fetchEmptyAlbums(const std::vector<int>& kinds,
                                                                 ErrorPtr* error) override {
    return inner_->fetchEmptyAlbums(kinds, error);
  }
  std::vector<std::shared_ptr<KXManagedObject>> registeredObjects() override {
    return inner_->registeredObjects();
  }
  void refreshObject(const std::shared_ptr<KXManagedObject>& object, bool mergeChanges) override {
    inner_->refreshObject(object, mergeChanges);
  }

 private:
  bool fails(const char* point, ErrorPtr* error) {
    const std::optional<FaultScript::Fault> fault = script_.take(point);
    if (!fault) return false;
    const ErrorPtr cause = fault->error ? fault->error : injectedError(point);
    if (onFailure_) onFailure_(point, cause);
    setError(error, cause);
    return true;
  }

  FaultScript& script_;
  FaultyPhotoLibraryFramework::FailureHandler onFailure_;
  KXManagedObjectContext* inner_ = nullptr;
};

class FaultyPhotoLibrary final : public KXPhotoLibrary {
 public:
  FaultyPhotoLibrary(KXPhotoLibraryPtr inner, FaultScript& script,
                     FaultyPhotoLibraryFramework::FailureHandler onFailure)
      : inner_(std::move(inner)), script_(script), context_(script, std::move(onFailure)) {}

  void withDispatchGroupPerformTransaction(const DispatchGroupPtr& group, Block block) override {
    inner_->withDispatchGroupPerformTransaction(
        group, [self = shared_from_this(), &script = script_, work = std::move(block)] {
          work();
          if (script.take("transaction")) {
            throw std::runtime_error("made to fail: transaction");
          }
        });
  }
  void withDispatchGroupPerformBlock(const DispatchGroupPtr& group, Block block) override {
    inner_->withDispatchGroupPerformBlock(group, keptAlive(std::move(block)));
  }
  void performBlock(Block block) override { inner_->performBlock(keptAlive(std::move(block))); }

  KXManagedObjectContext& managedObjectContext() override {
    context_.setInner(inner_->managedObjectContext());
    return context_;
  }
  KXGenericAlbumPtr syncProgressAlbum() override { return inner_->syncProgressAlbum(); }
  KXGenericAlbumPtr otaRestoreProgressAlbum() override { return inner_->otaRestoreProgressAlbum(); }
  KXGenericAlbumPtr shoeboxAlbum() override { return inner_->shoeboxAlbum(); }
  KXGenericAlbumPtr insertNewAlbum() override { return inner_->insertNewAlbum(); }
  KXGenericAlbumPtr insertNewFaceAlbum() override { return inner_->insertNewFaceAlbum(); }
  KXGenericAlbumPtr insertNewSyncedEvent() override { return inner_->insertNewSyncedEvent(); }
  std::vector<KXGenericAlbumPtr> albumsOfKinds(const std::vector<int>& kinds) override {
    return inner_->albumsOfKinds(kinds);
  }
  KXGenericAlbumPtr albumWithUUID(std::string_view uuid) override {
    return inner_->albumWithUUID(uuid);
  }
  KXManagedAssetPtr assetWithUUID(std::string_view uuid) override {
    return inner_->assetWithUUID(uuid);
  }
  std::vector<std::pair<std::string, std::string>> pathsForAllIncompleteAssets() override {
    return inner_->pathsForAllIncompleteAssets();
  }
  std::shared_ptr<KXManagedAlbumList> albumList() override { return inner_->albumList(); }
  std::shared_ptr<KXManagedAlbumList> eventList() override { return inner_->eventList(); }
  std::shared_ptr<KXManagedAlbumList> facesAlbumList() override { return inner_->facesAlbumList(); }
  std::string description() const override { return inner_->description(); }

 private:
  Block keptAlive(Block block) {
    return [self = shared_from_this(), work = std::move(block)] { work(); };
  }

  KXPhotoLibraryPtr inner_;
  FaultScript& script_;
  FaultyContext context_;
};

}  // namespace

FaultyPhotoLibraryFramework::FaultyPhotoLibraryFramework(KXPhotoLibraryFramework& inner,
                                                         FaultScript& script,
                                                         FailureHandler onFailure)
    : inner_(inner), script_(script), onFailure_(std::move(onFailure)) {}

KXPhotoLibraryPtr FaultyPhotoLibraryFramework::newPhotoLibrary() {
  const KXPhotoLibraryPtr library = inner_.newPhotoLibrary();
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    std::erase_if(opened_, [](const auto& weak) { return weak.expired(); });
    opened_.push_back(library);
  }
  return std::make_shared<FaultyPhotoLibrary>(library, script_, onFailure_);
}

KXPhotoLibraryPtr FaultyPhotoLibraryFramework::lastOpenLibrary() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  for (auto weak = opened_.rbegin(); weak != opened_.rend(); ++weak) {
    if (KXPhotoLibraryPtr library = weak->lock()) return library;
  }
  return nullptr;
}

}  // namespace kx
