"""The example on a terminal: what it shows, when it ends, and that nothing of a passphrase stays in its memory."""
import contextlib
import gzip
import os
import pty
import re
import select
import subprocess
import sys
import tempfile
import termios
import textwrap
import unittest

from simulator import EXAMPLES, Simulator

PAGE = next(EXAMPLES.parent.glob("python.md*"))
PROGRAM = EXAMPLES / "verify_policy.py"
PASSPHRASE = b"correct horse battery staple"
# Also a copy that is not whole is one too many.
PARTS = [PASSPHRASE[place : place + 10] for place in (0, 9, 18)]

POLICIES = (EXAMPLES / "policies.conf").read_text() + """
policy both = all-of(passphrase(purpose=1), passphrase(purpose=2))
policy others = passphrase(purpose=1, user=4242)
"""

# Nothing is given back, so no copy that was freed is overwritten before it can be found.
HOARDING = """
#include <malloc.h>
#include <stdlib.h>
#include <string.h>
void free(void* memory) { (void)memory; }
void* realloc(void* before, size_t size) {
    void* now = malloc(size);
    if (before && now) {
        const size_t length = malloc_usable_size(before);
        memcpy(now, before, length < size ? length : size);
    }
    return now;
}
"""

# Runs the example in this process, says that it has ended, and waits for a line.
RUNNER = """
import runpy, sys
{before}
del sys.argv[0]
status = 0
try:
    runpy.run_path(sys.argv[0], run_name="__main__")
except SystemExit as ended:
    status = ended.code
except KeyboardInterrupt:
    status = "an interrupt"
print("ended with", status, flush=True)
sys.stdin.readline()
"""

# What leaves a copy: one that is made and dropped, and getpass.
COPYING = """
import kstlib
wipe = kstlib.Passphrase.wipe
def copy_and_wipe(passphrase):
    bytes(passphrase._bytes)
    wipe(passphrase)
kstlib.Passphrase.wipe = copy_and_wipe
"""
GETPASS = """
import getpass, kstlib, sys
kstlib.Passphrase(bytearray(getpass.getpass().encode())).wipe()
print("ended", flush=True)
sys.stdin.readline()
"""


class Terminal:
    """A program on a terminal of its own."""

    def __init__(self, *command):
        self.process, self._terminal = pty.fork()
        if self.process == 0:
            environment = {**os.environ, "PYTHONMALLOC": "malloc", "LD_PRELOAD": os.path.abspath("hoarding.so")}
            os.execve(sys.executable, [sys.executable, *command], environment)
        self.shown = ""

    def read_until(self, text):
        while text not in self.shown:
            data = self._read()
            assert data, f"{text!r} does not come after {self.shown!r}"
            self.shown = (self.shown + data).replace("\r\n", "\n")
        before, _, self.shown = self.shown.partition(text)
        return before + text

    def _read(self):
        """What is shown next; nothing when the program has ended."""
        ready, _, _ = select.select([self._terminal], [], [], 30)
        assert ready, f"still waiting after {self.shown!r}"
        try:
            return os.read(self._terminal, 4096).decode()
        except OSError:
            return ""

    def type(self, data):
        os.write(self._terminal, data)

    @property
    def echoes(self):
        return bool(termios.tcgetattr(self._terminal)[3] & termios.ECHO)

    def is_in_memory(self, *parts):
        with open(f"/proc/{self.process}/maps") as maps, open(f"/proc/{self.process}/mem", "rb", 0) as memory:
            for line in maps:
                start, end = (int(place, 16) for place in line.split()[0].split("-"))
                if not line.split()[1].startswith("rw"):
                    continue  # nothing is stored there
                memory.seek(start)
                data = memory.read(end - start)
                if any(part in data for part in parts):
                    return True
        return False

    def end(self):
        """The status with which the program ends."""
        while self._read():
            pass
        os.close(self._terminal)
        return os.waitstatus_to_exitcode(os.waitpid(self.process, 0)[1])


class ExampleTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.enterClassContext(contextlib.chdir(cls.enterClassContext(tempfile.TemporaryDirectory())))
        compiler = ["cc", "-shared", "-fPIC", "-fno-builtin", "-x", "c", "-", "-o", "hoarding.so"]
        subprocess.run(compiler, input=HOARDING, text=True, check=True)
        cls.sim = cls.enterClassContext(Simulator(POLICIES))

    def run_story(self, policy, *purposes, before="", ended):
        """What the example shows while somebody enters these passphrases, and whether one is left in memory."""
        terminal = Terminal("-c", RUNNER.format(before=before), str(PROGRAM), policy)
        shown = ""
        for purpose in purposes:
            shown += terminal.read_until(f"adding a passphrase for purpose {purpose}\npassphrase: ")
            if not before:
                self.assertFalse(terminal.echoes)
            terminal.type(PASSPHRASE + b"\n")
        shown += terminal.read_until(f"ended with {ended}\n")
        self.assertTrue(terminal.echoes)
        is_left = terminal.is_in_memory(*PARTS)
        self.assertTrue(terminal.is_in_memory(policy.encode()), "what is there is found")
        terminal.type(b"\n")
        self.assertEqual(terminal.end(), 0)
        self.assertEqual(self.sim.ctl("contexts"), [])
        return shown, is_left

    def test_story(self):
        shown, is_left = self.run_story("both", 1, 2, ended=0)
        self.assertEqual(
            shown,
            "asking about the policy both\nnot satisfied, missing:\n"
            "  all of\n    a passphrase for purpose 1\n    a passphrase for purpose 2\n"
            "adding a passphrase for purpose 1\npassphrase: \nadding a passphrase for purpose 2\npassphrase: \n"
            "asking about the policy both\nsatisfied\nended with 0\n",
        )
        self.assertFalse(is_left, "nothing of the passphrase is left")

    def test_it_stops_when_nothing_changes(self):
        shown, is_left = self.run_story("others", 1, ended=1)
        asked = "asking about the policy others\nnot satisfied, missing:\n  a passphrase for purpose 1\n"
        added = "adding a passphrase for purpose 1\npassphrase: \n"
        self.assertEqual(shown, f"{asked}{added}{asked}ended with 1\n")
        self.assertFalse(is_left)
        shown, _ = self.run_story("com.example.retired", ended=1)
        asked = "asking about the policy com.example.retired\nnot satisfied, missing:\n  what no credential gives\n"
        self.assertEqual(shown, f"{asked}{asked}ended with 1\n")

    def test_what_is_left_is_found(self):
        _, is_left = self.run_story("unlock", 1, before=COPYING, ended=0)
        self.assertTrue(is_left)

    def test_getpass_leaves_a_copy(self):
        terminal = Terminal("-c", GETPASS)
        terminal.read_until("Password: ")
        terminal.type(PASSPHRASE + b"\n")
        terminal.read_until("ended\n")
        self.assertTrue(terminal.is_in_memory(*PARTS), "as the module's pages say")
        terminal.type(b"\n")
        self.assertEqual(terminal.end(), 0)

    def test_failures(self):
        terminal = Terminal(str(PROGRAM), "unheard.of")
        terminal.read_until("verify_policy: KSTContextVerifyPolicyEx: no such policy (status -6013)\n")
        self.assertEqual(terminal.end(), 1)
        terminal = Terminal(str(PROGRAM))
        terminal.read_until("usage: verify_policy.py POLICY\n")
        self.assertEqual(terminal.end(), 2)

    def test_interrupted_on_the_terminal(self):
        terminal = Terminal("-c", RUNNER.format(before=""), str(PROGRAM), "unlock")
        terminal.read_until("passphrase: ")
        terminal.type(PASSPHRASE)
        terminal.type(b"\x03")
        terminal.read_until("ended with an interrupt\n")
        self.assertTrue(terminal.echoes)
        self.assertFalse(terminal.is_in_memory(*PARTS))
        terminal.type(b"\n")
        self.assertEqual(terminal.end(), 0)

    def test_first_program_of_the_page(self):
        page = gzip.open(PAGE, "rt").read() if PAGE.suffix == ".gz" else PAGE.read_text()
        program, shown = re.search(r"```python\n(.*?)```\n\n(.*?)\n\n", page, re.S).groups()
        self.assertLessEqual(len([line for line in program.splitlines() if line]), 15)
        terminal = Terminal("-c", program)
        terminal.read_until("a passphrase for purpose 1\na passphrase for purpose 1: ")
        terminal.type(PASSPHRASE + b"\n")
        terminal.read_until("\nsatisfied\n")
        self.assertEqual(terminal.end(), 0)
        self.assertEqual(
            textwrap.dedent(shown), "a passphrase for purpose 1\na passphrase for purpose 1: \nsatisfied"
        )

    def test_it_fits_on_a_screen(self):
        lines = PROGRAM.read_text().splitlines()
        start = next(number for number, line in enumerate(lines) if line.startswith("def satisfy"))
        length = lines[start:].index("")
        self.assertLessEqual(length, 15)
        self.assertLessEqual(len(lines), 50)


if __name__ == "__main__":
    unittest.main()
