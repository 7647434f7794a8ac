#pragma once

#include <time.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/foundation/Date.h"
#include "platform/foundation/Error.h"

namespace kx {

// A file's modification time: whole seconds since 2001-01-01 00:00:00 UTC, and nanoseconds.
struct BackupFileTime {
  std::int64_t seconds = 0;
  std::int32_t nanoseconds = 0;  // 0 to 999,999,999
  static BackupFileTime fromUnix(const struct timespec& time);
  struct timespec unixTime() const;
  friend bool operator==(const BackupFileTime&, const BackupFileTime&) = default;
};

struct BackupFile {
  std::string path;       // absolute device path
  std::int64_t size = 0;  // bytes
  BackupFileTime modified;
  std::string sha256;  // sixty-four hexadecimal digits, small letters
  friend bool operator==(const BackupFile&, const BackupFile&) = default;
};

// Size and hash of one of the backup's own files.
struct BackupPart {
  std::int64_t size = 0;
  std::string sha256;
  friend bool operator==(const BackupPart&, const BackupPart&) = default;
};

// What a backup holds, as manifest.json says (docs/formats/backup.md).
struct BackupManifest {
  std::string identity;               // of this one backup: a new UUID each time
  std::optional<std::string> device;  // identity of the device's library
  Date takenAt;
  std::vector<std::string> paths;  // what the plug-in named, relative to /var/mobile/Media
  std::vector<BackupFile> files;   // by path, ascending by bytes
  BackupPart albums;
  std::optional<BackupPart> library;

  // Null when there is no such file.
  const BackupFile* find(std::string_view path) const;
  friend bool operator==(const BackupManifest&, const BackupManifest&) = default;
};

// Whether albums of that kind come from the host, so that a backup leaves them out.
bool isSyncedAlbumKind(std::int32_t kind);

enum class BackupAlbumList { kAlbums, kEvents, kFaceAlbums };

// An album that the device itself made, as albums.json says.
struct BackupAlbum {
  std::string uuid;  // empty when it had none
  std::optional<std::string> title;
  std::int32_t kind = 0;
  BackupAlbumList list = BackupAlbumList::kAlbums;
  std::size_t position = 0;          // in its list, albums from the host counted
  std::vector<std::string> members;  // device paths of the assets' main files, in order
  friend bool operator==(const BackupAlbum&, const BackupAlbum&) = default;
};

namespace backup_limits {
inline constexpr std::int64_t kDocumentBytes = 384LL << 20;  // manifest.json, albums.json
inline constexpr std::size_t kFiles = 1'000'000;
inline constexpr std::int64_t kFileBytes = 64LL << 30;
inline constexpr std::size_t kPaths = 64;
inline constexpr std::size_t kAlbums = 200'000;
inline constexpr std::size_t kMembers = 16U << 20;
inline constexpr int kDepth = 8;
}  // namespace backup_limits

// The documents' bytes. Texts have to be UTF-8.
std::string serializeManifest(const BackupManifest& manifest);
std::string serializeAlbums(const std::vector<BackupAlbum>& albums);

// The bytes are not trusted: types, ranges, order, paths and the checksum are looked at. Nothing
// and one clear kUnusable or kNewerForm when anything is wrong.
std::optional<BackupManifest> parseManifest(std::string_view bytes, ErrorPtr* error);
std::optional<std::vector<BackupAlbum>> parseAlbums(std::string_view bytes, ErrorPtr* error);

// Where the file of a device path lies in a backup, "/DCIM/..."; empty for a path that no backup
// may hold: one that is not beneath /var/mobile/Media or takes the name of a file of the backup.
std::string backupPathOf(std::string_view devicePath);
// The device path that an entry of the plug-in's list stands for; empty when it may not be used.
std::string devicePathOfEntry(std::string_view entry);

namespace backup_names {  // within a backup
inline constexpr const char* kManifest = "/manifest.json";
inline constexpr const char* kAlbums = "/albums.json";
inline constexpr const char* kLibrary = "/library.sqlite";
inline constexpr const char* kIncoming = "/.incoming";
inline constexpr const char* kJournal = "/.incoming/journal.json";
}  // namespace backup_names

}  // namespace kx
