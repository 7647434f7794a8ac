#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstddef>
#include <cstring>
#include <thread>

#include "host/HostIdentity.h"
#include "host/HostLibrary.h"
#include "host/HostLimits.h"
#include "platform/foundation/PropertyList.h"
#include "tests/host/SamplePhotos.h"

namespace kx {
namespace {

using namespace test;

double real(const Value& value) { return value.numberValue().doubleValue(); }
std::string text(const Value& value) {
  return value.isNull() ? "(null)" : std::string(value.stringValue());
}

TEST(FolderLibrary, AFolderBecomesAlbumsEventsAndOneMasterAlbum) {
  const TemporaryFolder folder;
  folder.write("b.jpg", photoTaken("2024:05:31 10:00:00"));
  folder.write("Trip/later.jpg", photoTaken("2024:05:31 09:00:00"));
  folder.write("Trip/a.jpg", photoTaken("2024:06:01 08:00:00"));
  folder.write("Trip/Day 2/c.jpg", photoTaken("2024:06:01 07:00:00"));
  folder.makeFolder("Nothing in it");
  HostOptions options;
  options.userAgent = "kxsync/1.2";
  const auto library = openHost(folder.path(), options);
  EXPECT_EQ(problemsOf(*library), "");
  const Value root = rootOf(*library);

  EXPECT_EQ(text(root["libraryKind"]), "Folder");
  EXPECT_EQ(text(root["TesselUserAgent"]), "kxsync/1.2");
  EXPECT_EQ(text(root["libraryUUID"]), library->libraryUUID());
  EXPECT_TRUE(root["deletes"].arrayValue().empty());

  const std::vector<Value> albums = itemsOf(root, "Album");
  ASSERT_EQ(albums.size(), 3U);
  EXPECT_EQ(albums[0]["subclass"].numberValue().int64Value(), 5);
  EXPECT_EQ(fileNamesOf(root, albums[0]), "later.jpg b.jpg c.jpg a.jpg");
  EXPECT_EQ(text(albums[1]["albumName"]), "Trip");
  EXPECT_EQ(albums[1]["subclass"].numberValue().int64Value(), 0);
  EXPECT_EQ(fileNamesOf(root, albums[1]), "a.jpg later.jpg");
  EXPECT_EQ(text(albums[2]["albumName"]), "Trip/Day 2");
  EXPECT_TRUE(albums[2]["parentUUID"].isNull());

  const std::vector<Value> events = itemsOf(root, "Event");
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(text(events[0]["eventName"]), "2024-05-31");
  EXPECT_EQ(text(events[1]["eventName"]), "2024-06-01");
  EXPECT_EQ(assetNamed(root, "c.jpg")["eventUUID"], events[1]["uuid"]);
  EXPECT_EQ(assetNamed(root, "b.jpg")["eventUUID"], events[0]["uuid"]);
}

TEST(FolderLibrary, IdentifiersComeFromPathsAndTheLibrary) {
  const TemporaryFolder folder;
  folder.write("Trip/a.jpg", jpeg());
  const HostIdentity identity(HostIdentity::libraryOfFolder(folder.path()));
  const auto library = openHost(folder.path() + "/Trip/..");
  const Value root = rootOf(*library);
  EXPECT_EQ(library->path(), folder.path());
  EXPECT_EQ(library->libraryUUID(), identity.library());
  EXPECT_EQ(text(assetNamed(root, "a.jpg")["uuid"]), identity.asset("Trip/a.jpg"));
  EXPECT_EQ(text(containerNamed(root, "Trip")["uuid"]), identity.album("Trip"));

  HostOptions options;
  options.libraryID = "2ed6657d-e927-568b-95e1-2665a8aea6a2";
  const auto named = openHost(folder.path(), options);
  EXPECT_EQ(named->libraryUUID(), "2ED6657D-E927-568B-95E1-2665A8AEA6A2");
  EXPECT_NE(text(assetNamed(rootOf(*named), "a.jpg")["uuid"]), identity.asset("Trip/a.jpg"));
  options.libraryID = "my library";
  EXPECT_EQ(openingErrorCode(folder.path(), options), static_cast<int>(HostError::kUsage));
}

TEST(FolderLibrary, CaptureTimesFollowOffsetAndTimezone) {
  const TemporaryFolder folder;
  folder.write("plain.jpg", photoTaken("2024:05:31 23:30:15"));
  folder.write("offset.jpg", withMetadata(jpeg(), [](Exiv2::Image& image) {
                 image.exifData()["Exif.Photo.DateTimeOriginal"] = "2024:05:31 23:30:15";
                 image.exifData()["Exif.Photo.SubSecTimeOriginal"] = "25";
                 image.exifData()["Exif.Photo.OffsetTimeOriginal"] = "-07:00";
               }));
  const double moment = hostTime(1'717'198'215);
  const Value utc = rootOf(*openHost(folder.path()));
  EXPECT_EQ(real(assetNamed(utc, "plain.jpg")["exposureDate"]), moment);
  EXPECT_EQ(real(assetNamed(utc, "offset.jpg")["exposureDate"]), moment + 7 * 3600 + 0.25);
  EXPECT_EQ(itemsOf(utc, "Event").size(), 1U);

  HostOptions options;
  options.timezoneOffsetMinutes = 120;
  const Value east = rootOf(*openHost(folder.path(), options));
  EXPECT_EQ(real(assetNamed(east, "plain.jpg")["exposureDate"]), moment - 7200);
  EXPECT_EQ(real(assetNamed(east, "offset.jpg")["exposureDate"]), moment + 7 * 3600 + 0.25);
  EXPECT_FALSE(containerNamed(east, "2024-05-31").isNull());
  options.timezoneOffsetMinutes = 14 * 60 + 1;
  EXPECT_EQ(openingErrorCode(folder.path(), options), static_cast<int>(HostError::kUsage));
}

TEST(FolderLibrary, APhotoWithoutCaptureTimeStatesNone) {
  const TemporaryFolder folder;
  folder.write("a.jpg", jpeg());
  folder.setTime("a.jpg", 1'717'198'215, 500'000'000);
  const Value root = rootOf(*openHost(folder.path()));
  const Value asset = assetNamed(root, "a.jpg");
  EXPECT_TRUE(asset["exposureDate"].isNull());
  EXPECT_EQ(real(asset["modificationDate"]), hostTime(1'717'198'215) + 0.5);
  EXPECT_FALSE(containerNamed(root, "2024-05-31").isNull());
}

TEST(FolderLibrary, FieldsOfAnAsset) {
  const TemporaryFolder folder;
  const std::string photo = withMetadata(jpeg(), [](Exiv2::Image& image) {
    Exiv2::ExifData& exif = image.exifData();
    exif["Exif.Image.Make"] = "Sample";
    exif["Exif.Image.Orientation"] = std::uint16_t{6};
    exif["Exif.Photo.FNumber"] = Exiv2::URational(28, 10);
    exif["Exif.GPSInfo.GPSLatitudeRef"] = "S";
    exif["Exif.GPSInfo.GPSLatitude"] = "46/1 34/1 3900/100";
    exif["Exif.GPSInfo.GPSLongitudeRef"] = "W";
    exif["Exif.GPSInfo.GPSLongitude"] = "7/1 30/1 0/1";
    image.iptcData()["Iptc.Application2.City"] = "Town";
    image.xmpData()["Xmp.dc.description"] = " At the lake \n";
    image.xmpData()["Xmp.xmp.Rating"] = "4";
  });
  folder.write("a.jpg", photo);
  const Value asset = assetNamed(rootOf(*openHost(folder.path())), "a.jpg");
  EXPECT_EQ(text(asset["caption"]), "At the lake");
  EXPECT_EQ(asset["rating"].numberValue().int64Value(), 4);
  EXPECT_FALSE(asset["isVideo"].numberValue().boolValue());
  EXPECT_DOUBLE_EQ(real(asset["latitude"]), -46.5775);
  EXPECT_DOUBLE_EQ(real(asset["longitude"]), -7.5);
  EXPECT_TRUE(asset["faces"].isNull());
  const Value properties = asset["assetProperties"];
  EXPECT_EQ(text(properties["fileName"]), "a.jpg");
  EXPECT_EQ(properties["fileProperties"]["size"].numberValue().uint64Value(), photo.size());
  const Value image = properties["imageProperties"];
  EXPECT_EQ(text(image["MQFileUTType"]), "image/jpeg");
  EXPECT_EQ(text(image["Exif"]["Exif.Image.Make"]), "Sample");
  EXPECT_EQ(image["Exif"]["Exif.Image.Orientation"].numberValue().int64Value(), 6);
  EXPECT_EQ(real(image["Exif"]["Exif.Photo.FNumber"]), 2.8);
  EXPECT_EQ(text(image["GPS"]["Exif.GPSInfo.GPSLatitudeRef"]), "S");
  EXPECT_EQ(text(image["Iptc"]["Iptc.Application2.City"]), "Town");
  EXPECT_EQ(text(image["Xmp"]["Xmp.dc.description"]), "At the lake");
}

TEST(FolderLibrary, CaptionsHaveAnOrderAndCamerasBlanksAreNone) {
  const auto caption = [](const MetadataEdit& edit) {
    const TemporaryFolder folder;
    folder.write("a.jpg", withMetadata(jpeg(), edit));
    return text(assetNamed(rootOf(*openHost(folder.path())), "a.jpg")["caption"]);
  };
  const auto exif = [](const std::string& description) {
    return [description](Exiv2::Image& image) {
      image.exifData()["Exif.Image.ImageDescription"] = description;
    };
  };
  EXPECT_EQ(caption(exif("Sunset")), "Sunset");
  EXPECT_EQ(caption(exif("Z\xFCrich")), "Z\xC3\xBCrich");
  EXPECT_EQ(caption(exif("      ")), "(null)");
  EXPECT_EQ(caption(exif("OLYMPUS DIGITAL CAMERA         ")), "(null)");
  EXPECT_EQ(caption([&](Exiv2::Image& image) {
              exif("from Exif")(image);
              image.iptcData()["Iptc.Application2.Caption"] = "from IPTC";
            }),
            "from IPTC");
  EXPECT_EQ(caption([&](Exiv2::Image& image) {
              exif("from Exif")(image);
              image.xmpData()["Xmp.dc.description"] = "from XMP";
            }),
            "from XMP");
}

TEST(FolderLibrary, PlacesThatAreNoneAreLeftOut) {
  const auto place = [](const char* latitude, const char* reference) {
    const TemporaryFolder folder;
    folder.write("a.jpg", withMetadata(jpeg(), [&](Exiv2::Image& image) {
                   Exiv2::ExifData& exif = image.exifData();
                   exif["Exif.GPSInfo.GPSLatitude"] = latitude;
                   if (*reference != '\0') exif["Exif.GPSInfo.GPSLatitudeRef"] = reference;
                   exif["Exif.GPSInfo.GPSLongitudeRef"] = "E";
                   exif["Exif.GPSInfo.GPSLongitude"] = "7/1 0/1 0/1";
                 }));
    const Value asset = assetNamed(rootOf(*openHost(folder.path())), "a.jpg");
    EXPECT_EQ(asset["latitude"].isNull(), asset["longitude"].isNull());
    return asset["latitude"].isNull() ? std::string("none") : asset["latitude"].description();
  };
  EXPECT_EQ(place("46/1 30/1 0/1", "N"), "46.5");
  EXPECT_EQ(place("46/1 30/1 0/0", "N"), "46.5");
  EXPECT_EQ(place("0/0 0/0 0/0", "N"), "none");
  EXPECT_EQ(place("91/1 0/1 0/1", "N"), "none");
  EXPECT_EQ(place("46/1 30/1 0/1", ""), "none");
  EXPECT_EQ(place("46/1 30/1 0/1", "X"), "none");
}

TEST(FolderLibrary, PeopleBecomeFaceAlbums) {
  const TemporaryFolder folder;
  const auto photo = [](const std::string& time, const std::vector<SampleRegion>& regions) {
    return withMetadata(jpeg(400, 300), [&](Exiv2::Image& image) {
      image.exifData()["Exif.Photo.DateTimeOriginal"] = time;
      addRegions({400, 300, regions}, &image.xmpData());
    });
  };
  folder.write("a.jpg", photo("2024:05:31 10:00:00", {{"", "Face", 0.2, 0.2, 0.1, 0.1},
                                                      {"Grace", "Face", 0.5, 0.5, 0.2, 0.2},
                                                      {"Ada", "Face", 0.8, 0.5, 0.2, 0.2}}));
  folder.write("b.jpg", photo("2024:05:30 10:00:00", {{"Ada", "Face", 0.5, 0.5, 0.5, 0.5}}));
  const Value root = rootOf(*openHost(folder.path()));
  const Value ada = containerNamed(root, "Ada");
  EXPECT_EQ(ada["subclass"].numberValue().int64Value(), 3);
  EXPECT_EQ(fileNamesOf(root, ada), "b.jpg a.jpg");
  EXPECT_EQ(ada["keyAssetUUID"], assetNamed(root, "b.jpg")["uuid"]);
  EXPECT_EQ(ada["keyAssetFaceIndex"].numberValue().int64Value(), 0);
  EXPECT_EQ(containerNamed(root, "Grace")["keyAssetFaceIndex"].numberValue().int64Value(), 1);
  EXPECT_TRUE(containerNamed(root, "").isNull());

  const Value faces = assetNamed(root, "a.jpg")["faces"];
  ASSERT_EQ(faces.arrayValue().size(), 3U);
  for (std::size_t i = 0; i < 3; ++i)
    EXPECT_EQ(faces.arrayValue()[i]["faceIndex"].numberValue().uint64Value(), i);
  EXPECT_TRUE(faces.arrayValue()[0]["faceAlbumUUID"].isNull());
  EXPECT_EQ(faces.arrayValue()[2]["faceAlbumUUID"], ada["uuid"]);
  EXPECT_NEAR(real(faces.arrayValue()[2]["faceRectangle"]["X"]), 0.7, 1e-9);
  EXPECT_NEAR(real(faces.arrayValue()[2]["faceRectangle"]["Height"]), 0.2, 1e-9);
}

TEST(FolderLibrary, ASideFileComesBeforeThePhotoAndTheLongNameBeforeTheShort) {
  const TemporaryFolder folder;
  folder.write("a.jpg", withMetadata(photoTaken("2024:05:31 10:00:00"), [](Exiv2::Image& image) {
                 image.xmpData()["Xmp.xmp.Rating"] = "1";
                 image.xmpData()["Xmp.dc.description"] = "inside";
               }));
  const auto asset = [&] { return assetNamed(rootOf(*openHost(folder.path())), "a.jpg"); };
  folder.write("a.xmp",
               xmpPacket("xmp:Rating=\"2\" exif:DateTimeOriginal=\"2024-05-30T10:00:00.5\" "
                         "exif:GPSLatitude=\"46,30N\" exif:GPSLongitude=\"7,30W\""));
  EXPECT_EQ(asset()["rating"].numberValue().int64Value(), 2);
  EXPECT_EQ(text(asset()["caption"]), "inside");
  EXPECT_EQ(real(asset()["exposureDate"]), hostTime(1'717'063'200) + 0.5);
  EXPECT_DOUBLE_EQ(real(asset()["longitude"]), -7.5);
  folder.write("a.jpg.xmp", "\xEF\xBB\xBF" + xmpPacket("xmp:Rating=\"3\""));
  EXPECT_EQ(asset()["rating"].numberValue().int64Value(), 3);
  EXPECT_TRUE(asset()["latitude"].isNull());
  EXPECT_EQ(itemsOf(rootOf(*openHost(folder.path())), "Asset").size(), 1U);
}

TEST(FolderLibrary, AnEditOfThePhotoOrItsSideFileIsSeen) {
  const TemporaryFolder folder;
  folder.write("a.jpg", jpeg());
  folder.write("a.jpg.xmp", xmpPacket(""));
  const auto modified = [&] {
    return real(assetNamed(rootOf(*openHost(folder.path())), "a.jpg")["modificationDate"]);
  };
  folder.setTime("a.jpg", 1'700'000'000, 0);
  folder.setTime("a.jpg.xmp", 1'600'000'000, 0);
  EXPECT_EQ(modified(), hostTime(1'700'000'000));
  folder.setTime("a.jpg.xmp", 1'700'000'000, 2'000);
  const double bySide = modified();
  EXPECT_GT(bySide, hostTime(1'700'000'000));
  folder.setTime("a.jpg", 1'700'000'000, 4'000);
  EXPECT_GT(modified(), bySide);
}

TEST(FolderLibrary, ADamagedSideFileCostsItselfAlone) {
  const TemporaryFolder folder;
  folder.write("a.jpg", photoTaken("2024:05:31 10:00:00"));
  folder.write("a.xmp", "<x:xmpmeta");
  folder.write("b.jpg", photoTaken("2024:05:31 11:00:00"));
  folder.write("b.xmp", std::string("<!") + "DOCTYPE a>" + xmpPacket("xmp:Rating=\"5\""));
  const auto library = openHost(folder.path());
  EXPECT_EQ(problemsOf(*library),
            "a.jpg: its side file: its XMP cannot be read\n"
            "b.jpg: its side file: its XMP has a document type declaration or entity\n");
  EXPECT_EQ(real(assetNamed(rootOf(*library), "a.jpg")["exposureDate"]), hostTime(1'717'149'600));
  EXPECT_EQ(assetNamed(rootOf(*library), "b.jpg")["rating"].numberValue().int64Value(), 0);
}

TEST(FolderLibrary, ADamagedPhotoIsStillSyncedAndListed) {
  const TemporaryFolder folder;
  folder.write("cut.jpg", photoTaken("2024:05:31 10:00:00").substr(0, 40));
  const auto library = openHost(folder.path());
  EXPECT_EQ(problemsOf(*library), "cut.jpg: it ends before its metadata does\n");
  const Value asset = assetNamed(rootOf(*library), "cut.jpg");
  EXPECT_FALSE(asset.isNull());
  EXPECT_TRUE(asset["exposureDate"].isNull());
  EXPECT_TRUE(library->openMedia(asset["uuid"].stringValue(), nullptr).has_value());
}

TEST(FolderLibrary, ContentDecidesNotNames) {
  const TemporaryFolder folder;
  folder.write("no-extension", jpeg());
  folder.write("film.jpg", std::string("\0\0\0\x18", 4) + "ftypisom" + std::string(12, '\0'));
  folder.write("notes.txt", "no photo");
  folder.write("fake.jpg", "no photo either");
  folder.write("empty.jpg", "");
  folder.write(".hidden.jpg", jpeg());
  folder.write(".trash/a.jpg", jpeg());
  folder.write(".b.jpg.0123456789abcdef.kxsync-tmp", jpeg());
  const auto library = openHost(folder.path());
  const Value root = rootOf(*library);
  EXPECT_EQ(itemsOf(root, "Asset").size(), 2U);
  EXPECT_TRUE(assetNamed(root, "film.jpg")["isVideo"].numberValue().boolValue());
  EXPECT_EQ(problemsOf(*library),
            "empty.jpg: its content is no photo or video\n"
            "fake.jpg: its content is no photo or video\n");
}

TEST(FolderLibrary, LinksAndSpecialFilesAreListedAndNeverFollowed) {
  const TemporaryFolder folder;
  const TemporaryFolder outside;
  outside.write("secret.jpg", jpeg());
  folder.write("a.jpg", jpeg());
  ASSERT_EQ(::symlink(outside.at("secret.jpg").c_str(), folder.at("file-link.jpg").c_str()), 0);
  ASSERT_EQ(::symlink(outside.path().c_str(), folder.at("folder-link").c_str()), 0);
  ASSERT_EQ(::symlink("nowhere", folder.at("dangling").c_str()), 0);
  ASSERT_EQ(::symlink("a.jpg", folder.at("near-link.jpg").c_str()), 0);
  ASSERT_EQ(::mkfifo(folder.at("pipe.jpg").c_str(), 0600), 0);
  const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  const FileHandle socket(fd);
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  const std::string path = folder.at("socket");
  ASSERT_LT(path.size(), sizeof address.sun_path);
  std::strcpy(address.sun_path, path.c_str());
  ASSERT_EQ(::bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);

  const auto library = openHost(folder.path());
  EXPECT_EQ(itemsOf(rootOf(*library), "Asset").size(), 1U);
  EXPECT_EQ(problemsOf(*library),
            "dangling: it is a link, which is not followed\n"
            "file-link.jpg: it is a link, which is not followed\n"
            "folder-link: it is a link, which is not followed\n"
            "near-link.jpg: it is a link, which is not followed\n"
            "pipe.jpg: it is no regular file\n"
            "socket: it is no regular file\n");
}

TEST(FolderLibrary, NamesOfEveryKindKeepTheirBytes) {
  const TemporaryFolder folder;
  const std::array<std::string, 8> names{"new\nline.jpg", "bell\a.jpg",         "bad\xFF.jpg",
                                         "u\xCC\x88.jpg", "\xC3\xBC.jpg",       "-rf.jpg",
                                         "a\\b.jpg",      "\xE2\x80\xAEgpj.jpg"};
  for (const std::string& name : names) folder.write("Al\nbum\xFE/" + name, jpeg());
  const auto library = openHost(folder.path());
  const Value root = rootOf(*library);
  EXPECT_EQ(itemsOf(root, "Asset").size(), names.size());
  const HostIdentity identity(HostIdentity::libraryOfFolder(folder.path()));
  for (const std::string& name : names) {
    const std::string shown = name == "bad\xFF.jpg" ? "bad\\xFF.jpg" : name;
    const Value asset = assetNamed(root, shown);
    ASSERT_FALSE(asset.isNull()) << shown;
    EXPECT_EQ(text(asset["uuid"]), identity.asset("Al\nbum\xFE/" + name));
    EXPECT_TRUE(library->openMedia(asset["uuid"].stringValue(), nullptr).has_value());
  }
  EXPECT_EQ(text(containerNamed(root, "Al\nbum\\xFE")["uuid"]), identity.album("Al\nbum\xFE"));
}

TEST(FolderLibrary, AnUnchangedFolderGivesTheSameBytes) {
  const TemporaryFolder folder;
  for (int i = 0; i < 200; ++i) {
    const std::string number = std::to_string(i);
    folder.write("d" + std::to_string(i % 7) + "/" + number + ".jpg",
                 photoTaken("2024:05:" + std::to_string(10 + i % 20) + " 10:00:00", number));
  }
  const auto bytes = [&](unsigned threads) {
    HostOptions options;
    options.threads = threads;
    const DataPtr data = openHost(folder.path(), options)->snapshotBytes();
    return std::string(reinterpret_cast<const char*>(data->bytes()), data->length());
  };
  const std::string first = bytes(1);
  EXPECT_EQ(bytes(4), first);
  EXPECT_EQ(bytes(0), first);
  folder.setTime("d0/0.jpg", 1'717'198'215, 0);
  EXPECT_NE(bytes(1), first);
}

TEST(FolderLibrary, MissingAndEmptyFoldersAreErrors) {
  const TemporaryFolder folder;
  EXPECT_EQ(openingErrorCode(folder.at("none")), static_cast<int>(HostError::kMissing));
  EXPECT_EQ(openingErrorCode(folder.path()), static_cast<int>(HostError::kEmpty));
  folder.write("notes.txt", "no photo");
  EXPECT_EQ(openingErrorCode(folder.path()), static_cast<int>(HostError::kEmpty));
  EXPECT_EQ(openingErrorCode(folder.at("notes.txt")), static_cast<int>(HostError::kMissing));
}

TEST(FolderLibrary, FoldersNestedTooDeeplyAreAnError) {
  const TemporaryFolder folder;
  std::string path;
  for (std::size_t depth = 0; depth < hostlimits::kFolderDepth; ++depth) path += "d/";
  folder.write(path + "a.jpg", jpeg());
  EXPECT_EQ(itemsOf(rootOf(*openHost(folder.path())), "Asset").size(), 1U);
  folder.write(path + "d/a.jpg", jpeg());
  EXPECT_EQ(openingErrorCode(folder.path()), static_cast<int>(HostError::kLimit));
}

TEST(FolderLibrary, AFolderThatCannotBeReadIsAnError) {
  const TemporaryFolder folder;
  folder.write("a.jpg", jpeg());
  folder.write("locked/c.jpg", jpeg());
  const AsOrdinaryUser user(folder);
  // Listing it and looking at what it holds take a right each.
  for (const mode_t mode : {mode_t{0}, mode_t{0300}, mode_t{0600}}) {
    ASSERT_EQ(::chmod(folder.at("locked").c_str(), mode), 0);
    EXPECT_EQ(openingErrorCode(folder.path()), static_cast<int>(HostError::kUnreadable)) << mode;
  }
  ASSERT_EQ(::chmod(folder.at("locked").c_str(), 0700), 0);
  EXPECT_EQ(itemsOf(rootOf(*openHost(folder.path())), "Asset").size(), 2U);
}

TEST(FolderLibrary, AFileThatCannotBeReadStaysWithoutItsMetadata) {
  const TemporaryFolder folder;
  folder.write("Trip/b.jpg", photoTaken("2024:05:31 10:00:00"));
  folder.write("Trip/film.MOV", std::string("\0\0\0\x14", 4) + "ftypqt  " + std::string(8, '\0'));
  folder.write("notes.txt", "no photo");
  const Value before = rootOf(*openHost(folder.path()));
  const AsOrdinaryUser user(folder);
  for (const char* name : {"Trip/b.jpg", "Trip/film.MOV", "notes.txt"})
    ASSERT_EQ(::chmod(folder.at(name).c_str(), 0), 0);
  const auto library = openHost(folder.path());
  const Value root = rootOf(*library);
  EXPECT_EQ(problemsOf(*library),
            "Trip/b.jpg: it cannot be read: Permission denied; it stays in the library, without "
            "its metadata\n"
            "Trip/film.MOV: it cannot be read: Permission denied; it stays in the library, without "
            "its metadata\n"
            "notes.txt: it cannot be read: Permission denied\n");
  EXPECT_EQ(itemsOf(root, "Asset").size(), 2U);
  EXPECT_EQ(fileNamesOf(root, containerNamed(root, "Trip")), "b.jpg film.MOV");
  const Value asset = assetNamed(root, "b.jpg");
  for (const char* key : {"uuid", "modificationDate", "isVideo"})
    EXPECT_EQ(asset[key], assetNamed(before, "b.jpg")[key]) << key;
  EXPECT_EQ(asset["assetProperties"]["fileProperties"],
            assetNamed(before, "b.jpg")["assetProperties"]["fileProperties"]);
  EXPECT_TRUE(asset["exposureDate"].isNull());
  EXPECT_TRUE(assetNamed(root, "film.MOV")["isVideo"].numberValue().boolValue());
  ErrorPtr error;
  EXPECT_FALSE(library->openMedia(asset["uuid"].stringValue(), &error).has_value());
  EXPECT_EQ(error->code(), EACCES);
}

TEST(FolderLibrary, WhatTheSideFileSaysOfAFileThatCannotBeReadCounts) {
  const TemporaryFolder folder;
  folder.write("a.jpg", jpeg());
  folder.write("a.xmp", xmpPacket("xmp:Rating=\"4\" exif:GPSLatitude=\"46,30N\" "
                                  "exif:GPSLongitude=\"7,30W\""));
  const AsOrdinaryUser user(folder);
  ASSERT_EQ(::chmod(folder.at("a.jpg").c_str(), 0), 0);
  const Value asset = assetNamed(rootOf(*openHost(folder.path())), "a.jpg");
  EXPECT_EQ(asset["rating"].numberValue().int64Value(), 4);
  EXPECT_DOUBLE_EQ(real(asset["longitude"]), -7.5);
}

TEST(FolderLibrary, AFileThatCouldBeReadBeforeStaysJustAsItWas) {
  const TemporaryFolder folder;
  folder.write(
      "Trip/a.jpg", withMetadata(photoTaken("2024:05:31 10:00:00"), [](Exiv2::Image& image) {
        image.xmpData()["Xmp.dc.description"] = "At the lake";
        image.xmpData()["Xmp.xmp.Rating"] = "-1";
        image.xmpData()["Xmp.exif.GPSLatitude"] = "46,30N";
        image.xmpData()["Xmp.exif.GPSLongitude"] = "7,30W";
        addRegions(
            {64, 48, {{"", "Face", 0.2, 0.2, 0.1, 0.1}, {"Ada", "Face", 0.8, 0.5, 0.2, 0.2}}},
            &image.xmpData());
      }));
  folder.write("Trip/odd.name", jpeg());
  folder.write("Trip/film.jpg", std::string("\0\0\0\x14", 4) + "ftypqt  " + std::string(8, '\0'));
  folder.write("b.jpg", photoTaken("2024:05:30 10:00:00"));
  const DataPtr before = openHost(folder.path())->snapshotBytes();
  for (const char* name : {"Trip/a.jpg", "Trip/odd.name", "Trip/film.jpg"})
    folder.setTime(name, 1'750'000'000, 0);
  const AsOrdinaryUser user(folder);
  for (const char* name : {"Trip/a.jpg", "Trip/odd.name", "Trip/film.jpg"})
    ASSERT_EQ(::chmod(folder.at(name).c_str(), 0), 0);
  HostOptions options;
  options.previousSnapshot = [&] { return before; };
  const auto library = openHost(folder.path(), options);
  const Value rootBefore = readPropertyList(before, nullptr);
  EXPECT_EQ(rootOf(*library), rootBefore);
  EXPECT_EQ(rootOf(*library).description(), rootBefore.description());  // the order too
  EXPECT_EQ(problemsOf(*library),
            "Trip/a.jpg: it cannot be read: Permission denied; it stays in the library as it was\n"
            "Trip/film.jpg: it cannot be read: Permission denied; it stays in the library as it "
            "was\n"
            "Trip/odd.name: it cannot be read: Permission denied; it stays in the library as it "
            "was\n");
}

TEST(FolderLibrary, APreviousSnapshotThatIsOfNoUseIsAsGoodAsNone) {
  const TemporaryFolder folder;
  folder.write("a.jpg", photoTaken("2024:05:31 10:00:00"));
  const DataPtr good = openHost(folder.path())->snapshotBytes();
  HostOptions other;
  other.libraryID = "2ED6657D-E927-568B-95E1-2665A8AEA6A2";
  const DataPtr foreign = openHost(folder.path(), other)->snapshotBytes();
  std::vector<DataPtr> useless{nullptr, std::make_shared<Data>(), foreign,
                               std::make_shared<Data>(good->bytes(), good->length() - 1)};
  const HostIdentity identity(HostIdentity::libraryOfFolder(folder.path()));
  const auto made = [&](Value updates) {
    ErrorPtr error;
    useless.push_back(std::make_shared<Data>(writePropertyList(
        Value::dictionary(Dictionary{{"libraryUUID", Value::string(identity.library())},
                                     {"updates", std::move(updates)}}),
        PropertyListFormat::kBinary, &error)));
    EXPECT_EQ(error, nullptr);
  };
  made(Value::string("none"));
  made(Value::array({Value::integer(1)}));
  made(Value::array({Value::dictionary(
      Dictionary{{"itemType", Value::string("Asset")}, {"uuid", Value::integer(1)}})}));
  made(Value::array(
      {Value::dictionary(Dictionary{{"itemType", Value::string("Asset")},
                                    {"uuid", Value::string(identity.asset("a.jpg"))},
                                    {"modificationDate", Value::string("yesterday")}})}));
  const AsOrdinaryUser user(folder);
  ASSERT_EQ(::chmod(folder.at("a.jpg").c_str(), 0), 0);
  const DataPtr plain = openHost(folder.path())->snapshotBytes();
  for (const DataPtr& previous : useless) {
    HostOptions options;
    options.previousSnapshot = [&] { return previous; };
    EXPECT_TRUE(openHost(folder.path(), options)->snapshotBytes()->isEqual(*plain));
  }
}

// Makes every positioned read of this thread fail, for good.
void failReadsOfThisThread() {
  std::array<sock_filter, 4> filter{
      sock_filter BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
      sock_filter BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_pread64, 0, 1),
      sock_filter BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | EIO),
      sock_filter BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW)};
  const sock_fprog program{filter.size(), filter.data()};
  ASSERT_EQ(::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), 0);
  ASSERT_EQ(::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program), 0);
}

TEST(FolderLibrary, AFileWhoseReadingFailsStays) {
  const TemporaryFolder folder;
  folder.write("Trip/a.jpg", jpeg());
  folder.write("Trip/plain", jpeg());
  folder.write("Trip/notes.txt", "no photo");
  std::unique_ptr<HostLibrary> library;
  std::thread([&] {
    failReadsOfThisThread();
    HostOptions options;
    options.threads = 1;  // this one
    library = openHost(folder.path(), options);
  }).join();
  ASSERT_NE(library, nullptr);
  const Value root = rootOf(*library);
  EXPECT_EQ(fileNamesOf(root, containerNamed(root, "Trip")), "a.jpg plain");
  EXPECT_EQ(problemsOf(*library),
            "Trip/a.jpg: it cannot be read: Input/output error; it stays in the library, without "
            "its metadata\n"
            "Trip/notes.txt: it cannot be read: Input/output error\n"
            "Trip/plain: it cannot be read: Input/output error; it stays in the library, without "
            "its metadata\n");
}

TEST(FolderLibrary, AFolderThatKeepsChangingIsAnError) {
  const TemporaryFolder folder;
  folder.write("a.jpg", jpeg());
  folder.write("sub/b.jpg", jpeg());
  int calls = 0;
  HostOptions options;
  options.progress = [&](const HostProgress& progress) {
    if (progress.phase == HostProgress::Phase::kListing)
      folder.write("new" + std::to_string(calls++) + ".jpg", jpeg());
    return true;
  };
  EXPECT_EQ(openingErrorCode(folder.path(), options), static_cast<int>(HostError::kChanged));
  // One change is caught by reading again.
  calls = 0;
  options.progress = [&](const HostProgress&) {
    if (calls++ == 0) folder.write("sub/late.jpg", jpeg());
    return true;
  };
  EXPECT_FALSE(assetNamed(rootOf(*openHost(folder.path(), options)), "late.jpg").isNull());
}

TEST(FolderLibrary, TheCallbackCancels) {
  const TemporaryFolder folder;
  folder.write("a.jpg", jpeg());
  HostOptions options;
  for (const auto phase : {HostProgress::Phase::kListing, HostProgress::Phase::kReading}) {
    options.progress = [&](const HostProgress& progress) { return progress.phase != phase; };
    EXPECT_EQ(openingErrorCode(folder.path(), options), static_cast<int>(HostError::kCancelled));
  }
}

TEST(FolderLibrary, MediaAreOpenedBelowTheFolderOnly) {
  const TemporaryFolder folder;
  const TemporaryFolder outside;
  folder.write("Trip/a.jpg", jpeg());
  folder.setTime("Trip/a.jpg", 1'717'198'215, 7);
  outside.write("a.jpg", jpeg(10, 10, "other"));
  const auto library = openHost(folder.path());
  const std::string uuid = text(assetNamed(rootOf(*library), "a.jpg")["uuid"]);
  const auto media = library->openMedia(uuid, nullptr);
  ASSERT_TRUE(media.has_value());
  EXPECT_EQ(media->sizeBytes, static_cast<std::int64_t>(jpeg().size()));
  EXPECT_EQ(media->modifiedSeconds, 1'717'198'215);
  EXPECT_EQ(media->modifiedNanoseconds, 7);
  EXPECT_EQ(media->path, "Trip/a.jpg");
  EXPECT_EQ(::fcntl(media->file.get(), F_GETFL) & O_ACCMODE, O_RDONLY);
  EXPECT_EQ(library->mediaSize(uuid), media->sizeBytes);

  const auto errorCode = [&] {
    ErrorPtr error;
    EXPECT_FALSE(library->openMedia(uuid, &error).has_value());
    EXPECT_EQ(error->domain(), kPosixErrorDomain);
    return error->code();
  };
  folder.remove("Trip/a.jpg");
  EXPECT_EQ(errorCode(), ENOENT);
  ASSERT_EQ(::mkfifo(folder.at("Trip/a.jpg").c_str(), 0600), 0);
  EXPECT_EQ(errorCode(), EINVAL);
  folder.remove("Trip");
  ASSERT_EQ(::symlink(outside.path().c_str(), folder.at("Trip").c_str()), 0);
  EXPECT_EQ(errorCode(), ELOOP);
  EXPECT_FALSE(library->mediaSize(uuid).has_value());
  ErrorPtr error;
  EXPECT_FALSE(library->openMedia("../a.jpg", &error).has_value());
  EXPECT_EQ(error->code(), ENOENT);
}

}  // namespace
}  // namespace kx
