#include "backup/BackupManifest.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "backup/BackupErrors.h"
#include "device/Sha256.h"

namespace kx {
namespace {

using Json = nlohmann::ordered_json;

const std::string kHash(64, 'a');

BackupManifest sample() {
  BackupManifest manifest;
  manifest.identity = "6F1F2A6C-5B0E-4A55-9C43-0D6B8E2A9D11";
  manifest.device = "2B1F2A6C-5B0E-4A55-9C43-0D6B8E2A9D11";
  manifest.takenAt = Date{785318400.125};
  manifest.paths = {"DCIM"};
  manifest.files = {{"/var/mobile/Media/DCIM/100AB/IMG 1.JPG", 3, {-5, 999999999}, kHash},
                    {"/var/mobile/Media/DCIM/100AB/\xC3\x84\n\"2\".MOV", 64LL << 30, {7, 0}, kHash},
                    {"/var/mobile/Media/DCIM/z", 0, {0, 1}, kHash}};
  manifest.albums = {10, kHash};
  manifest.library = BackupPart{4096, kHash};
  return manifest;
}

// The document with a checksum that fits, after a change by `edit`.
std::string resealed(const std::function<void(Json&)>& edit) {
  Json json = Json::parse(serializeManifest(sample()));
  json.erase("checksum");
  edit(json);
  const std::string text = json.dump();
  Sha256 hash;
  hash.update({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
  json["checksum"] = hash.hexDigest();
  return json.dump();
}

// Why the manifest is refused; "" when it is not.
std::string refusal(const std::string& bytes, BackupError expected = BackupError::kUnusable) {
  ErrorPtr error;
  if (parseManifest(bytes, &error)) return "";
  EXPECT_EQ(error->domain(), kBackupErrorDomain);
  EXPECT_EQ(error->code(), static_cast<std::int64_t>(expected));
  EXPECT_EQ(error->message().find('\n'), std::string::npos);
  EXPECT_TRUE(error->message().starts_with("manifest.json cannot be used: ")) << error->message();
  return error->message().substr(std::string("manifest.json cannot be used: ").size());
}

TEST(BackupManifestTest, IsReadAsItWasWritten) {
  BackupManifest manifest = sample();
  EXPECT_EQ(parseManifest(serializeManifest(manifest), nullptr), manifest);
  manifest.device = std::nullopt;
  manifest.library = std::nullopt;
  manifest.files.clear();
  EXPECT_EQ(parseManifest(serializeManifest(manifest), nullptr), manifest);
}

TEST(BackupManifestTest, FindsFilesByPath) {
  const BackupManifest manifest = sample();
  for (const BackupFile& file : manifest.files) EXPECT_EQ(manifest.find(file.path), &file);
  EXPECT_EQ(manifest.find("/var/mobile/Media/DCIM"), nullptr);
  EXPECT_EQ(manifest.find("/zzz"), nullptr);
}

TEST(BackupManifestTest, EveryChangedByteBreaksTheChecksumOrTheForm) {
  const std::string good = serializeManifest(sample());
  for (std::size_t i = 0; i + 1 < good.size(); ++i) {
    std::string bad = good;
    bad[i] = static_cast<char>(bad[i] ^ 1);
    EXPECT_FALSE(parseManifest(bad, nullptr)) << i;
  }
}

TEST(BackupManifestTest, EveryTruncationIsRefused) {
  const std::string good = serializeManifest(sample());
  for (std::size_t length = 0; length + 1 < good.size(); ++length) {
    EXPECT_FALSE(parseManifest(good.substr(0, length), nullptr)) << length;
  }
}

TEST(BackupManifestTest, WhatIsNoManifestIsRefused) {
  EXPECT_EQ(refusal(""), "it is no JSON (byte 1)");
  EXPECT_EQ(refusal("[]"), "it is no document of the form \"kxsync-backup\"");
  EXPECT_EQ(refusal("null"), "it is no document of the form \"kxsync-backup\"");
  EXPECT_EQ(refusal("{\"format\":\"other\"}"), "it is no document of the form \"kxsync-backup\"");
  EXPECT_EQ(refusal(serializeAlbums({})), "it is no document of the form \"kxsync-backup\"");
  EXPECT_EQ(refusal("{\"format\":\"\xff\"}").substr(0, 13), "it is no JSON");
  EXPECT_EQ(refusal(std::string(100000, '[')), "it is nested too deep");
  EXPECT_EQ(refusal("{\"a\":1e999}"), "it holds a number that is out of range");
  EXPECT_EQ(refusal("{\"a\":1,\"a\":2}"), "the key \"a\" stands twice in one object");
  EXPECT_EQ(refusal("{\"format\":\"kxsync-backup\",\"version\":2}", BackupError::kNewerForm),
            "it has version 2, this program knows 1");
  EXPECT_EQ(refusal("{\"format\":\"kxsync-backup\",\"version\":1}"), "\"checksum\" is missing");
}

TEST(BackupManifestTest, AWrongChecksumIsRefused) {
  Json json = Json::parse(serializeManifest(sample()));
  json["checksum"] = kHash;
  EXPECT_EQ(refusal(json.dump()), "its checksum is wrong");
  json["checksum"] = "AA";
  EXPECT_EQ(refusal(json.dump()), "\"checksum\" is no SHA-256");
  json["checksum"] = 5;
  EXPECT_EQ(refusal(json.dump()), "\"checksum\" is no text");
}

TEST(BackupManifestTest, KeysThatAreUnknownArePassedOver) {
  EXPECT_EQ(refusal(resealed([](Json& json) { json["later"] = {1, 2}; })), "");
}

struct Edit {
  const char* pointer;
  Json value;
  const char* why;
};

TEST(BackupManifestTest, WrongTypesAndRangesAreRefused) {
  const std::vector<Edit> edits = {
      {"/version", "1", "\"version\" is no whole number"},
      {"/version", 0, "\"version\" is out of range"},
      {"/identity", 5, "\"identity\" is no text"},
      {"/identity", "", "\"identity\" is empty"},
      {"/device", 1, "\"device\" is no text"},
      {"/takenAt", "now", "\"takenAt\" is no number"},
      {"/paths", "DCIM", "\"paths\" is no list"},
      {"/paths/0", 1, "\"paths\" has an entry that may not be backed up"},
      {"/paths/0", "..", "\"paths\" has an entry that may not be backed up"},
      {"/paths/0", "/etc", "\"paths\" has an entry that may not be backed up"},
      {"/paths/0", "", "\"paths\" has an entry that may not be backed up"},
      {"/paths/0", "Other",
       "the path \"/var/mobile/Media/DCIM/100AB/IMG 1.JPG\" lies beneath none of \"paths\""},
      {"/files", Json::object(), "\"files\" is no list"},
      {"/files/0", 1, "an object is missing where \"path\" was looked for"},
      {"/files/0/path", 1, "\"path\" is no text"},
      {"/files/0/path", std::string(70000, 'x'), "\"path\" is too long"},
      {"/files/0/size", -1, "\"size\" is out of range"},
      {"/files/0/size", 1.0, "\"size\" is no whole number"},
      {"/files/0/size", (64LL << 30) + 1, "\"size\" is out of range"},
      {"/files/0/size", UINT64_MAX, "\"size\" is out of range"},
      {"/files/0/size", nullptr, "\"size\" is no whole number"},
      {"/files/0/modificationDate", 1, "an object is missing where \"seconds\" was looked for"},
      {"/files/0/modificationDate/seconds", 1LL << 41, "\"seconds\" is out of range"},
      {"/files/0/modificationDate/nanoseconds", 1000000000, "\"nanoseconds\" is out of range"},
      {"/files/0/modificationDate/nanoseconds", -1, "\"nanoseconds\" is out of range"},
      {"/files/0/sha256", std::string(63, 'a'), "\"sha256\" is no SHA-256"},
      {"/files/0/sha256", std::string(64, 'A'), "\"sha256\" is no SHA-256"},
      {"/albums", nullptr, "an object is missing where \"size\" was looked for"},
      {"/albums/size", -1, "\"size\" is out of range"},
      {"/library", "yes", "an object is missing where \"size\" was looked for"},
      {"/library/sha256", "", "\"sha256\" is no SHA-256"}};
  for (const Edit& edit : edits) {
    const std::string bytes =
        resealed([&](Json& json) { json[Json::json_pointer(edit.pointer)] = edit.value; });
    EXPECT_EQ(refusal(bytes), edit.why) << edit.pointer << " " << edit.value.dump().substr(0, 50);
  }
}

TEST(BackupManifestTest, MissingKeysAreRefused) {
  for (const char* key :
       {"version", "identity", "device", "takenAt", "paths", "files", "albums", "library"}) {
    EXPECT_EQ(refusal(resealed([&](Json& json) { json.erase(key); })),
              "\"" + std::string(key) + "\" is missing");
  }
}

TEST(BackupManifestTest, HostilePathsAreRefused) {
  const std::string media = "/var/mobile/Media/";
  const std::vector<std::pair<std::string, const char*>> rows = {
      {media + "DCIM/../../x", "may not be in a backup"},
      {media + "DCIM/..", "may not be in a backup"},
      {media + "DCIM//x", "may not be in a backup"},
      {media + "DCIM/./x", "may not be in a backup"},
      {media + "DCIM/", "may not be in a backup"},
      {media + "DCIM/" + std::string(256, 'x'), "may not be in a backup"},
      {media + std::string("DCIM/a\0b", 8), "may not be in a backup"},
      {"DCIM/x", "may not be in a backup"},
      {"/etc/passwd", "may not be in a backup"},
      {"/var/mobile/Media", "may not be in a backup"},
      {"", "may not be in a backup"},
      {media + "manifest.json", "may not be in a backup"},
      {media + "albums.json", "may not be in a backup"},
      {media + "library.sqlite", "may not be in a backup"},
      {media + ".incoming/DCIM/x", "may not be in a backup"},
      {media + "PhotoData/Photos.sqlite", "lies beneath none of \"paths\""},
      {media + "DCIMX/a", "lies beneath none of \"paths\""}};
  for (const auto& [path, why] : rows) {
    const std::string bytes = resealed([&path = path](Json& json) {
      json["files"].erase(1);
      json["files"].erase(1);
      json["files"][0]["path"] = path;
    });
    const std::string text = refusal(bytes);
    EXPECT_TRUE(text.ends_with(why)) << path << ": " << text;
  }
}

TEST(BackupManifestTest, FilesStandOnceInOrderAndNoneIsADirectory) {
  const auto withPaths = [](const std::vector<std::string>& names) {
    return resealed([&](Json& json) {
      const Json file = json["files"][0];
      json["files"] = Json::array();
      for (const std::string& name : names) {
        json["files"].push_back(file);
        json["files"].back()["path"] = "/var/mobile/Media/DCIM/" + name;
      }
    });
  };
  EXPECT_EQ(refusal(withPaths({"a", "a-b", "b/c"})), "");
  EXPECT_EQ(refusal(withPaths({"a", "a"})),
            "the path \"/var/mobile/Media/DCIM/a\" stands there twice");
  EXPECT_EQ(refusal(withPaths({"b", "a"})),
            "the path \"/var/mobile/Media/DCIM/a\" stands out of order");
  EXPECT_EQ(refusal(withPaths({"a", "a-b", "a/b"})),
            "the path \"/var/mobile/Media/DCIM/a\" is a file and a directory");
}

TEST(BackupManifestTest, TimesGoToUnixAndBack) {
  const struct timespec time = {1700000000, 123456789};
  const BackupFileTime kept = BackupFileTime::fromUnix(time);
  EXPECT_EQ(kept.seconds, 1700000000 - 978307200);
  EXPECT_EQ(kept.unixTime().tv_sec, time.tv_sec);
  EXPECT_EQ(kept.unixTime().tv_nsec, time.tv_nsec);
}

TEST(BackupManifestTest, EntriesOfThePlugInAreBelowMediaWhenRelative) {
  EXPECT_EQ(devicePathOfEntry("DCIM"), "/var/mobile/Media/DCIM");
  EXPECT_EQ(devicePathOfEntry("/var/mobile/Media/DCIM"), "/var/mobile/Media/DCIM");
  for (const char* bad :
       {"", "..", "../x", "/", "/var/mobile", "a//b", ".incoming", "albums.json"}) {
    EXPECT_EQ(devicePathOfEntry(bad), "") << bad;
  }
  EXPECT_EQ(backupPathOf("/var/mobile/Media/DCIM/x"), "/DCIM/x");
}

BackupAlbum album() {
  return {"U", "T\xC3\x84", 2, BackupAlbumList::kEvents, 3, {"/var/mobile/Media/DCIM/a"}};
}

TEST(BackupAlbumsTest, AreReadAsTheyWereWritten) {
  BackupAlbum untitled = album();
  untitled.title = std::nullopt;
  untitled.list = BackupAlbumList::kFaceAlbums;
  untitled.members.clear();
  const std::vector<BackupAlbum> albums = {album(), untitled};
  EXPECT_EQ(parseAlbums(serializeAlbums(albums), nullptr), albums);
}

TEST(BackupAlbumsTest, BadOnesAreRefused) {
  const std::vector<Edit> edits = {
      {"/albums", 1, "\"albums\" is no list"},
      {"/albums/0", 1, "an object is missing where \"uuid\" was looked for"},
      {"/albums/0/uuid", nullptr, "\"uuid\" is no text"},
      {"/albums/0/title", 1, "\"title\" is no text"},
      {"/albums/0/kind", 1550, "an album of kind 1550 is not the device's own"},
      {"/albums/0/kind", 15, "an album of kind 15 is not the device's own"},
      {"/albums/0/kind", 1LL << 32, "\"kind\" is out of range"},
      {"/albums/0/list", "other", "there is no list \"other\""},
      {"/albums/0/position", -1, "\"position\" is out of range"},
      {"/albums/0/members", 1, "\"members\" is no list"},
      {"/albums/0/members/0", 1, "an album has a member with a path that may not be in a backup"},
      {"/albums/0/members/0", "/etc/passwd",
       "an album has a member with a path that may not be in a backup"}};
  for (const Edit& edit : edits) {
    Json json = Json::parse(serializeAlbums({album()}));
    json[Json::json_pointer(edit.pointer)] = edit.value;
    ErrorPtr error;
    EXPECT_FALSE(parseAlbums(json.dump(), &error)) << edit.pointer;
    EXPECT_EQ(error->message(), "albums.json cannot be used: " + std::string(edit.why));
  }
}

}  // namespace
}  // namespace kx
