#include "daemon/LibrarySwitch.h"

#include <gtest/gtest.h>

#include "platform/foundation/PropertyList.h"
#include "testing/InMemoryFileSystem.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

class LibrarySwitchTest : public testing::Test {
 protected:
  void setCurrent(const std::string& uuid) {
    const DataPtr bytes =
        plistBytes(Value::dictionary(Dictionary{{"libraryUUID", Value::string(uuid)}}));
    files.writeFileAtomically(kKXCurrentLibraryUUIDPath, bytes->span(), nullptr);
  }
  std::string current() {
    const Value uuid = readDevicePropertyList(files, kKXCurrentLibraryUUIDPath)["libraryUUID"];
    return uuid.isString() ? std::string(uuid.stringValue()) : "none";
  }

  InMemoryFileSystem files;
};

TEST_F(LibrarySwitchTest, PutsTheOldNameBackInALaterRun) {
  setCurrent("old");
  EXPECT_FALSE(LibrarySwitch(files).begin("new"));
  setCurrent("new");
  EXPECT_FALSE(LibrarySwitch(files).rollBack());
  EXPECT_EQ(current(), "old");
  EXPECT_FALSE(files.fileExists(kLibraryMarkerPath));
}

TEST_F(LibrarySwitchTest, PutsTheAbsenceOfANameBack) {
  EXPECT_FALSE(LibrarySwitch(files).begin("new"));
  setCurrent("new");
  EXPECT_FALSE(LibrarySwitch(files).rollBack());
  EXPECT_FALSE(files.fileExists(kKXCurrentLibraryUUIDPath));
  EXPECT_FALSE(files.fileExists(kLibraryMarkerPath));
}

TEST_F(LibrarySwitchTest, CommitKeepsTheNewName) {
  setCurrent("old");
  LibrarySwitch change(files);
  EXPECT_FALSE(change.begin("new"));
  setCurrent("new");
  EXPECT_FALSE(change.commit());
  EXPECT_FALSE(change.rollBack());
  EXPECT_EQ(current(), "new");
}

TEST_F(LibrarySwitchTest, WritesNothingForTheSameLibrary) {
  setCurrent("same");
  const std::size_t writes = files.writes();
  LibrarySwitch change(files);
  EXPECT_FALSE(change.begin("same"));
  EXPECT_FALSE(change.commit());
  EXPECT_EQ(files.writes(), writes);
}

TEST_F(LibrarySwitchTest, KeepsAnOldFileThatIsNoPropertyListByteForByte) {
  files.putText(kKXCurrentLibraryUUIDPath, "junk");
  EXPECT_FALSE(LibrarySwitch(files).begin("new"));
  setCurrent("new");
  EXPECT_FALSE(LibrarySwitch(files).rollBack());
  EXPECT_EQ(files.text(kKXCurrentLibraryUUIDPath), "junk");
}

TEST_F(LibrarySwitchTest, DropsAMarkerThatCannotBeRead) {
  setCurrent("new");
  for (const char* junk : {"", "junk"}) {
    files.putText(kLibraryMarkerPath, junk);
    EXPECT_FALSE(LibrarySwitch(files).rollBack());
    EXPECT_EQ(current(), "new");
    EXPECT_FALSE(files.fileExists(kLibraryMarkerPath));
  }
}

}  // namespace
}  // namespace kx::test
