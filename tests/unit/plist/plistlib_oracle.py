#!/usr/bin/env python3
"""Python's plistlib as an independent oracle for kolt's property-list codec.

  dump FILE OUT        write FILE (XML or binary) as the canonical dump to OUT
  convert FMT IN OUT   read IN, write it as FMT ("xml" or "binary") to OUT
  sample DIR           write a document of every kind as sample.xml,
                       sample.binary and its dump as sample.dump

The canonical dump has one token per line, keys in byte order, and matches
the one the C++ tests print.
"""
import datetime
import math
import plistlib
import struct
import sys

EPOCH = datetime.datetime(2001, 1, 1)


def dump(value, out):
    if isinstance(value, dict):
        out.append("dict %d" % len(value))
        for key in sorted(value, key=lambda k: k.encode("utf-8")):
            out.append("key " + key.encode("utf-8").hex())
            dump(value[key], out)
    elif isinstance(value, list):
        out.append("array %d" % len(value))
        for item in value:
            dump(item, out)
    elif isinstance(value, str):
        out.append("string " + value.encode("utf-8").hex())
    elif isinstance(value, bool):
        out.append("bool " + ("true" if value else "false"))
    elif isinstance(value, int):
        out.append("int %d" % value)
    elif isinstance(value, float):
        if math.isnan(value):
            out.append("real nan")
        else:
            out.append("real " + struct.pack(">d", value).hex())
    elif isinstance(value, datetime.datetime):
        out.append("date %d" % ((value - EPOCH) // datetime.timedelta(microseconds=1)))
    elif isinstance(value, bytes):
        out.append("data " + value.hex())
    else:
        raise TypeError("unexpected value %r" % (value,))


def dump_text(value):
    out = []
    dump(value, out)
    return "\n".join(out) + "\n"


def sample():
    return {
        "string": "plain",
        "escapes": "a & b < c > d \"q\" 'a'\ttab\nline",
        "caf\u00e9 \u65e5\u672c \U0001F600": "\U0001F600 non-ASCII",
        "empty string": "",
        "empty dict": {},
        "empty array": [],
        "int min": -(1 << 63),
        "int max": (1 << 63) - 1,
        "uint max": (1 << 64) - 1,
        "minus one": -1,
        "negative zero": -0.0,
        "third": 1.0 / 3.0,
        "tiny": 5e-324,
        "huge": 1.7976931348623157e308,
        "nan": float("nan"),
        "inf": float("inf"),
        "minus inf": float("-inf"),
        "yes": True,
        "no": False,
        "date 1900": datetime.datetime(1900, 1, 1),
        "date 2100": datetime.datetime(2099, 12, 31, 23, 59, 59),
        "data": b"\x00\x01\xff\x00zz",
        "long data": bytes(range(256)) * 2,
        "empty data": b"",
        "nested": [{"inner": [7, 1.5, "deep"]}, "x", [[], {}]],
        "shared": ["same", "same", "same"],
    }


def main(argv):
    if argv[1] == "dump":
        with open(argv[2], "rb") as f:
            text = dump_text(plistlib.load(f))
        with open(argv[3], "w") as f:
            f.write(text)
    elif argv[1] == "convert":
        fmt = plistlib.FMT_XML if argv[2] == "xml" else plistlib.FMT_BINARY
        with open(argv[3], "rb") as f:
            value = plistlib.load(f)
        with open(argv[4], "wb") as f:
            plistlib.dump(value, f, fmt=fmt)
    elif argv[1] == "sample":
        value = sample()
        with open(argv[2] + "/sample.xml", "wb") as f:
            plistlib.dump(value, f, fmt=plistlib.FMT_XML)
        with open(argv[2] + "/sample.binary", "wb") as f:
            plistlib.dump(value, f, fmt=plistlib.FMT_BINARY)
        with open(argv[2] + "/sample.dump", "w") as f:
            f.write(dump_text(value))
    else:
        sys.exit("unknown command " + argv[1])


if __name__ == "__main__":
    main(sys.argv)
