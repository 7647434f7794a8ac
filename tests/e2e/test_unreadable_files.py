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

    def photo(self, path, note=b""):
        self.write(os.path.join(self.host, path),
                   jpeg(path.encode() + note, exif_of(f"2020:05:01 10:00:0{path[-5]}")))

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

    def assert_stays_as_it_was(self, path, before):
        result = self.sync()
        self.assertEqual((result["requested"], result["deletedAssets"], result["updatedAssets"],
                          result["failed"]), (0, 0, 0, []))
        self.assertEqual(result["problems"], {
            path: "it cannot be read: Permission denied; it stays in the library as it was"})
        self.assertEqual(self.dump("--hash"), before)

    def test_copy_on_the_device_stays_as_it_was(self):
        self.sync()
        before = self.dump("--hash")
        self.lock("Sea/2.jpg")
        self.assert_stays_as_it_was("Sea/2.jpg", before)
        self.assert_stays_as_it_was("Sea/2.jpg", before)
        self.lock("Sea/2.jpg", 0o644)
        result = self.sync()
        self.assertEqual((result["requested"], result["updatedAssets"], result["problems"]),
                         (0, 0, {}))
        self.assertEqual(self.dump("--hash"), before)

    def test_change_that_cannot_be_read_comes_when_it_can(self):
        self.sync()
        before = self.dump("--hash")
        self.photo("Sea/2.jpg", note=b" edited")
        os.utime(os.path.join(self.host, "Sea/2.jpg"), (1750000000, 1750000000))
        self.lock("Sea/2.jpg")
        self.assert_stays_as_it_was("Sea/2.jpg", before)
        self.lock("Sea/2.jpg", 0o644)
        result = self.sync()
        self.assertEqual((result["requested"], result["imported"], result["problems"]), (1, 1, {}))
        dump = self.dump("--hash")
        self.assert_whole(dump)
        self.assertNotEqual(self.entry_of(dump, "2.jpg")["sha256"],
                            self.entry_of(before, "2.jpg")["sha256"])

    def test_other_changes_are_made_beside_it(self):
        self.sync()
        before = self.dump("--hash")
        self.lock("Sea/2.jpg")
        self.photo("Sea/4.jpg")
        os.remove(os.path.join(self.host, "Sea/1.jpg"))
        result = self.sync()
        self.assertEqual((result["imported"], result["deletedAssets"]), (1, 1))
        dump = self.dump("--hash")
        self.assertEqual(sorted(self.file_names(dump, self.titles(dump["albums"])["Sea"])),
                         ["2.jpg", "3.jpg", "4.jpg"])
        self.assertEqual(self.entry_of(dump, "2.jpg"), self.entry_of(before, "2.jpg"))

    def test_photo_that_was_never_readable_is_reported_and_comes_later(self):
        self.lock("Sea/2.jpg")
        result = self.sync(code=3)
        self.assertEqual(result["outcome"], "partial")
        self.assertEqual((result["imported"], len(result["failed"])), (2, 1))
        self.assertEqual(result["problems"], {
            "Sea/2.jpg": "it cannot be read: Permission denied; it stays in the library, without "
                         "its metadata"})
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
