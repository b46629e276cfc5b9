#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/RequirementSerialization.h"
#include "base/Concat.h"
#include "kstctl/decode/Decoded.h"
#include "kstctl/decode/Decoders.h"
#include "wire/RequirementLayout.h"

#include <cstring>

namespace kstctl::decode {

namespace {

/// How deep a tree is shown. Each level of a report is one of its writers' stack frames, too.
constexpr std::size_t kMaxDepth = 100;

const char* requirementTypeText(std::uint32_t type) {
    switch (type) {
    case kKSTRequirementTypePasscodeValidated:
        return "passcode validated";
    case kKSTRequirementTypePassphraseEntered:
        return "passphrase entered";
    case kKSTRequirementTypeBiometryMatched:
        return "biometry matched";
    case kKSTRequirementTypeAnd:
        return "all of";
    case kKSTRequirementTypeOr:
        return "any of";
    case kKSTRequirementTypeKofN:
        return "k of n";
    case kKSTRequirementTypeUserOutputDisplayed:
        return "user output displayed";
    default:
        return "";
    }
}

void addProperties(Report& report, const KSTRequirement& node) {
    for (const wire::RequirementProperty& property : wire::requirementProperties()) {
        if (property.type == wire::RequirementProperty::kEveryType || !property.belongsTo(&node) ||
            !property.fitsIn(&node)) {
            continue;
        }
        const Bytes bytes(property.in(&node), property.length);
        std::uint32_t number = 0;
        if (bytes.size() == sizeof number) {
            std::memcpy(&number, bytes.data(), sizeof number);
            report.add(base::concat("property", property.id), number);
        } else {
            report.add(base::concat("property", property.id), hexText(bytes));
        }
    }
}

Report fieldsAtDepth(const KSTRequirement& node, std::size_t depth) {
    Report report;
    report.add("type", node.type, requirementTypeText(node.type))
        .add("state", node.state)
        .add("priority", node.priority)
        .add("dataLength", node.dataLength);
    addProperties(report, node);
    if (wire::findCompositeLayout(node.type) == nullptr) {
        const auto* const data = reinterpret_cast<const std::uint8_t*>(&node) + sizeof node;
        report.add("data", hexText({data, node.dataLength}));
        return report;
    }
    if (depth == kMaxDepth) {
        report.add("children", Report::Unknown{"too deep to be shown"});
        return report;
    }
    Data children;
    for (std::uint32_t i = 0; i < wire::childCount(&node); ++i) {
        children.emplace_back(fieldsAtDepth(*wire::childAt(&node, i), depth + 1));
    }
    report.add("children", std::move(children));
    return report;
}

} // namespace

Result decodeRequirement(Bytes bytes, Secrets /*secrets*/) {
    KSTRequirement* made = nullptr;
    std::size_t size = 0;
    if (auto refusal = refusalOf("a requirement", [&] {
            return DeserializeRequirement(bytes.data(), bytes.size(), &made, &size);
        })) {
        return *std::move(refusal);
    }
    const Received<KSTRequirement> tree(made, DeallocRequirement);
    return Decoded{fieldsAtDepth(*tree, 1), size};
}

Result decodeContextProperty(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    KSTContextProperty property = 0;
    if (auto refusal = refusalOf("the payload that asks for a property of a context", [&] {
            return DeserializeGetContextProperty(bytes.data(), bytes.size(), &handle, &property);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {}, .size = sizeof handle + sizeof property};
    decoded.fields.add("handle", hexText(handle.bytes)).add("property", property);
    return decoded;
}

} // namespace kstctl::decode
