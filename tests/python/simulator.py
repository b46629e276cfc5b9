"""The kernel side of a test: keystrand-sim as it is installed, with policies of the test's."""
import os
import subprocess
import tempfile
from pathlib import Path

EXAMPLES = Path(os.environ["INSTALLED"], "usr/share/doc/python3-kstlib/examples")


class Simulator:
    """Runs within a with-block."""

    def __init__(self, policies: str = ""):
        self._policies = policies

    def __enter__(self):
        with tempfile.NamedTemporaryFile("w", suffix=".conf") as file:
            file.write(self._policies)
            file.flush()
            self._process = subprocess.Popen(
                ["keystrand-sim", "--policies", file.name], stdout=subprocess.PIPE, text=True
            )
            ready = self._process.stdout.readline()
        assert ready == "keystrand-sim: ready\n", ready
        return self

    def __exit__(self, *_):
        self._process.terminate()
        self._process.communicate(timeout=30)

    def ctl(self, *words):
        """What a command answers, in lines."""
        words = [str(word) for word in words]
        ended = subprocess.run(["keystrand-sim", "ctl", *words], capture_output=True, text=True, timeout=60)
        assert ended.returncode == 0, f"{words}: {ended.stderr}"
        return ended.stdout.splitlines()

    def credentials(self, handle=""):
        """Type and user of each credential of a context, or of the global one."""
        lines = [line.split() for line in self.ctl("credentials", *([handle] if handle else []))]
        return [(int(words[2]), words[6]) for words in lines]

    def commands(self):
        """The codes of the commands that arrived since the last `requests clear`."""
        return [int(line.split()[3]) for line in self.ctl("requests")]
