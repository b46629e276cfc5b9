// Every exported function that talks to the kernel service, against the program: what it sends, and
// what its caller learns when the kernel side fails it.

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "base/Concat.h"
#include "tests/keystrand-sim/LibraryClient.h"

#include <algorithm>
#include <functional>
#include <map>
#include <set>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

using Words = std::vector<std::string>;
using Codes = std::vector<std::string>;

/// What stands for a failure of a function without a status.
constexpr KSTStatus kNothing = 1;

constexpr std::uint32_t kAnyAge = 0xffffffff;

/// One exported function.
struct Function {
    std::string name;
    /// Calls it so that it succeeds.
    std::function<KSTStatus()> call;
    /// The commands that it sends, in their order.
    Codes commands;
    /// What the caller learns when the kernel side fails one of them with -42, where that is not
    /// -42.
    std::map<std::string, KSTStatus> otherFailures = {};
};

/// The exported names that send nothing: they work on the caller's memory.
const std::set<std::string> kPure = {
    "CompareCredentials",
    "CompareDataBlobs",
    "CopyCredential",
    "DeallocCredential",
    "DeallocCredentialList",
    "DeallocDataBlob",
    "DeallocParameters",
    "DeallocRequirement",
    "DeserializeAddCredential",
    "DeserializeCredential",
    "DeserializeCredentialList",
    "DeserializeGetContextProperty",
    "DeserializeProcessAcl",
    "DeserializeRemoveCredential",
    "DeserializeReplacePassphraseCredential",
    "DeserializeRequirement",
    "DeserializeVerifyAclConstraint",
    "DeserializeVerifyPolicy",
    "GetSerializedAddCredentialSize",
    "GetSerializedCredentialSize",
    "GetSerializedGetContextPropertySize",
    "GetSerializedParametersLength",
    "GetSerializedProcessAclSize",
    "GetSerializedRemoveCredentialSize",
    "GetSerializedReplacePassphraseCredentialSize",
    "GetSerializedRequirementSize",
    "GetSerializedVerifyAclConstraintSize",
    "GetSerializedVerifyPolicySize",
    "KSTCredentialCreate",
    "KSTCredentialDelete",
    "KSTCredentialGetProperty",
    "KSTCredentialGetPropertyData",
    "KSTCredentialGetType",
    "KSTCredentialSetProperty",
    "KSTRequirementGetPriority",
    "KSTRequirementGetProperties",
    "KSTRequirementGetProperty",
    "KSTRequirementGetPropertyData",
    "KSTRequirementGetState",
    "KSTRequirementGetSubrequirements",
    "KSTRequirementGetType",
    "LibCall_BuildCommand",
    "LibCall_KSTCredentialCreate",
    "LibCall_KSTCredentialDelete",
    "LibCall_KSTCredentialGetPropertyData",
    "LibCall_KSTCredentialGetType",
    "LibCall_KSTCredentialSetProperty",
    "LibCall_KSTRequirementDelete",
    "LibCall_KSTRequirementGetPriority",
    "LibCall_KSTRequirementGetPropertyData",
    "LibCall_KSTRequirementGetState",
    "LibCall_KSTRequirementGetType",
    "SerializeAddCredential",
    "SerializeCredential",
    "SerializeCredentialList",
    "SerializeGetContextProperty",
    "SerializeProcessAcl",
    "SerializeRemoveCredential",
    "SerializeReplacePassphraseCredential",
    "SerializeRequirement",
    "SerializeVerifyAclConstraint",
    "SerializeVerifyPolicy",
    "ValidateParameter",
    "gAllocatedBytes",
    "gLastAllocatedBytes",
};

std::set<std::string> exportedSymbols() {
    std::set<std::string> names;
    std::ifstream list(EXPORTED_SYMBOLS);
    for (std::string name, version; list >> name >> version;) {
        names.insert(name);
    }
    return names;
}

std::vector<std::string> without(const std::set<std::string>& all,
                                 const std::set<std::string>& some) {
    std::vector<std::string> left;
    std::set_difference(all.begin(), all.end(), some.begin(), some.end(), std::back_inserter(left));
    return left;
}

/// The word of a line behind another one.
std::string wordBehind(const std::string& line, const std::string& key) {
    const std::string spaced = " " + line + " ";
    const std::size_t at = spaced.find(" " + key + " ");
    const std::size_t begin = at + key.size() + 2;
    return at == std::string::npos ? "" : spaced.substr(begin, spaced.find(' ', begin) - begin);
}

/// Keeps the status that a block is told.
struct StatusBlock {
    void operator()(KSTStatus told, bool satisfied, const KSTRequirement* requirement) {
        status = told;
        answer = satisfied ? "satisfied" : textOf(requirement);
    }

    KSTStatus status = kNothing;
    std::string answer;
};

class EveryFunctionTest : public LibraryClient {
  protected:
    /// A context with a credential that no function of the table takes out, and the library at a
    /// level at which it tells of every call.
    void SetUp() override {
        LibraryClient::SetUp();
        startWith("policy open = continuity-unlock\n"
                  "policy pay = all-of(marker-4, passphrase(once))\n");
        tell("log-level 30");
        ASSERT_EQ(KSTContextCreate(&context_), 0);
        form_ = externalForm(context_);
        ASSERT_EQ(form_.size(), 16U);
        ASSERT_EQ(KSTContextAddCredential(context_, make(9).get()), 0);
        ASSERT_EQ(KSTContextAddCredential(context_, makePassphrase("kept", 7).get()), 0);
    }

    void TearDown() override {
        EXPECT_EQ(KSTContextDelete(context_, false), 0);
        LibraryClient::TearDown();
    }

    /// The commands that the kernel side received since the last look.
    Codes received(const std::string& status) {
        Codes codes;
        for (const std::string& line : tell("requests").lines) {
            codes.push_back(wordBehind(line, "command"));
            EXPECT_EQ(wordBehind(line, "status"), status) << line;
        }
        tell("requests clear");
        return codes;
    }

    /// The types of the credentials in the context, or of the global ones.
    Words types(bool global) {
        Words types;
        const std::string context = tell("contexts").lines.front();
        for (const std::string& line :
             tell("credentials" + (global ? "" : " " + wordBehind(context, "context"))).lines) {
            types.push_back(wordBehind(line, "type"));
        }
        return types;
    }

    KSTContextRef createOverChannel() {
        KSTContextRef made = nullptr;
        status_ = LibCall_KSTContextCreate(kst::channelTransport, &made, nullptr);
        return made;
    }

    /// Creates a context and has `destroy` end both ends of it.
    KSTStatus createAnd(const std::function<KSTStatus(KSTContextRef)>& destroy) {
        KSTContextRef made = createOverChannel();
        if (made == nullptr) {
            return status_;
        }
        const KSTStatus status = destroy(made);
        if (status != 0) {
            EXPECT_EQ(KSTContextDelete(made, false), 0);
        }
        return status;
    }

    KSTStatus open() {
        KSTContextRef opened = KSTContextCreateWithExternalForm(form_.data(), form_.size());
        return opened == nullptr ? kNothing : KSTContextDelete(opened, false);
    }

    KSTStatus create() {
        KSTContextRef made = nullptr;
        const KSTStatus status = KSTContextCreate(&made);
        return status != 0 ? status : KSTContextDelete(made, false);
    }

    KSTStatus verifyEx(const char* policy) {
        StatusBlock block;
        KSTContextVerifyPolicyEx(context_, policy, false, nullptr, 0, kAnyAge, block);
        return block.status;
    }

    KSTStatus verifyGlobally() {
        StatusBlock block;
        KSTGlobalContextVerifyPolicy("pay", false, nullptr, 0, block);
        return block.status;
    }

    StatusBlock verifyAcl(const std::string& constraint, bool preflight = false,
                          std::uint32_t age = 0, const KSTParameter* parameter = nullptr) {
        StatusBlock block;
        KSTContextVerifyAclConstraint(context_, constraint.data(), constraint.size(), preflight,
                                      parameter, parameter == nullptr ? 0 : 1, age, block);
        return block;
    }

    /// Has a list parsed; the block must be told the same status.
    KSTStatus parse(const std::string& list, ByteVector* characteristics = nullptr) {
        KSTStatus told = kNothing;
        const KSTStatus status = KSTParseAclAndCopyConstraintCharacteristics(
            list.data(), list.size(),
            [&](KSTStatus blockStatus, const void* data, std::size_t size) {
                told = blockStatus;
                if (characteristics != nullptr && data != nullptr) {
                    *characteristics = bytesAt(data, size);
                }
            });
        EXPECT_EQ(told, status);
        return status;
    }

    KSTStatus verifyOverChannel() {
        bool satisfied = true;
        KSTRequirement* requirement = nullptr;
        const KSTStatus status = LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
            kst::channelTransport, context_, "pay", true, nullptr, 0, kAnyAge, &satisfied,
            &requirement);
        if (status == 0) {
            EXPECT_FALSE(satisfied);
            EXPECT_EQ(LibCall_KSTRequirementDelete(kst::channelTransport, requirement), 0);
        }
        return status;
    }

    static void ignore(const void* /*data*/, std::size_t /*length*/) {}

    /// All of them, by their names.
    std::vector<Function> functions() {
        const auto ignorePolicy = [](bool, const KSTRequirement*) {
        };
        return {
            {"KSTContextAddCredential",
             [this] { return KSTContextAddCredential(context_, make(4).get()); },
             {"5"}},
            {"KSTContextAddCredentialWithScope",
             [this] { return KSTContextAddCredentialWithScope(context_, make(4).get(), 2); },
             {"5"}},
            {"KSTContextContainsCredentialType",
             [this] { return KSTContextContainsCredentialType(context_, 9); },
             {"4"}},
            {"KSTContextContainsCredentialTypeEx",
             [this] { return KSTContextContainsCredentialTypeEx(context_, 9, 1); },
             {"4"}},
            {"KSTContextContainsPassphraseCredentialWithPurpose",
             [this] { return KSTContextContainsPassphraseCredentialWithPurpose(context_, 7, 0); },
             {"13"}},
            {"KSTContextCreate", [this] { return create(); }, {"1"}},
            {"KSTContextCreateWithExternalForm",
             [this] { return open(); },
             {"18"},
             {{"18", kNothing}}},
            {"KSTContextDelete",
             [this] {
                 return createAnd([](KSTContextRef made) { return KSTContextDelete(made, true); });
             },
             {"1", "2"}},
            {"KSTContextGetExternalForm",
             [this] { return externalForm(context_) == form_ ? 0 : kNothing; },
             {"19"},
             {{"19", kNothing}}},
            {"KSTContextRemoveCredentialsByType",
             [this] { return KSTContextRemoveCredentialsByType(context_, 4); },
             {"9"}},
            {"KSTContextRemoveCredentialsByTypeAndScope",
             [] { return KSTContextRemoveCredentialsByTypeAndScope(nullptr, 4, 2); },
             {"9"}},
            {"KSTContextRemoveCredentialsByValue",
             [this] { return KSTContextRemoveCredentialsByValue(context_, make(4).get()); },
             {"6"}},
            {"KSTContextRemoveCredentialsByValueAndScope",
             [] { return KSTContextRemoveCredentialsByValueAndScope(nullptr, make(4).get(), 2); },
             {"6"}},
            {"KSTContextRemovePassphraseCredentialsByPurposeAndScope",
             [this] {
                 return KSTContextRemovePassphraseCredentialsByPurposeAndScope(context_, 8, 1);
             },
             {"16"}},
            {"KSTContextReplacePassphraseCredentialsWithScope",
             [this] {
                 return KSTContextReplacePassphraseCredentialsWithScope(
                     context_, makePassphrase("renewed", 8).get(), 1);
             },
             {"15"}},
            {"KSTContextVerifyAclConstraint",
             [this] { return verifyAcl("policy open").status; },
             {"11"}},
            {"KSTContextVerifyPolicy",
             [=, this] { return KSTContextVerifyPolicy(context_, "open", ignorePolicy); },
             {"3"}},
            {"KSTContextVerifyPolicyEx", [this] { return verifyEx("open"); }, {"3"}},
            {"KSTContextVerifyPolicyWithPreflight",
             [=, this] {
                 return KSTContextVerifyPolicyWithPreflight(context_, "open", true, ignorePolicy);
             },
             {"3"}},
            {"KSTGetEnvironmentVariable",
             [] { return KSTGetEnvironmentVariable(3, ignore); },
             {"25"}},
            // What becomes of the temporary context changes nothing about the result.
            {"KSTGlobalContextAddCredential",
             [] { return KSTGlobalContextAddCredential(make(5).get()); },
             {"1", "5", "2"},
             {{"2", 0}}},
            {"KSTGlobalContextRemoveCredentialsByType",
             [] { return KSTGlobalContextRemoveCredentialsByType(5); },
             {"1", "9", "2"},
             {{"2", 0}}},
            {"KSTGlobalContextVerifyPolicy",
             [this] { return verifyGlobally(); },
             {"1", "3", "2"},
             {{"2", 0}}},
            {"KSTKernelControl", [] { return KSTKernelControl(5, "\1", 1, ignore); }, {"26"}},
            {"KSTParseAclAndCopyConstraintCharacteristics",
             [this] { return parse("allow sign = marker-4"); },
             {"20"}},
            {"KSTSetEnvironmentVariable",
             [] { return KSTSetEnvironmentVariable(3, "v", 1); },
             {"24"}},
            {"LibCall_KSTContexAddCredentialWithScope",
             [this] {
                 return LibCall_KSTContexAddCredentialWithScope(kst::channelTransport, context_,
                                                                make(4).get(), 1);
             },
             {"5"}},
            {"LibCall_KSTContexRemoveCredentialsByTypeAndScope",
             [this] {
                 return LibCall_KSTContexRemoveCredentialsByTypeAndScope(kst::channelTransport,
                                                                         context_, 4, 1);
             },
             {"9"}},
            {"LibCall_KSTContextCreate",
             [this] {
                 return createAnd([](KSTContextRef made) {
                     return LibCall_KSTContextDelete(kst::channelTransport, made, false);
                 });
             },
             {"1"}},
            {"LibCall_KSTContextDelete",
             [this] {
                 return createAnd([](KSTContextRef made) {
                     return LibCall_KSTContextDelete(kst::channelTransport, made, true);
                 });
             },
             {"1", "2"}},
            {"LibCall_KSTContextVerifyPolicyAndCopyRequirementEx",
             [this] { return verifyOverChannel(); },
             {"3"}},
            {"LibCall_KSTGetEnvironmentVariable_Block",
             [] {
                 return LibCall_KSTGetEnvironmentVariable_Block(kst::channelTransport, nullptr, 3,
                                                                ignore);
             },
             {"25"}},
            {"LibCall_KSTKernelControl_Block",
             [] {
                 return LibCall_KSTKernelControl_Block(kst::channelTransport, nullptr, 5, "\1", 1,
                                                       nullptr);
             },
             {"26"}},
            {"LibCall_KSTSetEnvironmentVariable",
             [] {
                 return LibCall_KSTSetEnvironmentVariable(kst::channelTransport, nullptr, 3, "v",
                                                          1);
             },
             {"24"}},
        };
    }

    [[nodiscard]] bool logHas(const std::string& line) const {
        const auto texts = log_.texts();
        return std::find(texts.begin(), texts.end(), line) != texts.end();
    }

    KSTContextRef context_ = nullptr;
    ByteVector form_;
    KSTStatus status_ = 0;
};

TEST_F(EveryFunctionTest, ExportedListIsWhatIsCalledHereAndWhatIsPure) {
    std::set<std::string> known = kPure;
    for (const Function& function : functions()) {
        EXPECT_TRUE(known.insert(function.name).second) << function.name;
    }
    const std::set<std::string> exported = exportedSymbols();
    EXPECT_THAT(without(exported, known), testing::IsEmpty()) << "are exported and not called here";
    EXPECT_THAT(without(known, exported), testing::IsEmpty()) << "are here and not exported";
}

TEST_F(EveryFunctionTest, SendsItsCommands) {
    tell("requests clear");
    for (const Function& function : functions()) {
        SCOPED_TRACE(function.name);
        log_.clear();
        EXPECT_EQ(function.call(), 0);
        EXPECT_EQ(received("0"), function.commands);
        // A LibCall function tells of its failures only.
        EXPECT_EQ(logHas(base::concat("KSTLib: ", function.name, ": called.\n")),
                  function.name.rfind("KST", 0) == 0);
    }
}

TEST_F(EveryFunctionTest, StatusOfTheKernelSideReachesTheCaller) {
    for (const Function& function : functions()) {
        SCOPED_TRACE(function.name);
        for (const std::string& command : function.commands) {
            SCOPED_TRACE(command);
            tell(base::concat("fault command=", command, " status=-42"));
            const auto other = function.otherFailures.find(command);
            EXPECT_EQ(function.call(), other != function.otherFailures.end() ? other->second : -42);
            EXPECT_EQ(SimulatorProcess::ask("status", "faults"), "0");
        }
        EXPECT_EQ(function.call(), 0);
    }
}

TEST_F(EveryFunctionTest, BrokenConnectionReachesTheCallerAndTheNextCallConnectsAnew) {
    constexpr KSTStatus kReset = -1104;
    constexpr KSTStatus kProtocol = -1071;
    const std::pair<std::string, KSTStatus> faults[] = {
        {"hang-up", kReset}, {"garbage=5", kProtocol}, {"wrong-sequence", kProtocol}};
    for (const Function& function : functions()) {
        SCOPED_TRACE(function.name);
        const std::string& command = function.commands.front();
        for (const auto& [fault, status] : faults) {
            tell(base::concat("fault command=", command, " ", fault));
            const auto other = function.otherFailures.find(command);
            EXPECT_EQ(function.call(),
                      other != function.otherFailures.end() ? other->second : status);
        }
        EXPECT_EQ(function.call(), 0);
    }
}

TEST_F(EveryFunctionTest, RepliesOfOtherSizes) {
    const std::map<std::string, std::map<std::size_t, KSTStatus>> replies = {
        {"KSTContextCreate", {{0, -5}, {16, -5}, {17, 0}, {18, -5}}},
        {"LibCall_KSTContextCreate", {{0, -5}, {16, -5}, {17, 0}, {18, -5}}},
        {"KSTContextCreateWithExternalForm", {{0, kNothing}, {4, kNothing}, {5, 0}, {6, kNothing}}},
        {"KSTContextVerifyPolicy", {{0, -5}, {3, -5}, {4, 0}, {5, -3}, {4097, -5}}},
        {"KSTContextVerifyPolicyEx", {{0, -5}, {3, -5}, {4, 0}, {5, -3}, {4097, -5}}},
        {"KSTContextVerifyAclConstraint", {{0, -5}, {3, -5}, {4, 0}, {5, -3}, {4097, -5}}},
        {"KSTContextContainsCredentialType", {{0, -7}, {1, 0}, {4, 0}, {5, -5}}},
        {"KSTContextContainsPassphraseCredentialWithPurpose", {{0, -7}, {1, 0}, {4, 0}, {5, -5}}},
        {"KSTParseAclAndCopyConstraintCharacteristics", {{0, 0}, {1, 0}, {4096, 0}, {4097, -5}}},
        {"KSTGetEnvironmentVariable", {{0, 0}, {64, 0}, {65, -5}}},
        {"KSTKernelControl", {{0, 0}, {256, 0}, {257, -5}}},
        {"KSTSetEnvironmentVariable", {{0, 0}, {1, -5}}},
        {"KSTContextAddCredential", {{0, 0}, {1, -5}}},
        {"KSTContextRemoveCredentialsByValue", {{0, 0}, {1, -5}}},
        {"KSTContextRemoveCredentialsByType", {{0, 0}, {1, -5}}},
        {"KSTContextReplacePassphraseCredentialsWithScope", {{0, 0}, {1, -5}}},
        {"KSTContextRemovePassphraseCredentialsByPurposeAndScope", {{0, 0}, {1, -5}}},
        {"KSTContextGetExternalForm", {{0, 0}, {1, kNothing}}},
        {"LibCall_KSTContexAddCredentialWithScope", {{0, 0}, {1, -5}}},
    };
    std::size_t found = 0;
    for (const Function& function : functions()) {
        const auto sizes = replies.find(function.name);
        if (sizes == replies.end()) {
            continue;
        }
        ++found;
        for (const auto& [size, status] : sizes->second) {
            SCOPED_TRACE(base::concat(function.name, " ", size));
            tell(base::concat("fault command=", function.commands.front(), " reply=", size));
            EXPECT_EQ(function.call(), status);
        }
        EXPECT_EQ(function.call(), 0);
    }
    EXPECT_EQ(found, replies.size());
}

TEST_F(EveryFunctionTest, AbsentServiceIsLookedForAgain) {
    connect();
    tell("fault entry absent");
    for (const Function& function : functions()) {
        SCOPED_TRACE(function.name);
        const auto& others = function.otherFailures;
        const auto other = others.find(function.commands.front());
        EXPECT_EQ(function.call(), other != others.end() ? other->second : kKSTErrorUnexpected);
    }
    tell("fault entry present");
    for (const Function& function : functions()) {
        EXPECT_EQ(function.call(), 0) << function.name;
    }
}

TEST_F(EveryFunctionTest, CredentialsGoWhereTheScopeSays) {
    const OwnedCredential marker = make(4);
    const Words kept = {"9", "2"};
    const struct {
        bool withContext;
        KSTScope scope;
    } kPlaces[] = {{true, 1}, {true, 2}, {false, 2}};
    for (const auto& place : kPlaces) {
        SCOPED_TRACE(base::concat(place.withContext ? "with" : "without", " a context, scope ",
                                  place.scope));
        KSTContextRef context = place.withContext ? context_ : nullptr;
        const bool global = place.scope == 2;
        const KSTScope scope = place.scope;
        const auto expectThere = [&](const Words& added) {
            Words own = kept;
            own.insert(own.end(), added.begin(), added.end());
            EXPECT_EQ(types(false), global ? kept : own);
            EXPECT_EQ(types(true), global ? added : Words());
        };
        EXPECT_EQ(KSTContextAddCredentialWithScope(context, marker.get(), scope), 0);
        expectThere({"4"});
        EXPECT_EQ(KSTContextContainsCredentialTypeEx(context_, 4, scope), 0);
        EXPECT_EQ(KSTContextContainsCredentialTypeEx(context_, 4, 3 - scope), -7);
        EXPECT_EQ(KSTContextRemoveCredentialsByTypeAndScope(context, 5, scope), 0);
        expectThere({"4"});
        EXPECT_EQ(KSTContextRemoveCredentialsByTypeAndScope(context, 4, scope), 0);
        expectThere({});
        EXPECT_EQ(KSTContextAddCredentialWithScope(context, marker.get(), scope), 0);
        EXPECT_EQ(KSTContextRemoveCredentialsByValueAndScope(context, make(5).get(), scope), 0);
        expectThere({"4"});
        EXPECT_EQ(KSTContextRemoveCredentialsByValueAndScope(context, marker.get(), scope), 0);
        expectThere({});
        for (const char* text : {"old", "new"}) {
            EXPECT_EQ(KSTContextReplacePassphraseCredentialsWithScope(
                          context, makePassphrase(text, 8).get(), scope),
                      0);
            expectThere({"2"});
        }
        EXPECT_EQ(KSTContextContainsPassphraseCredentialWithPurpose(context_, 8, scope), 0);
        EXPECT_EQ(KSTContextContainsPassphraseCredentialWithPurpose(context_, 8, 3 - scope), -7);
        EXPECT_EQ(KSTContextRemovePassphraseCredentialsByPurposeAndScope(context, 8, scope), 0);
        expectThere({});
    }
}

TEST_F(EveryFunctionTest, ScopesThatTheKernelSideRefuses) {
    constexpr KSTStatus kBadPayload = -6007;
    for (const KSTScope scope : {0U, 3U}) {
        EXPECT_EQ(KSTContextAddCredentialWithScope(context_, make(4).get(), scope), kBadPayload);
        EXPECT_EQ(KSTContextRemoveCredentialsByTypeAndScope(context_, 4, scope), kBadPayload);
    }
    EXPECT_EQ(KSTContextContainsCredentialTypeEx(context_, 4, 3), kBadPayload);
    tell("requests clear");
    EXPECT_EQ(KSTContextAddCredentialWithScope(nullptr, make(4).get(), 1), -3);
    EXPECT_EQ(KSTContextRemoveCredentialsByTypeAndScope(nullptr, 4, 1), -3);
    EXPECT_EQ(KSTContextContainsCredentialTypeEx(nullptr, 4, 2), -3);
    EXPECT_EQ(received("0"), Codes());
}

TEST_F(EveryFunctionTest, ExternalFormOutlivesTheObject) {
    KSTContextRef made = createOverChannel();
    ASSERT_NE(made, nullptr);
    const ByteVector form = externalForm(made);
    EXPECT_EQ(LibCall_KSTContextDelete(kst::channelTransport, made, false), 0);
    EXPECT_EQ(contexts(), 2U);
    KSTContextRef opened = KSTContextCreateWithExternalForm(form.data(), form.size());
    ASSERT_NE(opened, nullptr);
    EXPECT_EQ(externalForm(opened), form);
    EXPECT_EQ(KSTContextDelete(opened, true), 0);
    EXPECT_EQ(contexts(), 1U);
    EXPECT_EQ(KSTContextCreateWithExternalForm(form.data(), form.size()), nullptr);
}

TEST_F(EveryFunctionTest, TwinCopiesTheRequirement) {
    ASSERT_EQ(KSTContextAddCredential(context_, make(4).get()), 0);
    ASSERT_EQ(KSTContextRemovePassphraseCredentialsByPurposeAndScope(context_, 7, 1), 0);
    bool satisfied = true;
    KSTRequirement* requirement = nullptr;
    const auto verify = [&] {
        return LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
            kst::channelTransport, context_, "pay", false, nullptr, 0, 0, &satisfied, &requirement);
    };
    ASSERT_EQ(verify(), 0);
    EXPECT_FALSE(satisfied);
    EXPECT_EQ(textOf(requirement), "4(2)");
    EXPECT_EQ(LibCall_KSTRequirementGetType(requirement), 4U);
    EXPECT_EQ(LibCall_KSTRequirementDelete(kst::channelTransport, requirement), 0);
    ASSERT_EQ(LibCall_KSTContexAddCredentialWithScope(kst::channelTransport, context_,
                                                      makePassphrase("once", 1).get(), 1),
              0);
    ASSERT_EQ(verify(), 0);
    EXPECT_TRUE(satisfied);
    EXPECT_EQ(requirement, nullptr);
    ASSERT_EQ(verify(), 0);
    EXPECT_FALSE(satisfied);
    EXPECT_EQ(LibCall_KSTRequirementDelete(kst::channelTransport, requirement), 0);
}

TEST_F(EveryFunctionTest, ConstraintWithPreflightAgeAndUser) {
    const OwnedCredential marker = make(4);
    const std::uint32_t user = 1000;
    ASSERT_EQ(KSTCredentialSetProperty(marker.get(), 5, &user, sizeof user), 0);
    ASSERT_EQ(KSTGlobalContextAddCredential(marker.get()), 0);
    tell("clock advance 10");
    EXPECT_EQ(verifyAcl("marker-4", false, 0).answer, "14");
    EXPECT_EQ(verifyAcl("marker-4", false, 9).answer, "14!");
    EXPECT_EQ(verifyAcl("marker-4", false, 10).answer, "satisfied");
    EXPECT_EQ(verifyAcl("marker-4", false, kAnyAge).answer, "satisfied");
    const std::uint32_t other = 1001;
    const KSTParameter parameters[] = {{4, &user, sizeof user}, {4, &other, sizeof other}};
    EXPECT_EQ(verifyAcl("marker-4", false, kAnyAge, &parameters[0]).answer, "satisfied");
    EXPECT_EQ(verifyAcl("marker-4", false, kAnyAge, &parameters[1]).answer, "14");
    for (const bool preflight : {true, true, false}) {
        EXPECT_EQ(verifyAcl("marker-4(once)", preflight, kAnyAge).answer, "satisfied");
    }
    EXPECT_EQ(verifyAcl("marker-4(once)", false, kAnyAge).answer, "14");
}

TEST_F(EveryFunctionTest, AccessListsAreParsed) {
    ByteVector characteristics;
    EXPECT_EQ(
        parse("allow read = policy pay  allow sign = any-of(marker-4, biometry)", &characteristics),
        0);
    EXPECT_EQ(characteristics, Bytes()
                                   .u32(2)
                                   .u32(1U << 4U | 1U << 2U)
                                   .u32(1U << 4U | 1U << 2U)
                                   .u32(1U << 4U | 1U << 3U)
                                   .u32(0)
                                   .get());
    EXPECT_EQ(parse("allow read"), -6014);
    EXPECT_EQ(parse("allow read = policy gone"), -6013);
    EXPECT_EQ(parse(std::string(4097, ' ')), -6007);
}

TEST_F(EveryFunctionTest, GlobalPolicyLooksAtGlobalCredentialsOfAnyAge) {
    ASSERT_EQ(KSTGlobalContextAddCredential(make(9).get()), 0);
    tell("clock advance 1000000");
    StatusBlock block;
    KSTGlobalContextVerifyPolicy("open", false, nullptr, 0, block);
    EXPECT_EQ(block.answer, "satisfied");
    ASSERT_EQ(KSTGlobalContextRemoveCredentialsByType(9), 0);
    KSTGlobalContextVerifyPolicy("open", false, nullptr, 0, block);
    EXPECT_EQ(block.answer, "9");
    EXPECT_EQ(contexts(), 1U);
}

TEST_F(EveryFunctionTest, EnvironmentVariables) {
    const auto valueOf = [](std::uint32_t variable) {
        ByteVector value = {0xee};
        EXPECT_EQ(KSTGetEnvironmentVariable(variable,
                                            [&](const void* data, std::size_t length) {
                                                EXPECT_EQ(data == nullptr, length == 0);
                                                value = bytesAt(data, length);
                                            }),
                  0);
        return value;
    };
    const ByteVector longest(64, 0x5a);
    EXPECT_EQ(valueOf(7), ByteVector());
    EXPECT_EQ(KSTSetEnvironmentVariable(7, longest.data(), longest.size()), 0);
    EXPECT_EQ(valueOf(7), longest);
    EXPECT_EQ(SimulatorProcess::ask("env get 7", "value").size(), 128U);
    tell("env set 7 c0ffee");
    EXPECT_EQ(valueOf(7), (ByteVector{0xc0, 0xff, 0xee}));
    EXPECT_EQ(KSTSetEnvironmentVariable(7, nullptr, 0), 0);
    EXPECT_EQ(valueOf(7), ByteVector());
    for (std::uint32_t variable = 100; variable < 164; ++variable) {
        EXPECT_EQ(KSTSetEnvironmentVariable(variable, "v", 1), 0);
    }
    EXPECT_EQ(KSTSetEnvironmentVariable(164, "v", 1), -6009);
}

TEST_F(EveryFunctionTest, KernelControl) {
    for (const char* allowed : {"off", "on"}) {
        const std::uint8_t byte = allowed == std::string("on") ? 1 : 0;
        EXPECT_EQ(KSTKernelControl(5, &byte, 1, nullptr), 0);
        EXPECT_EQ(SimulatorProcess::ask("status", "allowed"), allowed);
    }
    ByteVector seen;
    const auto keep = [&](const void* data, std::size_t length) {
        seen = bytesAt(data, length);
    };
    EXPECT_EQ(KSTKernelControl(99, nullptr, 0, keep), -6006);
    EXPECT_EQ(seen, ByteVector(256));
    EXPECT_EQ(KSTKernelControl(5, "\1\1", 2, keep), -6007);
    tell("fault command=26 reply=3");
    EXPECT_EQ(KSTKernelControl(99, nullptr, 0, keep), 0);
    EXPECT_EQ(seen, (ByteVector{1, 2, 3}));
}

TEST_F(EveryFunctionTest, LogLevelComesFromTheKernelSide) {
    EXPECT_EQ(kst::gLogLevel, 30);
    tell("log-level 20");
    log_.clear();
    EXPECT_EQ(KSTContextCreate(nullptr), -3);
    EXPECT_EQ(kst::gLogLevel, 20);
    EXPECT_TRUE(logHas("KSTLib: updateLogLevel: log level set to 20.\n"));
    tell("log-level 25");
    EXPECT_EQ(open(), 0);
    EXPECT_EQ(kst::gLogLevel, 25);
    tell("log-level 200");
    log_.clear();
    EXPECT_EQ(create(), 0);
    EXPECT_EQ(kst::gLogLevel, 200);
    // Above the severity of a failure only failed checks are written.
    log_.clear();
    tell("log-level 10");
    tell("fault command=24 status=-42");
    EXPECT_EQ(KSTSetEnvironmentVariable(1, "v", 1), -42);
    EXPECT_EQ(kst::gLogLevel, 200);
    for (const std::string& line : log_.texts()) {
        EXPECT_NE(line.find(": AssertMacros: "), std::string::npos) << line;
    }
    std::uint8_t level = 0;
    KSTContextRef made = nullptr;
    ASSERT_EQ(LibCall_KSTContextCreate(kst::channelTransport, &made, &level), 0);
    EXPECT_EQ(level, 10);
    EXPECT_EQ(kst::gLogLevel, 200);
    EXPECT_EQ(LibCall_KSTContextDelete(kst::channelTransport, made, true), 0);
}

} // namespace

} // namespace keystrand::sim::test
