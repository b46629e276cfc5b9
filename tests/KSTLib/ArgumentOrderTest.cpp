// Which of several wrong arguments is the one that is found: of every set of them the first in the
// order of the checks, with nothing sent, nothing allocated and no output changed.

#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Serialization.h"
#include "tests/KSTLib/ContextFixture.h"
#include "tests/common/CredentialSamples.h"
#include "tests/common/RequirementSamples.h"

#include <gtest/gtest.h>

#include <array>

namespace {

using support::asCredential;
using support::asRequirement;
using support::Bytes;
using support::credentialBytes;
using support::leafBytes;

constexpr const char* kPair =
    "(parameters && parametersCount) || (!parameters && !parametersCount)";
constexpr const char* kCount = "parametersCount <= 10";
constexpr const char* kRoom = "*outSize >= requiredSize";
constexpr const char* kHandleRoom = "(size - offset) >= sizeof(KSTHandle)";
constexpr const char* kScopeOfHandle = "handle || scope == kKSTScopeGlobal";
constexpr const char* kScopeOfContext = "context || scope == kKSTScopeGlobal";

/// A set of wrong arguments, by the number of their check.
class Faults {
  public:
    explicit Faults(unsigned bits) : bits_(bits) {}

    [[nodiscard]] bool has(unsigned check) const { return (bits_ >> check & 1U) != 0; }

    /// Null instead of `argument` when the check is to fail.
    template <typename Argument>
    [[nodiscard]] Argument* orNull(unsigned check, Argument* argument) const {
        return has(check) ? nullptr : argument;
    }

    [[nodiscard]] std::size_t first() const {
        return static_cast<std::size_t>(__builtin_ctz(bits_));
    }

  private:
    unsigned bits_;
};

class ArgumentOrder : public support::ContextFixture {
  protected:
    using Checks = std::vector<const char*>;
    using Call = std::function<KSTStatus(const Faults& faults)>;

    /// The source whose checks are meant, as the line shows it.
    enum Source { kSerialization, kLibCall, kLibCallBlock, kLibrary };

    static std::string lineOf(Source source, const std::string& check) {
        constexpr const char* kPaths[] = {"common/LibSerialization", "common/LibCall",
                                          "common/LibCallBlock", "KSTLib/KSTLib"};
        std::string line = source == kLibrary ? "KSTLib" : "KST";
        line += ": AssertMacros: " + check + " (value: 0x0),  file: " + kPaths[source] + ":<n>\n";
        return line;
    }

    void expectOrder(Source source, const Checks& checks, const Call& call) {
        channel.scalars = {40};
        for (unsigned bits = 1; bits < 1U << checks.size(); ++bits) {
            const Faults faults(bits);
            const support::ScriptedGate gate;
            log.clear();
            reset();
            EXPECT_EQ(call(faults), kKSTErrorBadParameter) << std::hex << bits;
            ASSERT_FALSE(logged().empty()) << std::hex << bits;
            EXPECT_EQ(logged().front(), lineOf(source, checks[faults.first()])) << std::hex << bits;
            EXPECT_EQ(gate.asked.size(), gate.freed.size());
            EXPECT_TRUE(sent().empty());
            expectOutputsUntouched();
        }
        log.clear();
    }

    /// Outputs as they were, but for the handle, which a reader stores as soon as it has it.
    void expectOutputsUntouched() const {
        EXPECT_EQ(size, room);
        EXPECT_EQ(size32, room32);
        EXPECT_EQ(credential, nullptr);
        EXPECT_EQ(requirement, nullptr);
        EXPECT_EQ(list, nullptr);
        EXPECT_EQ(pointer, nullptr);
        EXPECT_EQ(word, 4711U);
        EXPECT_EQ(byte, 77U);
        EXPECT_EQ(blockCalls, 0);
    }

    void reset() {
        size = room = 8192;
        size32 = room32 = 8192;
    }

    /// Rooms of the right size and of one byte too few.
    std::size_t* withRoom(std::size_t bytes) {
        size = room = bytes;
        return &size;
    }
    std::uint32_t* withRoom32(std::uint32_t bytes) {
        size32 = room32 = bytes;
        return &size32;
    }

    /// The parameters of a request with three faults: a pair, a count, a type.
    struct Parameters {
        const KSTParameter* array;
        std::uint32_t count;
    };
    Parameters parameters(const Faults& faults, unsigned pair, unsigned count, unsigned type) {
        values.fill({faults.has(type) ? 8U : 1U, numbers.data(), 4});
        return {faults.orNull(pair, values.data()), faults.has(count) ? 11U : 1U};
    }

    static KSTCredential* credentialOf(Bytes& good, Bytes& bad, bool isBad) {
        return asCredential(isBad ? bad : good);
    }

    std::array<std::uint8_t, 8192> buffer{};
    std::size_t size = 0;
    std::size_t room = 0;
    std::uint32_t size32 = 0;
    std::uint32_t room32 = 0;
    KSTHandle handle{};
    KSTHandle outHandle{};
    KSTCredential* credential = nullptr;
    KSTRequirement* requirement = nullptr;
    KSTCredential** list = nullptr;
    KSTParameter* outParameters = nullptr;
    void* pointer = nullptr;
    char* text = nullptr;
    std::uint32_t word = 4711;
    std::uint8_t byte = 77;
    int blockCalls = 0;

    std::array<std::uint8_t, 4> numbers{};
    std::array<KSTParameter, 11> values{};
    Bytes good = credentialBytes(2);
    Bytes bad = credentialBytes(13, 136);
    Bytes leaf = leafBytes(2, 4);
    Bytes noLeaf = leafBytes(17, 4);
    const std::string longPolicy = std::string(129, 'p');
};

} // namespace

TEST_F(ArgumentOrder, Credentials) {
    expectOrder(kSerialization, {"credential", "outSize", "0"}, [&](const Faults& faults) {
        return GetSerializedCredentialSize(faults.orNull(0, credentialOf(good, bad, faults.has(2))),
                                           faults.orNull(1, &size));
    });
    expectOrder(kSerialization, {"credential", "outBuffer", "outSize", "0", "credLen <= *outSize"},
                [&](const Faults& faults) {
                    return SerializeCredential(
                        faults.orNull(0, credentialOf(good, bad, faults.has(3))),
                        faults.orNull(1, buffer.data()),
                        faults.orNull(2, withRoom(faults.has(4) ? 167 : 168)));
                });
    expectOrder(
        kSerialization,
        {"buffer", "credential", "consumedBytes", "size >= sizeof(KSTCredential)", "0",
         "dataLength == sizeof(KSTCredentialDataKextDenyList)", "size >= credSize"},
        [&](const Faults& faults) {
            const Bytes bytes = credentialBytes(faults.has(4) ? 13 : 12, faults.has(5) ? 9 : 8);
            return DeserializeCredential(faults.orNull(0, bytes.data()),
                                         faults.has(3) ? 31 : (faults.has(6) ? 39 : bytes.size()),
                                         faults.orNull(1, &credential), faults.orNull(2, &size));
        });
    expectOrder(kSerialization, {"credential", "copy"}, [&](const Faults& faults) {
        return CopyCredential(faults.orNull(0, asCredential(good)), faults.orNull(1, &credential));
    });
    expectOrder(kSerialization, {"credential1", "credential2", "equal", "0"},
                [&](const Faults& faults) {
                    KSTCredential* compared = credentialOf(good, bad, faults.has(3));
                    return CompareCredentials(faults.orNull(0, compared),
                                              faults.orNull(1, compared), faults.orNull(2, &byte));
                });
}

TEST_F(ArgumentOrder, Lists) {
    KSTCredential* elements[] = {asCredential(good), asCredential(good)};
    expectOrder(kSerialization,
                {"credentialList || (count == 0)", "outBuffer", "outSize", "credentialList[i]",
                 "credLen <= *outSize"},
                [&](const Faults& faults) {
                    elements[0] = faults.orNull(3, asCredential(good));
                    return SerializeCredentialList(
                        faults.orNull(0, &elements[0]), 2, faults.orNull(1, buffer.data()),
                        faults.orNull(2, withRoom(faults.has(4) ? 171 : 340)));
                });
    expectOrder(
        kSerialization,
        {"buffer", "credentialList", "count", "size >= sizeof(uint32_t)", "credCount <= 1000"},
        [&](const Faults& faults) {
            Bytes bytes(4);
            support::putU32(bytes, 0, faults.has(4) ? 1001 : 1);
            return DeserializeCredentialList(faults.orNull(0, bytes.data()), faults.has(3) ? 3 : 4,
                                             faults.orNull(1, &list), faults.orNull(2, &word));
        });
}

TEST_F(ArgumentOrder, Requirements) {
    expectOrder(kSerialization, {"requirement", "outSize", "0"}, [&](const Faults& faults) {
        return GetSerializedRequirementSize(
            faults.orNull(0, asRequirement(faults.has(2) ? noLeaf : leaf)),
            faults.orNull(1, &size));
    });
    expectOrder(kSerialization,
                {"requirement", "buffer", "bufferSize", "0", "reqLen <= *bufferSize"},
                [&](const Faults& faults) {
                    return SerializeRequirement(
                        faults.orNull(0, asRequirement(faults.has(3) ? noLeaf : leaf)),
                        faults.orNull(1, buffer.data()),
                        faults.orNull(2, withRoom(faults.has(4) ? 19 : 20)));
                });
    expectOrder(kSerialization,
                {"buffer", "size >= sizeof(KSTRequirement)", "requirement", "consumedBytes", "0",
                 "size >= reqSize"},
                [&](const Faults& faults) {
                    const Bytes& bytes = faults.has(4) ? noLeaf : leaf;
                    return DeserializeRequirement(faults.orNull(0, bytes.data()),
                                                  faults.has(1) ? 15 : (faults.has(5) ? 19 : 20),
                                                  faults.orNull(2, &requirement),
                                                  faults.orNull(3, &size));
                });
}

TEST_F(ArgumentOrder, PolicyPayload) {
    expectOrder(kSerialization, {"handle", "policyId", "outSize", "policyLength <= 128", "0"},
                [&](const Faults& faults) {
                    const Parameters given = parameters(faults, 31, 31, 4);
                    return GetSerializedVerifyPolicySize(
                        faults.orNull(0, &handle),
                        faults.orNull(1, faults.has(3) ? longPolicy.c_str() : "p"), 0, 0,
                        given.array, given.count, faults.orNull(2, &size));
                });
    expectOrder(kSerialization,
                {"handle", "policyId", kPair, kCount, "outBuffer", "outSize", "policyLength <= 128",
                 "0", kRoom},
                [&](const Faults& faults) {
                    const Parameters given = parameters(faults, 2, 3, 7);
                    return SerializeVerifyPolicy(
                        faults.orNull(0, &handle),
                        faults.orNull(1, faults.has(6) ? longPolicy.c_str() : "p"), 0, 0,
                        given.array, given.count, faults.orNull(4, buffer.data()),
                        faults.orNull(5, withRoom(faults.has(8) ? 38 : 39)));
                });
    expectOrder(kSerialization,
                {"buffer", "handle", "policyId", "preflight", "maxGlobalCredentialAge",
                 "parameters", "parametersCount", kHandleRoom},
                [&](const Faults& faults) {
                    return DeserializeVerifyPolicy(
                        faults.orNull(0, buffer.data()), faults.has(7) ? 15 : 27,
                        faults.orNull(1, &outHandle), faults.orNull(2, &text),
                        faults.orNull(3, &byte), faults.orNull(4, &word),
                        faults.orNull(5, &outParameters), faults.orNull(6, &word));
                });
    expectOrder(kSerialization, {"paramsLength", "param"}, [&](const Faults& faults) {
        // The length is the one output that a failure changes.
        std::uint32_t length = 1;
        return GetSerializedParametersLength(faults.orNull(1, values.data()), 1,
                                             faults.orNull(0, &length));
    });
}

TEST_F(ArgumentOrder, AccessListPayloads) {
    const std::uint8_t acl[] = {1, 2, 3};
    const auto constraintSize = [&](const Faults& faults) {
        const Parameters given = parameters(faults, 2, 3, 4);
        return GetSerializedVerifyAclConstraintSize(&handle, faults.orNull(0, acl), 3, 0, 0,
                                                    given.array, given.count,
                                                    faults.orNull(1, &size32));
    };
    expectOrder(kSerialization, {"aclConstraint", "outSize", kPair, kCount, "0"}, constraintSize);
    const auto writeConstraint = [&](const Faults& faults) {
        const Parameters given = parameters(faults, 1, 2, 5);
        return SerializeVerifyAclConstraint(&handle, faults.orNull(0, acl), 3, 0, 0, given.array,
                                            given.count, faults.orNull(3, buffer.data()),
                                            faults.orNull(4, withRoom32(faults.has(6) ? 47 : 48)));
    };
    expectOrder(kSerialization,
                {"aclConstraint", kPair, kCount, "outBuffer", "outSize", "0", kRoom},
                writeConstraint);
    expectOrder(kSerialization,
                {"buffer", "handle", "aclConstraint", "aclConstraintLength", "preflight",
                 "maxGlobalCredentialAge", "parameters", "parametersCount", kHandleRoom},
                [&](const Faults& faults) {
                    return DeserializeVerifyAclConstraint(
                        faults.orNull(0, buffer.data()), faults.has(8) ? 15 : 29,
                        faults.orNull(1, &outHandle), faults.orNull(2, &pointer),
                        faults.orNull(3, &word), faults.orNull(4, &byte), faults.orNull(5, &word),
                        faults.orNull(6, &outParameters), faults.orNull(7, &word));
                });
    expectOrder(kSerialization, {"acl && aclLength", "outSize", kPair, kCount, "0"},
                [&](const Faults& faults) {
                    const Parameters given = parameters(faults, 2, 3, 4);
                    return GetSerializedProcessAclSize(&handle, faults.orNull(0, acl), 3, nullptr,
                                                       0, 0, given.array, given.count,
                                                       faults.orNull(1, &size32));
                });
    expectOrder(
        kSerialization, {"acl && aclLength", kPair, kCount, "outBuffer", "outSize", "0", kRoom},
        [&](const Faults& faults) {
            const Parameters given = parameters(faults, 1, 2, 5);
            return SerializeProcessAcl(&handle, acl, faults.has(0) ? 0 : 3, nullptr, 0, 0,
                                       given.array, given.count, faults.orNull(3, buffer.data()),
                                       faults.orNull(4, withRoom32(faults.has(6) ? 50 : 51)));
        });
    expectOrder(kSerialization,
                {"buffer", "handle", "acl", "aclLength", "operation", "operationLength",
                 "maxGlobalCredentialAge", "parameters", "parametersCount", kHandleRoom},
                [&](const Faults& faults) {
                    return DeserializeProcessAcl(
                        faults.orNull(0, buffer.data()), faults.has(9) ? 15 : 32,
                        faults.orNull(1, &outHandle), faults.orNull(2, &pointer),
                        faults.orNull(3, &word), faults.orNull(4, &pointer),
                        faults.orNull(5, &word), faults.orNull(6, &word),
                        faults.orNull(7, &outParameters), faults.orNull(8, &word));
                });
}

TEST_F(ArgumentOrder, CredentialPayloads) {
    for (const auto getSize : {GetSerializedAddCredentialSize, GetSerializedRemoveCredentialSize,
                               GetSerializedReplacePassphraseCredentialSize}) {
        expectOrder(kSerialization, {kScopeOfHandle, "credential", "outSize", "0"},
                    [&](const Faults& faults) {
                        return getSize(faults.orNull(0, &handle),
                                       faults.orNull(1, credentialOf(good, bad, faults.has(3))),
                                       kKSTScopeContext, faults.orNull(2, &size));
                    });
    }
    for (const auto serialize : {SerializeAddCredential, SerializeRemoveCredential,
                                 SerializeReplacePassphraseCredential}) {
        expectOrder(kSerialization,
                    {kScopeOfHandle, "credential", "outBuffer", "outSize", "0", kRoom},
                    [&](const Faults& faults) {
                        return serialize(faults.orNull(0, &handle),
                                         faults.orNull(1, credentialOf(good, bad, faults.has(4))),
                                         kKSTScopeContext, faults.orNull(2, buffer.data()),
                                         faults.orNull(3, withRoom(faults.has(5) ? 187 : 188)));
                    });
    }
    for (const auto deserialize : {DeserializeAddCredential, DeserializeRemoveCredential,
                                   DeserializeReplacePassphraseCredential}) {
        expectOrder(kSerialization,
                    {"buffer",
                     "size >= sizeof(KSTHandle) + sizeof(KSTCredential) + "
                     "sizeof(KSTScope)",
                     "handle", "credential", "scope", "0"},
                    [&](const Faults& faults) {
                        Bytes bytes(16);
                        support::append(bytes, faults.has(5) ? bad : good);
                        bytes.resize(bytes.size() + 4);
                        return deserialize(faults.orNull(0, bytes.data()),
                                           faults.has(1) ? 51 : bytes.size(),
                                           faults.orNull(2, &outHandle),
                                           faults.orNull(3, &credential), faults.orNull(4, &word));
                    });
    }
    expectOrder(
        kSerialization, {"handle", "outBuffer", "outSize", kRoom}, [&](const Faults& faults) {
            return SerializeGetContextProperty(faults.orNull(0, &handle), 1,
                                               faults.orNull(1, buffer.data()),
                                               faults.orNull(2, withRoom(faults.has(3) ? 19 : 20)));
        });
    expectOrder(kSerialization, {"buffer", "handle", "property", kHandleRoom},
                [&](const Faults& faults) {
                    return DeserializeGetContextProperty(
                        faults.orNull(0, buffer.data()), faults.has(3) ? 15 : 20,
                        faults.orNull(1, &outHandle), faults.orNull(2, &word));
                });
}

TEST_F(ArgumentOrder, OverATransport) {
    KSTContextRef made = nullptr;
    bool satisfied = false;
    const KSTTransport transport = kst::channelTransport;
    const auto transportUnless = [&](const Faults& faults) {
        return faults.has(0) ? nullptr : transport;
    };
    expectOrder(kLibCall, {"transport", "context"}, [&](const Faults& faults) {
        return LibCall_KSTContextCreate(transportUnless(faults), faults.orNull(1, &made), &byte);
    });
    expectOrder(kLibCall, {"transport", "context"}, [&](const Faults& faults) {
        return LibCall_KSTContextDelete(transportUnless(faults), faults.orNull(1, context), true);
    });
    expectOrder(kLibCall, {"transport", kScopeOfContext, "credential"}, [&](const Faults& faults) {
        return LibCall_KSTContexAddCredentialWithScope(
            transportUnless(faults), faults.orNull(1, context),
            faults.orNull(2, asCredential(good)), kKSTScopeContext);
    });
    expectOrder(kLibCall, {"transport", kScopeOfContext}, [&](const Faults& faults) {
        return LibCall_KSTContexRemoveCredentialsByTypeAndScope(
            transportUnless(faults), faults.orNull(1, context), 1, kKSTScopeContext);
    });
    expectOrder(kLibCall,
                {"transport", "context",
                 "( (parametersCount > 0 && parameters != ((void*)0)) || ((parametersCount == 0) "
                 "&& parameters == ((void*)0)) )",
                 "policyId", "policySatisfied", kCount},
                [&](const Faults& faults) {
                    const Parameters given = parameters(faults, 2, 5, 31);
                    return LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
                        transportUnless(faults), faults.orNull(1, context), faults.orNull(3, "p"),
                        false, given.array, given.count, 0, faults.orNull(4, &satisfied),
                        &requirement);
                });
    EXPECT_EQ(made, nullptr);
    expectOrder(kLibCall,
                {"transport", "(data && dataLength && dataLength <= 64) || (!data && !dataLength)"},
                [&](const Faults& faults) {
                    return LibCall_KSTSetEnvironmentVariable(transportUnless(faults), nullptr, 1,
                                                             faults.orNull(1, "a"), 1);
                });
    const auto look = [&](const void*, std::size_t) {
        ++blockCalls;
    };
    expectOrder(kLibCallBlock, {"transport", "processVariable"}, [&](const Faults& faults) {
        return LibCall_KSTGetEnvironmentVariable_Block(transportUnless(faults), nullptr, 1,
                                                       faults.has(1) ? KSTDataBlock() : look);
    });
    expectOrder(
        kLibCallBlock,
        {"transport", "(data && dataLength && dataLength <= 256) || (!data && !dataLength)"},
        [&](const Faults& faults) {
            return LibCall_KSTKernelControl_Block(transportUnless(faults), nullptr, 1,
                                                  faults.orNull(1, "a"), 1, look);
        });
    expectOrder(kLibCall, {"transport", "requirement"}, [&](const Faults& faults) {
        return LibCall_KSTRequirementDelete(transportUnless(faults),
                                            faults.orNull(1, asRequirement(leaf)));
    });
}

TEST_F(ArgumentOrder, ObjectsInMemory) {
    const void* found = nullptr;
    Bytes other = credentialBytes(4);
    expectOrder(kLibCall, {"credential", "0"}, [&](const Faults& faults) {
        return KSTCredentialCreate(faults.has(1) ? 13 : 1, faults.orNull(0, &credential));
    });
    expectOrder(kLibCall,
                {"credential", "(data && dataLength) || (!data && !dataLength)", "0",
                 "credential->type == kKSTCredentialTypePassphraseEntered",
                 "dataLength == sizeof(KSTPassphrasePurpose)"},
                [&](const Faults& faults) {
                    const Bytes before = good;
                    const KSTStatus status = KSTCredentialSetProperty(
                        faults.orNull(0, credentialOf(good, other, faults.has(3))),
                        faults.has(2) ? 999 : 201, faults.orNull(1, "abcd"), faults.has(4) ? 3 : 4);
                    EXPECT_EQ(good, before);
                    return status;
                });
    expectOrder(kLibCall,
                {"credential", "data", "dataLength", "0",
                 "credential->type == kKSTCredentialTypePassphraseEntered"},
                [&](const Faults& faults) {
                    return KSTCredentialGetPropertyData(
                        faults.orNull(0, credentialOf(good, other, faults.has(4))),
                        faults.has(3) ? 999 : 201, faults.orNull(1, &found),
                        faults.orNull(2, &size));
                });
    Bytes otherLeaf = leafBytes(6, 4);
    expectOrder(kLibCall,
                {"requirement", "data", "data", "0",
                 "requirement->type == kKSTCredentialTypePassphraseEntered"},
                [&](const Faults& faults) {
                    return KSTRequirementGetPropertyData(
                        faults.orNull(0, asRequirement(faults.has(4) ? otherLeaf : leaf)),
                        faults.has(3) ? 999 : 200, faults.orNull(1, &found),
                        faults.orNull(2, &size));
                });
    EXPECT_EQ(found, nullptr);
    const auto look = [&](const void*, std::size_t) {
        ++blockCalls;
    };
    expectOrder(kLibrary, {"credential", "processProperty"}, [&](const Faults& faults) {
        return KSTCredentialGetProperty(faults.orNull(0, asCredential(good)), 201,
                                        faults.has(1) ? KSTDataBlock() : look);
    });
    expectOrder(kLibrary, {"requirement", "processProperty"}, [&](const Faults& faults) {
        return KSTRequirementGetProperty(faults.orNull(0, asRequirement(leaf)), 200,
                                         faults.has(1) ? KSTDataBlock() : look);
    });
    const auto lookAtProperty = [&](std::uint32_t, const void*, std::size_t) {
        ++blockCalls;
    };
    expectOrder(kLibrary, {"requirement", "processProperty"}, [&](const Faults& faults) {
        return KSTRequirementGetProperties(faults.orNull(0, asRequirement(leaf)),
                                           faults.has(1) ? KSTPropertyBlock() : lookAtProperty);
    });
    const auto lookAtChild = [&](const KSTRequirement*) {
        ++blockCalls;
    };
    expectOrder(kLibrary, {"requirement", "processSubrequirement"}, [&](const Faults& faults) {
        KSTRequirementGetSubrequirements(faults.orNull(0, asRequirement(leaf)),
                                         faults.has(1) ? KSTRequirementBlock() : lookAtChild);
        return kKSTErrorBadParameter;
    });
}

TEST_F(ArgumentOrder, Contexts) {
    expectOrder(kLibrary, {"externalForm", "dataLength == sizeof(KSTHandle)"},
                [&](const Faults& faults) {
                    EXPECT_EQ(KSTContextCreateWithExternalForm(faults.orNull(0, kHandle.data()),
                                                               faults.has(1) ? 15 : 16),
                              nullptr);
                    return kKSTErrorBadParameter;
                });
    const auto look = [&](const void*, std::size_t) {
        ++blockCalls;
    };
    expectOrder(kLibrary, {"context", "processExternalForm"}, [&](const Faults& faults) {
        KSTContextGetExternalForm(faults.orNull(0, context), faults.has(1) ? KSTDataBlock() : look);
        return kKSTErrorBadParameter;
    });
    for (const auto send :
         {KSTContextAddCredentialWithScope, KSTContextRemoveCredentialsByValueAndScope,
          KSTContextReplacePassphraseCredentialsWithScope}) {
        expectOrder(kLibrary, {kScopeOfContext, "credential"}, [&](const Faults& faults) {
            return send(faults.orNull(0, context), faults.orNull(1, asCredential(good)),
                        kKSTScopeContext);
        });
    }
}

TEST_F(ArgumentOrder, Policies) {
    const auto look = [&](bool, const KSTRequirement*) {
        ++blockCalls;
    };
    for (const bool withPreflight : {false, true}) {
        expectOrder(kLibrary, {"context", "policyId", "processRequirement"},
                    [&](const Faults& faults) {
                        KSTContextRef given = faults.orNull(0, context);
                        const char* policy = faults.orNull(1, "p");
                        const KSTPolicyBlock block = faults.has(2) ? KSTPolicyBlock() : look;
                        return withPreflight
                                   ? KSTContextVerifyPolicyWithPreflight(given, policy, true, block)
                                   : KSTContextVerifyPolicy(given, policy, block);
                    });
    }
    // These call their block after a failure, too.
    KSTStatus seen = kKSTErrorBadParameter;
    const auto learn = [&](KSTStatus status, bool, const KSTRequirement*) {
        seen = status;
    };
    expectOrder(kLibrary, {"context", "policyId", "processRequirement"}, [&](const Faults& faults) {
        KSTContextVerifyPolicyEx(faults.orNull(0, context), faults.orNull(1, "p"), false, nullptr,
                                 0, 0, faults.has(2) ? KSTPolicyStatusBlock() : learn);
        return seen;
    });
    expectOrder(kLibrary, {"context", "aclConstraint && aclConstraintLength", "processRequirement"},
                [&](const Faults& faults) {
                    KSTContextVerifyAclConstraint(faults.orNull(0, context), faults.orNull(1, "c"),
                                                  1, false, nullptr, 0, 0,
                                                  faults.has(2) ? KSTPolicyStatusBlock() : learn);
                    return seen;
                });
    const auto learnOfBytes = [&](KSTStatus status, const void*, std::size_t) {
        seen = status;
    };
    expectOrder(kLibrary, {"acl && aclLength", "processConstraintCharacteristics"},
                [&](const Faults& faults) {
                    return KSTParseAclAndCopyConstraintCharacteristics(
                        faults.orNull(0, "a"), 1,
                        faults.has(1) ? KSTStatusDataBlock() : learnOfBytes);
                });
}
