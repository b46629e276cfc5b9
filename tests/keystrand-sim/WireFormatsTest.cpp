// Every example of docs/wire-formats.md: made by the code from what the document says about it, and
// read by the end that it is sent to.

#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Platform.h"
#include "KSTLib/Serialization.h"
#include "base/Concat.h"
#include "common/ContextObject.h"
#include "keystrand-sim/ControlArguments.h"
#include "tests/keystrand-sim/WireExamples.h"
#include "tests/keystrand/CommandChannel.h"
#include "tests/keystrand/KernelFixture.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScriptedRegistry.h"

#include <cstring>
#include <map>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

/// A requirement with the properties of its type and its children.
std::string describe(const KSTRequirement* requirement) {
    std::string text = std::to_string(KSTRequirementGetType(requirement));
    EXPECT_EQ(KSTRequirementGetProperties(
                  requirement,
                  [&](std::uint32_t id, const void* data, std::size_t length) {
                      if (id >= 100) {
                          const auto* bytes = static_cast<const std::uint8_t*>(data);
                          text += base::concat(" ", id, "=", toHexWord({bytes, length}));
                      }
                  }),
              0);
    KSTRequirementGetSubrequirements(
        requirement, [&](const KSTRequirement* child) { text += " " + describe(child); });
    return "(" + text + ")";
}

/// A node in memory.
ByteVector node(std::uint32_t type, const ByteVector& data) {
    return Bytes().u32(type).u32(0).u32(0).u32(data.size()).bytes(data);
}

/// The data of a composite behind its numbers.
std::uint64_t pointerTo(const ByteVector& child) {
    return reinterpret_cast<std::uintptr_t>(child.data());
}

ByteVector encoded(const ByteVector& tree) {
    const auto* root = reinterpret_cast<const KSTRequirement*>(tree.data());
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedRequirementSize(root, &size), 0);
    ByteVector bytes(size);
    EXPECT_EQ(SerializeRequirement(root, bytes.data(), &size), 0);
    return bytes;
}

std::string decodedRequirement(const ByteVector& bytes) {
    KSTRequirement* root = nullptr;
    std::size_t consumed = 0;
    EXPECT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &root, &consumed), 0);
    EXPECT_EQ(consumed, bytes.size());
    std::string text = describe(root);
    DeallocRequirement(root);
    return text;
}

ByteVector encoded(const KSTCredential* credential) {
    std::size_t size = 0;
    EXPECT_EQ(GetSerializedCredentialSize(credential, &size), 0);
    ByteVector bytes(size);
    EXPECT_EQ(SerializeCredential(credential, bytes.data(), &size), 0);
    return bytes;
}

/// A pair of serialisers for one payload.
template <typename Size, typename Measure, typename Write>
ByteVector written(Measure measure, Write write) {
    Size size = 0;
    EXPECT_EQ(measure(&size), 0);
    ByteVector bytes(size);
    EXPECT_EQ(write(bytes.data(), &size), 0);
    bytes.resize(size);
    return bytes;
}

CredentialPointer make(std::uint32_t type) {
    KSTCredential* credential = nullptr;
    EXPECT_EQ(KSTCredentialCreate(type, &credential), 0);
    return CredentialPointer(credential);
}

void set(const CredentialPointer& credential, std::uint32_t property, std::uint32_t value) {
    EXPECT_EQ(KSTCredentialSetProperty(credential.get(), property, &value, sizeof value), 0);
}

std::string property(const KSTCredential* credential, std::uint32_t id) {
    std::string text;
    EXPECT_EQ(KSTCredentialGetProperty(
                  credential, id,
                  [&](const void* data, std::size_t length) {
                      text = toHexWord({static_cast<const std::uint8_t*>(data), length});
                  }),
              0);
    return text;
}

/// The passphrase that several examples are about.
CredentialPointer makePassphrase() {
    CredentialPointer credential = make(kKSTCredentialTypePassphraseEntered);
    const std::string text = "open sesame";
    set(credential, 5, 1000);
    set(credential, 201, 1);
    EXPECT_EQ(KSTCredentialSetProperty(credential.get(), 200, text.data(), text.size()), 0);
    return credential;
}

/// The two parameters of several examples.
struct TwoParameters {
    const std::int32_t minusOne = -1;
    const KSTParameter list[2] = {{1, &minusOne, 4}, {3, "usb", 3}};
};

/// What a reader of a payload with parameters stores.
struct Received {
    KSTHandle handle{};
    std::uint8_t preflight = 77;
    std::uint32_t age = 0;
    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;

    /// Each as its type and its value. The parameters are released.
    std::string take() {
        std::string text;
        for (std::uint32_t i = 0; i < count; ++i) {
            const auto* value = static_cast<const std::uint8_t*>(parameters[i].parameterData);
            text += base::concat(parameters[i].type, ":",
                                 toHexWord({value, parameters[i].parameterDataLength}), " ");
        }
        DeallocParameters(parameters, count);
        return text;
    }
};

constexpr const char* kTwoParametersReceived = "1:ffffffff 3:757362 ";

class WireFormatsTest : public KernelFixture {
  protected:
    using Case = void (WireFormatsTest::*)(const ByteVector&);

    void SetUp() override {
        std::uint8_t next = 0xa0;
        for (std::uint8_t& byte : handle_.bytes) {
            byte = next++;
        }
        kst::installPlatform({log_, registry_, channel_});
    }

    void TearDown() override {
        kst::removePlatform();
        KernelFixture::TearDown();
    }

    /// Hands an example to its case, which finds the kernel side with one context.
    void run(const std::string& name, const ByteVector& example) {
        SCOPED_TRACE(name);
        const auto all = cases();
        const auto found = all.find(name);
        ASSERT_NE(found, all.end()) << "no case for it";
        kernel_.contexts = ContextTable([this] { return std::optional(handle_); });
        ASSERT_EQ(LibCall_KSTContextCreate(kst::channelTransport, &context_, &level_), 0);
        (this->*found->second)(example);
        EXPECT_EQ(KSTContextDelete(context_, false), 0);
    }

    static std::map<std::string, Case> cases() {
        return {
            {"frame", &WireFormatsTest::frame},
            {"frame-add-credential", &WireFormatsTest::frameAddCredential},
            {"credential-marker", &WireFormatsTest::credentialMarker},
            {"credential-passphrase", &WireFormatsTest::credentialPassphrase},
            {"credential-list", &WireFormatsTest::credentialList},
            {"requirement-leaf", &WireFormatsTest::requirementLeaf},
            {"requirement-tree", &WireFormatsTest::requirementTree},
            {"parameters", &WireFormatsTest::parameters},
            {"verify-policy", &WireFormatsTest::verifyPolicy},
            {"verify-acl-constraint", &WireFormatsTest::verifyAclConstraint},
            {"process-acl", &WireFormatsTest::processAcl},
            {"add-credential", &WireFormatsTest::addCredential},
            {"remove-credential", &WireFormatsTest::removeCredential},
            {"remove-credentials-by-type", &WireFormatsTest::removeCredentialsByType},
            {"contains-passphrase", &WireFormatsTest::containsPassphrase},
            {"context-property", &WireFormatsTest::contextProperty},
            {"set-environment-variable", &WireFormatsTest::setEnvironmentVariable},
            {"get-environment-variable", &WireFormatsTest::getEnvironmentVariable},
            {"kernel-control", &WireFormatsTest::kernelControl},
            {"reply-context-create", &WireFormatsTest::replyContextCreate},
            {"reply-external-form", &WireFormatsTest::replyExternalForm},
            {"reply-contains", &WireFormatsTest::replyContains},
            {"reply-satisfied", &WireFormatsTest::replySatisfied},
            {"reply-unsatisfied", &WireFormatsTest::replyUnsatisfied},
        };
    }

    [[nodiscard]] Types own() { return typesIn(kernel_.contexts.find(handle_)->credentials); }

    [[nodiscard]] std::string contextIn(const KSTHandle& handle) const {
        return toHex(handle) == toHex(handle_) ? "the context" : toHex(handle);
    }

    KSTStatus add(const CredentialPointer& credential) {
        return KSTContextAddCredential(context_, credential.get());
    }

    /// Whether the policy `unlock` is satisfied; otherwise what is missing.
    std::string ask() {
        definePolicies("policy unlock = passphrase(purpose=1)");
        std::string answer = "none";
        EXPECT_EQ(KSTContextVerifyPolicy(context_, "unlock",
                                         [&](bool satisfied, const KSTRequirement* requirement) {
                                             answer =
                                                 satisfied ? "satisfied" : describe(requirement);
                                         }),
                  0);
        return answer;
    }

    void frame(const ByteVector& example) {
        EXPECT_EQ(KSTGetEnvironmentVariable(7, [](const void*, std::size_t) {}), 0);
        EXPECT_EQ(channel_.frame, example);
        const std::uint32_t variable = 7;
        std::size_t size = 0;
        std::uint8_t* built = LibCall_BuildCommand(25, 0, 0, &variable, sizeof variable, &size);
        EXPECT_EQ(ByteVector(built, built + size), example);
        DeallocDataBlob(built, size);
    }

    void frameAddCredential(const ByteVector& example) {
        EXPECT_EQ(add(make(4)), 0);
        EXPECT_EQ(channel_.frame, example);
        EXPECT_EQ(own(), Types{4});
    }

    void credentialMarker(const ByteVector& example) {
        EXPECT_EQ(encoded(make(4).get()), example);
        EXPECT_EQ(property(read(example).get(), 3), "04000000");
    }

    void credentialPassphrase(const ByteVector& example) {
        EXPECT_EQ(encoded(makePassphrase().get()), example);
        const CredentialPointer received = read(example);
        EXPECT_EQ(property(received.get(), 5), "e8030000");
        EXPECT_EQ(property(received.get(), 200), "6f70656e20736573616d65");
        EXPECT_EQ(property(received.get(), 201), "01000000");
    }

    void credentialList(const ByteVector& example) {
        const CredentialPointer marker = make(4);
        const CredentialPointer denyList = make(12);
        set(denyList, 601, 1);
        set(denyList, 602, 7);
        KSTCredential* const list[] = {marker.get(), denyList.get()};
        ByteVector bytes(example.size());
        std::size_t size = bytes.size();
        EXPECT_EQ(SerializeCredentialList(list, 2, bytes.data(), &size), 0);
        EXPECT_EQ(size, example.size());
        EXPECT_EQ(bytes, example);
        KSTCredential** received = nullptr;
        std::uint32_t count = 0;
        ASSERT_EQ(DeserializeCredentialList(example.data(), example.size(), &received, &count), 0);
        ASSERT_EQ(count, 2U);
        EXPECT_EQ(received[0]->type, 4U);
        EXPECT_EQ(property(received[1], 601), "01000000");
        EXPECT_EQ(property(received[1], 602), "07000000");
        DeallocCredentialList(received, count);
    }

    void requirementLeaf(const ByteVector& example) {
        EXPECT_EQ(encoded(node(2, Bytes().u32(1))), example);
        EXPECT_EQ(decodedRequirement(example), "(2 200=01000000)");
    }

    void requirementTree(const ByteVector& example) {
        const ByteVector first = node(1, Bytes().u32(0));
        const ByteVector passphrase = node(2, Bytes().u32(1));
        const ByteVector empty = node(6, {});
        const ByteVector oneOf =
            node(7, Bytes().u32(1).u32(2).u64(pointerTo(passphrase)).u64(pointerTo(empty)));
        EXPECT_EQ(encoded(node(4, Bytes().u32(2).u64(pointerTo(first)).u64(pointerTo(oneOf)))),
                  example);
        EXPECT_EQ(decodedRequirement(example),
                  "(4 (1 100=00000000) (7 700=01000000 (2 200=01000000) (6)))");
    }

    void parameters(const ByteVector& example) {
        const TwoParameters parameters;
        std::uint32_t length = 0;
        EXPECT_EQ(GetSerializedParametersLength(parameters.list, 2, &length), 0);
        EXPECT_EQ(length, example.size());
        // They are written and read at the end of a payload only.
        const ByteVector payload = verifyPolicyPayload();
        ByteVector front(payload.begin(), payload.end() - length);
        EXPECT_EQ(ByteVector(payload.end() - length, payload.end()), example);
        front.insert(front.end(), example.begin(), example.end());
        expectVerifyPolicy(front);
    }

    ByteVector verifyPolicyPayload() const {
        const TwoParameters parameters;
        return written<std::size_t>(
            [&](std::size_t* size) {
                return GetSerializedVerifyPolicySize(&handle_, "unlock", 1, 300, parameters.list, 2,
                                                     size);
            },
            [&](void* buffer, std::size_t* size) {
                return SerializeVerifyPolicy(&handle_, "unlock", 1, 300, parameters.list, 2, buffer,
                                             size);
            });
    }

    void expectVerifyPolicy(const ByteVector& bytes) const {
        Received received;
        char* policy = nullptr;
        ASSERT_EQ(DeserializeVerifyPolicy(bytes.data(), bytes.size(), &received.handle, &policy,
                                          &received.preflight, &received.age, &received.parameters,
                                          &received.count),
                  0);
        EXPECT_STREQ(policy, "unlock");
        DeallocDataBlob(policy, std::strlen(policy) + 1);
        EXPECT_EQ(contextIn(received.handle), "the context");
        EXPECT_EQ(received.preflight, 1);
        EXPECT_EQ(received.age, 300U);
        EXPECT_EQ(received.take(), kTwoParametersReceived);
    }

    void verifyPolicy(const ByteVector& example) {
        EXPECT_EQ(verifyPolicyPayload(), example);
        expectVerifyPolicy(example);
    }

    void verifyAclConstraint(const ByteVector& example) {
        const std::uint8_t constraint[] = {1, 2, 3, 4, 5};
        EXPECT_EQ(written<std::uint32_t>(
                      [&](std::uint32_t* size) {
                          return GetSerializedVerifyAclConstraintSize(&handle_, constraint, 5, 0,
                                                                      0xffffffff, nullptr, 0, size);
                      },
                      [&](void* buffer, std::uint32_t* size) {
                          return SerializeVerifyAclConstraint(&handle_, constraint, 5, 0,
                                                              0xffffffff, nullptr, 0, buffer, size);
                      }),
                  example);
        Received received;
        void* blob = nullptr;
        std::uint32_t length = 0;
        ASSERT_EQ(DeserializeVerifyAclConstraint(
                      example.data(), static_cast<std::uint32_t>(example.size()), &received.handle,
                      &blob, &length, &received.preflight, &received.age, &received.parameters,
                      &received.count),
                  0);
        EXPECT_EQ(takeBlob(blob, length), "0102030405");
        EXPECT_EQ(contextIn(received.handle), "the context");
        EXPECT_EQ(received.preflight, 0);
        EXPECT_EQ(received.age, 0xffffffffU);
        EXPECT_EQ(received.take(), "");
    }

    static std::string takeBlob(void* blob, std::uint32_t length) {
        std::string text = toHexWord({static_cast<const std::uint8_t*>(blob), length});
        DeallocDataBlob(blob, length);
        return text;
    }

    void processAcl(const ByteVector& example) {
        const std::uint8_t acl[] = {0x30, 1, 2};
        const std::uint32_t user = 1000;
        const KSTParameter parameter = {4, &user, sizeof user};
        EXPECT_EQ(written<std::uint32_t>(
                      [&](std::uint32_t* size) {
                          return GetSerializedProcessAclSize(nullptr, acl, 3, "sign", 4, 0,
                                                             &parameter, 1, size);
                      },
                      [&](void* buffer, std::uint32_t* size) {
                          return SerializeProcessAcl(nullptr, acl, 3, "sign", 4, 0, &parameter, 1,
                                                     buffer, size);
                      }),
                  example);
        Received received;
        void* blob = nullptr;
        std::uint32_t length = 0;
        void* operation = nullptr;
        std::uint32_t operationLength = 0;
        ASSERT_EQ(DeserializeProcessAcl(example.data(), static_cast<std::uint32_t>(example.size()),
                                        &received.handle, &blob, &length, &operation,
                                        &operationLength, &received.age, &received.parameters,
                                        &received.count),
                  0);
        EXPECT_EQ(takeBlob(blob, length), "300102");
        EXPECT_EQ(takeBlob(operation, operationLength), "7369676e");
        EXPECT_TRUE(isNoHandle(received.handle));
        EXPECT_EQ(received.age, 0U);
        EXPECT_EQ(received.take(), "4:e8030000 ");
    }

    void addCredential(const ByteVector& example) {
        const CredentialPointer credential = makePassphrase();
        EXPECT_EQ(
            written<std::size_t>(
                [&](std::size_t* size) {
                    return GetSerializedAddCredentialSize(&handle_, credential.get(), 1, size);
                },
                [&](void* buffer, std::size_t* size) {
                    return SerializeAddCredential(&handle_, credential.get(), 1, buffer, size);
                }),
            example);
        KSTHandle handle{};
        KSTCredential* received = nullptr;
        KSTScope scope = 0;
        ASSERT_EQ(
            DeserializeAddCredential(example.data(), example.size(), &handle, &received, &scope),
            0);
        EXPECT_EQ(contextIn(handle), "the context");
        EXPECT_EQ(encoded(CredentialPointer(received).get()), encoded(credential.get()));
        EXPECT_EQ(scope, 1U);
    }

    void removeCredential(const ByteVector& example) {
        const CredentialPointer credential = make(4);
        EXPECT_EQ(
            written<std::size_t>(
                [&](std::size_t* size) {
                    return GetSerializedRemoveCredentialSize(nullptr, credential.get(), 2, size);
                },
                [&](void* buffer, std::size_t* size) {
                    return SerializeRemoveCredential(nullptr, credential.get(), 2, buffer, size);
                }),
            example);
        KSTHandle handle{};
        KSTCredential* received = nullptr;
        KSTScope scope = 0;
        ASSERT_EQ(
            DeserializeRemoveCredential(example.data(), example.size(), &handle, &received, &scope),
            0);
        EXPECT_TRUE(isNoHandle(handle));
        EXPECT_EQ(encoded(CredentialPointer(received).get()), encoded(credential.get()));
        EXPECT_EQ(scope, 2U);
    }

    void removeCredentialsByType(const ByteVector& example) {
        EXPECT_EQ(add(makePassphrase()), 0);
        EXPECT_EQ(KernelFixture::run(9, example), 0);
        EXPECT_EQ(own(), Types());
        EXPECT_EQ(KSTContextRemoveCredentialsByType(context_, 2), 0);
        EXPECT_EQ(channel_.payload(), example);
    }

    void containsPassphrase(const ByteVector& example) {
        EXPECT_EQ(KSTContextContainsPassphraseCredentialWithPurpose(context_, 1, 0),
                  kKSTErrorNotContained);
        EXPECT_EQ(channel_.payload(), example);
        EXPECT_EQ(add(makePassphrase()), 0);
        EXPECT_EQ(result(13, example).output, ByteVector(Bytes().u32(1)));
    }

    void contextProperty(const ByteVector& example) {
        EXPECT_EQ(written<std::size_t>(
                      [&](std::size_t* size) {
                          return GetSerializedGetContextPropertySize(&handle_, 3, size);
                      },
                      [&](void* buffer, std::size_t* size) {
                          return SerializeGetContextProperty(&handle_, 3, buffer, size);
                      }),
                  example);
        KSTHandle handle{};
        KSTContextProperty property = 0;
        EXPECT_EQ(DeserializeGetContextProperty(example.data(), example.size(), &handle, &property),
                  0);
        EXPECT_EQ(contextIn(handle), "the context");
        EXPECT_EQ(property, 3U);
    }

    void setEnvironmentVariable(const ByteVector& example) {
        const std::uint8_t value[] = {0xc0, 0xff, 0xee};
        EXPECT_EQ(KernelFixture::run(24, example), 0);
        EXPECT_EQ(toHexWord(kernel_.environment.get(7)), "c0ffee");
        EXPECT_EQ(KSTSetEnvironmentVariable(7, value, sizeof value), 0);
        EXPECT_EQ(channel_.payload(), example);
    }

    void getEnvironmentVariable(const ByteVector& example) {
        EXPECT_TRUE(kernel_.environment.set(7, ByteVector{0xc0, 0xff, 0xee}));
        EXPECT_EQ(toHexWord(result(25, example).output), "c0ffee");
        std::string value;
        EXPECT_EQ(KSTGetEnvironmentVariable(
                      7,
                      [&](const void* data, std::size_t length) {
                          value = toHexWord({static_cast<const std::uint8_t*>(data), length});
                      }),
                  0);
        EXPECT_EQ(value, "c0ffee");
        EXPECT_EQ(channel_.payload(), example);
    }

    void kernelControl(const ByteVector& example) {
        ByteVector input;
        controls_.add(5, {.min = 1, .max = 1}, [&](std::span<const std::uint8_t> bytes) {
            input.assign(bytes.begin(), bytes.end());
            return CommandResult();
        });
        EXPECT_EQ(KernelFixture::run(26, example), 0);
        EXPECT_EQ(input, ByteVector{1});
        EXPECT_EQ(KSTKernelControl(5, "\1", 1, nullptr), 0);
        EXPECT_EQ(channel_.payload(), example);
    }

    void replyContextCreate(const ByteVector& example) {
        // The context of the case was made by that reply.
        EXPECT_EQ(channel_.reply, example);
        EXPECT_EQ(contextIn(context_->handle), "the context");
        EXPECT_EQ(level_, 40);
    }

    void replyExternalForm(const ByteVector& example) {
        kst::gLogLevel = 70;
        KSTContextRef opened = KSTContextCreateWithExternalForm(handle_.bytes, 16);
        ASSERT_NE(opened, nullptr);
        EXPECT_EQ(channel_.reply, example);
        EXPECT_EQ(kst::gLogLevel, 40);
        EXPECT_EQ(KSTContextDelete(opened, false), 0);
    }

    void replyContains(const ByteVector& example) {
        EXPECT_EQ(add(make(4)), 0);
        EXPECT_EQ(KSTContextContainsCredentialType(context_, 4), 0);
        EXPECT_EQ(channel_.reply, example);
    }

    void replySatisfied(const ByteVector& example) {
        EXPECT_EQ(add(makePassphrase()), 0);
        EXPECT_EQ(ask(), "satisfied");
        EXPECT_EQ(channel_.reply, example);
    }

    void replyUnsatisfied(const ByteVector& example) {
        EXPECT_EQ(ask(), "(2 200=01000000)");
        EXPECT_EQ(channel_.reply, example);
    }

    KSTHandle handle_{};
    support::RecordingLog log_;
    support::ScriptedRegistry registry_;
    CommandChannel channel_{commands_};
    KSTContextRef context_ = nullptr;
    std::uint8_t level_ = 0;
};

TEST_F(WireFormatsTest, EveryExampleIsWrittenAndReadAsTheDocumentSays) {
    const auto examples = readExamples(WIRE_FORMATS);
    for (const auto& [name, example] : examples) {
        run(name, example);
    }
    for (const auto& [name, unused] : cases()) {
        EXPECT_TRUE(examples.contains(name)) << name << " is not in the document";
    }
}

} // namespace

} // namespace keystrand::sim::test
