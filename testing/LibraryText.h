#pragma once

#include <string>

#include "testing/InMemoryLibrary.h"

namespace kx {

// One list of the library as one line: "Trip(t2 n1)[a1 a2] Pets[]". Albums by title (their UUID
// when they have none), pending type and count unless at rest, assets by UUID in album order. Waits
// for the library's queue.
std::string textOfList(InMemoryPhotoLibraryFramework& library, SeedList which);
// The synced assets by UUID in row order: "a1 a2".
std::string textOfSyncedAssets(InMemoryPhotoLibraryFramework& library);
// One of the library's own albums: "t1 n0".
std::string textOfPending(InMemoryPhotoLibraryFramework& library, std::int64_t row);

}  // namespace kx
