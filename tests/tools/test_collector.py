#!/usr/bin/env python3
"""test_collector.py TOOLS DOCUMENT: the collector as people use it, with Python's own client."""

import http.client
import os
import re
import ssl
import subprocess
import sys
import tempfile
import unittest

TOOLS, DOCUMENT = sys.argv[1:3]
sys.dont_write_bytecode = True
sys.path.insert(0, TOOLS)

from collector_parts.controls import CONTROLS
from collector_parts.faults import FAULTS


class Collector:
    def __init__(self, *options):
        self.process = subprocess.Popen([os.path.join(TOOLS, "collector"), *options], text=True,
                                        stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                                        stderr=subprocess.PIPE)
        line = self.process.stdout.readline()
        self.address = re.fullmatch(r"collector: listening on https?://(127\.0\.0\.1:\d+)\n", line)[1]

    def control(self, line):
        self.process.stdin.write(line + "\n")
        self.process.stdin.flush()
        return self.process.stdout.readline().rstrip("\n")

    def end(self):
        """What it wrote to standard error."""
        errors = self.process.communicate()[1]
        if self.process.returncode != 0:
            raise AssertionError("the collector ended with %d" % self.process.returncode)
        return errors


def ask(connection, method, target, body=None):
    connection.request(method, target, body)
    answer = connection.getresponse()
    text = answer.read()
    connection.close()
    return answer.status, text


class CollectorTest(unittest.TestCase):
    def setUp(self):
        self.directory = tempfile.TemporaryDirectory()
        self.addCleanup(self.directory.cleanup)
        self.kept = self.path("kept")

    def path(self, name):
        return os.path.join(self.directory.name, name)

    def contents(self, name):
        with open(os.path.join(self.kept, name), "rb") as file:
            return file.read()

    def test_requests_are_kept_and_numbered_on(self):
        for number in ("0001", "0002"):
            collector = Collector("--plain", "--directory", self.kept, "--status", "503")
            connection = http.client.HTTPConnection(collector.address)
            self.assertEqual(ask(connection, "POST", "/2/kst", b"a\0b"), (503, b""))
            self.assertEqual(collector.end(), "collector: %s POST /2/kst, 3 bytes\n" % number)
            self.assertEqual(self.contents(number + ".body"), b"a\0b")
            head = self.contents(number + ".head")
            self.assertTrue(head.startswith(b"POST /2/kst HTTP/1.1\r\nHost: "), head)
            self.assertTrue(head.endswith(b"\r\n\r\n"), head)
        self.assertEqual(len(os.listdir(self.kept)), 4)

    def test_bag_over_tls(self):
        with open(self.path("bag"), "w") as file:
            file.write('{"metricsUrl":"https://x"}')
        certificates = self.path("certificates")
        collector = Collector("--self-made", certificates, "--quiet", "--bag", self.path("bag"))
        context = ssl.create_default_context(cafile=os.path.join(certificates, "ca.pem"))

        def bag():
            return ask(http.client.HTTPSConnection(collector.address, context=context), "GET", "/bag")

        self.assertEqual(bag(), (200, b'{"metricsUrl":"https://x"}'))
        self.assertEqual(collector.control("bag-status 500"), "ok")
        self.assertEqual(bag()[0], 500)
        self.assertEqual(collector.control("bag none"), "ok")
        self.assertEqual(bag(), (404, b""))
        self.assertEqual(collector.control("certificate expired"), "ok")
        with self.assertRaises(ssl.SSLCertVerificationError):
            bag()
        self.assertEqual(collector.control("connections"), "ok 4")
        self.assertEqual(collector.control("requests"), "ok 3")
        self.assertEqual(collector.end(), "")

    def test_fault_for_one_method(self):
        collector = Collector("--plain", "--quiet")
        self.assertEqual(collector.control("fault hang-up GET"), "ok")
        with self.assertRaises(http.client.RemoteDisconnected):
            ask(http.client.HTTPConnection(collector.address), "GET", "/")
        self.assertEqual(ask(http.client.HTTPConnection(collector.address), "POST", "/")[0], 200)
        collector.end()

    def test_wrong_words_are_answered_with_an_error(self):
        collector = Collector("--plain", "--quiet")
        for line in ("frob", "status", "status 99", "status 1000", "status x", "fault frob",
                     "fault hang-up GET more", "fault no-handshake GET", "bag /nonexistent",
                     "framing frob", "header frob", "pace -1", "certificate good", "body-size x"):
            with self.subTest(line):
                self.assertRegex(collector.control(line), "^error .")
        self.assertEqual(ask(http.client.HTTPConnection(collector.address), "GET", "/"), (200, b""))
        collector.end()

    def test_wrong_options_end_it(self):
        for options in ((), ("--plain", "--fault", "frob"), ("--plain", "--status", "7"),
                        ("--plain", "--bag", "/nonexistent"), ("--self-made", "/dev/null/x"),
                        ("--certificate", "/nonexistent", "--key", "/nonexistent")):
            with self.subTest(options):
                ended = subprocess.run([os.path.join(TOOLS, "collector"), *options],
                                       stdin=subprocess.DEVNULL, capture_output=True, text=True)
                self.assertNotEqual(ended.returncode, 0)
                self.assertNotIn("Traceback", ended.stderr)

    def test_document_names_every_control_and_fault(self):
        with open(DOCUMENT) as file:
            text = file.read()
        for word in (*CONTROLS, *FAULTS):
            with self.subTest(word):
                self.assertRegex(text, "`(fault )?%s[` ]" % re.escape(word))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
