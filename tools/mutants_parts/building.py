"""Keeps a copy of the tree in which the sources of the rooms hold all of their mutants, and builds it."""

import concurrent.futures
import hashlib
import json
import os
import re
import shlex
import subprocess
import sys

from . import source
from .rewriting import Rewriting

ROOMS = {
    "KSTLib": ["KSTLib"],
    "common": ["common"],
    "wire": ["wire"],
    "base": ["base"],
    "kstd": ["kstd"],
    "codecs": ["platform/formats", "platform/Value.cpp", "platform/ValueBuilder.cpp", "platform/ValueSink.cpp"],
}
BLOCK = 64  # Numbers are given in blocks, so that an edit in one source renumbers no other.
LAST_NUMBER = 1 << 20
HERE = os.path.dirname(os.path.realpath(__file__))


def read(path):
    with open(path, "rb") as file:
        return file.read()


def write_if_different(path, content, mode=None):
    if os.path.isfile(path) and not os.path.islink(path) and read(path) == content:
        return
    os.makedirs(os.path.dirname(path), exist_ok=True)
    if os.path.lexists(path):
        os.remove(path)
    with open(path, "wb") as file:
        file.write(content)
    if mode is not None:
        os.chmod(path, mode)


def room_of(path):
    for room, places in ROOMS.items():
        if any(path == place or path.startswith(place + "/") for place in places):
            return room
    return "others"


def analyse(task):
    root, path, arguments = task
    os.chdir(root)
    return [(point.start, point.end, point.form, [tuple(change) for change in point.changes])
            for point in source.points_of(path, arguments)]


class Build:
    """`root` is the tree, `directory` what this tool may write in."""

    def __init__(self, root, directory, jobs=2):
        self.root, self.directory, self.jobs = root, directory, jobs
        self.tree = os.path.join(directory, "tree")
        self.binary = os.path.join(directory, "build")
        self.state_file = os.path.join(directory, "numbers.json")
        self.state = {"blocks": {}, "uncompilable": []}
        if os.path.exists(self.state_file):
            with open(self.state_file) as file:
                self.state = json.load(file)
        self.rewritings = {}
        os.makedirs(directory, exist_ok=True)

    def save(self):
        write_if_different(self.state_file, json.dumps(self.state, indent=0).encode())

    # Sources

    def files_of_tree(self):
        """Every file of the tree; without git, every one that is not hidden or built."""
        listed = subprocess.run(["git", "ls-files", "-z", "--cached", "--others", "--exclude-standard"],
                                cwd=self.root, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
        if listed.returncode == 0:
            files = listed.stdout.decode().split("\0")
        else:
            files = []
            for directory, inner, names in os.walk(self.root):
                inner[:] = [each for each in inner if not each.startswith(".") and each != "build"]
                files += [os.path.relpath(os.path.join(directory, name), self.root) for name in names]
        return [each for each in files if each and os.path.lexists(os.path.join(self.root, each))]

    def sources(self, files):
        """The product's own, but for the headers that belong to clients as well, which C has to read."""
        listed = os.path.join(self.root, "KSTLib/shared/public-headers")
        public = set(read(listed).decode().split()) if os.path.exists(listed) else set()
        return [path for path in files if room_of(path) != "others" and re.search(r"\.(cpp|h)$", path)
                and path not in public and "/shared/" not in path and not path.endswith("main.cpp")]

    def arguments(self):
        packages = subprocess.check_output(
            ["pkg-config", "--cflags", "libsystemd", "sqlite3", "libcrypto", "libplist-2.0"], text=True).split()
        return ["-xc++", "-std=c++20", "-I.", "-w", *packages, "-resource-dir", source.resource_directory()]

    def definitions(self):
        """What the build defines for each source."""
        listed = os.path.join(self.binary, "compile_commands.json")
        commands = json.loads(read(listed)) if os.path.exists(listed) else []
        return {os.path.relpath(each["file"], self.tree):
                [word for word in shlex.split(each["command"]) if word.startswith("-D")] for each in commands}

    def find_points(self, paths):
        """The points of each source; those of a source that has not changed are kept from before."""
        kept_file = os.path.join(self.directory, "points.json")
        kept = json.loads(read(kept_file)) if os.path.exists(kept_file) else {}
        program = read(os.path.join(HERE, "source.py"))
        points, tasks = {}, {}
        arguments, definitions = self.arguments(), self.definitions()
        with concurrent.futures.ProcessPoolExecutor(self.jobs) as pool:
            for path in paths:
                stamp = hashlib.sha256(program + self.texts[path]).hexdigest()
                if path in kept and kept[path][0] == stamp:
                    points[path] = kept[path]
                else:
                    task = (self.root, path, arguments + definitions.get(path, []))
                    tasks[pool.submit(analyse, task)] = path, stamp
            try:
                for task in concurrent.futures.as_completed(tasks):
                    path, stamp = tasks[task]
                    points[path] = stamp, task.result()
            finally:
                # What is known is kept, even when another source does not compile.
                pool.shutdown(cancel_futures=True)
                write_if_different(kept_file, json.dumps({**kept, **points}).encode())
        for path in paths:
            if read(os.path.join(self.root, path)) != self.texts[path]:
                raise SystemExit(f"mutants: {path} has changed meanwhile; once more, please")
        return {path: [source.Point(start, end, form, shared(changes)) for start, end, form, changes in each]
                for path, (_, each) in points.items()}

    def numbers(self, path):
        """Of every mutant of the source that can be compiled."""
        names = list(self.rewritings[path].mutants)
        block = self.state["blocks"].get(path)
        if block is None or block[1] < len(names):
            begin = max((start + size for start, size in self.state["blocks"].values()), default=1)
            block = [begin, (len(names) // BLOCK + 2) * BLOCK]
            if sum(block) >= LAST_NUMBER:
                raise SystemExit(f"mutants: no numbers are left; remove {self.directory}")
            self.state["blocks"][path] = block
        uncompilable = set(self.state["uncompilable"])
        return {name: block[0] + index for index, name in enumerate(names) if name not in uncompilable}

    def mutants(self):
        """Every mutant of the build: its number and what it is."""
        return {number: self.rewritings[path].mutants[name]
                for path in self.rewritings for name, number in self.numbers(path).items()}

    def copy(self):
        """The tree as it is. A source stays as it was written here, if it was."""
        files = self.files_of_tree()
        sources, kept = set(self.sources(files)), set(files)
        for path in files:
            from_, to = os.path.join(self.root, path), os.path.join(self.tree, path)
            if path in sources and os.path.exists(to):
                continue
            if os.path.islink(from_):
                if not os.path.lexists(to):
                    os.makedirs(os.path.dirname(to), exist_ok=True)
                    os.symlink(os.readlink(from_), to)
            elif os.path.isfile(from_):
                write_if_different(to, read(from_), os.stat(from_).st_mode & 0o777)
        for directory, _, names in os.walk(self.tree):
            for name in names:
                path = os.path.relpath(os.path.join(directory, name), self.tree)
                if path not in kept:
                    os.remove(os.path.join(directory, name))

    def rewrite(self):
        """Knows all mutants, as the build has them."""
        paths = self.sources(self.files_of_tree())
        self.texts = {path: read(os.path.join(self.root, path)) for path in paths}
        for path, points in self.find_points(paths).items():
            self.rewritings[path] = Rewriting(path, self.texts[path].decode("latin-1"), points)

    def write(self, path):
        text = self.rewritings[path].write(self.numbers(path))
        write_if_different(os.path.join(self.tree, path), text.encode("latin-1"))

    # Compiling

    def configure(self):
        # An element behind the end and the value of an optional without one are crashes.
        flags = f"-w -Wno-c++11-narrowing -D_GLIBCXX_ASSERTIONS -include {HERE}/Mutants.h"
        runtime = os.path.join(self.directory, "Mutants.o")
        subprocess.run(["clang++", "-std=c++20", "-O1", "-fPIC", f"-I{HERE}/../..", "-c", os.path.join(HERE, "Mutants.cpp"),
                        "-o", runtime], check=True)
        subprocess.run(["cmake", "--no-warn-unused-cli", "-S", self.tree, "-B", self.binary, "-G", "Ninja",
                        "-DCMAKE_C_COMPILER=clang", "-DCMAKE_CXX_COMPILER=clang++", "-DCMAKE_BUILD_TYPE=Debug",
                        "-DCMAKE_CXX_FLAGS_DEBUG=-O0 -g0", f"-DCMAKE_CXX_FLAGS={flags}",
                        f"-DCMAKE_EXE_LINKER_FLAGS={runtime}", f"-DCMAKE_SHARED_LINKER_FLAGS={runtime}",
                        "-DKSTD_BENCHMARKS=OFF", "-DCMAKE_EXPORT_COMPILE_COMMANDS=ON"], check=True, stdout=subprocess.DEVNULL)

    def drop_blamed(self, output):
        """Takes out the mutants that the compiler refuses. How many there were."""
        blamed = set()
        places = re.compile(r"(?m)^(\S+?):(\d+):(\d+): (?:fatal )?(error|note):")
        in_error = False
        for path, line, column, kind in places.findall(output):
            path = os.path.relpath(os.path.join(self.binary, path), self.tree)
            in_error = in_error or kind == "error"
            if path not in self.rewritings or not in_error:
                continue
            numbers = self.numbers(path)
            names = {number: name for name, number in numbers.items()}
            found = self.rewritings[path].blamed(int(line), int(column))
            blamed |= {names[number] for number in found if number in names}
            in_error = False
        self.state["uncompilable"] = sorted(set(self.state["uncompilable"]) | blamed)
        self.save()
        for path in self.rewritings:
            self.write(path)
        return len(blamed)

    def check_headers(self):
        """Alone, before everything else that would be compiled again for each of their mistakes."""
        headers = [path for path in self.rewritings if path.endswith(".h")]

        def written():
            return hashlib.sha256(b"".join(read(os.path.join(self.tree, path)) for path in sorted(
                path for path in self.rewritings if path.endswith(".h")))).hexdigest()

        if self.state.get("headers") == written():
            return
        arguments = [each for each in self.arguments() if each != "-w"]
        command = ["clang++", *arguments[:2], f"-I{self.tree}", *arguments[3:-2], "-w", "-Wno-c++11-narrowing",
                   "-ferror-limit=0", "-include", os.path.join(HERE, "Mutants.h"), "-fsyntax-only"]
        with concurrent.futures.ThreadPoolExecutor(self.jobs) as pool:
            def complaints(path):
                return subprocess.run(command + [os.path.join(self.tree, path)], stderr=subprocess.PIPE,
                                      text=True).stderr
            while headers:
                outputs = list(pool.map(complaints, headers))
                if not self.drop_blamed("\n".join(outputs)):
                    break
                headers = [path for path, output in zip(headers, outputs) if output]
        self.state["headers"] = written()
        self.save()

    def compile(self, targets):
        while True:
            done = subprocess.run(["ninja", "-C", self.binary, "-k", "0", f"-j{self.jobs}", "--quiet", *targets],
                                  stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)
            if done.returncode == 0:
                return
            dropped = self.drop_blamed(done.stdout)
            print(f"mutants: {dropped} cannot be compiled", file=sys.stderr, flush=True)
            if not dropped:
                sys.stderr.write(done.stdout[-6000:])
                raise SystemExit("mutants: the copy does not compile")

    def make(self, targets):
        self.copy()
        self.configure()
        self.rewrite()
        for path in self.rewritings:
            self.write(path)
        self.check_headers()
        self.save()
        self.compile(targets)
        self.save()


def shared(changes):
    return [source.Change(*change) for change in changes]
