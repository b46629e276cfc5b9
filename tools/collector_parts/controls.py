"""The lines on standard input."""

from collector_parts.behaviour import UnknownWords

PATIENCE = 30  # seconds for what is awaited


def awaited(counter, count):
    reached = counter.await_count(int(count), PATIENCE)
    if reached < int(count):
        raise UnknownWords("only %d came" % reached)
    return reached


CONTROLS = {
    "status": lambda behaviour, server, rest: behaviour.set_status(rest),
    "body": lambda behaviour, server, rest: behaviour.set_body(rest.encode()),
    "body-size": lambda behaviour, server, rest: behaviour.set_body(int(rest) * b"x"),
    "bag": lambda behaviour, server, rest: behaviour.set_bag(rest),
    "bag-status": lambda behaviour, server, rest: behaviour.set_bag_status(rest),
    "header": lambda behaviour, server, rest: behaviour.add_header(rest),
    "no-headers": lambda behaviour, server, rest: behaviour.clear_headers(),
    "framing": lambda behaviour, server, rest: behaviour.set_framing(rest),
    "certificate": lambda behaviour, server, rest: behaviour.set_certificate(rest),
    "fault": lambda behaviour, server, rest: behaviour.set_fault(*rest.split()),
    "pace": lambda behaviour, server, rest: behaviour.set_pace(rest),
    "hold": lambda behaviour, server, rest: behaviour.hold(),
    "release": lambda behaviour, server, rest: behaviour.release(),
    "reset": lambda behaviour, server, rest: behaviour.reset(),
    "requests": lambda behaviour, server, rest: server.requests.count(),
    "connections": lambda behaviour, server, rest: server.connections.count(),
    "await-requests": lambda behaviour, server, rest: awaited(server.requests, rest),
    "await-connections": lambda behaviour, server, rest: awaited(server.connections, rest),
}


def answer_control(line, behaviour, server):
    """Does what a line says and gives the line to answer with."""
    word, _, rest = line.partition(" ")
    if word not in CONTROLS:
        return "error unknown word %s; known are %s" % (word, ", ".join(CONTROLS))
    try:
        result = CONTROLS[word](behaviour, server, rest.strip())
    except (UnknownWords, ValueError, TypeError, OSError) as problem:
        return "error %s" % " ".join(str(problem).split())
    return "ok" if result is None else "ok %s" % result
