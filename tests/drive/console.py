"""Drives the plug-in through `ferrule drive`: what the console tests stand on."""

import base64
import json
import os
import plistlib
import shutil
import subprocess
import sys
import tempfile
import unittest

sys.path.insert(0, os.path.join(os.path.dirname(__file__), "..", "e2e"))
from harness import (BIN, HOST_EPOCH, SUBCLASS_FACES, SUBCLASS_MASTER, album, asset, event, jpeg,
                     snapshot, uid)  # noqa: F401, E402

FERRULE = os.path.join(BIN, "ferrule")
ERROR, WARNING, INFO, DEBUG = 3, 4, 6, 7
MEDIA = "/var/mobile/Media/"
SNAPSHOT = "/var/mobile/Media/Photos/Sync/PhotoLibrary.plist"
CLOCK = 800000000.0


class Raised(Exception):
    """The console answered a call with an exception."""

    def __init__(self, name, reason):
        super().__init__(f"{name}: {reason}")
        self.name = name


class Console:
    """One `ferrule drive` on a directory."""

    def __init__(self, device):
        self.process = subprocess.Popen([FERRULE, "drive", device], stdin=subprocess.PIPE,
                                        stdout=subprocess.PIPE, text=True, encoding="utf-8")
        self.log = []       # of the last answer
        self.whole_log = []  # of all answers
        self.answer = None

    def line(self, text):
        """The answer to one line of text, whatever it is."""
        self.process.stdin.write(text + "\n")
        self.process.stdin.flush()
        self.answer = json.loads(self.process.stdout.readline())
        self.log = self.answer["log"]
        self.whole_log += self.log
        return self.answer

    def raw(self, call, **arguments):
        return self.line(json.dumps({"call": call, **arguments}))

    def __call__(self, call, **arguments):
        """The call's result; Raised when it is answered with an exception."""
        answer = self.raw(call, **arguments)
        if answer["exception"]:
            raise Raised(answer["exception"]["name"], answer["exception"]["reason"])
        return answer["result"]

    def logged(self, level, text):
        """Whether the last answer has that message at that level."""
        return [level, text] in [[entry[0], entry[3]] for entry in self.log]

    def close(self):
        """Ends the input; the exit code."""
        self.process.stdin.close()
        code = self.process.wait(timeout=60)
        self.process.stdout.close()
        return code


class ConsoleTest(unittest.TestCase):
    """A test with a console on a new device, its clock standing."""

    def setUp(self):
        self.root = tempfile.mkdtemp(prefix="drive-")
        self.addCleanup(shutil.rmtree, self.root, ignore_errors=True)
        self.device = os.path.join(self.root, "device")
        self.console = Console(self.device)
        self.addCleanup(self.end)
        self.call("device.setClock", now=CLOCK)

    def end(self):
        if self.console.process.poll() is None:
            self.assertEqual(self.console.close(), 0)

    def restart(self):
        """A new console on the same device."""
        self.end()
        self.console = Console(self.device)
        self.call("device.setClock", now=CLOCK)

    def call(self, name, **arguments):
        return self.console(name, **arguments)

    def assertLogged(self, level, text):
        self.assertTrue(self.console.logged(level, text), f"{text!r} not in {self.console.log}")

    def assertNotLogged(self, text):
        self.assertNotIn(text, [entry[3] for entry in self.console.log])

    # Steps of a sync.

    def put_snapshot(self, updates, **root):
        content = plistlib.dumps(snapshot(updates, **root), fmt=plistlib.FMT_BINARY)
        self.call("device.putFile", path=SNAPSHOT, base64=base64.b64encode(content).decode())

    def begin(self, updates, **root):
        """Prepares and reconciles; the identifiers of the files asked for."""
        self.put_snapshot(updates, **root)
        self.assertTrue(self.call("prepareForSync", hostAnchor="1"))
        self.assertTrue(self.call("reconcileSync", type=1, newAnchor="1"), self.console.answer)
        return [request["identifier"] for request in self.call("outstandingAssetTransfers")]

    def arrive(self, identifier):
        """The asset's file arrives."""
        path = f"Photos/Sync/Staging/{identifier}"
        self.call("device.putFile", path=MEDIA + path,
                  base64=base64.b64encode(jpeg(identifier.encode())).decode())
        self.call("assetTransfer", identifier=identifier, succeeded=True, path=path)

    def finish(self, success=True):
        self.call("assetTransferEnded", success=success)
        log = list(self.console.log)
        self.call("syncEnded", success=success)
        self.console.log = log + self.console.log

    def sync(self, updates, **root):
        """One whole sync; what it asked for."""
        requested = self.begin(updates, **root)
        for identifier in requested:
            self.arrive(identifier)
        self.finish()
        return requested

    def dump(self, **arguments):
        return self.call("device.dump", **arguments)


A, B, C = uid("a"), uid("b"), uid("c")
TRIP, PETS, DAY, MASTER, ANNA = uid("trip"), uid("pets"), uid("day"), uid("master"), uid("anna")


def library():
    """Three assets in two albums, an event, a face album and the master album."""
    face = {"faceAlbumUUID": ANNA, "faceIndex": 1,
            "faceRectangle": {"X": 0.1, "Y": 0.2, "Width": 0.3, "Height": 0.4}}
    return [
        event(DAY, "2020-01-02"),
        album(TRIP, "Trip", [A, B]),
        album(PETS, "Pets", [B]),
        album(ANNA, "Anna", [A], subclass=SUBCLASS_FACES),
        album(MASTER, "All", [A, B, C], subclass=SUBCLASS_MASTER),
        asset(A, caption="first", eventUUID=DAY, faces=[face], latitude=48.5, longitude=9.25),
        asset(B, eventUUID=DAY),
        asset(C),
    ]
