#include "backup/BackupVerifier.h"

#include <cerrno>
#include <memory>
#include <system_error>

#include "backup/BackupErrors.h"
#include "backup/BackupReader.h"
#include "backup/FileHash.h"

namespace kx {
namespace {

class Verifying {
 public:
  Verifying(const BackupReader& reader, const BackupProgressCallback& callback, BackupCheck* check)
      : reader_(reader), callback_(callback), check_(*check) {}

  void run() {
    const BackupManifest& manifest = reader_.manifest();
    progress_.phase = BackupPhase::kVerifying;
    progress_.filesTotal = manifest.files.size();
    for (const BackupFile& file : manifest.files) {
      progress_.bytesTotal += static_cast<std::uint64_t>(file.size);
    }
    for (const BackupFile& file : manifest.files) {
      UniqueFd fd;
      const int failed = reader_.openFile(file.path, &fd);
      compare(file.path, {file.size, file.sha256}, failed, fd);
      ++progress_.filesDone;
      if (!goOn()) return;
    }
    ErrorPtr error;
    if (!reader_.albums(&error)) damaged("albums.json", error->message());
    if (!manifest.library) return;
    UniqueFd fd;
    const int failed = reader_.openLibrary(&fd);
    compare("library.sqlite", *manifest.library, failed, fd);
  }

 private:
  bool goOn() {
    progress_.failures = check_.damaged.size();
    if (!stopped_ && callback_ && !callback_(progress_)) {
      stopped_ = true;
      check_.error = backupError(BackupError::kCancelled, "ended early, before all was verified");
    }
    return !stopped_;
  }
  void damaged(const std::string& path, const std::string& reason) {
    check_.damaged.push_back({path, reason});
  }
  void compare(const std::string& path, const BackupPart& expected, int failed,
               const UniqueFd& fd) {
    const std::uint64_t before = progress_.bytesDone;
    BackupPart found;
    if (failed == 0) {
      failed = hashFile(
          fd.get(),
          [&] {
            progress_.bytesDone = before + static_cast<std::uint64_t>(found.size);
            return goOn();
          },
          &found);
    }
    progress_.bytesDone = before + static_cast<std::uint64_t>(expected.size);
    if (stopped_) return;
    if (failed == ENOENT || failed == ENOTDIR) {
      damaged(path, "is missing");
    } else if (failed != 0) {
      damaged(path,
              "cannot be read: " + std::error_code(failed, std::generic_category()).message());
    } else if (found.size != expected.size) {
      damaged(path, "has " + std::to_string(found.size) + " bytes instead of " +
                        std::to_string(expected.size));
    } else if (found.sha256 != expected.sha256) {
      damaged(path, "its content is damaged");
    }
  }

  const BackupReader& reader_;
  const BackupProgressCallback& callback_;
  BackupCheck& check_;
  BackupProgress progress_;
  bool stopped_ = false;
};

}  // namespace

BackupCheck verifyBackup(const std::string& backupPath, const BackupProgressCallback& progress) {
  BackupCheck check;
  try {
    const std::unique_ptr<BackupReader> reader = BackupReader::open(backupPath, &check.error);
    if (!reader) return check;
    Verifying(*reader, progress, &check).run();
    check.manifest = reader->manifest();
  } catch (const std::exception& failure) {
    check.error = backupError(BackupError::kIo, failure.what());
  }
  return check;
}

}  // namespace kx
