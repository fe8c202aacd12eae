#!/usr/bin/python3
"""Which characters can be seen, by Python's tables of Unicode, which are not those of the C library.

visible.py all           prints every character, but NUL
visible.py check         fails unless standard input holds nothing but characters that can be seen and line feeds
visible.py compare       the same; fails, too, unless it holds all of those
"""

import sys
import unicodedata

# Characters that Unicode says to ignore, and Python prints: joiners, fillers, inherent vowels, variation selectors;
# and the Braille pattern without dots.
IGNORED = {0x034F, 0x115F, 0x1160, 0x17B4, 0x17B5, 0x180B, 0x180C, 0x180D, 0x180F, 0x2800, 0x3164, 0xFFA0,
           *range(0xFE00, 0xFE10), *range(0xE0100, 0xE01F0)}

ALL = [chr(code) for code in range(1, 0x110000) if not 0xD800 <= code < 0xE000]


def hidden(character):
    # Where the C library's Unicode is the newer one, it knows what Python cannot judge.
    known = unicodedata.category(character) != "Cn"
    return known and (not character.isprintable() or ord(character) in IGNORED)


def expected(character):
    # Either's Unicode may be the older one, but not as old as this.
    return unicodedata.ucd_3_2_0.category(character) != "Cn" and not hidden(character)


def report(what, characters):
    if characters:
        print(f"{what}:", *sorted(f"U+{ord(character):04X}" for character in characters)[:20])


def main():
    if sys.argv[1] == "all":
        sys.stdout.buffer.write("".join(ALL).encode())
        return 0
    shown = set(sys.stdin.buffer.read().decode())
    wrong = {character for character in shown if hidden(character)} - {"\n"}
    missing = {character for character in ALL if expected(character)} - shown if sys.argv[1] == "compare" else set()
    report("cannot be seen", wrong)
    report("is missing", missing)
    return 1 if wrong or missing else 0


sys.exit(main())
