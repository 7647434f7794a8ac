#include "testing/TestPlatform.h"

namespace kx {
namespace {

class AnsweringBackupManager final : public QBManager {
 public:
  explicit AnsweringBackupManager(TestPlatform::BackupAnswer answer) : answer_(std::move(answer)) {}

  std::optional<std::vector<QBFile>> restoreFilesForDomain(const std::string& domain,
                                                           ErrorPtr* error) override {
    setError(error, answer_.error);
    if (!answer_.paths || domain != kQBShoeboxDomain) return std::nullopt;
    std::vector<QBFile> files;
    for (const std::string& path : *answer_.paths) files.push_back(QBFile{path});
    return files;
  }

 private:
  TestPlatform::BackupAnswer answer_;
};

}  // namespace

TestPlatform::TestPlatform() { setLogSinks(captured.sinks()); }

TestPlatform::~TestPlatform() {
  saver.release();
  saver.drain();
  setLogSinks({});
}

std::unique_ptr<QBManager> TestPlatform::newBackupManager() {
  return std::make_unique<AnsweringBackupManager>(backup);
}

}  // namespace kx
