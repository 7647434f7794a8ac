"""The other reader and writer of property lists that the oracle test compares with.

usage: plist_oracle.py make DIR COUNT SEED   writes DIR/N.plist (binary, XML) and DIR/N.txt
       plist_oracle.py show DIR              writes DIR/N.txt for every DIR/N.plist
       plist_oracle.py try DIR               writes DIR/N.txt, or "refused", for every DIR/N.plist
The text form is one line a value and says type, bits and text exactly.
"""
import datetime
import os
import plistlib
import random
import struct
import sys

EPOCH = datetime.datetime(2001, 1, 1)


def show(value, depth, lines):
    pad = " " * depth
    if isinstance(value, bool):
        lines.append("%sbool %d" % (pad, value))
    elif isinstance(value, plistlib.UID):
        lines.append("%suid %d" % (pad, value.data))
    elif isinstance(value, int):
        lines.append("%sint %d" % (pad, value))
    elif isinstance(value, float):
        lines.append("%sreal %s" % (pad, "nan" if value != value else struct.pack(">d", value).hex()))
    elif isinstance(value, datetime.datetime):
        delta = value - EPOCH
        lines.append("%sdate %d" % (pad, delta.days * 86400 + delta.seconds))
    elif isinstance(value, bytes):
        lines.append("%sdata %s" % (pad, value.hex()))
    elif isinstance(value, str):
        lines.append("%sstring %s" % (pad, value.encode("utf-8").hex()))
    elif isinstance(value, list):
        lines.append("%sarray %d" % (pad, len(value)))
        for element in value:
            show(element, depth + 1, lines)
    elif isinstance(value, dict):
        lines.append("%sdict %d" % (pad, len(value)))
        for key, element in value.items():
            lines.append("%s key %s" % (pad, key.encode("utf-8").hex()))
            show(element, depth + 1, lines)
    else:
        raise TypeError(type(value))


def text_of(value):
    lines = []
    show(value, 0, lines)
    return "\n".join(lines) + "\n"


def random_text(rng, xml):
    alphabet = ["a", "B", " ", "&", "<", ">", '"', "'", "\n", "\t", "]]>", "0",
                "\u00e9", "\u20ac", "\u65e5", "\U0001f600", "\uffef"]
    if not xml:
        alphabet += ["\x01", "\x7f", "\r"]
    count = rng.choice([0, 1, 3, 14, 15, 16, 40])
    if rng.random() < 0.5:
        return "".join(chr(rng.randrange(32, 127)) for _ in range(count))
    return "".join(rng.choice(alphabet) for _ in range(count))


def random_value(rng, depth, xml):
    kind = rng.randrange(10 if depth else 7)
    if kind == 0:
        return rng.random() < 0.5
    if kind == 1:
        edge = rng.choice([0, 255, 256, 65535, 65536, 2**32 - 1, 2**32, 2**63 - 1, 2**63, 2**64 - 1,
                           -1, -(2**63), -128])
        return edge if rng.random() < 0.6 else rng.randrange(-(2**40), 2**40)
    if kind == 2:
        edge = rng.choice([0.0, 0.1, -1.5, 1e300, 5e-324, float("inf"), float("-inf"), 3.0])
        return edge if rng.random() < 0.5 else rng.uniform(-1e6, 1e6)
    if kind == 3:
        return EPOCH + datetime.timedelta(seconds=rng.randrange(-63113904000, 252423993600))
    if kind == 4:
        return bytes(rng.randrange(256) for _ in range(rng.choice([0, 1, 2, 3, 20, 300])))
    if kind in (5, 6):
        if not xml and rng.random() < 0.1:
            return plistlib.UID(rng.choice([0, 1, 255, 256, 65536, 2**32 - 1]))
        return random_text(rng, xml)
    count = rng.choice([0, 1, 2, 5, 16])
    if kind == 7:
        return [random_value(rng, depth - 1, xml) for _ in range(count)]
    return {"%s%d" % (random_text(rng, xml)[:20], i): random_value(rng, depth - 1, xml)
            for i in range(count)}


def make(folder, count, seed):
    rng = random.Random(seed)
    for number in range(count):
        xml = number % 3 == 0
        value = random_value(rng, 4, xml)
        fmt = plistlib.FMT_XML if xml else plistlib.FMT_BINARY
        with open(os.path.join(folder, "%d.plist" % number), "wb") as out:
            out.write(plistlib.dumps(value, fmt=fmt, sort_keys=rng.random() < 0.5))
        with open(os.path.join(folder, "%d.plist" % number), "rb") as file:
            value = plistlib.load(file)
        with open(os.path.join(folder, "%d.txt" % number), "w") as out:
            out.write(text_of(value))


def show_all(folder, may_refuse):
    for name in sorted(os.listdir(folder)):
        if not name.endswith(".plist"):
            continue
        with open(os.path.join(folder, name), "rb") as file:
            content = file.read()
        try:
            text = text_of(plistlib.loads(content))
        except Exception as error:
            if not may_refuse:
                raise
            text = "refused %s\n" % type(error).__name__
        with open(os.path.join(folder, name[:-5] + "txt"), "w") as out:
            out.write(text)


if sys.argv[1] == "make":
    make(sys.argv[2], int(sys.argv[3]), int(sys.argv[4]))
else:
    show_all(sys.argv[2], sys.argv[1] == "try")
