#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "device/DeviceRoot.h"
#include "platform/files/FileSystem.h"

namespace kx {

// The device's files beneath its root. Any thread. A read-only one refuses every change (EROFS).
// An entry that is gone when a walk comes to it is told to the error handler (ENOENT).
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
  bool removeItem(const std::string& path, ErrorPtr* error) override;
  bool createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) override;
  std::vector<std::string> contentsOfDirectory(const std::string& path, ErrorPtr* error) override;
  void enumerate(const std::string& path, const EntryHandler& onEntry,
                 const ErrorHandler& onError) override;
  std::string resourceIdentifier(const std::string& path) override;
  std::uint32_t blockSize(const std::string& path, ErrorPtr* error) override;
  LockAttempt tryLock(const std::string& path) override;

 private:
  bool done(const std::string& path, int errorNumber, ErrorPtr* error) const;

  const std::shared_ptr<DeviceRoot> root_;
  const bool readOnly_;
  std::function<void(const std::string&)> onRemoved_;
};

}  // namespace kx
