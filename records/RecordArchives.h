#pragma once

#include "platform/foundation/KeyedArchive.h"

namespace kx {

// The record classes that an archive may hold: identifiers, items and their companions. Any thread.
ArchiveClasses recordArchiveClasses();

}  // namespace kx
