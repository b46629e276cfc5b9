#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/Credential.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Requirement.h"

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

/// What the codecs write: the same values for all of them.
namespace bench {

using Bytes = std::vector<std::uint8_t>;

/// An entered passphrase, as long as it may be: nothing in the record is left unused.
struct SampleCredential {
    KSTCredential header;
    KSTCredentialDataPassphraseEntered data;
};
static_assert(sizeof(SampleCredential) == 32 + 136);

[[nodiscard]] SampleCredential sampleCredential();

/// A requirement as a program has it that uses no library.
struct SampleRequirement {
    std::uint32_t type = 0;
    std::uint32_t state = 0;
    std::uint32_t priority = 0;
    /// Of a kKSTRequirementTypeKofN.
    std::uint32_t k = 0;
    /// Of a leaf.
    Bytes data = {};
    std::vector<SampleRequirement> children = {};
};

/// 20 nodes, 4 levels, every kind of composite, leaves with the data of their types.
[[nodiscard]] SampleRequirement sampleRequirement();

struct SampleParameter {
    KSTParameterType type;
    Bytes value;
};

struct SampleQuestion {
    KSTHandle handle;
    std::string policy;
    bool preflight;
    std::uint32_t maxGlobalCredentialAge;
    std::vector<SampleParameter> parameters;
};

/// A policy with as many parameters as there may be, of every type that has a value.
[[nodiscard]] SampleQuestion sampleQuestion();

struct DeallocTree {
    void operator()(KSTRequirement* tree) const;
};
using Tree = std::unique_ptr<KSTRequirement, DeallocTree>;

/// The bytes of a requirement on the wire, made by hand.
[[nodiscard]] Bytes wireBytes(const SampleRequirement& requirement);

/// The tree that stands at the start of `bytes`; throws when none does.
[[nodiscard]] Tree treeOf(const Bytes& bytes);

} // namespace bench
