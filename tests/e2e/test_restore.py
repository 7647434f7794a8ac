"""Restores: of a large device with and without the library, onto other devices, of bad backups."""

import hashlib
import json
import os
import shutil
import signal
import sqlite3
import stat
import subprocess
import tempfile
import time
import unittest

from harness import (EndToEnd, KXSYNC, album, asset, environment, exif_of, file_hash, finish, jpeg,
                     kxsync, snapshot, start, uid)

CAMERA_ASSETS = 2000
SYNCED = 300
MEDIA = "var/mobile/Media"
DCIM = MEDIA + "/DCIM"
DATABASE = MEDIA + "/PhotoData/Photos.sqlite"


def camera_name(number):
    return f"{100 + number // 1000}CAMRA/IMG_{number % 1000:04d}"


class Restores(EndToEnd):

    def restore(self, backup=None, device=None, code=0):
        done = kxsync("restore", backup or self.backup, device or self.device, "--json")
        self.assertEqual(done.code, code, str(done))
        self.assertEqual(done.out.count("\n"), 1, "one line of JSON")
        return json.loads(done.out)

    def take(self, *options, device=None, backup=None):
        done = kxsync("backup", device or self.device, backup or self.backup, *options)
        self.assertEqual(done.code, 0, str(done))

    def setUp(self):
        super().setUp()
        self.backup = self.path("backup")

    # A device's own photos, put into its library the way a camera would, but many at once.

    def make_camera(self, count, first=0, albums=()):
        if not os.path.exists(os.path.join(self.device, DATABASE)):
            self.bundle(snapshot([]))
            self.sync()
        paths = {}
        for number in range(first, first + count):
            picture = jpeg(f"camera {number}".encode(),
                           exif_of(f"2021:{number % 12 + 1:02d}:03 04:05:06"))
            paths[number] = [f"/{DCIM}/{camera_name(number)}.JPG"]
            self.write(self.device + paths[number][0], picture)
            if number % 50 == 0:
                paths[number].append(f"/{DCIM}/{camera_name(number)}.MOV")
                self.write(self.device + paths[number][1], b"film %d" % number)
        base = sqlite3.connect(os.path.join(self.device, DATABASE))
        with base:
            for number, files in paths.items():
                cursor = base.execute(
                    "INSERT INTO assets(uuid, saved_type, is_video, incomplete, creation_date, "
                    "path, size) VALUES(?, 0, 0, 0, ?, ?, ?)",
                    (uid(f"camera-{number}"), 600000000.0 + number, files[0],
                     os.path.getsize(self.device + files[0])))
                for ordinal, path in enumerate(files if len(files) > 1 else []):
                    base.execute("INSERT INTO asset_files VALUES(?, ?, ?)",
                                 (cursor.lastrowid, ordinal, path))
            for title, members in albums:
                self.insert_album(base, title, members)
        base.close()

    def insert_album(self, base, title, members):
        album_row = base.execute(
            "INSERT INTO albums(uuid, kind, title, pending_type, pending_count, managed) "
            "VALUES(?, 2, ?, 1, 0, 1)", (uid(f"own-{title}"), title)).lastrowid
        base.execute("INSERT INTO list_entries VALUES(?, 1, (SELECT coalesce(max(position) + 1, 0) "
                     "FROM list_entries WHERE list = 1))", (album_row,))
        for position, member in enumerate(members):
            base.execute("INSERT INTO memberships SELECT ?, pk, ? FROM assets WHERE uuid = ?",
                         (album_row, position, uid(f"camera-{member}")))

    def camera_hashes(self, device=None):
        top = os.path.join(device or self.device, DCIM)
        return {os.path.relpath(os.path.join(folder, name), top):
                file_hash(os.path.join(folder, name))
                for folder, _, names in os.walk(top) for name in names}

    def own_albums(self, device=None):
        """Title and members' paths of the device's own albums, in order."""
        dump = json.loads(kxsync("dump", device or self.device, "--json").out)
        return [(entry["uuid"], entry["title"],
                 [dump["assets"][member]["path"] for member in entry["assets"]])
                for entry in dump["albums"] if entry["kind"] == 2]

    def assert_at_rest(self, device=None):
        device = device or self.device
        dump = json.loads(kxsync("dump", device, "--json").out)
        self.assertEqual([entry["path"] for entry in dump["assets"].values()
                          if entry["incomplete"]], [])
        for name in ("camera", "otaRestoreProgress", "syncProgress"):
            self.assertEqual(dump[name], {"pendingItemsType": 1, "pendingItemsCount": 0}, name)
        for left in ("PhotoData/RestoreMarker.plist", "PhotoData/Caches/restoreContext.plist"):
            self.assertFalse(os.path.exists(os.path.join(device, MEDIA, left)), left)
        self.assertEqual(os.listdir(os.path.join(device, MEDIA, "Photos/Sync/Staging")), [])
        return dump


class ALargeDevice(Restores):
    """2,000 photos of the camera and 300 synced ones; the runs that are killed are a test of C++."""

    def setUp(self):
        super().setUp()
        # Thousands of state files are made durable one by one: memory takes that faster.
        if os.access("/dev/shm", os.W_OK):
            self.top = tempfile.mkdtemp(prefix="kxsync-test-", dir="/dev/shm")
            self.addCleanup(shutil.rmtree, self.top, ignore_errors=True)
        self.host, self.device = self.path("host"), self.path("device")
        self.backup = self.path("backup")
        self.make_camera(CAMERA_ASSETS, albums=[("Best of", range(0, 2000, 100)),
                                                ("Empty", []), ("Last", [1999, 5, 700])])
        self.members = [uid(f"synced-{number}") for number in range(SYNCED)]
        self.bundle(snapshot([album(uid("trip"), "Trip", self.members)] +
                             [asset(member) for member in self.members]))
        self.sync()

    def check_round(self, with_library):
        self.take(*(["--with-library"] if with_library else []))
        files, albums = self.camera_hashes(), self.own_albums()
        self.assertEqual(len(files), CAMERA_ASSETS + CAMERA_ASSETS // 50)
        before = json.loads(kxsync("dump", self.device, "--json").out)["assets"]
        shutil.rmtree(self.device)
        result = self.restore()
        self.assertEqual(result["outcome"], "restored")
        self.assertEqual(result["library"], "restored" if with_library else "none")
        self.assertEqual((result["requested"], result["restored"]), (len(files), len(files)))
        self.assertEqual(result["registered"], 0 if with_library else CAMERA_ASSETS)
        self.assertEqual(self.camera_hashes(), files)
        self.assertEqual(self.own_albums(), albums)
        dump = self.assert_at_rest()
        own = {identifier for identifier, entry in before.items() if entry["savedAssetType"] == 0}
        if with_library:
            self.assertEqual(set(dump["assets"]), own)
        else:
            self.assertEqual(len(dump["assets"]), CAMERA_ASSETS)
        synced = self.sync()
        self.assertEqual(synced["imported"], SYNCED)
        self.assertEqual(self.own_albums(), albums)
        self.assertEqual(self.titles(self.dump()["albums"])["Trip"]["assets"], self.members)
        return files, albums

    def test_both_ways_then_onto_another_device_and_after_new_photos(self):
        self.check_round(with_library=True)
        files, albums = self.check_round(with_library=False)
        # The same backup onto another device.
        other = self.path("other")
        self.assertEqual(self.restore(device=other)["restored"], len(files))
        self.assertEqual(self.camera_hashes(other), files)
        self.assertEqual(self.own_albums(other), albums)
        self.assert_at_rest(other)
        self.assertEqual(self.restore(device=other)["outcome"], "nothing")
        # Photos taken since stay, whatever is restored.
        self.make_camera(20, first=CAMERA_ASSETS)
        os.remove(os.path.join(self.device, DCIM, camera_name(3) + ".JPG"))
        result = self.restore()
        self.assertEqual((result["outcome"], result["restored"]), ("restored", 1))
        self.assertEqual(len(self.camera_hashes()), len(files) + 21)  # one has a film
        self.assertEqual(len(self.assert_at_rest()["assets"]), CAMERA_ASSETS + SYNCED + 20)


class SmallDevices(Restores):

    def setUp(self):
        super().setUp()
        self.make_camera(12, albums=[("Mine", [3, 1])])

    def test_dates_and_films_come_from_the_files(self):
        self.take()
        shutil.rmtree(self.device)
        self.restore()
        assets = {entry["path"]: entry for entry in self.dump()["assets"].values()}
        self.assertEqual(len(assets), 12)
        first = assets[f"/{DCIM}/{camera_name(0)}.JPG"]
        self.assertEqual(first["creationDate"], 631339506.0)  # 2021-01-03 04:05:06
        self.assertFalse(first["isVideo"])
        self.assertEqual(first["originalFileName"], "IMG_0000.JPG")

    def test_a_device_with_a_library_of_its_own_keeps_it(self):
        self.take("--with-library")
        shutil.rmtree(self.device)
        self.make_camera(1, first=500, albums=[("Newer", [500])])
        done = kxsync("restore", self.backup, self.device)
        self.assertEqual(done.code, 0, str(done))
        self.assertIn("the device's own is kept; 12 photos added, 1 album created", done.out)
        self.assertEqual([title for _, title, _ in self.own_albums()], ["Mine", "Newer"])
        self.assertEqual(len(self.assert_at_rest()["assets"]), 13)

    def test_nothing_to_do_is_said(self):
        self.take()
        done = kxsync("restore", self.backup, self.device)
        self.assertEqual((done.code, done.err), (0, ""), str(done))
        self.assertEqual(done.out, "Nothing to do: the device has all that the backup holds.\n")

    def test_quiet_says_nothing(self):
        self.take()
        done = kxsync("restore", self.backup, self.path("other"), "--quiet")
        self.assertEqual((done.code, done.out, done.err), (0, "", ""), str(done))

    def test_what_the_device_has_stays(self):
        self.take()
        path = os.path.join(self.device, DCIM, camera_name(4) + ".JPG")
        self.write(path, jpeg(b"another picture"))
        kept = file_hash(path)
        done = kxsync("restore", self.backup, self.device)
        self.assertEqual(done.code, 3, str(done))
        self.assertIn(f"not restored: /{DCIM}/{camera_name(4)}.JPG: the device has another file",
                      done.err)
        self.assertIn("1 file could not be restored", done.err)
        self.assertEqual(file_hash(path), kept)

    def test_a_damaged_file_fails_alone(self):
        self.take()
        with open(os.path.join(self.backup, "DCIM", camera_name(2) + ".JPG"), "r+b") as stream:
            stream.write(b"damaged")
        shutil.rmtree(self.device)
        result = self.restore(code=3)
        self.assertEqual(result["outcome"], "partial")
        self.assertEqual([entry["path"] for entry in result["failed"]],
                         [f"/{DCIM}/{camera_name(2)}.JPG"])
        self.assertEqual(result["restored"], 12)
        self.assertEqual(len(self.assert_at_rest()["assets"]), 11)

    def rewrite_manifest(self, change):
        path = os.path.join(self.backup, "manifest.json")
        with open(path, encoding="utf-8") as stream:
            manifest = json.load(stream)
        del manifest["checksum"]
        change(manifest)
        text = json.dumps(manifest, separators=(",", ":"), ensure_ascii=False)
        manifest["checksum"] = hashlib.sha256(text.encode()).hexdigest()
        with open(path, "w", encoding="utf-8") as stream:
            json.dump(manifest, stream, separators=(",", ":"), ensure_ascii=False)

    def test_a_hostile_manifest_leads_nowhere(self):
        self.take()
        shutil.rmtree(self.device)
        outside = self.path("outside.JPG")
        for name in ("../../../../outside.JPG", "100CAMRA/../../../../../outside.JPG",
                     "/../outside.JPG", "100CAMRA//x.JPG", "100CAMRA/./x.JPG", "x\0.JPG"):
            with self.subTest(name=name):
                def point(manifest, name=name):
                    manifest["files"] = manifest["files"][:1]
                    manifest["files"][0]["path"] = f"/{DCIM}/{name}"
                self.rewrite_manifest(point)
                done = kxsync("restore", self.backup, self.device)
                self.assertEqual(done.code, 1, str(done))
                self.assertEqual(len(done.err.splitlines()), 1, done.err)
                self.assertFalse(os.path.exists(outside))
                self.assertFalse(os.path.exists(self.device))

    def test_backups_that_cannot_be_used(self):
        self.take()
        target = self.path("target")
        damaged = self.path("damaged")
        shutil.copytree(self.backup, damaged)
        self.write(os.path.join(damaged, "manifest.json"), b"{\"format\":\"kxsync-backup\"}")
        empty = self.path("empty")
        os.mkdir(empty)
        plain = self.path("plain")
        self.write(plain, b"no directory")
        for backup in (self.path("missing"), empty, plain, damaged):
            with self.subTest(backup=backup):
                done = kxsync("restore", backup, target)
                self.assert_clear_failure(done, 1)
                self.assertFalse(os.path.exists(target), "no device is made")
                result = json.loads(kxsync("restore", backup, target, "--json").out)
                self.assertEqual(result["outcome"], "failed")
                self.assertTrue(result["error"]["message"])

    @unittest.skipUnless(os.geteuid() == 0, "only root can give files away")
    def test_what_belongs_to_somebody_else_is_refused(self):
        self.take()
        os.chown(self.backup, 12345, 12345)
        self.assert_clear_failure(kxsync("restore", self.backup, self.path("target")), 1,
                                  "another user")
        self.assertFalse(os.path.exists(self.path("target")))

    def test_wrong_usage(self):
        self.take()
        for arguments in ((), (self.backup,), (self.backup, self.device, "more"),
                          (self.backup, os.path.join(self.backup, "device")),
                          (self.backup, self.backup), (self.top, self.device),
                          (self.backup, self.device, "--with-library")):
            with self.subTest(arguments=arguments):
                done = kxsync("restore", *arguments)
                self.assertEqual(done.code, 2, str(done))
                self.assertEqual(done.out, "")

    def test_a_held_device_is_left_alone(self):
        self.take()
        holder = subprocess.Popen([os.path.join(os.path.dirname(KXSYNC), "ferrule"), "drive",
                                   self.device], stdin=subprocess.PIPE, stdout=subprocess.PIPE)
        try:
            holder.stdin.write(b'{"call":"currentSyncAnchor"}\n')
            holder.stdin.flush()
            holder.stdout.readline()
            self.assert_clear_failure(kxsync("restore", self.backup, self.device), 7,
                                      str(holder.pid))
        finally:
            holder.stdin.close()
            holder.stdout.close()
            holder.wait(timeout=60)

    def test_a_sync_in_between_does_not_disturb_a_restore(self):
        """An interrupted restore, a sync, and then the rest of the restore."""
        self.take("--with-library")
        files, albums = self.camera_hashes(), self.own_albums()
        os.remove(os.path.join(self.backup, "DCIM", camera_name(7) + ".JPG"))
        shutil.rmtree(self.device)
        self.assertEqual(self.restore(code=3)["restored"], 12)
        members = [uid(f"m-{number}") for number in range(5)]
        self.bundle(snapshot([album(uid("trip"), "Trip", members)] +
                             [asset(member) for member in members]))
        self.assertEqual(self.sync()["imported"], 5)
        self.write(os.path.join(self.backup, "DCIM", camera_name(7) + ".JPG"),
                   jpeg(b"camera 7", exif_of("2021:08:03 04:05:06")))
        self.assertEqual(self.restore()["restored"], 1)
        self.assertEqual(self.camera_hashes(), files)
        self.assertEqual(self.own_albums(), albums)
        self.assertEqual(len(self.assert_at_rest()["assets"]), 17)
        self.assertEqual(self.counts(self.sync()), {})


class Interruptions(Restores):
    """Signals in the middle; what is on its way is a few large files."""

    FILES = 30

    def setUp(self):
        super().setUp()
        self.bundle(snapshot([]))
        self.sync()
        for number in range(self.FILES):
            self.write(os.path.join(self.device, DCIM, camera_name(number) + ".JPG"),
                       jpeg(str(number).encode()) + os.urandom(1 << 16) * 96)
        self.take()
        self.files = self.camera_hashes()

    def interrupted(self, number):
        target = self.path("target")
        process = start("restore", self.backup, target, "--json")
        staging = os.path.join(target, MEDIA, "Photos/Sync/Staging")
        deadline = time.monotonic() + 60
        while time.monotonic() < deadline and process.poll() is None:
            if os.path.isdir(staging) and os.listdir(staging):
                break
        began = time.monotonic()
        self.interrupt(process, number)
        done = finish(process)
        return done, time.monotonic() - began, target

    def test_a_signal_ends_it_soon_and_it_goes_on(self):
        for number, code in ((signal.SIGINT, 130), (signal.SIGTERM, 143)):
            with self.subTest(code=code):
                done, seconds, target = self.interrupted(number)
                self.assertEqual(done.code, code, str(done))
                self.assertLess(seconds, 4.0)
                self.assertEqual(json.loads(done.out)["outcome"], "stopped")
                self.assertIn("the same command goes on from here", done.err)
                self.assertEqual(self.restore(device=target)["outcome"], "restored")
                self.assertEqual(self.camera_hashes(target), self.files)
                self.assert_at_rest(target)
                shutil.rmtree(target)

    def test_kill_leaves_nothing_half(self):
        done, _, target = self.interrupted(signal.SIGKILL)
        self.assertEqual(done.code, -signal.SIGKILL)
        there = self.camera_hashes(target)
        self.assertEqual({name: self.files[name] for name in there}, there)
        self.assertEqual(self.restore(device=target)["restored"], len(self.files) - len(there))
        self.assertEqual(self.camera_hashes(target), self.files)
        self.assert_at_rest(target)


FULL_DISK = """
set -e
kxsync=$1; backup=$2; device=$3
mount -t tmpfs -o "$4" none "$device"
set +e
"$kxsync" restore "$backup" "$device" --json; first=$?
mount -o remount,size=400m,nr_inodes=100k "$device"
"$kxsync" restore "$backup" "$device" --json; second=$?
"$kxsync" dump "$device" --json --hash
echo "[$first, $second]"
"""


def can_mount():
    done = subprocess.run(["unshare", "-rm", "mount", "-t", "tmpfs", "none", "/mnt"],
                          capture_output=True, check=False)
    return done.returncode == 0


@unittest.skipUnless(can_mount(), "needs a mount namespace of its own")
class AFullDisk(Restores):

    def check(self, *options):
        """A restore that finds no room, and one after there is room, at each of the sizes."""
        self.make_camera(20)
        self.take()
        target = self.path("target")
        os.mkdir(target)
        os.chmod(target, stat.S_IRWXU)
        brought = []
        for option in options:
            with self.subTest(option=option):
                done = subprocess.run(["unshare", "-rm", "sh", "-c", FULL_DISK, "sh", KXSYNC,
                                       self.backup, target, option], capture_output=True,
                                      text=True, env=environment(), check=False)
                lines = done.stdout.splitlines()
                self.assertEqual(len(lines), 4, done.stdout[:2000] + done.stderr[:2000])
                full, again, dump, codes = [json.loads(line) for line in lines]
                self.assertEqual(codes, [6, 0], (full, again))
                self.assertIn("no space left on the device", full["error"]["message"])
                self.assertEqual(again["outcome"], "restored")
                self.assertEqual(len(dump["assets"]), 20)
                brought.append(full["restored"])
        return brought

    def test_too_little_room_is_said_before_anything_is_brought(self):
        self.assertEqual(set(self.check("size=64k", "size=1m", "size=20m")), {0})

    def test_a_disk_that_fills_up_in_the_middle(self):
        """There is room for the bytes, but not for that many files."""
        brought = self.check(*[f"size=300m,nr_inodes={count}" for count in range(18, 38, 3)])
        self.assertGreater(max(brought), 0)


if __name__ == "__main__":
    unittest.main()
