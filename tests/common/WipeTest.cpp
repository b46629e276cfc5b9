// How often memory is overwritten before it is freed. What overwrites it is replaced here by a
// function that does the same and keeps a note.

#include "KSTLib/Credential.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Serialization.h"
#include "tests/common/CredentialSamples.h"
#include "tests/common/ParameterPayloads.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

using support::Bytes;

struct Wipe {
    const void* memory;
    std::size_t size;
    bool operator==(const Wipe&) const = default;
};

using Wipes = std::vector<Wipe>;

Wipes* notes = nullptr;

/// What `work` overwrites, in order.
template <typename Work>
Wipes wipesOf(Work work) {
    Wipes wipes;
    wipes.reserve(100);
    notes = &wipes;
    work();
    notes = nullptr;
    return wipes;
}

class Wiping : public support::SerializationFixture {
  protected:
    void SetUp() override {
        SerializationFixture::SetUp();
        Bytes bytes = support::credentialBytes(2);
        ASSERT_EQ(CopyCredential(support::asCredential(bytes), &credential), 0);
    }

    void TearDown() override {
        if (credential != nullptr) {
            DeallocCredential(credential);
        }
        SerializationFixture::TearDown();
    }

    /// A payload that asks about the policy "p" with two parameters.
    static Bytes payload() {
        Bytes bytes(16);
        support::append(bytes, {'p', 0, 0, 0, 0, 0, 0, 2, 0, 0, 0});
        support::append(bytes, support::wireOf({{1, Bytes(4, 1)}, {2, Bytes(16, 2)}}));
        return bytes;
    }

    KSTStatus read(const Bytes& bytes) {
        KSTHandle handle{};
        std::uint8_t preflight = 0;
        std::uint32_t age = 0;
        return DeserializeVerifyPolicy(bytes.data(), bytes.size(), &handle, &policy, &preflight,
                                       &age, &parameters, &count);
    }

    KSTCredential* credential = nullptr;
    char* policy = nullptr;
    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
};

} // namespace

extern "C" void explicit_bzero(void* memory, std::size_t size) noexcept {
    auto* byte = static_cast<volatile std::uint8_t*>(memory);
    for (std::size_t i = 0; i < size; ++i) {
        byte[i] = 0;
    }
    if (notes != nullptr) {
        notes->push_back({memory, size});
    }
}

TEST_F(Wiping, CredentialTwiceInARow) {
    const Wipe whole{credential, 168};
    EXPECT_EQ(wipesOf([this] { DeallocCredential(credential); }), (Wipes{whole, whole}));
    credential = nullptr;
    ASSERT_EQ(LibCall_KSTCredentialCreate(2, &credential), 0);
    const Wipe made{credential, 168};
    EXPECT_EQ(wipesOf([this] { LibCall_KSTCredentialDelete(credential); }), (Wipes{made, made}));
    credential = nullptr;
}

TEST_F(Wiping, CredentialsOfAListTwiceAndTheListOnce) {
    Bytes bytes = {2, 0, 0, 0};
    support::append(bytes, support::credentialBytes(4));
    support::append(bytes, support::credentialBytes(12));
    KSTCredential** list = nullptr;
    ASSERT_EQ(DeserializeCredentialList(bytes.data(), bytes.size(), &list, &count), 0);
    const Wipe first{list[0], 32};
    const Wipe second{list[1], 40};
    const Wipe array{list, 16};
    EXPECT_EQ(wipesOf([&] { DeallocCredentialList(list, count); }),
              (Wipes{first, first, second, second, array}));
}

TEST_F(Wiping, CredentialThatIsCutShortTwice) {
    const Bytes bytes = support::credentialBytes(12);
    KSTCredential* none = nullptr;
    std::size_t consumed = 0;
    const Wipes wipes =
        wipesOf([&] { EXPECT_EQ(DeserializeCredential(bytes.data(), 39, &none, &consumed), -3); });
    ASSERT_GE(wipes.size(), 2U);
    EXPECT_EQ(wipes.end()[-1], wipes.end()[-2]);
    EXPECT_EQ(wipes.back().size, 40U);
}

TEST_F(Wiping, ParametersAndTheirValuesTwiceThePolicyOnce) {
    ASSERT_EQ(read(payload()), 0);
    const Wipe first{parameters[0].parameterData, 4};
    const Wipe second{parameters[1].parameterData, 16};
    const Wipe array{parameters, 2 * sizeof(KSTParameter)};
    EXPECT_EQ(wipesOf([this] { DeallocParameters(parameters, count); }),
              (Wipes{first, first, second, second, array, array}));
    const Wipe text{policy, 2};
    EXPECT_EQ(wipesOf([this] { DeallocDataBlob(policy, 2); }), Wipes{text});
}

TEST_F(Wiping, WhatAFailedReaderHadReadLikewise) {
    Bytes bytes = payload();
    bytes.pop_back();
    Wipes wipes = wipesOf([&] { EXPECT_EQ(read(bytes), -3); });
    ASSERT_FALSE(wipes.empty());
    const Wipe text = wipes.back();
    EXPECT_EQ(text.size, 2U);
    while (!wipes.empty() && wipes.back() == text) {
        wipes.pop_back();
    }
    ASSERT_GE(wipes.size(), 4U);
    EXPECT_EQ(wipes.end()[-1], wipes.end()[-2]);
    EXPECT_EQ(wipes.end()[-1].size, 2 * sizeof(KSTParameter));
    EXPECT_EQ(wipes.end()[-3], wipes.end()[-4]);
    EXPECT_EQ(wipes.end()[-3].size, 4U);
}
