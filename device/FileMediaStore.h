#pragma once

#include <memory>

#include "device/DeviceRoot.h"
#include "device/MediaStore.h"

namespace kx {

// Media files as they are, beneath the device's root. A file is renamed to its final place; one
// that lies on another file system is copied.
class FileMediaStore : public MediaStore {
 public:
  explicit FileMediaStore(std::shared_ptr<DeviceRoot> root) : root_(std::move(root)) {}

  std::optional<Arrived> inspect(const std::string& path, ErrorPtr* error) override;
  bool place(const std::string& from, const std::string& to, ErrorPtr* error) override;
  bool makeDurable(const std::vector<std::string>& paths, ErrorPtr* error) override;
  bool remove(const std::string& path, ErrorPtr* error) override;

 private:
  bool copy(const std::string& from, const std::string& to, ErrorPtr* error);
  [[nodiscard]] int syncContents(const std::vector<std::string>& paths);

  const std::shared_ptr<DeviceRoot> root_;
};

}  // namespace kx
