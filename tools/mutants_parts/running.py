"""Runs tests: all of them once, to learn which mutants each reaches, and then for each mutant those
that reach it, up to the first that fails."""

import concurrent.futures
import json
import mmap
import os
import re
import resource
import shutil
import signal
import subprocess
import tempfile
import time

from .building import LAST_NUMBER

MEMORY = 8 << 30
FILE_SIZE = 2 << 40


def limit():
    resource.setrlimit(resource.RLIMIT_AS, (MEMORY, MEMORY))
    resource.setrlimit(resource.RLIMIT_FSIZE, (FILE_SIZE, FILE_SIZE))
    resource.setrlimit(resource.RLIMIT_CORE, (0, 0))
    os.nice(5)


class Outcome:
    def __init__(self, status, output, seconds):
        self.status, self.output, self.seconds = status, output, seconds

    def last_test(self):
        """The one that failed, or in which the process ended."""
        failed = re.findall(r"(?m)^\[  FAILED  \] (\S+?),? ", self.output + " ")
        begun = re.findall(r"(?m)^\[ RUN      \] (\S+)", self.output)
        return failed[0] if failed else (begun[-1] if begun else None)


def run(program, names, seconds, mutant=0, reached=None):
    """Runs tests of a program; status None when the time is over."""
    environment = dict(os.environ, MUTANT=str(mutant), GTEST_BRIEF="0", GTEST_COLOR="no",
                       MALLOC_PERTURB_="165")  # Memory that was freed, or never written, is no zeros.
    if reached is not None:
        environment["MUTANTS_REACHED"] = reached
    private = tempfile.mkdtemp(prefix="mutants-")
    os.chmod(private, 0o755)  # Some tests become another user.
    environment["TMPDIR"] = private
    began = time.monotonic()
    output_file = os.path.join(private, "output")
    try:
        with open(output_file, "wb") as output:
            process = subprocess.Popen([program, "--gtest_fail_fast", "--gtest_filter=" + ":".join(names)],
                                       cwd=os.path.dirname(program), env=environment, stdin=subprocess.DEVNULL,
                                       stdout=output, stderr=subprocess.STDOUT, start_new_session=True,
                                       preexec_fn=limit)
        try:
            status = process.wait(seconds)
        except subprocess.TimeoutExpired:
            status = None
        # Whatever the test has left behind goes with it.
        try:
            os.killpg(process.pid, signal.SIGKILL)
        except ProcessLookupError:
            pass
        process.wait()
        with open(output_file, "rb") as output:
            text = output.read(1 << 20).decode("utf-8", "replace")
        return Outcome(status, text, time.monotonic() - began)
    finally:
        shutil.rmtree(private, ignore_errors=True)


class Tests:
    """What every test takes, and reaches; kept for each program until it is built anew."""

    def __init__(self, directory, programs, jobs=2):
        self.programs, self.jobs = programs, jobs
        self.file = os.path.join(directory, "tests.json")
        self.known = {}
        if os.path.exists(self.file):
            with open(self.file) as file:
                self.known = json.load(file)

    @staticmethod
    def names(program):
        listed = subprocess.run([program, "--gtest_list_tests"], cwd=os.path.dirname(program), check=True,
                                stdout=subprocess.PIPE, text=True, env=dict(os.environ, MUTANT="0")).stdout
        suite, found = "", []
        for line in listed.splitlines():
            words = line.split("#")[0].rstrip()
            if not words.startswith(" "):
                suite = words
            elif "DISABLED_" not in suite + words:
                found.append(suite + words.strip())
        return found

    def learn(self, say):
        with concurrent.futures.ThreadPoolExecutor(self.jobs) as pool:
            for program in self.programs:
                stamp = [os.stat(program).st_mtime_ns, os.stat(program).st_size]
                name = os.path.basename(program)
                if self.known.get(name, {}).get("stamp") == stamp:
                    continue
                tests = self.names(program)
                outcomes = list(pool.map(lambda test: self.learn_one(program, test), tests))
                good = {test: outcome for test, outcome in zip(tests, outcomes) if outcome is not None}
                whole = run(program, list(good), 600) if good else None
                self.known[name] = {"stamp": stamp, "tests": good, "together": bool(good) and whole.status == 0}
                failed = sorted(set(tests) - set(good))
                say(f"{name}: {len(good)} tests, {'together' if self.known[name]['together'] else 'each alone'}"
                    + (f"; left out, as they fail by themselves: {' '.join(failed)}" if failed else ""))
                with open(self.file, "w") as file:
                    json.dump(self.known, file)

    @staticmethod
    def learn_one(program, test):
        with tempfile.NamedTemporaryFile(prefix="mutants-reached-") as file:
            file.truncate(LAST_NUMBER)
            outcome = run(program, [test], 300, reached=file.name)
            if outcome.status != 0:
                return None
            with mmap.mmap(file.fileno(), LAST_NUMBER, access=mmap.ACCESS_READ) as reached:
                numbers = [match.start() for match in re.finditer(b"\x01", reached)]
        # What it costs among others in one process, however busy the machine is.
        own = re.search(r"(?m)^\[       OK \] .*\((\d+) ms\)", outcome.output)
        return {"seconds": outcome.seconds, "own": int(own[1]) / 1000 if own else outcome.seconds,
                "reached": numbers}

    def reaching(self):
        """For each mutant the tests that reach it: (own seconds, seconds, program, test)."""
        found = {}
        for program in self.programs:
            for test, what in self.known[os.path.basename(program)]["tests"].items():
                for number in what["reached"]:
                    found.setdefault(number, []).append((what["own"], what["seconds"], program, test))
        return found

    def runs_together(self, program):
        return self.known[os.path.basename(program)]["together"]


class Killer:
    """Tries one mutant. `budget` is how long the tests of one may take where nothing is changed."""

    FIRST, THEN = 8, 40

    def __init__(self, tests, budget):
        self.tests, self.budget = tests, budget

    def order(self, path, reaching):
        """Those that bear the source's name first, then the fast ones."""
        stem = os.path.splitext(os.path.basename(path))[0].lower()
        tests = sorted(reaching, key=lambda each: (stem not in each[3].lower(), each))
        seconds, kept = 0.0, []
        for each in tests:
            seconds += each[0]
            if seconds > self.budget and kept:
                break
            kept.append(each)
        return kept

    def verdict(self, number, path, reaching):
        """What killed it, or None; and how many tests were run."""
        tests = self.order(path, reaching)
        rounds = [tests[:self.FIRST], tests[self.FIRST:self.THEN], tests[self.THEN:]]
        for each in rounds:
            by_program = {}
            for _, seconds, program, test in each:
                by_program.setdefault(program, []).append((seconds, test))
            for program, batch in by_program.items():
                killed = self.together(number, program, batch) if self.tests.runs_together(program) \
                    else self.alone(number, program, batch)
                if killed is not None:
                    return killed, len(tests)
        return None, len(tests)

    def together(self, number, program, batch):
        patience = 10 * sum(seconds for seconds, _ in batch) + 3
        outcome = run(program, [test for _, test in batch], patience, mutant=number)
        if outcome.status == 0:
            return None
        test = outcome.last_test()
        if outcome.status is None:
            return f"{test} hangs"
        # One test may trip over what another left; only one that fails alone counts.
        seconds = dict((name, took) for took, name in batch).get(test)
        if seconds is not None:
            killed = self.alone(number, program, [(seconds, test)])
            if killed is not None:
                return killed
        return self.alone(number, program, batch)

    @staticmethod
    def alone(number, program, batch):
        for seconds, test in batch:
            outcome = run(program, [test], 10 * seconds + 3, mutant=number)
            if outcome.status is None:
                return f"{test} hangs"
            if outcome.status != 0:
                return test if outcome.status > 0 else f"{test} crashes"
        return None
