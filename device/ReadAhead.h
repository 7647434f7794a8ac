#pragma once

#include <atomic>
#include <memory>

#include "device/LibraryContext.h"
#include "device/LibraryStore.h"

namespace kx {

// Reads the library's synced assets on its queue, and on one thread more, while the rest of a sync
// has other work, for the library objects that come next: each takes over what the one before left
// behind, as long as that has nothing unsaved. Threads: start and stop from any, they return at
// once; take and giveBack on the library's queue. Lifetime: kept by a shared pointer; stop it
// before the store goes, which it may hold. Errors: what cannot be read is left to the fetch that
// needs it.
class ReadAhead : public std::enable_shared_from_this<ReadAhead> {
 public:
  void start(const std::shared_ptr<LibraryStore>& store);
  // Ends the reading where it is and lets go of what was read.
  void stop(LibraryStore& store);

  // Null when there is none.
  std::shared_ptr<LibraryContext> take() { return std::move(context_); }
  // Kept for the next library object, or let go of.
  void giveBack(std::shared_ptr<LibraryContext> context);

 private:
  std::atomic<bool> isOn_{false};
  std::shared_ptr<LibraryContext> context_;
};

}  // namespace kx
