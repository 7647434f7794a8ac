#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "daemon/FileDescriptor.h"
#include "platform/foundation/Data.h"
#include "platform/foundation/Error.h"

namespace kx {

// The sync link to one host library: its snapshot and the files of its assets. Used on one thread,
// the one that runs the sync; outlives the sync. Nothing here may write below the device.
class HostLink {
 public:
  virtual ~HostLink() = default;

  // Where the host library is, for messages: "/home/me/Pictures".
  virtual std::string description() const = 0;

  // The snapshot file's whole bytes; null and an error (any domain, its message is shown) when
  // there are none. More than limits::kSnapshotFileBytes need not be read: that is an error, too.
  virtual DataPtr snapshot(ErrorPtr* error) = 0;

  // A hint: files are going to be asked for. What finding them takes may be done meanwhile.
  virtual void expectFiles() {}

  // Size of the asset's file in bytes where that is known without opening it; nullopt otherwise.
  virtual std::optional<std::int64_t> mediaSize(std::string_view identifier) = 0;

  // Opens the asset's file for reading, from its start, links not followed and without waiting
  // (O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC). The caller checks what kind of file it got. Invalid and
  // an error of the domain "POSIX" on failure: ENOENT means that the host does not have the file.
  virtual FileDescriptor openMedia(std::string_view identifier, ErrorPtr* error) = 0;
};

}  // namespace kx
