#include "backup/BackupManifest.h"

#include <algorithm>
#include <cmath>
#include <nlohmann/json.hpp>
#include <set>
#include <stdexcept>
#include <unordered_set>

#include "backup/BackupErrors.h"
#include "device/DeviceLayout.h"
#include "device/DeviceRoot.h"
#include "device/Sha256.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

constexpr const char* kManifestFormat = "kxsync-backup";
constexpr const char* kAlbumsFormat = "kxsync-backup-albums";
constexpr std::int64_t kVersion = 1;
constexpr std::int64_t kUnixOfReferenceDate = 978307200;
constexpr std::int64_t kFurthestSeconds = 1LL << 40;
constexpr std::int32_t kNanosecondsPerSecond = 1'000'000'000;
constexpr std::size_t kTextBytes = 64U << 10;
constexpr std::int32_t kSyncedKinds[] = {1550, 1551, 15};
constexpr const char* kListNames[] = {"albums", "events", "faceAlbums"};

// Why a document is refused.
class Refusal : public std::runtime_error {
 public:
  explicit Refusal(const std::string& why, BackupError error = BackupError::kUnusable)
      : std::runtime_error(escapeControlCharacters(why)), code(error) {}
  const BackupError code;
};

Json parsedStrictly(std::string_view bytes) {
  if (bytes.size() > static_cast<std::size_t>(backup_limits::kDocumentBytes)) {
    throw Refusal("it is too large");
  }
  std::vector<std::set<std::string>> keys;
  const auto watch = [&keys](int depth, Json::parse_event_t event, Json& value) {
    if (depth > backup_limits::kDepth) throw Refusal("it is nested too deep");
    if (event == Json::parse_event_t::object_start) keys.emplace_back();
    if (event == Json::parse_event_t::object_end) keys.pop_back();
    if (event == Json::parse_event_t::key && !keys.back().insert(value.get<std::string>()).second) {
      throw Refusal("the key \"" + value.get<std::string>() + "\" stands twice in one object");
    }
    return true;
  };
  try {
    return Json::parse(bytes.begin(), bytes.end(), watch);
  } catch (const Json::parse_error& failure) {
    throw Refusal("it is no JSON (byte " + std::to_string(failure.byte) + ")");
  } catch (const Json::exception&) {
    throw Refusal("it holds a number that is out of range");
  }
}

const Json& member(const Json& object, const char* key) {
  if (!object.is_object())
    throw Refusal("an object is missing where \"" + std::string(key) + "\" was looked for");
  const auto found = object.find(key);
  if (found == object.end()) throw Refusal("\"" + std::string(key) + "\" is missing");
  return *found;
}

std::string text(const Json& object, const char* key) {
  const Json& value = member(object, key);
  if (!value.is_string()) throw Refusal("\"" + std::string(key) + "\" is no text");
  const auto& found = value.get_ref<const std::string&>();
  if (found.size() > kTextBytes) throw Refusal("\"" + std::string(key) + "\" is too long");
  return found;
}

std::optional<std::string> optionalText(const Json& object, const char* key) {
  if (member(object, key).is_null()) return std::nullopt;
  return text(object, key);
}

std::int64_t whole(const Json& object, const char* key, std::int64_t least, std::int64_t most) {
  const Json& value = member(object, key);
  if (!value.is_number_integer()) throw Refusal("\"" + std::string(key) + "\" is no whole number");
  const bool beyond = value.is_number_unsigned() &&
                      value.get<std::uint64_t>() > static_cast<std::uint64_t>(INT64_MAX);
  if (beyond || value.get<std::int64_t>() < least || value.get<std::int64_t>() > most) {
    throw Refusal("\"" + std::string(key) + "\" is out of range");
  }
  return value.get<std::int64_t>();
}

const Json& list(const Json& object, const char* key, std::size_t most) {
  const Json& value = member(object, key);
  if (!value.is_array()) throw Refusal("\"" + std::string(key) + "\" is no list");
  if (value.size() > most) throw Refusal("\"" + std::string(key) + "\" has too many entries");
  return value;
}

std::string digest(const Json& object, const char* key) {
  std::string value = text(object, key);
  const bool good = value.size() == 64 && std::all_of(value.begin(), value.end(), [](char c) {
                      return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
                    });
  if (!good) throw Refusal("\"" + std::string(key) + "\" is no SHA-256");
  return value;
}

BackupPart part(const Json& json) {
  return {whole(json, "size", 0, INT64_MAX), digest(json, "sha256")};
}

BackupFileTime fileTime(const Json& json) {
  return {whole(json, "seconds", -kFurthestSeconds, kFurthestSeconds),
          static_cast<std::int32_t>(whole(json, "nanoseconds", 0, kNanosecondsPerSecond - 1))};
}

Json partJson(const BackupPart& part) { return {{"size", part.size}, {"sha256", part.sha256}}; }

std::string hashOf(std::string_view bytes) {
  Sha256 hash;
  hash.update({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
  return hash.hexDigest();
}

bool isBeneath(std::string_view path, std::string_view directory) {
  return path.size() > directory.size() + 1 && path.starts_with(directory) &&
         path[directory.size()] == '/';
}

void checkFormat(const Json& json, const char* format) {
  if (!json.is_object() || json.value("format", Json()) != format) {
    throw Refusal(std::string("it is no document of the form \"") + format + "\"");
  }
  const std::int64_t version = whole(json, "version", 1, INT64_MAX);
  if (version != kVersion) {
    throw Refusal("it has version " + std::to_string(version) + ", this program knows " +
                      std::to_string(kVersion),
                  BackupError::kNewerForm);
  }
}

std::vector<std::string> readPaths(const Json& json) {
  std::vector<std::string> paths;
  for (const Json& entry : list(json, "paths", backup_limits::kPaths)) {
    if (!entry.is_string() || devicePathOfEntry(entry.get_ref<const std::string&>()).empty()) {
      throw Refusal("\"paths\" has an entry that may not be backed up");
    }
    paths.push_back(entry.get<std::string>());
  }
  return paths;
}

// Strictly ascending, each beneath one of the paths, none the directory of another.
void checkFiles(const BackupManifest& manifest) {
  std::vector<std::string> roots;
  for (const std::string& entry : manifest.paths) roots.push_back(devicePathOfEntry(entry));
  std::unordered_set<std::string_view> directories;
  std::string_view before;
  for (const BackupFile& file : manifest.files) {
    const std::string_view path = file.path;
    const auto refuse = [&path](const char* why) {
      throw Refusal("the path \"" + std::string(path.substr(0, 200)) + "\" " + why);
    };
    if (backupPathOf(path).empty()) refuse("may not be in a backup");
    if (std::none_of(roots.begin(), roots.end(), [&](const std::string& root) {
          return path == root || isBeneath(path, root);
        })) {
      refuse("lies beneath none of \"paths\"");
    }
    if (!before.empty() && path == before) refuse("stands there twice");
    if (!before.empty() && path < before) refuse("stands out of order");
    before = path;
    for (std::size_t slash = path.rfind('/'); slash != 0; slash = path.rfind('/', slash - 1)) {
      if (!directories.insert(path.substr(0, slash)).second) break;
    }
  }
  for (const BackupFile& file : manifest.files) {
    if (directories.contains(file.path)) {
      throw Refusal("the path \"" + file.path.substr(0, 200) + "\" is a file and a directory");
    }
  }
}

BackupManifest readManifest(std::string_view bytes) {
  Json json = parsedStrictly(bytes);
  checkFormat(json, kManifestFormat);
  const std::string checksum = digest(json, "checksum");
  json.erase("checksum");
  if (hashOf(json.dump()) != checksum) throw Refusal("its checksum is wrong");

  BackupManifest manifest;
  manifest.identity = text(json, "identity");
  if (manifest.identity.empty()) throw Refusal("\"identity\" is empty");
  manifest.device = optionalText(json, "device");
  const Json& taken = member(json, "takenAt");
  if (!taken.is_number() || !std::isfinite(taken.get<double>())) {
    throw Refusal("\"takenAt\" is no number");
  }
  manifest.takenAt = Date{taken.get<double>()};
  manifest.paths = readPaths(json);
  for (const Json& entry : list(json, "files", backup_limits::kFiles)) {
    manifest.files.push_back(
        {text(entry, "path"), whole(entry, "size", 0, backup_limits::kFileBytes),
         fileTime(member(entry, "modificationDate")), digest(entry, "sha256")});
  }
  checkFiles(manifest);
  manifest.albums = part(member(json, "albums"));
  if (!member(json, "library").is_null()) manifest.library = part(json["library"]);
  return manifest;
}

BackupAlbum readAlbum(const Json& json, std::size_t* members) {
  BackupAlbum album;
  album.uuid = text(json, "uuid");
  album.title = optionalText(json, "title");
  album.kind = static_cast<std::int32_t>(whole(json, "kind", INT32_MIN, INT32_MAX));
  if (isSyncedAlbumKind(album.kind)) {
    throw Refusal("an album of kind " + std::to_string(album.kind) + " is not the device's own");
  }
  const std::string name = text(json, "list");
  const auto* found = std::find(std::begin(kListNames), std::end(kListNames), name);
  if (found == std::end(kListNames)) throw Refusal("there is no list \"" + name + "\"");
  album.list = static_cast<BackupAlbumList>(found - std::begin(kListNames));
  album.position = static_cast<std::size_t>(
      whole(json, "position", 0, static_cast<std::int64_t>(backup_limits::kAlbums)));
  for (const Json& entry : list(json, "members", backup_limits::kMembers - *members)) {
    if (!entry.is_string() || backupPathOf(entry.get_ref<const std::string&>()).empty()) {
      throw Refusal("an album has a member with a path that may not be in a backup");
    }
    album.members.push_back(entry.get<std::string>());
  }
  *members += album.members.size();
  return album;
}

std::vector<BackupAlbum> readAlbums(std::string_view bytes) {
  const Json json = parsedStrictly(bytes);
  checkFormat(json, kAlbumsFormat);
  std::vector<BackupAlbum> albums;
  std::size_t members = 0;
  for (const Json& entry : list(json, "albums", backup_limits::kAlbums)) {
    albums.push_back(readAlbum(entry, &members));
  }
  return albums;
}

template <typename Document>
std::optional<Document> read(const char* name, Document (*reader)(std::string_view),
                             std::string_view bytes, ErrorPtr* error) {
  try {
    return reader(bytes);
  } catch (const Refusal& refusal) {
    setError(error,
             backupError(refusal.code, std::string(name) + " cannot be used: " + refusal.what()));
    return std::nullopt;
  }
}

}  // namespace

BackupFileTime BackupFileTime::fromUnix(const struct timespec& time) {
  return {static_cast<std::int64_t>(time.tv_sec) - kUnixOfReferenceDate,
          static_cast<std::int32_t>(time.tv_nsec)};
}

struct timespec BackupFileTime::unixTime() const {
  return {static_cast<time_t>(seconds + kUnixOfReferenceDate), nanoseconds};
}

bool isSyncedAlbumKind(std::int32_t kind) {
  return std::find(std::begin(kSyncedKinds), std::end(kSyncedKinds), kind) !=
         std::end(kSyncedKinds);
}

const BackupFile* BackupManifest::find(std::string_view path) const {
  const auto found = std::lower_bound(
      files.begin(), files.end(), path,
      [](const BackupFile& file, std::string_view key) { return file.path < key; });
  return found != files.end() && found->path == path ? &*found : nullptr;
}

std::string serializeManifest(const BackupManifest& manifest) {
  Json files = Json::array();
  for (const BackupFile& file : manifest.files) {
    files.push_back(
        {{"path", file.path},
         {"size", file.size},
         {"modificationDate",
          {{"seconds", file.modified.seconds}, {"nanoseconds", file.modified.nanoseconds}}},
         {"sha256", file.sha256}});
  }
  Json json = {{"format", kManifestFormat},
               {"version", kVersion},
               {"identity", manifest.identity},
               {"device", manifest.device ? Json(*manifest.device) : Json()},
               {"takenAt", manifest.takenAt.secondsSinceReference},
               {"paths", manifest.paths},
               {"files", std::move(files)},
               {"albums", partJson(manifest.albums)},
               {"library", manifest.library ? partJson(*manifest.library) : Json()}};
  json["checksum"] = hashOf(json.dump());
  return json.dump() + "\n";
}

std::string serializeAlbums(const std::vector<BackupAlbum>& albums) {
  Json entries = Json::array();
  for (const BackupAlbum& album : albums) {
    entries.push_back({{"uuid", album.uuid},
                       {"title", album.title ? Json(*album.title) : Json()},
                       {"kind", album.kind},
                       {"list", kListNames[static_cast<std::size_t>(album.list)]},
                       {"position", album.position},
                       {"members", album.members}});
  }
  const Json json = {{"format", kAlbumsFormat}, {"version", kVersion}, {"albums", entries}};
  // A title that is no UTF-8 is for people alone and may lose its bad bytes.
  return json.dump(-1, ' ', false, Json::error_handler_t::replace) + "\n";
}

std::optional<BackupManifest> parseManifest(std::string_view bytes, ErrorPtr* error) {
  return read<BackupManifest>("manifest.json", &readManifest, bytes, error);
}

std::optional<std::vector<BackupAlbum>> parseAlbums(std::string_view bytes, ErrorPtr* error) {
  return read<std::vector<BackupAlbum>>("albums.json", &readAlbums, bytes, error);
}

std::string backupPathOf(std::string_view devicePath) {
  if (DeviceRoot::checkPath(devicePath) != 0) return {};
  if (!isBeneath(devicePath, device_paths::kMedia)) return {};
  std::string path(devicePath.substr(std::string_view(device_paths::kMedia).size()));
  for (const std::string_view own : {backup_names::kManifest, backup_names::kAlbums,
                                     backup_names::kLibrary, backup_names::kIncoming}) {
    if (path == own || isBeneath(path, own)) return {};
  }
  return path;
}

std::string devicePathOfEntry(std::string_view entry) {
  std::string path =
      entry.starts_with('/') ? std::string(entry) : pathByAppending(device_paths::kMedia, entry);
  return backupPathOf(path).empty() ? std::string() : path;
}

}  // namespace kx
