#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <set>

#include "host/HostLibrary.h"
#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

using namespace test;

std::set<std::string> namesIn(const std::string& path) {
  std::set<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(path))
    names.insert(entry.path().filename().string());
  return names;
}

std::string contentOf(const HostLibrary& library, std::string_view uuid) {
  const auto media = library.openMedia(uuid, nullptr);
  if (!media) return "(none)";
  std::string bytes(static_cast<std::size_t>(media->sizeBytes), '\0');
  EXPECT_EQ(::read(media->file.get(), bytes.data(), bytes.size()), media->sizeBytes);
  return bytes;
}

std::string snapshotOf(const HostLibrary& library) {
  const DataPtr data = library.snapshotBytes();
  return std::string(reinterpret_cast<const char*>(data->bytes()), data->length());
}

std::int64_t writeErrorCode(const HostLibrary& library, const std::string& path,
                            const HostOptions& options = {}) {
  ErrorPtr error;
  if (writeHostBundle(library, path, options, nullptr, &error)) return 0;
  EXPECT_EQ(error->domain(), kHostErrorDomain);
  return error->code();
}

class HostBundle : public ::testing::Test {
 protected:
  HostBundle() {
    photos_.write("a.jpg", jpeg(10, 10, "first"));
    photos_.write("Trip/b.jpg", jpeg(10, 10, "second"));
    photos_.write("film.mov", std::string("\0\0\0\x08wide", 8) + "film");
  }

  TemporaryFolder photos_;
  TemporaryFolder target_;
};

TEST_F(HostBundle, WrittenAndReadAgainIsTheSame) {
  const auto folder = openHost(photos_.path());
  const std::string path = target_.at("bundle");
  ASSERT_EQ(writeErrorCode(*folder, path), 0);
  EXPECT_EQ(namesIn(target_.path()), std::set<std::string>{"bundle"});
  EXPECT_EQ(namesIn(path), (std::set<std::string>{"PhotoLibrary.plist", "media"}));

  const auto bundle = openHost(path);
  EXPECT_EQ(bundle->form(), HostLibrary::Form::kBundle);
  EXPECT_EQ(snapshotOf(*bundle), snapshotOf(*folder));
  EXPECT_EQ(bundle->libraryUUID(), folder->libraryUUID());
  EXPECT_EQ(bundle->libraryKind(), "Folder");
  const auto names = folder->mediaNames();
  ASSERT_EQ(names.size(), 3U);
  ASSERT_EQ(bundle->mediaNames().size(), 3U);
  for (std::size_t i = 0; i < names.size(); ++i) {
    EXPECT_EQ(bundle->mediaNames()[i].uuid, names[i].uuid);
    EXPECT_EQ(bundle->mediaNames()[i].bundleName, names[i].bundleName);
    EXPECT_EQ(contentOf(*bundle, names[i].uuid), contentOf(*folder, names[i].uuid));
    EXPECT_EQ(bundle->mediaSize(names[i].uuid), folder->mediaSize(names[i].uuid));
    const auto media = bundle->openMedia(names[i].uuid, nullptr);
    ASSERT_TRUE(media.has_value());
    EXPECT_EQ(media->path, "media/" + names[i].bundleName);
    EXPECT_EQ(media->modifiedSeconds, 1'704'164'645);
  }
}

TEST_F(HostBundle, ExtensionsComeFromTheContent) {
  photos_.remove("a.jpg");
  photos_.write("a.png", jpeg(10, 10, "first"));
  const auto folder = openHost(photos_.path());
  std::multiset<std::string> extensions;
  for (const auto& name : folder->mediaNames())
    extensions.insert(name.bundleName.substr(name.uuid.size()));
  EXPECT_EQ(extensions, (std::multiset<std::string>{".jpg", ".jpg", ".mov"}));
}

TEST_F(HostBundle, AFileIsFoundByItsExactNameElseTheFirstByBytes) {
  target_.write("PhotoLibrary.plist", "x");
  target_.write("media/A", "exact");
  target_.write("media/A.JPG", "not this");
  target_.write("media/B.jpg", "second by bytes");
  target_.write("media/B.JPG", "first by bytes");
  target_.write("media/BB.JPG", "another asset");
  target_.write("media/C-1.jpg", "another asset");
  const auto bundle = openHost(target_.path());
  EXPECT_EQ(contentOf(*bundle, "A"), "exact");
  EXPECT_EQ(contentOf(*bundle, "B"), "first by bytes");
  EXPECT_EQ(contentOf(*bundle, "C"), "(none)");
  EXPECT_EQ(contentOf(*bundle, "b"), "(none)");
  EXPECT_EQ(bundle->mediaSize("B"), 14);
  EXPECT_FALSE(bundle->mediaSize("C").has_value());
  std::string names;
  for (const auto& name : bundle->mediaNames()) names += name.bundleName + " ";
  EXPECT_EQ(names, "A B.JPG BB.JPG C-1.jpg ");
}

// However much their beginnings are alike.
TEST_F(HostBundle, NamesAreSortedByBytes) {
  target_.write("PhotoLibrary.plist", "x");
  const std::vector<std::string> names = {
      "A",           "A-1.JPG",        "IMG_2020",    "IMG_2020-1",      "IMG_2020.A",
      "IMG_2020_10", "IMG_2020_9.JPG", "IMG_202\x7f", "IMG_202\xc3\xa9", "\xc3\xa9"};
  for (auto name = names.rbegin(); name != names.rend(); ++name)
    target_.write("media/" + *name, "");
  const auto bundle = openHost(target_.path());
  std::vector<std::string> listed;
  for (const auto& name : bundle->mediaNames()) listed.push_back(name.bundleName);
  std::vector<std::string> expected = names;
  std::erase(expected, "IMG_2020.A");  // the asset has a file of its exact name
  EXPECT_EQ(listed, expected);
  for (const std::string& name : expected) {
    EXPECT_TRUE(bundle->mediaSize(name.substr(0, name.find('.'))).has_value()) << name;
  }
}

TEST_F(HostBundle, IdentifiersNeverLeadOutOfMedia) {
  target_.write("PhotoLibrary.plist", "x");
  target_.write("media/A", "a");
  target_.write("media/sub/B", "b");
  ASSERT_EQ(::symlink("A", target_.at("media/link").c_str()), 0);
  const auto bundle = openHost(target_.path());
  for (const std::string& uuid :
       {std::string("../PhotoLibrary"), std::string("../PhotoLibrary.plist"), std::string("."),
        std::string(".."), std::string(""), std::string("sub/B"), std::string("A\0", 2),
        std::string(5000, 'A'), target_.at("media/A"), std::string("A\n")}) {
    ErrorPtr error;
    EXPECT_FALSE(bundle->openMedia(uuid, &error).has_value());
    EXPECT_EQ(error->code(), ENOENT) << uuid.substr(0, 40);
    EXPECT_FALSE(bundle->mediaSize(uuid).has_value());
  }
  ErrorPtr error;
  EXPECT_FALSE(bundle->openMedia("link", &error).has_value());
  EXPECT_EQ(error->code(), ELOOP);
  EXPECT_FALSE(bundle->openMedia("sub", &error).has_value());
  EXPECT_EQ(error->code(), EINVAL);
}

// A sync takes the snapshot and goes on to ask for files.
TEST_F(HostBundle, WithoutTheSnapshotThatWasTakenItStillGivesItsFiles) {
  const auto folder = openHost(photos_.path());
  const std::string path = target_.at("bundle");
  ASSERT_EQ(writeErrorCode(*folder, path), 0);
  for (const auto& library : {openHost(path), openHost(photos_.path())}) {
    const std::string before = snapshotOf(*library);
    const DataPtr taken = library->takeSnapshotBytes();
    ASSERT_NE(taken, nullptr);
    EXPECT_EQ(std::string(taken->span().begin(), taken->span().end()), before);
    EXPECT_EQ(library->snapshotBytes(), nullptr);
    library->expectMedia();
    library->expectMedia();
    const auto names = folder->mediaNames();
    ASSERT_EQ(library->mediaNames().size(), names.size());
    EXPECT_EQ(contentOf(*library, names[0].uuid), contentOf(*folder, names[0].uuid));
  }
  const auto bundle = openHost(path);
  bundle->takeSnapshotBytes();
  EXPECT_EQ(bundle->libraryUUID(), "");
}

TEST_F(HostBundle, ASnapshotThatCannotBeReadIsAnError) {
  target_.makeFolder("media");
  target_.makeFolder("PhotoLibrary.plist");
  EXPECT_EQ(openingErrorCode(target_.path()), static_cast<int>(HostError::kUnreadable));
  target_.remove("PhotoLibrary.plist");
  ASSERT_EQ(::symlink("/etc/passwd", target_.at("PhotoLibrary.plist").c_str()), 0);
  EXPECT_EQ(openingErrorCode(target_.path()), static_cast<int>(HostError::kUnreadable));
}

TEST_F(HostBundle, BytesThatAreNoPropertyListAreHandedOnAsTheyAre) {
  target_.write("PhotoLibrary.plist", "no property list");
  target_.makeFolder("media");
  const auto bundle = openHost(target_.path());
  EXPECT_EQ(snapshotOf(*bundle), "no property list");
  EXPECT_EQ(bundle->libraryUUID(), "");
}

TEST_F(HostBundle, AFolderWithOnlyOneOfTheTwoIsAFolder) {
  photos_.write("PhotoLibrary.plist", "x");
  EXPECT_EQ(openHost(photos_.path())->form(), HostLibrary::Form::kFolder);
  photos_.makeFolder("media");
  EXPECT_EQ(openHost(photos_.path())->form(), HostLibrary::Form::kBundle);
}

TEST_F(HostBundle, ReplacesABundleOrAnEmptyFolderAndNothingElse) {
  const auto folder = openHost(photos_.path());
  target_.makeFolder("empty");
  EXPECT_EQ(writeErrorCode(*folder, target_.at("empty")), 0);
  photos_.remove("film.mov");
  const auto smaller = openHost(photos_.path());
  EXPECT_EQ(writeErrorCode(*smaller, target_.at("empty/")), 0);
  EXPECT_EQ(openHost(target_.at("empty"))->mediaNames().size(), 2U);

  target_.write("foreign/thesis.txt", "precious");
  EXPECT_EQ(writeErrorCode(*folder, target_.at("foreign")),
            static_cast<int>(HostError::kNotABundle));
  EXPECT_EQ(readFile(target_.at("foreign/thesis.txt")), "precious");
  target_.write("empty/thesis.txt", "precious");
  EXPECT_EQ(writeErrorCode(*folder, target_.at("empty")), static_cast<int>(HostError::kNotABundle));
  EXPECT_EQ(readFile(target_.at("empty/thesis.txt")), "precious");
  target_.write("file", "precious");
  EXPECT_EQ(writeErrorCode(*folder, target_.at("file")), static_cast<int>(HostError::kNotABundle));
  EXPECT_EQ(namesIn(target_.path()), (std::set<std::string>{"empty", "file", "foreign"}));
}

TEST_F(HostBundle, IsNotWrittenIntoItsOwnLibrary) {
  const auto folder = openHost(photos_.path());
  for (const std::string& path : {photos_.at("bundle"), photos_.at("Trip/bundle"), photos_.path(),
                                  std::string("/"), std::string("")})
    EXPECT_EQ(writeErrorCode(*folder, path), static_cast<int>(HostError::kUsage)) << path;
  EXPECT_EQ(writeErrorCode(*folder, target_.at("none/bundle")),
            static_cast<int>(HostError::kWrite));
}

TEST_F(HostBundle, FilesThatVanishedAreLeftOutAndListed) {
  const auto folder = openHost(photos_.path());
  photos_.remove("a.jpg");
  std::vector<HostProblem> problems;
  ASSERT_TRUE(writeHostBundle(*folder, target_.at("bundle"), {}, &problems, nullptr));
  ASSERT_EQ(problems.size(), 1U);
  EXPECT_NE(problems[0].text.find("No such file"), std::string::npos);
  EXPECT_EQ(openHost(target_.at("bundle"))->mediaNames().size(), 2U);
}

TEST_F(HostBundle, CancellingLeavesNothingBehind) {
  const auto folder = openHost(photos_.path());
  HostOptions options;
  options.progress = [](const HostProgress& progress) { return progress.filesDone < 2; };
  EXPECT_EQ(writeErrorCode(*folder, target_.at("bundle"), options),
            static_cast<int>(HostError::kCancelled));
  EXPECT_TRUE(namesIn(target_.path()).empty());
}

TEST_F(HostBundle, ABundleCanBeCopiedToo) {
  ASSERT_EQ(writeErrorCode(*openHost(photos_.path()), target_.at("one")), 0);
  const auto one = openHost(target_.at("one"));
  ASSERT_EQ(writeErrorCode(*one, target_.at("two")), 0);
  const auto two = openHost(target_.at("two"));
  EXPECT_EQ(snapshotOf(*two), snapshotOf(*one));
  EXPECT_EQ(two->mediaNames().size(), one->mediaNames().size());
}

}  // namespace
}  // namespace kx
