#include "cli/Paths.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

#include "cli/Command.h"

namespace kx::cli {

namespace {

std::filesystem::path canonical(const std::string& path) {
  std::error_code error;
  std::filesystem::path full = std::filesystem::weakly_canonical(path, error);
  if (error) full = std::filesystem::absolute(path, error).lexically_normal();
  // "a/b/" ends in an empty component.
  return full.has_filename() ? full : full.parent_path();
}

bool contains(const std::filesystem::path& outer, const std::filesystem::path& inner) {
  return std::mismatch(outer.begin(), outer.end(), inner.begin(), inner.end()).first == outer.end();
}

}  // namespace

void refuseNesting(const NamedPath& a, const NamedPath& b) {
  const std::filesystem::path pathA = canonical(a.path);
  const std::filesystem::path pathB = canonical(b.path);
  const std::string nameA = a.name;
  const std::string nameB = b.name;
  if (pathA == pathB) {
    throw UsageError(nameA + " and " + nameB + " are the same directory: " + pathA.string());
  }
  if (contains(pathA, pathB))
    throw UsageError(nameB + " lies inside " + nameA + ": " + pathB.string());
  if (contains(pathB, pathA))
    throw UsageError(nameA + " lies inside " + nameB + ": " + pathA.string());
}

}  // namespace kx::cli
