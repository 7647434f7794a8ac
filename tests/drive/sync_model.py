"""A second, small implementation of what a sync does to a device, written from the documents and
not from the plug-in: what the random tests compare the real one with."""

import re

HOST_EPOCH = 3061152000.0
EPSILON = 2.220446049250313e-16
ALBUM, EVENT, FACES = 1550, 1551, 15
LIST_OF_KIND = {ALBUM: "albums", EVENT: "events", FACES: "faceAlbums"}
KIND_NAMES = {ALBUM: "SyncedAlbum", EVENT: "SyncedEvent", FACES: "SyncedFaceAlbum"}
SYNCED = 256
THUMBNAILS = "/var/mobile/Media/PhotoData/FaceThumbnails/"
INFO, WARNING = 6, 4


def is_album(item):
    return item["itemType"] == "Album"


def name_of(item):
    return item.get("albumName" if is_album(item) else "eventName")


def members_of(item):
    return (item.get("assetUUIDs") or []) if is_album(item) else []


def text(value):
    return "(null)" if value is None else str(value)


def real_text(value):
    shown = repr(float(value))
    return shown[:-2] if shown.endswith(".0") else shown


def exposure_of(asset):
    return asset.get("exposureDate", asset.get("modificationDate"))


def device_time(host_time):
    return (0.0 if host_time is None else host_time) - HOST_EPOCH


def can_use(latitude, longitude):
    return (latitude, longitude) != (0, 0) and abs(latitude) <= 90 and abs(longitude) <= 180


def face_of(info):
    """(identifier in 16 bits, rectangle, face album) of a host's face dictionary."""
    rectangle = info.get("faceRectangle")
    keys = ("X", "Y", "Width", "Height")
    if not isinstance(rectangle, dict) or not all(key in rectangle for key in keys):
        rectangle = dict.fromkeys(keys, 0.0)
    return (int(info.get("faceIndex", 0)) & 0xFFFF, tuple(float(rectangle[key]) for key in keys),
            info.get("faceAlbumUUID"))


def signed(identifier):
    return identifier - 65536 if identifier >= 32768 else identifier


def sort_key(name):
    if name is None:
        return (0,)
    pieces = re.findall(r"\d+|\D", name)
    return (1, [(ord("0"), int(piece)) if piece.isdigit() else (ord(piece.lower()), -1)
                for piece in pieces])


class HostLibrary:
    """A snapshot's root dictionary, decoded."""

    def __init__(self, root):
        self.uuid, self.kind = root.get("libraryUUID"), root.get("libraryKind")
        self.assets, self.containers, self.ordered = {}, {}, []
        for item in root["updates"]:
            if item["itemType"] == "Asset":
                self.assets[item["uuid"]] = item
            else:
                self.ordered.append(item)
                self.containers[item["uuid"]] = item
        if self.kind == "Folder":
            self.ordered.sort(key=lambda item: sort_key(name_of(item)))

    def __eq__(self, other):
        return (other is not None and (self.uuid, self.kind) == (other.uuid, other.kind)
                and len(self.ordered) == len(other.ordered)
                and all(map(self.same_container, self.ordered, other.ordered))
                and len(self.assets) == len(other.assets)
                and all(uuid in other.assets and self.equivalent(other.assets[uuid], asset)
                        for uuid, asset in self.assets.items()))

    @staticmethod
    def same_container(one, other):
        keys = ["itemType", "parentUUID", "keyAssetUUID"]
        keys += ["albumName", "subclass", "keyAssetFaceIndex"] if is_album(one) else ["eventName"]
        return (all(one.get(key) == other.get(key) for key in keys)
                and members_of(one) == members_of(other))

    @staticmethod
    def equivalent(one, other):
        if (exposure_of(one) != exposure_of(other)
                or one.get("modificationDate") != other.get("modificationDate")):
            return False
        if any(one.get(key) is None or one[key] != other.get(key)
               for key in ("latitude", "longitude")):
            return False
        return (one.get("originalFileName") == other.get("originalFileName")
                and len(one.get("faces") or []) == len(other.get("faces") or []))


class Container:
    def __init__(self, row, uuid, title, kind):
        self.row, self.uuid, self.title, self.kind = row, uuid, title, kind
        self.pending_type, self.pending_count = (2, 0) if kind in LIST_OF_KIND else (1, 0)

    def shown(self):
        return f'<KXManagedAlbum: {self.uuid} "{text(self.title)}" Album/p>'


class Device:
    """The library and state files of a device."""

    def __init__(self):
        self.rows = 0
        self.lists = {"albums": [], "events": [], "faceAlbums": []}
        self.assets = {}  # by UUID, in row order
        self.progress = (1, 0)
        self.order = {}  # of each album's assets: UUID to index
        self.last_synced = None
        self.library_uuid = None

    def new_row(self):
        self.rows += 1
        return self.rows

    def add_container(self, uuid, title, kind):
        container = Container(self.new_row(), uuid, title, kind)
        self.lists[LIST_OF_KIND.get(kind, "albums")].append(container)
        return container

    def remove_container(self, container):
        for containers in self.lists.values():
            if container in containers:
                containers.remove(container)
        for asset in self.assets.values():
            asset["in"].discard(container)

    def synced_containers(self):
        """By UUID, in row order."""
        all_lists = sum(self.lists.values(), [])
        return {container.uuid: container
                for container in sorted(all_lists, key=lambda container: container.row)
                if container.kind in LIST_OF_KIND}

    def synced_assets(self):
        return [uuid for uuid, asset in self.assets.items() if asset["type"] == SYNCED]

    def members(self, container):
        order = self.order.get(container.uuid, {})

        def key(uuid):
            token = self.assets[uuid]["token"]
            if uuid in order:
                return (0, order[uuid], 0, uuid)
            return (1, token is None, token or 0.0, uuid)
        return sorted((uuid for uuid, asset in self.assets.items() if container in asset["in"]),
                      key=key)

    def dump(self):
        """As `device.dump` gives it, but for the files of the assets and the progress of restores."""
        lists = {name: [{"uuid": container.uuid, "title": container.title,
                         "kind": container.kind, "pendingItemsType": container.pending_type,
                         "pendingItemsCount": container.pending_count,
                         "assets": self.members(container)} for container in containers]
                 for name, containers in self.lists.items()}
        assets = {uuid: {"savedAssetType": asset["type"], "isVideo": False,
                         "creationDate": asset["created"], "modificationDate": asset["modified"],
                         "sortToken": asset["token"],
                         "location": list(asset["place"]) if asset["place"] else None,
                         "originalFileName": asset["name"],
                         "faces": [{"identifier": face[0], "relativeRect": list(face[1]),
                                    "albumUUID": face[2]}
                                   for face in sorted(asset["faces"], key=lambda face: face[0])],
                         "incomplete": False} for uuid, asset in self.assets.items()}
        return {**lists, "assets": assets,
                "syncProgress": {"pendingItemsType": self.progress[0],
                                 "pendingItemsCount": self.progress[1]},
                "currentLibraryUUID": self.library_uuid,
                "lastSynced": self.last_synced is not None}


class Sync:
    """One sync of a host's library to a device, from the reconcile to the end."""

    def __init__(self, device, host):
        self.device, self.host = device, host
        self.log, self.outstanding = [], []
        self.containers, self.tokens, self.uris = {}, {}, {}
        previous = device.last_synced
        self.is_null = host == previous
        known = previous.uuid if previous else device.library_uuid
        self.is_resync = known is None or known != host.uuid
        device.library_uuid = host.uuid
        if self.is_null:
            return
        device.last_synced = None
        self.containers = dict(host.containers)
        self.master = next((item for item in self.containers.values()
                            if is_album(item) and item.get("subclass") == 5), None)
        if self.master:
            del self.containers[self.master["uuid"]]
        self.reconcile_albums()
        self.reconcile_assets()
        self.set_pending_counts()
        on_device = device.synced_containers()
        self.uris = {uuid: on_device[uuid] for uuid in self.containers}

    def say(self, function, message, level=INFO):
        self.log.append([level, function, message])

    # Containers.

    @staticmethod
    def kind_of(item):
        if not is_album(item):
            return EVENT
        return {3: FACES, 4: EVENT}.get(item.get("subclass"), ALBUM)

    def reconcile_albums(self):
        function = "_reconcileAlbums"
        self.say(function, "Transaction for album reconciliation")
        on_device = self.device.synced_containers()
        kept = [uuid for uuid in on_device if not self.is_resync and uuid in self.containers]
        for uuid in [uuid for uuid in on_device if uuid not in kept]:
            container = on_device.pop(uuid)
            if container.kind == FACES:
                path = f"{THUMBNAILS}{uuid}.JPG"
                self.say(function, f"Could not remove face thumbnail at path {path} Error: Error "
                         f'Domain=POSIX Code=2 "{path}: No such file or directory"', WARNING)
            self.device.remove_container(container)
        for uuid, item in self.containers.items():
            if uuid in kept:
                continue
            name, kind = name_of(item), self.kind_of(item)
            self.say(function, f"Creating managed album with name {text(name)}, uuid: {uuid}, "
                     f"kind: {kind}!")
            on_device[uuid] = self.device.add_container(uuid, name, kind)
        self.reorder_lists(on_device)
        self.device.order = {uuid: {member: index for index, member in enumerate(members_of(item))}
                             for uuid, item in self.containers.items() if is_album(item)}
        for uuid in kept:
            name, container = name_of(self.containers[uuid]), on_device[uuid]
            if name != container.title:
                self.say(function,
                         f"Updating album {container.shown()} to have title {text(name)}")
                container.title = name

    def reorder_lists(self, on_device):
        host_index = {item["uuid"]: index for index, item in enumerate(self.host.ordered)}
        for kind, name in LIST_OF_KIND.items():
            containers = self.device.lists[name]
            slots = [index for index, container in enumerate(containers)
                     if on_device.get(container.uuid) is container and container.kind == kind]
            wanted = sorted((containers[slot] for slot in slots),
                            key=lambda container: host_index[container.uuid])
            for slot, container in zip(slots, wanted):
                containers[slot] = container

    # Assets.

    def compute_tokens(self):
        previous, ties = -1.0, 0
        for uuid in members_of(self.master) if self.master else []:
            asset = self.host.assets.get(uuid)
            if asset is None:
                continue
            time = device_time(exposure_of(asset))
            ties = ties + 1 if abs(previous - time) < EPSILON else 0
            self.tokens[uuid] = time + ties / 100000.0
            previous = time

    def request(self, uuid):
        caption = self.host.assets[uuid].get("caption")
        self.say("_reconcileAssets", f"Download request for asset: <FRAsset: {uuid} (Photo), "
                 f"name: {text(caption)}, path: (null)>")
        self.outstanding.append(uuid)

    def reconcile_assets(self):
        function = "_reconcileAssets"
        self.compute_tokens()
        self.say(function, "Transaction for Reconciling Assets")
        present = self.device.synced_assets()
        for uuid in present[:]:
            if self.is_resync or uuid not in self.host.assets:
                self.say(function, f"deleted photo with {uuid} is P")
                del self.device.assets[uuid]
                present.remove(uuid)
        for uuid in self.host.assets:
            if uuid not in present:
                self.request(uuid)
        for uuid in present:
            self.update_asset(uuid, self.host.assets[uuid], self.device.assets[uuid])

    def update_asset(self, uuid, wanted, asset):
        function = "_reconcileAssets"
        if asset["modified"] != device_time(wanted.get("modificationDate")):
            self.say(function, f"Deleting stale asset: <KXManagedAsset: {uuid}>")
            del self.device.assets[uuid]
            self.say(function,
                     f"=========== ASSET {uuid} HAS CHANGED, RE-REQUESTING DOWNLOAD")
            self.request(uuid)
            return
        token = self.tokens.get(uuid)
        if token is not None and (asset["token"] is None
                                  or abs(asset["token"] - token) >= EPSILON):
            asset["token"] = token
        self.update_place(wanted, asset)
        self.update_faces(wanted, asset)
        self.update_memberships(uuid, wanted, asset)

    def update_place(self, wanted, asset):
        place = None
        if wanted.get("latitude") is not None and wanted.get("longitude") is not None:
            place = (float(wanted["latitude"]), float(wanted["longitude"]))
        if asset["place"] == place:
            return
        if place is None or not can_use(*place):
            self.say("_reconcileAssets", "Removing location for asset")
            asset["place"] = None
            return
        self.say("_reconcileAssets", "Updating onDeviceAsset for its new location: "
                 f"<{real_text(place[0])},{real_text(place[1])}>")
        asset["place"] = place

    def update_faces(self, wanted, asset):
        host_faces = [face_of(info) for info in wanted.get("faces") or []]
        matched, kept = set(), []
        for face in asset["faces"]:
            found = next((index for index, host_face in enumerate(host_faces)
                          if host_face[:2] == face[:2]), None)
            if found is None:
                self.say("_reconcileAssets", f"Deleting face with index: {face[0]}")
            else:
                matched.add(found)
                kept.append(face)
        for index, face in enumerate(host_faces):
            if index not in matched:
                self.say("_reconcileAssets", f"adding face: {signed(face[0])}")
                kept.append(face)
        asset["faces"] = kept

    def containers_at_host(self, uuid, wanted):
        """The event first, known or not, then the albums in their order."""
        found = [wanted["eventUUID"]] if wanted.get("eventUUID") else []
        return found + [key for key, item in self.containers.items()
                        if uuid in members_of(item) and key not in found]

    def update_memberships(self, uuid, wanted, asset):
        on_device = self.device.synced_containers()
        at_host = self.containers_at_host(uuid, wanted)
        present = [container.uuid
                   for container in sorted(asset["in"], key=lambda container: container.row)]

        def tell(key, what):
            container = on_device.get(key)
            shown = container.shown() if container else "(null)"
            self.say("_reconcileAssets",
                     f"Asset <KXManagedAsset: {uuid}> {uuid} {what} album {shown} {key}")
            return container
        for key in [key for key in present if key not in at_host]:
            asset["in"].discard(tell(key, "removed from"))
        for key in [key for key in at_host if key not in present]:
            container = tell(key, "added to")
            if container:
                asset["in"].add(container)

    # Counts.

    def set_pending_counts(self):
        counts = {}
        for uuid in self.outstanding:
            event = self.host.assets[uuid].get("eventUUID")
            if event and event in self.containers and not is_album(self.containers[event]):
                counts[event] = counts.get(event, 0) + 1
        for key, item in self.containers.items():
            for uuid in members_of(item):
                if uuid in self.outstanding:
                    counts[key] = counts.get(key, 0) + 1
        on_device = self.device.synced_containers()
        for key, count in counts.items():
            container = on_device[key]
            self.say("_setPendingAlbumCounts",
                     f"Album: {text(container.title)} (KXManagedAlbum,{KIND_NAMES[container.kind]})"
                     f" id={key} pendingItemsCount={container.pending_count} CD_ID=Album/p")
            self.say("_setPendingAlbumCounts", f"     Setting pendingItemsCount to be {count}")
            container.pending_count, container.pending_type = count, 2
        self.device.progress = (2, len(self.outstanding))

    def lower_progress(self):
        self.device.progress = (self.device.progress[0], max(0, self.device.progress[1] - 1))

    # Transfers and end.

    def album_uris(self, uuid):
        """The containers, by UUID, that a save job of the asset names."""
        event = self.host.assets[uuid].get("eventUUID")
        return [key for key, item in self.containers.items()
                if (uuid in members_of(item) if is_album(item) else item["uuid"] == event)]

    def give_up(self, uuid):
        self.outstanding.remove(uuid)
        self.lower_progress()

    def import_assets(self, uuids):
        for uuid in uuids:
            wanted = self.host.assets[uuid]
            place = (float(wanted.get("latitude") or 0), float(wanted.get("longitude") or 0))
            containers = {self.uris[key] for key in self.album_uris(uuid)}
            self.device.assets[uuid] = {
                "type": SYNCED, "created": device_time(exposure_of(wanted)),
                "modified": device_time(wanted.get("modificationDate")),
                "token": self.tokens.get(uuid), "place": place if can_use(*place) else None,
                "name": wanted.get("originalFileName"),
                "faces": [face_of(info) for info in wanted.get("faces") or []], "in": containers}
            for container in containers:
                container.pending_count = max(0, container.pending_count - 1)
            self.lower_progress()

    def end(self, success):
        for container in self.device.synced_containers().values():
            container.pending_type, container.pending_count = 1, 0
            if container.kind != FACES and not self.device.members(container):
                self.device.remove_container(container)
        self.device.progress = (1, 0)
        whole = all(uuid in self.device.assets
                    and self.device.assets[uuid]["modified"]
                    == device_time(asset.get("modificationDate"))
                    for uuid, asset in self.host.assets.items())
        if success and whole:
            self.device.last_synced = self.host
