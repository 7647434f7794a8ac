#include <algorithm>
#include <array>

#include "client/KXSyncClient.h"
#include "client/LogSource.h"

namespace kx {
namespace {

// Codes of domain "FRError" after which the daemon may try again.
constexpr std::array<std::int64_t, 9> kRecoverableCodes = {4, 7, 8, 9, 14, 16, 18, 19, 20};

}  // namespace

bool isRecoverableTransferError(const Error& error) {
  if (error.domain() != kFRErrorDomain) return true;
  return std::find(kRecoverableCodes.begin(), kRecoverableCodes.end(), error.code()) !=
         kRecoverableCodes.end();
}

std::vector<FRAssetPtr> KXSyncClient::outstandingAssetTransfers() {
  if (!outstandingAssets()) _initializeOutstandingAssets();
  const std::shared_ptr<TransferList> list = outstandingAssets();
  _startListeningToMemoryPressureEvents();
  KX_LOG(kClientSource, "outstandingAssetTransfers", LogLevel::kInfo,
         "outstandingAssetTransfers %@", describeTransfers(list));
  return list ? list->copy() : std::vector<FRAssetPtr>();
}

void KXSyncClient::_initializeOutstandingAssets() {
  _initializeLibrary();
  setOutstandingAssets(std::make_shared<TransferList>(_neededRestoreAssets()));
}

void KXSyncClient::assetTransfer(const FRAssetPtr& asset, bool succeeded, const ErrorPtr& error) {
  if (!asset) return;
  KX_LOG(kClientSource, "assetTransfer", LogLevel::kInfo,
         "asset: %@   isAvailableAtPath: %@ success: %@ error: %@ isRestore: %@", asset,
         asset->path(), succeeded ? "YES" : "NO", error, asset->isRestore() ? "YES" : "NO");
  if (asset->isRestore()) {
    _restoreAssetTransfer(asset, succeeded, error);
  } else {
    _syncAssetTransfer(asset, succeeded, error);
  }
}

}  // namespace kx
