#!/usr/bin/env python3
"""test_property_lists.py ECHO: the binary form of property lists against Python's own.

What plistlib writes must be read as what it is, and what we write of it must be the same to
plistlib.
"""

import datetime
import math
import plistlib
import random
import struct
import subprocess
import sys
import unittest

ECHO = None
EPOCH = datetime.datetime(2001, 1, 1)


def bits(real):
    # Hexadecimal digits without leading zeros.
    return format(struct.unpack(">Q", struct.pack(">d", real))[0], "x")


def described(value):
    """The text that the echo gives of the same value."""
    if value is True or value is False:
        return "T," if value else "F,"
    if isinstance(value, int):
        return f"i{value},"
    if isinstance(value, float):
        return f"r{bits(value)},"
    if isinstance(value, str):
        return f'"{value.encode().hex()},'
    if isinstance(value, bytes):
        return f"#{value.hex()},"
    if isinstance(value, datetime.datetime):
        return f"d{bits((value - EPOCH).total_seconds())},"
    if isinstance(value, list):
        return "[" + "".join(map(described, value)) + "],"
    entries = sorted((key.encode(), entry) for key, entry in value.items())
    return "{" + "".join(f'"{key.hex()}:{described(entry)}' for key, entry in entries) + "},"


def ask(files):
    """The echo's answers to binary files: pairs of description and binary form."""
    question = b"".join(struct.pack(">I", len(file)) + file for file in files)
    output = subprocess.run([ECHO], input=question, stdout=subprocess.PIPE, check=True).stdout
    parts = []
    while output:
        (length,) = struct.unpack_from(">I", output)
        parts.append(output[4 : 4 + length])
        output = output[4 + length :]
    answers = [(parts[i].decode(), parts[i + 1]) for i in range(0, len(parts), 2)]
    assert len(answers) == len(files), "an answer is missing"
    return answers


def random_text(source):
    alphabets = ["abcXYZ 09", "\u00e9\u00fc\u20ac", "\uffee\U0001f600\U00010000\U0010ffff"]
    alphabet = "".join(alphabets[: source.randint(1, 3)])
    return "".join(source.choices(alphabet, k=source.choice([0, 1, 5, 14, 15, 16, 40])))


def random_scalar(source):
    kind = source.randrange(7)
    if kind == 0:
        return source.random() < 0.5
    if kind == 1:
        return source.randint(-(2**63), 2**64 - 1) >> source.randrange(64)
    if kind == 2:
        return struct.unpack(">d", source.randbytes(8))[0]
    if kind == 3:
        return source.randbytes(source.choice([0, 1, 14, 15, 16, 300]))
    if kind == 4:
        return EPOCH + datetime.timedelta(seconds=source.randint(-(10**10), 10**10) / 8)
    return random_text(source)


def random_value(source, depth):
    if depth == 0 or source.random() < 0.5:
        return random_scalar(source)
    size = source.choice([0, 1, 3, 14, 15, 16])
    if source.random() < 0.5:
        return [random_value(source, depth - 1) for _ in range(size)]
    return {random_text(source): random_value(source, depth - 1) for _ in range(size)}


def has_nan(value):
    if isinstance(value, float):
        return math.isnan(value)
    if isinstance(value, list):
        return any(map(has_nan, value))
    return isinstance(value, dict) and any(map(has_nan, value.values()))


class PropertyLists(unittest.TestCase):
    def check(self, values):
        for sort_keys in (True, False):
            files = [
                plistlib.dumps(value, fmt=plistlib.FMT_BINARY, sort_keys=sort_keys)
                for value in values
            ]
            for value, (description, binary) in zip(values, ask(files)):
                self.assertEqual(description, described(value))
                back = plistlib.loads(binary, fmt=plistlib.FMT_BINARY)
                # Compared by their descriptions, which tell 1 from 1.0 and from true.
                self.assertEqual(described(back), described(value))
                if not has_nan(value):
                    self.assertEqual(back, value)

    def test_integers_around_every_power_of_two(self):
        powers = [2**exponent for exponent in range(65)]
        numbers = {sign * (power + offset) for power in powers for offset in (-1, 0, 1)
                   for sign in (1, -1)}
        self.check([n for n in sorted(numbers) if -(2**63) <= n < 2**64])

    def test_reals(self):
        self.check([0.0, -0.0, 1.5, 0.1, -1e308, 5e-324, math.inf, -math.inf, math.nan,
                    1700000000500.25])

    def test_dates(self):
        self.check([EPOCH, datetime.datetime(1, 1, 1), datetime.datetime(1970, 1, 1),
                    datetime.datetime(2023, 11, 14, 22, 13, 20, 250000),
                    datetime.datetime(9999, 12, 31, 23, 59, 59)])

    def test_texts(self):
        self.check(["", "a", "\x01\x7f", "\u0080", "\u00e9", "\uffff", "\U00010000", "\U0010ffff",
                    *("a" * n for n in (14, 15, 16, 255, 256, 65535, 65536)),
                    *("\u20ac" * n for n in (14, 15, 16, 255, 256, 65535, 65536))])

    def test_sizes_of_containers(self):
        sizes = (0, 1, 14, 15, 16, 127, 128, 253, 254, 255, 256, 257)
        self.check([list(range(size)) for size in sizes])
        self.check([[True] * size for size in (*sizes, 65534, 65535, 65536)])
        self.check([{f"key {n}": n for n in range(size)} for size in sizes])

    def test_shared_objects(self):
        inner = {"a": ["text", "text"], "b": b"bytes"}
        self.check([[inner] * 50, {str(n): inner for n in range(50)}])

    def test_random_values(self):
        source = random.Random(20240229)
        self.check([random_value(source, 4) for _ in range(100)])

    def test_what_is_no_value_is_refused(self):
        files = [plistlib.dumps(value, fmt=plistlib.FMT_BINARY)
                 for value in (plistlib.UID(1), [plistlib.UID(1)], "a\0b", {"\0": True})]
        files.append(plistlib.dumps(True, fmt=plistlib.FMT_XML))
        self.assertEqual(ask(files), [("", b"")] * len(files))


if __name__ == "__main__":
    ECHO = sys.argv.pop(1)
    unittest.main()
