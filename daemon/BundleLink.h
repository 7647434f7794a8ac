#pragma once

#include <map>
#include <string>

#include "daemon/HostLink.h"

namespace kx {

// The link to a host bundle: a directory with PhotoLibrary.plist and media/, where an asset's file
// is named by its identifier, with or without an extension (the exact name first, else the first by
// bytes). The directory's list is read once. Links inside the bundle are not followed.
class BundleLink : public HostLink {
 public:
  // Null and an error when the directory is no bundle.
  static std::unique_ptr<BundleLink> open(const std::string& directory, ErrorPtr* error);

  std::string description() const override { return directory_; }
  DataPtr snapshot(ErrorPtr* error) override;
  std::optional<std::int64_t> mediaSize(std::string_view identifier) override;
  FileDescriptor openMedia(std::string_view identifier, ErrorPtr* error) override;

 private:
  BundleLink() = default;
  const std::string* nameOf(std::string_view identifier);
  void readNames();

  std::string directory_;
  FileDescriptor root_;
  FileDescriptor media_;
  bool namesRead_ = false;
  // By whole name, and by name without extension: the first one by bytes.
  std::map<std::string, std::string, std::less<>> byStem_;
  std::map<std::string, std::string, std::less<>> byName_;
};

}  // namespace kx
