"""Listens, and keeps the requests that come."""

import os
import socket
import sys
import threading

from collector_parts.exchange import Hangup, exchange


class Counter:
    """A number that others wait for."""

    def __init__(self):
        self._changed = threading.Condition()
        self._count = 0

    def add(self):
        with self._changed:
            self._count += 1
            self._changed.notify_all()

    def count(self):
        with self._changed:
            return self._count

    def await_count(self, count, patience):
        with self._changed:
            self._changed.wait_for(lambda: self._count >= count, patience)
            return self._count


class Server:
    """A thread that accepts, and one for each connection. `connections` counts what was accepted,
    `requests` what came whole."""

    def __init__(self, behaviour, options):
        self.connections = Counter()
        self.requests = Counter()
        self._behaviour = behaviour
        self._directory = options.directory
        self._quiet = options.quiet
        self._keeping = threading.Lock()
        self._kept = 0
        if self._directory:
            os.makedirs(self._directory, exist_ok=True)
            self._kept = self._last_number()
        self._listener = socket.create_server(("127.0.0.1", options.port), backlog=64)
        self.port = self._listener.getsockname()[1]
        threading.Thread(target=self._accept, daemon=True).start()

    def _last_number(self):
        """Of the requests that an earlier collector has kept."""
        stems = [os.path.splitext(name)[0] for name in os.listdir(self._directory)]
        return max((int(stem) for stem in stems if stem.isdigit()), default=0)

    def _accept(self):
        while True:
            connection, _ = self._listener.accept()
            self.connections.add()
            threading.Thread(target=self._serve, args=(connection,), daemon=True).start()

    def _serve(self, connection):
        with connection:
            try:
                exchange(connection, self._behaviour, self._keep)
            except (OSError, Hangup):
                pass  # The client is gone, or did not like the certificate: its own affair.

    def _keep(self, request):
        with self._keeping:
            self._kept += 1
            self._write("%04d" % self._kept, request)
        self.requests.add()

    def _write(self, number, request):
        if self._directory:
            for kind, data in (("body", request.body), ("head", request.head)):
                with open(os.path.join(self._directory, "%s.%s" % (number, kind)), "wb") as file:
                    file.write(data)
        if not self._quiet:
            print("collector: %s %s %s, %d bytes" % (number, request.method, request.target,
                                                     len(request.body)), file=sys.stderr, flush=True)
