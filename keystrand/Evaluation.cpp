#include "keystrand/Evaluation.h"

#include "KSTLib/RequirementSerialization.h"
#include "base/ByteWriter.h"
#include "wire/RequirementLayout.h"

#include <algorithm>
#include <cassert>
#include <memory>
#include <new>
#include <span>
#include <utility>

namespace keystrand {

namespace {

using Member = CredentialSet::Member;

/// How well a credential meets a leaf, better ones last.
enum class Fit { no, tooOld, yes };

struct Match {
    Fit fit = Fit::no;
    const KSTCredential* credential = nullptr;
};

template <typename Wanted, typename Actual>
bool agrees(const std::optional<Wanted>& wanted, const Actual& actual) {
    return !wanted || *wanted == actual;
}

Fit fitOf(const PolicyRequirement& leaf, const Member& member, std::uint32_t ageLimit,
          const Situation& situation) {
    const KSTCredential& credential = *member.credential;
    const auto& user = leaf.user ? leaf.user : situation.user;
    if (credential.type != leaf.type->credential || !agrees(user, credential.userId) ||
        !agrees(leaf.purpose, purposeOf(credential))) {
        return Fit::no;
    }
    const auto age = situation.now - std::min(member.addedAt, situation.now);
    return ageLimit == kNoAgeLimit || age <= ageLimit ? Fit::yes : Fit::tooOld;
}

void lookIn(const CredentialSet& set, const PolicyRequirement& leaf, std::uint32_t ageLimit,
            const Situation& situation, Match& best) {
    for (const Member& member : set.members()) {
        const Fit fit = fitOf(leaf, member, ageLimit, situation);
        if (fit > best.fit) {
            best = {.fit = fit, .credential = member.credential.get()};
        }
    }
}

Match bestMatch(const PolicyRequirement& leaf, const Situation& situation) {
    const std::uint32_t ageLimit = leaf.maxAge.value_or(kNoAgeLimit);
    Match best;
    lookIn(situation.own, leaf, ageLimit, situation, best);
    if (situation.maxGlobalAge > 0) {
        lookIn(situation.global, leaf, std::min(ageLimit, situation.maxGlobalAge), situation, best);
    }
    return best;
}

std::optional<Missing> missingLeaf(const PolicyRequirement& leaf, const Situation& situation) {
    const Fit fit = bestMatch(leaf, situation).fit;
    if (fit == Fit::yes) {
        return std::nullopt;
    }
    Missing missing;
    missing.requirement = &leaf;
    missing.state = fit == Fit::tooOld ? Missing::State::tooOld : Missing::State::absent;
    return missing;
}

/// Appends what the requirement, which is met, uses up.
void collect(const PolicyRequirement& requirement, const Situation& situation,
             std::vector<const KSTCredential*>& used) {
    if (requirement.kind == PolicyRequirement::Kind::leaf) {
        if (requirement.once) {
            used.push_back(bestMatch(requirement, situation).credential);
        }
        return;
    }
    std::uint32_t left = requirement.needed;
    for (const PolicyRequirement& child : requirement.children) {
        if (left > 0 && !whatIsMissing(child, situation)) {
            collect(child, situation, used);
            --left;
        }
    }
}

} // namespace

std::optional<Missing> whatIsMissing(const PolicyRequirement& requirement,
                                     const Situation& situation) {
    if (requirement.kind == PolicyRequirement::Kind::leaf) {
        return missingLeaf(requirement, situation);
    }
    Missing missing;
    missing.requirement = &requirement;
    for (const PolicyRequirement& child : requirement.children) {
        if (auto missingChild = whatIsMissing(child, situation)) {
            missing.children.push_back(std::move(*missingChild));
        }
    }
    const std::size_t met = requirement.children.size() - missing.children.size();
    if (met >= requirement.needed) {
        return std::nullopt;
    }
    missing.needed = requirement.needed - static_cast<std::uint32_t>(met);
    return missing;
}

std::vector<const KSTCredential*> whatIsUsedUp(const PolicyRequirement& requirement,
                                               const Situation& situation) {
    std::vector<const KSTCredential*> used;
    collect(requirement, situation, used);
    return used;
}

namespace {

std::uint32_t typeOf(const PolicyRequirement& requirement) {
    switch (requirement.kind) {
    case PolicyRequirement::Kind::allOf:
        return kKSTRequirementTypeAnd;
    case PolicyRequirement::Kind::anyOf:
        return kKSTRequirementTypeOr;
    case PolicyRequirement::Kind::someOf:
        return kKSTRequirementTypeKofN;
    case PolicyRequirement::Kind::leaf:
        return requirement.type->requirement;
    case PolicyRequirement::Kind::always:
        break;
    }
    // What is always met is never missing.
    return 0;
}

/// Requirements that go together.
class Nodes {
  public:
    /// A node whose data are zeros.
    KSTRequirement* make(const Missing& missing, std::size_t dataLength) {
        constexpr std::size_t kWord = sizeof(std::uint64_t);
        auto& memory = memory_.emplace_back(std::make_unique<std::uint64_t[]>(
            (sizeof(KSTRequirement) + dataLength + kWord - 1) / kWord));
        return new (memory.get()) KSTRequirement{
            .type = typeOf(*missing.requirement),
            .state = static_cast<std::uint32_t>(missing.state),
            .priority = missing.requirement->priority,
            .dataLength = static_cast<std::uint32_t>(dataLength),
        };
    }

  private:
    std::vector<std::unique_ptr<std::uint64_t[]>> memory_;
};

base::ByteWriter dataOf(KSTRequirement* node) {
    return {reinterpret_cast<std::uint8_t*>(node + 1), node->dataLength};
}

/// The first number of a leaf's data.
std::uint32_t leafNumber(const PolicyRequirement& leaf) {
    return leaf.type->requirement == kKSTRequirementTypePassphraseEntered
               ? leaf.purpose.value_or(0)
               : leaf.maxAge.value_or(kNoAgeLimit);
}

bool beginsWithNumber(const PolicyRequirement& leaf) {
    return leaf.type->requirement <= kKSTRequirementTypeBiometryMatched;
}

KSTRequirement* buildLeaf(const Missing& missing, Nodes& nodes) {
    const PolicyRequirement& leaf = *missing.requirement;
    KSTRequirement* const node = nodes.make(missing, leaf.type->dataSize);
    if (beginsWithNumber(leaf)) {
        [[maybe_unused]] const bool fits = dataOf(node).writeU32(leafNumber(leaf));
        assert(fits);
    }
    return node;
}

KSTRequirement* build(const Missing& missing, Nodes& nodes) {
    if (missing.requirement->kind == PolicyRequirement::Kind::leaf) {
        return buildLeaf(missing, nodes);
    }
    const auto count = static_cast<std::uint32_t>(missing.children.size());
    const auto& layout = *wire::findCompositeLayout(typeOf(*missing.requirement));
    KSTRequirement* const node =
        nodes.make(missing, wire::compositeSize(layout, count) - sizeof(KSTRequirement));
    base::ByteWriter writer = dataOf(node);
    [[maybe_unused]] const bool fits =
        (node->type != kKSTRequirementTypeKofN || writer.writeU32(missing.needed)) &&
        writer.writeU32(count);
    assert(fits);
    for (std::uint32_t i = 0; i < count; ++i) {
        wire::setChildAt(node, i, build(missing.children[i], nodes));
    }
    return node;
}

} // namespace

std::vector<std::uint8_t> encodeMissing(const Missing& missing) {
    Nodes nodes;
    const KSTRequirement* const root = build(missing, nodes);
    std::size_t size = 0;
    [[maybe_unused]] KSTStatus status = GetSerializedRequirementSize(root, &size);
    assert(status == kKSTErrorSuccess);
    std::vector<std::uint8_t> bytes(size);
    status = SerializeRequirement(root, bytes.data(), &size);
    assert(status == kKSTErrorSuccess && size == bytes.size());
    return bytes;
}

} // namespace keystrand
