"""Runs the real programs on real directories: what the end-to-end tests stand on.

KX_BIN names the directory of the built programs (and of the module that they load).
"""

import hashlib
import json
import os
import plistlib
import shutil
import signal
import struct
import subprocess
import tempfile
import unittest
import uuid as uuids

BIN = os.environ["KX_BIN"]
KXSYNC = os.path.join(BIN, "kxsync")
RUN_SECONDS = 240

# Seconds from 1904-01-01, the host's first second, to 2001-01-01.
HOST_EPOCH = 3061152000.0

KIND_ALBUM, KIND_EVENT, KIND_FACES = 1550, 1551, 15
SUBCLASS_FACES, SUBCLASS_EVENT, SUBCLASS_MASTER = 3, 4, 5

# What a sync that is no null sync may write even when it finds nothing to do.
DATABASE = ("var/mobile/Media/PhotoData/Photos.sqlite", "var/mobile/Media/PhotoData/Photos.lock")


def segment(marker, body):
    return bytes([0xFF, marker]) + struct.pack(">H", len(body) + 2) + body


def jpeg(note=b"", exif=b""):
    """A whole grey JPEG of one pixel; `note` makes its bytes differ from another's."""
    one_code = bytes([1] + [0] * 15 + [0])
    return b"".join([
        b"\xff\xd8",
        segment(0xE0, b"JFIF\0\1\1\0\0\1\0\1\0\0"),
        segment(0xE1, exif) if exif else b"",
        segment(0xFE, note) if note else b"",
        segment(0xDB, bytes([0]) + bytes([1] * 64)),
        segment(0xC0, bytes([8, 0, 1, 0, 1, 1, 1, 0x11, 0])),
        segment(0xC4, bytes([0x00]) + one_code),
        segment(0xC4, bytes([0x10]) + one_code),
        segment(0xDA, bytes([1, 1, 0, 0, 63, 0])),
        b"\x3f\xff\xd9",
    ])


def exif_of(date):
    """An EXIF block that holds the capture time alone, "2020:01:02 03:04:05"."""
    text = date.encode() + b"\0"
    ifd0 = struct.pack("<H", 1) + struct.pack("<HHII", 0x8769, 4, 1, 26) + struct.pack("<I", 0)
    sub = struct.pack("<H", 1) + struct.pack("<HHII", 0x9003, 2, len(text), 44)
    sub += struct.pack("<I", 0)
    return b"Exif\0\0II*\0" + struct.pack("<I", 8) + ifd0 + sub + text


def uid(number):
    """The canonical text of the identifier with that number."""
    return str(uuids.uuid5(uuids.NAMESPACE_URL, f"test-{number}")).upper()


def asset(identifier, modified=1000.0, **fields):
    item = {"uuid": identifier, "itemType": "Asset", "isVideo": False,
            "exposureDate": HOST_EPOCH + 600000000.0, "modificationDate": HOST_EPOCH + modified,
            "originalFileName": "photo.jpg"}
    item.update(fields)
    return item


def album(identifier, name, members, **fields):
    item = {"uuid": identifier, "itemType": "Album", "albumName": name, "assetUUIDs": members,
            "subclass": 0}
    item.update(fields)
    return item


def event(identifier, name, **fields):
    item = {"uuid": identifier, "itemType": "Event", "eventName": name}
    item.update(fields)
    return item


def kind_of(item):
    """The kind of the device's container for an album or event; None for the master album."""
    if item["itemType"] == "Event" or item.get("subclass") == SUBCLASS_EVENT:
        return KIND_EVENT
    if item.get("subclass") == SUBCLASS_MASTER:
        return None
    return KIND_FACES if item.get("subclass") == SUBCLASS_FACES else KIND_ALBUM


def snapshot(updates, library="4B1B4C7E-53A8-4B62-9D0B-0F5D6F5C3A11", kind="Cassock", **root):
    return {"libraryUUID": library, "libraryKind": kind, "updates": updates, "deletes": [],
            "TesselUserAgent": "tests/1", **root}


def tree_hash(top, leave_out=()):
    """A digest of every name, kind and content below a directory."""
    digest = hashlib.sha256()
    for folder, names, files in os.walk(top):
        names.sort()
        for name in names:
            digest.update(b"D" + os.path.relpath(os.path.join(folder, name), top).encode() + b"\0")
        for name in sorted(files):
            path = os.path.join(folder, name)
            relative = os.path.relpath(path, top)
            if relative in leave_out:
                continue
            digest.update(b"F" + relative.encode() + b"\0")
            if os.path.islink(path):
                digest.update(os.readlink(path).encode())
            else:
                with open(path, "rb") as stream:
                    digest.update(hashlib.sha256(stream.read()).digest())
    return digest.hexdigest()


def file_hash(path):
    with open(path, "rb") as stream:
        return hashlib.sha256(stream.read()).hexdigest()


class Finished:
    """What a program left behind when it ended."""

    def __init__(self, code, out, err):
        self.code, self.out, self.err = code, out, err

    def __str__(self):
        return f"exit code {self.code}\n--- stdout\n{self.out}\n--- stderr\n{self.err}"


def environment():
    clean = {key: value for key, value in os.environ.items() if key not in ("NO_COLOR", "TERM")}
    clean["TERM"] = "xterm"
    clean["LC_ALL"] = "C.UTF-8"
    return clean


def kxsync(*arguments, timeout=RUN_SECONDS, **options):
    done = subprocess.run([KXSYNC, *map(str, arguments)], stdin=subprocess.DEVNULL,
                          stdout=subprocess.PIPE, stderr=subprocess.PIPE, timeout=timeout,
                          env=environment(), check=False, **options)
    return Finished(done.returncode, done.stdout.decode("utf-8", "surrogateescape"),
                    done.stderr.decode("utf-8", "surrogateescape"))


def start(*arguments, **options):
    """Starts kxsync with pipes for both streams; the caller waits for it."""
    return subprocess.Popen([KXSYNC, *map(str, arguments)], stdin=subprocess.DEVNULL,
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=environment(),
                            **options)


def finish(process, timeout=RUN_SECONDS):
    out, err = process.communicate(timeout=timeout)
    return Finished(process.returncode, out.decode("utf-8", "surrogateescape"),
                    err.decode("utf-8", "surrogateescape"))


class OrdinaryUser:
    """Runs kxsync as a user whom permissions bind; for tests that root runs.

    The programs are copied, since they may lie where only root may look.
    """

    NOBODY = 65534

    def __init__(self, top):
        os.chmod(top, 0o777)
        self._bin = os.path.join(top, "bin")
        os.mkdir(self._bin)
        for name in ("kxsync", "kxsyncbundle.so"):
            shutil.copy(os.path.join(BIN, name), self._bin)

    def kxsync(self, *arguments):
        return kxsync(*arguments, executable=os.path.join(self._bin, "kxsync"), user=self.NOBODY,
                      group=self.NOBODY, extra_groups=[])


class EndToEnd(unittest.TestCase):
    """A test with a directory of its own; self.host and self.device are paths in it."""

    maxDiff = None

    def setUp(self):
        self.top = tempfile.mkdtemp(prefix="kxsync-test-")
        self.addCleanup(shutil.rmtree, self.top, ignore_errors=True)
        self.host = self.path("host")
        self.device = self.path("device")

    def path(self, *parts):
        return os.path.join(self.top, *parts)

    def write(self, path, data):
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(path, "wb") as stream:
            stream.write(data)

    def bundle(self, root, missing=(), media=None):
        """Writes self.host as a host bundle with that snapshot and a file for each asset."""
        self.write(os.path.join(self.host, "PhotoLibrary.plist"),
                   plistlib.dumps(root, fmt=plistlib.FMT_BINARY, sort_keys=False))
        os.makedirs(os.path.join(self.host, "media"), exist_ok=True)
        for item in root.get("updates", []):
            if media is None and item.get("itemType") == "Asset" and item["uuid"] not in missing:
                self.write(os.path.join(self.host, "media", item["uuid"] + ".JPG"),
                           jpeg(item["uuid"].encode()))
        for name, data in (media or {}).items():
            self.write(os.path.join(self.host, "media", name), data)

    def sync(self, *options, code=0, host=None):
        """Runs a sync with --json, checks its exit code and gives the result."""
        done = kxsync("sync", host or self.host, self.device, "--json", *options)
        self.assertEqual(done.code, code, str(done))
        result = json.loads(done.out)
        self.assertEqual(done.out.count("\n"), 1, "one line of JSON")
        result["stderr"] = done.err
        return result

    def assert_nothing_to_do(self, host=None, *options):
        """Another sync changes nothing that is in the library, and no other file."""
        files, dump = tree_hash(self.device, DATABASE), self.dump("--hash")
        result = self.sync(*options, host=host)
        self.assertIn(result["outcome"], ("synced", "null"))
        self.assertEqual(self.counts(result), {})
        self.assertEqual(self.dump("--hash"), dump)
        self.assertEqual(tree_hash(self.device, DATABASE), files)

    def counts(self, result):
        names = ("requested", "imported", "deletedAssets", "updatedAssets", "albumsCreated",
                 "albumsDeleted", "albumsRenamed")
        return {name: result[name] for name in names if result[name] != 0}

    def dump(self, *options):
        done = kxsync("dump", self.device, *options)
        self.assertEqual(done.code, 0, str(done))
        self.assertEqual(done.err, "")
        return json.loads(done.out)

    def titles(self, containers):
        return {container["title"]: container for container in containers}

    def file_names(self, dump, container):
        return [dump["assets"][member]["originalFileName"] for member in container["assets"]]

    def assert_whole(self, dump):
        """Every asset is complete, and its file is there, of the size that the library says."""
        for identifier, entry in dump["assets"].items():
            self.assertFalse(entry["incomplete"], identifier)
            local = self.device + entry["path"]
            self.assertTrue(os.path.isfile(local), local)
            self.assertEqual(os.path.getsize(local), entry["size"], local)
        for container in dump["albums"] + dump["events"] + dump["faceAlbums"]:
            self.assertEqual(container["pendingItemsCount"], 0, container)

    def assert_in_line(self, root, dump, media):
        """The dump says what a snapshot's root dictionary asks for; media: identifier -> path."""
        wanted = {item["uuid"]: item for item in root["updates"] if item["itemType"] == "Asset"}
        synced = {identifier: entry for identifier, entry in dump["assets"].items()
                  if entry["savedAssetType"] == 256}
        self.assertEqual(sorted(wanted), sorted(synced))
        for identifier, item in wanted.items():
            self.assert_asset_in_line(item, synced[identifier])
            self.assertEqual(synced[identifier]["sha256"], file_hash(media[identifier]))
        containers = [item for item in root["updates"] if item["itemType"] != "Asset"]
        for kind, name in ((KIND_ALBUM, "albums"), (KIND_EVENT, "events"),
                           (KIND_FACES, "faceAlbums")):
            expected = {item["uuid"]: item for item in containers if kind_of(item) == kind}
            found = {entry["uuid"]: entry for entry in dump[name] if entry["kind"] == kind}
            self.assertEqual(sorted(expected), sorted(found), name)
            for identifier, item in expected.items():
                self.assertEqual(found[identifier]["title"],
                                 item.get("albumName", item.get("eventName")))
                self.assert_members_in_line(item, found[identifier], wanted)

    def assert_asset_in_line(self, item, entry):
        self.assertEqual(entry["creationDate"], item["exposureDate"] - HOST_EPOCH)
        self.assertEqual(entry["modificationDate"], item["modificationDate"] - HOST_EPOCH)
        self.assertEqual(entry["originalFileName"], item.get("originalFileName"))
        self.assertEqual(entry["isVideo"], item["isVideo"])
        place = [item["latitude"], item["longitude"]] if "latitude" in item else None
        self.assertEqual(entry["location"], place)
        faces = [{"identifier": face["faceIndex"],
                  "relativeRect": [face["faceRectangle"][side]
                                   for side in ("X", "Y", "Width", "Height")],
                  "albumUUID": face["faceAlbumUUID"]} for face in item.get("faces", [])]
        self.assertEqual(entry["faces"], sorted(faces, key=lambda face: face["identifier"]))

    def assert_members_in_line(self, item, entry, wanted):
        if "assetUUIDs" in item:
            self.assertEqual(entry["assets"], item["assetUUIDs"], entry["title"])
        else:
            members = [identifier for identifier, member in wanted.items()
                       if member.get("eventUUID") == item["uuid"]]
            self.assertEqual(sorted(entry["assets"]), sorted(members), entry["title"])

    def assert_clear_failure(self, done, code, *words):
        """One line on standard error that says each of the words; nothing on standard output."""
        self.assertEqual(done.code, code, str(done))
        self.assertEqual(done.out, "")
        lines = [line for line in done.err.splitlines() if line]
        self.assertEqual(len(lines), 1, str(done))
        self.assertTrue(lines[0].startswith("kxsync: "), lines[0])
        for word in words:
            self.assertIn(word, done.err)

    def interrupt(self, process, signal_number=signal.SIGINT):
        process.send_signal(signal_number)
