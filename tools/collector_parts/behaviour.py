"""What the collector does at present."""

import copy
import ssl
import threading

from collector_parts.faults import CONNECTION_FAULTS, FAULTS

FRAMINGS = ("length", "chunked", "close")


class UnknownWords(Exception):
    """Somebody asked for something that does not exist."""


class Answering:
    """One consistent state of affairs, which a connection takes a copy of."""

    def __init__(self):
        self.status = 200
        self.body = b""
        self.headers = []
        self.framing = "length"
        self.bag = None
        self.bag_status = 200
        self.fault = "none"
        self.fault_method = None
        self.pace = 1.0
        self.context = None

    def fault_for(self, method):
        return self.fault if self.fault_method in (None, method) else "none"


class Behaviour:
    """The state that connections follow and controls change. Any thread may use it."""

    def __init__(self, options, certificates):
        self._lock = threading.Lock()
        self._certificates = certificates
        self._go = threading.Event()
        self._go.set()
        self._now = Answering()
        self.set_status(options.status)
        self.set_fault(options.fault)
        self.set_pace(options.pace)
        if options.bag:
            self.set_bag(options.bag)
        if certificates:
            self.set_certificate("good")
        self._at_start = copy.copy(self._now)

    def snapshot(self):
        with self._lock:
            return copy.copy(self._now)

    def reset(self):
        """As it was at the start; what is held goes on."""
        with self._lock:
            self._now = copy.copy(self._at_start)
        self._go.set()

    def _change(self, name, value):
        with self._lock:
            setattr(self._now, name, value)

    def set_status(self, status):
        if not 100 <= int(status) <= 999:
            raise UnknownWords("a status has three digits")
        self._change("status", int(status))

    def set_bag_status(self, status):
        self._change("bag_status", int(status))

    def set_body(self, body):
        self._change("body", body)

    def set_bag(self, path):
        """What the file holds now; later changes of the file change nothing."""
        if path == "none":
            self._change("bag", None)
            return
        with open(path, "rb") as file:
            self._change("bag", file.read())

    def add_header(self, line):
        if ":" not in line:
            raise UnknownWords("a header is NAME: VALUE")
        self._change("headers", self.snapshot().headers + [line])

    def clear_headers(self):
        self._change("headers", [])

    def set_framing(self, framing):
        if framing not in FRAMINGS:
            raise UnknownWords("a framing is one of " + ", ".join(FRAMINGS))
        self._change("framing", framing)

    def set_fault(self, kind, method=None):
        if kind not in FAULTS:
            raise UnknownWords("a fault is one of " + ", ".join(FAULTS))
        if method and kind in CONNECTION_FAULTS:
            raise UnknownWords("this fault comes before there is a method")
        with self._lock:
            self._now.fault, self._now.fault_method = kind, method

    def set_pace(self, seconds):
        if float(seconds) < 0:
            raise UnknownWords("a pace is not negative")
        self._change("pace", float(seconds))

    def set_certificate(self, name):
        if not self._certificates:
            raise UnknownWords("no certificates without TLS")
        certificate, key = self._certificates(name)
        context = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
        try:
            context.load_cert_chain(certificate, key)
        except (OSError, ssl.SSLError) as problem:
            raise UnknownWords("no certificate %s: %s" % (certificate, problem)) from problem
        self._change("context", context)

    def hold(self):
        self._go.clear()

    def release(self):
        self._go.set()

    def wait_while_held(self):
        self._go.wait()
