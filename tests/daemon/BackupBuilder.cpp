#include "tests/daemon/BackupBuilder.h"

#include <algorithm>

#include "device/DeviceLayout.h"
#include "device/Sha256.h"

namespace kx::test {

std::string sha256Of(const std::string& bytes) {
  Sha256 hash;
  hash.update({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
  return hash.hexDigest();
}

BackupBuilder::BackupBuilder(const TempDirectory& work, std::string name)
    : work_(work), name_(std::move(name)) {
  manifest_.identity = "AAAAAAAA-0000-4000-8000-00000000000" + std::to_string(name_.size() % 10);
  manifest_.takenAt = Date{700000000.0};
  manifest_.paths = {"DCIM"};
}

std::string BackupBuilder::add(const std::string& name, const std::string& content) {
  BackupFile file;
  file.path = std::string(device_paths::kDcim) + "/" + name;
  file.size = static_cast<std::int64_t>(content.size());
  file.modified = {600000000, 250000000};
  file.sha256 = sha256Of(content);
  manifest_.files.push_back(file);
  putContent(name, content);
  return file.path;
}

void BackupBuilder::putContent(const std::string& name, const std::string& content) const {
  work_.write(name_ + "/DCIM/" + name, content);
}

void BackupBuilder::album(const std::string& uuid, const std::vector<std::string>& names) {
  BackupAlbum album;
  album.uuid = uuid;
  album.title = "Title of " + uuid;
  album.kind = 2;
  album.position = albums_.size();
  for (const std::string& name : names) {
    album.members.push_back(std::string(device_paths::kDcim) + "/" + name);
  }
  albums_.push_back(std::move(album));
}

void BackupBuilder::write() {
  std::sort(manifest_.files.begin(), manifest_.files.end(),
            [](const BackupFile& a, const BackupFile& b) { return a.path < b.path; });
  const std::string albums = serializeAlbums(albums_);
  manifest_.albums = {static_cast<std::int64_t>(albums.size()), sha256Of(albums)};
  work_.write(name_ + "/albums.json", albums);
  work_.write(name_ + "/manifest.json", serializeManifest(manifest_));
}

}  // namespace kx::test
