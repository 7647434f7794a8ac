#pragma once

#include <memory>
#include <string>

#include "daemon/HostLink.h"
#include "host/HostLibrary.h"

namespace kx::cli {

// The sync link to a host library that lies in this machine's file system, whose snapshot it takes.
// One thread.
class LibraryLink : public HostLink {
 public:
  explicit LibraryLink(HostLibrary& library) : library_(library) {}

  std::string description() const override { return library_.path(); }
  DataPtr snapshot(ErrorPtr* error) override;
  void expectFiles() override { library_.expectMedia(); }
  std::optional<std::int64_t> mediaSize(std::string_view identifier) override;
  FileDescriptor openMedia(std::string_view identifier, ErrorPtr* error) override;

 private:
  HostLibrary& library_;
};

}  // namespace kx::cli
