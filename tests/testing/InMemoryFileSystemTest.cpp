#include "testing/InMemoryFileSystem.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "testing/FaultyFileSystem.h"

namespace kx {
namespace {

using Texts = std::vector<std::string>;

TEST(InMemoryFileSystemTest, ReadsWhatWasWritten) {
  InMemoryFileSystem files;
  ErrorPtr error;
  EXPECT_EQ(files.readFile("/a/b", &error), nullptr);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code(), ENOENT);
  EXPECT_EQ(error->domain(), kPosixErrorDomain);
  files.putText("/a/b", "text");
  EXPECT_EQ(files.text("/a/b"), "text");
  EXPECT_TRUE(files.fileExists("/a/b"));
  EXPECT_TRUE(files.fileExists("/a"));
  EXPECT_EQ(files.files("/a"), (Texts{"/a/b"}));
}

TEST(InMemoryFileSystemTest, WritingTheSameBytesIsNoWrite) {
  InMemoryFileSystem files;
  files.putText("/a", "text");
  files.putText("/a", "text");
  EXPECT_EQ(files.writes(), 1U);
  files.putText("/a", "other");
  EXPECT_EQ(files.writes(), 2U);
}

TEST(InMemoryFileSystemTest, RemovesFilesAndEmptyDirectories) {
  InMemoryFileSystem files;
  ErrorPtr error;
  EXPECT_FALSE(files.removeItem("/d", &error));
  EXPECT_EQ(error->code(), ENOENT);
  files.putText("/d/f", "");
  EXPECT_FALSE(files.removeItem("/d", &error));
  EXPECT_EQ(error->code(), ENOTEMPTY);
  EXPECT_TRUE(files.removeItem("/d/f", nullptr));
  EXPECT_TRUE(files.fileExists("/d"));
  EXPECT_TRUE(files.removeItem("/d", nullptr));
  EXPECT_FALSE(files.fileExists("/d"));
}

TEST(InMemoryFileSystemTest, WalksParentsBeforeChildrenAndPrunes) {
  InMemoryFileSystem files;
  files.setDirectorySize(7);
  for (const char* path : {"/r/a/1", "/r/b/2", "/r/c"}) files.putSize(path, 3);
  Texts seen;
  std::int64_t bytes = 0;
  const auto walk = [&](const FileProperties& entry) {
    seen.push_back(entry.path);
    bytes += entry.fileSize;
    EXPECT_EQ(entry.parentResourceIdentifier, files.resourceIdentifier(entry.parentPath));
    return entry.name == "b" ? EnumerationChoice::kSkipDescendants : EnumerationChoice::kDescend;
  };
  Texts failed;
  const auto onError = [&](const std::string& path, const ErrorPtr&) { failed.push_back(path); };
  files.enumerate("/r", walk, onError);
  EXPECT_EQ(seen, (Texts{"/r/a", "/r/a/1", "/r/b", "/r/c"}));
  EXPECT_EQ(bytes, 7 + 3 + 7 + 3);
  files.enumerate("/none", walk, onError);
  EXPECT_EQ(failed, (Texts{"/none"}));
}

TEST(InMemoryFileSystemTest, LocksSayWhoHoldsThem) {
  InMemoryFileSystem files;
  EXPECT_EQ(files.tryLock("/l").outcome, FileSystem::LockOutcome::kNoFile);
  files.putText("/l", "");
  EXPECT_EQ(files.tryLock("/l").outcome, FileSystem::LockOutcome::kTaken);
  EXPECT_NE(files.tryLock("/l").lock, nullptr);
  files.setLockedElsewhere("/l", true);
  EXPECT_EQ(files.tryLock("/l").outcome, FileSystem::LockOutcome::kHeldElsewhere);
}

TEST(FaultyFileSystemTest, FailsWhatItIsToldTo) {
  InMemoryFileSystem files;
  FaultyFileSystem faulty(files);
  files.putText("/a", "text");
  const ErrorPtr fault = Error::make(kPosixErrorDomain, EACCES);
  faulty.setFault([&](std::string_view operation, const std::string& path) {
    return operation == "removeItem" && path == "/a" ? fault : nullptr;
  });
  ErrorPtr error;
  EXPECT_FALSE(faulty.removeItem("/a", &error));
  EXPECT_EQ(error, fault);
  EXPECT_NE(faulty.readFile("/a", nullptr), nullptr);
  faulty.setFault([](std::string_view, const std::string&) { return Error::make("", 0); });
  error = nullptr;
  EXPECT_FALSE(faulty.removeItem("/a", &error));
  EXPECT_EQ(error, nullptr);
}

}  // namespace
}  // namespace kx
