"""Transfers through the console: failures of every kind, batches, jobs that fail."""

import base64
import unittest

from console import (A, B, C, ERROR, INFO, MEDIA, TRIP, WARNING, ConsoleTest, Raised, album, asset,
                     library, uid)

RECOVERABLE = (4, 7, 8, 9, 14, 16, 18, 19, 20)


class FailingTransfers(ConsoleTest):
    def setUp(self):
        super().setUp()
        self.begin(library())

    def outstanding(self):
        return [request["identifier"] for request in self.call("outstandingAssetTransfers")]

    def fail(self, identifier, **arguments):
        self.call("assetTransfer", identifier=identifier, succeeded=False, **arguments)

    def test_recoverable_codes_stay_outstanding(self):
        for code in RECOVERABLE:
            with self.subTest(code=code):
                self.fail(A, error={"domain": "FRError", "code": code})
                self.assertLogged(ERROR, "Asset transfer was not successful!")
        self.assertEqual(self.outstanding(), [A, B, C])

    def test_other_codes_are_given_up_and_no_longer_pending(self):
        self.fail(A, error={"domain": "FRError", "code": 5})
        texts = [entry[3] for entry in self.console.log]
        self.assertTrue(any(text.startswith("Encountered unrecoverable error ") and
                            text.endswith(" during sync") for text in texts), texts)
        self.assertEqual(self.outstanding(), [B, C])
        self.assertEqual(self.dump()["syncProgress"]["pendingItemsCount"], 2)

    def test_other_domains_and_no_error_are_recoverable(self):
        self.fail(A, error={"domain": "POSIX", "code": 5})
        self.assertLogged(ERROR, "Asset transfer was not successful!")
        self.fail(A)
        self.assertLogged(ERROR, "Asset transfer was not successful!")
        self.assertEqual(self.outstanding(), [A, B, C])

    def test_unknown_upload_and_pathless_reports_change_nothing(self):
        self.call("assetTransfer", identifier="nobody", succeeded=True, unknown=True, path="x")
        self.assertIn([WARNING, "Got transfer notification of unknown asset: "
                                "<FRAsset: nobody (Photo), name: (null), path: x>"],
                      [[entry[0], entry[3]] for entry in self.console.log])
        self.call("assetTransfer", identifier=A, succeeded=True, isDownload=False, path="x")
        self.assertLogged(ERROR,
                          "Asset upload complete--erm...unsupported...how did this happen??")
        self.call("assetTransfer", identifier=B, succeeded=True)
        self.assertIn([ERROR, f"Asset with no path: <FRAsset: {B} (Photo), name: (null), path: "
                              "(null)>, ignoring."],
                      [[entry[0], entry[3]] for entry in self.console.log])
        self.assertEqual(self.outstanding(), [A, B, C])

    def test_a_request_never_listed_is_an_exception(self):
        with self.assertRaises(Raised) as raised:
            self.call("assetTransfer", identifier="nobody", succeeded=True)
        self.assertEqual(raised.exception.name, "UnknownRequest")

    def test_a_request_stays_addressable_after_it_left_the_list(self):
        self.arrive(A)
        self.call("assetTransfer", identifier=A, succeeded=True, path="x")
        self.assertEqual(self.console.log[-1][0], WARNING)

    def test_one_left_outstanding_keeps_the_clean_up_and_the_seal_back(self):
        self.call("device.jobs")
        self.arrive(A)
        self.arrive(B)
        self.fail(C, error={"domain": "FRError", "code": 7})
        self.finish(success=False)
        jobs = [job for batch in self.call("device.jobs") for job in batch]
        self.assertEqual([job["uuid"] for job in jobs], [A, B])
        dump = self.dump()
        self.assertEqual(set(dump["assets"]), {A, B})
        self.assertFalse(dump["lastSynced"])
        self.assertEqual(dump["syncProgress"], {"pendingItemsType": 1, "pendingItemsCount": 0})
        self.assertEqual(self.begin(library()), [C])


class Batches(ConsoleTest):
    def uuids(self):
        return [[job["uuid"] for job in batch] for batch in self.call("device.jobs")]

    def test_a_batch_at_most_every_three_seconds(self):
        assets = [uid(n) for n in range(6)]
        self.begin([asset(u) for u in assets])
        self.call("device.jobs")
        self.arrive(assets[0])
        self.call("device.advanceClock", seconds=2.5)
        self.arrive(assets[1])
        self.assertEqual(self.uuids(), [])
        self.call("device.advanceClock", seconds=0.5)
        self.arrive(assets[2])
        self.assertEqual(self.uuids(), [assets[:3]])
        self.call("device.advanceClock", seconds=1)
        self.arrive(assets[3])
        self.call("device.advanceClock", seconds=1)
        self.arrive(assets[4])
        self.assertEqual(self.uuids(), [])
        self.call("device.advanceClock", seconds=1)
        self.arrive(assets[5])
        self.assertEqual(self.uuids(), [assets[3:]])

    def test_the_last_batch_holds_what_is_left_the_seal_and_the_clean_up(self):
        self.begin([asset(A), asset(B)])
        self.call("device.jobs")
        self.arrive(A)
        self.arrive(B)
        self.finish()
        batches = self.call("device.jobs")
        self.assertEqual(len(batches), 1)
        kinds = [(job["uuid"], job["isSyncComplete"], job["cleanupSyncState"])
                 for job in batches[0]]
        self.assertEqual(kinds, [(A, False, False), (B, False, False), (None, True, False),
                                 (None, False, True)])
        self.assertFalse(batches[0][3]["hasFinishedBlock"])
        self.assertIsNone(batches[0][3]["cleanupBeforeDate"])

    def test_prepare_cleans_up_what_is_a_second_old(self):
        self.call("prepareForSync")
        self.assertEqual([[(job["cleanupSyncState"], job["cleanupBeforeDate"],
                            job["hasFinishedBlock"]) for job in batch]
                          for batch in self.call("device.jobs")], [[(True, 800000000.0 - 1, True)]])

    def test_a_held_saver_shows_the_library_as_it_was(self):
        self.begin([asset(A), album(TRIP, "Trip", [A])])
        self.call("device.fault", point="saverHold")
        self.call("device.advanceClock", seconds=5)
        self.arrive(A)
        dump = self.dump()
        self.assertEqual(dump["assets"], {})
        self.assertEqual(dump["albums"][0]["pendingItemsCount"], 1)
        started = self.console.raw("assetTransferEnded", success=True, **{"async": True})
        self.assertEqual(started["started"], 1)
        self.call("device.releaseSaver")
        answer = self.console.raw("wait", of=1)
        self.assertEqual(answer["call"], "assetTransferEnded")
        self.assertIsNone(answer["exception"])
        dump = self.dump()
        self.assertEqual(set(dump["assets"]), {A})
        self.assertTrue(dump["lastSynced"])


class BadFiles(ConsoleTest):
    def test_a_file_that_never_came_fails_its_asset_alone(self):
        self.begin(library())
        self.arrive(A)
        self.call("assetTransfer", identifier=B, succeeded=True, path="Photos/Sync/Staging/none")
        self.arrive(C)
        self.finish()
        dump = self.dump()
        self.assertEqual(set(dump["assets"]), {A, C})
        self.assertFalse(dump["lastSynced"])
        self.assertEqual(self.begin(library()), [B])

    def test_a_path_that_leads_out_of_the_media_directory_is_refused(self):
        self.begin([asset(A)])
        self.call("device.putFile", path="/secret", text="secret")
        self.call("assetTransfer", identifier=A, succeeded=True, path="../../../secret")
        self.finish()
        self.assertEqual(self.dump()["assets"], {})
        self.assertEqual(base64.b64decode(self.call("device.readFile", path="/secret")["base64"]),
                         b"secret")

    def test_an_asset_of_the_devices_own_is_not_replaced(self):
        self.call("device.addAsset", uuid=A, path=MEDIA + "DCIM/100CAMRA/IMG_0001.JPG")
        self.assertEqual(self.begin([asset(A)]), [A])
        self.arrive(A)
        self.finish()
        dump = self.dump()
        self.assertEqual(dump["assets"][A]["savedAssetType"], 0)
        self.assertFalse(dump["lastSynced"])


if __name__ == "__main__":
    unittest.main()
