#!/usr/bin/env python3
"""test_peers.py PROGRAMS: both ends of the kernel socket, and the event socket's sender, written
from docs/kernel-socket.md and docs/events.md alone, against the programs of this build."""

import os
import select
import signal
import socket
import stat
import struct
import subprocess
import sys
import tempfile
import time
import traceback

sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))

import client as peer          # noqa: E402
import kernel_side             # noqa: E402
from client import Client, Ended, Failed, control_frame, frame  # noqa: E402
from kernel_side import ENTRY_CLASS, ENTRY_PATH, KernelSide, event  # noqa: E402

TIMEOUT = 30

STATE_FILE = "var/root/.usbrestrictedmode_v2"
ANALYTICS_FILE = "var/root/.usbrestrictedmode_analytics"


class Wrong(Exception):
    pass


def same(what, found, expected):
    if found != expected:
        if isinstance(found, bytes):
            found, expected = found.hex(" "), getattr(expected, "hex", lambda _: expected)(" ")
        raise Wrong(f"{what}:\n  found    {found!r}\n  expected {expected!r}")


def true(what, condition):
    if not condition:
        raise Wrong(what)


def status_of(call, *arguments, **named):
    """The status that the call is answered with."""
    try:
        call(*arguments, **named)
    except Failed as failed:
        return failed.status
    return 0


def read_file(path):
    try:
        with open(path, "rb") as opened:
            return opened.read()
    except FileNotFoundError:
        return None


class Program:
    """A process that is ended with the block it was started for."""

    def __init__(self, *words):
        self._log = tempfile.TemporaryFile()
        self.process = subprocess.Popen(
            words, stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=self._log)

    def wait_for_line(self, expected):
        end = time.monotonic() + TIMEOUT
        text = b""
        while expected not in text.splitlines():
            ready, _, _ = select.select([self.process.stdout], [], [], max(0, end - time.monotonic()))
            more = os.read(self.process.stdout.fileno(), 65536) if ready else b""
            true(f"no line {expected!r}, but {text!r}", more)
            text += more

    def running(self):
        return self.process.poll() is None

    def end(self):
        """Asks it to end; gives the exit status."""
        if self.running():
            self.process.send_signal(signal.SIGTERM)
        return self.process.wait(TIMEOUT)

    def __enter__(self):
        return self

    def __exit__(self, kind, *_):
        try:
            self.end()
        except subprocess.TimeoutExpired:
            self.process.kill()
            self.process.wait()
        self.process.stdout.close()
        if kind is not None:
            self._log.seek(0)
            sys.stderr.write(self._log.read().decode(errors="replace")[-4000:])
        self._log.close()


def make_root(parent, name):
    root = os.path.join(parent, name)
    for directory in ("run/keystrand", "run/kstd", "etc/kstd", "var/root"):
        os.makedirs(os.path.join(root, directory), 0o700)
    return root


# The daemon against the kernel side of this directory.

STATE = struct.pack("<IQB", 7, 1700000000, 1)
ANALYTICS = bytes(range(0x41, 0x41 + 32))

RECORDS = [
    (b"KSTRMTimerRestarted", struct.pack("<IQ", 1, 0) + STATE + b"\xee" * 11),
    (b"KSTRMAnalyticsCollected", struct.pack("<III4sBBBB16s", 2, 86400, 600, b"\xee" * 4,
                                             1, 0, 1, 0, b"\xee" * 16)),
    (b"KSTRMSaveAnalytics", struct.pack("<I", 3) + ANALYTICS),
    (b"KSTRMTimerRestartedAnalyticsCollected", struct.pack("<II", 4, 600) + b"\xee" * 28),
]


def daemon_input(call):
    """The payload of a call of the daemon, its header looked at."""
    same("status of a call", call.status, 0)
    same("magic and first bytes of a command frame", call.frame[:7], b"DRCS\x1a\x00\x00")
    return call.frame[8:]


class Daemon:
    def __init__(self, programs, root, kernel):
        self.kernel = kernel
        self._first = len(kernel.calls)
        self.program = Program(os.path.join(programs, "kstd-dev"), "--root", root)

    def __enter__(self):
        self.program.__enter__()
        return self

    def __exit__(self, *what):
        self.program.__exit__(*what)

    def next_calls(self, count):
        """The payloads of the next calls; fails when they do not come."""
        true(f"call {self._first + count} of the daemon came",
             self.kernel.wait_for_calls(self._first + count, TIMEOUT))
        calls = self.kernel.calls[self._first:self._first + count]
        self._first += count
        return [daemon_input(call) for call in calls]

    def no_more_calls(self, what):
        """All that was sent so far was handled: this event is answered with control code 5."""
        self.kernel.post(event(b"com.zerva.quorvane.effectivesettingschanged"))
        same(what, self.next_calls(1), [struct.pack("<IB", 5, 1)])


def acknowledgement(name):
    return struct.pack("<I64s", 7, name)


def check_start_without_files(daemon, _):
    example = event(b"com.zerva.Keystrand.KSTRMTimerRestarted")
    same("length of the example", len(example), 77)
    same("start of the example", example[:24],
         bytes.fromhex("4b535445 01 1a 2700 00000000 636f6d2e7a657276612e6e6f"))
    same("control code 3", daemon.next_calls(1), [struct.pack("<IB2s13s", 3, 1, b"", b"")])
    mode = os.stat(daemon.kernel.events_path).st_mode
    true("the event socket is a socket of mode 0600",
         stat.S_ISSOCK(mode) and stat.S_IMODE(mode) == 0o600)


def check_records(daemon, root):
    for name, record in RECORDS:
        daemon.kernel.publish(name, record)
        same(f"acknowledgement of {name.decode()}", daemon.next_calls(1), [acknowledgement(name)])
        true("the acknowledged record went", name not in daemon.kernel.properties)
    same("state file", read_file(os.path.join(root, STATE_FILE)), STATE)
    same("analytics file", read_file(os.path.join(root, ANALYTICS_FILE)), ANALYTICS)


def check_streams_and_order(daemon, _):
    """Both matching streams are handled alike, one event after the other in the order of arrival."""
    held, *names = (name for name, _ in RECORDS)
    streams = (kernel_side.NOTIFICATIONS, b"com.zerva.corvid.matching")
    order = [(name, stream) for name in names for stream in streams]
    for name, record in RECORDS:
        daemon.kernel.set_property(name, record)

    def post_all():
        for name, stream in reversed(order):
            daemon.kernel.post(event(kernel_side.NAME_PREFIX + name, stream, b"ignored"))

    # The daemon is held in the copy of the first record until all the others are sent.
    daemon.kernel.after_copy = post_all
    copies = len(daemon.kernel.copies)
    daemon.kernel.post(event(kernel_side.NAME_PREFIX + held))
    same("acknowledgements", daemon.next_calls(4),
         [acknowledgement(name) for name in (held, *reversed(names))])
    daemon.no_more_calls("a record is acknowledged once")
    same("copied properties", daemon.kernel.copies[copies:],
         [held, *(name for name, _ in reversed(order))])


def check_type_decides(daemon, root):
    name = b"KSTRMAnalyticsCollected"
    blob = bytes(range(0x61, 0x61 + 32))
    daemon.kernel.publish(name, struct.pack("<I", 3) + blob)
    same("acknowledgement", daemon.next_calls(1), [acknowledgement(name)])
    same("analytics file", read_file(os.path.join(root, ANALYTICS_FILE)), blob)
    daemon.kernel.publish(*RECORDS[2])
    daemon.next_calls(1)
    same("analytics file", read_file(os.path.join(root, ANALYTICS_FILE)), ANALYTICS)


def check_unacknowledged(daemon, _):
    """Records that are ignored or refused are not acknowledged and stay."""
    name = b"KSTRMTimerRestarted"
    good = RECORDS[0][1]
    for what, record in (("type 5", struct.pack("<I", 5) + good[4:]), ("type 0", bytes(36)),
                         ("35 bytes", good[:35]), ("37 bytes", good + b"\0"), ("no bytes", b"")):
        copies = len(daemon.kernel.copies)
        daemon.kernel.publish(name, record)
        daemon.no_more_calls(f"a record of {what} is not acknowledged")
        same("copied properties", daemon.kernel.copies[copies:], [name])
        same("the record stays", daemon.kernel.properties[name].value, record)
    del daemon.kernel.properties[name]
    daemon.kernel.post(event(kernel_side.NAME_PREFIX + name))
    daemon.no_more_calls("a record that is not there is not acknowledged")
    daemon.kernel.post(event(b"com.zerva.Keystrand.KSTRMSomethingElse"))
    daemon.kernel.post(event(b"org.example.other"))
    daemon.no_more_calls("names that the daemon does not know do nothing")


def check_published_over(daemon, root):
    """A record that is published while the one before is handled is kept and handled as well."""
    name = b"KSTRMSaveAnalytics"
    first, second = b"1" * 32, b"2" * 32
    daemon.kernel.after_copy = lambda: daemon.kernel.set_property(name, struct.pack("<I", 3) + second)
    daemon.kernel.publish(name, struct.pack("<I", 3) + first)
    same("acknowledgement of the first", daemon.next_calls(1), [acknowledgement(name)])
    same("analytics file", read_file(os.path.join(root, ANALYTICS_FILE)), first)
    true("the second record stays", name in daemon.kernel.properties)
    daemon.kernel.post(event(kernel_side.NAME_PREFIX + name))
    same("acknowledgement of the second", daemon.next_calls(1), [acknowledgement(name)])
    same("analytics file", read_file(os.path.join(root, ANALYTICS_FILE)), second)
    true("the second record went", name not in daemon.kernel.properties)
    daemon.kernel.publish(*RECORDS[2])
    daemon.next_calls(1)


def check_two_events_for_one_record(daemon, _):
    """Two events, the record published over before the first is handled."""
    name, record = RECORDS[1]
    # The daemon is held in the copy for another record while both events are sent.
    other, other_record = RECORDS[3]

    def publish_twice():
        daemon.kernel.publish(name, record)
        daemon.kernel.publish(name, record)

    daemon.kernel.after_copy = publish_twice
    copies = len(daemon.kernel.copies)
    daemon.kernel.publish(other, other_record)
    same("acknowledgements", daemon.next_calls(2), [acknowledgement(other), acknowledgement(name)])
    daemon.no_more_calls("the second event finds the property gone")
    same("copied properties", daemon.kernel.copies[copies:], [other, name, name])


def check_malformed_datagrams(daemon, _):
    good = event(b"com.zerva.quorvane.effectivesettingschanged")

    def with_bytes(offset, *values):
        return good[:offset] + bytes(values) + good[offset + len(values):]

    refused = [
        b"", b"K", good[:11], good[:12], good[:-1], good + b"\0",
        with_bytes(0, 0x6b), with_bytes(4, 0), with_bytes(4, 2), with_bytes(5, 0),
        with_bytes(5, 255), with_bytes(6, 0, 0), with_bytes(6, 0xff, 0xff),
        with_bytes(8, 1), with_bytes(8, 0xff, 0xff, 0xff, 0xff),
        with_bytes(12, 0), with_bytes(len(good) - 1, 0),
        event(b""), event(b"n", b""), event(b"n" * 1025),
        event(b"com.zerva.quorvane.effectivesettingschanged", b"com.zerva.other.matching"),
        event(b"com.zerva.quorvane.effectivesettingschanged",
              payload=bytes(4097 - len(good))),
    ]
    for datagram in refused:
        daemon.kernel.post(datagram)
    daemon.no_more_calls("malformed datagrams do nothing")
    true("the daemon runs", daemon.program.running())
    daemon.kernel.post(event(b"com.zerva.quorvane.effectivesettingschanged",
                             payload=bytes(4096 - len(good))))
    same("a datagram of 4096 bytes is handled", daemon.next_calls(1), [struct.pack("<IB", 5, 1)])


def check_start_with_files(daemon, _):
    same("control codes 6 and 3", daemon.next_calls(2),
         [struct.pack("<I", 6) + ANALYTICS, struct.pack("<IB2s", 3, 1, b"") + STATE])


def check_daemon(programs, directory):
    root = make_root(directory, "daemon")
    kernel = KernelSide(root)
    try:
        for checks in ((check_start_without_files, check_records, check_streams_and_order,
                        check_type_decides, check_published_over, check_two_events_for_one_record,
                        check_unacknowledged, check_malformed_datagrams),
                       (check_start_with_files,)):
            with Daemon(programs, root, kernel) as daemon:
                for check in checks:
                    check(daemon, root)
                    passed("daemon", check)
    finally:
        kernel.close()


# A kernel side against the client of this directory. `served` has `path`, the socket, and
# `set_property(name, value)`.

def raw(connection, operation, body):
    """The status that this body is answered with."""
    status, reported, content = connection.request(operation, body)
    if status == 0:
        return 0
    same("content of a reply with a status", (reported, content), (0, b""))
    return status


def check_find(served):
    with Client(served.path) as connection:
        same("the path", connection.find_path(ENTRY_PATH), ENTRY_PATH)
        same("the class", connection.find_class(ENTRY_CLASS), ENTRY_PATH)
        for path in (b"x", ENTRY_PATH[:-1], ENTRY_PATH + b"x", ENTRY_PATH + b"\0", b"p" * 1024,
                     b"\xff\xfe"):
            same(f"path {path[:40]!r}", connection.find_path(path), None)
        for name in (b"K", b"keystrand", b"Keystrand\0", b"c" * 255):
            same(f"class {name[:40]!r}", connection.find_class(name), None)
        for operation, limit in ((peer.FIND_PATH, 1024), (peer.FIND_CLASS, 255)):
            same("empty", raw(connection, operation, b""), -6001)
            same("too long", raw(connection, operation, b"x" * (limit + 1)), -6001)


def check_copy_property(served):
    served.set_property(b"Some", b"\x00\x01\x02")
    served.set_property(b"Nothing", b"")
    served.set_property(b"L" * 255, b"v" * 3000)
    with Client(served.path) as connection:
        same("a value", connection.copy_property(ENTRY_PATH, b"Some"), b"\x00\x01\x02")
        same("an empty value", connection.copy_property(ENTRY_PATH, b"Nothing"), b"")
        same("a long name", connection.copy_property(ENTRY_PATH, b"L" * 255), b"v" * 3000)
        for name in (b"some", b"Som", b"Some\0", b"L" * 254):
            same("another name", connection.copy_property(ENTRY_PATH, name), None)
        path, length = ENTRY_PATH, len(ENTRY_PATH)
        for body, expected in (
                (b"", -6001), (b"\x01", -6001), (b"\0\0", -6001), (b"\0\0Some", -6001),
                (struct.pack("<H", length) + path, -6001),
                (struct.pack("<H", length) + path + b"n" * 256, -6001),
                (struct.pack("<H", 0xffff) + path + b"Some", -6001),
                (struct.pack("<H", 1025) + b"p" * 1025 + b"Some", -6001),
                (struct.pack("<H", 1024) + b"p" * 1024 + b"Some", -6002),
                (struct.pack("<H", 1) + b"p" + b"n" * 256, -6001),
                (struct.pack("<H", length - 1) + path[:-1] + b"Some", -6002)):
            same(f"copy property {body[:16].hex()}… ({len(body)} bytes)",
                 raw(connection, peer.COPY_PROPERTY, body), expected)


def check_open(served):
    with Client(served.path) as connection, Client(served.path) as other:
        for selector in (0, 9):
            same("struct call before open",
                 raw(connection, peer.STRUCT_CALL, struct.pack("<II", selector, 0)), -6003)
            same("scalar call before open",
                 raw(connection, peer.SCALAR_CALL, struct.pack("<III", selector, 0, 0)), -6003)
        same("malformed before not open", raw(connection, peer.STRUCT_CALL, bytes(7)), -6001)
        same("malformed before not open", raw(connection, peer.SCALAR_CALL, bytes(11)), -6001)
        for body, expected in (
                (b"", -6001), (bytes(3), -6001), (bytes(4), -6001), (bytes(4) + b"p" * 1025, -6001),
                (bytes(4) + b"p" * 1024, -6002), (b"\1\0\0\0p", -6002),
                (b"\1\0\0\0" + ENTRY_PATH, -6004), (b"\0\0\0\1" + ENTRY_PATH, -6004)):
            same(f"open {body[:8].hex()}", raw(connection, peer.OPEN, body), expected)
        same("a refused open opens nothing", status_of(connection.control, 5, b"\1"), -6003)
        connection.open(ENTRY_PATH)
        connection.control(5, b"\1")
        connection.open(ENTRY_PATH)
        same("another type", status_of(connection.open, ENTRY_PATH, 1), -6004)
        same("another path", status_of(connection.open, b"p"), -6002)
        connection.control(5, b"\1")
        same("another connection is not open", status_of(other.control, 5, b"\1"), -6003)


def check_struct_call(served):
    with Client(served.path) as connection:
        connection.open(ENTRY_PATH)
        good = control_frame(5, b"\1")
        for length in range(8):
            same("a short body", raw(connection, peer.STRUCT_CALL, bytes(length)), -6001)
            same("a short frame", status_of(connection.struct_call, good[:length]), -6005)
        same("unknown selector", status_of(connection.struct_call, good, selector=1), -6004)
        same("unknown selector", status_of(connection.struct_call, good, selector=2), -6004)
        same("unknown selector first", status_of(connection.struct_call, b"", selector=1), -6004)
        same("another magic", status_of(connection.struct_call, b"drcs" + good[4:]), -6005)
        same("malformed frame first",
             status_of(connection.struct_call, frame(99, magic=b"SCRD")), -6005)
        for command in (0, 23, 27, 255):
            same("unknown command", status_of(connection.struct_call, frame(command)), -6006)
        same("the last byte of the header", connection.struct_call(
            frame(26, struct.pack("<IB", 5, 1), rest=b"\0\0\xff")), b"")
        same("the second and third byte", connection.struct_call(
            frame(26, struct.pack("<IB", 5, 1), rest=b"\1\2\0")), b"")
        same("any number of bytes may be offered",
             connection.struct_call(good, offered=0xffffffff), b"")


def check_scalar_call(served):
    with Client(served.path) as connection:
        connection.open(ENTRY_PATH)
        for offered in (1, 16):
            same("the log level", connection.scalar_call(2, offered=offered), [40])
        same("nothing offered", status_of(connection.scalar_call, 2), -6008)
        same("an input", status_of(connection.scalar_call, 2, [1], 1), -6007)
        same("an input first", status_of(connection.scalar_call, 2, [1], 0), -6007)
        same("16 inputs", status_of(connection.scalar_call, 2, range(16), 1), -6007)
        for selector in (0, 1, 3, 0x10002):
            same("unknown selector", status_of(connection.scalar_call, selector, [1], 0), -6004)
        for body in (b"", bytes(11), struct.pack("<IIIB", 2, 1, 0, 0),
                     struct.pack("<IIIQ", 2, 1, 0, 1), struct.pack("<III", 2, 1, 1),
                     struct.pack("<III7s", 2, 1, 1, b""), struct.pack("<III", 2, 17, 0),
                     struct.pack("<III17Q", 2, 1, 17, *range(17)), struct.pack("<III", 9, 17, 0)):
            same(f"scalar call {body.hex()}", raw(connection, peer.SCALAR_CALL, body), -6001)


def check_environment(served):
    with Client(served.path) as connection:
        connection.open(ENTRY_PATH)
        same("never set", connection.get_variable(7), b"")
        same("never set, nothing offered", connection.get_variable(7, offered=0), b"")
        same("set", connection.set_variable(7, b"\xc0\xff\xee"), b"")
        same("get", connection.get_variable(7), b"\xc0\xff\xee")
        same("get, just fits", connection.get_variable(7, offered=3), b"\xc0\xff\xee")
        same("get, does not fit", status_of(connection.get_variable, 7, offered=2), -6008)
        same("another id", connection.get_variable(0x07000000), b"")
        connection.set_variable(0xffffffff, b"m" * 64)
        same("64 bytes", connection.get_variable(0xffffffff), b"m" * 64)
        same("65 bytes", status_of(connection.set_variable, 7, b"m" * 65), -6007)
        same("a refused value changes nothing", connection.get_variable(7), b"\xc0\xff\xee")
        for payload in (b"", bytes(3), bytes(5)):
            same("get with a wrong payload", status_of(
                connection.struct_call, frame(25, payload), 64), -6007)
        for payload in (b"", bytes(3)):
            same("set with a wrong payload",
                 status_of(connection.struct_call, frame(24, payload)), -6007)
        with Client(served.path) as other:
            other.open(ENTRY_PATH)
            same("on another connection", other.get_variable(7), b"\xc0\xff\xee")
        for identifier in (7, 0xffffffff):
            connection.set_variable(identifier, b"")
            same("removed", connection.get_variable(identifier), b"")
        for identifier in range(64):
            connection.set_variable(identifier, b"v")
        same("one too many", status_of(connection.set_variable, 64, b"v"), -6009)
        connection.set_variable(63, b"w")
        connection.set_variable(64, b"")
        connection.set_variable(0, b"")
        connection.set_variable(64, b"v")
        for identifier in range(65):
            connection.set_variable(identifier, b"")


def check_kernel_control(served):
    no_state = struct.pack("<B2s13s", 1, b"", b"")
    name = b"KSTRMSaveAnalytics"
    good = {3: no_state, 5: b"\0", 6: bytes(32), 7: name.ljust(64, b"\0")}
    with Client(served.path) as connection:
        connection.open(ENTRY_PATH)
        for code, given in good.items():
            same(f"control code {code}", connection.control(code, given), b"")
            same(f"control code {code}, nothing offered",
                 connection.control(code, given, offered=0), b"")
            for length in sorted({0, len(given) - 1, len(given) + 1, 256} - {len(given)}):
                same(f"control code {code} with {length} bytes",
                     status_of(connection.control, code, given[:length].ljust(length, b"\0")), -6007)
        for code, given in ((3, b"\2" + no_state[1:]), (3, b"\1\1\0" + bytes(13)),
                            (3, b"\1\0\1" + bytes(13)), (5, b"\2"), (5, b"\xff"), (7, bytes(64)),
                            (7, b"\0" + b"n" * 63), (7, b"name".ljust(63, b"\0") + b"x")):
            same(f"control code {code} with {given.hex()}",
                 status_of(connection.control, code, given), -6007)
        same("the highest name", connection.control(7, b"n" * 64), b"")
        for code in (0, 1, 2, 4, 8, 0x0300, 0xffffffff):
            same(f"control code {code}", status_of(connection.control, code, bytes(256)), -6006)
            same(f"control code {code} with 257 bytes",
                 status_of(connection.control, code, bytes(257)), -6007)
        for payload in (b"", b"\x05\0\0"):
            same("no whole control code",
                 status_of(connection.struct_call, frame(26, payload)), -6007)
        connection.control(5, b"\1")


def check_acknowledgement(served):
    name, long_name = b"KSTRMSaveAnalytics", b"P" * 70
    with Client(served.path) as connection:
        connection.open(ENTRY_PATH)
        served.set_property(name, b"1")
        connection.control(7, name.ljust(64, b"\0"))
        same("never copied: it stays", connection.copy_property(ENTRY_PATH, name), b"1")
        served.set_property(name, b"2")
        connection.control(7, name.ljust(64, b"\0"))
        same("newer: it stays", connection.copy_property(ENTRY_PATH, name), b"2")
        connection.control(7, name[:-1].ljust(64, b"\0"))
        same("another name: it stays", connection.copy_property(ENTRY_PATH, name), b"2")
        connection.control(7, name.ljust(64, b"\0"))
        same("it went", connection.copy_property(ENTRY_PATH, name), None)
        for last in (b"a", b"b"):
            served.set_property(long_name + last, last)
            same("a long name", connection.copy_property(ENTRY_PATH, long_name + last), last)
        connection.control(7, long_name[:64])
        same("copied last: it went", connection.copy_property(ENTRY_PATH, long_name + b"b"), None)
        same("copied before: it stays", connection.copy_property(ENTRY_PATH, long_name + b"a"), b"a")
        served.set_property(long_name[:64], b"64")
        same("64 bytes", connection.copy_property(ENTRY_PATH, long_name[:64]), b"64")
        connection.copy_property(ENTRY_PATH, long_name + b"a")
        connection.control(7, long_name[:64])
        same("exactly that name: it went", connection.copy_property(ENTRY_PATH, long_name[:64]), None)
        connection.control(7, long_name[:63] + b"\0")
        same("a part of a name: it stays",
             connection.copy_property(ENTRY_PATH, long_name + b"a"), b"a")
        connection.control(7, long_name[:64])
        same("the longer one: it went", connection.copy_property(ENTRY_PATH, long_name + b"a"), None)


def check_two_requests(served):
    def reply(operation, sequence, reported, body):
        return (peer.HEADER.pack(b"KSTR", 1, operation, 0, sequence)
                + struct.pack("<iI", 0, reported) + body)

    requests = [
        (peer.FIND_CLASS, 0, b"x", reply(peer.FIND_CLASS, 0, 0, b"")),
        (peer.FIND_PATH, 2 ** 64 - 1, ENTRY_PATH,
         reply(peer.FIND_PATH, 2 ** 64 - 1, 1, ENTRY_PATH)),
        (peer.OPEN, 5, bytes(4) + ENTRY_PATH, reply(peer.OPEN, 5, 0, b"")),
        (peer.SCALAR_CALL, 4, struct.pack("<III", 2, 1, 0),
         reply(peer.SCALAR_CALL, 4, 1, struct.pack("<Q", 40)))]
    packets = [peer.HEADER.pack(b"KSTQ", 1, operation, 0, sequence) + body
               for operation, sequence, body, _ in requests]
    expected = [one[3] for one in requests]
    with Client(served.path) as connection:
        found = []
        for packet in packets:
            connection.send_packet(packet)
            found.append(connection.receive_packet())
        same("replies, one after the other", found, expected)
    with Client(served.path) as connection:
        for packet in packets:
            connection.send_packet(packet)
        same("replies to requests that wait", [connection.receive_packet() for _ in packets], expected)


def check_bad_headers(served):
    good = peer.HEADER.pack(b"KSTQ", 1, peer.FIND_CLASS, 0, 1) + ENTRY_CLASS

    def with_byte(offset, value):
        return good[:offset] + bytes([value]) + good[offset + 1:]

    with Client(served.path) as witness:
        for packet in (b"", b"K", good[:15], with_byte(0, ord("k")), with_byte(3, ord("R")),
                       with_byte(4, 0), with_byte(4, 2), with_byte(5, 0), with_byte(5, 7),
                       with_byte(5, 255), with_byte(6, 1), with_byte(7, 1)):
            with Client(served.path) as connection:
                same("before", connection.find_class(ENTRY_CLASS), ENTRY_PATH)
                connection.send_packet(packet)
                try:
                    found = connection.receive_packet()
                except Ended:
                    found = b""
                same(f"after {packet[:8].hex()} ({len(packet)} bytes)", found, b"")
        same("other connections go on", witness.find_class(ENTRY_CLASS), ENTRY_PATH)


def check_packet_lengths(served):
    with Client(served.path) as connection:
        longest = b"x" * (peer.MAX_PACKET - peer.HEADER.size)
        same("the longest packet", raw(connection, peer.FIND_PATH, longest), -6001)
        try:
            found = raw(connection, peer.FIND_PATH, longest + b"x")
        except Ended:
            found = "the end"
        same("a longer packet", found, "the end")


KERNEL_SIDE_CHECKS = (
    check_find, check_copy_property, check_open, check_struct_call, check_scalar_call,
    check_environment, check_kernel_control, check_acknowledgement, check_two_requests,
    check_bad_headers, check_packet_lengths)


class Simulator:
    def __init__(self, root):
        self.path = os.path.join(root, "run/keystrand/service.sock")
        self._control = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM | socket.SOCK_CLOEXEC)
        self._control.settimeout(TIMEOUT)
        self._control.connect(os.path.join(root, "run/keystrand/control.sock"))
        self._answers = self._control.makefile("rb")

    def close(self):
        self._answers.close()
        self._control.close()

    def command(self, text):
        """The lines of the answer."""
        self._control.sendall(text.encode() + b"\n")
        lines = []
        while True:
            line = self._answers.readline()
            true(f"answer to {text[:60]}: {lines} {line!r}",
                 line.endswith(b"\n") and not line.startswith(b"error "))
            if line == b"ok\n":
                return lines
            lines.append(line[:-1].decode())

    def set_property(self, name, value):
        self.command(f"property set {name.decode()} {value.hex() or 'empty'}")


def check_control_socket(simulator):
    """What the client did and what the simulator saw."""
    simulator.command("requests clear")
    simulator.set_property(b"Seen", b"\1")
    same("property get", simulator.command("property get Seen")[0], "value 01")
    with Client(simulator.path) as connection:
        connection.open(ENTRY_PATH)
        connection.copy_property(ENTRY_PATH, b"Seen")
        connection.set_variable(9, b"\x2a")
        same("env get", simulator.command("env get 9"), ["value 2a"])
        connection.control(7, b"Seen".ljust(64, b"\0"))
        status_of(connection.control, 4)
        same("wait", simulator.command("wait acks=1"), [])
    name = b"Seen".ljust(64, b"\0").hex()
    same("requests", simulator.command("requests"), [
        "request 1 command 24 payload 090000002a status 0",
        f"request 2 command 26 control 7 payload 07000000{name} status 0",
        "request 3 command 26 control 4 payload 04000000 status -6006"])


def check_simulator(programs, directory):
    root = make_root(directory, "simulator")
    with Program(os.path.join(programs, "keystrand-sim"), "--root", root, "--quiet") as program:
        program.wait_for_line(b"keystrand-sim: ready")
        simulator = Simulator(root)
        try:
            for check in (*KERNEL_SIDE_CHECKS, check_control_socket):
                check(simulator)
                passed("keystrand-sim", check)
        finally:
            simulator.close()
        same("exit status of the simulator", program.end(), 0)


def check_own_kernel_side(_, directory):
    """The kernel side that the daemon was tried with keeps the same rules."""
    kernel = KernelSide(make_root(directory, "own"))
    kernel.path = kernel.socket_path
    try:
        for check in KERNEL_SIDE_CHECKS:
            check(kernel)
            passed("kernel_side.py", check)
    finally:
        kernel.close()


def passed(against, check):
    print(f"passed: {against}: {check.__name__.removeprefix('check_').replace('_', ' ')}", flush=True)


def main():
    if len(sys.argv) != 2:
        sys.exit("Usage: test_peers.py PROGRAMS")
    failed = 0
    with tempfile.TemporaryDirectory(prefix="kstd-peers.", dir="/tmp") as directory:
        for part in (check_own_kernel_side, check_simulator, check_daemon):
            try:
                part(sys.argv[1], directory)
            except Exception:
                traceback.print_exc()
                failed += 1
    print("failed" if failed else "all passed")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
