"""What the commands print: for people, for scripts, and where."""

import json
import os
import plistlib
import pty
import select
import struct
import fcntl
import subprocess
import termios
import unittest

from harness import (EndToEnd, KXSYNC, SUBCLASS_FACES, SUBCLASS_MASTER, album, asset, environment,
                     event, jpeg, kxsync, snapshot, uid)

PLIST = "PhotoLibrary.plist"


def library():
    face = {"faceIndex": 0, "faceAlbumUUID": uid("ann"),
            "faceRectangle": {"X": 0.5, "Y": 0.25, "Width": 0.1, "Height": 0.1}}
    return snapshot([
        album(uid("m"), "Master", [uid(0), uid(1)], subclass=SUBCLASS_MASTER),
        album(uid("a"), "Beach", [uid(0), uid(1)]), event(uid("e"), "2020-01-06"),
        album(uid("ann"), "Ann", [uid(0)], subclass=SUBCLASS_FACES),
        asset(uid(0), eventUUID=uid("e"), latitude=48.5, longitude=9.25, faces=[face],
              originalFileName="one.jpg"),
        asset(uid(1), eventUUID=uid("e"), originalFileName="two.jpg")])


class Streams(EndToEnd):

    def test_sync_says_what_it_did_on_standard_output_alone(self):
        self.bundle(library())
        done = kxsync("sync", self.host, self.device)
        self.assertEqual((done.code, done.err), (0, ""))
        self.assertIn("2 of 2 imported", done.out)
        self.assertIn("3 created", done.out)
        again = kxsync("sync", self.host, self.device)
        self.assertEqual((again.code, again.err), (0, ""))
        self.assertEqual(again.out, "Nothing to do: the device is in line with the host.\n")

    def test_quiet_says_nothing_but_problems(self):
        self.bundle(library(), missing=[uid(1)])
        done = kxsync("sync", self.host, self.device, "--quiet")
        self.assertEqual((done.code, done.out), (3, ""))
        self.assertIn(uid(1), done.err)

    def test_log_lines_come_only_when_asked_for_and_on_standard_error(self):
        self.bundle(library())
        done = kxsync("sync", self.host, self.device, "--log-level", "info", "--json")
        self.assertEqual(done.code, 0)
        self.assertEqual(json.loads(done.out)["outcome"], "synced")
        self.assertIn("Entering reconcileMetadata", done.err)
        self.assertNotIn("KXS", kxsync("sync", self.host, self.device).err)

    def test_result_that_cannot_be_written_is_a_failure(self):
        self.bundle(library())
        self.sync()
        with open("/dev/full", "w", encoding="utf-8") as full:
            done = subprocess.run([KXSYNC, "dump", self.device], stdout=full,
                                  stderr=subprocess.PIPE, env=environment(), check=False)
        self.assertEqual(done.returncode, 1)
        self.assertIn(b"standard output", done.stderr)


class Terminal(EndToEnd):

    def on_terminal(self, *arguments, **variables):
        """Runs kxsync with a terminal of 60 columns as standard error; gives what it drew there."""
        leader, follower = pty.openpty()
        fcntl.ioctl(follower, termios.TIOCSWINSZ, struct.pack("HHHH", 24, 60, 0, 0))
        process = subprocess.Popen([KXSYNC, *arguments], stdin=subprocess.DEVNULL,
                                   stdout=subprocess.PIPE, stderr=follower,
                                   env={**environment(), **variables})
        os.close(follower)
        drawn = b""
        while True:
            try:
                select.select([leader], [], [])
                part = os.read(leader, 65536)
            except OSError:
                break
            if not part:
                break
            drawn += part
        os.close(leader)
        out = process.communicate()[0]
        return process.returncode, out.decode(), drawn.decode()

    def test_progress_is_one_line_that_is_gone_at_the_end(self):
        self.bundle(snapshot([asset(uid(number)) for number in range(300)]))
        code, out, drawn = self.on_terminal("sync", self.host, self.device)
        self.assertEqual(code, 0)
        self.assertIn("300 of 300 imported", out)
        self.assertIn(" of 300 files, ", drawn)
        self.assertTrue(drawn.endswith("\r\x1b[K"), repr(drawn[-80:]))
        self.assertNotIn("\n", drawn)
        for line in drawn.split("\r\x1b[K"):
            self.assertLess(len(line), 60)

    def test_quiet_and_pipes_have_no_progress(self):
        self.bundle(library())
        self.assertEqual(self.on_terminal("sync", self.host, self.device, "--quiet"), (0, "", ""))

    def test_no_color(self):
        for arguments, variables in ((["--no-color"], {}), ([], {"NO_COLOR": "1"}),
                                     ([], {"TERM": "dumb"})):
            _, _, drawn = self.on_terminal("status", self.device, *arguments, **variables)
            self.assertIn("kxsync: ", drawn)
            self.assertNotIn("\x1b[3", drawn)
        self.assertIn("\x1b[31mkxsync: \x1b[0m", self.on_terminal("status", self.device)[2])


class Status(EndToEnd):

    def test_columns_are_aligned(self):
        self.bundle(library())
        self.sync()
        done = kxsync("status", self.device)
        self.assertEqual((done.code, done.err), (0, ""))
        lines = done.out.splitlines()
        for kind, title, count in (("Albums", "Beach", "2"), ("Events", "2020-01-06", "2"),
                                   ("Face albums", "Ann", "1")):
            place = next(i for i, line in enumerate(lines) if line.startswith(kind + " ") and
                         line.endswith("Pending"))
            row = lines[place + 1]
            self.assertTrue(row.startswith(title))
            self.assertEqual(len(row), len(lines[place]))
            self.assertEqual(row.split()[-2:], [count, "0"])
        self.assertIn("2 synced", done.out)

    def test_json(self):
        self.bundle(library())
        self.sync()
        done = kxsync("status", self.device, "--json")
        self.assertEqual((done.code, done.err), (0, ""))
        status = json.loads(done.out)
        self.assertEqual(status["libraryKind"], "Cassock")
        self.assertEqual(status["assets"]["synced"], 2)
        self.assertEqual(status["pending"], 0)
        self.assertTrue(status["lastSynced"])
        self.assertGreater(status["lastSyncDate"], 0)
        self.assertEqual(status["albums"], [{"uuid": uid("a"), "title": "Beach", "kind": 1550,
                                             "assets": 2, "pending": 0}])

    def test_what_is_pending_after_a_sync_in_part(self):
        self.bundle(library(), missing=[uid(1)])
        self.sync(code=3)
        status = json.loads(kxsync("status", self.device, "--json").out)
        self.assertFalse(status["lastSynced"])
        self.assertIsNone(status["lastSyncDate"])
        self.assertIn("not whole", kxsync("status", self.device).out)


class Dump(EndToEnd):

    def test_hash_is_added_only_when_asked_for(self):
        self.bundle(library())
        self.sync()
        self.assertNotIn("sha256", self.dump()["assets"][uid(0)])
        self.assertEqual(len(self.dump("--hash")["assets"][uid(0)]["sha256"]), 64)

    def test_json_is_one_line_and_the_same(self):
        self.bundle(library())
        self.sync()
        plain, line = kxsync("dump", self.device), kxsync("dump", self.device, "--json")
        self.assertEqual(line.out.count("\n"), 1)
        self.assertGreater(plain.out.count("\n"), 50)
        self.assertEqual(json.loads(plain.out), json.loads(line.out))

    def test_documented_keys(self):
        self.bundle(library())
        self.sync()
        dump = self.dump()
        self.assertEqual(list(dump), ["albums", "events", "faceAlbums", "assets", "camera",
                                      "syncProgress", "otaRestoreProgress", "currentLibraryUUID",
                                      "syncAgent", "lastSynced"])
        self.assertEqual(list(dump["assets"][uid(0)]),
                         ["savedAssetType", "isVideo", "creationDate", "modificationDate",
                          "sortToken", "location", "originalFileName", "faces", "path", "size",
                          "incomplete"])
        self.assertEqual(list(dump["albums"][0]), ["uuid", "title", "kind", "pendingItemsType",
                                                   "pendingItemsCount", "assets"])


class Show(EndToEnd):

    def show(self, root, *options, form=plistlib.FMT_BINARY):
        path = self.path(PLIST)
        self.write(path, plistlib.dumps(root, fmt=form, sort_keys=False))
        done = kxsync("show", path, *options)
        self.assertEqual((done.code, done.err), (0, ""), str(done))
        return done.out

    def test_for_people(self):
        text = self.show(library())
        for word in (library()["libraryUUID"], "Cassock", "Beach", "2020-01-06", "face album",
                     "one.jpg", "48.50000, 9.25000", "1 face"):
            self.assertIn(word, text)

    def test_summary_has_counts_alone(self):
        text = self.show(library(), "--summary")
        self.assertIn("1 face album,", text)
        self.assertNotIn("one.jpg", text)
        counts = json.loads(self.show(library(), "--summary", "--json"))["counts"]
        self.assertEqual(counts, {"assets": 2, "videos": 0, "located": 1, "faces": 1, "albums": 1,
                                  "events": 1, "faceAlbums": 1, "masterAlbums": 1, "deletes": 0})

    def test_json_has_everything(self):
        root = library()
        root["deletes"] = [asset(uid("gone"))]
        for form in (plistlib.FMT_BINARY, plistlib.FMT_XML):
            shown = json.loads(self.show(root, "--json", form=form))
            self.assertEqual(list(shown), ["libraryUUID", "libraryKind", "isFolderSync",
                                           "orderedAlbums", "assets", "deletes"])
            self.assertFalse(shown["isFolderSync"])
            self.assertEqual(shown["orderedAlbums"], root["updates"][:4])
            self.assertEqual(shown["assets"], {item["uuid"]: item for item in root["updates"][4:]})
            self.assertEqual(shown["deletes"], {uid("gone"): root["deletes"][0]})

    def test_folder_kind_is_ordered_by_name(self):
        root = snapshot([album(uid(name), name, []) for name in ("b 10", "B 2", "a")],
                        kind="Folder")
        shown = json.loads(self.show(root, "--json"))
        self.assertTrue(shown["isFolderSync"])
        self.assertEqual([item["albumName"] for item in shown["orderedAlbums"]],
                         ["a", "B 2", "b 10"])

    def test_data_and_dates_have_a_form_of_their_own(self):
        import datetime
        root = snapshot([asset(uid(0), userInfo={
            "d": datetime.datetime(2001, 1, 2), "b": b"\0\xff", "n": 2**63, "r": 0.1})])
        shown = json.loads(self.show(root, "--json"))
        self.assertEqual(shown["assets"][uid(0)]["userInfo"],
                         {"d": {"date": 86400.0}, "b": {"base64": "AP8="}, "n": 2**63, "r": 0.1})

    def test_failures_are_one_clear_line(self):
        self.write(self.path("short.plist"), b"bplist")
        self.write(self.path("cut.plist"),
                   plistlib.dumps(library(), fmt=plistlib.FMT_BINARY)[:-40])
        self.write(self.path("array.plist"), plistlib.dumps([], fmt=plistlib.FMT_BINARY))
        self.write(self.path("folder.plist"),
                   plistlib.dumps({"updates": [{"itemType": "Folder", "uuid": "x"}]}))
        for name, words in (("missing.plist", ["No such file"]), ("short.plist", ["E_PLIST_MAGIC"]),
                            ("cut.plist", ["E_PLIST_", "byte"]), ("array.plist", ["array"]),
                            ("folder.plist", ["Unknown object type"]), (".", ["directory"])):
            with self.subTest(name=name):
                self.assert_clear_failure(kxsync("show", self.path(name)), 1, *words)
                done = kxsync("show", self.path(name), "--json")
                self.assertEqual(done.code, 1)
                self.assertIn(words[0], json.loads(done.out)["error"]["message"])


class Snapshot(EndToEnd):

    def test_bundle_in_place_of_something_else_is_refused(self):
        self.write(os.path.join(self.host, "1.jpg"), jpeg())
        self.write(self.path("taken", "notes.txt"), b"mine")
        done = kxsync("snapshot", self.host, self.path("taken"))
        self.assert_clear_failure(done, 1, "taken")
        self.assertEqual(os.listdir(self.path("taken")), ["notes.txt"])

    def test_bundle_inside_the_folder_is_wrong_usage(self):
        self.write(os.path.join(self.host, "1.jpg"), jpeg())
        done = kxsync("snapshot", self.host, os.path.join(self.host, "bundle"))
        self.assertEqual(done.code, 2, str(done))
        self.assertEqual(os.listdir(self.host), ["1.jpg"])

    def test_same_folder_gives_the_same_bytes(self):
        self.write(os.path.join(self.host, "1.jpg"), jpeg())
        for name in ("first", "second"):
            self.assertEqual(kxsync("snapshot", self.host, self.path(name)).code, 0)
        with open(self.path("first", PLIST), "rb") as a, open(self.path("second", PLIST), "rb") as b:
            self.assertEqual(a.read(), b.read())


if __name__ == "__main__":
    unittest.main()
