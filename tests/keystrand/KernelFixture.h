#pragma once

#include "KSTLib/AllocatedBytes.h"
#include "keystrand/Commands.h"
#include "keystrand/PolicyRequirement.h"
#include "tests/keystrand/Credentials.h"

#include <gtest/gtest.h>

#include <string>

namespace keystrand::test {

/// The commands on a state whose contexts have the handles 1, 2, 3, ... and whose clock stands
/// still.
class KernelFixture : public testing::Test {
  protected:
    void TearDown() override {
        kernel_.contexts = ContextTable();
        kernel_.globalCredentials = CredentialSet();
        EXPECT_EQ(gAllocatedBytes, allocatedBefore_);
    }

    static ByteVector handle(std::uint64_t number) { return Bytes().u64(number).u64(0); }
    static inline const ByteVector kNoHandle = ByteVector(16);

    [[nodiscard]] CommandResult result(std::uint32_t code, const ByteVector& payload,
                                       std::size_t offered = 4096) const {
        return commands_.run(code, payload, offered);
    }
    [[nodiscard]] KernelStatus run(std::uint32_t code, const ByteVector& payload) const {
        return result(code, payload).status;
    }

    /// Makes a context with the next handle.
    void createContext() { ASSERT_EQ(run(1, {}), 0); }

    void definePolicies(const std::string& text) {
        TextParser parser(text);
        auto policies = parsePolicies(parser);
        ASSERT_TRUE(policies) << parser.error()->reason;
        kernel_.policies.set(std::move(*policies));
    }

    /// The types of the credentials of a context, or of the global ones.
    [[nodiscard]] std::vector<std::uint32_t> typesIn(const CredentialSet& set) const {
        std::vector<std::uint32_t> types;
        for (const auto& member : set.members()) {
            types.push_back(member.credential->type);
        }
        return types;
    }
    [[nodiscard]] std::vector<std::uint32_t> own(std::uint64_t number) {
        KSTHandle wanted{};
        const ByteVector bytes = handle(number);
        std::copy(bytes.begin(), bytes.end(), wanted.bytes);
        return typesIn(kernel_.contexts.find(wanted)->credentials);
    }
    [[nodiscard]] std::vector<std::uint32_t> global() const {
        return typesIn(kernel_.globalCredentials);
    }

  private:
    std::int64_t allocatedBefore_ = gAllocatedBytes;
    std::uint64_t lastHandle_ = 0;

  protected:
    CredentialSet::Seconds now_ = 1000;
    KernelState kernel_{.registry = {},
                        .environment = {},
                        .contexts = ContextTable([this] {
                            KSTHandle made{};
                            const ByteVector bytes = handle(++lastHandle_);
                            std::copy(bytes.begin(), bytes.end(), made.bytes);
                            return std::optional(made);
                        }),
                        .globalCredentials = {},
                        .policies = {},
                        .logLevel = 40};
    DispatchTable controls_;
    DispatchTable commands_ = makeCommands(
        kernel_, [this] { return now_; }, controls_);
};

using Types = std::vector<std::uint32_t>;

} // namespace keystrand::test
