#include "device/MediaFolders.h"

#include <algorithm>
#include <cerrno>

#include "device/DeviceLayout.h"
#include "device/Sha256.h"

namespace kx {
namespace {

constexpr std::size_t kFirstNumber = 100;
constexpr std::size_t kNumbersPerLetter = 900;
constexpr std::size_t kLetters = 26;
constexpr std::string_view kStem = "SYNC";

// Thirty-two capital hexadecimal digits in groups of 8, 4, 4, 4 and 12.
bool isCanonicalUUID(std::string_view text) {
  if (text.size() != 36) return false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    const bool dash = i == 8 || i == 13 || i == 18 || i == 23;
    const bool digit = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'F');
    if (dash ? c != '-' : !digit) return false;
  }
  return true;
}

}  // namespace

std::string MediaFolders::fileName(const std::string& assetUUID, const std::string& extension) {
  if (isCanonicalUUID(assetUUID)) return assetUUID + "." + extension;
  Sha256 hash;
  hash.update({reinterpret_cast<const std::uint8_t*>(assetUUID.data()), assetUUID.size()});
  return hash.hexDigest() + "." + extension;
}

std::size_t MediaFolders::folderCount() { return kNumbersPerLetter * kLetters; }

std::string MediaFolders::folderName(std::size_t number) {
  return std::to_string(kFirstNumber + number % kNumbersPerLetter) + std::string(kStem) +
         static_cast<char>('A' + number / kNumbersPerLetter);
}

std::optional<std::size_t> MediaFolders::folderNumber(std::string_view name) {
  if (name.size() != 3 + kStem.size() + 1 || name.substr(3, kStem.size()) != kStem) {
    return std::nullopt;
  }
  std::size_t number = 0;
  for (const char c : name.substr(0, 3)) {
    if (c < '0' || c > '9') return std::nullopt;
    number = number * 10 + static_cast<std::size_t>(c - '0');
  }
  const char letter = name.back();
  if (number < kFirstNumber || letter < 'A' || letter > 'Z') return std::nullopt;
  return static_cast<std::size_t>(letter - 'A') * kNumbersPerLetter + number - kFirstNumber;
}

int MediaFolders::start() {
  std::vector<std::string> present;
  if (const int failed = root_->list(device_paths::kSyncedAssets, &present);
      failed != 0 && failed != ENOENT) {
    return failed;
  }
  std::size_t last = 0;
  for (const std::string& name : present) last = std::max(last, folderNumber(name).value_or(0));
  current_ = last;
  return 0;
}

int MediaFolders::names(std::size_t folder, std::set<std::string>** found) {
  auto known = names_.find(folder);
  if (known == names_.end()) {
    std::vector<std::string> present;
    const std::string path = std::string(device_paths::kSyncedAssets) + "/" + folderName(folder);
    if (const int failed = root_->list(path, &present); failed != 0 && failed != ENOENT) {
      return failed;
    }
    known = names_.emplace(folder, std::set<std::string>(present.begin(), present.end())).first;
  }
  *found = &known->second;
  return 0;
}

void MediaFolders::release(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos || slash == 0) return;
  const std::size_t before = path.rfind('/', slash - 1);
  const auto number = folderNumber(std::string_view(path).substr(before + 1, slash - before - 1));
  if (!number) return;
  if (const auto known = names_.find(*number); known != names_.end()) {
    known->second.erase(path.substr(slash + 1));
  }
}

int MediaFolders::place(const std::string& name, std::string* path) {
  if (!current_) {
    if (const int failed = start(); failed != 0) return failed;
  }
  bool keepsFilling = true;  // the first folder with room is the one to go on with
  for (std::size_t tried = 0, from = *current_; tried < folderCount(); ++tried) {
    const std::size_t folder = (from + tried) % folderCount();
    std::set<std::string>* taken = nullptr;
    if (const int failed = names(folder, &taken); failed != 0) return failed;
    if (taken->size() >= filesPerFolder_) continue;
    if (keepsFilling) {
      if (folder != *current_) names_.erase(*current_);
      current_ = folder;
      keepsFilling = false;
    }
    if (!taken->insert(name).second) continue;  // an asset that is there already
    *path = std::string(device_paths::kSyncedAssets) + "/" + folderName(folder) + "/" + name;
    return 0;
  }
  return ENOSPC;
}

}  // namespace kx
