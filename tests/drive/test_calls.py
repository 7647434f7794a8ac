"""Every call of the console: its results, its bad arguments, lines that are none, memory pressure."""

import base64
import json
import os
import subprocess
import tempfile
import unittest

from console import (A, ANNA, B, C, DEBUG, ERROR, FERRULE, INFO, TRIP, Console, ConsoleTest,
                     Raised, album, asset, event, library, uid)


class Lines(ConsoleTest):
    def test_a_line_that_is_none_is_answered_and_the_next_is_read(self):
        for text in ("", "no json", "[]", "1", '"x"', "null", '{"call":1}', "{}", "{", "\x00",
                     '{"call":"nope"}', '{"call":"wait"}', '{"call":"wait","of":9}',
                     '{"call":"device.putFile"}', '{"call":"device.putFile","path":7}',
                     '{"call":"device.readFile","path":"/\\u0000"}',
                     '{"call":"reconcileSync","type":-1}', '{"call":"reconcileSync","type":"x"}',
                     '{"call":"device.set","entity":"moon","fields":{}}', "[" * 100000):
            with self.subTest(text=text[:60]):
                answer = self.console.line(text)
                self.assertIsNone(answer["result"])
                self.assertEqual(set(answer["exception"]), {"name", "reason"})
        self.assertEqual(self.call("currentSyncAnchor"), "1")

    def test_a_line_beyond_the_limit_is_answered(self):
        self.assertEqual(self.console.line(" " * (64 << 20) + "{}")["exception"]["name"], "BadLine")
        self.assertEqual(self.call("currentSyncAnchor"), "1")

    def test_lines_nested_very_deep_do_no_harm(self):
        for inside in ("[" * 150000 + "]" * 150000, '{"a":' * 150000 + "1" + "}" * 150000):
            for call in ("device.paths", "records.archive", "currentSyncAnchor"):
                line = f'{{"call":"{call}","item":{{"x":{inside}}}}}'
                self.console.line(line)
                number = self.console.line(line.replace("{", '{"async":true,', 1))["started"]
                self.assertEqual(self.console.raw("wait", of=number)["call"], call)
        self.assertEqual(self.call("currentSyncAnchor"), "1")

    def test_missing_and_mistyped_arguments_are_named(self):
        answer = self.console.raw("device.addAsset", uuid="x")
        self.assertEqual(answer["exception"], {"name": "BadArgument",
                                               "reason": 'missing argument "path"'})
        answer = self.console.raw("device.setClock", now="noon")
        self.assertEqual(answer["exception"]["reason"],
                         'argument "now": expected number, found string')

    def test_the_end_of_input_in_the_middle_of_anything_ends_cleanly(self):
        self.begin(library())
        self.call("device.fault", point="saverHold", times=9)
        self.call("device.advanceClock", seconds=9)
        self.arrive(A)
        self.console.raw("assetTransferEnded", success=True, **{"async": True})
        self.assertEqual(self.console.close(), 0)

    def test_wrong_usage(self):
        for arguments in ([], ["a", "b"], ["-x"]):
            done = subprocess.run([FERRULE, "drive", *arguments], capture_output=True, text=True,
                                  stdin=subprocess.DEVNULL, check=False)
            self.assertEqual(done.returncode, 2, done.stderr)
            self.assertEqual(len(done.stderr.strip().splitlines()), 1)

    def test_a_device_that_is_held_is_refused(self):
        done = subprocess.run([FERRULE, "drive", self.device], capture_output=True, text=True,
                              stdin=subprocess.DEVNULL, check=False)
        self.assertEqual(done.returncode, 7)
        self.assertIn(str(self.console.process.pid), done.stderr)


class ClientCalls(ConsoleTest):
    def test_classes_and_anchor_never_change(self):
        for _ in range(2):
            self.assertEqual(self.call("supportedDataclasses"), ["Photo"])
            self.assertEqual(self.call("currentSyncAnchor"), "1")
            self.sync(library())

    def test_prepare_on_a_fresh_client_logs_a_null_library(self):
        self.assertTrue(self.call("prepareForSync", hostAnchor="77"))
        self.assertLogged(INFO, "Library before: (null)")
        self.assertEqual(self.console.log[0][0::3],
                         [DEBUG, "prepareForSyncWithHostAnchor"])

    def test_reconcile_without_a_snapshot(self):
        answer = self.console.raw("reconcileSync", type=3, newAnchor="2")
        self.assertFalse(answer["result"])
        self.assertEqual((answer["error"]["domain"], answer["error"]["code"]),
                         ("com.veltro.plist", 1))
        self.assertIn("No such file or directory", answer["error"]["message"])
        self.assertLogged(INFO, "Reconcile Sync: (type=3) anchor: 2")
        self.assertLogged(ERROR, "snapshot (null) err: (null)")

    def test_a_sync_on_the_main_thread_raises(self):
        reason = "Ferrule plugins should only be run on a non-main-thread queue!"
        raised = {"name": "InternalInconsistency", "reason": reason}
        for call in ("prepareForSync", "reconcileSync"):
            for asynchronous in (False, True):
                answer = self.console.raw(call, onMainThread=True, **{"async": asynchronous})
                if asynchronous:
                    self.assertIsNone(answer["exception"])
                    answer = self.console.raw("wait", of=answer["started"])
                self.assertEqual((answer["call"], answer["exception"]), (call, raised))

    def test_paths_to_backup(self):
        self.assertEqual(self.call("pathsToBackup", pathsNotToBackup=["keep"]),
                         {"pathsToBackup": ["DCIM"], "pathsNotToBackup": ["keep"]})
        self.assertEqual(self.console.log, [])

    def test_metrics(self):
        self.sync([asset(A)])
        metrics = self.call("installedAssetMetrics")
        self.assertEqual(metrics["Photo"]["_Count"], 1)
        self.assertEqual(metrics["Shoebox"], {"_PhysicalSize": 0, "_Count": 0})
        self.call("device.backupLock", held=True)
        self.assertEqual(self.call("installedAssetMetrics"), {})
        self.assertLogged(INFO, "Restore in progress, returning empty metrics")
        self.call("device.backupLock", held=False)
        self.assertEqual(self.call("installedAssetMetrics"), metrics)

    def test_a_new_client_starts_from_nothing(self):
        self.begin(library())
        self.call("client.new")
        self.assertIn("Clearing sync state", [entry[3] for entry in self.console.log])
        self.assertEqual(self.call("outstandingAssetTransfers"), [])

    def test_async_calls_are_collected_by_number(self):
        self.put_snapshot(library())
        one = self.console.raw("prepareForSync", **{"async": True})
        two = self.console.raw("reconcileSync", type=1, newAnchor="1", **{"async": True})
        self.assertEqual((one["started"], two["started"]), (1, 2))
        self.assertTrue(self.console.raw("wait", of=2)["result"])
        answer = self.console.raw("wait", of=1)
        self.assertEqual((answer["call"], answer["result"]), ("prepareForSync", True))
        self.assertEqual(self.console.raw("wait", of=1)["exception"]["name"], "BadArgument")

    def test_answers_that_nobody_collects_are_bounded(self):
        for _ in range(256):
            self.console.raw("currentSyncAnchor", **{"async": True})
        answer = self.console.raw("currentSyncAnchor", **{"async": True})
        self.assertEqual(answer["exception"]["name"], "TooManyStarted")
        self.assertEqual(self.console.raw("wait", of=1)["result"], "1")
        self.assertIn("started", self.console.raw("currentSyncAnchor", **{"async": True}))

    def test_faults_that_never_hit_are_bounded(self):
        for _ in range(1024):
            self.call("device.fault", point="statfs", skip=1)
        with self.assertRaises(Raised) as raised:
            self.call("device.fault", point="statfs")
        self.assertEqual(raised.exception.name, "TooManyFaults")
        self.call("device.clearFaults")
        self.call("device.fault", point="statfs")

    def begin_with_many(self, count):
        """A sync that asks for that many files, of which none is there."""
        requested = self.begin([asset(uid(number)) for number in range(count)])
        self.assertEqual(len(requested), count)
        return requested

    def test_held_batches_are_bounded(self):
        requested = self.begin_with_many(1025)
        self.call("device.fault", point="saverHold")
        for identifier in requested[:1024]:
            self.call("device.advanceClock", seconds=4)
            self.call("assetTransfer", identifier=identifier, path="Photos/Sync/Staging/none")
        with self.assertRaises(Raised) as raised:
            self.call("assetTransfer", identifier=requested[1024], path="Photos/Sync/Staging/none")
        self.assertEqual(raised.exception.name, "TooManyHeld")
        self.call("device.releaseSaver")
        self.call("assetTransfer", identifier=requested[1024], path="Photos/Sync/Staging/none")
        self.assertEqual(len(self.call("device.jobs")), 1025)

    def test_record_of_jobs_that_nobody_takes_is_bounded_and_tells_of_its_gap(self):
        requested = self.begin_with_many(20001)
        self.call("device.advanceClock", seconds=4)
        self.call("assetTransfer", identifier=requested[0], path="Photos/Sync/Staging/none")
        self.call("device.fault", point="saver")  # no job of the second batch is worked
        for identifier in requested[1:]:
            self.call("assetTransfer", identifier=identifier, path="Photos/Sync/Staging/none")
        self.call("device.advanceClock", seconds=4)
        self.finish(False)
        with self.assertRaises(Raised) as raised:
            self.call("device.jobs")
        self.assertEqual(raised.exception.name, "TooManyKept")
        self.assertEqual(self.call("device.jobs"), [])


class MemoryPressure(ConsoleTest):
    def test_one_source_however_often_the_transfers_are_listed(self):
        self.assertEqual(self.call("device.memoryPressure")["sources"], 0)
        self.call("outstandingAssetTransfers")
        self.call("outstandingAssetTransfers")
        self.assertEqual(self.call("device.memoryPressure")["sources"], 1)

    def test_listening_begun_by_the_transfers_re_faults(self):
        self.sync(library())
        self.call("outstandingAssetTransfers")
        self.call("device.touch", entity="asset", uuids=[A, B])
        self.call("device.touch", entity="album", uuids=[TRIP])
        answer = self.call("device.memoryPressure")
        self.assertEqual(answer["sources"], 1)
        self.assertGreaterEqual(answer["registered"], 3)
        self.assertLogged(DEBUG, f"Re-faulted {answer['registered']} objects.")

    def test_unsaved_changes_survive(self):
        self.sync(library())
        self.call("outstandingAssetTransfers")
        self.call("device.set", entity="album", uuid=TRIP, fields={"title": "Unsaved"}, save=False)
        self.call("device.memoryPressure")
        self.assertEqual(self.dump()["albums"][0]["title"], "Trip")
        self.call("device.set", entity="album", uuid=TRIP, fields={"pendingItemsCount": 4})
        self.assertEqual(self.dump()["albums"][0]["title"], "Unsaved")

    def test_a_stop_ends_it(self):
        self.call("outstandingAssetTransfers")
        self.call("syncEnded", success=True)
        self.assertEqual(self.call("device.memoryPressure")["sources"], 0)
        self.assertFalse(any(entry[3].startswith("Re-faulted") for entry in self.console.log))


class DeviceCalls(ConsoleTest):
    def test_files(self):
        path = "/var/mobile/Media/DCIM/100CAMRA/a.txt"
        self.assertIsNone(self.call("device.readFile", path=path))
        self.call("device.putFile", path=path, text="hello")
        self.assertEqual(self.call("device.readFile", path=path),
                         {"base64": base64.b64encode(b"hello").decode()})
        with tempfile.NamedTemporaryFile() as local:
            local.write(b"local")
            local.flush()
            self.call("device.putFile", path=path, **{"from": local.name})
        self.assertEqual(self.call("device.readFile", path=path)["base64"], "bG9jYWw=")
        self.assertEqual(self.call("device.listFiles", path="/var/mobile/Media/DCIM"), [path])
        self.call("device.removeFile", path=path)
        self.assertEqual(self.call("device.listFiles", path="/var/mobile/Media/DCIM"), [])
        self.assertIsNone(self.call("device.readPlist", path=path))

    def test_files_never_leave_the_device(self):
        outside = os.path.join(self.root, "outside")
        os.symlink(self.root, os.path.join(self.device, "link"))
        for path in ("/../outside", "/link/outside", "relative", "/a/../../outside", ""):
            with self.subTest(path=path), self.assertRaises(Raised):
                self.call("device.putFile", path=path, text="x")
        self.assertFalse(os.path.exists(outside))

    def test_property_lists_keep_data_and_dates(self):
        self.call("device.putFile", path="/p.plist", base64=base64.b64encode(
            b'<?xml version="1.0"?><plist version="1.0"><dict><key>d</key><data>AQI=</data>'
            b"<key>t</key><date>2001-01-01T00:00:01Z</date></dict></plist>").decode())
        self.assertEqual(self.call("device.readPlist", path="/p.plist"),
                         {"d": {"base64": "AQI="}, "t": {"date": 1.0}})

    def test_assets_albums_set_and_removal(self):
        own, mine = uid("own"), uid("mine")
        self.call("device.addAsset", uuid=own, path="/var/mobile/Media/DCIM/100CAMRA/1.JPG",
                  isVideo=True, creationDate=0.1 + 0.2, modificationDate=-5.5, sortToken=1e-300,
                  location=[-1.5, 2.5], originalFileName="n", originalFilesize=10,
                  faces=[{"identifier": 65535, "relativeRect": [0.1, 0.2, 0.3, 0.4],
                          "albumUUID": None}])
        self.call("device.addAlbum", uuid=mine, title=None, kind=2, assets=[own],
                  pendingItemsType=2, pendingItemsCount=7)
        dump = self.dump()
        self.assertEqual(dump["assets"][own]["creationDate"], 0.1 + 0.2)
        self.assertEqual(dump["assets"][own]["sortToken"], 1e-300)
        self.assertEqual(dump["assets"][own]["faces"][0]["identifier"], 65535)
        self.assertEqual(dump["albums"], [{"uuid": mine, "title": None, "kind": 2,
                                           "pendingItemsType": 2, "pendingItemsCount": 7,
                                           "assets": [own]}])
        self.call("device.set", entity="asset", uuid=own,
                  fields={"location": None, "originalFileName": "m", "isVideo": False})
        self.call("device.set", entity="album", uuid=mine, fields={"title": "Now"})
        self.call("device.set", entity="syncProgress", fields={"pendingItemsCount": 3})
        dump = self.dump()
        self.assertIsNone(dump["assets"][own]["location"])
        self.assertFalse(dump["assets"][own]["isVideo"])
        self.assertEqual(dump["albums"][0]["title"], "Now")
        self.assertEqual(dump["syncProgress"]["pendingItemsCount"], 3)
        self.call("device.removeAsset", uuid=own)
        dump = self.dump()
        self.assertEqual((dump["assets"], dump["albums"][0]["assets"]), ({}, []))

    def test_what_no_library_holds_is_refused(self):
        own = uid("own")
        place = {"uuid": own, "path": "/var/mobile/Media/DCIM/100CAMRA/1.JPG"}
        for wrong in ({"path": "../1.JPG"}, {"sidecarSizes": [1 << 63]}, {"sidecarSizes": [0.5]},
                      {"originalFilesize": 1 << 63}, {"savedAssetType": 1 << 31},
                      {"faces": [{"identifier": 1 << 16}]}, {"location": [1]}):
            with self.subTest(wrong=wrong), self.assertRaises(Raised):
                self.call("device.addAsset", **{**place, **wrong})
        self.call("device.addAsset", **place, sidecarSizes=[(1 << 63) - 1])
        for wrong in ({"path": "../1.JPG"}, {"path": ""}, {"savedAssetType": 1 << 31}):
            with self.subTest(wrong=wrong), self.assertRaises(Raised):
                self.call("device.set", entity="asset", uuid=own, fields=wrong)
        self.assertEqual(self.dump()["assets"][own]["path"], place["path"])

    def test_an_album_outside_its_list_is_reported(self):
        self.sync(library())
        self.call("device.addAlbum", uuid=uid("lost"), title="Lost", kind=1550, inList=False)
        self.begin([*library(), album(uid("lost"), "Lost", [A])])
        self.assertTrue(any(entry[0] == ERROR and entry[3].startswith(
            "===== ERROR ===== Didn't find Album ") for entry in self.console.whole_log))

    def test_counters_start_anew_at_every_call(self):
        self.sync(library())
        first = self.call("device.counters")
        self.assertEqual(list(first), ["listSorts", "rowsWritten", "statements"])
        self.assertGreater(first["rowsWritten"], 0)
        self.assertEqual(self.call("device.counters")["rowsWritten"], 0)

    def test_the_clock_stands_once_it_is_set(self):
        self.call("device.setClock", now=5.25)
        self.call("prepareForSync")
        self.assertEqual(self.call("device.jobs")[0][0]["cleanupBeforeDate"], 4.25)
        self.call("device.advanceClock", seconds=0.5)
        self.call("prepareForSync")
        self.assertEqual(self.call("device.jobs")[0][0]["cleanupBeforeDate"], 4.75)

    def test_dump_with_hashes(self):
        self.sync([asset(A)])
        self.assertEqual(len(self.dump(hash=True)["assets"][A]["sha256"]), 64)


class RunningClock(unittest.TestCase):
    def test_advancing_a_running_clock_is_refused(self):
        with tempfile.TemporaryDirectory() as root:
            console = Console(os.path.join(root, "device"))
            with self.assertRaises(Raised):
                console("device.advanceClock", seconds=1)
            self.assertEqual(console.close(), 0)


class RecordCalls(ConsoleTest):
    ZEROS = "00000000-0000-0000-0000-000000000000"

    def test_identifiers(self):
        self.assertEqual(self.call("records.uuid", photoBase64="A" * 22), self.ZEROS)
        self.assertEqual(self.call("records.uuid", photoBase64="-" + "A" * 21), self.ZEROS)
        for text in ("A" * 21, "A" * 23):
            self.assertIsNone(self.call("records.uuid", photoBase64=text))
        self.assertEqual(self.call("records.uuid", string=self.ZEROS.replace("0", "a")),
                         self.ZEROS.replace("0", "A"))
        self.assertEqual(self.call("records.isEqual", uuid=self.ZEROS),
                         {"isEqual": False, "isEqualToData": True})
        self.assertEqual(self.call("records.photoBase64UUIDs", uuids=[]), [])
        self.assertEqual(self.call("records.photoBase64UUIDs",
                                   uuids=["F" * 8 + "-FFFF-FFFF-FFFF-" + "F" * 12, self.ZEROS]),
                         ["%" * 21 + "w", "A" * 22])

    def test_base64(self):
        zeros = base64.b64encode(bytes(16)).decode()
        self.assertEqual(self.call("records.base64Encode", base64=zeros, photo=True), "A" * 22)
        self.assertEqual(self.call("records.base64Encode", base64=zeros), "A" * 22 + "==")
        self.assertEqual(self.call("records.base64Decode", text="QUI="), {"base64": "QUI="})
        self.assertIsNone(self.call("records.base64Decode", text="Q"))
        self.assertIsNone(self.call("records.base64Decode", text="QQ="))

    def test_archives_lose_dates_and_place(self):
        kept = self.call("records.archive", item={**asset(A), "latitude": 1.5, "longitude": 2.5})
        self.assertEqual(kept["uuid"], A)
        self.assertFalse({"exposureDate", "modificationDate", "latitude", "longitude"} & set(kept))

    def test_equality_of_items(self):
        one, other = album(A, "n", [B, C]), album(A, "n", [C, B])
        self.assertEqual(self.call("records.isEqualItems", a=one, b=one), {"isEqual": True})
        self.assertEqual(self.call("records.isEqualItems", a=one, b=other), {"isEqual": False})
        self.assertEqual([entry[3] for entry in self.console.log], ["album assetUUID not equal"])
        self.call("records.isEqualItems", a=one, b={"itemType": "Event"})
        self.assertEqual(self.console.log[0][:2] + self.console.log[0][3:],
                         [ERROR, "KXSAlbum", "otherAlbum isn't an album"])
        self.call("records.isEqualItems", a=event(A, "e"), b={"itemType": "Album"})
        self.assertLogged(ERROR, "otherEvent isn't an event")

    def test_snapshots(self):
        plist = {"libraryUUID": "L", "libraryKind": "Folder",
                 "updates": [album(TRIP, "img10", []), album(ANNA, "IMG2", []), asset(A)],
                 "deletes": [asset(B)]}
        decoded = self.call("records.snapshot", plist=plist)
        self.assertTrue(decoded["isFolderSync"])
        self.assertEqual([item["albumName"] for item in decoded["orderedAlbums"]],
                         ["IMG2", "img10"])
        self.assertEqual((list(decoded["assets"]), list(decoded["deletes"])), ([A], [B]))
        self.assertIsNone(decoded["updates"])
        self.assertTrue(decoded["hasChangedObjects"])
        archived = self.call("records.snapshot", plist=plist, archive=True)
        self.assertEqual((archived["libraryUUID"], archived["isFolderSync"]), ("L", False))
        self.assertIsNone(archived["assets"])
        self.assertEqual(list(archived["deletes"]), [B])

    def test_what_cannot_be_decoded_is_an_exception(self):
        answer = self.console.raw("records.snapshot", plist={"updates": [{"itemType": "Folder"}]})
        self.assertEqual(answer["exception"], {"name": "InternalInconsistency",
                                               "reason": "Unknown object type"})
        self.assertEqual(
            self.console.raw("records.archive", item={"itemType": "x"})["exception"]["name"],
            "InternalInconsistency")

    def test_a_face_rectangle_that_is_none_goes_to_the_standard_log(self):
        updates = [asset(A, faces=[{"faceIndex": 1, "faceRectangle": "no"}])]
        self.sync(updates)
        self.put_snapshot(updates)
        self.call("prepareForSync")
        answer = self.console.raw("reconcileSync", type=1, newAnchor="1")
        self.assertEqual(len(answer["stdlog"]), 1)
        self.assertTrue(answer["stdlog"][0].startswith(
            "[KXS] Unable to construct faceRect for faceInfo: "), answer["stdlog"])


class EveryCall(ConsoleTest):
    NAMES = """supportedDataclasses currentSyncAnchor prepareForSync reconcileSync
        outstandingAssetTransfers assetTransfer assetTransferEnded syncEnded restoreEnded
        pathsToBackup installedAssetMetrics device.dump device.paths device.jobs device.porterCalls
        device.putFile device.readFile device.readPlist device.removeFile device.listFiles
        device.addAsset device.addAlbum device.set device.removeAsset device.setClock
        device.advanceClock device.backupFiles device.backupLock device.memoryPressure device.touch
        device.fault device.clearFaults device.releaseSaver records.uuid records.base64Encode
        records.base64Decode records.photoBase64UUIDs records.isEqual records.archive
        records.isEqualItems records.snapshot device.counters client.new wait""".split()

    def test_is_known(self):
        for name in self.NAMES:
            with self.subTest(name=name):
                answer = self.console.line(json.dumps({"call": name}))
                self.assertEqual(answer["call"], name)
                self.assertEqual(list(answer), ["call", "result", "error", "exception", "log",
                                                "stdlog"])
                if answer["exception"]:
                    self.assertNotEqual(answer["exception"]["name"], "UnknownCall")


if __name__ == "__main__":
    unittest.main()
