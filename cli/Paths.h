#pragma once

#include <string>

namespace kx::cli {

// A directory as the command line names it.
struct NamedPath {
  const char* name;  // "HOST"
  const std::string& path;
};

// Raises UsageError when one of the two directories lies inside the other, or both are the same,
// whatever links and dots their paths use. Directories that are missing count by where they would
// be.
void refuseNesting(const NamedPath& a, const NamedPath& b);

}  // namespace kx::cli
