#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "device/DeviceRoot.h"
#include "platform/files/FileSystem.h"

namespace kx {

// The device's files beneath its root. Any thread. A read-only one refuses every change (EROFS).
// Of a large file all readers get the same data object, as long as one of them holds it and the
// file is as it was when it was read or written. An entry that is gone when a walk comes to it is
// told to the error handler (ENOENT).
class DeviceFileSystem : public FileSystem {
 public:
  DeviceFileSystem(std::shared_ptr<DeviceRoot> root, bool readOnly)
      : root_(std::move(root)), readOnly_(readOnly) {}

  // Called with the path of each item that removeItem has removed, on its thread. Set it while
  // nobody else uses the files.
  void setOnRemoved(std::function<void(const std::string&)> onRemoved) {
    onRemoved_ = std::move(onRemoved);
  }

  bool fileExists(const std::string& path) override;
  DataPtr readFile(const std::string& path, ErrorPtr* error) override;
  bool fileHolds(const std::string& path, std::span<const std::uint8_t> bytes) override;
  bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                           ErrorPtr* error) override;
  bool writeDataAtomically(const std::string& path, const DataPtr& bytes, ErrorPtr* error) override;
  std::unique_ptr<PreparedFile> prepareFile(const std::string& path, DataPtr bytes) override;
  bool removeItem(const std::string& path, ErrorPtr* error) override;
  bool createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) override;
  std::vector<std::string> contentsOfDirectory(const std::string& path, ErrorPtr* error) override;
  void enumerate(const std::string& path, const EntryHandler& onEntry,
                 const ErrorHandler& onError) override;
  std::string resourceIdentifier(const std::string& path) override;
  std::uint32_t blockSize(const std::string& path, ErrorPtr* error) override;
  LockAttempt tryLock(const std::string& path) override;

 private:
  class Prepared;
  // A file's content and the status that it had with it.
  struct Shared {
    struct stat status = {};
    std::weak_ptr<const Data> bytes;
  };

  DataPtr shared(const std::string& path) const;
  void share(const std::string& path, const struct stat& status, const DataPtr& bytes);
  bool done(const std::string& path, int errorNumber, ErrorPtr* error) const;

  const std::shared_ptr<DeviceRoot> root_;
  const bool readOnly_;
  std::function<void(const std::string&)> onRemoved_;
  mutable std::mutex sharedMutex_;
  std::map<std::string, Shared> shared_;  // by path
};

}  // namespace kx
