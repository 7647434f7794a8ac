"""Random and mutated lines: none ends the session, writes outside the device or grows its memory.

KX_RANDOM_LINES sets how many (4,000 by default), KX_RANDOM_SEED the seed, which is printed.
"""

import json
import os
import random
import shutil
import subprocess
import tempfile
import threading
import unittest

from console import FERRULE, A, MEDIA, TRIP, album, asset, library, snapshot, uid
from harness import tree_hash

LINES = int(os.environ.get("KX_RANDOM_LINES", "4000"))
SEED = int(os.environ.get("KX_RANDOM_SEED", str(random.SystemRandom().randrange(1 << 32))))

PATHS = ["/var/mobile/Media/DCIM/100CAMRA/a.jpg", "/../../canary", "../canary", "/link/canary",
         "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist", "/a\u0000b", "x" * 5000, "/", "",
         "/var/mobile/Media/Photos/Sync/../../../../../../canary", "/tmp/BackupRunning"]
CALLS = [
    {"call": "prepareForSync"}, {"call": "reconcileSync", "type": 1, "newAnchor": "1"},
    {"call": "outstandingAssetTransfers"}, {"call": "assetTransferEnded", "success": True},
    {"call": "syncEnded", "success": False}, {"call": "client.new"},
    {"call": "installedAssetMetrics"}, {"call": "device.jobs"}, {"call": "device.porterCalls"},
    {"call": "device.counters"}, {"call": "device.dump"}, {"call": "device.clearFaults"},
    {"call": "device.memoryPressure"}, {"call": "restoreEnded", "error": {"domain": "d", "code": 1}},
    {"call": "device.setClock", "now": 8e8}, {"call": "device.advanceClock", "seconds": 3},
    {"call": "device.addAlbum", "uuid": TRIP, "title": "t", "kind": 2},
    {"call": "device.removeAsset", "uuid": A},
    {"call": "records.snapshot", "plist": {"updates": [asset(A), album(TRIP, "n", [A])]}},
    {"call": "records.archive", "item": asset(A)}, {"call": "records.uuid", "string": A},
    {"call": "records.base64Decode", "text": "QUI="}, {"call": "device.touch", "entity": "asset",
                                                      "uuids": [A]},
    {"call": "device.set", "entity": "album", "uuid": TRIP, "fields": {"title": "x"}},
    {"call": "device.fault", "point": "transaction", "times": 1},
    {"call": "device.fault", "point": "saverHold"}, {"call": "device.releaseSaver"},
    {"call": "device.fault", "point": "cleanupNever"}, {"call": "device.fault", "point": "saver"},
    {"call": "assetTransferEnded", "async": True}, {"call": "prepareForSync", "async": True},
    {"call": "device.dump", "async": True}, {"call": "wait", "of": 1},
    {"call": "device.backupFiles", "paths": ["/var/mobile/Media/DCIM/100CAMRA/a.jpg"]},
    {"call": "assetTransfer", "identifier": A, "succeeded": True, "path": "../../../canary"},
    {"call": "assetTransfer", "identifier": A, "unknown": True, "succeeded": False},
]
VALUES = [None, True, -1, 0, 1.5, 1e308, 2 ** 63, "", "x", [], {}, [[]], {"a": None}, A, "\u202e",
          "a" * 300]


def make_line(source):
    """A well-formed call, one with members changed, or one with bytes changed."""
    kind = source.random()
    if kind < 0.15:
        path = source.choice(PATHS)
        line = {"call": source.choice(["device.putFile", "device.readFile", "device.readPlist",
                                       "device.removeFile"]), "path": path, "text": "t"}
    elif kind < 0.2:
        updates = library() + [asset(uid(source.randrange(4)))]
        line = {"call": "device.putFile", "path": MEDIA + "Photos/Sync/PhotoLibrary.plist",
                "text": xml_of(snapshot(updates))}
    else:
        line = dict(source.choice(CALLS))
    while source.random() < 0.4:
        line[source.choice([*line, "x", "path", "uuid", "error"])] = source.choice(VALUES)
    text = json.dumps(line)
    while source.random() < 0.2 and text:
        at = source.randrange(len(text))
        text = text[:at] + source.choice(["", '"', "{", "}", "\\u0000", "9", ","]) + text[at + 1:]
    return text.replace("\n", " ")


def xml_of(root):
    def value(item):
        if isinstance(item, dict):
            return "<dict>" + "".join(f"<key>{key}</key>{value(entry)}"
                                      for key, entry in item.items()) + "</dict>"
        if isinstance(item, list):
            return "<array>" + "".join(map(value, item)) + "</array>"
        if isinstance(item, bool):
            return "<true/>" if item else "<false/>"
        if isinstance(item, int):
            return f"<integer>{item}</integer>"
        if isinstance(item, float):
            return f"<real>{item!r}</real>"
        return f"<string>{item}</string>"
    return f'<?xml version="1.0"?><plist version="1.0">{value(root)}</plist>'


def resident_kib(process):
    with open(f"/proc/{process.pid}/status", encoding="ascii") as status:
        return next(int(line.split()[1]) for line in status if line.startswith("VmRSS"))


class RandomLines(unittest.TestCase):
    def test_neither_end_the_session_nor_leave_the_device_nor_grow(self):
        print(f"seed {SEED}, {LINES} lines")
        source = random.Random(SEED)
        root = tempfile.mkdtemp(prefix="drive-random-")
        self.addCleanup(shutil.rmtree, root, ignore_errors=True)
        device, outside = os.path.join(root, "device"), os.path.join(root, "outside")
        os.mkdir(outside)
        os.mkdir(device)
        os.symlink(outside, os.path.join(device, "link"))
        with open(os.path.join(outside, "canary"), "w", encoding="ascii") as canary:
            canary.write("sings")
        with open(os.path.join(root, "canary"), "w", encoding="ascii") as canary:
            canary.write("sings")
        before = tree_hash(outside)
        # What a sanitizer keeps of freed memory is no growth of ours.
        sanitizer = {"ASAN_OPTIONS": os.environ.get("ASAN_OPTIONS", "") + ":quarantine_size_mb=4"}
        process = subprocess.Popen([FERRULE, "drive", device], stdin=subprocess.PIPE,
                                   stdout=subprocess.PIPE, text=True, encoding="utf-8",
                                   env={**os.environ, **sanitizer})
        warm = None
        block = 200  # lines under way at once
        for start in range(0, LINES, block):
            lines = [make_line(source) for _ in range(min(block, LINES - start))]
            writer = threading.Thread(target=self.write, args=(process, lines))
            writer.start()
            for line in lines:
                answer = process.stdout.readline()
                self.assertTrue(answer, f"seed {SEED}: the session ended; near {line[:300]}")
                self.assertIn("exception", json.loads(answer))
            writer.join()
            if warm is None and start >= LINES // 4:
                warm = resident_kib(process)
        last = resident_kib(process)
        print(f"resident: {warm} KiB after a quarter of the lines, {last} KiB after all")
        grown = last - warm
        process.stdin.close()
        self.assertEqual(process.wait(timeout=60), 0)
        process.stdout.close()
        self.assertEqual(tree_hash(outside), before)
        self.assertEqual(sorted(os.listdir(root)), ["canary", "device", "outside"])
        self.assertLess(grown, 64 * 1024, f"seed {SEED}: grown by {grown} KiB")

    @staticmethod
    def write(process, lines):
        process.stdin.write("".join(line + "\n" for line in lines))
        process.stdin.flush()


if __name__ == "__main__":
    unittest.main()
