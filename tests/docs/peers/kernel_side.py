#!/usr/bin/env python3
"""A minimal kernel side, written from docs/kernel-socket.md and docs/events.md alone.

    kernel_side.py --root DIR

serves DIR/run/keystrand/service.sock until its standard input ends.
"""

import os
import socket
import struct
import sys
import threading

ENTRY_PATH = b"IOService:/IOResources/Keystrand"
ENTRY_CLASS = b"Keystrand"

MAX_PACKET = 131072
HEADER = struct.Struct("<4sBBHQ")
STATUS = struct.Struct("<iI")

FIND_PATH, FIND_CLASS, COPY_PROPERTY, OPEN, STRUCT_CALL, SCALAR_CALL = range(1, 7)
SET_ENVIRONMENT, GET_ENVIRONMENT, KERNEL_CONTROL = 24, 25, 26
DAEMON_STARTED, SET_ALLOWED, RESTORE_ANALYTICS, NOTIFICATION_ACK = 3, 5, 6, 7

MALFORMED_BODY = -6001
NO_ENTRY = -6002
NOT_OPEN = -6003
UNKNOWN_SELECTOR = -6004
MALFORMED_FRAME = -6005
UNKNOWN_COMMAND = -6006
BAD_PAYLOAD = -6007
DOES_NOT_FIT = -6008
NO_ROOM = -6009

MAX_VARIABLES = 64

NOTIFICATIONS = b"com.zerva.notifyd.matching"
NAME_PREFIX = b"com.zerva.Keystrand."


class Refused(Exception):
    """A request that is answered with a status other than 0."""

    def __init__(self, status):
        super().__init__(status)
        self.status = status


def require(condition, status):
    if not condition:
        raise Refused(status)


class Property:
    def __init__(self, value, generation):
        self.value = value
        self.generation = generation
        self.handed_out = 0
        self.copied_at = 0


class Call:
    """A struct call as it was received."""

    def __init__(self, frame, status):
        self.frame = frame
        self.status = status

    @property
    def control(self):
        if len(self.frame) < 12 or self.frame[4] != KERNEL_CONTROL:
            return None
        return struct.unpack_from("<I", self.frame, 8)[0]


def event(name, stream=NOTIFICATIONS, payload=b""):
    return (struct.pack("<4sBBHI", b"KSTE", 1, len(stream), len(name), len(payload))
            + stream + name + payload)


class KernelSide:
    def __init__(self, root, log_level=40):
        self.socket_path = os.path.join(root, "run/keystrand/service.sock")
        self.events_path = os.path.join(root, "run/kstd/events.sock")
        self.log_level = log_level
        self.properties = {}
        self.environment = {}
        self.calls = []
        self.copies = []        # the name of each property that a client asked for
        self.after_copy = None  # called once, after the next property that was copied
        self._generation = 0
        self._copied = 0
        self._state = threading.Condition(threading.RLock())
        self._connections = set()
        self._listener = socket.socket(socket.AF_UNIX, socket.SOCK_SEQPACKET | socket.SOCK_CLOEXEC)
        self._listener.bind(self.socket_path)
        os.chmod(self.socket_path, 0o600)
        self._listener.listen(16)
        threading.Thread(target=self._accept, daemon=True).start()

    def close(self):
        with self._state:
            connections = list(self._connections)
        for one in [self._listener, *connections]:
            try:
                one.shutdown(socket.SHUT_RDWR)
            except OSError:
                pass
        self._listener.close()
        os.unlink(self.socket_path)

    # What a test does with it.

    def set_property(self, name, value):
        with self._state:
            self._generation += 1
            kept = self.properties.get(name)
            if kept is None:
                self.properties[name] = Property(value, self._generation)
            else:
                kept.value, kept.generation = value, self._generation

    def post(self, datagram, timeout=30):
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM | socket.SOCK_CLOEXEC) as sender:
            sender.settimeout(timeout)
            sender.sendto(datagram, self.events_path)

    def publish(self, name, record):
        self.set_property(name, record)
        self.post(event(NAME_PREFIX + name))

    def wait_for(self, condition, timeout=30):
        """Waits until condition() holds; it is looked at after each request."""
        with self._state:
            return self._state.wait_for(condition, timeout)

    def wait_for_calls(self, count, timeout=30):
        return self.wait_for(lambda: len(self.calls) >= count, timeout)

    # Connections.

    def _accept(self):
        while True:
            try:
                connection, _ = self._listener.accept()
            except OSError:
                return
            credentials = connection.getsockopt(socket.SOL_SOCKET, socket.SO_PEERCRED, 12)
            _, uid, _ = struct.unpack("iii", credentials)
            if uid not in (0, os.geteuid()):
                connection.close()
                continue
            with self._state:
                self._connections.add(connection)
            threading.Thread(target=self._serve, args=(connection,), daemon=True).start()

    def _serve(self, connection):
        connection.setsockopt(socket.SOL_SOCKET, socket.SO_SNDBUF, 2 * MAX_PACKET)
        opened = False
        try:
            while True:
                packet = connection.recv(MAX_PACKET + 1)
                if not HEADER.size <= len(packet) <= MAX_PACKET:
                    return
                magic, version, operation, reserved, sequence = HEADER.unpack_from(packet)
                if (magic, version, reserved) != (b"KSTQ", 1, 0) or not 1 <= operation <= 6:
                    return
                status, reported, body = 0, 0, b""
                with self._state:
                    try:
                        reported, body = self._carry_out(operation, packet[HEADER.size:], opened)
                        opened = opened or operation == OPEN
                    except Refused as refused:
                        status = refused.status
                    if operation == STRUCT_CALL and len(packet) >= HEADER.size + 8:
                        self.calls.append(Call(packet[HEADER.size + 8:], status))
                    self._state.notify_all()
                connection.sendall(HEADER.pack(b"KSTR", 1, operation, 0, sequence)
                                   + STATUS.pack(status, reported) + body)
        except OSError:
            pass
        finally:
            with self._state:
                self._connections.discard(connection)
            connection.close()

    # Operations. Each gives what is reported and the body.

    def _carry_out(self, operation, body, opened):
        if operation == FIND_PATH:
            require(1 <= len(body) <= 1024, MALFORMED_BODY)
            return (1, ENTRY_PATH) if body == ENTRY_PATH else (0, b"")
        if operation == FIND_CLASS:
            require(1 <= len(body) <= 255, MALFORMED_BODY)
            return (1, ENTRY_PATH) if body == ENTRY_CLASS else (0, b"")
        if operation == COPY_PROPERTY:
            return self._copy_property(body)
        if operation == OPEN:
            require(5 <= len(body) <= 4 + 1024, MALFORMED_BODY)
            require(body[4:] == ENTRY_PATH, NO_ENTRY)
            require(body[:4] == bytes(4), UNKNOWN_SELECTOR)
            return 0, b""
        if operation == STRUCT_CALL:
            require(len(body) >= 8, MALFORMED_BODY)
            require(opened, NOT_OPEN)
            selector, offered = struct.unpack_from("<II", body)
            require(selector == 0, UNKNOWN_SELECTOR)
            output = self._command(body[8:], offered)
            return len(output), output
        return self._scalar_call(body, opened)

    def _copy_property(self, body):
        require(len(body) >= 2, MALFORMED_BODY)
        length, = struct.unpack_from("<H", body)
        path, name = body[2:2 + length], body[2 + length:]
        require(1 <= length <= 1024 and len(path) == length, MALFORMED_BODY)
        require(1 <= len(name) <= 255, MALFORMED_BODY)
        require(path == ENTRY_PATH, NO_ENTRY)
        self.copies.append(name)
        kept = self.properties.get(name)
        if kept is None:
            return 0, b""
        self._copied += 1
        kept.handed_out, kept.copied_at = kept.generation, self._copied
        value = kept.value
        hook, self.after_copy = self.after_copy, None
        if hook:
            hook()
        return 1, value

    def _scalar_call(self, body, opened):
        require(len(body) >= 12, MALFORMED_BODY)
        selector, offered, inputs = struct.unpack_from("<III", body)
        require(offered <= 16 and inputs <= 16 and len(body) == 12 + 8 * inputs, MALFORMED_BODY)
        require(opened, NOT_OPEN)
        require(selector == 2, UNKNOWN_SELECTOR)
        require(inputs == 0, BAD_PAYLOAD)
        require(offered >= 1, DOES_NOT_FIT)
        return 1, struct.pack("<Q", self.log_level)

    # Commands. Each gives its output.

    def _command(self, frame, offered):
        require(len(frame) >= 8 and frame[:4] == b"DRCS", MALFORMED_FRAME)
        command, payload = frame[4], frame[8:]
        if command == SET_ENVIRONMENT:
            require(4 <= len(payload) <= 4 + 64, BAD_PAYLOAD)
            self._set_variable(payload[:4], payload[4:])
            return b""
        if command == GET_ENVIRONMENT:
            require(len(payload) == 4, BAD_PAYLOAD)
            value = self.environment.get(payload, b"")
            require(len(value) <= offered, DOES_NOT_FIT)
            return value
        require(command == KERNEL_CONTROL, UNKNOWN_COMMAND)
        require(4 <= len(payload) <= 4 + 256, BAD_PAYLOAD)
        self._control(struct.unpack_from("<I", payload)[0], payload[4:])
        return b""

    def _set_variable(self, identifier, value):
        if not value:
            self.environment.pop(identifier, None)
            return
        require(identifier in self.environment or len(self.environment) < MAX_VARIABLES, NO_ROOM)
        self.environment[identifier] = value

    def _control(self, code, given):
        lengths = {DAEMON_STARTED: 16, SET_ALLOWED: 1, RESTORE_ANALYTICS: 32, NOTIFICATION_ACK: 64}
        require(code in lengths, UNKNOWN_COMMAND)
        require(len(given) == lengths[code], BAD_PAYLOAD)
        if code == DAEMON_STARTED:
            require(given[0] <= 1 and given[1:3] == bytes(2), BAD_PAYLOAD)
        elif code == SET_ALLOWED:
            require(given[0] <= 1, BAD_PAYLOAD)
        elif code == NOTIFICATION_ACK:
            name = given.rstrip(b"\0")
            require(name and b"\0" not in name, BAD_PAYLOAD)
            self._acknowledge(name)

    def _acknowledge(self, name):
        meant = [name] if name in self.properties else [
            key for key in self.properties if len(name) == 64 and key.startswith(name)]
        if not meant:
            return
        key = max(meant, key=lambda one: self.properties[one].copied_at)
        if self.properties[key].generation == self.properties[key].handed_out:
            del self.properties[key]


def main():
    if len(sys.argv) != 3 or sys.argv[1] != "--root":
        sys.exit("Usage: kernel_side.py --root DIR")
    kernel = KernelSide(sys.argv[2])
    print("kernel_side: ready", flush=True)
    sys.stdin.read()
    kernel.close()


if __name__ == "__main__":
    main()
