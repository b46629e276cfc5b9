#include "KSTLib/LibCall.h"
#include "KSTLib/RequirementSerialization.h"
#include "tests/common/RequirementSamples.h"

#include <gtest/gtest.h>

namespace {

using support::asRequirement;
using support::Bytes;
using support::leafBytes;

struct Property {
    std::uint32_t id;
    std::uint32_t type;
    /// In the whole node.
    std::size_t offset;
    std::size_t length;
    std::string typeCheck;
};

const std::string kIs = "requirement->type == ";

const std::vector<Property> kProperties = {
    {100, 1, 16, 4, kIs + "kKSTRequirementTypeBiometryMatched"},
    {100, 3, 16, 4, kIs + "kKSTRequirementTypeBiometryMatched"},
    {200, 2, 16, 4, kIs + "kKSTCredentialTypePassphraseEntered"},
    {300, 3, 16 + 4, 16, kIs + "kKSTRequirementTypeBiometryMatched"},
    {301, 3, 16 + 36, 32, kIs + "kKSTRequirementTypeBiometryMatched"},
    {302, 3, 16 + 20, 16, kIs + "kKSTRequirementTypeBiometryMatched"},
    {400, 13, 16, 32, kIs + "kKSTRequirementTypeUserOutputDisplayed"},
    {700, 7, 16, 4, kIs + "kKSTRequirementTypeKofN"},
};

constexpr std::uint32_t kUnknownIds[] = {0,   4,   99,  101, 199, 201,        299,       303,
                                         399, 401, 500, 699, 701, 0x80000000, 0xffffffff};

class RequirementProperties : public support::SerializationFixture {
  protected:
    static std::string libCallCheck(const std::string& condition) {
        return "KST: AssertMacros: " + condition + " (value: 0x0),  file: common/LibCall:<n>\n";
    }

    void expectRefused(Bytes& bytes, std::uint32_t id, const std::string& condition) {
        const void* data = this;
        std::size_t length = 4711;
        EXPECT_EQ(LibCall_KSTRequirementGetPropertyData(asRequirement(bytes), id, &data, &length),
                  -3);
        EXPECT_EQ(data, this);
        EXPECT_EQ(length, 4711U);
        expectLogged({libCallCheck(condition)});
        printedLines += "KST: LibCall_KSTRequirementGetPropertyData: returning, err = -3.\n";
    }

    static void expectFound(Bytes& bytes, std::uint32_t id, std::size_t offset,
                            std::size_t length) {
        const void* data = nullptr;
        std::size_t found = 0;
        EXPECT_EQ(LibCall_KSTRequirementGetPropertyData(asRequirement(bytes), id, &data, &found),
                  0);
        EXPECT_EQ(data, bytes.data() + offset);
        EXPECT_EQ(found, length);
    }

    void TearDown() override {
        EXPECT_EQ(printed(), printedLines);
        SerializationFixture::TearDown();
    }

    std::string printedLines;
};

KSTStatus unusedTransport(void* /*transportContext*/, std::uint32_t /*code*/,
                          std::uint32_t /*thirdByte*/, const void* /*inData*/,
                          std::size_t /*inSize*/, void* /*outData*/, std::size_t* /*outSize*/) {
    ADD_FAILURE() << "nothing is to be sent";
    return 0;
}

} // namespace

TEST_F(RequirementProperties, HeaderOfEveryType) {
    for (const std::uint32_t type : {0U, 1U, 4U, 7U, 16U, 17U, 1000U, 0xffffffffU}) {
        Bytes bytes = leafBytes(type);
        EXPECT_EQ(LibCall_KSTRequirementGetType(asRequirement(bytes)), type);
        EXPECT_EQ(LibCall_KSTRequirementGetState(asRequirement(bytes)), 0x04040404U);
        EXPECT_EQ(LibCall_KSTRequirementGetPriority(asRequirement(bytes)), 0x08080808U);
        expectFound(bytes, 1, 0, 4);
        expectFound(bytes, 2, 4, 4);
        expectFound(bytes, 3, 8, 4);
    }
    expectLogged({});
}

TEST_F(RequirementProperties, NullRequirement) {
    const void* data = nullptr;
    std::size_t length = 0;
    EXPECT_EQ(LibCall_KSTRequirementGetType(nullptr), 0U);
    EXPECT_EQ(LibCall_KSTRequirementGetState(nullptr), 0U);
    EXPECT_EQ(LibCall_KSTRequirementGetPriority(nullptr), 0U);
    EXPECT_EQ(LibCall_KSTRequirementGetPropertyData(nullptr, 1, &data, &length), -3);
    expectLogged(support::Lines(4, libCallCheck("requirement")));
    Bytes bytes = leafBytes(1);
    EXPECT_EQ(LibCall_KSTRequirementGetPropertyData(asRequirement(bytes), 1, nullptr, &length), -3);
    EXPECT_EQ(LibCall_KSTRequirementGetPropertyData(asRequirement(bytes), 1, &data, nullptr), -3);
    expectLogged({libCallCheck("data"), libCallCheck("data")});
    for (int i = 0; i < 3; ++i) {
        printedLines += "KST: LibCall_KSTRequirementGetPropertyData: returning, err = -3.\n";
    }
}

TEST_F(RequirementProperties, EveryPropertyAndShorterData) {
    for (const Property& property : kProperties) {
        SCOPED_TRACE(testing::Message() << property.id << " of type " << property.type);
        const auto end = static_cast<std::uint32_t>(property.offset + property.length - 16);
        for (const std::uint32_t length : {end, end + 1}) {
            Bytes bytes = leafBytes(property.type, length);
            expectFound(bytes, property.id, property.offset, property.length);
        }
        for (const std::uint32_t length : {0U, end - 1}) {
            Bytes bytes = leafBytes(property.type, length);
            expectRefused(bytes, property.id, "offset + length <= requirement->dataLength");
        }
    }
}

TEST_F(RequirementProperties, TypesWithoutTheProperty) {
    for (const Property& property : kProperties) {
        for (std::uint32_t type = 0; type <= 17; ++type) {
            if (type == property.type || (property.id == 100 && (type == 1 || type == 3))) {
                continue;
            }
            SCOPED_TRACE(testing::Message() << property.id << " of type " << type);
            Bytes bytes = leafBytes(type, 68);
            expectRefused(bytes, property.id, property.typeCheck);
        }
    }
}

TEST_F(RequirementProperties, UnknownProperties) {
    Bytes bytes = leafBytes(3, 68);
    for (const std::uint32_t id : kUnknownIds) {
        expectRefused(bytes, id, "0");
    }
}

TEST_F(RequirementProperties, Delete) {
    const Bytes bytes = support::compositeBytes(5, {leafBytes(1), leafBytes(2, 3)});
    KSTRequirement* tree = nullptr;
    std::size_t consumed = 0;
    ASSERT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), 0);
    EXPECT_EQ(LibCall_KSTRequirementDelete(nullptr, tree), -3);
    EXPECT_EQ(LibCall_KSTRequirementDelete(unusedTransport, nullptr), -3);
    EXPECT_EQ(LibCall_KSTRequirementDelete(nullptr, nullptr), -3);
    expectLogged(
        {libCallCheck("transport"), libCallCheck("requirement"), libCallCheck("transport")});
    for (int i = 0; i < 3; ++i) {
        printedLines += "KST: LibCall_KSTRequirementDelete: returning, err = -3.\n";
    }
    EXPECT_EQ(LibCall_KSTRequirementDelete(unusedTransport, tree), 0);
}
