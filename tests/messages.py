#!/usr/bin/env python3
"""Messages between this library and another language: messages.py FILE-PROGRAM docs/messages.md

Runs the reader of the page as it stands there, on what the library writes of each type, and on what the library
makes of messages that are written in other ways than its own."""

import itertools
import re
import struct
import subprocess
import sys

import cbor2
import numpy
from cbor2 import CBORTag

program, page_file = sys.argv[1:]
page = open(page_file, encoding="utf-8").read()
exec(re.search(r"```python\n(.*?)```", page, re.DOTALL)[1])  # value, Reader

NUMBERS = {"double": "f8", "float": "f4", **{f"{sign}int{bits}": f"{sign or 'i'}{bits // 8}" for sign, bits in
                                             itertools.product(("", "u"), (8, 16, 32, 64))}}


def library(messages=None):
    """What it writes; given some, what it reads of them."""
    given = b"".join(struct.pack("<I", len(message)) + message for message in messages or [])
    command = [program] + (["copy"] if messages else [])
    data = subprocess.run(command, input=given, stdout=subprocess.PIPE, check=True).stdout
    made = []
    while data:
        size, = struct.unpack_from("<I", data)
        made.append(data[4:4 + size])
        data = data[4 + size:]
    return made


def require_same(found, expected, dtype):
    expected = numpy.array(expected, dtype)
    assert found.dtype == expected.dtype and numpy.array_equal(found, expected), (found, expected)


def limits(dtype):
    """The least value, 0, 1 and the largest."""
    of = numpy.finfo(dtype) if numpy.dtype(dtype).kind == "f" else numpy.iinfo(dtype)
    return [of.min, 0, 1, of.max]


# What the library writes.
reader = Reader()
(hello, no_gap), (packet, lost), (end, tail) = [reader.read(message) for message in library()]
assert hello == {"v": 1, "stream": "s/1", "seq": 0, "first": 0, "hello": {
    "name": "Gerät", "unit": "µV", "rate": 1000, "options": {"Topic": "a"}}}
assert (no_gap, lost, tail) == (0, 3, 0)
fields, constants = packet.pop("fields"), packet.pop("constants")
assert packet == {"v": 1, "stream": "s/1", "seq": 0, "first": 3, "counts": 2, "lost": 3,
                  "time": -1700000000000000000}
assert (end["seq"], end["end"]) == (1, 5)
for name, dtype in NUMBERS.items():
    require_same(fields.pop(name), limits(dtype)[1:3], dtype)
    require_same(constants.pop("one " + name), limits(dtype)[3:], dtype)
require_same(fields.pop("logical"), [False, True], bool)
require_same(constants.pop("one logical"), [True], bool)
assert fields == {"texts": ["µ", ""]} and constants == {"char": "µ€\U0001F600"}

# What a reader of the page makes of a gap, of a repeated message, and of an end after others.
def order(*events):
    made = Reader()
    results = [made.read(cbor2.dumps({"v": 1, "stream": "s", **event})) for event in events]
    return [result and result[1] for result in results]


def some(seq, first, lost=0):
    return {"seq": seq, "first": first, "counts": 2, "time": 0, "lost": lost, "fields": {}}


assert order(some(4, 9, 1), some(4, 9, 1), some(7, 20), {"seq": 9, "end": 30}) == [1, None, 9, 8]
assert order({"seq": 2, "first": 5, "hello": {}}, some(3, 9)) == [0, 4]
assert order(some(0, 2, 2), {"seq": 1, "end": 4}) == [2, 0] and order({"seq": 0, "end": 5}) == [5]


# What the library reads: typed arrays in either order of bytes, and items longer than they need be.
def long_head(major, number):
    return bytes([major << 5 | 27]) + struct.pack(">Q", number)


def long_text(text):
    return long_head(3, len(text.encode())) + text.encode()


def long_map(entries):
    return long_head(5, len(entries)) + b"".join(long_text(key) + item for key, item in entries.items())


written = {}
for tag, dtype in TYPES.items():
    written[str(tag)] = CBORTag(tag, numpy.array(limits(dtype), dtype).tobytes())
foreign = {"fields": cbor2.dumps(written), "lost": long_head(0, 0), "time": long_head(1, 4),
           "counts": long_head(0, 4), "first": long_head(0, 7), "seq": long_head(0, 1),
           "stream": long_text("s/1"), "v": long_head(0, 1), "later": cbor2.dumps([{"a": b""}, CBORTag(1, 0.1)]),
           "constants": long_map({"logical": cbor2.dumps([True]), "texts": cbor2.dumps(["µ", b"\xe9"])})}
half = {"v": 1, "stream": "s/1", "seq": 0, "first": 0, "hello": {"rate": 0.5}}
assert len(cbor2.dumps(half, canonical=True)) < len(cbor2.dumps(half))  # 16 bits
example = bytes.fromhex(re.search(r"```\n([0-9a-f\n]*)```", page)[1])
copies = library([long_map(foreign), cbor2.dumps(half, canonical=True), example])
packet, _ = Reader().read(copies[0])
for tag, dtype in TYPES.items():
    require_same(packet["fields"][str(tag)], limits(dtype), dtype.replace(">", "<"))
require_same(packet["constants"]["logical"], [True], bool)
assert packet["constants"]["texts"] == ["µ", b"\xe9"] and "later" not in packet
assert [packet[key] for key in ("seq", "first", "counts", "time", "lost")] == [1, 7, 4, -5, 0]
assert cbor2.loads(copies[1])["hello"]["rate"] == 0.5

# The example of the page: as the library writes it, and the same in both notations.
assert copies[2] == example
notation = re.search(r"```\n(\{.*?)```", page, re.DOTALL)[1]
notation = re.sub(r"(\d+)\(h'([0-9a-f]*)'\)", r'CBORTag(\1, bytes.fromhex("\2"))', notation)
assert cbor2.loads(example) == eval(notation)
