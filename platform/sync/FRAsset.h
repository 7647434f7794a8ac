#pragma once

#include <memory>
#include <optional>
#include <string>

namespace kx {

// A request to the sync daemon to move one file. Shared by reference; identity matters. `path` is
// set by the daemon on its queue; the other fields are set before the request is handed over.
class FRAsset {
 public:
  // A request to bring one file to the device.
  static std::shared_ptr<FRAsset> downloadAssetWithIdentifier(
      std::string identifier, std::string dataclass, std::optional<std::string> prettyName);
  // A request to send one file to the host.
  static std::shared_ptr<FRAsset> uploadAssetWithIdentifier(std::string identifier,
                                                            std::string dataclass,
                                                            std::optional<std::string> prettyName);

  const std::string& identifier() const { return identifier_; }
  const std::string& dataclass() const { return dataclass_; }
  const std::optional<std::string>& prettyName() const { return prettyName_; }
  // Where the daemon has put the file: relative to "/var/mobile/Media/" for a sync request, the
  // absolute device path for a restore request; null until known.
  const std::optional<std::string>& path() const { return path_; }
  void setPath(std::optional<std::string> path) { path_ = std::move(path); }
  bool isDownload() const { return isDownload_; }
  void setIsDownload(bool isDownload) { isDownload_ = isDownload; }
  bool isRestore() const { return isRestore_; }
  void setIsRestore(bool isRestore) { isRestore_ = isRestore; }

  // `<FRAsset: identifier (dataclass), name: prettyName, path: path>`, with ", restore" for one.
  std::string description() const;

 private:
  FRAsset(std::string identifier, std::string dataclass, std::optional<std::string> prettyName,
          bool isDownload);

  std::string identifier_;
  std::string dataclass_;
  std::optional<std::string> prettyName_;
  std::optional<std::string> path_;
  bool isDownload_;
  bool isRestore_ = false;
};
using FRAssetPtr = std::shared_ptr<FRAsset>;

// Error domain of the sync framework, with the codes that the daemon itself gives.
inline constexpr const char* kFRErrorDomain = "FRError";
inline constexpr int kFRErrorFileMissingAtHost = 2;
inline constexpr int kFRErrorReadOrWrite = 4;
inline constexpr int kFRErrorDiskFull = 7;

}  // namespace kx
