"""Every fault point through the console: what fails, what is logged, and that the next sync heals."""

import unittest

from console import (A, ANNA, B, C, ERROR, INFO, MASTER, SUBCLASS_FACES, WARNING, ConsoleTest,
                     Raised, album, asset, library, uid)


class Faults(ConsoleTest):
    def fault(self, point, **arguments):
        self.call("device.fault", point=point, **arguments)

    def texts(self, level=None):
        return [entry[3] for entry in self.console.whole_log if level in (None, entry[0])]

    def assertHeals(self):
        """The next whole sync ends as an undisturbed one."""
        self.sync(library())
        dump = self.dump()
        self.assertEqual(set(dump["assets"]), {A, B, C})
        self.assertTrue(dump["lastSynced"])
        self.assertEqual([len(album["assets"]) for album in dump["albums"]], [2, 1])


class LibraryFaults(Faults):
    def test_fetch_assets(self):
        self.sync(library())
        self.fault("fetchAssets")
        self.assertEqual(self.begin(library()), [A, B, C])
        self.assertTrue(any(text.startswith("Error Reconciling Photos: Cannot fetch on device "
                                            "photos ") for text in self.texts(ERROR)))
        self.assertEqual(set(self.dump()["assets"]), {A, B, C})
        for identifier in (A, B, C):
            self.arrive(identifier)
        self.finish()
        self.assertFalse(self.dump()["lastSynced"])
        self.assertHeals()

    # The first transaction of a reconcile is restore planning's, then come albums and assets.

    def test_transaction(self):
        self.fault("transaction", skip=1)
        self.begin(library())
        self.assertEqual(self.dump()["albums"], [])
        self.finish(success=False)
        self.assertFalse(self.dump()["lastSynced"])
        self.assertHeals()

    def test_transaction_of_the_assets_alone(self):
        self.fault("transaction", skip=2)
        self.begin(library())
        self.assertEqual(len(self.dump()["albums"]), 2)
        self.finish(success=False)
        self.assertHeals()

    def test_asset_count(self):
        self.fault("assetCount", times=2)
        metrics = self.call("installedAssetMetrics")
        self.assertEqual(metrics["Photo"]["_Count"], 0)
        self.assertTrue(any(text.startswith("Error getting asset count: ")
                            for text in self.texts(ERROR)))

    def test_size_fetch(self):
        self.sync(library())
        whole = self.call("installedAssetMetrics")["Photo"]
        self.fault("sizeFetch", times=4)
        failed = self.call("installedAssetMetrics")["Photo"]
        self.assertEqual(failed["_Count"], 3)
        self.assertLess(failed["_PhysicalSize"], whole["_PhysicalSize"])


class SaverFaults(Faults):
    def test_saver(self):
        self.begin(library())
        self.fault("saver", error={"domain": "Test", "code": 9})
        for identifier in (A, B, C):
            self.arrive(identifier)
        self.finish()
        dump = self.dump()
        self.assertEqual(dump["assets"], {})
        self.assertFalse(dump["lastSynced"])
        self.assertHeals()

    def test_serialize(self):
        self.begin(library())
        self.fault("serialize")
        for identifier in (A, B, C):
            self.arrive(identifier)
        self.finish()
        self.assertEqual(set(self.dump()["assets"]), {B, C})
        self.assertFalse(self.dump()["lastSynced"])
        self.assertHeals()

    def test_cleanup_error(self):
        self.fault("cleanupError", error={"domain": "Test", "code": 3})
        self.assertFalse(self.call("prepareForSync"))
        self.assertTrue(any(text.startswith("prepareForSyncWithHostAnchor - error waiting for "
                                            "cleanup in quarryd: ") for text in self.texts(ERROR)))
        self.assertTrue(any(text.startswith("prepareForSyncWithHostAnchor - finished in ")
                            for text in self.texts()))
        self.assertHeals()

    def test_cleanup_never(self):
        self.fault("cleanupNever")
        self.assertFalse(self.call("prepareForSync"))
        self.assertLogged(ERROR, "prepareForSyncWithHostAnchor - timed out after waiting 28800 "
                                 "seconds for sync cleanup in quarryd")
        self.call("assetTransferEnded", success=False)
        self.assertHeals()

    def test_import_of_a_bad_file_fails_it_alone(self):
        self.begin(library())
        self.fault("import", kind="badFile", skip=1)
        for identifier in (A, B, C):
            self.arrive(identifier)
        self.finish()
        self.assertEqual(set(self.dump()["assets"]), {A, C})
        self.assertFalse(self.dump()["lastSynced"])
        self.assertHeals()

    def test_import_without_space(self):
        self.begin(library())
        self.fault("import", kind="noSpace")
        for identifier in (A, B, C):
            self.arrive(identifier)
        self.finish()
        self.assertNotIn(A, self.dump()["assets"])
        self.assertFalse(self.dump()["lastSynced"])
        self.assertHeals()


class FileFaults(Faults):
    def test_remove_thumbnail(self):
        self.sync(library())
        thumbnails = self.call("device.paths")["faceThumbnails"]
        self.call("device.putFile", path=f"{thumbnails}/{ANNA}.JPG", text="face")
        self.fault("removeThumbnail")
        self.begin([asset(A)])
        self.assertTrue(any(
            text.startswith(f"Could not remove face thumbnail at path {thumbnails}/{ANNA}.JPG "
                            "Error: ") for text in self.texts(WARNING)))
        self.assertEqual(self.dump()["faceAlbums"], [])

    def test_remove_agent_info(self):
        self.sync(library())
        self.fault("removeAgentInfo")
        self.begin(library())
        self.assertTrue(any(text.startswith("Failed to remove syncUserAgentInfoFile at path ")
                            for text in self.texts(ERROR)))

    def test_write_asset_order(self):
        self.fault("writeAssetOrder")
        self.begin(library())
        path = self.call("device.paths")["assetOrder"]
        self.assertIn(f"Failed to write assetOrdersByAlbumUUID to path {path}", self.texts(ERROR))
        self.assertIsNone(self.call("device.readFile", path=path))

    def test_statfs(self):
        self.fault("statfs", errno=5)
        self.call("installedAssetMetrics")
        self.assertIn("statfs(2) failed. Unable to get file system block size: "
                      "Input/output error (5)", self.texts(ERROR))

    def test_enumerate(self):
        self.fault("enumerate", errno=13)
        self.call("installedAssetMetrics")
        self.assertTrue(any(text.startswith('Error enumerating files inside "')
                            for text in self.texts(ERROR)))
        self.fault("enumerate", errno=2)
        self.call("installedAssetMetrics")
        self.assertFalse(any(entry[3].startswith("Error enumerating") for entry in
                             self.console.log))

    def test_file_properties(self):
        self.call("device.putFile", path="/var/mobile/Media/DCIM/100CAMRAX/f", text="x")
        self.call("device.putFile", path="/var/mobile/Media/DCIM/note.txt", text="x")
        self.fault("fileProperties", errno=13)
        self.call("installedAssetMetrics")
        self.assertTrue(any(text.startswith('Error getting properties of file "')
                            for text in self.texts(WARNING)))


class DecoderFault(Faults):
    def test_decoder(self):
        self.put_snapshot(library())
        self.call("prepareForSync")
        self.fault("decoder", error={"domain": "Test", "code": 77})
        answer = self.console.raw("reconcileSync", type=1, newAnchor="1")
        self.assertFalse(answer["result"])
        self.assertEqual((answer["error"]["domain"], answer["error"]["code"]), ("Test", 77))
        self.assertLogged(INFO, "Forwarding error from KXS")
        self.call("assetTransferEnded", success=False)
        self.assertHeals()


class Script(Faults):
    def test_times_and_skip(self):
        self.fault("assetCount", times=1, skip=1)
        self.call("installedAssetMetrics")
        self.assertEqual(len([text for text in self.texts(ERROR)
                              if text.startswith("Error getting asset count")]), 1)
        self.call("installedAssetMetrics")
        self.assertNotIn(ERROR, [entry[0] for entry in self.console.log])

    def test_cleared_faults_hit_nothing(self):
        self.fault("assetCount", times=100)
        self.call("device.clearFaults")
        self.call("installedAssetMetrics")
        self.assertEqual(self.texts(ERROR), [])

    def test_an_unknown_point_and_a_missing_kind_are_refused(self):
        for arguments in ({"point": "nothing"}, {"point": "import"}, {}, {"point": 1}):
            with self.subTest(arguments=arguments), self.assertRaises(Raised):
                self.call("device.fault", **arguments)

    def test_every_point_may_fail_and_the_next_sync_still_heals(self):
        for point, arguments in (("fetchAssets", {}), ("transaction", {}), ("serialize", {}),
                                 ("saver", {}), ("import", {"kind": "badFile"}),
                                 ("removeThumbnail", {}), ("removeAgentInfo", {}),
                                 ("writeAssetOrder", {}), ("decoder", {})):
            for skip in range(3):
                with self.subTest(point=point, skip=skip):
                    changed = [asset(A, modified=float(skip)), asset(uid(skip)),
                               album(ANNA, "Anna", [A], subclass=SUBCLASS_FACES),
                               album(MASTER, "All", [A], subclass=5)]
                    self.call("device.putFile", text="face",
                              path=f"{self.call('device.paths')['faceThumbnails']}/{ANNA}.JPG")
                    self.fault(point, skip=skip, **arguments)
                    self.put_snapshot(changed)
                    self.call("prepareForSync")
                    if self.console("reconcileSync", type=1, newAnchor="1"):
                        for request in self.call("outstandingAssetTransfers"):
                            self.arrive(request["identifier"])
                    self.finish()
                    self.call("device.clearFaults")
                    self.assertHeals()


if __name__ == "__main__":
    unittest.main()
