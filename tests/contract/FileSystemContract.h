#pragma once

#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/files/FileSystem.h"

// What every file system of a device must do, whatever it is made of. A test program includes this
// header once, provides a ContractFiles and instantiates the suite:
//
//   INSTANTIATE_TEST_SUITE_P(Real, FileSystemContract, ::testing::Values(&makeMyFiles));
namespace kx {

// A fresh device that holds "/d/old" ("old text"), "/d/sub/deep" ("deep text") and the empty
// directory "/d/empty", and nothing else below "/d"; "/link" is a symbolic link to "/d".
class ContractFiles {
 public:
  virtual ~ContractFiles() = default;
  virtual FileSystem& files() = 0;
};

using ContractFilesMaker = std::function<std::unique_ptr<ContractFiles>()>;

class FileSystemContract : public ::testing::TestWithParam<ContractFilesMaker> {
 protected:
  using Texts = std::vector<std::string>;

  void SetUp() override { made_ = GetParam()(); }

  FileSystem& files() { return made_->files(); }
  // 0, or the code of the error; fails when there is an error without one of its domain.
  static int codeOf(bool done, const ErrorPtr& error) {
    if (done) {
      EXPECT_EQ(error, nullptr);
      return 0;
    }
    EXPECT_NE(error, nullptr);
    if (!error) return -1;
    EXPECT_EQ(error->domain(), kPosixErrorDomain);
    return static_cast<int>(error->code());
  }
  int write(const std::string& path, std::string_view text) {
    ErrorPtr error;
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    const bool done = files().writeFileAtomically(path, {bytes, text.size()}, &error);
    return codeOf(done, error);
  }
  int remove(const std::string& path) {
    ErrorPtr error;
    const bool done = files().removeItem(path, &error);
    return codeOf(done, error);
  }
  int make(const std::string& path) {
    ErrorPtr error;
    const bool done = files().createDirectoryWithIntermediates(path, &error);
    return codeOf(done, error);
  }
  // The text, or "error N".
  std::string read(const std::string& path) {
    ErrorPtr error;
    const DataPtr data = files().readFile(path, &error);
    if (!data) return "error " + std::to_string(codeOf(false, error));
    return {reinterpret_cast<const char*>(data->bytes()), data->length()};
  }
  Texts list(const std::string& path) {
    ErrorPtr error;
    Texts names = files().contentsOfDirectory(path, &error);
    if (!error) return names;
    EXPECT_TRUE(names.empty());
    return {"error " + std::to_string(codeOf(false, error))};
  }
  // "path size" of files, "path/" of directories, in the order of the walk.
  Texts walk(const std::string& path, const std::string& pruned = "") {
    Texts seen;
    files().enumerate(
        path,
        [&](const FileProperties& entry) {
          EXPECT_EQ(entry.error, nullptr);
          EXPECT_EQ(entry.path, entry.parentPath + "/" + entry.name);
          EXPECT_EQ(entry.parentResourceIdentifier, files().resourceIdentifier(entry.parentPath));
          seen.push_back(entry.path +
                         (entry.isDirectory ? "/" : " " + std::to_string(entry.fileSize)));
          return entry.path == pruned ? EnumerationChoice::kSkipDescendants
                                      : EnumerationChoice::kDescend;
        },
        [&](const std::string& where, const ErrorPtr& error) {
          seen.push_back(where + " error " + std::to_string(codeOf(false, error)));
        });
    return seen;
  }

 private:
  std::unique_ptr<ContractFiles> made_;
};

TEST_P(FileSystemContract, HoldsExactlyTheBytesThatAreThere) {
  const auto holds = [this](const std::string& path, const std::string& text) {
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    return files().fileHolds(path, {bytes, text.size()});
  };
  EXPECT_TRUE(holds("/d/old", "old text"));
  EXPECT_FALSE(holds("/d/old", "old tex"));
  EXPECT_FALSE(holds("/d/old", "old text "));
  EXPECT_FALSE(holds("/d/old", "old texT"));
  EXPECT_FALSE(holds("/d/none", ""));
  EXPECT_FALSE(holds("/d/sub", ""));
  EXPECT_FALSE(holds("/link/old", "old text"));
  std::string large(1000003, 'x');
  EXPECT_EQ(write("/d/large", large), 0);
  EXPECT_TRUE(holds("/d/large", large));
  large.back() = 'y';
  EXPECT_FALSE(holds("/d/large", large));
  EXPECT_EQ(write("/d/old", ""), 0);
  EXPECT_TRUE(holds("/d/old", ""));
  EXPECT_EQ(remove("/d/old"), 0);
  EXPECT_FALSE(holds("/d/old", ""));
}

TEST_P(FileSystemContract, WritesDataObjects) {
  const auto put = [this](const std::string& path, const std::string& text) {
    const auto data = std::make_shared<const Data>(text.data(), text.size());
    ErrorPtr error;
    return codeOf(files().writeDataAtomically(path, data, &error), error);
  };
  std::string large(2'000'003, 'x');
  EXPECT_EQ(put("/d/large", large), 0);
  const DataPtr first = files().readFile("/d/large", nullptr);
  EXPECT_EQ(read("/d/large"), large);
  large.back() = 'y';
  EXPECT_EQ(put("/d/large", large), 0);
  EXPECT_EQ(read("/d/large"), large);
  large.front() = 'z';
  EXPECT_EQ(write("/d/large", large), 0);
  EXPECT_EQ(read("/d/large"), large);
  EXPECT_EQ(first->bytes()[first->length() - 1], 'x');
  EXPECT_EQ(remove("/d/large"), 0);
  EXPECT_EQ(read("/d/large"), "error " + std::to_string(ENOENT));
  EXPECT_EQ(put("/d/sub", "text"), EISDIR);
  EXPECT_EQ(put("/none/file", "text"), ENOENT);
}

TEST_P(FileSystemContract, APreparedFileIsThereWhenItIsPutInPlace) {
  const std::string text = "prepared";
  const auto data = std::make_shared<const Data>(text.data(), text.size());
  const auto put = [](FileSystem::PreparedFile& file) {
    ErrorPtr error;
    return codeOf(file.putInPlace(&error), error);
  };
  { const auto dropped = files().prepareFile("/d/old", data); }
  EXPECT_EQ(read("/d/old"), "old text");
  EXPECT_EQ(list("/d"), (Texts{"empty", "old", "sub"}));
  {
    const auto replacing = files().prepareFile("/d/old", data);
    const auto fresh = files().prepareFile("/d/new", data);
    EXPECT_EQ(read("/d/old"), "old text");
    EXPECT_FALSE(files().fileExists("/d/new"));
    EXPECT_EQ(put(*replacing), 0);
    EXPECT_EQ(put(*fresh), 0);
  }
  EXPECT_EQ(read("/d/old"), text);
  EXPECT_EQ(read("/d/new"), text);
  EXPECT_EQ(list("/d"), (Texts{"empty", "new", "old", "sub"}));
  EXPECT_EQ(put(*files().prepareFile("/none/file", data)), ENOENT);
  EXPECT_EQ(put(*files().prepareFile("/d/sub", data)), EISDIR);
  EXPECT_EQ(list("/d"), (Texts{"empty", "new", "old", "sub"}));
}

TEST_P(FileSystemContract, ReadsWhatIsThere) {
  EXPECT_EQ(read("/d/old"), "old text");
  EXPECT_EQ(read("/d/none"), "error " + std::to_string(ENOENT));
  EXPECT_EQ(read("/d/sub"), "error " + std::to_string(EISDIR));
  EXPECT_EQ(read("/d/old/x"), "error " + std::to_string(ENOTDIR));
  EXPECT_TRUE(files().fileExists("/d"));
  EXPECT_TRUE(files().fileExists("/d/old"));
  EXPECT_FALSE(files().fileExists("/d/none"));
  EXPECT_EQ(list("/d"), (Texts{"empty", "old", "sub"}));
  EXPECT_EQ(list("/d/empty"), Texts{});
  EXPECT_EQ(list("/d/none"), Texts{"error " + std::to_string(ENOENT)});
  EXPECT_EQ(list("/d/old"), Texts{"error " + std::to_string(ENOTDIR)});
}

TEST_P(FileSystemContract, WritesNewFilesAndReplacesOldOnes) {
  EXPECT_EQ(write("/d/new", "new text"), 0);
  EXPECT_EQ(read("/d/new"), "new text");
  EXPECT_EQ(write("/d/old", ""), 0);
  EXPECT_EQ(read("/d/old"), "");
  EXPECT_EQ(write("/d/old", "third"), 0);
  EXPECT_EQ(write("/d/old", "third"), 0);
  EXPECT_EQ(read("/d/old"), "third");
  EXPECT_EQ(list("/d"), (Texts{"empty", "new", "old", "sub"}));
}

TEST_P(FileSystemContract, WritesOnlyIntoDirectories) {
  EXPECT_EQ(write("/d/none/x", "x"), ENOENT);
  EXPECT_EQ(write("/d/old/x", "x"), ENOTDIR);
  EXPECT_EQ(write("/d/sub", "x"), EISDIR);
  EXPECT_EQ(list("/d"), (Texts{"empty", "old", "sub"}));
}

TEST_P(FileSystemContract, RemovesFilesAndEmptyDirectories) {
  EXPECT_EQ(remove("/d/none"), ENOENT);
  EXPECT_EQ(remove("/d/sub"), ENOTEMPTY);
  EXPECT_EQ(remove("/d/sub/deep"), 0);
  EXPECT_EQ(remove("/d/sub/deep"), ENOENT);
  EXPECT_EQ(remove("/d/sub"), 0);
  EXPECT_FALSE(files().fileExists("/d/sub"));
  EXPECT_FALSE(files().fileExists("/d/sub/deep"));
  EXPECT_EQ(read("/d/sub/deep"), "error " + std::to_string(ENOENT));
  EXPECT_EQ(write("/d/sub/deep", "x"), ENOENT);
  EXPECT_EQ(remove("/d/empty"), 0);
  EXPECT_EQ(list("/d"), Texts{"old"});
}

TEST_P(FileSystemContract, WhatWasRemovedCanBeMadeAnew) {
  EXPECT_EQ(remove("/d/old"), 0);
  EXPECT_EQ(write("/d/old", "again"), 0);
  EXPECT_EQ(read("/d/old"), "again");
  EXPECT_EQ(remove("/d/sub/deep"), 0);
  EXPECT_EQ(remove("/d/sub"), 0);
  EXPECT_EQ(write("/d/sub", "a file now"), 0);
  EXPECT_EQ(read("/d/sub"), "a file now");
  EXPECT_EQ(make("/d/sub/x"), ENOTDIR);
  EXPECT_EQ(remove("/d/sub"), 0);
  EXPECT_EQ(make("/d/sub"), 0);
  EXPECT_EQ(list("/d/sub"), Texts{});
}

TEST_P(FileSystemContract, MakesDirectoriesWithThoseOnTheWay) {
  EXPECT_EQ(make("/d/a/b/c"), 0);
  EXPECT_EQ(make("/d/a/b"), 0);
  EXPECT_EQ(make("/d"), 0);
  EXPECT_EQ(make("/d/old"), ENOTDIR);
  EXPECT_EQ(make("/d/old/x"), ENOTDIR);
  EXPECT_EQ(write("/d/a/b/c/f", "f"), 0);
  EXPECT_EQ(remove("/d/a/b/c"), ENOTEMPTY);
  EXPECT_EQ(list("/d/a/b"), Texts{"c"});
}

TEST_P(FileSystemContract, WalksParentsFirstInTheOrderOfNames) {
  EXPECT_EQ(write("/d/new", "123"), 0);
  EXPECT_EQ(make("/d/a"), 0);
  EXPECT_EQ(write("/d/a/f", "1"), 0);
  EXPECT_EQ(write("/d/sub/more", "12"), 0);
  EXPECT_EQ(remove("/d/old"), 0);
  EXPECT_EQ(walk("/d"), (Texts{"/d/a/", "/d/a/f 1", "/d/empty/", "/d/new 3", "/d/sub/",
                               "/d/sub/deep 9", "/d/sub/more 2"}));
  EXPECT_EQ(walk("/d", "/d/sub"), (Texts{"/d/a/", "/d/a/f 1", "/d/empty/", "/d/new 3", "/d/sub/"}));
  EXPECT_EQ(walk("/d/none"), Texts{"/d/none error " + std::to_string(ENOENT)});
  EXPECT_EQ(walk("/d/new"), Texts{"/d/new error " + std::to_string(ENOTDIR)});
}

TEST_P(FileSystemContract, AHandlerMayChangeWhatItWalks) {
  Texts seen;
  files().enumerate(
      "/d",
      [&](const FileProperties& entry) {
        seen.push_back(entry.path);
        if (entry.name == "empty") {
          EXPECT_EQ(write("/d/sub/late", "x"), 0);
        }
        return EnumerationChoice::kDescend;
      },
      [](const std::string&, const ErrorPtr&) {});
  EXPECT_EQ(seen, (Texts{"/d/empty", "/d/old", "/d/sub", "/d/sub/deep", "/d/sub/late"}));
}

TEST_P(FileSystemContract, IdentifiersTellFilesApart) {
  EXPECT_EQ(write("/d/new", "x"), 0);
  Texts all;
  for (const char* path : {"/d", "/d/old", "/d/new", "/d/sub", "/d/sub/deep"}) {
    const std::string identifier = files().resourceIdentifier(path);
    EXPECT_FALSE(identifier.empty()) << path;
    EXPECT_EQ(files().resourceIdentifier(path), identifier);
    EXPECT_EQ(std::count(all.begin(), all.end(), identifier), 0) << path;
    all.push_back(identifier);
  }
  EXPECT_EQ(files().resourceIdentifier("/d/none"), "");
  EXPECT_EQ(remove("/d/old"), 0);
  EXPECT_EQ(files().resourceIdentifier("/d/old"), "");
}

TEST_P(FileSystemContract, SaysTheBlockSizeOfWhatIsThere) {
  EXPECT_EQ(write("/d/new", "x"), 0);
  ErrorPtr error;
  const std::uint32_t size = files().blockSize("/d", &error);
  EXPECT_EQ(error, nullptr);
  EXPECT_GE(size, 512U);
  EXPECT_EQ(files().blockSize("/d/new", &error), size);
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(remove("/d/new"), 0);
  EXPECT_EQ(files().blockSize("/d/new", &error), 0U);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), ENOENT);
}

TEST_P(FileSystemContract, LocksAreHeldOnceEach) {
  EXPECT_EQ(write("/d/new", "x"), 0);
  for (const char* path : {"/d/old", "/d/new"}) {
    FileSystem::LockAttempt first = files().tryLock(path);
    EXPECT_EQ(first.outcome, FileSystem::LockOutcome::kTaken) << path;
    EXPECT_EQ(files().tryLock(path).outcome, FileSystem::LockOutcome::kHeldElsewhere) << path;
    first.lock.reset();
    EXPECT_EQ(files().tryLock(path).outcome, FileSystem::LockOutcome::kTaken) << path;
  }
  EXPECT_EQ(files().tryLock("/d/none").outcome, FileSystem::LockOutcome::kNoFile);
  EXPECT_EQ(remove("/d/old"), 0);
  EXPECT_EQ(files().tryLock("/d/old").outcome, FileSystem::LockOutcome::kNoFile);
}

TEST_P(FileSystemContract, RefusesWhatIsNoPath) {
  for (const char* path : {"", "d/old", "/d/../d/old", "/d//old", "/d/./old", "/d/old/"}) {
    EXPECT_FALSE(files().fileExists(path)) << path;
    EXPECT_EQ(read(path), "error " + std::to_string(EINVAL)) << path;
    EXPECT_EQ(write(path, "x"), EINVAL) << path;
    EXPECT_EQ(remove(path), EINVAL) << path;
    EXPECT_EQ(make(path), EINVAL) << path;
    EXPECT_EQ(list(path), Texts{"error " + std::to_string(EINVAL)}) << path;
  }
  EXPECT_EQ(write("/", "x"), EINVAL);
  EXPECT_EQ(remove("/"), EINVAL);
  EXPECT_EQ(read("/d/old"), "old text");
}

TEST_P(FileSystemContract, FollowsNoLink) {
  EXPECT_TRUE(files().fileExists("/link"));
  EXPECT_NE(read("/link/old"), "old text");
  EXPECT_EQ(read("/link/old").substr(0, 5), "error");
  EXPECT_NE(write("/link/new", "x"), 0);
  EXPECT_NE(remove("/link/old"), 0);
  EXPECT_NE(make("/link/sub"), 0);
  EXPECT_EQ(list("/d"), (Texts{"empty", "old", "sub"}));
  // The link itself is an entry like others.
  EXPECT_EQ(remove("/link"), 0);
  EXPECT_FALSE(files().fileExists("/link"));
  EXPECT_EQ(read("/d/old"), "old text");
}

}  // namespace kx
