#pragma once

#include <cstdint>
#include <future>
#include <vector>

#include "client/Memberships.h"
#include "client/SortTokens.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx {

// What a reconcile makes of the host's library alone, on threads of their own, while the device's
// library has other work. Threads: get each result once, on any thread. Lifetime: what it is made
// of is kept as long as that takes, and must not change meanwhile; it ends when that is done.
// Errors: a result raises what the host's records raise.
struct HostWork {
  // The asset order file: of each album by its UUID its assets' indexes by UUID. Empty when it
  // cannot be written.
  std::future<std::vector<std::uint8_t>> assetOrder;
  std::future<SortTokens> sortTokens;  // after the order of the master album
  std::future<Memberships> memberships;

  // Null is as good as empty.
  static HostWork start(const KXSItemMapPtr& containers, const KXSAlbumPtr& master,
                        const KXSAssetMapPtr& assets);
};

}  // namespace kx
