"""Files of the host that cannot be read for a while: their copies stay on the device."""

import json
import os
import unittest

from harness import EndToEnd, OrdinaryUser, exif_of, jpeg


@unittest.skipUnless(os.geteuid() == 0, "becomes an ordinary user, whom permissions bind")
class UnreadableFiles(EndToEnd):

    def setUp(self):
        super().setUp()
        self.user = OrdinaryUser(self.top)
        for number in (1, 2, 3):
            self.photo(f"Sea/{number}.jpg")

    def photo(self, path):
        self.write(os.path.join(self.host, path), jpeg(path.encode(), exif_of("2020:05:01 10:00:00")))

    def lock(self, path, mode=0):
        os.chmod(os.path.join(self.host, path), mode)

    def sync(self, code=0):
        done = self.user.kxsync("sync", self.host, self.device, "--json")
        self.assertEqual(done.code, code, str(done))
        result = json.loads(done.out)
        result["problems"] = {problem["path"]: problem["text"]
                              for problem in result["hostProblems"]}
        return result

    def dump(self, *options):
        done = self.user.kxsync("dump", self.device, *options)
        self.assertEqual(done.code, 0, str(done))
        return json.loads(done.out)

    def entry_of(self, dump, name):
        return next(entry for entry in dump["assets"].values()
                    if entry["originalFileName"] == name)

    def test_copy_stays_in_its_album_and_metadata_come_back(self):
        self.sync()
        before = self.dump("--hash")
        self.lock("Sea/2.jpg")
        result = self.sync()
        self.assertEqual(result["outcome"], "synced")
        self.assertEqual((result["requested"], result["deletedAssets"], result["failed"]),
                         (0, 0, []))
        self.assertEqual(result["problems"], {
            "Sea/2.jpg": "it cannot be read: Permission denied; it stays in the library, without "
                         "its metadata"})
        locked = self.dump("--hash")
        self.assert_whole(locked)
        self.assertEqual(self.entry_of(locked, "2.jpg")["sha256"],
                         self.entry_of(before, "2.jpg")["sha256"])
        self.assertEqual(sorted(self.file_names(locked, self.titles(locked["albums"])["Sea"])),
                         ["1.jpg", "2.jpg", "3.jpg"])
        self.lock("Sea/2.jpg", 0o644)
        result = self.sync()
        self.assertEqual((result["requested"], result["problems"]), (0, {}))
        self.assertEqual(self.dump("--hash")["assets"], before["assets"])

    def test_photo_that_was_never_readable_is_reported_and_comes_later(self):
        self.lock("Sea/2.jpg")
        result = self.sync(code=3)
        self.assertEqual(result["outcome"], "partial")
        self.assertEqual((result["imported"], len(result["failed"])), (2, 1))
        self.assertIn("Sea/2.jpg", result["problems"])
        self.lock("Sea/2.jpg", 0o644)
        result = self.sync()
        self.assertEqual((result["outcome"], result["imported"]), ("synced", 1))
        self.assert_whole(self.dump())

    def test_other_files_that_cannot_be_read_are_listed_alone(self):
        self.write(os.path.join(self.host, "notes.txt"), b"words")
        self.lock("notes.txt")
        result = self.sync()
        self.assertEqual((result["outcome"], result["imported"]), ("synced", 3))
        self.assertEqual(result["problems"],
                         {"notes.txt": "it cannot be read: Permission denied"})


if __name__ == "__main__":
    unittest.main()
