#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/FileSystem.h"

namespace kx {

// Passes every call on to another file system, except those that a test lets fail. `fault` is asked
// before each operation, with its name ("removeItem", ...) and path, and returns the error that
// ends it, or null; one of empty domain fails the operation without reporting an error. Set it
// while no call is under way.
class FaultyFileSystem final : public FileSystem {
 public:
  using Fault = std::function<ErrorPtr(std::string_view operation, const std::string& path)>;

  explicit FaultyFileSystem(FileSystem& inner) : inner_(inner) {}
  void setFault(Fault fault) { fault_ = std::move(fault); }

  bool fileExists(const std::string& path) override { return inner_.fileExists(path); }
  DataPtr readFile(const std::string& path, ErrorPtr* error) override {
    return fails("readFile", path, error) ? nullptr : inner_.readFile(path, error);
  }
  bool writeFileAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                           ErrorPtr* error) override {
    return !fails("writeFileAtomically", path, error) &&
           inner_.writeFileAtomically(path, bytes, error);
  }
  bool removeItem(const std::string& path, ErrorPtr* error) override {
    return !fails("removeItem", path, error) && inner_.removeItem(path, error);
  }
  bool createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) override {
    return !fails("createDirectoryWithIntermediates", path, error) &&
           inner_.createDirectoryWithIntermediates(path, error);
  }
  std::vector<std::string> contentsOfDirectory(const std::string& path, ErrorPtr* error) override {
    if (fails("contentsOfDirectory", path, error)) return {};
    return inner_.contentsOfDirectory(path, error);
  }
  // A fault of "enumerate" goes to the error handler, one of "fileProperties" to the entry.
  void enumerate(const std::string& path, const EntryHandler& onEntry,
                 const ErrorHandler& onError) override {
    ErrorPtr error;
    if (fails("enumerate", path, &error)) {
      onError(path, error);
      return;
    }
    const auto handler = [this, &onEntry](const FileProperties& entry) {
      FileProperties seen = entry;
      fails("fileProperties", entry.path, &seen.error);
      return onEntry(seen);
    };
    inner_.enumerate(path, handler, onError);
  }
  std::string resourceIdentifier(const std::string& path) override {
    return fails("resourceIdentifier", path, nullptr) ? "" : inner_.resourceIdentifier(path);
  }
  std::uint32_t blockSize(const std::string& path, ErrorPtr* error) override {
    return fails("blockSize", path, error) ? 0 : inner_.blockSize(path, error);
  }
  LockAttempt tryLock(const std::string& path) override { return inner_.tryLock(path); }

 private:
  bool fails(std::string_view operation, const std::string& path, ErrorPtr* error) {
    ErrorPtr fault = fault_ ? fault_(operation, path) : nullptr;
    if (!fault) return false;
    if (!fault->domain().empty()) setError(error, std::move(fault));
    return true;
  }

  FileSystem& inner_;
  Fault fault_;
};

}  // namespace kx
