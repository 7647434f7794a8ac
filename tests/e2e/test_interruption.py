"""Runs that meet another run, a signal or a full disk."""

import fcntl
import json
import os
import shutil
import signal
import subprocess
import time
import unittest

from harness import (EndToEnd, KXSYNC, album, asset, environment, finish, jpeg, kxsync, snapshot,
                     start, uid)

MANY = 2000
COPIED = 400  # enough for whole batches to have arrived, far from all
WAIT_SECONDS = 120


class Running(EndToEnd):

    def many(self, count=MANY):
        members = [uid(number) for number in range(count)]
        root = snapshot([album(uid("a"), "All", members)] +
                        [asset(member, latitude=1.5, longitude=2.5) for member in members])
        self.bundle(root)

    def files_on_device(self):
        """How many media files have been copied, imported or not."""
        media = os.path.join(self.device, "var/mobile/Media")
        return sum(len(files) for place in ("Photos/Sync/Staging", "PhotoData/SyncedAssets")
                   for _, _, files in os.walk(os.path.join(media, place)))

    def start_and_reach_transfers(self):
        """A running sync that has copied some files and is far from its end."""
        process = start("sync", self.host, self.device, "--json")
        self.addCleanup(process.stderr.close)
        self.addCleanup(process.stdout.close)
        self.addCleanup(process.kill)
        until = time.monotonic() + WAIT_SECONDS
        while self.files_on_device() < COPIED:
            self.assertIsNone(process.poll(), "it ended before enough was copied")
            self.assertLess(time.monotonic(), until)
        return process

    def test_signal_ends_it_within_two_seconds_and_it_goes_on_from_there(self):
        for number, code in ((signal.SIGINT, 130), (signal.SIGTERM, 143)):
            with self.subTest(signal=number):
                shutil.rmtree(self.device, ignore_errors=True)
                self.many()
                process = self.start_and_reach_transfers()
                process.send_signal(number)
                sent = time.monotonic()
                done = finish(process)
                self.assertLess(time.monotonic() - sent, 2.5)
                self.assertEqual(done.code, code, str(done))
                result = json.loads(done.out)
                self.assertEqual(result["outcome"], "stopped")
                self.assertIsNotNone(result["error"])
                dump = self.dump()
                there = [identifier for identifier, entry in dump["assets"].items()
                         if not entry["incomplete"]]
                self.assertGreater(len(there), 0)
                self.assertLess(len(there), MANY)
                self.assertFalse(dump["lastSynced"])
                result = self.sync()
                self.assertEqual(result["requested"], MANY - len(there), "nothing is moved twice")
                dump = self.dump()
                self.assert_whole(dump)
                self.assertEqual(len(dump["assets"]), MANY)
                self.assertEqual(self.sync()["outcome"], "null")

    def test_second_run_names_the_holder_and_reading_goes_on(self):
        self.many()
        process = self.start_and_reach_transfers()
        process.send_signal(signal.SIGSTOP)
        done = kxsync("sync", self.host, self.device)
        reading = kxsync("status", self.device), kxsync("dump", self.device)
        self.assertIsNone(process.poll(), "the first run still holds the device")
        self.assert_clear_failure(done, 7, str(process.pid))
        for reader in reading:
            self.assertEqual((reader.code, reader.err), (0, ""))
        result = json.loads(kxsync("sync", self.host, self.device, "--json").out)
        process.send_signal(signal.SIGCONT)
        self.assertEqual(result["outcome"], "failed")
        self.assertIn(str(process.pid), result["error"]["message"])
        self.assertEqual(finish(process).code, 0)
        self.assertEqual(self.sync()["outcome"], "null")

    def test_kill_and_go_on(self):
        self.many()
        process = self.start_and_reach_transfers()
        process.kill()
        process.wait()
        result = self.sync()
        self.assertGreater(result["requested"], 0)
        dump = self.dump()
        self.assert_whole(dump)
        self.assertEqual(len(dump["assets"]), MANY)
        self.assertEqual(dump["albums"][0]["assets"], [uid(number) for number in range(MANY)])
        self.assertEqual(self.sync()["outcome"], "null")


def can_mount():
    done = subprocess.run(["unshare", "-rm", "mount", "-t", "tmpfs", "none", "/mnt"],
                          capture_output=True, check=False)
    return done.returncode == 0


@unittest.skipUnless(can_mount(), "needs a mount namespace of its own")
class FullDisk(EndToEnd):

    SCRIPT = """
set -e
mount -t tmpfs -o "$1" none "$2"
shift
set +e
"$0" sync "$2" "$1" --json; first=$?
mount -o remount,size=400m,nr_inodes=100000 "$1"
"$0" sync "$2" "$1" --json; second=$?
"$0" dump "$1" --json
exit $((first * 10 + second))
"""

    def sync_with_little_room(self, options, count):
        """A sync on a file system made with those options, and one more once there is room."""
        done = subprocess.run(["unshare", "-rm", "sh", "-c", self.SCRIPT, KXSYNC, options,
                               self.device, self.host], capture_output=True, text=True,
                              env=environment(), check=False)
        self.assertEqual(done.returncode, 60, done.stdout[:2000] + done.stderr[:2000])
        first, second, dump = map(json.loads, done.stdout.splitlines())
        self.assertIn(first["outcome"], ("failed", "partial", "stopped"))
        self.assertRegex(first["error"]["message"], "[Nn]o space")
        self.assertEqual(second["outcome"], "synced")
        self.assertEqual(second["requested"], count - first["imported"], "nothing is moved twice")
        self.assertEqual(len(dump["assets"]), count)
        return first

    def test_too_few_bytes(self):
        count = 40
        media = {uid(number): jpeg() + bytes(1_000_000) for number in range(count)}
        self.bundle(snapshot([asset(uid(number)) for number in range(count)]), media=media)
        os.makedirs(self.device)
        for size in ("40k", "120k", "300k", "1m", "8m", "30m", "64m", "70m", "85m", "95m"):
            with self.subTest(size=size):
                self.sync_with_little_room("size=" + size, count)

    def test_disk_that_turns_out_full_while_files_are_copied(self):
        count = 1000
        self.bundle(snapshot([asset(uid(number)) for number in range(count)]))
        os.makedirs(self.device)
        for files in (8, 12, 16, 20, 24, 28, 40, 100, 300, 900):
            with self.subTest(files=files):
                self.sync_with_little_room(f"size=400m,nr_inodes={files}", count)


if __name__ == "__main__":
    unittest.main()
