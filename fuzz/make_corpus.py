#!/usr/bin/env python3
"""Writes the seeds of the fuzz targets below fuzz/corpus: small property lists of both formats, for
the binary ones the same bytes cut or with one field of the trailer changed, and keyed archives.

usage: make_corpus.py     (the seeds are kept in the repository; run it after adding one below)
"""

import datetime
import hashlib
import os
import plistlib
import re
import struct

CORPUS = os.path.join(os.path.dirname(os.path.abspath(__file__)), "corpus")
MOMENT = datetime.datetime(2012, 9, 9, 10, 11, 12)


def nested(depth):
    value = []
    for _ in range(depth - 1):
        value = [value]
    return value


VALUES = [
    True, False, 0, 1, 127, 128, 255, 256, 65535, 65536, 2**31, 2**32, 2**63 - 1, 2**63, 2**64 - 1,
    -1, -128, -2**31, -2**63, 0.0, -0.0, 1.5, 1e300, 5e-324, MOMENT, datetime.datetime(1, 1, 1),
    datetime.datetime(9999, 12, 31, 23, 59, 59), b"", b"\0\1\2", bytes(range(256)), "", "plain",
    "<&>\"'", "caf\u00e9", "\U0001f4f7", "x" * 14, "x" * 15, "x" * 300, "\u20ac" * 300, [], {},
    [1, 2, 3], list(range(20)), [True, 1, 1.0, "1"], {"a": 1}, {"": ""}, {"b": {"a": []}, "a": {}},
    {str(number): number for number in range(300)}, nested(10), nested(64), nested(65),
    ["same", "same", ["same"]], {"date": MOMENT, "data": b"xyz", "list": [1.25, "z"]},
    {"libraryUUID": "4B1B4C7E-53A8-4B62-9D0B-0F5D6F5C3A11", "libraryKind": "Folder", "deletes": [],
     "updates": [{"itemType": "Asset", "uuid": "A", "isVideo": False, "modificationDate": 3.5e9},
                 {"itemType": "Album", "uuid": "B", "albumName": "Trip", "assetUUIDs": ["A"]}]},
]

XML_PIECES = [
    "<array><integer>0x1F</integer><integer>-0x1F</integer><integer> 7</integer></array>",
    "<dict><key>a</key></dict>", "<dict><key>a</key><true/><key>a</key><false/></dict>",
    "<string>&#65;&#x42;&amp;&undefined;</string>", "<string>&#0;</string>", "<array>", "<unknown/>",
    "<string><![CDATA[<a>]]></string>", "<data>AAEC\n AwQ=</data>", "<data>A</data>",
    "<date>2012-09-09T10:11:12Z</date>", "<date>2012-13-09T10:11:12Z</date>",
    "<real>nan</real>", "<real>1e400</real>", "<integer>18446744073709551616</integer>",
    "<!-- comment --><true/>", "<string>a\r\nb&#13;</string>", "<string>a]]>b</string>",
    "<string>a<!-- c -->b</string>", "<array>text</array>", "<dict><true/></dict>", "<string>&lt</string>",
    "<real>-infinity</real>", "<real>1e5</real>", "<real>0x1</real>", "<true version='1.0' b=''/>",
    "<!-- - -- ---><true/>", "<true/><true/>", "<string a='b'/>",
]


def variants(data):
    """Binary property lists that are wrong in one place."""
    for cut in (1, 8, 20, 32, 33):
        yield data[:-cut]
    sizes = struct.unpack(">6xBBQQQ", data[-32:])
    for field, values in ((0, (0, 9, 255)), (1, (0, 9)), (2, (0, 2**31, 2**63)), (3, (sizes[2],)),
                          (4, (0, len(data), 2**64 - 1))):
        for value in values:
            changed = list(sizes)
            changed[field] = value
            yield data[:-32] + struct.pack(">6xBBQQQ", *changed)
    for marker in (0x0F, 0x1F, 0x5F, 0x6F, 0x7F, 0xAF, 0xDF, 0xFF):
        yield data[:8] + bytes([marker]) + data[9:]


def archive(objects, root=0, **more):
    content = {"archiver": "KXKeyedArchiver", "version": 1, "root": plistlib.UID(root),
               "objects": objects}
    content.update(more)
    return plistlib.dumps(content, fmt=plistlib.FMT_BINARY, sort_keys=False)


def node(value=None, left=None, right=None, mapped=None, name="Node"):
    fields = {"class": name}
    if value is not None:
        fields["values"] = {"v": value}
    links = {key: plistlib.UID(target) for key, target in (("l", left), ("r", right))
             if target is not None}
    if links:
        fields["references"] = links
    if mapped is not None:
        fields["maps"] = {"m": {"keys": [key for key, _ in mapped],
                                "objects": [plistlib.UID(target) for _, target in mapped]}}
    return fields


def chain(length):
    return [node(number, left=number + 1) for number in range(length - 1)] + [node("end")]


def archives():
    yield archive([node()])
    yield archive([node(value) for value in ("x",)])
    for value in (1, 1.5, True, b"data", "caf\u00e9", MOMENT, [1, [2]], {"a": {"b": []}},
                  plistlib.UID(7)):
        yield archive([node(value, left=1), node(value)])
    yield archive([node(left=1, right=1), node("shared")])
    yield archive([node(), node(left=0)], root=1)
    yield archive([node(mapped=[("z", 1), ("a", 2), ("", 1)]), node(), node(right=1)])
    yield archive([node(mapped=[])])
    yield archive([node(mapped=[("k", 1), ("k", 1)]), node()])
    for length in (2, 10, 63, 64, 65):
        yield archive(chain(length))
    for steps in (1, 2, 5):
        yield archive([node(left=(number + 1) % steps) for number in range(steps)])
    yield archive([node(), node()])
    yield archive([node(left=9)])
    yield archive([node(name="Other")])
    yield archive([node(right=1), node(name="Other")])
    yield archive([])
    yield archive([node()], version=2)
    yield archive([node()], archiver="Other")
    yield archive([node()], extra=1)
    yield archive([{"class": "Node", "references": {"l": 1}}])
    yield archive([{"class": "Node", "maps": {"m": {"keys": ["a"], "objects": []}}}])
    yield archive([{"class": 1}])
    yield archive(["text"])
    # For the target's own builder of tables, which the first byte asks for.
    for steps in ([0], [1, 4], [2, 1, 0], [6, 1, 2, 2, 2, 0], [8, 2, 1, 1, 2, 1, 0], [2, 0],
                  [2, 1, 2, 2, 2, 3, 2, 4, 0], [31], [2, 255, 0, 0], [248, 1], [3, 0, 1, 1, 5],
                  [8, 3, 1, 1, 1, 1, 2, 1, 0], [14, 1, 2, 1, 3, 3, 0, 0, 0],
                  [15, 4, 1, 2, 2, 5, 1, 6, 1, 0, 0], [1, 0, 9], [2, 1, 255, 255], [8, 0]):
        yield b"G" + bytes(steps)


def write(target, seeds):
    folder = os.path.join(CORPUS, target)
    os.makedirs(folder, exist_ok=True)
    for name in os.listdir(folder):
        if name.startswith("seed-"):
            os.unlink(os.path.join(folder, name))
    for seed in seeds:
        name = "seed-" + hashlib.sha256(seed).hexdigest()[:16]
        with open(os.path.join(folder, name), "wb") as stream:
            stream.write(seed)


def main():
    binary = [b"", b"bplist00", b"bplist15" + bytes(40)]
    xml = [b"\xef\xbb\xbf<plist><true/></plist>",
           "<?xml version=\"1.0\" encoding=\"UTF-16\"?><plist><string>\u00e9</string></plist>"
           .encode("utf-16")]
    for value in VALUES:
        binary.append(plistlib.dumps(value, fmt=plistlib.FMT_BINARY, sort_keys=False))
        if value != nested(65):
            xml.append(re.sub(rb"<!D[^>]*>\n", b"", plistlib.dumps(value, sort_keys=False)))
    xml += [f'<?xml version="1.0"?>\n<plist version="1.0">{piece}</plist>'.encode()
            for piece in XML_PIECES]
    for value in ("text", {"a": [1, "b", 2.5]}, [plistlib.UID(3), b"\0" * 20], nested(3)):
        data = plistlib.dumps(value, fmt=plistlib.FMT_BINARY)
        binary.append(data)
        binary += variants(data)
    write("BinaryPropertyList", binary)
    write("XmlPropertyList", xml)
    write("KeyedArchive", archives())


if __name__ == "__main__":
    main()
