#include "cli/LibraryLink.h"

namespace kx::cli {

DataPtr LibraryLink::snapshot(ErrorPtr* error) {
  DataPtr bytes = library_.takeSnapshotBytes();
  if (!bytes) {
    setError(error, Error::make(kHostErrorDomain, static_cast<std::int64_t>(HostError::kUnreadable),
                                "no snapshot in " + library_.path()));
  }
  return bytes;
}

std::optional<std::int64_t> LibraryLink::mediaSize(std::string_view identifier) {
  return library_.mediaSize(identifier);
}

FileDescriptor LibraryLink::openMedia(std::string_view identifier, ErrorPtr* error) {
  std::optional<HostMedia> media = library_.openMedia(identifier, error);
  return media ? FileDescriptor(media->file.release()) : FileDescriptor();
}

}  // namespace kx::cli
