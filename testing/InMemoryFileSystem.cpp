#include "testing/InMemoryFileSystem.h"

#include <algorithm>
#include <cerrno>

#include "platform/foundation/Text.h"

namespace kx {
namespace {

ErrorPtr posixError(int code) { return Error::make(kPosixErrorDomain, code); }

std::string parentOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

std::string prefixOf(const std::string& directory) {
  return directory == "/" ? directory : directory + "/";
}

class MemoryLock final : public FileLock {};

}  // namespace

bool InMemoryFileSystem::isDirectoryLocked(const std::string& path) const {
  if (directories_.contains(path)) return true;
  const std::string prefix = prefixOf(path);
  const auto file = files_.lower_bound(prefix);
  if (file != files_.end() && file->first.starts_with(prefix)) return true;
  const auto directory = directories_.lower_bound(prefix);
  return directory != directories_.end() && directory->starts_with(prefix);
}

// Names, sorted by bytes.
std::vector<std::string> InMemoryFileSystem::childrenLocked(const std::string& path) const {
  const std::string prefix = prefixOf(path);
  std::set<std::string> names;
  const auto take = [&](const std::string& candidate) {
    const std::string rest = candidate.substr(prefix.size());
    if (!rest.empty()) names.insert(rest.substr(0, rest.find('/')));
  };
  for (auto it = files_.lower_bound(prefix); it != files_.end(); ++it) {
    if (!it->first.starts_with(prefix)) break;
    take(it->first);
  }
  for (auto it = directories_.lower_bound(prefix); it != directories_.end(); ++it) {
    if (!it->starts_with(prefix)) break;
    take(*it);
  }
  return {names.begin(), names.end()};
}

bool InMemoryFileSystem::fileExists(const std::string& path) {
  std::lock_guard<std::mutex> lock(mutex_);
  return files_.contains(path) || isDirectoryLocked(path);
}

DataPtr InMemoryFileSystem::readFile(const std::string& path, ErrorPtr* error) {
  std::lock_guard<std::mutex> lock(mutex_);
  const auto file = files_.find(path);
  if (file != files_.end() && file->second.bytes) return file->second.bytes;
  setError(error, posixError(file == files_.end() ? ENOENT : EACCES));
  return nullptr;
}

bool InMemoryFileSystem::writeFileAtomically(const std::string& path,
                                             std::span<const std::uint8_t> bytes,
                                             ErrorPtr* /*error*/) {
  std::lock_guard<std::mutex> lock(mutex_);
  File& file = files_[path];
  if (file.bytes && std::ranges::equal(file.bytes->span(), bytes)) return true;
  file.bytes = std::make_shared<Data>(std::vector<std::uint8_t>(bytes.begin(), bytes.end()));
  file.size = static_cast<std::int64_t>(bytes.size());
  ++writes_;
  return true;
}

bool InMemoryFileSystem::removeItem(const std::string& path, ErrorPtr* error) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (files_.erase(path) > 0) {
    directories_.insert(parentOf(path));
    ++writes_;
    return true;
  }
  if (!isDirectoryLocked(path)) {
    setError(error, posixError(ENOENT));
    return false;
  }
  if (!childrenLocked(path).empty()) {
    setError(error, posixError(ENOTEMPTY));
    return false;
  }
  directories_.erase(path);
  return true;
}

bool InMemoryFileSystem::createDirectoryWithIntermediates(const std::string& path,
                                                          ErrorPtr* error) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (files_.contains(path)) {
    setError(error, posixError(EEXIST));
    return false;
  }
  directories_.insert(path);
  return true;
}

std::vector<std::string> InMemoryFileSystem::contentsOfDirectory(const std::string& path,
                                                                 ErrorPtr* error) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (!isDirectoryLocked(path)) {
    setError(error, posixError(files_.contains(path) ? ENOTDIR : ENOENT));
    return {};
  }
  return childrenLocked(path);
}

void InMemoryFileSystem::enumerate(const std::string& path, const EntryHandler& onEntry,
                                   const ErrorHandler& onError) {
  enumerateBelow(path, onEntry, onError);
}

// The depth is that of the test's own tree.
void InMemoryFileSystem::enumerateBelow(const std::string& path, const EntryHandler& onEntry,
                                        const ErrorHandler& onError) {
  ErrorPtr error;
  const std::vector<std::string> names = contentsOfDirectory(path, &error);
  if (error) {
    onError(path, error);
    return;
  }
  for (const std::string& name : names) {
    FileProperties entry;
    entry.name = name;
    entry.path = pathByAppending(path, name);
    entry.parentPath = path;
    entry.parentResourceIdentifier = resourceIdentifier(path);
    {
      std::lock_guard<std::mutex> lock(mutex_);
      const auto file = files_.find(entry.path);
      entry.isDirectory = file == files_.end();
      entry.fileSize = entry.isDirectory ? directorySize_ : file->second.size;
    }
    const EnumerationChoice choice = onEntry(entry);
    if (entry.isDirectory && choice == EnumerationChoice::kDescend) {
      enumerateBelow(entry.path, onEntry, onError);
    }
  }
}

std::string InMemoryFileSystem::resourceIdentifier(const std::string& path) {
  return fileExists(path) ? "memory:" + path : std::string();
}

std::uint32_t InMemoryFileSystem::blockSize(const std::string& /*path*/, ErrorPtr* /*error*/) {
  std::lock_guard<std::mutex> lock(mutex_);
  return blockSize_;
}

FileSystem::LockAttempt InMemoryFileSystem::tryLock(const std::string& path) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (lockedElsewhere_.contains(path)) return {LockOutcome::kHeldElsewhere, nullptr};
  if (!files_.contains(path)) return {LockOutcome::kNoFile, nullptr};
  return {LockOutcome::kTaken, std::make_unique<MemoryLock>()};
}

void InMemoryFileSystem::putText(const std::string& path, std::string_view text) {
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
  writeFileAtomically(path, {bytes, text.size()}, nullptr);
}

void InMemoryFileSystem::putSize(const std::string& path, std::int64_t bytes) {
  std::lock_guard<std::mutex> lock(mutex_);
  files_[path] = File{nullptr, bytes};
}

std::optional<std::string> InMemoryFileSystem::text(const std::string& path) {
  const DataPtr data = readFile(path, nullptr);
  if (!data) return std::nullopt;
  return std::string(reinterpret_cast<const char*>(data->bytes()), data->length());
}

std::vector<std::string> InMemoryFileSystem::files(const std::string& path) {
  std::lock_guard<std::mutex> lock(mutex_);
  std::vector<std::string> paths;
  for (const auto& entry : files_) {
    if (entry.first.starts_with(path)) paths.push_back(entry.first);
  }
  return paths;
}

void InMemoryFileSystem::setBlockSize(std::uint32_t bytes) {
  std::lock_guard<std::mutex> lock(mutex_);
  blockSize_ = bytes;
}

void InMemoryFileSystem::setDirectorySize(std::int64_t bytes) {
  std::lock_guard<std::mutex> lock(mutex_);
  directorySize_ = bytes;
}

void InMemoryFileSystem::setLockedElsewhere(const std::string& path, bool locked) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (locked) {
    lockedElsewhere_.insert(path);
  } else {
    lockedElsewhere_.erase(path);
  }
}

std::size_t InMemoryFileSystem::writes() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return writes_;
}

}  // namespace kx
