"""Bundles whose snapshot makes no sense or means harm: one clear error and an untouched device, or a
sync that stays within DEVICE."""

import datetime
import os
import plistlib
import unittest

from harness import (EndToEnd, HOST_EPOCH, SUBCLASS_MASTER, album, asset, event, jpeg, kxsync,
                     snapshot, tree_hash, uid)

NASTY_NAMES = (
    "../../../../../../../../tmp/kxsync-escaped",
    "..",
    ".",
    "/etc/kxsync-escaped",
    "a/b",
    "a\\b",
    "new\nline",
    "\x1b[31mred",
    "photo\u202egpj.exe",
    "-rf",
    "x" * 5000,
    ".kxsync-tmp",
    "Photos.sqlite-journal",
    "Cafe\u0301",
)


class Refused(EndToEnd):
    """The device holds a library already; what follows must leave it as it is."""

    def setUp(self):
        super().setUp()
        self.bundle(snapshot([asset(uid("kept")), album(uid("album"), "Kept", [uid("kept")])]))
        self.sync()
        self.before = tree_hash(self.device)

    def assert_refused(self, *words):
        done = kxsync("sync", self.host, self.device)
        self.assert_clear_failure(done, 1, *words)
        self.assertLess(len(done.err), 1000)
        self.assertEqual(tree_hash(self.device), self.before)
        result = self.sync(code=1)
        self.assertEqual(result["outcome"], "failed")
        self.assertEqual(tree_hash(self.device), self.before)

    def refuse_asset(self, key, value):
        item = asset(uid("kept"))
        item[key] = value
        self.bundle(snapshot([item, asset(uid("new"))]))
        self.assert_refused(key)

    def test_wrong_types_in_an_asset(self):
        wrong = {"uuid": 7, "caption": 7, "eventUUID": [], "adjustments": "x",
                 "exposureDate": "x", "modificationDate": b"x", "longitude": "x", "latitude": [],
                 "originalFileName": 7, "faces": {"a": 1}, "isVideo": "x", "assetProperties": 7}
        for key, value in wrong.items():
            with self.subTest(key=key):
                item = asset(uid("kept"))
                item[key] = value
                self.bundle(snapshot([item]), media={"x": b"x"})
                self.assert_refused(key)

    def test_wrong_types_in_a_face(self):
        for key, value in (("faceAlbumUUID", 7), ("faceIndex", "x"), ("faceRectangle", "x")):
            with self.subTest(key=key):
                face = {"faceAlbumUUID": uid("a"), "faceIndex": 0,
                        "faceRectangle": {"X": 0.1, "Y": 0.1, "Width": 0.1, "Height": 0.1}}
                face[key] = value
                self.bundle(snapshot([asset(uid("kept"), faces=[face])]))
                self.assert_refused(key)

    def test_wrong_types_in_an_album(self):
        wrong = {"uuid": b"x", "albumName": 7, "assetUUIDs": "x", "parentUUID": 7, "subclass": "x",
                 "keyAssetFaceIndex": "x", "keyAssetUUID": 7}
        for key, value in wrong.items():
            with self.subTest(key=key):
                item = album(uid("album"), "Kept", [uid("kept")])
                item[key] = value
                self.bundle(snapshot([asset(uid("kept")), item]))
                self.assert_refused(key)

    def test_wrong_types_in_an_event(self):
        for key, value in (("eventName", 7), ("parentUUID", []), ("keyAssetUUID", 1.5)):
            with self.subTest(key=key):
                item = event(uid("event"), "Day")
                item[key] = value
                self.bundle(snapshot([asset(uid("kept")), item]))
                self.assert_refused(key)

    def test_wrong_types_at_the_root(self):
        for key, value in (("libraryUUID", 7), ("libraryKind", []), ("updates", "x"),
                           ("deletes", "x")):
            with self.subTest(key=key):
                root = snapshot([asset(uid("kept"))])
                media = {uid("kept"): jpeg()}
                root[key] = value
                self.bundle(root, media=media)
                self.assert_refused(key)

    def test_member_that_is_no_text(self):
        self.bundle(snapshot([asset(uid("kept")), album(uid("album"), "A", [uid("kept"), 7])]))
        self.assert_refused("assetUUIDs")

    def test_library_without_identity(self):
        root = snapshot([asset(uid("kept"))])
        del root["libraryUUID"]
        self.bundle(root)
        self.assert_refused("libraryUUID")

    def test_item_without_identity(self):
        item = asset(uid("kept"))
        del item["uuid"]
        self.bundle(snapshot([item]), media={"x": b"x"})
        self.assert_refused("uuid")

    def test_item_of_unknown_type(self):
        for value in ("Folder", "", 7):
            with self.subTest(value=value):
                item = asset(uid("kept"))
                item["itemType"] = value
                self.bundle(snapshot([item]), media={"x": b"x"})
                self.assert_refused("itemType")

    def test_item_that_is_no_dictionary(self):
        root = snapshot([asset(uid("kept"))])
        root["updates"].append(7)
        self.bundle(root, media={"x": b"x"})
        self.assert_refused("updates")

    def test_numbers_that_are_not_finite(self):
        for value in (float("nan"), float("inf"), float("-inf")):
            for key in ("exposureDate", "modificationDate", "latitude", "longitude"):
                with self.subTest(key=key, value=value):
                    item = asset(uid("kept"), latitude=1.0, longitude=1.0)
                    item[key] = value
                    self.bundle(snapshot([item]))
                    self.assert_refused(key)

    def test_rectangle_that_is_not_finite(self):
        face = {"faceAlbumUUID": uid("a"), "faceIndex": 0,
                "faceRectangle": {"X": float("nan"), "Y": 0.1, "Width": 0.1, "Height": 0.1}}
        self.bundle(snapshot([asset(uid("kept"), faces=[face])]))
        self.assert_refused('"X" is not finite')

    def test_root_that_is_no_dictionary(self):
        self.write(os.path.join(self.host, "PhotoLibrary.plist"),
                   plistlib.dumps([1], fmt=plistlib.FMT_BINARY))
        self.assert_refused("array")

    def test_every_truncation_of_a_snapshot(self):
        whole = plistlib.dumps(snapshot([asset(uid("kept"))]), fmt=plistlib.FMT_BINARY)
        for length in range(0, len(whole), max(1, len(whole) // 12)):
            with self.subTest(length=length):
                self.write(os.path.join(self.host, "PhotoLibrary.plist"), whole[:length])
                self.assert_refused("E_PLIST_")

    def test_snapshot_that_is_a_link_is_not_followed(self):
        path = os.path.join(self.host, "PhotoLibrary.plist")
        os.rename(path, self.path("elsewhere.plist"))
        os.symlink(self.path("elsewhere.plist"), path)
        done = kxsync("sync", self.host, self.device)
        self.assertEqual(done.code, 1, str(done))
        self.assertEqual(tree_hash(self.device), self.before)


class Odd(EndToEnd):
    """Libraries that make little sense and are worked on all the same."""

    def sync_twice(self, root, **bundle):
        self.bundle(root, **bundle)
        result = self.sync()
        self.assertEqual(result["outcome"], "synced")
        dump = self.dump()
        self.assert_whole(dump)
        return dump

    def test_album_lists_unknown_assets(self):
        root = snapshot([album(uid("a"), "A", [uid("nowhere"), uid(0), uid("lost")]),
                         asset(uid(0)), asset(uid(1))])
        dump = self.sync_twice(root)
        self.assertEqual(dump["albums"][0]["assets"], [uid(0)])
        self.assertEqual(sorted(dump["assets"]), sorted([uid(0), uid(1)]))

    def test_same_uuid_twice(self):
        root = snapshot([asset(uid(0), originalFileName="first.jpg"),
                         asset(uid(0), originalFileName="second.jpg"),
                         album(uid("a"), "First", [uid(0)]), album(uid("a"), "Second", [uid(0)])])
        dump = self.sync_twice(root)
        self.assertEqual([entry["originalFileName"] for entry in dump["assets"].values()],
                         ["second.jpg"])
        self.assertEqual([entry["title"] for entry in dump["albums"]], ["Second"])

    def test_uuid_listed_twice_in_an_album(self):
        root = snapshot([asset(uid(0)), asset(uid(1)),
                         album(uid("a"), "A", [uid(0), uid(1), uid(0)])])
        self.assertEqual(self.sync_twice(root)["albums"][0]["assets"], [uid(1), uid(0)])

    def test_event_that_is_its_own_parent(self):
        root = snapshot([asset(uid(0), eventUUID=uid("e")),
                         event(uid("e"), "Day", parentUUID=uid("e"))])
        self.assertEqual(self.sync_twice(root)["events"][0]["assets"], [uid(0)])

    def test_event_that_names_an_unknown_event(self):
        self.assertEqual(self.sync_twice(snapshot([asset(uid(0), eventUUID=uid("e"))]))["events"],
                         [])

    def test_master_album_with_unknown_members(self):
        root = snapshot([asset(uid(0)), album(uid("m"), "M", [uid("lost"), uid(0)],
                                              subclass=SUBCLASS_MASTER)])
        self.assertEqual(self.sync_twice(root)["albums"], [])

    def test_place_out_of_range_is_no_place(self):
        root = snapshot([asset(uid(0), latitude=91.0, longitude=10.0),
                         asset(uid(1), latitude=0.0, longitude=0.0)])
        self.assertEqual([entry["location"] for entry in self.sync_twice(root)["assets"].values()],
                         [None, None])

    def test_xml_snapshot_is_read_too(self):
        root = snapshot([asset(uid(0), caption="<&\u00e9>")])
        self.bundle(root)
        xml = plistlib.dumps(root, fmt=plistlib.FMT_XML)
        self.write(os.path.join(self.host, "PhotoLibrary.plist"), xml)
        self.assertEqual(self.sync()["outcome"], "synced")

    def test_opaque_values_pass_through(self):
        root = snapshot([asset(uid(0), userInfo={
            "date": datetime.datetime(2020, 1, 2), "data": b"\0\1", "deep": [[[1, 2.5, True]]]})])
        self.sync_twice(root)


class Nasty(EndToEnd):
    """Names are data: none leads outside DEVICE, and none drives a terminal."""

    def setUp(self):
        super().setUp()
        self.device = self.path("a", "b", "c", "device")
        os.makedirs(os.path.dirname(self.device))

    def outside(self):
        """Everything in the test's directory but the host and the device."""
        found = []
        for folder, names, files in os.walk(self.top):
            names[:] = [name for name in names
                        if os.path.join(folder, name) not in (self.host, self.device)]
            found += [os.path.join(folder, name) for name in names + files]
        return sorted(found)

    def check_inside(self, dump):
        for entry in dump["assets"].values():
            local = os.path.realpath(self.device + entry["path"])
            self.assertTrue(local.startswith(os.path.realpath(self.device) + "/"), local)

    def test_file_names_albums_and_captions(self):
        before = self.outside()
        items = [asset(uid(number), originalFileName=name, caption=name)
                 for number, name in enumerate(NASTY_NAMES)]
        items += [album(uid(name), name, [uid(number)]) for number, name in enumerate(NASTY_NAMES)]
        items += [event("event" + uid(name), name) for name in NASTY_NAMES]
        self.bundle(snapshot(items))
        result = self.sync()
        self.assertEqual(result["outcome"], "synced")
        dump = self.dump()
        self.assert_whole(dump)
        self.check_inside(dump)
        self.assertEqual(self.outside(), before)
        for command in ("status", "dump"):
            done = kxsync(command, self.device)
            self.assertEqual(done.code, 0)
            self.assertNotIn("\x1b", done.out)
        done = kxsync("show", os.path.join(self.host, "PhotoLibrary.plist"))
        self.assertEqual(done.code, 0)
        self.assertNotIn("\x1b", done.out)
        self.assertNotIn("\u202e", done.out)

    def test_identifiers(self):
        before = self.outside()
        names = list(NASTY_NAMES)
        items = [asset(name) for name in names]
        items += [album("album" + name, "A", [name]) for name in names]
        media = {name: jpeg() for name in names
                 if "/" not in name and name not in (".", "..") and len(name) < 250}
        self.bundle(snapshot(items), media=media)
        result = self.sync(code=3)
        self.assertEqual(result["imported"], len(media))
        self.assertEqual(sorted(entry["uuid"] for entry in result["failed"]),
                         sorted(set(names) - set(media)))
        self.assertNotIn("\x1b", result["stderr"])
        dump = self.dump()
        self.check_inside(dump)
        self.assertEqual(sorted(dump["assets"]), sorted(media))
        self.assertEqual(self.outside(), before)

    def test_text_with_nul_is_no_text(self):
        before = self.outside()
        for items in ([asset("nul\0byte")], [asset(uid(0), originalFileName="nul\0byte")],
                      [asset(uid(0)), album(uid("a"), "nul\0byte", [])]):
            self.bundle(snapshot(items), media={uid(0): jpeg(), "nul": jpeg()})
            self.assert_clear_failure(kxsync("sync", self.host, self.device), 1,
                                      "E_TEXT_ENCODING")
            self.assertEqual(self.outside(), before)
            if os.path.exists(self.device):
                self.assertEqual(self.dump()["assets"], {})

    def test_media_that_is_no_regular_file(self):
        root = snapshot([asset(uid(number)) for number in range(4)])
        self.bundle(root, media={uid(3): jpeg()})
        media = os.path.join(self.host, "media")
        secret = self.path("secret")
        self.write(secret, b"secret")
        os.symlink(secret, os.path.join(media, uid(0)))
        os.mkfifo(os.path.join(media, uid(1)))
        os.makedirs(os.path.join(media, uid(2)))
        result = self.sync(code=3)
        self.assertEqual(result["imported"], 1)
        self.assertEqual(sorted(entry["uuid"] for entry in result["failed"]),
                         sorted(uid(number) for number in range(3)))
        self.assertEqual(list(self.dump()["assets"]), [uid(3)])


class Dates(EndToEnd):

    def test_dates_survive_bit_for_bit(self):
        values = [0.1, 1e9 + 1e-7, -5.5, 3661152000.123456]
        items = [asset(uid(number), exposureDate=value, modificationDate=value)
                 for number, value in enumerate(values)]
        self.bundle(snapshot(items))
        self.sync()
        dump = self.dump()
        for number, value in enumerate(values):
            self.assertEqual(dump["assets"][uid(number)]["creationDate"], value - HOST_EPOCH)
            self.assertEqual(dump["assets"][uid(number)]["modificationDate"], value - HOST_EPOCH)
        self.assert_nothing_to_do()


if __name__ == "__main__":
    unittest.main()
