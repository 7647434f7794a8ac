#pragma once

#include <nlohmann/json.hpp>

#include "cli/Console.h"
#include "transport/KXSLibraryChangeSnapshot.h"

namespace kx::cli {

// How many of what a snapshot lists.
struct SnapshotCounts {
  std::size_t assets = 0, videos = 0, located = 0, faces = 0;
  std::size_t albums = 0, events = 0, faceAlbums = 0, masterAlbums = 0;
  std::size_t deletes = 0;
};

// These raise TypeError when a field holds another type than it should.
SnapshotCounts countSnapshot(const KXSLibraryChangeSnapshot& snapshot);
nlohmann::ordered_json countsJson(const KXSLibraryChangeSnapshot& snapshot);

// For people: what library it is, the counts and, unless `summary`, every container and asset.
// `lines` receives the text line by line.
class LineSink {
 public:
  virtual ~LineSink() = default;
  virtual void heading(const std::string& line) = 0;
  virtual void line(const std::string& line) = 0;
};
void describeSnapshot(const KXSLibraryChangeSnapshot& snapshot, bool summary, LineSink& lines);

}  // namespace kx::cli
