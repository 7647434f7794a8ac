#include "testing/InMemoryLibrary.h"

#include <algorithm>
#include <atomic>
#include <exception>
#include <unordered_map>

#include "platform/foundation/Exceptions.h"
#include "platform/foundation/PropertyList.h"
#include "testing/InMemoryObjects.h"

namespace kx {
namespace {

using AssetOrder = std::unordered_map<std::string, std::unordered_map<std::string, std::uint64_t>>;

AssetOrder readAssetOrder(FileSystem& files, const std::string& path) {
  AssetOrder order;
  const DataPtr bytes = files.readFile(path, nullptr);
  const Value root = bytes ? readPropertyList(bytes, nullptr) : Value();
  if (!root.isDictionary()) return order;
  const DictionaryView albums = root.dictionaryValue();
  for (std::size_t i = 0; i < albums.size(); ++i) {
    auto& indexes = order[std::string(albums.keyAt(i))];
    const Value value = albums.valueAt(i);
    const DictionaryView assets = value.dictionaryValue();
    for (std::size_t j = 0; j < assets.size(); ++j) {
      indexes[std::string(assets.keyAt(j))] = assets.valueAt(j).numberValue().uint64Value();
    }
  }
  return order;
}

}  // namespace

struct InMemoryPhotoLibraryFramework::Shared {
  explicit Shared(FileSystem& fileSystem) : files(fileSystem) {}

  FileSystem& files;
  DispatchQueuePtr queue = DispatchQueue::serial("kx.memory.library");
  std::shared_ptr<InMemoryLibraryState> state = std::make_shared<InMemoryLibraryState>();
  std::optional<AssetOrder> assetOrder;  // the cached asset order file; on the queue
  std::size_t commitsToSkip = 0;
  std::size_t commitsToFail = 0;
  std::size_t failedCommits = 0;
  mutable std::mutex mutex;
  std::vector<std::string> exceptions;
  std::atomic<std::size_t> open{0};
  std::atomic<std::size_t> opened{0};

  void note(const std::exception& exception) {
    std::lock_guard<std::mutex> lock(mutex);
    exceptions.emplace_back(exception.what());
  }

  bool commitFails() {
    if (state->fails("commit", nullptr)) return true;
    if (commitsToFail == 0) return false;
    if (commitsToSkip > 0) {
      --commitsToSkip;
      return false;
    }
    --commitsToFail;
    return true;
  }
};

class InMemoryPhotoLibraryFramework::Library final : public KXPhotoLibrary {
 public:
  explicit Library(std::shared_ptr<Shared> shared)
      : shared_(std::move(shared)), context_(std::make_shared<InMemoryContext>(shared_->state)) {
    ++shared_->open;
    ++shared_->opened;
  }
  // The objects of the context are used on the queue: they go there, after every block.
  ~Library() override {
    --shared_->open;
    shared_->queue->async([context = std::move(context_)] {});
  }

  void withDispatchGroupPerformTransaction(const DispatchGroupPtr& group, Block block) override {
    submit(group, std::move(block), true);
  }
  void withDispatchGroupPerformBlock(const DispatchGroupPtr& group, Block block) override {
    submit(group, std::move(block), false);
  }
  void performBlock(Block block) override { submit(nullptr, std::move(block), false); }

  KXManagedObjectContext& managedObjectContext() override { return context(); }
  KXGenericAlbumPtr syncProgressAlbum() override {
    return context().albumObject(shared_->state->store.syncProgress);
  }
  KXGenericAlbumPtr otaRestoreProgressAlbum() override {
    return context().albumObject(shared_->state->store.otaRestoreProgress);
  }
  KXGenericAlbumPtr shoeboxAlbum() override {
    return context().albumObject(shared_->state->store.shoebox);
  }
  KXGenericAlbumPtr insertNewAlbum() override {
    return insert(SeedList::kAlbums, kKXAlbumKindSyncedAlbum);
  }
  KXGenericAlbumPtr insertNewFaceAlbum() override {
    return insert(SeedList::kFaceAlbums, kKXAlbumKindSyncedFaceAlbum);
  }
  KXGenericAlbumPtr insertNewSyncedEvent() override {
    return insert(SeedList::kEvents, kKXAlbumKindSyncedEvent);
  }
  std::vector<KXGenericAlbumPtr> albumsOfKinds(const std::vector<int>& kinds) override {
    std::vector<KXGenericAlbumPtr> albums;
    for (const std::int64_t row : context().albumRows()) {
      const int kind = context().album(row).kind;
      if (std::find(kinds.begin(), kinds.end(), kind) != kinds.end()) {
        albums.push_back(context().albumObject(row));
      }
    }
    return albums;
  }
  KXGenericAlbumPtr albumWithUUID(std::string_view uuid) override {
    const std::int64_t row = context().albumWithUUID(uuid);
    return row == 0 ? nullptr : context().albumObject(row);
  }
  KXManagedAssetPtr assetWithUUID(std::string_view uuid) override {
    const std::int64_t row = context().isDeleted(shared_->state->store.assetWithUUID(uuid))
                                 ? 0
                                 : shared_->state->store.assetWithUUID(uuid);
    return row == 0 ? nullptr : context().assetObject(row);
  }
  std::vector<std::pair<std::string, std::string>> pathsForAllIncompleteAssets() override {
    static_cast<void>(context());
    std::vector<std::pair<std::string, std::string>> paths;
    for (const auto& entry : shared_->state->store.assets) {
      const InMemoryAssetRow& row = entry.second;
      if (!row.incomplete) continue;
      paths.emplace_back(row.uuid.value_or(""), row.files.empty() ? "" : row.files.front());
    }
    return paths;
  }
  std::shared_ptr<KXManagedAlbumList> albumList() override { return list(SeedList::kAlbums); }
  std::shared_ptr<KXManagedAlbumList> eventList() override { return list(SeedList::kEvents); }
  std::shared_ptr<KXManagedAlbumList> facesAlbumList() override {
    return list(SeedList::kFaceAlbums);
  }
  std::string description() const override { return "<KXPhotoLibrary: memory>"; }

 private:
  InMemoryContext& context() {
    if (!shared_->queue->isCurrent()) {
      throw InternalInconsistency("a library object is used outside its library's queue");
    }
    return *context_;
  }

  KXGenericAlbumPtr insert(SeedList which, std::int32_t kind) {
    if (!inTransaction_) throw InternalInconsistency("an album is inserted without transaction");
    return context().insertAlbum(which, kind);
  }

  std::shared_ptr<KXManagedAlbumList> list(SeedList which) {
    return std::make_shared<InMemoryAlbumList>(context(), *shared_->state, which);
  }

  void submit(const DispatchGroupPtr& group, Block block, bool isTransaction) {
    shared_->queue->async(group, [self = shared_from_this(), this, block = std::move(block),
                                  isTransaction] { run(block, isTransaction); });
  }

  void run(const Block& block, bool isTransaction) {
    InMemoryContext::Changes before = context_->changes();
    inTransaction_ = isTransaction;
    try {
      block();
    } catch (const std::exception& exception) {
      inTransaction_ = false;
      shared_->note(exception);
      context_->setChanges(std::move(before));
      return;
    }
    inTransaction_ = false;
    if (!isTransaction) return;
    if (shared_->commitFails()) {
      ++shared_->failedCommits;
      context_->setChanges(std::move(before));
      return;
    }
    context_->commit();
  }

  std::shared_ptr<Shared> shared_;
  std::shared_ptr<InMemoryContext> context_;
  bool inTransaction_ = false;  // on the queue
};

InMemoryPhotoLibraryFramework::InMemoryPhotoLibraryFramework(FileSystem& files)
    : shared_(std::make_shared<Shared>(files)) {
  shared_->state->orderIndex = [shared = shared_.get(), path = pathToAssetAlbumOrderStructure()](
                                   std::string_view album,
                                   std::string_view asset) -> std::optional<std::uint64_t> {
    if (!shared->assetOrder) shared->assetOrder = readAssetOrder(shared->files, path);
    const auto indexes = shared->assetOrder->find(std::string(album));
    if (indexes == shared->assetOrder->end()) return std::nullopt;
    const auto index = indexes->second.find(std::string(asset));
    if (index == indexes->second.end()) return std::nullopt;
    return index->second;
  };
}

InMemoryPhotoLibraryFramework::~InMemoryPhotoLibraryFramework() { shared_->queue->drain(); }

KXPhotoLibraryPtr InMemoryPhotoLibraryFramework::newPhotoLibrary() {
  return std::make_shared<Library>(shared_);
}

void InMemoryPhotoLibraryFramework::clearAssetOrderByAbumUUIDs() {
  if (shared_->queue->isCurrent()) {
    shared_->assetOrder = std::nullopt;
  } else {
    shared_->queue->sync([this] { shared_->assetOrder = std::nullopt; });
  }
}

void InMemoryPhotoLibraryFramework::perform(
    const std::function<void(InMemoryLibraryState&)>& block) {
  shared_->queue->sync([this, &block] {
    block(*shared_->state);
    ++shared_->state->revision;
  });
}

std::int64_t InMemoryPhotoLibraryFramework::addAsset(const AssetSeed& seed) {
  std::int64_t row = 0;
  perform([&](InMemoryLibraryState& state) { row = state.store.addAsset(seed); });
  return row;
}

std::int64_t InMemoryPhotoLibraryFramework::addAlbum(const AlbumSeed& seed) {
  std::int64_t row = 0;
  perform([&](InMemoryLibraryState& state) { row = state.store.addAlbum(seed); });
  return row;
}

void InMemoryPhotoLibraryFramework::setFault(InMemoryLibraryState::Fault fault) {
  perform([&](InMemoryLibraryState& state) { state.fault = std::move(fault); });
}

void InMemoryPhotoLibraryFramework::failCommits(std::size_t count, std::size_t skip) {
  shared_->queue->sync([this, count, skip] {
    shared_->commitsToFail = count;
    shared_->commitsToSkip = skip;
  });
}

std::size_t InMemoryPhotoLibraryFramework::failedCommits() {
  std::size_t count = 0;
  shared_->queue->sync([this, &count] { count = shared_->failedCommits; });
  return count;
}

std::vector<std::string> InMemoryPhotoLibraryFramework::blockExceptions() const {
  std::lock_guard<std::mutex> lock(shared_->mutex);
  return shared_->exceptions;
}

std::size_t InMemoryPhotoLibraryFramework::openLibraries() const { return shared_->open; }

std::size_t InMemoryPhotoLibraryFramework::openedLibraries() const { return shared_->opened; }

std::size_t InMemoryPhotoLibraryFramework::rowsWritten() {
  std::size_t rows = 0;
  perform([&](InMemoryLibraryState& state) { rows = state.rowsWritten; });
  return rows;
}

std::size_t InMemoryPhotoLibraryFramework::listSorts() {
  std::size_t sorts = 0;
  perform([&](InMemoryLibraryState& state) { sorts = state.listSorts; });
  return sorts;
}

const DispatchQueuePtr& InMemoryPhotoLibraryFramework::queue() const { return shared_->queue; }

}  // namespace kx
