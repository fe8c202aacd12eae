"""Adds tokens of odd texts, numbers and data to a database, as the library would write them.

usage: odd_rows.py DATABASE SEED COUNT
"""
import random
import sqlite3
import struct
import sys

NESTED_MAX = 1000

database, seed, count = sys.argv[1], *map(int, sys.argv[2:])
draw = random.Random(seed)

TEXTS = ["'", '"', "\\", "''", "%Q", "\\u0000", "\r\n", "\x85", "\u2028", "\u202e", "ü", "日本", "😀"]
NO_UTF8 = [b"\xc3", b"\xc0\x80", b"\xed\xa0\x80", b"\xf4\x90\x80\x80", b"\xe2\x82", b"\xc2\x80\xc2"]
PIECES = [bytes([byte]) for byte in range(1, 256)] + [piece.encode() for piece in TEXTS] + NO_UTF8
INTEGERS = [0, 1, -1, 2**31, 2**32 - 1, 2**32, 2**53 + 1, 2**63 - 1, -(2**63)]
INFINITY = float("inf")
DOUBLES = [0.0, -0.0, 0.1, 1.0, 1e16, 1e17, 1e22, 2.0**63, 2.0**64, 5e-324, sys.float_info.max, INFINITY, -INFINITY]
ESCAPES = {ord(c): f"\\{e}".encode() for c, e in zip('"\\\b\f\n\r\t', '"\\bfnrt')}
ESCAPES.update({byte: b"\\u%04x" % byte for byte in range(32) if byte not in ESCAPES})


def text(more=()):
    return b"".join(draw.choice(draw.choice([PIECES, *more, [b"a"]])) for _ in range(draw.choice([0, 1, 2, 20])))


def integer():
    return draw.choice([draw.choice(INTEGERS), draw.getrandbits(64) - 2**63])


def double():
    return draw.choice([draw.choice(DOUBLES), struct.unpack("d", draw.randbytes(8))[0]])


def any_json(levels):
    kind = draw.randrange(10 if levels else 6)
    if kind == 0:
        return draw.choice([b"null", b"true", b"false"])
    if kind == 1:
        return str(draw.choice([integer(), 2**64 - 1])).encode()
    if kind in (2, 3):
        return json_double(double())
    if kind in (4, 5):
        return json_text(text(([b"\0"],)))
    if kind in (6, 7):
        return b"[" + b",".join(any_json(levels - 1) for _ in range(draw.randrange(4))) + b"]"
    names = sorted({text(([b"\0"],)) for _ in range(draw.randrange(4))})
    return b"{" + b",".join(json_text(name) + b":" + any_json(levels - 1) for name in names) + b"}"


def json_text(raw):
    return b'"' + b"".join(ESCAPES.get(byte, bytes([byte])) for byte in raw) + b'"'


def json_double(value):
    if value != value or value in (INFINITY, -INFINITY):
        return {"nan": b"NaN", "inf": b"Infinity", "-inf": b"-Infinity"}[str(value)]
    digits = b"%.17g" % value
    return digits if b"." in digits or b"e" in digits else digits + b".0"


def data():
    if draw.randrange(100):
        return any_json(4)
    levels = draw.randrange(NESTED_MAX - 5, NESTED_MAX)
    return b'{"a":' * levels + b"[]" + b"}" * levels


with sqlite3.connect(database) as connection:
    for i in range(count):
        row = (text() + b"/%d" % i, text(), integer(), integer(), integer(), integer(), text(), data(), data())
        connection.execute(
            "INSERT INTO token VALUES (CAST(? AS TEXT), CAST(? AS TEXT), ?, ?, ?, ?, CAST(? AS TEXT), CAST(? AS TEXT),"
            " CAST(? AS TEXT))",
            row,
        )
