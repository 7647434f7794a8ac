#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "host/FolderScan.h"
#include "host/HostIdentity.h"
#include "host/PhotoMetadata.h"
#include "platform/foundation/Value.h"

namespace kx {

// Facts that an earlier snapshot states of a file that cannot be read now.
struct RecordedFacts {
  double modified = 0.0;           // host time
  std::optional<double> captured;  // host time
  std::string day;                 // its event's name
  Value fileProperties;
};

// One photo or video of the folder, read. `recorded` counts instead of what file and metadata say.
struct FolderAsset {
  ScannedFile file;
  ContentType type;
  PhotoMetadata metadata;
  std::optional<RecordedFacts> recorded;
};

// Makes the snapshot's root dictionary of a folder's assets, which come sorted by path:
// - the master album, of all assets by capture time, then by path; without a capture time the time
//   of the last change stands for it;
// - an album for each folder below the top that has assets directly in it, sorted by its path,
// which
//   is its name; its assets are sorted by file name, byte by byte;
// - an event for each day on which assets were taken, by the clock on the wall there;
// - a face album for each person who is named, of the assets that show them, by capture time;
// - the assets themselves, by capture time.
// The same assets always give the same dictionary.
Value folderSnapshotRoot(const HostIdentity& identity, const HostOptions& options,
                         const std::vector<FolderAsset>& assets);

// A file's attributes as a snapshot carries them: "size" in bytes and "modificationDate".
Value fileAttributesValue(std::int64_t sizeBytes, const FileTime& modified);

}  // namespace kx
