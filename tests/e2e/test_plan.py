"""kxsync plan: what it says, and that it changes nothing."""

import fcntl
import json
import os
import shutil
import signal
import sqlite3
import unittest

from harness import (HOST_EPOCH, SUBCLASS_MASTER, album, asset, event, finish, kxsync, snapshot, start,
                     uid)
from plan_checks import PlanChecks, listing

LIBRARY_FILES = "var/mobile/Media/PhotoData"
DATABASE = os.path.join(LIBRARY_FILES, "Photos.sqlite")
LOCK = os.path.join(LIBRARY_FILES, "Photos.lock")
SPARSE_BYTES = 60 << 30


class Plan(PlanChecks):

    def library(self, count=4, first=0):
        members = [uid(number) for number in range(first, first + count)]
        items = [album(uid("master"), "Master", members, subclass=SUBCLASS_MASTER),
                 album(uid("trip"), "Trip", list(reversed(members))), event(uid("day"), "Day")]
        items += [asset(member, eventUUID=uid("day"), originalFileName=f"IMG_{number}.JPG",
                        exposureDate=HOST_EPOCH + 600000000.0 + first + number, latitude=1.5,
                        longitude=2.5)
                  for number, member in enumerate(members)]
        return items

    # What it says.

    def test_a_missing_device_is_planned_as_an_empty_one_and_stays_missing(self):
        self.put(self.library())
        plan = self.plan()
        self.assertFalse(os.path.exists(self.device))
        self.assertEqual((plan["outcome"], plan["requested"], plan["resync"]), ("synced", 4, True))
        self.assertEqual(plan["albumsCreated"], 2)
        self.assertEqual({action["action"] for action in plan["actions"]}, {"new"})
        self.assertEqual(plan["bytesToFree"], 0)
        self.assertEqual(plan["error"], None)
        files = [os.path.join(self.host, "media", uid(number) + ".JPG") for number in range(4)]
        self.assertEqual(plan["bytesToBring"], sum(map(os.path.getsize, files)))

    def test_a_missing_device_that_could_not_be_made(self):
        self.put(self.library())
        self.device = self.path("none", "device")
        self.assertEqual(kxsync("plan", self.host, self.device).code, 1)
        self.assertFalse(os.path.exists(self.path("none")))

    def test_an_empty_directory_stays_empty(self):
        self.put(self.library())
        os.mkdir(self.device)
        self.assertEqual(self.plan()["requested"], 4)
        self.assertEqual(os.listdir(self.device), [])

    def test_says_each_action_in_a_line(self):
        items = self.library()
        self.put(items)
        self.sync()
        edited, placed, gone = items[3], items[4], items[5]
        items.remove(gone)
        items[0]["assetUUIDs"].remove(gone["uuid"])
        items[1]["assetUUIDs"] = [uid(0), uid(1), uid("new")]
        items[1]["albumName"] = "Journey"
        edited["modificationDate"] += 5.0
        placed["latitude"] = 10.0
        items.append(asset(uid("new"), originalFileName="NEW.JPG", latitude=1.5, longitude=2.5))
        items.append(album(uid("more"), "More", [uid("new"), uid(0)]))
        self.put(items)
        lines = self.lines()
        text = "\n".join(lines)
        for start_of_line in ("+ photo NEW.JPG", "- photo IMG_2.JPG", "* photo IMG_0.JPG  (edited",
                              "* photo IMG_1.JPG  (place)", "> album Trip -> Journey",
                              "+ album More  (2 in it)", "* album Journey  (1 join, 2 leave, ",
                              "* event Day  (1 leave)"):
            self.assertIn(start_of_line, text)
        self.assertEqual(lines[-3], "Assets      1 new, 2 changed, 1 moved, 1 gone", text)
        self.assertIn("1 new, 1 renamed, 2 changed, 0 gone", lines[-2])
        self.assertIn("2 to bring", lines[-1])
        self.assertIn("2 to delete", lines[-1])

    def test_nothing_to_do(self):
        self.put(self.library())
        self.sync()
        self.assertEqual(self.lines(), ["Nothing to do: the device is in line with the host."])
        self.assertEqual(self.plan()["outcome"], "null")
        self.assertEqual(self.plan()["actions"], [])

    def test_quiet_tells_the_totals_alone(self):
        self.put(self.library())
        lines = self.lines("--quiet")
        self.assertEqual([line.split()[0] for line in lines], ["Assets", "Containers", "Files"])

    def test_shows_a_limited_number_of_lines_of_every_kind(self):
        self.put(self.library(300))
        self.sync()
        items = self.library(300, first=100)
        items.append(album(uid("other"), "Other", [uid(250)]))
        self.put(items)
        lines = self.lines()
        self.assertLess(len(lines), 60)
        kinds = [line[:7] for line in lines]
        self.assertAlmostEqual(kinds.count("+ photo"), kinds.count("- photo"), delta=1)
        self.assertGreater(kinds.count("+ photo"), 15)
        self.assertIn("+ album Other  (1 in it)", lines)
        self.assertIn("+ ... and ", "\n".join(lines))
        everything = self.lines("--all")
        self.assertEqual(sum(line.startswith("+ photo") for line in everything), 100)
        self.assertEqual(sum(line.startswith("- photo") for line in everything), 100)
        self.assertNotIn("... and", "\n".join(everything))

    def test_dry_run_is_the_same(self):
        self.put(self.library())
        for options in ([], ["--json"], ["--all"], ["--quiet"]):
            planned = kxsync("plan", self.host, self.device, *options)
            dry = kxsync("sync", "--dry-run", self.host, self.device, *options)
            self.assertEqual((dry.code, dry.err), (planned.code, planned.err))
            if "--json" in options:
                pair = [json.loads(each.out) for each in (planned, dry)]
                for each in pair:
                    each.pop("seconds")
                self.assertEqual(*pair)
            else:
                self.assertEqual(dry.out, planned.out)
        self.assertFalse(os.path.exists(self.device))

    def test_all_alone_is_no_option_of_a_sync(self):
        self.put(self.library())
        done = kxsync("sync", "--all", self.host, self.device)
        self.assert_clear_usage(done, "--all")
        self.assertFalse(os.path.exists(self.device))

    def assert_clear_usage(self, done, word):
        self.assertEqual(done.code, 2, str(done))
        self.assertIn(word, done.err)

    def test_names_what_the_host_lacks(self):
        self.bundle(snapshot(self.library()), missing=(uid(2),))
        self.write(os.path.join(self.host, "media", uid(1) + ".JPG"), b"")
        plan = self.plan(code=3)
        result = self.sync(code=3)
        for key in ("outcome", "requested", "imported"):
            self.assertEqual(plan[key], result[key], key)
        self.assertEqual(self.failures(plan), self.failures(result))
        self.assertIn(uid(2), plan["stderr"])

    def test_a_bad_snapshot_is_refused_as_by_a_sync(self):
        self.put([asset(uid(0), latitude="north")])
        plan = self.plan(code=1)
        self.assertEqual(plan["error"], self.sync(code=1)["error"])
        self.assertEqual(plan["actions"], [])

    # What would stop the sync.

    def test_the_guard_is_explained(self):
        self.put(self.library(120))
        self.sync()
        items = self.library(120, first=80)
        self.put(items)
        plan = self.plan(code=4)
        self.assertEqual(plan["guard"], {"deletes": 80, "photos": 80, "videos": 0, "synced": 120})
        self.assertEqual(plan["outcome"], "stopped")
        before = listing(self.device)
        stopped = self.sync(code=4)
        changed = {name for name, entry in listing(self.device).items()
                   if entry != before.get(name)}
        self.assertLessEqual(changed, {LOCK, os.path.dirname(LOCK)})
        self.assertEqual(stopped["error"], plan["error"])
        for word in ("80 of 120", "80 photos, 0 videos", "--allow-deletes", "more than half"):
            self.assertIn(word, plan["error"]["message"])
        text = "\n".join(self.lines(code=4))
        self.assertIn("- photo ", text)
        self.assertIn("80 new, 0 changed, 0 moved, 80 gone", text)
        self.assertEqual(self.plan("--allow-deletes")["deletedAssets"], 80)
        self.agree("--allow-deletes")

    def test_an_emptied_host_is_explained(self):
        self.put(self.library(3))
        self.sync()
        self.put([])
        plan = self.plan(code=4)
        self.assertIn("lists no photo at all", plan["error"]["message"])
        self.assertIn("3 photos, 0 videos", plan["error"]["message"])
        self.assertEqual(self.sync(code=4)["error"], plan["error"])

    def test_a_device_too_small_says_needed_free_and_missing(self):
        free = os.statvfs(self.top)
        count = free.f_bavail * free.f_frsize // SPARSE_BYTES + 2
        self.put(self.library(count))
        for number in range(count):
            os.truncate(os.path.join(self.host, "media", uid(number) + ".JPG"), SPARSE_BYTES)
        done = kxsync("plan", self.host, self.device, "--json")
        self.assertEqual(done.code, 6, str(done)[:2000])
        self.assertFalse(os.path.exists(self.device))
        plan = json.loads(done.out)
        space = plan["space"]
        self.assertEqual(space["needed"], count * SPARSE_BYTES)
        self.assertEqual(space["missing"], space["needed"] + space["kept"] - space["free"])
        self.assertEqual(len([each for each in plan["actions"] if each["entity"] == "asset"]),
                         count)
        for word in ("bytes needed (", " free (", " missing ("):
            self.assertIn(word, plan["error"]["message"])
        stopped = self.sync(code=6)
        self.assertIn(f"{count * SPARSE_BYTES} bytes needed", stopped["error"]["message"])
        self.assertEqual(stopped["requested"], 0)

    def test_a_running_sync_is_named(self):
        self.put(self.library())
        self.sync()
        with open(os.path.join(self.device, LOCK), "r+", encoding="ascii") as lock:
            fcntl.flock(lock, fcntl.LOCK_EX)
            text = lock.read()
            lock.seek(0)
            lock.write("4711\n")
            lock.truncate()
            lock.flush()
            plan = self.plan(code=7)
            self.assertIn("4711", plan["error"]["message"])
            lock.seek(0)
            lock.write(text)
            lock.truncate()

    def test_a_running_plan_keeps_a_sync_out_and_no_other_plan(self):
        self.put(self.library())
        self.sync()
        with open(os.path.join(self.device, LOCK), "r", encoding="ascii") as lock:
            fcntl.flock(lock, fcntl.LOCK_SH)
            self.assertEqual(self.plan()["outcome"], "null")
            self.assertIn(f"pid {os.getpid()}", self.sync(code=7)["error"]["message"])

    # Devices that were not closed in order.

    def test_an_interrupted_device_is_planned_without_mending_it(self):
        self.put(self.library(6))
        self.sync()
        synced = os.path.join(self.device, "var/mobile/Media/PhotoData/SyncedAssets/100SYNCA")
        os.remove(os.path.join(synced, uid(3) + ".JPG"))
        self.write(os.path.join(synced, "left over"), b"x")
        self.write(os.path.join(self.device, "var/mobile/Media/Photos/Sync/Staging/t1"), b"x")
        self.write(os.path.join(self.device, "var/mobile/Media/PhotoData",
                                ".kxtmp-0123456789abcdef"), b"x")
        with open(os.path.join(self.device, LOCK), "w", encoding="ascii") as lock:
            lock.write("4711\n")
        plan = self.plan()
        self.assertEqual((plan["outcome"], plan["requested"]), ("synced", 1))
        self.assertEqual([each["uuid"] for each in plan["actions"]], [uid(3)])
        self.agree()
        self.assertFalse(os.path.exists(os.path.join(synced, "left over")))

    def test_a_device_cut_off_in_a_commit_is_left_as_it_is(self):
        self.put(self.library(6))
        self.sync()
        self.cut_off_in_a_commit()
        items = self.library(8)
        items[1]["albumName"] = "Journey"
        self.put(items)
        plan = self.plan()
        self.assertEqual((plan["requested"], plan["albumsRenamed"]), (2, 1))
        result = self.sync()
        for key in ("outcome", "requested", "updatedAssets", "deletedAssets", "albumsRenamed"):
            self.assertEqual(plan[key], result[key], key)

    def cut_off_in_a_commit(self):
        """The library as a kill in the middle of a commit leaves it: half written, with the
        journal that takes it back."""
        database = os.path.join(self.device, DATABASE)
        copy = self.path("copy.sqlite")
        shutil.copyfile(database, copy)
        connection = sqlite3.connect(copy, isolation_level=None)
        connection.execute("PRAGMA cache_size=2")
        connection.execute("PRAGMA cache_spill=2")
        connection.execute("BEGIN IMMEDIATE")
        connection.execute("CREATE TABLE filler(text)")
        connection.executemany("INSERT INTO filler VALUES(?)", [("x" * 3000,)] * 200)
        connection.execute("UPDATE assets SET original_file_name = 'half'")
        shutil.copyfile(copy + "-journal", database + "-journal")
        shutil.copyfile(copy, database)
        connection.execute("ROLLBACK")
        connection.close()
        os.remove(copy)
        with open(os.path.join(self.device, LOCK), "w", encoding="ascii") as lock:
            lock.write("4711\n")
        self.assertGreater(os.path.getsize(database + "-journal"), 0)

    def test_a_killed_plan_leaves_nothing_behind(self):
        self.put(self.library(800))
        os.mkdir(self.path("tmp"))
        os.environ["TMPDIR"] = self.path("tmp")
        self.addCleanup(os.environ.pop, "TMPDIR")
        for wait_for in ("device of a first sync", "synced device"):
            with self.subTest(wait_for):
                before = listing(self.top)
                for number in (signal.SIGKILL, signal.SIGINT, signal.SIGTERM):
                    process = start("plan", self.host, self.device, "--log-level", "info")
                    process.stderr.readline()  # it is at work
                    process.send_signal(number)
                    done = finish(process)
                    self.assertIn(done.code, (0, -number, 128 + number), done.err[-500:])
                    self.assertEqual(listing(self.top), before)
                self.sync()
                self.put(self.library(800, first=10))

if __name__ == "__main__":
    unittest.main()
