"""What can be made to go wrong."""

import select
import socket
import struct
import time

MANY = 1024 * 1024
ONE_LINE = b"X-Filling: " + 100 * b"x" + b"\r\n"

# Before the request is read, or while it is.
CONNECTION_FAULTS = {
    "reset-on-connect": "resets the connection as soon as it is there",
    "no-handshake": "says nothing at all, no TLS either",
    "garbage-instead-of-tls": "sends a line of text where the handshake should begin",
    "reset-in-request": "resets the connection when the request's headers are there",
    "reads-nothing": "reads the request's headers and nothing of its body",
    "early-answer": "answers when the request's headers are there, and reads nothing of its body",
}

# Instead of the answer, or in it.
ANSWER_FAULTS = {
    "never-answers": "reads the request and says nothing",
    "hang-up": "reads the request and closes the connection",
    "reset-in-response": "resets the connection in the middle of the answer's body",
    "hang-up-in-response": "closes the connection in the middle of the answer's body",
    "garbage-instead-of-http": "answers with a line that is not HTTP",
    "byte-a-second": "sends the answer one byte at a time, `pace` seconds apart",
    "byte-a-second-body": "sends the answer's body so, after the headers",
    "huge-headers": "sends 1 MiB of headers before the answer's end",
    "huge-header-line": "sends one header of 1 MiB",
    "endless-headers": "sends headers for ever",
    "endless-interim": "sends interim answers (103) for ever",
    "endless-body": "sends a body of no announced length for ever",
    "interim-first": "sends two interim answers before the answer",
}

FAULTS = ["none", *CONNECTION_FAULTS, *ANSWER_FAULTS]


def reset(connection):
    """Closes the connection so that the peer sees a reset."""
    connection.setsockopt(socket.SOL_SOCKET, socket.SO_LINGER, struct.pack("ii", 1, 0))
    connection.close()


def stand_still(connection):
    """Says nothing until the peer hangs up."""
    while connection.recv(65536):
        pass


def stand_by(connection):
    """Reads nothing until the peer hangs up, which is seen without reading."""
    hang_up = select.poll()
    hang_up.register(connection, select.POLLRDHUP)
    hang_up.poll()


def for_ever(connection, block):
    """Sends until the peer hangs up, which shows as an error."""
    while True:
        connection.sendall(block)


def byte_by_byte(connection, data, pace):
    for i in range(len(data)):
        connection.sendall(data[i:i + 1])
        time.sleep(pace)


def send_in_half(connection, head, body):
    connection.sendall(head + body[:len(body) // 2])


def filled(head, filling):
    """The head with more header lines in it."""
    return head[:-2] + filling + b"\r\n"


def answer_with(fault, connection, head, body, pace):
    """Sends the answer as the fault has it. False when the connection is no more."""
    if fault == "never-answers":
        stand_still(connection)
    elif fault == "hang-up":
        pass
    elif fault in ("reset-in-response", "hang-up-in-response"):
        send_in_half(connection, head, body)
        if fault == "reset-in-response":
            reset(connection)
            return False
    elif fault == "garbage-instead-of-http":
        connection.sendall(b"this is not HTTP\r\n")
    elif fault == "byte-a-second":
        byte_by_byte(connection, head + body, pace)
    elif fault == "byte-a-second-body":
        connection.sendall(head)
        byte_by_byte(connection, body, pace)
    elif fault == "huge-headers":
        connection.sendall(filled(head, ONE_LINE * (MANY // len(ONE_LINE) + 1)) + body)
    elif fault == "huge-header-line":
        connection.sendall(filled(head, b"X-Filling: " + MANY * b"x" + b"\r\n") + body)
    elif fault == "endless-headers":
        connection.sendall(head[:-2])
        for_ever(connection, ONE_LINE * 100)
    elif fault == "endless-interim":
        for_ever(connection, b"HTTP/1.1 103 Early Hints\r\n\r\n" * 100)
    elif fault == "endless-body":
        connection.sendall(b"HTTP/1.1 200 OK\r\nConnection: close\r\n\r\n")
        for_ever(connection, 65536 * b"x")
    elif fault == "interim-first":
        connection.sendall(b"HTTP/1.1 103 Early Hints\r\nLink: <x>\r\n\r\n"
                           b"HTTP/1.1 199 Soon\r\n\r\n" + head + body)
    else:
        connection.sendall(head + body)
    return True
