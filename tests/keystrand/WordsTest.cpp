// The words that clients have for what the kernel side says, against the kernel side.

#include "KSTLib/Words.h"

#include "keystrand/DispatchTable.h"
#include "keystrand/Evaluation.h"
#include "keystrand/PolicyRequirement.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <regex>
#include <set>
#include <string>

namespace keystrand {
namespace {

namespace fs = std::filesystem;

std::string contentOf(const fs::path& file) {
    std::ifstream stream(file);
    EXPECT_TRUE(stream.is_open()) << file;
    return {std::istreambuf_iterator<char>(stream), {}};
}

/// Statuses with their meaning, as the page of the socket lists them.
std::map<KSTStatus, std::string> statusesOfThePage() {
    const std::string page = contentOf(fs::path(SOURCE_ROOT) / "docs/kernel-socket.md");
    const std::regex row(R"(\n\| +(-6\d\d\d) \| (.*?) +\|(?=\n))");
    std::map<KSTStatus, std::string> statuses;
    for (std::sregex_iterator match(page.begin(), page.end(), row), end; match != end; ++match) {
        statuses[std::stoi((*match)[1])] = (*match)[2];
    }
    return statuses;
}

TEST(KernelWords, EveryStatusOfThePageHasItsWords) {
    const auto statuses = statusesOfThePage();
    ASSERT_GE(statuses.size(), 14U);
    for (const auto& [status, meaning] : statuses) {
        EXPECT_EQ(KSTStatusText(status), meaning) << status;
    }
}

// A status of the kernel side is a name that clients have too; the page has all of them.
TEST(KernelWords, EveryStatusOfTheKernelSideIsNamed) {
    const fs::path root = SOURCE_ROOT;
    const std::string header = contentOf(root / "KSTLib/Words.h");
    const std::regex named(R"(kKSTKernelError\w+ = (-\d+))");
    std::set<KSTStatus> names;
    for (std::sregex_iterator match(header.begin(), header.end(), named), end; match != end;
         ++match) {
        names.insert(std::stoi((*match)[1]));
    }
    std::set<KSTStatus> listed;
    for (const auto& [status, meaning] : statusesOfThePage()) {
        listed.insert(status);
    }
    EXPECT_EQ(names, listed);

    const std::regex number(R"(-[678]\d\d\d\b)");
    for (const char* const room : {"keystrand", "keystrand-sim"}) {
        for (const auto& file : fs::recursive_directory_iterator(root / room)) {
            if (file.is_regular_file()) {
                EXPECT_FALSE(std::regex_search(contentOf(file.path()), number))
                    << file.path() << " has a status without a name";
            }
        }
    }
}

TEST(KernelWords, EveryLeafHasItsWordsAndItsCredential) {
    const std::string none = KSTRequirementTypeText(0);
    std::set<std::string> texts;
    for (const LeafType& leaf : leafTypes()) {
        EXPECT_NE(KSTRequirementTypeText(leaf.requirement), none) << leaf.name;
        EXPECT_EQ(KSTCredentialTypeForRequirementType(leaf.requirement), leaf.credential)
            << leaf.name;
        texts.insert(KSTRequirementTypeText(leaf.requirement));
    }
    EXPECT_EQ(texts.size(), leafTypes().size());
    for (const std::uint32_t composite :
         {kKSTRequirementTypeAnd, kKSTRequirementTypeOr, kKSTRequirementTypeKofN}) {
        EXPECT_EQ(KSTCredentialTypeForRequirementType(composite), 0U);
    }
    ASSERT_NE(findLeafType("never"), nullptr);
    EXPECT_EQ(findLeafType("never")->requirement, kKSTRequirementTypeNever);
}

TEST(KernelWords, StatesAndTheAgeLimitAreTheEvaluations) {
    EXPECT_EQ(static_cast<std::uint32_t>(Missing::State::absent), kKSTRequirementStateMissing);
    EXPECT_EQ(static_cast<std::uint32_t>(Missing::State::tooOld), kKSTRequirementStateTooOld);
    EXPECT_EQ(kNoAgeLimit, kKSTNoAgeLimit);
    EXPECT_STREQ(KSTRequirementStateText(0), KSTRequirementStateText(3));
    EXPECT_STREQ(KSTPassphrasePurposeText(0), "any purpose");
    EXPECT_STREQ(KSTPassphrasePurposeText(1), KSTPassphrasePurposeText(0xffffffff));
}

} // namespace
} // namespace keystrand
