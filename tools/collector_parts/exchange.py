"""One connection: its request is read, kept and answered."""

import http
import socket
import ssl

from collector_parts.faults import answer_with, reset, stand_by, stand_still

LONGEST_HEAD = 1024 * 1024


class Hangup(Exception):
    """The peer went before its request was whole."""


class Request:
    def __init__(self, head):
        """From the header block as it came, with the empty line at its end."""
        self.head = head
        self.body = b""
        lines = head.decode("latin-1").split("\r\n")
        self.method, self.target = (lines[0].split(" ") + ["", ""])[:2]
        self.length = 0
        for line in lines[1:]:
            name, _, value = line.partition(":")
            if name.lower() == "content-length" and value.strip().isdigit():
                self.length = int(value)


def read_head(connection):
    data = b""
    while b"\r\n\r\n" not in data:
        more = connection.recv(65536)
        if not more or len(data) > LONGEST_HEAD:
            raise Hangup
        data += more
    head, _, rest = data.partition(b"\r\n\r\n")
    return Request(head + b"\r\n\r\n"), rest


def read_body(connection, request, begin):
    parts, size = [begin], len(begin)
    while size < request.length:
        more = connection.recv(65536)
        if not more:
            raise Hangup
        parts.append(more)
        size += len(more)
    request.body = b"".join(parts)


def reason_of(status):
    try:
        return http.HTTPStatus(status).phrase
    except ValueError:
        return "Something"


def answer_for(request, answering):
    """Header block and body, ready to be sent."""
    status, body = answering.status, answering.body
    if request.method == "GET" and request.target == "/bag":
        status, body = (404, b"") if answering.bag is None else (answering.bag_status, answering.bag)
    lines = ["HTTP/1.1 %d %s" % (status, reason_of(status)), *answering.headers]
    if status < 200:
        body = b""
    else:
        lines.append("Connection: close")
        if answering.framing == "length":
            lines.append("Content-Length: %d" % len(body))
        elif answering.framing == "chunked":
            lines.append("Transfer-Encoding: chunked")
            body = b"%x\r\n%s\r\n" % (len(body), body) if body else b""
            body += b"0\r\n\r\n"
    return ("\r\n".join(lines) + "\r\n\r\n").encode("latin-1"), body


def begin_talking(connection, answering):
    """The connection as requests come over it; None when a fault has ended it."""
    if answering.fault == "reset-on-connect":
        reset(connection)
        return None
    if answering.fault == "no-handshake":
        stand_still(connection)
        return None
    if answering.fault == "garbage-instead-of-tls":
        connection.sendall(b"this is not TLS\r\n")
        return None
    if answering.context:
        return answering.context.wrap_socket(connection, server_side=True)
    return connection


def end_talking(connection):
    """So that the peer sees an end and no loss."""
    if isinstance(connection, ssl.SSLSocket):
        connection.settimeout(5)
        connection.unwrap().close()
    else:
        connection.shutdown(socket.SHUT_WR)


def exchange(connection, behaviour, keep):
    """Serves one request. `keep` is called with it when it is whole."""
    answering = behaviour.snapshot()
    # What was sent before a reset is to arrive, and not to wait here for an acknowledgement.
    connection.setsockopt(socket.IPPROTO_TCP, socket.TCP_NODELAY, 1)
    connection = begin_talking(connection, answering)
    if not connection:
        return
    with connection:
        request, begin = read_head(connection)
        if answering.fault == "reset-in-request":
            reset(connection)
            return
        if answering.fault == "reads-nothing":
            stand_by(connection)
            return
        if answering.fault == "early-answer":
            connection.sendall(b"".join(answer_for(request, answering)))
            stand_by(connection)
            return
        read_body(connection, request, begin)
        # Before it counts as here, so that changes made because it is do not concern it.
        answering = behaviour.snapshot()
        keep(request)
        behaviour.wait_while_held()
        head, body = answer_for(request, answering)
        if answer_with(answering.fault_for(request.method), connection, head, body, answering.pace):
            end_talking(connection)
