#include <sys/resource.h>

#include <csignal>
#include <filesystem>
#include <random>

#include "device/DeviceFileSystem.h"
#include "device/OverlayFileSystem.h"
#include "tests/contract/FileSystemContract.h"
#include "tests/device/DeviceFixture.h"

namespace kx {
namespace {

namespace fs = std::filesystem;

void fill(const std::string& root) {
  fs::create_directories(root + "/d/sub");
  fs::create_directories(root + "/d/empty");
  std::ofstream(root + "/d/old") << "old text";
  std::ofstream(root + "/d/sub/deep") << "deep text";
  fs::create_symlink(root + "/d", root + "/link");
}

// Every entry below with kind, size, content and modification time.
std::string listing(const std::string& root) {
  std::vector<std::string> lines;
  for (const auto& entry : fs::recursive_directory_iterator(root)) {
    std::string line = entry.path().string();
    if (entry.is_regular_file() && !entry.is_symlink()) {
      std::ifstream file(entry.path(), std::ios::binary);
      line += " " + std::string(std::istreambuf_iterator<char>(file), {});
    }
    if (!entry.is_symlink()) {
      line += " " + std::to_string(entry.last_write_time().time_since_epoch().count());
    }
    lines.push_back(line);
  }
  std::sort(lines.begin(), lines.end());
  std::string all;
  for (const std::string& line : lines) all += line + "\n";
  return all;
}

class RealFiles : public ContractFiles {
 public:
  RealFiles() {
    fill(directory_.path());
    files_ = std::make_unique<DeviceFileSystem>(DeviceRoot::open(directory_.path(), false, nullptr),
                                                false);
  }
  FileSystem& files() override { return *files_; }

 private:
  TemporaryDirectory directory_;
  std::unique_ptr<DeviceFileSystem> files_;
};

// The content lies below the overlay, which must leave it as it is.
class OverlaidFiles : public ContractFiles {
 public:
  OverlaidFiles() {
    fill(directory_.path());
    before_ = listing(directory_.path());
    below_ = std::make_unique<DeviceFileSystem>(DeviceRoot::open(directory_.path(), false, nullptr),
                                                true);
    files_ = std::make_unique<OverlayFileSystem>(*below_);
  }
  ~OverlaidFiles() override { EXPECT_EQ(listing(directory_.path()), before_); }
  FileSystem& files() override { return *files_; }

 private:
  TemporaryDirectory directory_;
  std::string before_;
  std::unique_ptr<DeviceFileSystem> below_;
  std::unique_ptr<OverlayFileSystem> files_;
};

INSTANTIATE_TEST_SUITE_P(Real, FileSystemContract,
                         ::testing::Values([]() -> std::unique_ptr<ContractFiles> {
                           return std::make_unique<RealFiles>();
                         }));
INSTANTIATE_TEST_SUITE_P(Overlay, FileSystemContract,
                         ::testing::Values([]() -> std::unique_ptr<ContractFiles> {
                           return std::make_unique<OverlaidFiles>();
                         }));

// Readers of a large file share one data object, as long as the file is as it was.
TEST(DeviceFileSystemTest, AFileThatHasChangedIsReadAnew) {
  TemporaryDirectory directory;
  DeviceFileSystem files(DeviceRoot::open(directory.path(), false, nullptr), false);
  const auto text = [&files] {
    const DataPtr data = files.readFile("/f", nullptr);
    return data ? std::string(data->bytes(), data->bytes() + data->length()) : "none";
  };
  const std::string a(2 << 20, 'a');
  const std::string b(2 << 20, 'b');
  auto data = std::make_shared<const Data>(a.data(), a.size());
  ASSERT_TRUE(files.writeDataAtomically("/f", data, nullptr));
  EXPECT_EQ(files.readFile("/f", nullptr), data);
  // In place, by another program, of equal length.
  std::ofstream(directory.path() + "/f", std::ios::in | std::ios::binary) << b;
  const DataPtr second = files.readFile("/f", nullptr);
  EXPECT_EQ(text(), b);
  EXPECT_EQ(files.readFile("/f", nullptr), second);
  // By another file.
  std::ofstream(directory.path() + "/g", std::ios::binary) << a;
  fs::rename(directory.path() + "/g", directory.path() + "/f");
  EXPECT_EQ(text(), a);
  // A file that held the bytes before counts as written.
  ASSERT_TRUE(files.writeDataAtomically("/f", data, nullptr));
  EXPECT_EQ(files.readFile("/f", nullptr), data);
  fs::remove(directory.path() + "/f");
  EXPECT_EQ(text(), "none");
  // Nobody holds it any longer: it is not kept either.
  ASSERT_TRUE(files.writeDataAtomically("/f", data, nullptr));
  const std::weak_ptr<const Data> gone = data;
  data = nullptr;
  EXPECT_TRUE(gone.expired());
  EXPECT_EQ(text(), a);
}

TEST(DeviceFileSystemTest, WhatHasNoRoomLeavesNothing) {
  TemporaryDirectory directory;
  DeviceFileSystem files(DeviceRoot::open(directory.path(), false, nullptr), false);
  rlimit before = {};
  ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &before), 0);
  const rlimit small{1 << 20, before.rlim_max};
  const auto handler = std::signal(SIGXFSZ, SIG_IGN);
  ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &small), 0);
  const std::string text(2 << 20, 'a');
  const auto data = std::make_shared<const Data>(text.data(), text.size());
  const auto prepared = files.prepareFile("/f", data);
  EXPECT_TRUE(fs::is_empty(directory.path()));
  ErrorPtr error;
  EXPECT_FALSE(prepared->putInPlace(&error));
  EXPECT_TRUE(fs::is_empty(directory.path()));
  ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &before), 0);
  std::signal(SIGXFSZ, handler);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), EFBIG);
  // There is room again.
  EXPECT_TRUE(prepared->putInPlace(nullptr));
  EXPECT_TRUE(files.fileHolds("/f", data->span()));
}

TEST(DeviceFileSystemTest, AReadOnlyOnePreparesNothing) {
  TemporaryDirectory directory;
  DeviceFileSystem files(DeviceRoot::open(directory.path(), false, nullptr), true);
  const auto data = std::make_shared<const Data>("x", 1);
  const auto prepared = files.prepareFile("/f", data);
  EXPECT_TRUE(fs::is_empty(directory.path()));
  ErrorPtr error;
  EXPECT_FALSE(prepared->putInPlace(&error));
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), EROFS);
}

// Over a directory that is missing everything has to be made first.
TEST(OverlayFileSystemTest, StandsOnADirectoryThatIsMissing) {
  TemporaryDirectory directory;
  const std::string missing = directory.path() + "/none";
  DeviceFileSystem below(DeviceRoot::ofMissing(missing), true);
  OverlayFileSystem files(below);
  EXPECT_FALSE(files.fileExists("/a"));
  ErrorPtr error;
  EXPECT_FALSE(files.writeFileAtomically("/a/f", {}, &error));
  EXPECT_EQ(error->code(), ENOENT);
  EXPECT_TRUE(files.createDirectoryWithIntermediates("/a/b", nullptr));
  const std::vector<std::uint8_t> bytes = {1, 2, 3};
  EXPECT_TRUE(files.writeFileAtomically("/a/b/f", bytes, nullptr));
  const DataPtr kept = files.readFile("/a/b/f", nullptr);
  ASSERT_NE(kept, nullptr);
  EXPECT_TRUE(std::equal(bytes.begin(), bytes.end(), kept->bytes()));
  EXPECT_EQ(files.contentsOfDirectory("/a/b", nullptr), std::vector<std::string>{"f"});
  EXPECT_FALSE(fs::exists(missing));
}

TEST(OverlayFileSystemTest, KeepsBytesThatItHasOnce) {
  TemporaryDirectory directory;
  fill(directory.path());
  DeviceFileSystem below(DeviceRoot::open(directory.path(), false, nullptr), true);
  OverlayFileSystem files(below);
  const std::vector<std::uint8_t> bytes(1000, 7);
  EXPECT_TRUE(files.writeFileAtomically("/d/a", bytes, nullptr));
  const DataPtr first = files.readFile("/d/a", nullptr);
  EXPECT_TRUE(files.writeFileAtomically("/d/b", first->span(), nullptr));
  EXPECT_EQ(files.readFile("/d/b", nullptr), first);
}

// The same random operations on real files and on an overlay over a copy of them give the same
// answers, and the copy stays as it was.
class OverlayHistory {
 public:
  explicit OverlayHistory(unsigned seed) : random_(seed) {
    fill(real_.path());
    fill(below_.path());
    before_ = listing(below_.path());
  }

  void run(std::size_t steps) {
    DeviceFileSystem real(DeviceRoot::open(real_.path(), false, nullptr), false);
    DeviceFileSystem below(DeviceRoot::open(below_.path(), false, nullptr), true);
    OverlayFileSystem overlay(below);
    for (std::size_t step = 0; step < steps; ++step) {
      const unsigned operation = random_() % 8;
      const std::string path = somePath();
      const std::string text(random_() % 4, 'x');
      const std::string what = std::to_string(step) + ": " + std::to_string(operation) + " " + path;
      ASSERT_EQ(perform(real, operation, path, text), perform(overlay, operation, path, text))
          << what;
      ASSERT_EQ(walk(real), walk(overlay)) << what;
    }
    EXPECT_EQ(listing(below_.path()), before_);
  }

 private:
  std::string somePath() {
    static const std::vector<std::string> kNames = {"d", "sub", "old", "deep", "empty", "n"};
    std::string path = "/d";
    for (unsigned depth = random_() % 4; depth > 0; --depth) {
      path += "/" + kNames[random_() % kNames.size()];
    }
    return path;
  }
  static std::string answer(bool done, const ErrorPtr& error) {
    return done ? "done" : "error " + std::to_string(error ? error->code() : -1);
  }
  static std::string perform(FileSystem& files, unsigned operation, const std::string& path,
                             const std::string& text) {
    ErrorPtr error;
    if (operation < 2) {
      const bool done = files.removeItem(path, &error);
      return answer(done, error);
    }
    if (operation < 5) {
      const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
      const bool done = files.writeFileAtomically(path, {bytes, text.size()}, &error);
      return answer(done, error);
    }
    if (operation < 6) {
      const bool done = files.createDirectoryWithIntermediates(path, &error);
      return answer(done, error);
    }
    const DataPtr data = files.readFile(path, &error);
    return answer(data != nullptr, error) + (data ? std::to_string(data->length()) : "");
  }
  static std::string walk(FileSystem& files) {
    std::string seen;
    files.enumerate(
        "/d",
        [&](const FileProperties& entry) {
          seen +=
              entry.path + (entry.isDirectory ? "/" : " " + std::to_string(entry.fileSize)) + "\n";
          return EnumerationChoice::kDescend;
        },
        [&](const std::string& path, const ErrorPtr& error) {
          seen += path + answer(false, error);
        });
    return seen;
  }

  std::mt19937 random_;
  TemporaryDirectory real_, below_;
  std::string before_;
};

TEST(OverlayFileSystemTest, AnswersAsRealFilesOverRandomHistories) {
  const unsigned base = std::random_device{}();
  for (unsigned seed = base; seed < base + 20; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    OverlayHistory(seed).run(120);
    if (::testing::Test::HasFatalFailure()) return;
  }
}

}  // namespace
}  // namespace kx
