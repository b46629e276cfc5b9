#include "KSTLib/Words.h"

#include "KSTLib/RequestSerialization.h"
#include "common/CredentialTypes.h"
#include "tests/KSTLib/InterfaceInC.h"
#include "wire/RequirementLayout.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <map>
#include <regex>
#include <set>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

constexpr std::uint32_t kHighestNumber = 1100;
constexpr KSTStatus kUnknownStatus = -9999;
constexpr int kLastErrno = 4095;

std::string contentOf(const fs::path& file) {
    std::ifstream stream(file);
    EXPECT_TRUE(stream.is_open()) << file;
    return {std::istreambuf_iterator<char>(stream), {}};
}

/// What a pattern's first group finds.
std::set<std::string> found(const std::string& text, const std::string& pattern) {
    const std::regex regex(pattern);
    std::set<std::string> words;
    for (std::sregex_iterator match(text.begin(), text.end(), regex), end; match != end; ++match) {
        words.insert((*match)[1]);
    }
    return words;
}

/// The numbers up to kHighestNumber that have a text of their own.
std::set<std::uint32_t> numbersWithWords(const std::function<const char*(std::uint32_t)>& words) {
    const std::string none = words(kHighestNumber + 1);
    std::set<std::uint32_t> numbers;
    for (std::uint32_t number = 0; number <= kHighestNumber; ++number) {
        if (words(number) != none) {
            numbers.insert(number);
        }
    }
    return numbers;
}

/// Errors by their names in the sources.
std::map<std::string, int> errorNumbers() {
    std::map<std::string, int> numbers = {{"EWOULDBLOCK", EWOULDBLOCK}};
    for (int error = 1; error < 200; ++error) {
        if (const char* name = ::strerrorname_np(error); name != nullptr) {
            numbers[name] = error;
        }
    }
    return numbers;
}

TEST(Words, EveryStatusOfTheLibraryHasAText) {
    const std::string header = contentOf(fs::path(SOURCE_ROOT) / "KSTLib/Status.h");
    const auto numbers = found(header, R"(kKSTError\w+ = (-?\d+))");
    ASSERT_GE(numbers.size(), 5U);
    std::set<std::string> texts;
    for (const std::string& number : numbers) {
        texts.insert(KSTStatusText(std::stoi(number)));
    }
    EXPECT_EQ(texts.size(), numbers.size());
    EXPECT_EQ(texts.count(KSTStatusText(kUnknownStatus)), 0U);
}

// What the connection's sources say an error is must have words of its own; what the system may say
// besides has at least the words of a connection that failed.
TEST(Words, EveryErrorThatTheConnectionNamesHasAText) {
    const std::set<std::string> sources = {"KernelSocketConnection.cpp", "LinuxKernelChannel.cpp",
                                           "LinuxServiceRegistry.cpp", "LocalConnection.cpp"};
    const auto numbers = errorNumbers();
    const std::string other = KSTStatusText(KST_STATUS_OF_ERRNO(kLastErrno));
    std::set<std::string> seen;
    std::size_t count = 0;
    for (const auto& file : fs::recursive_directory_iterator(fs::path(SOURCE_ROOT) / "platform")) {
        if (sources.count(file.path().filename()) == 0) {
            continue;
        }
        seen.insert(file.path().filename());
        for (const std::string& name : found(contentOf(file.path()), R"(\b(E[A-Z0-9]{3,})\b)")) {
            if (name == "EINTR") { // never the end of a call
                continue;
            }
            ASSERT_EQ(numbers.count(name), 1U) << name;
            EXPECT_NE(KSTStatusText(KST_STATUS_OF_ERRNO(numbers.at(name))), other) << name;
            ++count;
        }
    }
    EXPECT_EQ(seen, sources);
    EXPECT_GE(count, 12U);
}

TEST(Words, EveryErrnoIsAFailedConnection) {
    const std::string unknown = KSTStatusText(kUnknownStatus);
    EXPECT_EQ(KSTStatusText(KST_STATUS_OF_ERRNO(0)), unknown);
    for (int error = 1; error <= kLastErrno; ++error) {
        EXPECT_NE(KSTStatusText(KST_STATUS_OF_ERRNO(error)), unknown) << error;
    }
    EXPECT_EQ(KSTStatusText(KST_STATUS_OF_ERRNO(kLastErrno + 1)), unknown);
    EXPECT_EQ(KSTStatusText(1), unknown);
}

TEST(Words, ThePropertiesOfCredentialsAreTheLibrarys) {
    std::set<std::uint32_t> known;
    for (std::uint32_t id = 0; id <= kHighestNumber; ++id) {
        if (kst::findCredentialProperty(id) != nullptr) {
            known.insert(id);
        }
    }
    ASSERT_EQ(known.size(), 19U);
    EXPECT_EQ(numbersWithWords(KSTCredentialPropertyText), known);
    EXPECT_EQ(kKSTCredentialPropertyPassphrase, kst::kPassphraseProperty);
    EXPECT_EQ(kKSTCredentialPropertyIdentifier, kst::kIdentifierProperty);
}

TEST(Words, ThePropertiesOfRequirementsAreTheLibrarys) {
    std::set<std::uint32_t> known;
    for (const wire::RequirementProperty& property : wire::requirementProperties()) {
        known.insert(property.id);
    }
    ASSERT_EQ(known.size(), 10U);
    EXPECT_EQ(numbersWithWords(KSTRequirementPropertyText), known);
}

TEST(Words, TwoHundredIsTwoThings) {
    EXPECT_EQ(kKSTCredentialPropertyPassphrase, 200);
    EXPECT_EQ(kKSTRequirementPropertyPurpose, 200);
    EXPECT_STREQ(KSTCredentialPropertyText(200), "passphrase");
    EXPECT_STREQ(KSTRequirementPropertyText(200), "purpose that is asked for");
}

TEST(Words, TheTypesOfRequirementsAreThoseOnTheWire) {
    std::set<std::uint32_t> known = {kKSTRequirementTypeInMemory};
    for (std::uint32_t type = 0; type <= kHighestNumber; ++type) {
        if (wire::isWireType(type)) {
            known.insert(type);
        }
    }
    ASSERT_EQ(known.size(), 17U);
    EXPECT_EQ(numbersWithWords(KSTRequirementTypeText), known);
}

TEST(Words, TheTypesOfParametersAreThoseThatAreValid) {
    std::set<std::uint32_t> known;
    for (std::uint32_t type = 0; type <= kHighestNumber; ++type) {
        const std::vector<std::uint8_t> value(16);
        for (const std::uint32_t length : {0U, 4U, 16U}) {
            const KSTParameter parameter{type, length == 0 ? nullptr : value.data(), length};
            if (ValidateParameter(&parameter) == kKSTErrorSuccess) {
                known.insert(type);
            }
        }
    }
    ASSERT_EQ(known.size(), 8U);
    EXPECT_EQ(numbersWithWords(KSTParameterTypeText), known);
}

TEST(Words, CHasTheSameWords) {
    using Words = const char* (*)(std::uint32_t);
    const Words inCxx[] = {
        [](std::uint32_t number) { return KSTStatusText(static_cast<KSTStatus>(number)); },
        KSTCredentialPropertyText,
        KSTRequirementPropertyText,
        KSTPassphrasePurposeText,
        KSTRequirementStateText,
        KSTRequirementTypeText,
        KSTParameterTypeText,
    };
    static_assert(std::size(inCxx) == kWordTableCount);
    for (int table = 0; table < kWordTableCount; ++table) {
        for (std::uint32_t number = 0; number <= kHighestNumber; ++number) {
            EXPECT_STREQ(wordsInC(table, number), inCxx[table](number)) << table << ' ' << number;
        }
    }
    for (KSTStatus status = -6100; status < 0; ++status) {
        EXPECT_STREQ(wordsInC(0, static_cast<std::uint32_t>(status)), KSTStatusText(status));
    }
    for (std::uint32_t type = 0; type <= kHighestNumber; ++type) {
        EXPECT_EQ(credentialTypeForRequirementTypeInC(type),
                  KSTCredentialTypeForRequirementType(type));
    }
}

static_assert(*KSTStatusText(kKSTErrorSuccess) == 's', "words are constant expressions in C++");

} // namespace
