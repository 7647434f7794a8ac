"""Restore planning and restore transfers through the console, from both sources of the file list."""

import base64
import plistlib
import unittest

from console import ERROR, INFO, WARNING, ConsoleTest, asset, uid  # noqa: F401

CAMERA = "/var/mobile/Media/DCIM/100CAMRA/"
DATABASE_KEY = "kKXSyncRestoreContextUseDatabaseKey"
RESTORED_KEY = "kKXSyncRestoreContextRestoredFilesKey"


class Restore(ConsoleTest):
    def backup(self, *names):
        self.call("device.backupFiles", paths=[CAMERA + name for name in names])

    def add_incomplete(self, identifier, *names):
        files = [CAMERA + name for name in names]
        self.call("device.addAsset", uuid=identifier, path=files[0], files=files, incomplete=True)

    def plan(self):
        return [request["path"][len(CAMERA):]
                for request in self.call("outstandingAssetTransfers")]

    def context(self):
        path = self.call("device.paths")["restoreContext"]
        stored = self.call("device.readPlist", path=path)
        return stored

    def texts(self):
        return [entry[3] for entry in self.console.log]

    def restored(self, name, **arguments):
        self.call("assetTransfer", identifier=CAMERA + name, succeeded=True, **arguments)


class Planning(Restore):
    def test_from_the_database_when_it_knows_every_file(self):
        self.add_incomplete(uid("a"), "IMG_0002.JPG")
        self.add_incomplete(uid("b"), "IMG_0001.JPG")
        self.backup("IMG_0002.JPG", "IMG_0001.JPG")
        self.assertEqual(self.plan(), ["IMG_0001.JPG", "IMG_0002.JPG"])
        self.assertIn("First time attempting this restore", self.texts())
        self.assertEqual(self.context(), {DATABASE_KEY: True})
        dump = self.dump()
        self.assertEqual(dump["camera"], {"pendingItemsType": 1, "pendingItemsCount": 0})
        self.assertEqual(dump["otaRestoreProgress"],
                         {"pendingItemsType": 4, "pendingItemsCount": 2})

    def test_from_the_backup_when_the_database_lacks_a_file(self):
        self.add_incomplete(uid("a"), "IMG_0001.JPG")
        self.backup("IMG_0001.JPG", "IMG_0003.JPG")
        self.assertEqual(self.plan(), ["IMG_0001.JPG", "IMG_0003.JPG"])
        self.assertIn("Found assets in the filesystem which are missing from the database",
                      self.texts())
        self.assertIn("The database can't help us here, consulting the backup list", self.texts())
        self.assertEqual(self.context(), {})
        dump = self.dump()
        pending = {"pendingItemsType": 4, "pendingItemsCount": 2}
        self.assertEqual((dump["camera"], dump["otaRestoreProgress"]), (pending, pending))

    def test_without_any_file_both_albums_come_to_rest(self):
        self.call("device.set", entity="camera",
                  fields={"pendingItemsType": 4, "pendingItemsCount": 9})
        self.backup()
        self.assertEqual(self.plan(), [])
        self.assertNotIn("Found assets in the filesystem which are missing from the database",
                         self.texts())
        self.assertIn("The database can't help us here, consulting the backup list", self.texts())
        self.assertEqual(self.dump()["camera"], {"pendingItemsType": 1, "pendingItemsCount": 0})

    def test_resumed_from_the_database(self):
        self.add_incomplete(uid("a"), "IMG_0001.JPG")
        self.backup("IMG_0001.JPG")
        self.plan()
        self.restart()
        self.backup("IMG_0001.JPG", "IMG_0009.JPG")
        self.assertEqual(self.plan(), ["IMG_0001.JPG"])
        self.assertIn("Resuming restore with incomplete files from the database", self.texts())

    def test_resumed_from_the_backup_leaves_out_what_was_dealt_with(self):
        self.backup("IMG_0001.JPG", "IMG_0002.JPG")
        self.plan()
        self.restored("IMG_0001.JPG")
        self.assertEqual(self.context(), {RESTORED_KEY: [CAMERA + "IMG_0001.JPG"]})
        self.restart()
        self.backup("IMG_0001.JPG", "IMG_0002.JPG")
        self.assertEqual(self.plan(), ["IMG_0002.JPG"])
        self.assertIn("Resuming restore without using the database for the asset list",
                      self.texts())

    def test_what_is_no_camera_file_is_left_out(self):
        cascades = self.call("device.paths")["cascades"].rsplit("/", 1)[1]
        self.backup("IMG_0001.JPG", "A.MISC/IMG_0002.JPG", "IMG_0003.JPEG2", "IMG_0004",
                    f"{cascades}/IMG_0005.JPG", "IMG_0006.J")
        self.assertEqual(self.plan(), ["IMG_0001.JPG", "IMG_0006.J"])

    def test_a_list_that_cannot_be_had(self):
        self.call("device.backupFiles", error={"domain": "Backup", "code": 4})
        self.assertEqual(self.plan(), [])
        self.assertLogged(WARNING, "Could not retrieve the list of files backed up. Error = "
                                   "Error Domain=Backup Code=4")

    def test_files_of_one_asset_form_one_group(self):
        self.backup("IMG_0001.JPG", "IMG_0001.MOV", "IMG_0002.JPG")
        self.plan()
        self.assertEqual(self.dump()["camera"]["pendingItemsCount"], 2)

    def test_listing_twice_gives_the_same_list(self):
        self.backup("IMG_0001.JPG")
        self.assertEqual(self.plan(), ["IMG_0001.JPG"])
        self.backup("IMG_0009.JPG")
        self.assertEqual(self.plan(), ["IMG_0001.JPG"])
        self.assertNotIn("First time attempting this restore", self.texts())

    def test_an_unreadable_context_counts_as_none(self):
        self.call("device.putFile", path=self.call("device.paths")["restoreContext"], text="junk")
        self.backup("IMG_0001.JPG")
        self.plan()
        self.assertIn("First time attempting this restore", self.texts())


class Transfers(Restore):
    def test_a_group_is_reported_when_its_last_file_came(self):
        self.add_incomplete(uid("a"), "IMG_0001.JPG", "IMG_0001.MOV")
        self.backup("IMG_0001.JPG", "IMG_0001.MOV")
        self.plan()
        self.restored("IMG_0001.JPG")
        self.assertLogged(INFO, "Group is pending...")
        self.assertLogged(INFO, f"Pair: {CAMERA}IMG_0001.JPG  has status: complete")
        self.assertLogged(INFO, f"Pair: {CAMERA}IMG_0001.MOV  has status: pending")
        self.assertEqual(self.call("device.porterCalls"), [])
        self.restored("IMG_0001.MOV")
        self.assertLogged(INFO, f"Group with uuid {uid('a')} is complete!")
        self.assertEqual(self.call("device.porterCalls"),
                         [["updateRestoredAsset", uid("a"),
                           [CAMERA + "IMG_0001.JPG", CAMERA + "IMG_0001.MOV"]]])

    def test_a_failed_file_is_left_out_and_remembered(self):
        self.backup("IMG_0001.JPG", "IMG_0001.MOV")
        self.plan()
        self.call("assetTransfer", identifier=CAMERA + "IMG_0001.JPG", succeeded=False,
                  error={"domain": "FRError", "code": 5})
        self.assertEqual(self.context()[RESTORED_KEY], [CAMERA + "IMG_0001.JPG"])
        self.restored("IMG_0001.MOV")
        self.assertEqual(self.call("device.porterCalls"),
                         [["updateRestoredAsset", None, [CAMERA + "IMG_0001.MOV"]]])

    def test_recoverable_failures_change_nothing(self):
        self.backup("IMG_0001.JPG")
        self.plan()
        for error in ({"domain": "FRError", "code": 7}, {"domain": "Other", "code": 5}, None):
            self.call("assetTransfer", identifier=CAMERA + "IMG_0001.JPG", succeeded=False,
                      error=error)
        self.assertIn("Nothing to do for now.", self.texts())
        self.assertEqual(self.plan(), ["IMG_0001.JPG"])
        self.assertEqual(self.call("device.porterCalls"), [])

    def test_a_file_without_group_reports_nothing_at_all(self):
        self.call("assetTransfer", identifier="x", unknown=True, isRestore=True, succeeded=True,
                  path=CAMERA + "IMG_0009.JPG")
        self.assertEqual(self.call("device.porterCalls"), [["updateRestoredAsset", None, []]])

    def test_the_end_finalises_by_the_source(self):
        self.backup("IMG_0001.JPG")
        self.plan()
        self.restored("IMG_0001.JPG")
        self.call("device.porterCalls")
        self.call("assetTransferEnded", success=True)
        self.assertEqual(self.call("device.porterCalls"), [["finalizeOTARestore", True]])

    def test_the_end_with_the_database_recreates_no_albums(self):
        self.add_incomplete(uid("a"), "IMG_0001.JPG")
        self.backup("IMG_0001.JPG")
        self.plan()
        self.restored("IMG_0001.JPG")
        self.call("device.porterCalls")
        self.call("assetTransferEnded", success=True)
        self.assertEqual(self.call("device.porterCalls"), [["finalizeOTARestore", False]])

    def test_the_end_with_files_missing_finalises_nothing(self):
        self.backup("IMG_0001.JPG")
        self.plan()
        self.call("assetTransferEnded", success=False)
        self.assertEqual(self.call("device.porterCalls"), [])

    def test_a_cancelled_restore_is_only_logged(self):
        self.call("restoreEnded", error={"domain": "D", "code": 1})
        self.assertLogged(INFO, "Photos restore was cancelled with error: Error Domain=D Code=1")
        self.call("restoreEnded")
        self.assertLogged(INFO, "Photos restore was cancelled with error: (null)")

    def test_a_sync_leaves_restore_requests_alone(self):
        self.backup("IMG_0001.JPG")
        self.assertEqual(self.begin([asset(uid("s"))]), [CAMERA + "IMG_0001.JPG", uid("s")])
        self.arrive(uid("s"))
        self.finish()
        self.assertEqual(set(self.dump()["assets"]), {uid("s")})


class Context(Restore):
    def test_is_a_property_list_of_its_own(self):
        self.backup("IMG_0001.JPG")
        self.plan()
        path = self.call("device.paths")["restoreContext"]
        content = base64.b64decode(self.call("device.readFile", path=path)["base64"])
        self.assertEqual(plistlib.loads(content), {})


if __name__ == "__main__":
    unittest.main()
