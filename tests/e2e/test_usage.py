"""The command line itself: help, wrong usage, hosts and devices that cannot be used."""

import json
import os
import unittest

from harness import EndToEnd, OrdinaryUser, asset, jpeg, kxsync, snapshot, tree_hash, uid

COMMANDS = ("sync", "plan", "status", "dump", "show", "snapshot", "restore", "backup",
            "metrics", "backup-paths")


class Help(EndToEnd):

    def test_every_command_explains_itself_with_examples(self):
        done = kxsync("--help")
        self.assertEqual((done.code, done.err), (0, ""))
        for command in COMMANDS:
            self.assertIn(command, done.out)
            own = kxsync(command, "--help")
            self.assertEqual((own.code, own.err), (0, ""))
            self.assertIn("Examples:", own.out)
            self.assertIn(f"kxsync {command} ", own.out)
            for option in ("--json", "--quiet", "--log-level", "--no-color"):
                self.assertIn(option, own.out)

    def test_version(self):
        done = kxsync("--version")
        self.assertEqual((done.code, done.err), (0, ""))
        self.assertRegex(done.out, r"^kxsync \d+\.\d+\.\d+\n$")


class WrongUsage(EndToEnd):

    TABLE = (
        ([], "a command is missing"),
        (["frobnicate"], '"frobnicate"'),
        (["plan", "a"], "DEVICE"),
        (["--frobnicate"], "--frobnicate"),
        (["sync"], "HOST"),
        (["sync", "a"], "DEVICE"),
        (["sync", "a", "b", "c"], "c"),
        (["sync", "a", "b", "--dry"], "--dry"),
        (["sync", "a", "b", "--log-level", "loud"], "loud"),
        (["sync", "a", "b", "--log-level"], "--log-level"),
        (["sync", "a", "b", "--timezone", "CEST"], "CEST"),
        (["sync", "a", "b", "--library-id", "no-uuid"], "no-uuid"),
        (["status"], "DEVICE"),
        (["status", "a", "b"], "b"),
        (["status", "a", "--hash"], "--hash"),
        (["dump"], "DEVICE"),
        (["show"], "FILE"),
        (["snapshot", "a"], "HOST"),
        (["backup"], "DEVICE"),
        (["backup", "a"], "BACKUP"),
        (["backup", "a", "a"], "same directory"),
        (["backup", "a", "a/b"], "BACKUP lies inside DEVICE"),
        (["backup", "a", "--verify", "b"], "--verify"),
        (["backup", "--verify"], "--verify"),
        (["backup", "--verify", "a", "--with-library"], "--verify"),
        (["metrics"], "DEVICE"),
        (["metrics", "a", "b"], "b"),
        (["backup-paths"], "DEVICE"),
    )

    def setUp(self):
        super().setUp()
        self.write(self.path("a", "photo.jpg"), jpeg())

    def test_one_clear_line_a_hint_and_exit_code_2(self):
        for arguments, word in self.TABLE:
            with self.subTest(arguments=arguments):
                done = kxsync(*arguments, cwd=self.top)
                self.assertEqual(done.code, 2, str(done))
                self.assertEqual(done.out, "")
                lines = done.err.splitlines()
                self.assertEqual(len(lines), 2, str(done))
                self.assertTrue(lines[0].startswith("kxsync: "), str(done))
                self.assertIn(word, lines[0])
                self.assertRegex(lines[1], r'^Try "kxsync( [\w-]+)? --help"\.$')
        self.assertEqual(sorted(os.listdir(self.top)), ["a"], "nothing was made")

    def test_wrong_usage_is_json_too_when_asked_for(self):
        for arguments, word in self.TABLE:
            with self.subTest(arguments=arguments):
                done = kxsync("--json", *arguments, cwd=self.top)
                self.assertEqual(done.code, 2, str(done))
                error = json.loads(done.out)["error"]
                self.assertEqual(sorted(error), ["code", "domain", "message"])
                self.assertIn(word, error["message"])

    def test_nesting_is_wrong_usage(self):
        os.makedirs(self.path("photos", "inner"))
        self.write(self.path("photos", "1.jpg"), jpeg())
        os.symlink(self.path("photos"), self.path("link"))
        for host, device in (("photos", "photos/device"), ("photos/inner", "photos"),
                             ("photos", "photos"), ("link", "photos/device"),
                             ("photos", "link/device"), ("photos", "photos/inner/../device")):
            with self.subTest(host=host, device=device):
                before = tree_hash(self.top)
                done = kxsync("sync", self.path(host), self.path(device))
                self.assertEqual(done.code, 2, str(done))
                self.assertRegex(done.err, "inside|same directory")
                self.assertEqual(tree_hash(self.top), before)


class UnusableHost(EndToEnd):

    def refused(self, *words, code=1):
        done = kxsync("sync", self.host, self.device)
        self.assert_clear_failure(done, code, *words)
        result = self.sync(code=code)
        self.assertEqual(result["outcome"], "failed")
        self.assertIsNotNone(result["error"])
        self.assertFalse(os.path.exists(os.path.join(self.device, "var/mobile/Media/Photos/Sync/"
                                                     "PhotoLibrary.plist")))

    def test_missing_folder(self):
        self.refused(self.host)

    def test_empty_folder_is_never_an_empty_library(self):
        os.makedirs(os.path.join(self.host, "deeper"))
        self.refused(self.host)

    def test_folder_without_photos(self):
        self.write(os.path.join(self.host, "notes.txt"), b"words")
        self.refused(self.host)

    def test_file_in_place_of_a_folder(self):
        self.write(self.host, jpeg())
        self.refused(self.host)

    def test_bundle_with_a_broken_snapshot(self):
        self.write(os.path.join(self.host, "PhotoLibrary.plist"), b"bplist00 and no more")
        os.makedirs(os.path.join(self.host, "media"))
        self.refused("E_PLIST_")

    @unittest.skipUnless(os.geteuid() == 0, "drops root's rights")
    def test_folder_that_may_not_be_read(self):
        self.write(os.path.join(self.host, "1.jpg"), jpeg())
        os.makedirs(os.path.join(self.host, "closed"))
        os.chmod(os.path.join(self.host, "closed"), 0)
        self.assert_clear_failure(OrdinaryUser(self.top).kxsync("sync", self.host, self.device), 1,
                                  "closed")


class UnusableDevice(EndToEnd):

    def test_missing_device_is_one_line_for_status_and_dump(self):
        for command in ("status", "dump"):
            with self.subTest(command=command):
                self.assert_clear_failure(kxsync(command, self.device), 1, self.device)
                done = kxsync(command, self.device, "--json")
                self.assertEqual(done.code, 1)
                self.assertIn(self.device, json.loads(done.out)["error"]["message"])
                self.assertFalse(os.path.exists(self.device))

    def test_directory_that_is_no_device_is_not_read_as_one(self):
        self.write(os.path.join(self.device, "notes.txt"), b"words")
        before = tree_hash(self.device)
        for command in ("status", "dump"):
            self.assert_clear_failure(kxsync(command, self.device), 1, self.device)
        self.assertEqual(tree_hash(self.device), before)

    def test_file_in_place_of_a_device(self):
        self.write(self.device, b"words")
        self.bundle(snapshot([asset(uid(0))]))
        self.assert_clear_failure(kxsync("sync", self.host, self.device), 1, self.device)
        self.assert_clear_failure(kxsync("status", self.device), 1, self.device)

    def test_device_below_a_directory_that_is_missing(self):
        self.bundle(snapshot([asset(uid(0))]))
        self.device = self.path("new", "device")
        self.assert_clear_failure(kxsync("sync", self.host, self.device), 1, self.device)
        self.assertFalse(os.path.exists(self.path("new")))


if __name__ == "__main__":
    unittest.main()
