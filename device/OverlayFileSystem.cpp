#include "device/OverlayFileSystem.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include "device/DeviceErrors.h"
#include "device/DeviceRoot.h"
#include "platform/foundation/Text.h"

namespace kx {
namespace {

bool done(const std::string& path, int errorNumber, ErrorPtr* error) {
  if (errorNumber == 0) return true;
  setError(error, posixError(path, errorNumber));
  return false;
}

int codeOf(const ErrorPtr& error) {
  return error && error->domain() == kPosixErrorDomain ? static_cast<int>(error->code()) : EIO;
}

std::string parentOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::string prefixOf(const std::string& directory) {
  return directory == "/" ? directory : directory + "/";
}

}  // namespace

class OverlayFileSystem::HeldLock : public FileLock {
 public:
  HeldLock(std::shared_ptr<LockTable> table, std::string path)
      : table_(std::move(table)), path_(std::move(path)) {}
  ~HeldLock() override {
    const std::lock_guard<std::mutex> lock(table_->mutex);
    table_->held.erase(path_);
  }

 private:
  const std::shared_ptr<LockTable> table_;
  const std::string path_;
};

const OverlayFileSystem::Entry* OverlayFileSystem::find(const std::string& path) const {
  const auto found = entries_.find(path);
  return found == entries_.end() ? nullptr : &found->second;
}

int OverlayFileSystem::blocked(const std::string& path) const {
  bool isInNewDirectory = false;
  for (std::size_t slash = path.find('/', 1); slash != std::string::npos;
       slash = path.find('/', slash + 1)) {
    const Entry* entry = find(path.substr(0, slash));
    if (entry == nullptr) continue;
    if (entry->kind == Kind::kFile) return ENOTDIR;
    if (entry->kind == Kind::kRemoved) return ENOENT;
    isInNewDirectory = true;
  }
  return isInNewDirectory && find(path) == nullptr ? ENOENT : 0;
}

bool OverlayFileSystem::exists(const std::string& path) const {
  if (blocked(path) != 0) return false;
  const Entry* entry = find(path);
  return entry != nullptr ? entry->kind != Kind::kRemoved : below_.fileExists(path);
}

int OverlayFileSystem::directoryError(const std::string& path) const {
  if (const int end = blocked(path); end != 0) return end;
  if (const Entry* entry = find(path)) {
    if (entry->kind == Kind::kRemoved) return ENOENT;
    return entry->kind == Kind::kDirectory ? 0 : ENOTDIR;
  }
  ErrorPtr error;
  below_.contentsOfDirectory(path, &error);
  return error ? codeOf(error) : 0;
}

// What lay below a directory was removed before it was: a removed entry of its own hides each.
int OverlayFileSystem::list(const std::string& path, std::vector<std::string>* names) const {
  if (const int failed = directoryError(path); failed != 0) return failed;
  std::set<std::string> found;
  ErrorPtr ignored;
  for (std::string& name : below_.contentsOfDirectory(path, &ignored)) found.insert(name);
  const std::string prefix = prefixOf(path);
  for (auto entry = entries_.lower_bound(prefix);
       entry != entries_.end() && entry->first.starts_with(prefix); ++entry) {
    const std::string name = entry->first.substr(prefix.size());
    if (name.empty() || name.find('/') != std::string::npos) continue;
    if (entry->second.kind == Kind::kRemoved) {
      found.erase(name);
    } else {
      found.insert(name);
    }
  }
  names->assign(found.begin(), found.end());
  return 0;
}

void OverlayFileSystem::put(const std::string& path, Kind kind, DataPtr bytes) {
  Entry& entry = entries_[path];
  entry.kind = kind;
  entry.bytes = std::move(bytes);
  entry.identifier = kind == Kind::kRemoved ? "" : "planned:" + std::to_string(++made_);
}

DataPtr OverlayFileSystem::keep(std::span<const std::uint8_t> bytes) const {
  for (const auto& [path, entry] : entries_) {
    if (!entry.bytes || bytes.empty()) continue;
    const std::span<const std::uint8_t> kept = entry.bytes->span();
    if (kept.data() == bytes.data() && kept.size() == bytes.size()) return entry.bytes;
  }
  return std::make_shared<const Data>(std::vector<std::uint8_t>(bytes.begin(), bytes.end()));
}

std::string OverlayFileSystem::identifierOf(const std::string& path) const {
  if (blocked(path) != 0) return {};
  const Entry* entry = find(path);
  return entry != nullptr ? entry->identifier : below_.resourceIdentifier(path);
}

bool OverlayFileSystem::fileExists(const std::string& path) {
  if (DeviceRoot::checkPath(path) != 0) return false;
  const std::lock_guard<std::mutex> lock(mutex_);
  return exists(path);
}

DataPtr OverlayFileSystem::readFile(const std::string& path, ErrorPtr* error) {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (const int end = blocked(path); end != 0) {
      done(path, end, error);
      return nullptr;
    }
    if (const Entry* entry = find(path)) {
      if (entry->kind == Kind::kFile) return entry->bytes;
      done(path, entry->kind == Kind::kRemoved ? ENOENT : EISDIR, error);
      return nullptr;
    }
  }
  return below_.readFile(path, error);
}

bool OverlayFileSystem::fileHolds(const std::string& path, std::span<const std::uint8_t> bytes) {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (blocked(path) != 0) return false;
    if (const Entry* entry = find(path)) {
      return entry->kind == Kind::kFile && std::ranges::equal(entry->bytes->span(), bytes);
    }
  }
  return below_.fileHolds(path, bytes);
}

bool OverlayFileSystem::writeFileAtomically(const std::string& path,
                                            std::span<const std::uint8_t> bytes, ErrorPtr* error) {
  return write(path, bytes, nullptr, error);
}

bool OverlayFileSystem::writeDataAtomically(const std::string& path, const DataPtr& bytes,
                                            ErrorPtr* error) {
  return write(path, bytes->span(), bytes, error);
}

// Keeps the data object if there is one, else a copy of the bytes.
bool OverlayFileSystem::write(const std::string& path, std::span<const std::uint8_t> bytes,
                              DataPtr data, ErrorPtr* error) {
  int failed = DeviceRoot::checkPath(path);
  if (failed == 0 && path == "/") failed = EINVAL;
  const std::lock_guard<std::mutex> lock(mutex_);
  if (failed == 0) failed = directoryError(parentOf(path));
  if (failed == 0 && directoryError(path) == 0) failed = EISDIR;
  if (failed != 0) return done(path, failed, error);
  const Entry* entry = find(path);
  const bool same = entry != nullptr && entry->kind == Kind::kFile &&
                    std::ranges::equal(entry->bytes->span(), bytes);
  if (!same) put(path, Kind::kFile, data ? std::move(data) : keep(bytes));
  return true;
}

bool OverlayFileSystem::removeItem(const std::string& path, ErrorPtr* error) {
  int failed = DeviceRoot::checkPath(path);
  if (failed == 0 && path == "/") failed = EINVAL;
  const std::lock_guard<std::mutex> lock(mutex_);
  if (failed == 0) failed = directoryError(parentOf(path));
  if (failed == 0 && !exists(path)) failed = ENOENT;
  std::vector<std::string> names;
  if (failed == 0 && list(path, &names) == 0 && !names.empty()) failed = ENOTEMPTY;
  if (failed == 0) put(path, Kind::kRemoved, nullptr);
  return done(path, failed, error);
}

bool OverlayFileSystem::createDirectoryWithIntermediates(const std::string& path, ErrorPtr* error) {
  if (const int bad = DeviceRoot::checkPath(path); bad != 0) return done(path, bad, error);
  const std::lock_guard<std::mutex> lock(mutex_);
  if (path == "/") return true;
  for (std::size_t slash = path.find('/', 1);; slash = path.find('/', slash + 1)) {
    const std::string directory = path.substr(0, slash);
    const int missing = directoryError(directory);
    if (missing == ENOENT) {
      put(directory, Kind::kDirectory, nullptr);
    } else if (missing != 0) {
      return done(path, missing, error);
    }
    if (slash == std::string::npos) return true;
  }
}

std::vector<std::string> OverlayFileSystem::contentsOfDirectory(const std::string& path,
                                                                ErrorPtr* error) {
  std::vector<std::string> names;
  int failed = DeviceRoot::checkPath(path);
  const std::lock_guard<std::mutex> lock(mutex_);
  if (failed == 0) failed = list(path, &names);
  if (!done(path, failed, error)) names.clear();
  return names;
}

struct OverlayFileSystem::Level {
  std::vector<FileProperties> entries;  // by name from the end, so that the next one is the last
};

// One directory of a walk; false when it cannot be listed.
bool OverlayFileSystem::openLevel(const std::string& path, Level* level,
                                  const ErrorHandler& onError) const {
  std::map<std::string, FileProperties> found;
  int failed = DeviceRoot::checkPath(path);
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    std::vector<std::string> names;
    if (failed == 0) failed = list(path, &names);
    for (std::string& name : names) {
      FileProperties properties;
      properties.path = pathByAppending(path, name);
      properties.parentPath = path;
      properties.parentResourceIdentifier = identifierOf(path);
      if (const Entry* entry = find(properties.path)) {
        properties.isDirectory = entry->kind == Kind::kDirectory;
        if (entry->bytes) properties.fileSize = static_cast<std::int64_t>(entry->bytes->length());
      }
      properties.name = name;
      found.emplace(std::move(name), std::move(properties));
    }
    const auto takeOver = [&](const FileProperties& below) {
      const auto place = found.find(below.name);
      if (place != found.end() && find(below.path) == nullptr) {
        place->second.isDirectory = below.isDirectory;
        place->second.fileSize = below.fileSize;
        place->second.error = below.error;
      }
      return EnumerationChoice::kSkipDescendants;
    };
    if (failed == 0) below_.enumerate(path, takeOver, [](const std::string&, const ErrorPtr&) {});
  }
  if (failed != 0) {
    onError(path, posixError(path, failed));
    return false;
  }
  for (auto entry = found.rbegin(); entry != found.rend(); ++entry) {
    level->entries.push_back(std::move(entry->second));
  }
  return true;
}

void OverlayFileSystem::enumerate(const std::string& path, const EntryHandler& onEntry,
                                  const ErrorHandler& onError) {
  std::vector<Level> levels(1);
  if (!openLevel(path, &levels.back(), onError)) return;
  while (!levels.empty()) {
    if (levels.back().entries.empty()) {
      levels.pop_back();
      continue;
    }
    const FileProperties entry = std::move(levels.back().entries.back());
    levels.back().entries.pop_back();
    const EnumerationChoice choice = onEntry(entry);
    if (!entry.isDirectory || choice == EnumerationChoice::kSkipDescendants) continue;
    Level next;
    if (openLevel(entry.path, &next, onError)) levels.push_back(std::move(next));
  }
}

std::string OverlayFileSystem::resourceIdentifier(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  return identifierOf(path);
}

// Of something new that of the nearest directory that is really there.
std::uint32_t OverlayFileSystem::blockSize(const std::string& path, ErrorPtr* error) {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (const int end = blocked(path); end != 0) {
    done(path, end, error);
    return 0;
  }
  if (DeviceRoot::checkPath(path) == 0 && find(path) != nullptr) {
    if (!exists(path)) {
      done(path, ENOENT, error);
      return 0;
    }
    std::string real = path;
    while (real != "/" && find(real) != nullptr) real = parentOf(real);
    return below_.blockSize(real, error);
  }
  return below_.blockSize(path, error);
}

FileSystem::LockAttempt OverlayFileSystem::tryLock(const std::string& path) {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (find(path) != nullptr || blocked(path) != 0) {
      LockAttempt attempt;
      if (!exists(path)) return attempt;
      const std::lock_guard<std::mutex> tableLock(locks_->mutex);
      attempt.outcome = LockOutcome::kHeldElsewhere;
      if (!locks_->held.insert(path).second) return attempt;
      attempt.outcome = LockOutcome::kTaken;
      attempt.lock = std::make_unique<HeldLock>(locks_, path);
      return attempt;
    }
  }
  return below_.tryLock(path);
}

}  // namespace kx
