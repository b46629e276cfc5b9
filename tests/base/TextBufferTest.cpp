#include "base/TextBuffer.h"

#include "tests/support/ChildProcess.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <new>
#include <string>
#include <sys/resource.h>
#include <utility>

namespace {

using base::TextBuffer;

TEST(TextBufferTest, NothingAtFirst) {
    const TextBuffer buffer;
    EXPECT_EQ(buffer.size(), 0U);
    EXPECT_EQ(buffer.view(), "");
}

TEST(TextBufferTest, GrowsByTextsAndCharacters) {
    TextBuffer buffer;
    buffer.append("ab");
    buffer.append('c');
    buffer.append("");
    buffer.append(std::string_view());
    buffer.append(std::string_view("\0d", 2));
    EXPECT_EQ(buffer.view(), std::string_view("abc\0d", 5));
    EXPECT_EQ(buffer.size(), 5U);
}

TEST(TextBufferTest, TextBetweenTwoCharacters) {
    TextBuffer buffer;
    buffer.append("ab", '"');
    buffer.append(std::string_view(), '|');
    buffer.append(std::string(100, 'x'), '\0');
    std::string expected = "\"ab\"||";
    expected.push_back('\0');
    expected.append(100, 'x');
    expected.push_back('\0');
    EXPECT_EQ(buffer.view(), expected);
}

TEST(TextBufferTest, WhatIsWrittenIntoItsRoom) {
    constexpr std::size_t kMost = 100;
    TextBuffer buffer;
    std::string expected;
    for (std::size_t used = 0; used <= kMost; ++used) {
        buffer.appendWritten(kMost, [used](char* place) {
            std::fill(place, place + kMost, static_cast<char>('a' + used % 26));
            return place + used;
        });
        expected.append(used, static_cast<char>('a' + used % 26));
        ASSERT_EQ(buffer.view(), expected);
    }
}

TEST(TextBufferTest, KeepsWhatIsThereWhileItGrows) {
    TextBuffer buffer;
    std::string expected;
    for (std::size_t i = 0; i < 2000; ++i) {
        const auto character = static_cast<char>('a' + i % 26);
        buffer.append(character);
        expected.push_back(character);
        ASSERT_EQ(buffer.view(), expected);
    }
    const std::string large(1 << 20, 'x');
    buffer.append(large);
    EXPECT_EQ(buffer.view(), expected + large);
}

TEST(TextBufferTest, FromTheHeapIntoPagesOfItsOwn) {
    constexpr std::size_t kLeastMapped = 256UL * 1024;
    for (const std::size_t size : {kLeastMapped - 1, kLeastMapped, kLeastMapped + 1}) {
        SCOPED_TRACE(size);
        TextBuffer buffer;
        std::string expected(size, 'x');
        buffer.append(expected);
        EXPECT_EQ(buffer.view(), expected);
        for (const std::size_t more : {std::size_t{1}, size, 4 * size}) {
            expected.append(more, 'y');
            buffer.append(std::string(more, 'y'));
            EXPECT_EQ(buffer.view(), expected);
        }
        buffer.truncate(1);
        const TextBuffer moved(std::move(buffer));
        EXPECT_EQ(moved.view(), "x");
    }
}

TEST(TextBufferTest, OneByteGoesAlongIntoPages) {
    TextBuffer buffer;
    buffer.append('x');
    const std::string large(1 << 20, 'y');
    buffer.append(large);
    EXPECT_EQ(buffer.view(), 'x' + large);
}

TEST(TextBufferTest, PagesAreGivenBack) {
    const auto pagesOfTheProcess = [] {
        std::size_t pages = 0;
        std::ifstream("/proc/self/statm") >> pages;
        return pages;
    };
    const std::string large(1 << 20, 'x');
    const std::size_t before = pagesOfTheProcess();
    for (int round = 0; round < 100; ++round) {
        TextBuffer buffer;
        buffer.append(large);
    }
    EXPECT_LT(pagesOfTheProcess(), before + 50 * large.size() / 4096);
}

#ifndef KSTD_SANITIZED // Which takes more addresses than any limit.
TEST(TextBufferTest, WantOfMemoryIsThrownAndLeavesTheText) {
    EXPECT_EQ(support::exitStatusOfChild([] {
                  constexpr rlim_t kMost = 1UL << 30U;
                  const rlimit limit{kMost, kMost};
                  TextBuffer buffer;
                  buffer.append("text");
                  const std::string piece(1 << 20, 'x');
                  std::size_t added = 0;
                  if (::setrlimit(RLIMIT_AS, &limit) != 0) {
                      return 1;
                  }
                  try {
                      for (; added <= kMost; added += piece.size()) {
                          buffer.append(piece);
                      }
                  } catch (const std::bad_alloc&) {
                      return buffer.size() == 4 + added && buffer.view().starts_with("textx") ? 0
                                                                                              : 2;
                  }
                  return 3;
              }),
              0);
}
#endif

TEST(TextBufferTest, ShortenedToEveryLength) {
    for (std::size_t size = 0; size <= 3; ++size) {
        TextBuffer buffer;
        buffer.append("abc");
        buffer.truncate(size);
        EXPECT_EQ(buffer.size(), size);
        buffer.append('z');
        EXPECT_EQ(buffer.view(), std::string("abc").substr(0, size) + 'z');
    }
}

TEST(TextBufferTest, MovedWithoutACopy) {
    TextBuffer from;
    from.append("text");
    const char* const characters = from.view().data();

    TextBuffer to(std::move(from));
    EXPECT_EQ(to.view(), "text");
    EXPECT_EQ(to.view().data(), characters);

    TextBuffer third;
    third.append("gone");
    third = std::move(to);
    EXPECT_EQ(third.view().data(), characters);
}

TEST(TextBufferTest, UsableAfterMoving) {
    TextBuffer from;
    from.append("text");
    const TextBuffer to = std::move(from);
    // NOLINTNEXTLINE(bugprone-use-after-move): empty is what it must be.
    EXPECT_EQ(from.view(), "");
    from.append("more");
    EXPECT_EQ(from.view(), "more");
    EXPECT_EQ(to.view(), "text");
}

} // namespace
