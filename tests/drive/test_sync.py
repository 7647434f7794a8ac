"""Whole syncs through the console: first, null, changed, resync, library switch, device albums."""

import unittest

from console import (A, ANNA, B, C, DAY, DEBUG, INFO, MASTER, PETS, SUBCLASS_MASTER,
                     TRIP, ConsoleTest, album, asset, event, library, uid)


def titles(containers):
    return [container["title"] for container in containers]


class FirstSync(ConsoleTest):
    def test_brings_assets_albums_events_and_faces(self):
        self.assertEqual(self.sync(library()), [A, B, C])
        dump = self.dump()
        self.assertEqual(titles(dump["albums"]), ["Trip", "Pets"])
        self.assertEqual(titles(dump["events"]), ["2020-01-02"])
        self.assertEqual(titles(dump["faceAlbums"]), ["Anna"])
        self.assertEqual(dump["albums"][0]["assets"], [A, B])
        self.assertEqual(sorted(dump["events"][0]["assets"]), sorted([A, B]))
        self.assertEqual(list(dump["assets"]), [A, B, C])
        first = dump["assets"][A]
        self.assertEqual(first["savedAssetType"], 256)
        self.assertEqual(first["location"], [48.5, 9.25])
        self.assertEqual(first["faces"], [{"identifier": 1, "relativeRect": [0.1, 0.2, 0.3, 0.4],
                                           "albumUUID": ANNA}])
        self.assertEqual(first["creationDate"], 600000000.0)
        self.assertEqual([dump["assets"][u]["sortToken"] for u in (A, B, C)],
                         [600000000.0, 600000000.0 + 1 / 100000.0, 600000000.0 + 2 / 100000.0])
        self.assertTrue(dump["lastSynced"])
        self.assertEqual(dump["syncAgent"], {"userAgent": "tests/1", "libraryKind": "Cassock"})

    def test_is_a_resync_that_says_why(self):
        self.begin(library())
        messages = [entry[3] for entry in self.console.whole_log]
        self.assertIn("Forcing resync based on CurrentLibraryUUID.plist: previous (null), snapshot "
                      "4B1B4C7E-53A8-4B62-9D0B-0F5D6F5C3A11", messages)

    def test_requests_carry_class_and_caption(self):
        self.begin(library())
        requests = self.call("outstandingAssetTransfers")
        self.assertEqual(requests[0], {"identifier": A, "dataclass": "Photo", "prettyName": "first",
                                       "path": None, "isDownload": True, "isRestore": False})
        self.assertIsNone(requests[1]["prettyName"])

    def test_hands_over_jobs_with_every_field(self):
        self.begin(library())
        self.call("device.jobs")
        self.arrive(A)
        self.finish()
        batches = self.call("device.jobs")
        jobs = [job for batch in batches for job in batch]
        imported = next(job for job in jobs if job["uuid"] == A)
        self.assertEqual(imported["originalAssetURL"],
                         f"file:///var/mobile/Media/Photos/Sync/Staging/{A}")
        self.assertEqual(imported["location"], [48.5, 9.25])
        self.assertEqual(sorted(imported["albumURIs"]), sorted([TRIP, DAY, ANNA]))
        self.assertEqual(imported["sortToken"], 600000000.0)
        self.assertEqual(imported["modificationDate"], 1000.0)
        self.assertEqual(imported["originalFileName"], "photo.jpg")
        self.assertEqual(imported["facesInfo"][0]["faceIndex"], 1)
        self.assertFalse(imported["hasFinishedBlock"])
        complete = [job for job in jobs if job["isSyncComplete"]]
        self.assertEqual([job["originalAssetURL"] for job in complete],
                         ["file:///var/mobile/Media/Photos/Sync/PhotoLibrary.plist"])


class LaterSyncs(ConsoleTest):
    def setUp(self):
        super().setUp()
        self.sync(library())

    def test_a_sync_without_changes_changes_nothing(self):
        before = self.dump(hash=True)
        self.put_snapshot(library())
        self.call("prepareForSync")
        self.call("device.counters")
        self.assertTrue(self.call("reconcileSync", type=1, newAnchor="1"))
        # An asset without a place never equals itself: such a sync reconciles, and finds nothing.
        self.assertNotLogged("NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED")
        self.assertEqual(self.call("outstandingAssetTransfers"), [])
        self.finish()
        self.assertEqual(self.dump(hash=True), before)

    def test_null_sync_when_every_asset_has_a_place(self):
        placed = [asset(A, latitude=1.5, longitude=2.5), album(TRIP, "Trip", [A]),
                  album(MASTER, "All", [A], subclass=SUBCLASS_MASTER)]
        self.sync(placed)
        before = self.dump(hash=True)
        self.put_snapshot(placed)
        self.assertTrue(self.call("prepareForSync"))
        self.call("device.counters")
        self.assertTrue(self.call("reconcileSync", type=1, newAnchor="1"))
        self.assertLogged(DEBUG, "NULL PHOTO SYNC DETECTED - NO RECONCILING NEEDED")
        self.finish()
        self.assertEqual(self.call("device.counters")["rowsWritten"], 0)
        self.assertEqual(self.dump(hash=True), before)

    def test_deleted_new_changed_and_renamed(self):
        new = uid("d")
        requested = self.begin([
            event(DAY, "2020-01-02"), album(TRIP, "Journey", [A, new]),
            album(MASTER, "All", [A, C, new], subclass=SUBCLASS_MASTER),
            asset(A, eventUUID=DAY, latitude=48.5, longitude=9.25),
            asset(C, modified=2000.0), asset(new)])
        self.assertEqual(requested, [new, C])
        texts = [entry[3] for entry in self.console.whole_log]
        self.assertIn(f"=========== ASSET {C} HAS CHANGED, RE-REQUESTING DOWNLOAD", texts)
        for identifier in requested:
            self.arrive(identifier)
        self.finish()
        dump = self.dump()
        self.assertEqual(titles(dump["albums"]), ["Journey"])
        self.assertEqual(dump["albums"][0]["assets"], [A, new])
        self.assertEqual(dump["faceAlbums"], [])
        self.assertEqual(set(dump["assets"]), {A, C, new})
        self.assertEqual(dump["assets"][A]["faces"], [])
        self.assertEqual(dump["assets"][C]["modificationDate"], 2000.0)

    def test_an_album_left_alone_keeps_its_members_when_one_leaves_another(self):
        updates = library()
        updates[2] = album(PETS, "Pets", [C])
        self.assertEqual(self.sync(updates), [])
        dump = self.dump()
        self.assertEqual(dump["albums"][0]["assets"], [A, B])
        self.assertEqual(dump["albums"][1]["assets"], [C])

    def test_library_switch_is_a_resync(self):
        other = [asset(uid("x"))]
        self.assertEqual(self.sync(other, library="11111111-2222-3333-4444-555555555555"),
                         [uid("x")])
        dump = self.dump()
        self.assertEqual(list(dump["assets"]), [uid("x")])
        self.assertEqual(dump["albums"], [])
        self.assertEqual(dump["currentLibraryUUID"], "11111111-2222-3333-4444-555555555555")

    def test_a_sync_after_a_restart_asks_for_nothing(self):
        self.restart()
        self.assertEqual(self.begin(library()), [])


class PendingCounts(ConsoleTest):
    def test_stand_between_reconcile_and_transfers_and_sink_with_imports(self):
        self.begin(library())
        dump = self.dump()
        counts = {c["uuid"]: c["pendingItemsCount"]
                  for c in dump["albums"] + dump["events"] + dump["faceAlbums"]}
        self.assertEqual(counts, {TRIP: 2, PETS: 1, DAY: 2, ANNA: 1})
        self.assertEqual(dump["syncProgress"], {"pendingItemsType": 2, "pendingItemsCount": 3})
        self.call("device.advanceClock", seconds=3)
        self.arrive(A)
        dump = self.dump()
        self.assertEqual(dump["albums"][0]["pendingItemsCount"], 1)
        self.assertEqual(dump["syncProgress"]["pendingItemsCount"], 2)
        self.arrive(B)
        self.arrive(C)
        self.finish()
        dump = self.dump()
        for container in dump["albums"] + dump["events"] + dump["faceAlbums"]:
            self.assertEqual((container["pendingItemsType"], container["pendingItemsCount"]),
                             (1, 0))
        self.assertEqual(dump["syncProgress"], {"pendingItemsType": 1, "pendingItemsCount": 0})


class DeviceAlbums(ConsoleTest):
    def test_keep_their_slots_among_synced_ones(self):
        for index, name in ((0, "Mine"), (1, "Yours")):
            self.call("device.addAlbum", uuid=uid(name), title=name, kind=2, index=index)
        first, second, third = uid(1), uid(2), uid(3)
        members = [asset(A), asset(B), asset(C)]
        self.sync([album(first, "1", [A]), album(second, "2", [B]), album(third, "3", [C])] +
                  members)
        self.call("device.addAlbum", uuid=uid("Ours"), title="Ours", kind=2, index=3)
        self.assertEqual(titles(self.dump()["albums"]), ["Mine", "Yours", "1", "Ours", "2", "3"])
        self.sync([album(third, "3", [C]), album(first, "1", [A]), album(second, "2", [B])] +
                  members)
        self.assertEqual(titles(self.dump()["albums"]), ["Mine", "Yours", "3", "Ours", "1", "2"])

    def test_the_devices_own_assets_and_albums_are_never_changed(self):
        own = uid("own")
        self.call("device.addAsset", uuid=own, path=MEDIA_DCIM + "IMG_0001.JPG", isVideo=False,
                  creationDate=5.5, location=[1.5, 2.5])
        self.call("device.addAlbum", uuid=uid("Mine"), title="Mine", kind=2, assets=[own])
        before = self.dump()
        self.sync(library())
        self.sync([asset(C)], library="11111111-2222-3333-4444-555555555555")
        after = self.dump()
        self.assertEqual(after["assets"][own], before["assets"][own])
        self.assertIn(before["albums"][0], after["albums"])

    def test_an_unmanaged_album_of_a_synced_kind_is_not_deleted(self):
        stranger = uid("stranger")
        self.call("device.addAlbum", uuid=stranger, title="S", kind=1550, managed=False)
        self.begin([asset(A)])
        self.assertIn([3, "can't delete album because it's not of type KXManagedAlbum"],
                      [[entry[0], entry[3]] for entry in self.console.whole_log])

    def test_equal_order_sorts_no_list(self):
        two = [album(TRIP, "1", [A]), album(PETS, "2", [B]), asset(A), asset(B)]
        self.sync(two)
        self.call("device.counters")
        self.begin([*two, asset(C)])
        self.assertEqual(self.call("device.counters")["listSorts"], 0)


class EndCalls(ConsoleTest):
    def test_end_calls_in_the_other_order_twice_and_on_a_fresh_client(self):
        self.call("syncEnded", success=True)
        self.call("assetTransferEnded", success=False)
        self.call("assetTransferEnded", success=False)
        self.assertLogged(DEBUG, "========= Photos Sync did not end with success ======")
        self.call("client.new")
        self.call("syncEnded", success=False)
        self.assertLogged(INFO, "syncEndedWithSuccess 0")
        self.assertEqual(self.sync(library()), [A, B, C])

    def test_a_failed_end_leaves_no_seal(self):
        for identifier in self.begin(library()):
            self.arrive(identifier)
        self.finish(success=False)
        self.assertFalse(self.dump()["lastSynced"])
        self.assertEqual(self.begin(library()), [])


class MainThread(ConsoleTest):
    def test_prepare_and_reconcile_refuse_the_main_thread(self):
        for call in ("prepareForSync", "reconcileSync"):
            answer = self.console.raw(call, onMainThread=True)
            self.assertEqual(answer["exception"], {
                "name": "InternalInconsistency",
                "reason": "Ferrule plugins should only be run on a non-main-thread queue!"})


MEDIA_DCIM = "/var/mobile/Media/DCIM/100CAMRA/"

if __name__ == "__main__":
    unittest.main()
