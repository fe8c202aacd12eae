"""Adds tokens of odd texts, numbers and data to a database, as the library would write them.

usage: odd_rows.py DATABASE
"""
import sqlite3
import struct
import sys

NESTED_MAX = 1000

TEXTS = ["", "''", "%Q", "\\u0000", "\r\n", "\x85", "\u2028", "\u202e", "ü", "日本", "😀"]
NO_UTF8 = [b"\xc3", b"\xc0\x80", b"\xed\xa0\x80", b"\xf4\x90\x80\x80", b"\xe2\x82", b"\xc2\x80\xc2"]
PIECES = [bytes([byte]) for byte in range(1, 256)] + [text.encode() for text in TEXTS] + NO_UTF8
INTEGERS = [0, 1, -1, 2**31, 2**32 - 1, 2**32, 2**53 + 1, 2**63 - 1, -(2**63)]
DOUBLES = [0.0, -0.0, 0.1, 1.0, 1e16, 1e17, 1e22, 2.0**63, 2.0**64, 5e-324, sys.float_info.max]
# And some of any kind, finite.
DOUBLES += [struct.unpack("d", struct.pack("Q", bits * 0x123456789ABCDEF % 2**63))[0] for bits in range(1, 50)]
ESCAPES = {ord(c): f"\\{e}".encode() for c, e in zip('"\\\b\f\n\r\t', '"\\bfnrt')}
ESCAPES.update({byte: b"\\u%04x" % byte for byte in range(32) if byte not in ESCAPES})


def json_text(raw):
    return b'"' + b"".join(ESCAPES.get(byte, bytes([byte])) for byte in raw) + b'"'


def json_double(value):
    digits = b"%.17g" % value
    return digits if b"." in digits or b"e" in digits else digits + b".0"


VALUES = [b"null", b"true", b"false", b"Infinity", b"-Infinity", b"NaN", b"[]", b'{"":{},"a":[[{}]]}', json_text(b"\0")]
VALUES += [str(integer).encode() for integer in [*INTEGERS, 2**64 - 1]] + list(map(json_double, DOUBLES))


def rows():
    for i, piece in enumerate(PIECES):
        text = piece + PIECES[-i] + b"a" + piece  # before, between and after others
        numbers = [INTEGERS[(i + column) % len(INTEGERS)] for column in range(4)]
        data = b"{" + json_text(text) + b":[" + VALUES[i % len(VALUES)] + b"," + json_text(piece) + b"]}"
        yield (text + b"/%d" % i, piece, *numbers, text, data, data)
    for levels in range(NESTED_MAX - 5, NESTED_MAX):
        yield (b"/-%d" % levels, b"", 0, 0, 0, 0, b"", b"{}", b'{"a":' * levels + b"[]" + b"}" * levels)


with sqlite3.connect(sys.argv[1]) as connection:
    connection.executemany(
        "INSERT INTO token VALUES (CAST(? AS TEXT), CAST(? AS TEXT), ?, ?, ?, ?, CAST(? AS TEXT), CAST(? AS TEXT),"
        " CAST(? AS TEXT))",
        rows(),
    )
