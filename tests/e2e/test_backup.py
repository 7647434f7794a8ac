"""Backups, storage figures and backup lists, as a user meets them."""

import fcntl
import json
import os
import pty
import shutil
import signal
import subprocess
import sys
import time
import unittest

from harness import (EndToEnd, KXSYNC, OrdinaryUser, album, asset, environment, file_hash, finish,
                     kxsync, snapshot, start, tree_hash, uid)

sys.path.insert(0, os.path.join(os.path.dirname(__file__), "..", "drive"))
from console import Console  # noqa: E402

DCIM = "/var/mobile/Media/DCIM/"
WAIT_SECONDS = 120


class BackupCase(EndToEnd):
    """A device with a synced photo, two of its own, and an album of its own."""

    def setUp(self):
        super().setUp()
        self.backup = self.path("backup")
        self.bundle(snapshot([album(uid("album"), "Synced", [uid("s")]), asset(uid("s"))]))
        self.sync()
        self.own("100AB/IMG_0001.JPG", b"one")
        self.own("100AB/IMG_0002.JPG", b"two" * 1000)
        console = Console(self.device)
        for number in (1, 2):
            path = f"{DCIM}100AB/IMG_000{number}.JPG"
            console("device.addAsset", uuid=uid(number), path=path, isVideo=False,
                    originalFilesize=os.path.getsize(self.device + path))
        console("device.addAlbum", uuid=uid("mine"), title="Mine", kind=2,
                assets=[uid(2), uid(1)])
        self.assertEqual(console.close(), 0)

    def own(self, name, data):
        self.write(self.device + DCIM + name, data)

    def take(self, *options, code=0):
        done = kxsync("backup", self.device, self.backup, "--json", *options)
        self.assertEqual(done.code, code, str(done))
        self.assertEqual(done.out.count("\n"), 1, "one line of JSON")
        return json.loads(done.out)

    def verify(self, code=0):
        done = kxsync("backup", "--verify", self.backup, "--json")
        self.assertEqual(done.code, code, str(done))
        return json.loads(done.out)

    def refused(self, code, word, *arguments):
        """Ends with that code and one line that has the word, and leaves the device alone."""
        before = tree_hash(self.device + "/var/mobile/Media/DCIM")
        arguments = arguments or ("backup", self.device, self.backup)
        done = kxsync(*arguments)
        self.assertEqual((done.code, done.out), (code, ""), str(done))
        self.assertEqual(done.err.count("\n"), 1, str(done))
        self.assertIn(word, done.err)
        self.assertEqual(tree_hash(self.device + "/var/mobile/Media/DCIM"), before)
        return done.err


class Taking(BackupCase):

    def test_result_and_files(self):
        result = self.take()
        self.assertEqual(list(result), ["identity", "files", "bytes", "copiedFiles", "copiedBytes",
                                        "removedFiles", "albums", "library", "failed", "leftOut",
                                        "seconds", "error"])
        self.assertEqual((result["files"], result["bytes"], result["copiedFiles"],
                          result["copiedBytes"], result["albums"], result["library"]),
                         (2, 3003, 2, 3003, 1, False))
        with open(self.path("backup", "manifest.json"), encoding="utf-8") as stream:
            manifest = json.load(stream)
        self.assertEqual(manifest["identity"], result["identity"])
        self.assertEqual([entry["path"] for entry in manifest["files"]],
                         [DCIM + "100AB/IMG_0001.JPG", DCIM + "100AB/IMG_0002.JPG"])
        for entry in manifest["files"]:
            self.assertEqual(entry["sha256"],
                             file_hash(self.path("backup", "DCIM/100AB", entry["path"][-12:])))
        with open(self.path("backup", "albums.json"), encoding="utf-8") as stream:
            albums = json.load(stream)["albums"]
        self.assertEqual([(entry["title"], entry["members"]) for entry in albums],
                         [("Mine", [DCIM + "100AB/IMG_0002.JPG", DCIM + "100AB/IMG_0001.JPG"])])
        check = self.verify()
        self.assertEqual((check["identity"], check["files"], check["damaged"], check["error"]),
                         (result["identity"], 2, [], None))

    def test_for_people(self):
        done = kxsync("backup", self.device, self.backup, "--with-library")
        self.assertEqual((done.code, done.err), (0, ""), str(done))
        self.assertRegex(done.out, r"\ABacked up in 0:\d\d\.\n"
                         r"Files       2 \(3\.0 kB\), 2 copied \(3\.0 kB\), 0 gone\n"
                         r"Albums      1 of the device's own\n"
                         r"Library     in it\n\Z")
        done = kxsync("backup", "--verify", self.backup)
        self.assertEqual((done.code, done.err), (0, ""), str(done))
        self.assertRegex(done.out, r"\AThe backup is whole: 2 files, 3\.0 kB, taken .*\)\.\n\Z")
        done = kxsync("backup", self.device, self.backup, "--quiet")
        self.assertEqual((done.code, done.out, done.err), (0, "", ""))

    def test_only_what_changed_is_copied(self):
        self.take("--with-library")
        self.own("100AB/IMG_0003.JPG", b"three")
        os.remove(self.device + DCIM + "100AB/IMG_0001.JPG")
        result = self.take("--with-library")
        self.assertEqual((result["copiedFiles"], result["removedFiles"], result["library"]),
                         (1, 1, True))
        self.assertEqual(self.verify()["files"], 2)
        self.assertEqual(self.take()["copiedFiles"], 0)

    def test_damage_is_named(self):
        self.take("--with-library")
        for name, data in (("DCIM/100AB/IMG_0001.JPG", b"0ne"), ("albums.json", b"[]")):
            self.write(self.path("backup", name), data)
        check = self.verify(code=3)
        self.assertEqual([entry["path"] for entry in check["damaged"]],
                         [DCIM + "100AB/IMG_0001.JPG", "albums.json"])
        done = kxsync("backup", "--verify", self.backup)
        self.assertEqual(done.code, 3)
        self.assertIn(f"damaged: {DCIM}100AB/IMG_0001.JPG: its content is damaged", done.err)
        # As the hint says: what was removed is copied anew.
        os.remove(self.path("backup", "DCIM/100AB/IMG_0001.JPG"))
        self.assertEqual(self.take()["copiedFiles"], 1)
        self.verify()

    def test_links_are_left_out_and_said(self):
        os.symlink("/etc/passwd", self.device + DCIM + "100AB/link.JPG")
        done = kxsync("backup", self.device, self.backup)
        self.assertEqual(done.code, 0, str(done))
        self.assertIn(f"left out: {DCIM}100AB/link.JPG: a link, not followed", done.err)
        self.assertFalse(os.path.lexists(self.path("backup", "DCIM/100AB/link.JPG")))

    def test_progress_is_shown_on_a_terminal_alone(self):
        master, slave = pty.openpty()
        done = subprocess.run([KXSYNC, "backup", self.device, self.backup], stdout=subprocess.PIPE,
                              stderr=slave, env=environment(), check=False)
        os.close(slave)
        shown = os.read(master, 65536).decode()
        os.close(master)
        self.assertEqual(done.returncode, 0)
        for text in ("looking at the device", "copying: ", "of 2 files", "in place"):
            self.assertIn(text, shown)


class Refusals(BackupCase):

    def test_nesting_is_wrong_usage(self):
        for backup, word in ((self.device, "same directory"),
                             (os.path.join(self.device, "var/backup"), "BACKUP lies inside DEVICE"),
                             (self.top, "DEVICE lies inside BACKUP")):
            done = kxsync("backup", self.device, backup)
            self.assertEqual(done.code, 2, str(done))
            self.assertIn(word, done.err.splitlines()[0])

    def test_no_device(self):
        self.refused(1, "does not exist", "backup", self.path("missing"), self.backup)
        os.mkdir(self.path("empty"))
        self.refused(1, "holds no photo library", "backup", self.path("empty"), self.backup)
        self.assertFalse(os.path.exists(self.backup))

    def test_no_place_for_the_backup(self):
        self.refused(1, "No such file or directory", "backup", self.device,
                     self.path("missing/backup"))
        self.write(self.path("file"), b"x")
        self.refused(1, "is no directory", "backup", self.device, self.path("file"))

    def test_something_else_is_there(self):
        self.write(self.path("backup", "notes.txt"), b"mine")
        self.refused(1, "holds something else than a backup (notes.txt)")
        self.assertEqual(os.listdir(self.backup), ["notes.txt"])
        shutil.rmtree(self.backup)
        self.write(self.path("backup", "manifest.json"), b'{"name": "an app"}')
        self.refused(1, "manifest.json cannot be used")
        self.assertEqual(os.listdir(self.backup), ["manifest.json"])

    def test_verifying_what_is_no_backup(self):
        self.refused(1, "does not exist", "backup", "--verify", self.path("missing"))
        os.mkdir(self.backup)
        self.refused(1, "holds no whole backup", "backup", "--verify", self.backup)
        self.take()
        with open(self.path("backup", "manifest.json"), "r+b") as stream:
            stream.seek(40)
            stream.write(b"#")
        self.refused(1, "manifest.json cannot be used", "backup", "--verify", self.backup)

    def test_a_lost_camera_roll_does_not_take_the_backup_with_it(self):
        self.take()
        shutil.rmtree(self.device + DCIM)
        self.refused(4, "--allow-deletes")
        self.assertEqual(self.verify()["files"], 2)
        self.assertEqual(self.take("--allow-deletes")["removedFiles"], 2)

    def test_another_run_holds_the_device(self):
        console = Console(self.device)
        console("currentSyncAnchor")
        line = self.refused(7, f"pid {console.process.pid}")
        self.assertIn("another process holds the device", line)
        self.assertEqual(console.close(), 0)
        self.take()

    def test_another_backup_of_the_device_is_running(self):
        path = self.device + "/tmp/BackupRunning"
        self.write(path, b"4711\n")
        with open(path, "r+b") as stream:
            fcntl.flock(stream, fcntl.LOCK_EX)
            self.refused(7, "another backup of the device is running (pid 4711)")
        self.take()

    def test_two_backups_into_one_directory(self):
        self.take()
        directory = os.open(self.backup, os.O_RDONLY)
        fcntl.flock(directory, fcntl.LOCK_SH)
        self.refused(7, "another process uses the backup")
        self.verify()
        os.close(directory)
        self.take()


@unittest.skipUnless(os.geteuid() == 0, "becomes an ordinary user, whom permissions bind")
class OtherUsers(BackupCase):

    def setUp(self):
        super().setUp()
        self.user = OrdinaryUser(self.top)
        for folder, names, files in os.walk(self.device):
            for name in [".", *names, *files]:
                os.chown(os.path.join(folder, name), OrdinaryUser.NOBODY, OrdinaryUser.NOBODY)

    def test_a_file_that_may_not_be_read_fails_by_name_and_keeps_its_old_copy(self):
        self.assertEqual(self.user.kxsync("backup", self.device, self.backup).code, 0)
        path = self.device + DCIM + "100AB/IMG_0002.JPG"
        self.own("100AB/IMG_0002.JPG", b"newer")
        os.chmod(path, 0)
        done = self.user.kxsync("backup", self.device, self.backup, "--json")
        self.assertEqual(done.code, 3, str(done))
        result = json.loads(done.out)
        self.assertEqual(result["failed"], [{"path": DCIM + "100AB/IMG_0002.JPG",
                                             "reason": "cannot be read: Permission denied"}])
        self.assertIn("not backed up: " + DCIM + "100AB/IMG_0002.JPG", done.err)
        check = json.loads(self.user.kxsync("backup", "--verify", self.backup, "--json").out)
        self.assertEqual((check["files"], check["damaged"]), (2, []))
        self.assertEqual(os.path.getsize(self.path("backup/DCIM/100AB/IMG_0002.JPG")), 3000)

    def test_a_directory_that_may_not_be_read_keeps_what_was_beneath(self):
        self.assertEqual(self.user.kxsync("backup", self.device, self.backup).code, 0)
        os.chmod(self.device + DCIM + "100AB", 0)
        done = self.user.kxsync("backup", self.device, self.backup, "--json")
        self.assertEqual(done.code, 3, str(done))
        self.assertEqual([entry["path"] for entry in json.loads(done.out)["failed"]],
                         [DCIM + "100AB"])
        check = self.user.kxsync("backup", "--verify", self.backup, "--json")
        self.assertEqual(json.loads(check.out)["files"], 2)

    def test_another_users_backup_is_refused(self):
        foreign = self.path("foreign")
        os.mkdir(foreign)
        for arguments in ((self.device, foreign), ("--verify", foreign)):
            done = self.user.kxsync("backup", *arguments)
            self.assertEqual((done.code, done.err.count("\n")), (1, 1), str(done))
            self.assertIn("belongs to another user", done.err)

    def test_a_directory_that_may_not_be_written(self):
        os.mkdir(self.backup)
        os.chown(self.backup, OrdinaryUser.NOBODY, OrdinaryUser.NOBODY)
        os.chmod(self.backup, 0o500)
        done = self.user.kxsync("backup", self.device, self.backup)
        self.assertEqual((done.code, done.err.count("\n")), (1, 1), str(done))
        self.assertIn("Permission denied", done.err)


class Signals(BackupCase):

    def incoming(self):
        """How many files of a backup that is being taken have been begun."""
        try:
            return len(os.listdir(self.path("backup/.incoming/DCIM/101AB")))
        except FileNotFoundError:
            return 0

    def test_a_signal_ends_it_and_the_same_command_goes_on(self):
        for number in range(3000):
            self.own(f"101AB/{number}.JPG", bytes([number % 256]) * 20000)
        for number, code in ((signal.SIGINT, 130), (signal.SIGTERM, 143)):
            copied = self.incoming()
            process = start("backup", self.device, self.backup, "--json")
            self.addCleanup(process.kill)
            until = time.monotonic() + WAIT_SECONDS
            while self.incoming() < copied + 300:
                self.assertIsNone(process.poll(), "it ended before enough was copied")
                self.assertLess(time.monotonic(), until)
            process.send_signal(number)
            done = finish(process)
            self.assertEqual(done.code, code, str(done))
            self.assertIsNotNone(json.loads(done.out)["error"])
            self.assertEqual(done.err.count("\n"), 1)
            self.assertEqual(kxsync("backup", "--verify", self.backup).code, 1, "none yet")
        result = self.take()
        self.assertLess(result["copiedFiles"], 2800, "what was copied is not copied again")
        self.assertEqual(self.verify()["files"], 3002)


SMALL_DISK = """
set -e
mount -t tmpfs -o size=$4 none "$3"
cp -a "$5/." "$3/" 2> /dev/null || true
set +e
"$1" backup "$2" "$3" --json; echo "$?"
"$1" backup --verify "$3" --json; echo "$?"
ls -A "$3" | wc -l
mount -o remount,ro "$3"
"$1" backup "$2" "$3" --json; echo "$?"
"$1" backup --verify "$3" --json > /dev/null; echo "$?"
"""


def can_mount():
    done = subprocess.run(["unshare", "-rm", "mount", "-t", "tmpfs", "none", "/mnt"],
                          capture_output=True, check=False)
    return done.returncode == 0


@unittest.skipUnless(can_mount(), "needs a mount namespace of its own")
class Disks(BackupCase):

    def run_on(self, size):
        old = self.path("old")
        os.makedirs(self.path("disk"), exist_ok=True)
        done = subprocess.run(["unshare", "-rm", "sh", "-c", SMALL_DISK, "sh", KXSYNC, self.device,
                               self.path("disk"), size, old],
                              capture_output=True, text=True, env=environment(), check=False)
        lines = done.stdout.splitlines()
        self.assertEqual(len(lines), 8, done.stdout + done.stderr)
        return [json.loads(line) for line in lines], done.stderr

    def test_a_full_disk_keeps_the_old_backup_and_a_read_only_one_says_so(self):
        self.take()
        os.rename(self.backup, self.path("old"))
        self.own("101AB/large.MOV", b"x" * 5_000_000)
        answers, err = self.run_on("4m")
        taken, code, check, verified, entries, written, denied, readable = answers
        self.assertEqual((code, verified, denied, readable), (6, 0, 1, 0), err)
        self.assertIn("no space left on the backup's disk", taken["error"]["message"])
        self.assertIn("no space left on the backup's disk", err)
        self.assertEqual(check["files"], 2)
        self.assertEqual(entries, 3, "nothing is left of the attempt")
        self.assertIn("Read-only file system", written["error"]["message"])


class Metrics(BackupCase):

    def metrics(self):
        done = kxsync("metrics", self.device, "--json")
        self.assertEqual((done.code, done.err), (0, ""), str(done))
        return json.loads(done.out)

    def test_figures(self):
        answer = self.metrics()
        block = os.statvfs(self.device).f_frsize
        self.assertEqual(answer["metrics"]["Shoebox"],
                         {"_PhysicalSize": 2 * block if block >= 3000 else 4 * block, "_Count": 2})
        self.assertEqual(answer["metrics"]["Photo"]["_Count"], 1)
        self.assertEqual(answer["metrics"]["Photo"]["_PhysicalSize"] % block, 0)
        self.assertGreater(answer["metrics"]["Photo"]["_PhysicalSize"], 0)
        disk = os.statvfs(self.device)
        self.assertEqual(answer["capacity"], disk.f_frsize * disk.f_blocks)
        self.assertAlmostEqual(answer["shares"]["Photo"], answer["metrics"]["Photo"][
            "_PhysicalSize"] / answer["capacity"])
        self.assertFalse(answer["backupRunning"])

    def test_for_people(self):
        done = kxsync("metrics", self.device)
        self.assertEqual((done.code, done.err), (0, ""), str(done))
        lines = done.out.splitlines()
        self.assertEqual([line[:20].strip() for line in lines],
                         ["Synced photos", "The device's photos", "Everything else", "Free"])
        self.assertTrue(lines[1].endswith("2 photos"))
        master, slave = pty.openpty()
        code = subprocess.run([KXSYNC, "metrics", self.device], stdout=slave, env=environment(),
                              check=False).returncode
        os.close(slave)
        shown = os.read(master, 65536).decode()
        os.close(master)
        self.assertEqual(code, 0)
        self.assertRegex(shown.splitlines()[0], r"^\[#[#=\-.]{58}\.\]$|^\[#[#=\-.]{59}\]$")
        self.assertEqual(len(shown.splitlines()), 5)

    def test_while_a_backup_runs(self):
        self.take()
        with open(self.device + "/tmp/BackupRunning", "rb") as stream:
            fcntl.flock(stream, fcntl.LOCK_EX)
            answer = self.metrics()
            self.assertEqual((answer["backupRunning"], answer["metrics"]), (True, {}))
            done = kxsync("metrics", self.device)
            self.assertIn("A backup is running", done.out)
        self.assertFalse(self.metrics()["backupRunning"])

    def test_while_a_sync_holds_the_device(self):
        console = Console(self.device)
        console("currentSyncAnchor")
        self.assertEqual(self.metrics()["metrics"]["Shoebox"]["_Count"], 2)
        done = kxsync("backup-paths", self.device)
        self.assertEqual((done.code, done.out), (0, "DCIM\n"))
        self.assertEqual(console.close(), 0)

    def test_paths(self):
        done = kxsync("backup-paths", self.device, "--json")
        self.assertEqual(json.loads(done.out), {"pathsToBackup": ["DCIM"]})
        self.refused(1, "does not exist", "backup-paths", self.path("missing"))
        self.refused(1, "does not exist", "metrics", self.path("missing"))

    def test_nothing_is_changed(self):
        before = tree_hash(self.device)
        self.metrics()
        kxsync("backup-paths", self.device)
        self.assertEqual(tree_hash(self.device), before)


if __name__ == "__main__":
    unittest.main()
