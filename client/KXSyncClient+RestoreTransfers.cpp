#include "client/KXSyncClient.h"
#include "client/LogSource.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

constexpr const char* kRestoreFunction = "_restoreAssetTransfer";

std::optional<std::string> nameOfStatus(std::int32_t status) {
  switch (status) {
    case KXSyncFileStatusPair::kPending:
      return "pending";
    case KXSyncFileStatusPair::kFailed:
      return "failed";
    case KXSyncFileStatusPair::kComplete:
      return "complete";
    default:
      return std::nullopt;
  }
}

// Calls the visitor for each pair of the group, which may be null, with that path.
template <typename Visitor>
void forEachPairAt(const KXSyncAssetGroup* group, const std::optional<std::string>& path,
                   Visitor visit) {
  const auto pairs = group != nullptr ? group->assetPairs() : nullptr;
  if (!pairs || !path) return;
  for (const std::shared_ptr<KXSyncFileStatusPair>& pair : *pairs) {
    if (pair->path() == *path) visit(*pair);
  }
}

}  // namespace

void KXSyncClient::restoreEndedWithError(const ErrorPtr& error) {
  KX_LOG(kClientSource, "restoreEndedWithError", LogLevel::kInfo,
         "Photos restore was cancelled with error: %@", error);
}

void KXSyncClient::_restoreAssetTransfer(const FRAssetPtr& request, bool succeeded,
                                         const ErrorPtr& error) {
  const std::optional<std::string> path = request->path();
  KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo,
         "restored asset: %@   isAvailableAtPath: %@ success: %@ error: %@", request, path,
         succeeded ? "YES" : "NO", error);
  std::shared_ptr<KXSyncAssetGroup> group;
  if (path && restoreGroups_) {
    const auto* found = restoreGroups_->find(pathByDeletingExtension(*path));
    if (found != nullptr) group = *found;
  }
  appendRestoredFiles({});
  const std::shared_ptr<TransferList> outstanding = outstandingAssets();
  if (succeeded) {
    if (outstanding) outstanding->remove(request);
    KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Setting pair as complete");
    forEachPairAt(group.get(), path, [](KXSyncFileStatusPair& pair) {
      KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Pair at path %@ is complete",
             pair.path());
      pair.setStatus(KXSyncFileStatusPair::kComplete);
    });
  } else if (!error) {
    KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo,
           "We got a potentially recoverable error when trying to restore an asset %@", request);
    KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Nothing to do for now.");
    return;
  } else if (!isRecoverableTransferError(*error)) {
    KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo,
           "Encountered unrecoverable error for restore asset %@", request);
    if (outstanding) outstanding->remove(request);
    forEachPairAt(group.get(), path, [this](KXSyncFileStatusPair& pair) {
      pair.setStatus(KXSyncFileStatusPair::kFailed);
      appendRestoredFiles({pair.path()});
      _writeRestoreContext();
    });
  }
  judgeRestoreGroup(group);
}

// Once every pair of the group is settled, tells the asset daemon. A missing group counts as
// settled.
void KXSyncClient::judgeRestoreGroup(const std::shared_ptr<KXSyncAssetGroup>& group) {
  KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Looking at group %@", group);
  StringList completed;
  const auto pairs = group ? group->assetPairs() : nullptr;
  if (pairs) {
    completed.reserve(pairs->size());
    for (const std::shared_ptr<KXSyncFileStatusPair>& pair : *pairs) {
      if (pair->status() == KXSyncFileStatusPair::kComplete) completed.push_back(pair->path());
      KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Pair: %@  has status: %@",
             pair->path(), nameOfStatus(pair->status()));
      if (pair->status() != KXSyncFileStatusPair::kPending) continue;
      KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Group is pending...");
      return;
    }
  }
  const std::optional<std::string> uuid = group ? group->uuid() : std::nullopt;
  KX_LOG(kClientSource, kRestoreFunction, LogLevel::kInfo, "Group with uuid %@ is complete!", uuid);
  platform_.porterClient().updateRestoredAssetWithUUID(uuid, completed);
  appendRestoredFiles(completed);
  _writeRestoreContext();
}

// Makes the list of settled files when there is none; nothing happens without a restore context.
void KXSyncClient::appendRestoredFiles(const StringList& paths) {
  if (!restoreContext_) return;
  const Value present = restoreContext_->find(kKXSyncRestoreContextRestoredFilesKey);
  if (present.isArray() && paths.empty()) return;
  Array files;
  if (present.isArray()) {
    const ArrayView view = present.arrayValue();
    files.reserve(view.size() + paths.size());
    for (const Value& file : view) files.push_back(file);
  }
  for (const std::string& path : paths) files.push_back(Value::string(path));
  restoreContext_->set(kKXSyncRestoreContextRestoredFilesKey, Value::array(std::move(files)));
}

}  // namespace kx
