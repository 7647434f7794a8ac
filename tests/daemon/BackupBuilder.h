#pragma once

#include <string>
#include <vector>

#include "backup/BackupManifest.h"
#include "tests/daemon/Support.h"

namespace kx::test {

// Writes backups file by file, whole or with whatever a test wants wrong in them.
class BackupBuilder {
 public:
  explicit BackupBuilder(const TempDirectory& work, std::string name = "backup");

  const std::string& name() const { return name_; }
  std::string path() const { return work_.at(name_); }
  BackupManifest& manifest() { return manifest_; }
  std::vector<BackupAlbum>& albums() { return albums_; }

  // A camera file, "100CAMRA/IMG_0001.JPG"; its device path.
  std::string add(const std::string& name, const std::string& content);
  // A file's content in the backup, without a word in the manifest.
  void putContent(const std::string& name, const std::string& content) const;
  void album(const std::string& uuid, const std::vector<std::string>& names);
  // Writes albums.json and manifest.json.
  void write();

 private:
  const TempDirectory& work_;
  std::string name_;
  BackupManifest manifest_;
  std::vector<BackupAlbum> albums_;
};

std::string sha256Of(const std::string& bytes);

}  // namespace kx::test
