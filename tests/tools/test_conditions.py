#!/usr/bin/env python3
"""test_conditions.py TOOLS (list|measure): tools/conditions and its list, in seconds.

list: every entry of the list names a condition that stands in that function's source.
measure: a small program, of which the answer is known; ends with 77 when clang 19 is not there.
"""
import importlib.machinery
import importlib.util
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

TOOLS, PART = pathlib.Path(sys.argv.pop(1)), sys.argv.pop(1)
LOADER = importlib.machinery.SourceFileLoader("conditions", str(TOOLS / "conditions"))
conditions = importlib.util.module_from_spec(importlib.util.spec_from_loader("conditions", LOADER))
sys.dont_write_bytecode = True
LOADER.exec_module(conditions)

SOURCE = """
#include <optional>
#include <string>
#include <sys/stat.h>

namespace sample {
namespace {

bool both(int a, int b) { return a > 0 && b > 0; }
bool either(int a, int b, int c) { return a > 0 || (b > 0 && c > 0); }
std::optional<std::string> chosen(int a, int b) {
    return a > 0 && b > 0 ? std::optional<std::string>("x") : std::nullopt;
}
template <typename T> bool alone(T a) { if (a > 0) return true; return false; }
bool nested(int a, int b) { return a > 0 && !(b > 0 && b < 5); }
bool ofMacro(mode_t a) { return S_ISREG(a) && a > 1; }
struct Reader {
    bool read(int a) const { return [](auto one) { return one > 0 && one < 5; }(a); }
};
bool encodeBoth(int a, int b) { return a > 0 && b > 0; }

}
}

int main() {
    using namespace sample;
    both(1, 1); both(0, 1);
    either(0, 0, 1); either(1, 0, 0); either(0, 1, 1); either(0, 1, 0);
    chosen(1, 1); chosen(1, 0);
    alone(1); alone(0U);
    nested(1, 1); nested(0, 0); nested(1, 7);
    ofMacro(S_IFREG); ofMacro(S_IFDIR);
    Reader().read(1); Reader().read(7);
    encodeBoth(0, 0);
}
"""
OPEN = [("sample::both", "b > 0"), ("sample::chosen", "a > 0"), ("sample::ofMacro", "a > 1"),
        ("sample::Reader::read", "one > 0")]


class ListTest(unittest.TestCase):
    def test_every_entry_is_in_the_sources(self):
        scope = conditions.Scope(place for places in conditions.DECODERS.values() for place in places)
        for file, function, text in conditions.listed():
            self.assertTrue(scope.holds(file, function), (file, function))
            source = " ".join((conditions.ROOT / file).read_text().split())
            self.assertIn(function.rsplit("::", 1)[-1], source)
            self.assertIn(text, source)

    def test_every_source_of_the_table_is_there(self):
        for places in conditions.DECODERS.values():
            for place in places:
                self.assertTrue((conditions.ROOT / place.partition(":")[0]).is_file(), place)


class MeasureTest(unittest.TestCase):
    def setUp(self):
        self.directory = tempfile.TemporaryDirectory()
        self.addCleanup(self.directory.cleanup)
        conditions.ROOT = conditions.BUILD = pathlib.Path(self.directory.name)
        self.source = conditions.ROOT / "sample.cpp"
        self.source.write_text(SOURCE)

    def run_there(self, *command):
        subprocess.run(command, check=True, cwd=self.directory.name, stderr=subprocess.DEVNULL,
                       env=dict(os.environ, LLVM_PROFILE_FILE="sample.profraw"))

    def test_open_conditions_are_found(self):
        self.run_there(conditions.COMPILER, "-std=c++20", "-O0", "-fprofile-instr-generate",
                       "-fcoverage-mapping", "-fcoverage-mcdc", str(self.source), "-o", "sample")
        self.run_there("./sample")
        self.run_there(conditions.PROFDATA, "merge", "-sparse", "sample.profraw", "-o", "counters.profdata")
        functions = conditions.exported(["sample.cpp"], [conditions.ROOT / "sample"])
        found, unmeasured = conditions.conditions_of(functions, conditions.Scope(["sample.cpp", "other.cpp"]))
        self.assertEqual(sorted(OPEN), sorted((c.function, c.text) for c in found if not c.decides
                                              and c.function != "sample::nested"))
        self.assertEqual({("sample.cpp", "sample::nested", "a > 0")},
                         {what for what in unmeasured if what[-1] == "a > 0"})
        self.assertIn(("other.cpp", "is in no program"), unmeasured)
        self.assertNotIn("sample::encodeBoth", {c.function for c in found})
        self.assertIn(("sample::alone", True), {(c.function, c.decides) for c in found})


if PART == "measure" and shutil.which(conditions.COMPILER) is None:
    print(f"skipped: {conditions.COMPILER} is not there")
    sys.exit(77)
unittest.main(defaultTest={"list": "ListTest", "measure": "MeasureTest"}[PART], verbosity=2)
