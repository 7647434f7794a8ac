#pragma once

#include <cstdint>
#include <vector>

// What the two sides of keyed archives share. Internal to platform/foundation.
namespace kx::archive {

inline constexpr const char* kArchiverKey = "archiver";
inline constexpr const char* kArchiverName = "KXKeyedArchiver";
inline constexpr const char* kVersionKey = "version";
inline constexpr std::int64_t kVersion = 1;
inline constexpr const char* kRootKey = "root";
inline constexpr const char* kObjectsKey = "objects";
inline constexpr const char* kClassKey = "class";
inline constexpr const char* kValuesKey = "values";
inline constexpr const char* kReferencesKey = "references";
inline constexpr const char* kMapsKey = "maps";
inline constexpr const char* kMapKeysKey = "keys";
inline constexpr const char* kMapObjectsKey = "objects";

// Which object refers to which: the targets of object i are edges[starts[i]] to edges[starts[i+1]].
struct Graph {
  std::vector<std::size_t> starts{0};
  std::vector<std::uint32_t> edges;

  void closeObject() { starts.push_back(edges.size()); }
  std::size_t size() const { return starts.size() - 1; }
};

// Throws PropertyListFailure for a cycle, for too many objects inside one another and for an object
// that cannot be reached from the root. Keeps a stack of its own.
void checkGraph(const Graph& graph, std::uint32_t root);

}  // namespace kx::archive
