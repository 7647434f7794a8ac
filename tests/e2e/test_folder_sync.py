"""A folder of photos onto a device, again and again."""

import glob
import json
import os
import plistlib
import shutil
import subprocess
import unittest

from harness import BIN, EndToEnd, exif_of, jpeg, kxsync


class FolderSync(EndToEnd):

    def photo(self, path, date="2020:05:01 10:00:00", note=b""):
        self.write(os.path.join(self.host, path), jpeg(path.encode() + note, exif_of(date)))

    def make_folder(self):
        for number in range(1, 4):
            self.photo(f"Sea/{number}.jpg", f"2020:05:0{number} 10:00:00")
        for number in range(4, 7):
            self.photo(f"Hills/{number}.jpg", f"2020:05:01 12:00:0{number}")

    def names_in(self, dump, title):
        return self.file_names(dump, self.titles(dump["albums"])[title])

    def test_first_sync_brings_albums_events_and_dates(self):
        self.make_folder()
        result = self.sync()
        self.assertEqual(result["outcome"], "synced")
        self.assertTrue(result["resync"])
        self.assertEqual(result["failed"], [])
        self.assertIsNone(result["error"])
        self.assertEqual(self.counts(result), {"requested": 6, "imported": 6, "albumsCreated": 5})
        dump = self.dump()
        self.assert_whole(dump)
        self.assertEqual([entry["title"] for entry in dump["albums"]], ["Hills", "Sea"])
        self.assertEqual([entry["title"] for entry in dump["events"]],
                         ["2020-05-01", "2020-05-02", "2020-05-03"])
        self.assertEqual(sorted(self.names_in(dump, "Sea")), ["1.jpg", "2.jpg", "3.jpg"])
        self.assertEqual(sorted(self.names_in(dump, "Hills")), ["4.jpg", "5.jpg", "6.jpg"])
        first = next(entry for entry in dump["assets"].values()
                     if entry["originalFileName"] == "1.jpg")
        # 2020-05-01 10:00:00 UTC in seconds since 2001-01-01.
        self.assertEqual(first["creationDate"], 1588327200 - 978307200)
        self.assertTrue(dump["lastSynced"])
        self.assertEqual(dump["syncAgent"]["libraryKind"], "Folder")
        self.assertRegex(dump["syncAgent"]["userAgent"], r"^kxsync/\d+\.\d+\.\d+$")

    def test_second_run_finds_nothing_to_do(self):
        self.make_folder()
        self.sync()
        dump = self.dump("--hash")
        self.assert_nothing_to_do()
        self.assertEqual(self.dump("--hash"), dump)

    def test_third_run_does_just_what_changed(self):
        self.make_folder()
        self.sync()
        before = self.dump("--hash")["assets"]
        os.rename(os.path.join(self.host, "Sea/1.jpg"), os.path.join(self.host, "Sea/first.jpg"))
        os.rename(os.path.join(self.host, "Sea/2.jpg"), os.path.join(self.host, "Hills/2.jpg"))
        os.remove(os.path.join(self.host, "Hills/4.jpg"))
        self.photo("Sea/7.jpg", "2020:05:01 11:00:00")
        self.photo("Hills/5.jpg", "2020:05:01 12:00:05", note=b" edited")
        result = self.sync()
        self.assertEqual(result["outcome"], "synced")
        self.assertFalse(result["resync"])
        self.assertEqual(self.counts(result),
                         {"requested": 4, "imported": 4, "deletedAssets": 3})
        dump = self.dump("--hash")
        self.assert_whole(dump)
        self.assertEqual(sorted(self.names_in(dump, "Sea")), ["3.jpg", "7.jpg", "first.jpg"])
        self.assertEqual(sorted(self.names_in(dump, "Hills")), ["2.jpg", "5.jpg", "6.jpg"])
        kept = {identifier: entry for identifier, entry in dump["assets"].items()
                if entry["originalFileName"] in ("3.jpg", "6.jpg")}
        self.assertEqual(len(kept), 2)
        for identifier, entry in kept.items():
            self.assertEqual(entry, before[identifier])
        self.assert_nothing_to_do()

    def test_folder_renamed_is_another_album(self):
        self.make_folder()
        self.sync()
        os.rename(os.path.join(self.host, "Sea"), os.path.join(self.host, "Beach"))
        result = self.sync()
        self.assertEqual(self.counts(result), {"requested": 3, "imported": 3, "deletedAssets": 3,
                                               "albumsCreated": 1, "albumsDeleted": 1})
        self.assertEqual([entry["title"] for entry in self.dump()["albums"]], ["Beach", "Hills"])

    def test_timezone_moves_capture_times_without_offset(self):
        self.photo("Sea/1.jpg", "2020:05:01 00:30:00")
        self.sync("--timezone", "+02:00")
        dump = self.dump()
        entry = next(iter(dump["assets"].values()))
        self.assertEqual(entry["creationDate"], 1588285800 - 978307200)
        self.assertEqual([event["title"] for event in dump["events"]], ["2020-05-01"])

    def test_library_id_keeps_identity_when_the_folder_moves(self):
        self.make_folder()
        identity = "0B7C7C5E-1C8B-4A53-9E0E-0A6A7D1B2C3D"
        self.sync("--library-id", identity)
        self.assertEqual(self.dump()["currentLibraryUUID"], identity)
        os.rename(self.host, self.path("moved"))
        self.assert_nothing_to_do(self.path("moved"), "--library-id", identity)

    def test_links_and_foreign_files_are_passed_over_and_listed(self):
        self.make_folder()
        self.write(os.path.join(self.host, "notes.txt"), b"no photo")
        os.symlink("/etc/passwd", os.path.join(self.host, "Sea/link.jpg"))
        result = self.sync()
        self.assertEqual(result["imported"], 6)
        self.assertIn("Sea/link.jpg", [problem["path"] for problem in result["hostProblems"]])
        self.assertIn("Sea/link.jpg", result["stderr"])

    def test_snapshot_writes_a_bundle_that_syncs_to_the_same(self):
        self.make_folder()
        bundle = self.path("bundle")
        done = kxsync("snapshot", self.host, bundle, "--json")
        self.assertEqual(done.code, 0, str(done))
        self.assertEqual(json.loads(done.out)["files"], 6)
        with open(os.path.join(bundle, "PhotoLibrary.plist"), "rb") as stream:
            root = plistlib.load(stream)
        self.sync(host=bundle)
        media = {os.path.basename(path).split(".")[0]: path
                 for path in glob.glob(os.path.join(bundle, "media", "*"))}
        self.assert_in_line(root, self.dump("--hash"), media)
        self.assert_nothing_to_do()


MAKE_SAMPLE = os.environ.get("KX_MAKE_SAMPLE", os.path.join(BIN, "make-sample-library"))


class SampleLibrary(EndToEnd):

    def setUp(self):
        super().setUp()
        subprocess.run([MAKE_SAMPLE, self.host], check=True,
                       stdout=subprocess.DEVNULL)

    def test_sample_library_arrives_whole(self):
        bundle = self.path("bundle")
        self.assertEqual(kxsync("snapshot", self.host, bundle).code, 0)
        with open(os.path.join(bundle, "PhotoLibrary.plist"), "rb") as stream:
            root = plistlib.load(stream)
        media = {os.path.basename(path).split(".")[0]: path
                 for path in glob.glob(os.path.join(bundle, "media", "*"))}
        result = self.sync()
        dump = self.dump("--hash")
        self.assert_whole(dump)
        self.assert_in_line(root, dump, media)
        self.assertEqual(result["imported"], len(media))
        self.assertGreater(len(dump["faceAlbums"]), 0)
        self.assertGreater(sum(1 for entry in dump["assets"].values() if entry["location"]), 0)
        self.assert_nothing_to_do()

    def test_copy_on_another_device_is_the_same(self):
        self.sync()
        first = self.dump("--hash")
        shutil.rmtree(self.device)
        self.sync()
        self.assertEqual(self.dump("--hash")["albums"], first["albums"])
        self.assertEqual({key: value["sha256"] for key, value in first["assets"].items()},
                         {key: value["sha256"]
                          for key, value in self.dump("--hash")["assets"].items()})


if __name__ == "__main__":
    unittest.main()
