#!/usr/bin/env python3
"""Writes the seeds of fuzz/corpus/PropertyList: small property lists of both formats, and for the
binary ones the same bytes cut, or with one field of the trailer changed.

usage: make_corpus.py     (the seeds are kept in the repository; run it after adding one below)
"""

import datetime
import hashlib
import os
import plistlib
import re
import struct

CORPUS = os.path.join(os.path.dirname(os.path.abspath(__file__)), "corpus", "PropertyList")
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
    ["same", "same", ["same"]], {"date": MOMENT, "data": b"xyz", "list": [1.25, None or "z"]},
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
    "<!-- comment --><true/>", "<!-- - -- ---><true/>", "<true/><true/>", "<string a='b'/>",
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


def main():
    os.makedirs(CORPUS, exist_ok=True)
    for name in os.listdir(CORPUS):
        os.unlink(os.path.join(CORPUS, name))
    seeds = [b"", b"bplist00", b"bplist15" + bytes(40), b"\xef\xbb\xbf<plist><true/></plist>"]
    for value in VALUES:
        seeds.append(plistlib.dumps(value, fmt=plistlib.FMT_BINARY, sort_keys=False))
        if value != nested(65):
            seeds.append(re.sub(rb"<!D[^>]*>\n", b"", plistlib.dumps(value, sort_keys=False)))
    seeds += [f'<?xml version="1.0"?>\n<plist version="1.0">{piece}</plist>'.encode()
              for piece in XML_PIECES]
    for value in ("text", {"a": [1, "b", 2.5]}, [plistlib.UID(3), b"\0" * 20], nested(3)):
        data = plistlib.dumps(value, fmt=plistlib.FMT_BINARY)
        seeds.append(data)
        seeds += variants(data)
    for seed in seeds:
        with open(os.path.join(CORPUS, hashlib.sha256(seed).hexdigest()[:16]), "wb") as stream:
            stream.write(seed)


if __name__ == "__main__":
    main()
