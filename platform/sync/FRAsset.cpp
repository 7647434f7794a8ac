#include "platform/sync/FRAsset.h"

#include "platform/sync/FRLog.h"

namespace kx {

FRAsset::FRAsset(std::string identifier, std::string dataclass,
                 std::optional<std::string> prettyName, bool isDownload)
    : identifier_(std::move(identifier)),
      dataclass_(std::move(dataclass)),
      prettyName_(std::move(prettyName)),
      isDownload_(isDownload) {}

FRAssetPtr FRAsset::downloadAssetWithIdentifier(std::string identifier, std::string dataclass,
                                                std::optional<std::string> prettyName) {
  return FRAssetPtr(
      new FRAsset(std::move(identifier), std::move(dataclass), std::move(prettyName), true));
}

FRAssetPtr FRAsset::uploadAssetWithIdentifier(std::string identifier, std::string dataclass,
                                              std::optional<std::string> prettyName) {
  return FRAssetPtr(
      new FRAsset(std::move(identifier), std::move(dataclass), std::move(prettyName), false));
}

std::string FRAsset::description() const {
  return formatMessage(
      "<FRAsset: %@ (%@), name: %@, path: %@%@>",
      {identifier_, dataclass_, prettyName_, path_, isRestore_ ? ", restore" : ""});
}

}  // namespace kx
