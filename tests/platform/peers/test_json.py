"""Holds the JSON reader and writer against those of Python, through the program json_echo:

    test_json.py <path of json_echo>

What Python writes must be read, and what comes back must be to Python what it wrote. Texts with
random faults must be refused by both or read alike by both.
"""

import json
import random
import re
import struct
import subprocess
import sys

INT64_MIN, UINT64_MAX = -(2**63), 2**64 - 1

VALUES = [
    None, True, False, 0, 1, -1, 2**31 - 1, 2**31, -(2**31) - 1, 2**32 - 1, 2**32, 2**53 + 1,
    2**63 - 1, 2**63, INT64_MIN, UINT64_MAX,
    0.0, -0.0, 1.0, 0.1, -2.5, 1 / 3, 1e-7, 1e20, 1e21, 1e22, 1e25, 5e-324, 2.2250738585072014e-308,
    1.7976931348623157e308, -1.7976931348623157e308, 1700000000500.25, 9007199254740993.0,
    "", "a", "\"\\/\b\f\n\r\t", "".join(map(chr, range(0x80))), "\x00", "\u0080\u07ff\u0800\ud7ff",
    "\ue000\ufeff\uffff\U00010000\U0010ffff", "\u2028\u2029",
    [], {}, [[]], [{}], {"": {}}, {"a": [1, {"b": [None, True]}], "\x00": "\x00", "\u00e9": "\""},
    {"b": 1, "a": 2, "\uffff": 3, "\U00010000": 4, "": 5}, list(range(100)),
    {"events": [{"topic": None, "eventTime": 1700000000000.0}], "postTime": 1700000000500.25},
]

PIECES = [b'"', b"\\", b"\\u", b"\\ud800", b"\\udc00", b"{", b"}", b"[", b"]", b",", b":", b"0",
          b"1", b"-", b"+", b".", b"e", b"E", b"e400", b"e-400", b"true", b"null", b" ", b"\n", b"\t",
          b"\x00", b"\x1f", b"\x7f", b"\x80", b"\xc3", b"\xed\xa0\x80", b"\xf0\x9f", b"/", b"'"]


class Refused(Exception):
    pass


def refuse(text):
    raise Refused(text)


def real(text):
    value = float(text)
    digits, _, exponent = re.sub("[-.]", "", text.lower().replace("e-", "e~")).partition("e")
    if value in (float("inf"), float("-inf")):
        refuse("too large")
    if value == 0 and digits.strip("0"):
        refuse("too small")
    if value == 0 and exponent and not exponent.startswith("~") and int(exponent) > 300:
        refuse("zero with an exponent beyond all doubles")
    return value


def integer(text):
    value = int(text)
    return value if INT64_MIN <= value <= UINT64_MAX else real(text)


def understand(frame):
    """The value that the frame is by the rules of the reader under test."""
    text = frame.decode("utf-8")
    value = json.loads(text, parse_constant=refuse, parse_float=real, parse_int=integer)
    json.dumps(value, ensure_ascii=False).encode("utf-8")  # no lone surrogates
    return value


def typed(value):
    """Tells 1, 1.0 and True apart, and 0.0 and -0.0."""
    if isinstance(value, list):
        return [typed(item) for item in value]
    if isinstance(value, dict):
        return {key: typed(item) for key, item in value.items()}
    return (type(value).__name__, repr(value))


def echo(program, frames):
    sent = b"".join(struct.pack("<I", len(frame)) + frame for frame in frames)
    came = subprocess.run([program], input=sent, stdout=subprocess.PIPE, check=True).stdout
    answers = []
    while came:
        size = struct.unpack_from("<I", came)[0]
        answers.append(came[4:4 + size])
        came = came[4 + size:]
    assert len(answers) == len(frames), (len(answers), len(frames))
    return answers


def with_fault(source, frame):
    at = source.randrange(len(frame) + 1)
    cut = min(len(frame), at + source.choice([0, 0, 1, 1, 2, 8]))
    piece = source.choice(PIECES + [b"", b"", b""])
    return frame[:at] + piece + frame[cut:]


def valid_frames():
    for value in VALUES + [VALUES]:
        for ascii_only in (True, False):
            yield json.dumps(value, ensure_ascii=ascii_only).encode()
            yield json.dumps(value, ensure_ascii=ascii_only, indent=1).encode()


def main():
    valid = list(valid_frames())
    source = random.Random(7)
    faulty = [with_fault(source, source.choice(valid)) for _ in range(6000)]
    faulty += [with_fault(source, frame) for frame in faulty]
    refused = 0
    for frame, answer in zip(valid + faulty, echo(sys.argv[1], valid + faulty)):
        try:
            expected = typed(understand(frame))
        except (ValueError, Refused, RecursionError):
            assert not answer, ("read", frame, answer)
            refused += 1
            continue
        assert answer, ("refused", frame)
        assert typed(json.loads(answer)) == expected, (frame, answer)
        assert answer == answer.strip() and b"\n" not in answer, answer
    assert 1000 < refused < len(faulty) - 1000, refused
    print(f"{len(valid)} valid texts, {len(faulty)} with faults, {refused} refused by both")


if __name__ == "__main__":
    main()
