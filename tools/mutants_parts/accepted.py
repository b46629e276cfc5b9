"""The list of mutants that stay, with the reasons."""

import os
import re


class Accepted:
    """Each paragraph of the file begins with its reason, in lines that start with "=" for mutants
    that no test can tell from the original, and with "?" for those that nobody has killed yet. The
    names of mutants follow, each on a line."""

    def __init__(self, path):
        self.path, self.equivalent, self.open = path, {}, {}
        if os.path.exists(path):
            with open(path) as file:
                self.read(file)

    def read(self, lines):
        reason, kind, in_names = "", None, False
        for number, line in enumerate(lines, 1):
            line = line.rstrip("\n")
            if not line.strip() or line.startswith("#"):
                in_names = True
            elif line[0] in "=?":
                if in_names or kind != line[0]:
                    reason = ""
                kind, in_names = line[0], False
                reason = (reason + " " + line[1:].strip()).strip()
            else:
                in_names = True
                if not reason or not re.match(r"\S+: .*: \S+: ", line):
                    raise SystemExit(f"{self.path}:{number}: no mutant's name under a reason: {line}")
                (self.equivalent if kind == "=" else self.open)[line] = reason

    def is_equivalent(self, name):
        return name in self.equivalent

    def is_listed(self, name):
        return name in self.equivalent or name in self.open

    def without(self, names):
        return [name for name in (*self.equivalent, *self.open) if name not in names]
