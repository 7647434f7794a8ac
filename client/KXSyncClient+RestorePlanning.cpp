#include <algorithm>
#include <unordered_set>

#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "platform/foundation/PropertyList.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr const char* kPlanningFunction = "_neededRestoreAssets";
constexpr std::string_view kHiddenFolderMark = ".MISC";
// An extension is a dot among the characters at these distances from the end.
constexpr std::size_t kShortestExtensionUnits = 2;
constexpr std::size_t kLongestExtensionUnits = 5;

// Whether a dot stands among the UTF-16 units len-5 to len-2 of the path.
bool hasShortExtension(std::string_view path) {
  std::size_t units = 0;  // from the character at hand to the end
  for (std::size_t i = path.size(); i-- > 0;) {
    const auto byte = static_cast<unsigned char>(path[i]);
    if ((byte & 0xC0U) == 0x80U) continue;  // counted at its first byte
    units += byte >= 0xF0U ? 2 : 1;
    if (units > kLongestExtensionUnits) return false;
    if (path[i] == '.' && units >= kShortestExtensionUnits) return true;
  }
  return false;
}

std::unordered_set<std::string_view> setOf(const StringList& paths) {
  return {paths.begin(), paths.end()};
}

}  // namespace

// What the two blocks of one planning share.
struct KXSyncClient::RestorePlan {
  bool usedBackupList = false;
  std::vector<FRAssetPtr> requests;
  IncompletePaths incomplete;
};

std::vector<FRAssetPtr> KXSyncClient::_neededRestoreAssets() {
  const auto group = std::make_shared<DispatchGroup>();
  RestorePlan plan;
  BlockFailure failure;
  submitWatched(failure, [this, &group, &plan] {
    submitBlock(group, [this, &plan] { planRestore(plan); });
    submitTransaction(group, [this, &plan] { setRestorePendingCounts(plan.usedBackupList); });
  });
  group->wait();
  failure.rethrow();
  return std::move(plan.requests);
}

void KXSyncClient::planRestore(RestorePlan& plan) {
  const std::unique_ptr<QBManager> manager = platform_.newBackupManager();
  ErrorPtr error;
  std::optional<std::vector<QBFile>> backupList =
      manager->restoreFilesForDomain(kQBShoeboxDomain, &error);
  if (error || !backupList) {
    KX_LOG(kClientSource, kPlanningFunction, LogLevel::kWarning,
           "Could not retrieve the list of files backed up. Error = %@", error);
    backupList.emplace();
  }
  KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo,
         "<===----- The list of backedup files is");
  for (const QBFile& file : *backupList) {
    KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo, "   %@", file.path);
  }
  _loadRestoreContext();
  plan.incomplete = library_->pathsForAllIncompleteAssets();
  StringList paths = restorePathsForPlan(plan, *backupList);

  const std::string cascadesDirectory = platform_.photoLibrary().cascadesDataDirectory();
  const std::string_view cascades = lastPathComponent(cascadesDirectory);
  if (!cascades.empty()) {
    std::erase_if(paths, [cascades](const std::string& path) {
      return path.find(cascades) != std::string::npos;
    });
  }
  std::vector<FRAssetPtr> requests = _getAssetsToRestoreFromPaths(paths);
  _populateRestorePathToAssetGroupDictionary(paths, plan.incomplete);
  std::stable_sort(requests.begin(), requests.end(), [](const FRAssetPtr& a, const FRAssetPtr& b) {
    return *a->path() < *b->path();
  });
  plan.requests = std::move(requests);
  KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo, "Paths to restore = %@",
         describeList(plan.requests));
}

StringList KXSyncClient::restorePathsForPlan(RestorePlan& plan,
                                             const std::vector<QBFile>& backupList) {
  if (!restoreContext_) return pathsOfFirstRestoreAttempt(plan, backupList);
  if (restoreUsesDatabase()) {
    KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo,
           "Resuming restore with incomplete files from the database");
    return _restorePathsFromIncompletePaths(plan.incomplete);
  }
  KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo,
         "Resuming restore without using the database for the asset list");
  plan.usedBackupList = true;
  return _restorePathsFromBackupList(backupList);
}

StringList KXSyncClient::pathsOfFirstRestoreAttempt(RestorePlan& plan,
                                                    const std::vector<QBFile>& backupList) {
  KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo, "First time attempting this restore");
  restoreContext_.emplace();
  StringList databasePaths = _restorePathsFromIncompletePaths(plan.incomplete);
  StringList backupPaths = _restorePathsFromBackupList(backupList);
  const std::unordered_set<std::string_view> inDatabase = setOf(databasePaths);
  const bool hasExtra =
      std::any_of(backupPaths.begin(), backupPaths.end(),
                  [&inDatabase](const std::string& path) { return !inDatabase.contains(path); });
  if (!databasePaths.empty() && !hasExtra) {
    restoreContext_->set(kKXSyncRestoreContextUseDatabaseKey, Value::boolean(true));
    _writeRestoreContext();
    return databasePaths;
  }
  if (hasExtra) {
    KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo,
           "Found assets in the filesystem which are missing from the database");
  }
  KX_LOG(kClientSource, kPlanningFunction, LogLevel::kInfo,
         "The database can't help us here, consulting the backup list");
  plan.usedBackupList = true;
  _writeRestoreContext();
  return backupPaths;
}

void KXSyncClient::setRestorePendingCounts(bool usedBackupList) {
  const auto count = static_cast<std::uint32_t>(restoreGroups_ ? restoreGroups_->size() : 0);
  const auto apply = [count](const KXGenericAlbumPtr& album) {
    if (!album) return;
    const std::int32_t type = count > 0 ? kKXPendingItemsRestore : kKXPendingItemsNone;
    if (album->pendingItemsCount() != count) album->setPendingItemsCount(count);
    if (album->pendingItemsType() != type) album->setPendingItemsType(type);
  };
  if (usedBackupList || count == 0) apply(library_->shoeboxAlbum());
  apply(library_->otaRestoreProgressAlbum());
}

bool KXSyncClient::restoreUsesDatabase() const {
  if (!restoreContext_) return false;
  const Value flag = restoreContext_->find(kKXSyncRestoreContextUseDatabaseKey);
  return flag.isNumber() && flag.numberValue().boolValue();
}

void KXSyncClient::_loadRestoreContext() {
  if (restoreContext_) return;
  const Value root = readDictionary(pathToRestoreContext(platform_));
  if (root.isDictionary()) restoreContext_.emplace(root.dictionaryValue());
}

void KXSyncClient::_writeRestoreContext() {
  if (restoreContext_) writeDictionary(pathToRestoreContext(platform_), *restoreContext_);
}

StringList KXSyncClient::_restorePathsFromIncompletePaths(const IncompletePaths& incomplete) {
  StringList paths;
  paths.reserve(incomplete.size());
  for (const auto& entry : incomplete) {
    if (entry.first.empty()) continue;
    const KXManagedAssetPtr asset = library_->assetWithUUID(entry.first);
    if (!asset) continue;
    for (std::string& path : asset->filePathsWithoutThumbs()) paths.push_back(std::move(path));
  }
  return paths;
}

StringList KXSyncClient::_restorePathsFromBackupList(const std::vector<QBFile>& backupList) {
  const StringList restoredPaths = restoredFiles();
  const std::unordered_set<std::string_view> restored = setOf(restoredPaths);
  const std::string dcim = platform_.photoLibrary().dcimDirectory();
  StringList paths;
  for (const QBFile& file : backupList) {
    const std::string& path = file.path;
    if (!restored.contains(path) && path.find(kHiddenFolderMark) == std::string::npos &&
        path.starts_with(dcim) && path.size() > dcim.size() && hasShortExtension(path)) {
      paths.push_back(path);
    }
  }
  return paths;
}

// Empty when there is none; whatever is no text in it is left out.
StringList KXSyncClient::restoredFiles() const {
  StringList paths;
  if (!restoreContext_) return paths;
  const Value list = restoreContext_->find(kKXSyncRestoreContextRestoredFilesKey);
  if (!list.isArray()) return paths;
  for (const Value& path : list.arrayValue()) {
    if (path.isString()) paths.emplace_back(path.stringValue());
  }
  return paths;
}

std::vector<FRAssetPtr> KXSyncClient::_getAssetsToRestoreFromPaths(const StringList& paths) {
  std::vector<FRAssetPtr> requests;
  requests.reserve(paths.size());
  for (const std::string& path : paths) {
    FRAssetPtr request = FRAsset::downloadAssetWithIdentifier(path, kKXPhotoDataclass, path);
    request->setIsRestore(true);
    request->setPath(path);
    requests.push_back(std::move(request));
  }
  return requests;
}

void KXSyncClient::_populateRestorePathToAssetGroupDictionary(const StringList& paths,
                                                              const IncompletePaths& uuidPaths) {
  auto groups = std::make_shared<AssetGroupMap>();
  groups->reserve(paths.size());
  for (const std::string& path : paths) {
    const std::string_view key = pathByDeletingExtension(path);
    const std::shared_ptr<KXSyncAssetGroup>* found = groups->find(key);
    std::shared_ptr<KXSyncAssetGroup> group =
        found != nullptr ? *found : groups->set(key, std::make_shared<KXSyncAssetGroup>());
    if (!group->assetPairs()) group->setAssetPairs(std::make_shared<KXSyncAssetGroup::Pairs>());
    group->assetPairs()->push_back(std::make_shared<KXSyncFileStatusPair>(path));
  }
  for (const auto& entry : uuidPaths) {
    const auto* group = groups->find(pathByDeletingExtension(entry.second));
    if (group != nullptr) (*group)->setUuid(entry.first);
  }
  restoreGroups_ = std::move(groups);
}

}  // namespace kx
