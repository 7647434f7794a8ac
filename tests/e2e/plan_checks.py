"""What the tests of kxsync plan share: a plan changes nothing, and the next sync bears it out."""

import hashlib
import json
import os
import stat

from harness import EndToEnd, kxsync, snapshot


def listing(top):
    """Every entry of a tree, the top too: kind, mode, size, modification time and content."""
    found = {}

    def add(path):
        status = os.lstat(path)
        content = None
        if stat.S_ISREG(status.st_mode):
            with open(path, "rb") as stream:
                content = hashlib.sha256(stream.read()).hexdigest()
        found[os.path.relpath(path, top)] = (status.st_mode, status.st_size, status.st_mtime_ns,
                                             status.st_ino, content)

    if os.path.lexists(top):
        add(top)
    for folder, names, files in os.walk(top):
        for name in names + files:
            add(os.path.join(folder, name))
    return found


class PlanChecks(EndToEnd):

    def plan(self, *options, code=0):
        """The plan's JSON; the device and what lies beside it stay as they are."""
        before = listing(self.top)
        done = kxsync("plan", self.host, self.device, "--json", *options)
        self.assertEqual(done.code, code, str(done))
        self.assertEqual(listing(self.top), before)
        self.assertEqual(done.out.count("\n"), 1, "one line of JSON")
        plan = json.loads(done.out)
        plan["stderr"] = done.err
        return plan

    def lines(self, *options, code=0):
        before = listing(self.top)
        done = kxsync("plan", self.host, self.device, *options)
        self.assertEqual(done.code, code, str(done))
        self.assertEqual(listing(self.top), before)
        return done.out.splitlines()

    def put(self, items, missing=(), **options):
        root = snapshot(items, **options)
        self.bundle(root, missing=missing)
        return root

    def failures(self, result):
        return sorted((each["uuid"], each["domain"], each["code"]) for each in result["failed"])

    def agree(self, *options, code=0):
        """The plan says what the next sync then reports and does."""
        plan = self.plan(*options, code=code)
        before = self.dump("--hash") if os.path.exists(self.device) else None
        result = self.sync(*options, code=code)
        for key in ("outcome", "resync", "requested", "imported", "deletedAssets",
                    "updatedAssets", "albumsCreated", "albumsDeleted", "albumsRenamed"):
            self.assertEqual(plan[key], result[key], key)
        self.assertEqual(self.failures(plan), self.failures(result))
        self.assert_told(plan["actions"], before, self.dump("--hash"))

    def assert_told(self, actions, before, after):
        told = [each for each in actions if each["entity"] == "asset"]
        empty = {"assets": {}, "albums": [], "events": [], "faceAlbums": []}
        old, new = (before or empty)["assets"], after["assets"]
        by_action = {name: {each["uuid"] for each in told if each["action"] == name}
                     for name in ("new", "gone", "changed")}
        self.assertEqual(by_action["new"], set(new) - set(old))
        self.assertEqual(by_action["gone"], set(old) - set(new))
        kept = set(new) & set(old)
        differing = {each for each in kept
                     if {**old[each], "path": ""} != {**new[each], "path": ""}}
        self.assertLessEqual(differing, by_action["changed"])
        moved = {each["uuid"] for each in told
                 if each["action"] == "changed" and each["what"] == ["albums"]}
        self.assertEqual(moved & differing, set())
        for name, kind in (("albums", "album"), ("events", "event"), ("faceAlbums", "faceAlbum")):
            self.assert_containers_told([each for each in actions if each["entity"] == kind],
                                        (before or empty)[name], after[name])

    def assert_containers_told(self, told, before, after):
        old = {each["uuid"]: each for each in before}
        new = {each["uuid"]: each for each in after}
        by_action = {name: {each["uuid"] for each in told if each["action"] == name}
                     for name in ("new", "gone", "changed", "renamed")}
        self.assertEqual(by_action["new"], set(new) - set(old))
        self.assertEqual(by_action["gone"], set(old) - set(new))
        kept = set(old) & set(new)
        differing = {each for each in kept
                     if (old[each]["title"], old[each]["assets"])
                     != (new[each]["title"], new[each]["assets"])}
        self.assertEqual(by_action["changed"] | by_action["renamed"], differing)
        for each in told:
            if each["uuid"] not in kept:
                continue
            was, now = (side[each["uuid"]]["assets"] for side in (old, new))
            self.assertEqual(each["joined"], len(set(now) - set(was)))
            self.assertEqual(each["left"], len(set(was) - set(now)))
            self.assertEqual(each["reordered"], [one for one in was if one in now]
                             != [one for one in now if one in was])
            if each["action"] == "renamed":
                self.assertEqual((each["titleBefore"], each["title"]),
                                 (old[each["uuid"]]["title"], new[each["uuid"]]["title"]))
