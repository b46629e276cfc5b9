// Replays the corpus of the fuzz target that this is linked with, without a fuzzer.

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace {

std::vector<std::uint8_t> contentOf(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    EXPECT_TRUE(file) << path;
    return {std::istreambuf_iterator<char>(file), {}};
}

// A fuzz target ends the process when anything is wrong.
TEST(CORPUS_TEST, EveryFileOfTheCorpusHolds) {
    std::size_t files = 0;
    for (const auto& entry : std::filesystem::directory_iterator(CORPUS)) {
        SCOPED_TRACE(entry.path());
        const std::vector<std::uint8_t> content = contentOf(entry.path());
        EXPECT_EQ(LLVMFuzzerTestOneInput(content.data(), content.size()), 0);
        ++files;
    }
    EXPECT_GT(files, 0U);
}

} // namespace
