"""A disk that fills up in the middle of a sync, at ten levels."""

import json
import os
import subprocess
import unittest

from harness import EndToEnd, KXSYNC, album, asset, environment, jpeg, snapshot, uid

COUNT = 40
LEVELS = 10
FILE_BYTES = 500_000

# A first sync of small files on a large disk; then the disk shrinks until `left` bytes are free,
# and a sync brings changed, larger files. That they replace others keeps the check of free space
# before a sync out of the way.
SCRIPT = """
set -e
kxsync=$1; small=$2; large=$3; device=$4; left=$5
mount -t tmpfs -o size=400m none "$device"
"$kxsync" sync "$small" "$device" --json
used=$(df --output=used -k "$device" | tail -1)
mount -o remount,size=$((used + left / 1024))k "$device"
set +e
"$kxsync" sync "$large" "$device" --json; first=$?
"$kxsync" status "$device" --json > /dev/null; opened=$?
mount -o remount,size=400m "$device"
"$kxsync" sync "$large" "$device" --json; second=$?
"$kxsync" sync "$large" "$device" --json; third=$?
"$kxsync" dump "$device" --json --hash
echo "[$first, $opened, $second, $third]"
"""


def can_mount():
    done = subprocess.run(["unshare", "-rm", "mount", "-t", "tmpfs", "none", "/mnt"],
                          capture_output=True, check=False)
    return done.returncode == 0


@unittest.skipUnless(can_mount(), "needs a mount namespace of its own")
class FillingDisk(EndToEnd):

    def library(self, name, modified, file_bytes):
        self.host = self.path(name)
        members = [uid(number) for number in range(COUNT)]
        items = [album(uid("album"), name, members)]
        items += [asset(member, modified=modified, latitude=1.5, longitude=2.5)
                  for member in members]
        media = {member: jpeg(member.encode()) + b"\0" * file_bytes for member in members}
        self.bundle(snapshot(items), media=media)
        return self.host

    def run_level(self, small, large, left):
        os.makedirs(self.device, exist_ok=True)
        done = subprocess.run(
            ["unshare", "-rm", "sh", "-c", SCRIPT, "sh", KXSYNC, small, large, self.device,
             str(left)], capture_output=True, text=True, env=environment(), check=False)
        lines = done.stdout.splitlines()
        self.assertEqual(len(lines), 6, done.stdout[:2000] + done.stderr[:2000])
        return [json.loads(line) for line in lines], done.stderr

    def test_every_level_says_so_and_goes_on_once_there_is_room(self):
        small = self.library("small", 1000.0, 100)
        large = self.library("large", 2000.0, FILE_BYTES)
        whole = self.run_level(small, large, 200_000_000)[0]
        self.assertEqual(whole[5][:1], [0], whole[1])
        expected = whole[4]
        self.assertEqual(len(expected["assets"]), COUNT)
        for level in range(LEVELS):
            left = COUNT * FILE_BYTES * level // LEVELS
            with self.subTest(left=left):
                (_, full, again, last, dump, codes), errors = self.run_level(small, large, left)
                self.assertEqual(codes, [6, 0, 0, 0], (full, again, errors[:2000]))
                self.assertEqual(full["outcome"], "failed")
                self.assertIn("no space left on the device", full["error"]["message"])
                self.assertIn("no space left on the device", errors)
                self.assertEqual(again["outcome"], "synced")
                self.assertLess(again["requested"], COUNT + 1)
                if left > 5_000_000:
                    self.assertGreater(full["imported"], 0)
                    self.assertEqual(again["requested"], COUNT - full["imported"])
                self.assertEqual(last["outcome"], "null")
                self.assertEqual(dump, expected)


if __name__ == "__main__":
    unittest.main()
