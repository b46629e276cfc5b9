#!/usr/bin/env python3
"""test_mutants.py TOOLS: the tool that makes mutants, on a tree of one source and one test program."""

import os
import subprocess
import sys
import tempfile
import unittest

TOOLS = sys.argv[1]

SOURCE = """#include "common/Tiny.h"

namespace tiny {

// Few enough, and room for one more.
bool fits(int count) {
    return count >= 0 && count < kMost;
}

void note(int* log, int count) {
    log[0] = count; // The first of two.
    log[1] = 7;
}

template <typename Number>
constexpr Number half(Number number) {
    return number / 2;
}

int spin(int count) {
    int left = half(count);
    while (left != 0) {
        left -= 1;
    }
    return left;
}

int asBit(int count) {
    switch (count) {
    case 5: return kBits[1];
    default: return kBits[0];
    }
}

constexpr int kWidth = 3 + 4;
static_assert(half(8) == 4);

void nobodyCalls(int* log) {
    note(log, kWidth);
}

} // namespace tiny
"""

HEADER = """#pragma once

namespace tiny {

inline constexpr int kMost = 10;
inline constexpr int kBits[] = {0, 1};

bool fits(int count);
void note(int* log, int count);
int spin(int count);
int asBit(int count);
void nobodyCalls(int* log);

} // namespace tiny
"""

# It reads its command line as GoogleTest does, without the seconds that its headers take.
TEST = r"""#include "common/Tiny.h"
#include <cstdio>
#include <cstring>

static bool limits() { return tiny::fits(0) && !tiny::fits(-1) && tiny::fits(5) && !tiny::fits(11); }
static bool notes() { int log[2] = {}; tiny::note(log, 3); return log[0] == 3; }
static bool spins() { return tiny::spin(9) == 0; }
static bool bits() { return tiny::asBit(5) == 1 && tiny::asBit(6) == 0; }

int main(int, char** arguments) {
    const struct { const char* name; bool (*test)(); } tests[] = {
        {"Limits", limits}, {"Notes", notes}, {"Spins", spins}, {"Bits", bits}};
    bool good = true;
    if (std::strcmp(arguments[1], "--gtest_list_tests") == 0) std::puts("Tiny.");
    for (const auto& each : tests) {
        char whole[32];
        std::snprintf(whole, sizeof whole, "Tiny.%s", each.name);
        if (std::strcmp(arguments[1], "--gtest_list_tests") == 0) {
            std::printf("  %s\n", each.name);
        } else if (std::strstr(arguments[2], whole) != nullptr) {
            std::printf("[ RUN      ] %s\n", whole);
            if (!each.test()) { std::printf("[  FAILED  ] %s (0 ms)\n", whole); good = false; break; }
        }
    }
    return good ? 0 : 1;
}
"""

BUILD = """cmake_minimum_required(VERSION 3.25)
project(tiny LANGUAGES CXX)
set(CMAKE_CXX_STANDARD 20)
include_directories(${CMAKE_SOURCE_DIR})
add_executable(tiny_test tests/TinyTest.cpp common/Tiny.cpp)
set_target_properties(tiny_test PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/tests)
"""

# What no test notices: nothing asks for exactly 10, for log[1], for more of a half than that it gets
# smaller, or for what nobody calls. Two are the original in other words.
SURVIVORS = """common/Tiny.cpp
  7: fits: boundary: count < kMost -> count <= kMost
  7: fits: next-value: kMost -> the next of kMost
  12: note: drop-statement: log[1] = 7 -> nothing
  12: note: next-value: 7 -> the next of 7
  17: half: arithmetic: number / 2 -> number * 2
  17: half: next-value: 2 -> the next of 2
  17: half: return-nothing: return number / 2 -> return {}
  23: spin: next-value: 1 -> the next of 1
  25: spin: return-nothing: return left -> return {}
  31: asBit: return-nothing: return kBits[0] -> return {}
  39: nobodyCalls: drop-statement: note(log, kWidth) -> nothing  [no test comes here]
  39: nobodyCalls: next-value: kWidth -> the next of kWidth  [no test comes here]
"""

LIST = """# Comments are nobody's reason.

= The loop has left nothing,
= which is what is returned.
common/Tiny.cpp: spin: return-nothing: return left -> return {}
common/Tiny.cpp: asBit: return-nothing: return kBits[0] -> return {}

? To be tried.
common/Tiny.cpp: note: next-value: 7 -> the next of 7
"""


class MutantsTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.directory = tempfile.TemporaryDirectory()
        for path, text in {"common/Tiny.cpp": SOURCE, "common/Tiny.h": HEADER, "tests/TinyTest.cpp": TEST,
                           "CMakeLists.txt": BUILD}.items():
            cls.write(path, text)

    @classmethod
    def tearDownClass(cls):
        cls.directory.cleanup()

    @classmethod
    def write(cls, path, text):
        whole = os.path.join(cls.directory.name, path)
        os.makedirs(os.path.dirname(whole), exist_ok=True)
        with open(whole, "w", encoding="utf-8") as file:
            file.write(text)

    def mutants(self, *options):
        done = subprocess.run([os.path.join(TOOLS, "mutants"), "--root", self.directory.name,
                               "--programs", "tiny_test", *options], stdout=subprocess.PIPE, text=True)
        return done.returncode, done.stdout

    def setUp(self):
        self.write("tools/mutants-that-stay", "")

    def test_every_survivor_is_shown_by_its_place(self):
        status, text = self.mutants("--score", "57")
        self.assertEqual(status, 0)
        self.assertIn("tiny_test: 4 tests, together\n" + SURVIVORS, text)
        self.assertRegex(text, r"\ncommon +28 +28 +16 +0 +12 +57\.1%\n")

        # The verdicts are kept: no test is run for these.
        program = os.path.join(self.directory.name, "build/mutants/build/tests/tiny_test")
        os.chmod(program, 0)
        self.addCleanup(os.chmod, program, 0o755)
        status, text = self.mutants("--no-build", "--score", "58")
        self.assertEqual(status, 1)
        self.assertTrue(text.startswith(SURVIVORS), text)

        self.write("tools/mutants-that-stay", LIST)
        status, text = self.mutants("--report", "--score", "61")
        self.assertEqual(status, 0)
        self.assertNotIn("return left", text)
        self.assertNotIn("the next of 7", text)
        self.assertIn("log[1] = 7 -> nothing", text)
        self.assertRegex(text, r"\ncommon +28 +28 +16 +2 +10 +61\.5%\n")

        killed = "common/Tiny.cpp: note: drop-statement: log[0] = count -> nothing"
        self.write("tools/mutants-that-stay", LIST.replace("= The loop", f"= Not so.\n{killed}\n= The loop"))
        status, text = self.mutants("--report", "--score", "61")
        self.assertEqual(status, 1)
        self.assertIn(f"{killed}\n    is listed as equivalent, but Tiny.Notes kills it\n", text)

        gone = "common/Tiny.cpp: note: next-value: 8 -> the next of 8"
        self.write("tools/mutants-that-stay", LIST + gone + "\n")
        status, text = self.mutants("--report", "--score", "61")
        self.assertEqual(status, 1)
        self.assertIn(f"{gone}\n    is listed as one that stays, and there is no such mutant\n", text)

    def test_a_name_without_a_reason_is_refused(self):
        self.write("tools/mutants-that-stay", "common/Tiny.cpp: note: next-value: 7 -> the next of 7\n")
        status, _ = self.mutants("--report")
        self.assertEqual(status, 1)

    def test_a_place_names_a_room_a_source_or_a_pattern(self):
        for place, lines in (("common", 28), ("common/Tiny.cpp", 28), ("common/T*", 28)):
            status, text = self.mutants("--list", place)
            self.assertEqual((status, len(text.splitlines())), (0, lines))
        self.assertEqual(self.mutants("--list", "wire")[0], 1)

    def test_what_is_the_same_from_either_side_is_not_turned_round(self):
        self.write("common/Sides.cpp", """#include <utility>
int less(int left, int right);
int saturatingAdd(int left, int right);
int both(int a, int b) {
    int sum = 0;
    std::swap(a, b);
    if (__builtin_add_overflow(a, b, &sum)) { return saturatingAdd(a, b); }
    return less(a, b);
}
""")
        self.addCleanup(os.remove, os.path.join(self.directory.name, "common/Sides.cpp"))
        status, text = self.mutants("--list", "common/Sides.cpp")
        self.assertEqual(status, 0)
        self.assertEqual([line for line in text.splitlines() if "swap-arguments" in line],
                         ["common/Sides.cpp: both: swap-arguments: less(a, b) -> less(b, a)"])

    def test_a_sample_is_the_same_each_time(self):
        first, second, other = (self.mutants("--list", "--every", "3", "--seed", seed)[1] for seed in "112")
        self.assertEqual(first, second)
        self.assertNotEqual(first, other)
        self.assertLess(len(first.splitlines()), 20)


unittest.main(argv=sys.argv[:1])
