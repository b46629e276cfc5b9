#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/common/RequirementSamples.h"
#include "tests/support/RecordingBlock.h"

#include <gtest/gtest.h>

namespace {

using support::asRequirement;
using support::Bytes;
using support::leafBytes;
using support::Lines;

std::string libCallCheck(const std::string& condition) {
    return "KST: AssertMacros: " + condition + " (value: 0x0),  file: common/LibCall:<n>\n";
}

std::string returning(const std::string& function) {
    return "KSTLib: " + function + ": returning, err = -3.\n";
}

/// A property as the enumeration gives it.
struct Enumerated {
    std::uint32_t id;
    std::ptrdiff_t offset;
    std::size_t length;
    bool operator==(const Enumerated&) const = default;
};

class RequirementObjects : public support::ChannelFixture {
  protected:
    static std::vector<Enumerated> enumerated(Bytes bytes) {
        std::vector<Enumerated> properties;
        EXPECT_EQ(KSTRequirementGetProperties(
                      asRequirement(bytes),
                      [&](std::uint32_t id, const void* data, std::size_t length) {
                          const auto* place = static_cast<const std::uint8_t*>(data);
                          properties.push_back({id, place - bytes.data(), length});
                      }),
                  0);
        return properties;
    }

    static std::vector<const KSTRequirement*> childrenOf(Bytes& bytes) {
        std::vector<const KSTRequirement*> children;
        KSTRequirementGetSubrequirements(
            asRequirement(bytes), [&](const KSTRequirement* child) { children.push_back(child); });
        EXPECT_EQ(KSTRequirementGetSubrequirementsCount(asRequirement(bytes)), children.size());
        return children;
    }

    Lines newLines() {
        Lines lines = logged();
        log.clear();
        return lines;
    }

    support::RecordingBlock block;
};

const Enumerated kType = {1, 0, 4};
const Enumerated kState = {2, 4, 4};
const Enumerated kPriority = {3, 8, 4};

} // namespace

TEST_F(RequirementObjects, Getters) {
    Bytes bytes = leafBytes(3, 68);
    EXPECT_EQ(KSTRequirementGetType(asRequirement(bytes)), 3U);
    EXPECT_EQ(KSTRequirementGetState(asRequirement(bytes)), 0x04040404U);
    EXPECT_EQ(KSTRequirementGetPriority(asRequirement(bytes)), 0x08080808U);
    const void* data = nullptr;
    std::size_t length = 0;
    EXPECT_EQ(KSTRequirementGetPropertyData(asRequirement(bytes), 302, &data, &length), 0);
    EXPECT_EQ(data, bytes.data() + 36);
    EXPECT_EQ(length, 16U);
    EXPECT_EQ(KSTRequirementGetProperty(asRequirement(bytes), 302, block), 0);
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls[0].bytes, Bytes(bytes.begin() + 36, bytes.begin() + 52));
    EXPECT_EQ(newLines(), Lines());
    EXPECT_EQ(printed(), "");
}

TEST_F(RequirementObjects, Enumeration) {
    using All = std::vector<Enumerated>;
    const All header = {kType, kState, kPriority};
    EXPECT_EQ(enumerated(leafBytes(1, 4)), (All{kType, kState, kPriority, {100, 16, 4}}));
    EXPECT_EQ(enumerated(leafBytes(2, 4)), (All{kType, kState, kPriority, {200, 16, 4}}));
    EXPECT_EQ(
        enumerated(leafBytes(3, 68)),
        (All{kType, kState, kPriority, {100, 16, 4}, {300, 20, 8}, {302, 36, 8}, {301, 52, 8}}));
    EXPECT_EQ(enumerated(leafBytes(7, 8)), (All{kType, kState, kPriority, {700, 16, 4}}));
    // 400 can be read and is not enumerated.
    EXPECT_EQ(enumerated(leafBytes(13, 32)), header);
    for (const std::uint32_t type : {0U, 4U, 5U, 6U, 8U, 12U, 16U, 17U, 1000U, 0xffffffffU}) {
        EXPECT_EQ(enumerated(leafBytes(type, 68)), header) << type;
    }
}

TEST_F(RequirementObjects, EnumerationLeavesOutWhatIsNotThere) {
    using Ids = std::vector<std::uint32_t>;
    const std::pair<std::uint32_t, Ids> byLength[] = {
        {0, {1, 2, 3}},
        {3, {1, 2, 3}},
        {4, {1, 2, 3, 100}},
        {11, {1, 2, 3, 100}},
        {12, {1, 2, 3, 100, 300}},
        {13, {1, 2, 3, 100, 300}},
        {27, {1, 2, 3, 100, 300}},
        {28, {1, 2, 3, 100, 300, 302}},
        {29, {1, 2, 3, 100, 300, 302}},
        {43, {1, 2, 3, 100, 300, 302}},
        {44, {1, 2, 3, 100, 300, 302, 301}},
        {45, {1, 2, 3, 100, 300, 302, 301}},
        {67, {1, 2, 3, 100, 300, 302, 301}},
        {68, {1, 2, 3, 100, 300, 302, 301}},
    };
    for (const auto& [length, expected] : byLength) {
        Ids ids;
        for (const Enumerated& property : enumerated(leafBytes(3, length))) {
            ids.push_back(property.id);
        }
        EXPECT_EQ(ids, expected) << length;
    }
}

TEST_F(RequirementObjects, WhatIsEnumeratedInPartIsReadOnlyAsAWhole) {
    const std::pair<std::uint32_t, std::size_t> wholeLengths[] = {{300, 20}, {302, 36}, {301, 68}};
    const void* data = nullptr;
    std::size_t length = 0;
    for (const auto& [id, whole] : wholeLengths) {
        Bytes bytes = leafBytes(3, static_cast<std::uint32_t>(whole - 1));
        EXPECT_EQ(KSTRequirementGetPropertyData(asRequirement(bytes), id, &data, &length), -3);
        EXPECT_EQ(data, nullptr) << id;
        bytes = leafBytes(3, static_cast<std::uint32_t>(whole));
        EXPECT_EQ(KSTRequirementGetPropertyData(asRequirement(bytes), id, &data, &length), 0);
        data = nullptr;
    }
}

TEST_F(RequirementObjects, ChildrenInOrder) {
    Bytes first = leafBytes(1);
    Bytes second = leafBytes(2);
    const std::vector<KSTRequirement*> children = {asRequirement(second), asRequirement(first),
                                                   asRequirement(second)};
    for (const std::uint32_t type : support::kCompositeTypes) {
        Bytes list = support::compositeInMemory(type, children);
        EXPECT_EQ(childrenOf(list),
                  (std::vector<const KSTRequirement*>(children.begin(), children.end())));
        // As far as there are slots, whatever the count says.
        for (const std::uint32_t count : {4U, 0xffffffffU}) {
            support::putU32(list, type == 7 ? 20 : 16, count);
            EXPECT_EQ(childrenOf(list).size(), 3U);
        }
        Bytes empty = support::compositeInMemory(type, {});
        EXPECT_TRUE(childrenOf(empty).empty());
        Bytes tooShort = support::requirementHeader(type, 3);
        tooShort.resize(19, 0xff);
        EXPECT_TRUE(childrenOf(tooShort).empty());
    }
    for (const std::uint32_t type : support::kLeafTypes) {
        Bytes leaf = leafBytes(type, 100);
        EXPECT_TRUE(childrenOf(leaf).empty());
    }
    // A slot that nothing was put into is handed over as it is.
    for (const std::uint32_t type : support::kCompositeTypes) {
        Bytes sparse = support::compositeInMemory(type, {nullptr, asRequirement(first), nullptr});
        EXPECT_EQ(childrenOf(sparse),
                  (std::vector<const KSTRequirement*>{nullptr, asRequirement(first), nullptr}));
    }
    Bytes inMemory = leafBytes(1000, 100);
    EXPECT_TRUE(childrenOf(inMemory).empty());
    EXPECT_EQ(newLines(), Lines());
}

TEST_F(RequirementObjects, Failures) {
    Bytes bytes = leafBytes(2, 4);
    const KSTRequirement* requirement = asRequirement(bytes);
    const void* data = nullptr;
    std::size_t length = 0;
    const std::string typeCheck = libCallCheck("requirement->type == kKSTRequirementTypeKofN");

    EXPECT_EQ(KSTRequirementGetPropertyData(requirement, 700, &data, &length), -3);
    EXPECT_EQ(newLines(), (Lines{typeCheck, returning("KSTRequirementGetPropertyData")}));
    EXPECT_EQ(KSTRequirementGetProperty(requirement, 700, block), -3);
    EXPECT_EQ(newLines(), (Lines{typeCheck, returning("KSTRequirementGetPropertyData"),
                                 failedCheck("err == 0 ", "0xfffffffffffffffd"),
                                 returning("KSTRequirementGetProperty")}));
    EXPECT_EQ(KSTRequirementGetProperty(nullptr, 1, nullptr), -3);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("requirement"), returning("KSTRequirementGetProperty")}));
    EXPECT_EQ(KSTRequirementGetProperty(requirement, 1, nullptr), -3);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("processProperty"), returning("KSTRequirementGetProperty")}));
    EXPECT_TRUE(block.calls.empty());

    EXPECT_EQ(KSTRequirementGetProperties(nullptr, nullptr), -3);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("requirement"), returning("KSTRequirementGetProperties")}));
    EXPECT_EQ(KSTRequirementGetProperties(requirement, nullptr), -3);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("processProperty"), returning("KSTRequirementGetProperties")}));

    KSTRequirementGetSubrequirements(nullptr, nullptr);
    KSTRequirementGetSubrequirements(requirement, nullptr);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("requirement"), failedCheck("processSubrequirement")}));

    EXPECT_EQ(KSTRequirementGetSubrequirementsCount(nullptr), 0U);
    EXPECT_EQ(newLines(), Lines{failedCheck("requirement")});

    EXPECT_EQ(KSTRequirementGetType(nullptr), 0U);
    EXPECT_EQ(KSTRequirementGetState(nullptr), 0U);
    EXPECT_EQ(KSTRequirementGetPriority(nullptr), 0U);
    EXPECT_EQ(newLines(), Lines(3, libCallCheck("requirement")));
}

TEST_F(RequirementObjects, EntriesAndReturnsAtLevel30) {
    Bytes bytes = leafBytes(4);
    kst::gLogLevel = 30;
    static_cast<void>(KSTRequirementGetType(asRequirement(bytes)));
    static_cast<void>(KSTRequirementGetProperties(asRequirement(bytes),
                                                  [](std::uint32_t, const void*, std::size_t) {}));
    KSTRequirementGetSubrequirements(asRequirement(bytes), [](const KSTRequirement*) {});
    static_cast<void>(KSTRequirementGetState(asRequirement(bytes)));
    static_cast<void>(KSTRequirementGetPriority(asRequirement(bytes)));
    const void* data = nullptr;
    std::size_t length = 0;
    static_cast<void>(KSTRequirementGetPropertyData(asRequirement(bytes), 1, &data, &length));
    EXPECT_EQ(newLines(), (Lines{
                              "KSTLib: KSTRequirementGetType: called.\n",
                              "KSTLib: KSTRequirementGetType: returning.\n",
                              "KSTLib: KSTRequirementGetProperties: called.\n",
                              "KSTLib: KSTRequirementGetProperties: returning, err = 0.\n",
                              "KSTLib: KSTRequirementGetSubrequirements: called.\n",
                              "KSTLib: KSTRequirementGetSubrequirements: returning.\n",
                              "KSTLib: KSTRequirementGetState: called.\n",
                              "KSTLib: KSTRequirementGetState: returning.\n",
                              "KSTLib: KSTRequirementGetPriority: called.\n",
                              "KSTLib: KSTRequirementGetPriority: returning.\n",
                              "KSTLib: KSTRequirementGetPropertyData: called.\n",
                              "KSTLib: KSTRequirementGetPropertyData: returning, err = 0.\n",
                          }));
    // What fails is told between the two.
    KSTRequirementGetSubrequirements(nullptr, nullptr);
    EXPECT_EQ(newLines(), (Lines{
                              "KSTLib: KSTRequirementGetSubrequirements: called.\n",
                              failedCheck("requirement"),
                              "KSTLib: KSTRequirementGetSubrequirements: returning.\n",
                          }));
}
