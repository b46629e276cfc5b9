"""A client of the kernel socket, written from docs/kernel-socket.md alone."""

import os
import socket
import struct

MAX_PACKET = 131072
HEADER = struct.Struct("<4sBBHQ")
STATUS = struct.Struct("<iI")
REPLY_TIMEOUT = 30

FIND_PATH, FIND_CLASS, COPY_PROPERTY, OPEN, STRUCT_CALL, SCALAR_CALL = range(1, 7)
SET_ENVIRONMENT, GET_ENVIRONMENT, KERNEL_CONTROL = 24, 25, 26


class Ended(Exception):
    """The connection came to an end."""


class BadReply(Exception):
    """A reply that breaks the rules."""


class Failed(Exception):
    """The kernel side answered with a status other than 0."""

    def __init__(self, status):
        super().__init__(f"status {status}")
        self.status = status


def require(condition, what):
    if not condition:
        raise BadReply(what)


def frame(command, payload=b"", magic=b"DRCS", rest=b"\0\0\0"):
    return magic + bytes([command]) + rest + payload


def control_frame(code, given=b""):
    return frame(KERNEL_CONTROL, struct.pack("<I", code) + given)


class Client:
    def __init__(self, path):
        self._sequence = 0
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET | socket.SOCK_CLOEXEC)
        self._socket.settimeout(REPLY_TIMEOUT)
        self._socket.setsockopt(socket.SOL_SOCKET, socket.SO_SNDBUF, 2 * MAX_PACKET)
        self._socket.connect(path)
        _, uid, _ = struct.unpack(
            "iii", self._socket.getsockopt(socket.SOL_SOCKET, socket.SO_PEERCRED, 12))
        if uid not in (0, os.geteuid()):
            self.close()
            raise PermissionError(f"{path} is served by user {uid}")

    def close(self):
        self._socket.close()

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    # Packets.

    def send_packet(self, packet):
        self._socket.send(packet)

    def receive_packet(self):
        try:
            packet = self._socket.recv(MAX_PACKET + 1)
        except ConnectionResetError:
            packet = b""
        if not packet:
            raise Ended()
        return packet

    def request(self, operation, body):
        """(status, reported, body) of the reply."""
        self._sequence += 1
        try:
            try:
                self.send_packet(HEADER.pack(b"KSTQ", 1, operation, 0, self._sequence) + body)
            except (BrokenPipeError, ConnectionResetError):
                raise Ended() from None
            return self.parse_reply(self.receive_packet(), operation, self._sequence)
        except (Ended, BadReply, TimeoutError):
            self.close()
            raise

    @staticmethod
    def parse_reply(packet, operation, sequence):
        require(HEADER.size + STATUS.size <= len(packet) <= MAX_PACKET, "length of a reply")
        require(packet[:HEADER.size] == HEADER.pack(b"KSTR", 1, operation, 0, sequence),
                "header of a reply")
        status, reported = STATUS.unpack_from(packet, HEADER.size)
        body = packet[HEADER.size + STATUS.size:]
        require(status == 0 or (reported == 0 and not body), "content in a reply with a status")
        return status, reported, body

    def _succeed(self, operation, body):
        status, reported, content = self.request(operation, body)
        if status != 0:
            raise Failed(status)
        return reported, content

    def _check(self, condition, what):
        if not condition:
            self.close()
            raise BadReply(what)

    # Operations.

    def _find(self, operation, what):
        reported, path = self._succeed(operation, what)
        self._check(reported == 1 and 1 <= len(path) <= 1024 or (reported, path) == (0, b""),
                    "reply to find")
        return path if reported else None

    def find_path(self, path):
        return self._find(FIND_PATH, path)

    def find_class(self, name):
        return self._find(FIND_CLASS, name)

    def copy_property(self, path, name):
        """The value, or None when there is no such property."""
        reported, value = self._succeed(
            COPY_PROPERTY, struct.pack("<H", len(path)) + path + name)
        self._check(reported == 1 or (reported, value) == (0, b""), "reply to copy property")
        return value if reported else None

    def open(self, path, kind=0):
        reported, body = self._succeed(OPEN, struct.pack("<I", kind) + path)
        self._check((reported, body) == (0, b""), "reply to open")

    def struct_call(self, given, offered=0, selector=0):
        reported, output = self._succeed(
            STRUCT_CALL, struct.pack("<II", selector, offered) + given)
        self._check(reported <= offered and reported == len(output), "reply to a struct call")
        return output

    def scalar_call(self, selector, inputs=(), offered=0):
        reported, body = self._succeed(
            SCALAR_CALL, struct.pack(f"<III{len(inputs)}Q", selector, offered, len(inputs), *inputs))
        self._check(reported <= offered and len(body) == 8 * reported, "reply to a scalar call")
        return list(struct.unpack(f"<{reported}Q", body))

    # Commands.

    def set_variable(self, identifier, value):
        return self.struct_call(frame(SET_ENVIRONMENT, struct.pack("<I", identifier) + value))

    def get_variable(self, identifier, offered=64):
        return self.struct_call(frame(GET_ENVIRONMENT, struct.pack("<I", identifier)), offered)

    def control(self, code, given=b"", offered=256):
        return self.struct_call(control_frame(code, given), offered)
