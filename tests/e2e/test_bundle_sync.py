"""Host bundles onto a device: what a change of the host's library does there."""

import os
import unittest

from harness import (EndToEnd, SUBCLASS_EVENT, SUBCLASS_FACES, SUBCLASS_MASTER, album,
                     asset, event, kxsync, snapshot, tree_hash, uid)

OTHER_LIBRARY = "9A3F1B7E-2222-4B62-9D0B-0F5D6F5C3A22"


def face(index, album_uuid, x=0.25):
    return {"faceIndex": index, "faceAlbumUUID": album_uuid,
            "faceRectangle": {"X": x, "Y": 0.5, "Width": 0.125, "Height": 0.0625}}


class BundleSync(EndToEnd):

    def library(self, count=4):
        """Assets 0 to count-1, a master album, an album of all, an event, a face album."""
        members = [uid(number) for number in range(count)]
        items = [album(uid("master"), "Master", members, subclass=SUBCLASS_MASTER),
                 album(uid("all"), "All", list(reversed(members))),
                 event(uid("day"), "Day"),
                 album(uid("ann"), "Ann", members[:1], subclass=SUBCLASS_FACES)]
        for number, member in enumerate(members):
            items.append(asset(member, exposureDate=3661152000.5 + number, eventUUID=uid("day"),
                               latitude=48.25 + number, longitude=-11.125, isFlagged=True,
                               originalFileName=f"{number}.jpg"))
        items[4]["faces"] = [face(0, uid("ann"))]
        return items

    def media(self):
        folder = os.path.join(self.host, "media")
        return {name.split(".")[0]: os.path.join(folder, name) for name in os.listdir(folder)}

    def assert_synced(self, root, result):
        self.assertEqual(result["outcome"], "synced")
        dump = self.dump("--hash")
        self.assert_whole(dump)
        self.assert_in_line(root, dump, self.media())
        return dump

    def test_everything_arrives_bit_for_bit(self):
        root = snapshot(self.library())
        self.bundle(root)
        dump = self.assert_synced(root, self.sync())
        self.assertEqual(dump["camera"]["pendingItemsCount"], 0)
        self.assertEqual(dump["syncProgress"]["pendingItemsCount"], 0)
        self.assertEqual(dump["currentLibraryUUID"], root["libraryUUID"])
        self.assertEqual(dump["syncAgent"], {"userAgent": "tests/1", "libraryKind": "Cassock"})
        self.assertEqual([entry["sortToken"] for entry in
                          map(dump["assets"].get, map(uid, range(4)))],
                         [600000000.5, 600000001.5, 600000002.5, 600000003.5])

    def test_same_library_again_is_a_null_sync(self):
        self.bundle(snapshot(self.library()))
        self.sync()
        before = tree_hash(self.device)
        result = self.sync()
        self.assertEqual(result["outcome"], "null")
        self.assertEqual(self.counts(result), {})
        self.assertEqual(tree_hash(self.device), before)

    def test_a_snapshot_as_long_as_the_sealed_one_is_checked_all_the_same(self):
        items = self.library()
        self.bundle(snapshot(items))
        self.sync()
        before = tree_hash(self.device)
        path = os.path.join(self.host, "PhotoLibrary.plist")
        with open(path, "rb") as file:
            sealed = file.read()
        damaged = sealed[:-40] + b"\xff" * 8 + sealed[-32:]
        self.write(path, damaged)
        self.assertEqual(self.sync(code=1)["outcome"], "failed")
        self.assertEqual(tree_hash(self.device), before)
        self.assertEqual(sealed.count(b"All"), 1)
        self.write(path, sealed.replace(b"All", b"Few"))
        self.assertEqual(self.counts(self.sync()), {"albumsRenamed": 1})

    def test_assets_without_a_place_are_no_null_sync_but_nothing_changes(self):
        self.bundle(snapshot([asset(uid(0)), album(uid("a"), "A", [uid(0)])]))
        self.sync()
        self.assert_nothing_to_do()

    def test_metadata_alone_changes_in_place(self):
        items = self.library()
        self.bundle(snapshot(items))
        self.sync()
        items[1]["albumName"] = "Everything"
        items[1]["assetUUIDs"] = items[1]["assetUUIDs"][1:]
        items[5]["latitude"] = 10.5
        items[4]["faces"] = [face(0, uid("ann"), x=0.75), face(1, uid("ann"))]
        root = snapshot(items)
        self.bundle(root)
        result = self.sync()
        # Asset 3 left the album, 1 moved, 0 has other faces.
        self.assertEqual(self.counts(result), {"updatedAssets": 3, "albumsRenamed": 1})
        self.assert_synced(root, result)
        self.assertEqual(self.sync()["outcome"], "null")

    def test_order_of_an_album_follows_the_host(self):
        items = self.library()
        self.bundle(snapshot(items))
        self.sync()
        items[1]["assetUUIDs"] = [uid(2), uid(0), uid(3), uid(1)]
        root = snapshot(items)
        self.bundle(root)
        self.assert_synced(root, self.sync())

    def test_order_of_the_album_list_follows_the_host(self):
        items = [asset(uid(0))] + [album(uid(f"a{n}"), f"Album {n}", [uid(0)]) for n in range(4)]
        self.bundle(snapshot(items))
        self.sync()
        items[1:] = [items[3], items[1], items[4], items[2]]
        self.bundle(snapshot(items))
        self.assertEqual(self.counts(self.sync()), {})
        self.assertEqual([entry["title"] for entry in self.dump()["albums"]],
                         ["Album 2", "Album 0", "Album 3", "Album 1"])

    def test_edited_asset_is_fetched_again_and_not_counted_as_deleted(self):
        items = self.library()
        self.bundle(snapshot(items))
        self.sync()
        items[6]["modificationDate"] += 0.25
        root = snapshot(items)
        self.bundle(root)
        result = self.sync()
        self.assertEqual(self.counts(result), {"requested": 1, "imported": 1})
        self.assert_synced(root, result)

    def test_album_that_becomes_another_library_is_a_resync(self):
        self.bundle(snapshot(self.library()))
        self.sync()
        root = snapshot([album(uid("x"), "New", [uid("n1")]), asset(uid("n1"))],
                        library=OTHER_LIBRARY)
        self.bundle(root)
        result = self.sync()
        self.assertTrue(result["resync"])
        self.assertEqual(self.counts(result), {"requested": 1, "imported": 1, "deletedAssets": 4,
                                               "albumsCreated": 1, "albumsDeleted": 3})
        dump = self.assert_synced(root, result)
        self.assertEqual(dump["currentLibraryUUID"], OTHER_LIBRARY)

    def test_same_assets_from_another_library_are_all_fetched_again(self):
        self.bundle(snapshot(self.library()))
        self.sync()
        root = snapshot(self.library(), library=OTHER_LIBRARY)
        self.bundle(root)
        result = self.sync()
        self.assertTrue(result["resync"])
        self.assertEqual(self.counts(result), {"requested": 4, "imported": 4})
        self.assert_synced(root, result)

    def test_album_subclass_event_is_an_event(self):
        self.bundle(snapshot([asset(uid(0)), album(uid("e"), "Party", [uid(0)],
                                                   subclass=SUBCLASS_EVENT)]))
        self.sync()
        dump = self.dump()
        self.assertEqual([entry["title"] for entry in dump["events"]], ["Party"])
        self.assertEqual(dump["albums"], [])

    def test_missing_media_is_named_and_asked_for_again(self):
        root = snapshot(self.library())
        self.bundle(root, missing=[uid(2)])
        result = self.sync(code=3)
        self.assertEqual(result["outcome"], "partial")
        self.assertEqual(self.counts(result)["imported"], 3)
        self.assertEqual([(entry["uuid"], entry["domain"], entry["code"])
                          for entry in result["failed"]], [(uid(2), "FRError", 2)])
        self.assertIn(uid(2), result["stderr"])
        dump = self.dump()
        self.assertNotIn(uid(2), dump["assets"])
        self.assertFalse(dump["lastSynced"])
        self.assertEqual(self.counts(self.sync(code=3))["requested"], 1)
        self.bundle(root)
        result = self.sync()
        self.assertEqual(self.counts(result), {"requested": 1, "imported": 1})
        self.assert_synced(root, result)

    def test_media_by_exact_name_goes_before_a_name_with_extension(self):
        self.bundle(snapshot([asset(uid(0))]))
        exact = os.path.join(self.host, "media", uid(0))
        self.write(exact, b"\xff\xd8\xff exact")
        self.sync()
        self.assertEqual(self.dump("--hash")["assets"][uid(0)]["size"], os.path.getsize(exact))


class Guard(EndToEnd):

    def synced(self, count):
        items = [asset(uid(number)) for number in range(count)]
        self.bundle(snapshot(items))
        self.sync()
        return items

    def test_more_than_half_and_more_than_fifty_stops(self):
        items = self.synced(101)
        self.bundle(snapshot(items[51:]))
        before = tree_hash(self.device)
        result = self.sync(code=4)
        self.assertEqual(result["outcome"], "stopped")
        self.assertIn("--allow-deletes", result["stderr"])
        self.assertEqual(tree_hash(self.device), before)
        result = self.sync("--allow-deletes")
        self.assertEqual(self.counts(result), {"deletedAssets": 51})

    def test_just_half_or_just_fifty_passes(self):
        items = self.synced(100)
        self.bundle(snapshot(items[50:]))
        self.assertEqual(self.counts(self.sync()), {"deletedAssets": 50})
        self.bundle(snapshot(items[99:]))
        self.assertEqual(self.counts(self.sync()), {"deletedAssets": 49})

    def test_empty_snapshot_stops_whatever_the_number(self):
        self.synced(1)
        self.bundle(snapshot([]))
        before = tree_hash(self.device)
        self.assertEqual(self.sync(code=4)["outcome"], "stopped")
        self.assertEqual(tree_hash(self.device), before)
        self.assertEqual(self.counts(self.sync("--allow-deletes")), {"deletedAssets": 1})
        self.assertEqual(self.dump()["assets"], {})

    def test_resync_counts_too(self):
        self.synced(60)
        self.bundle(snapshot([asset(uid("new"))], library=OTHER_LIBRARY))
        self.assertEqual(self.sync(code=4)["outcome"], "stopped")
        self.assertEqual(len(self.dump()["assets"]), 60)

    def test_stop_in_words(self):
        self.synced(1)
        self.bundle(snapshot([]))
        self.assert_clear_failure(kxsync("sync", self.host, self.device), 4, "--allow-deletes")


if __name__ == "__main__":
    unittest.main()
