"""Random histories of syncs, compared after each step with a second implementation: requests, log,
save jobs, batches, and the device library itself.

KX_RANDOM_HISTORIES sets how many (10 by default), KX_RANDOM_SEED the seed, which is printed.
"""

import base64
import os
import plistlib
import random
import re
import unittest

from console import CLOCK, HOST_EPOCH, MEDIA, SNAPSHOT, ConsoleTest, jpeg
from sync_model import Device, HostLibrary, Sync, device_time, exposure_of

HISTORIES = int(os.environ.get("KX_RANDOM_HISTORIES", "10"))
SEED = int(os.environ.get("KX_RANDOM_SEED", str(random.SystemRandom().randrange(1 << 32))))
SYNCS = 6  # of one history

RECOVERABLE = (4, 7, 8, 9, 14, 16, 18, 19, 20)
UNRECOVERABLE = (0, 1, 2, 3, 5, 6, 10, 15, 17, 21, -4)
NAMES = ("Trip", "trip", "Trip 2", "Trip 10", "Zoo", "", "\u00c4rger", "\u00e4rger 2", None)
COMPARED = ("_reconcileAlbums", "_reconcileAssets", "_setPendingAlbumCounts",
            "_reconcileDeviceAlbumListSortingWithAlbums", "_reorderAlbumListProxy")
NULL_SYNC = "NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED"


def identifier(group, number):
    return f"{group:08X}-0000-4000-8000-{number:012X}"


ASSETS = [identifier(1, number) for number in range(10)]
ALBUMS = [identifier(2, number) for number in range(6)]
EVENTS = [identifier(3, number) for number in range(3)]


class Host:
    """Makes one snapshot after another, each much like the one before."""

    def __init__(self, source):
        self.source = source
        self.root = None

    def next(self):
        source = self.source
        if self.root and source.random() < 0.25:
            return self.root
        before = {item["uuid"]: item for item in self.root["updates"]} if self.root else {}
        assets = [self.asset(uuid, before.get(uuid))
                  for uuid in source.sample(ASSETS, source.randrange(9))]
        containers = [before[uuid] if uuid in before and source.random() < 0.5 else self.album(uuid)
                      for uuid in source.sample(ALBUMS, source.randrange(6))]
        containers += [self.named({"uuid": uuid, "itemType": "Event"}, "eventName")
                       for uuid in source.sample(EVENTS, source.randrange(4))]
        if source.random() < 0.8:
            members = [item["uuid"] for item in assets] + [identifier(1, 60)]
            source.shuffle(members)
            containers.append({"uuid": identifier(4, 0), "itemType": "Album", "subclass": 5,
                               "assetUUIDs": members})
        if assets and source.random() < 0.3:
            assets.append(dict(source.choice(assets)))
        updates = containers + assets
        if source.random() < 0.7:
            source.shuffle(updates)
        stays = self.root and source.random() < 0.85
        library = self.root["libraryUUID"] if stays else identifier(9, source.randrange(3))
        self.root = {"libraryUUID": library, "updates": updates}
        if source.random() < 0.9:
            self.root["libraryKind"] = source.choice(["Cassock", "Folder", "Brindle"])
        return self.root

    def asset(self, uuid, before):
        source = self.source
        if before and source.random() < 0.3:
            return dict(before)
        item = dict(before or {"uuid": uuid, "itemType": "Asset", "isVideo": False})
        choices = {
            "exposureDate": [HOST_EPOCH + 6e8, HOST_EPOCH + 6e8 + 0.1, HOST_EPOCH - 1, HOST_EPOCH],
            "latitude": [0, 0.0, 1.5, -90.0, 91.0], "longitude": [0, 0.0, 1.5, 180.0, -181.0],
            "caption": ["one", "two", ""], "originalFileName": ["a.jpg", "b.jpg"],
            "eventUUID": [*EVENTS, "", identifier(3, 77), ALBUMS[0]],
            "faces": [[self.face() for _ in range(source.randrange(4))]]}
        if "modificationDate" not in item or source.random() < 0.15:
            choices["modificationDate"] = [HOST_EPOCH + 1.0, HOST_EPOCH + 2.0]
        for key, values in choices.items():
            if key in item and source.random() < 0.4:
                continue
            if source.random() < 0.75:
                item[key] = source.choice(values)
            else:
                item.pop(key, None)
        return item

    def face(self):
        source = self.source
        choices = {"faceIndex": [0, 1, 2, 65535, 65536, -1, 1.9],
                   "faceAlbumUUID": [ALBUMS[0], "nobody"],
                   "faceRectangle": [{"X": 0.1, "Y": 0.2, "Width": 0.3, "Height": 0.4},
                                     {"X": 0, "Y": 0, "Width": 1, "Height": 1}, {"X": 0.5}]}
        return {key: source.choice(values) for key, values in choices.items()
                if source.random() < 0.85}

    def album(self, uuid):
        source = self.source
        item = self.named({"uuid": uuid, "itemType": "Album"}, "albumName")
        if source.random() < 0.8:
            item["subclass"] = source.choice([0, 1, 3, 3, 4, 5])
        if source.random() < 0.9:
            pool = [*ASSETS, identifier(1, 50)]
            item["assetUUIDs"] = [source.choice(pool) for _ in range(source.randrange(6))]
        return item

    def named(self, item, key):
        name = self.source.choice(NAMES)
        return item if name is None else {**item, key: name}


def comparable(log):
    """The messages that the model writes, too; row numbers and addresses are the device's own."""
    return [[level, function,
             re.sub(r"is 0x[0-9a-f]+$", "is P", re.sub(r"Album/p\d+", "Album/p", message))]
            for level, _, function, message in log if function in COMPARED]


class RandomSyncs(ConsoleTest):
    def test_agree_with_the_model(self):
        print(f"seed {SEED}, {HISTORIES} histories")
        for number in range(HISTORIES):
            with self.subTest(seed=SEED, history=number):
                self.history(random.Random(SEED + number))
                self.end()
            self.doCleanups()
            self.setUp()

    def history(self, source):
        host, device = Host(source), Device()
        self.now = CLOCK
        if source.random() < 0.6:
            self.add_own(device)
        for _ in range(SYNCS):
            self.one_sync(source, host, device)
            if source.random() < 0.2:
                self.restart()
            elif source.random() < 0.2:
                self.call("client.new")

    def add_own(self, device):
        own, mine = identifier(7, 1), identifier(8, 1)
        self.call("device.addAsset", uuid=own, path="/var/mobile/Media/DCIM/100CAMRA/1.JPG")
        self.call("device.addAlbum", uuid=mine, title="Mine", kind=2, assets=[own])
        container = device.add_container(mine, "Mine", 2)
        device.assets[own] = {"type": 0, "created": None, "modified": None, "token": None,
                              "place": None, "name": None, "faces": [], "in": {container}}

    def pass_time(self, seconds):
        self.now += seconds
        self.call("device.setClock", now=self.now)

    def check(self, device):
        dump, expected = self.dump(), device.dump()
        self.assertEqual(list(dump["assets"]), list(expected["assets"]))
        for asset in dump["assets"].values():
            del asset["path"], asset["size"]
        self.assertEqual({key: dump[key] for key in expected}, expected)

    def one_sync(self, source, host, device):
        root = host.next()
        content = plistlib.dumps(root, fmt=source.choice([plistlib.FMT_BINARY, plistlib.FMT_XML]))
        self.call("device.putFile", path=SNAPSHOT, base64=base64.b64encode(content).decode())
        self.pass_time(source.choice([0.5, 10.0]))
        self.saved_at = self.now
        self.assertTrue(self.call("prepareForSync", hostAnchor="1"))
        self.assertTrue(self.call("reconcileSync", type=1, newAnchor="1"))
        run = Sync(device, HostLibrary(root))
        self.assertEqual(comparable(self.console.log), run.log)
        messages = [entry[3] for entry in self.console.log]
        self.assertEqual(NULL_SYNC in messages, run.is_null)
        if not run.is_null:
            self.assertTrue(messages[-1].startswith(
                f"Done reconciling! isResync {int(run.is_resync)}, "), messages[-1])
        self.assertEqual([request["identifier"] for request in
                          self.call("outstandingAssetTransfers")], run.outstanding)
        self.check(device)
        self.call("device.jobs")
        queued = self.transfer_all(source, run)
        if source.random() < 0.4:
            self.check(device)
        self.finish_sync(run, queued, source.random() < 0.85)
        self.check(device)

    def transfer_all(self, source, run):
        """Reports the transfers, some not at all; the assets whose jobs wait for the next batch."""
        queued = []
        requested = list(run.outstanding)
        source.shuffle(requested)
        for uuid in requested:
            self.pass_time(source.choice([0, 0.5, 1, 2.9, 3, 4]))
            fate = source.random()
            if fate < 0.08:
                continue
            if fate < 0.2:
                error = {"domain": source.choice(["FRError", "FRError", "Other"]),
                         "code": source.choice(RECOVERABLE)}
                self.call("assetTransfer", identifier=uuid, succeeded=False, error=error)
            elif fate < 0.28:
                error = {"domain": "FRError", "code": source.choice(UNRECOVERABLE)}
                self.call("assetTransfer", identifier=uuid, succeeded=False, error=error)
                run.give_up(uuid)
            else:
                self.bring(run, uuid, queued)
        return queued

    def bring(self, run, uuid, queued):
        path = f"Photos/Sync/Staging/{uuid}"
        self.call("device.putFile", path=MEDIA + path,
                  base64=base64.b64encode(jpeg(uuid.encode())).decode())
        self.call("assetTransfer", identifier=uuid, succeeded=True, path=path)
        run.outstanding.remove(uuid)
        queued.append(uuid)
        batches = self.call("device.jobs")
        if self.now - self.saved_at < 3.0:
            self.assertEqual(batches, [])
            return
        self.saved_at = self.now
        self.assertEqual([[job["uuid"] for job in batch] for batch in batches], [queued])
        for job in batches[0]:
            self.check_job(run, job)
        run.import_assets(queued)
        queued.clear()

    def check_job(self, run, job):
        wanted = run.host.assets[job["uuid"]]
        self.assertEqual(job["albumURIs"], run.album_uris(job["uuid"]))
        self.assertEqual(job["facesInfo"], wanted.get("faces"))
        self.assertEqual(job["sortToken"], run.tokens.get(job["uuid"]))
        self.assertEqual(job["creationDate"], device_time(exposure_of(wanted)))
        self.assertEqual(job["originalFileName"], wanted.get("originalFileName"))

    def finish_sync(self, run, queued, success):
        self.call("assetTransferEnded", success=success)
        jobs = [job for batch in self.call("device.jobs") for job in batch]
        self.assertEqual([job["uuid"] for job in jobs if job["uuid"]], queued)
        expected = ["import"] * len(queued) + ["seal"] * success
        expected += ["clean-up"] * (not run.outstanding)
        self.assertEqual(["clean-up" if job["cleanupSyncState"] else
                          "seal" if job["isSyncComplete"] else "import" for job in jobs], expected)
        run.import_assets(queued)
        run.end(success)
        self.call("syncEnded", success=success)


if __name__ == "__main__":
    unittest.main()
