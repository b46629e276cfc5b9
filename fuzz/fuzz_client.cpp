// Whole client calls against a kernel side that answers whatever the input says, with an allocation
// that fails where the input says. Whatever happens: nothing is read or written out of bounds,
// every block is called as often as it is promised, and nothing stays allocated.

#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Platform.h"
#include "KSTLib/Serialization.h"
#include "base/NotCopied.h"
#include "fuzz/Payloads.h"

#include <array>
#include <cstdio>
#include <optional>
#include <string>

namespace {

using fuzz::require;

/// Hands the input out piece by piece, and zeros when it is used up.
class Script {
  public:
    explicit Script(std::span<const std::uint8_t> bytes) : rest_(bytes) {}

    [[nodiscard]] bool isOver() const { return rest_.empty(); }

    /// In memory of their own, so that nobody reads past their end unseen.
    std::vector<std::uint8_t> bytes(std::size_t count) {
        std::vector<std::uint8_t> taken(count);
        fill(taken);
        return taken;
    }

    void fill(std::span<std::uint8_t> bytes) {
        const auto there = rest_.first(std::min(bytes.size(), rest_.size()));
        std::fill(std::copy(there.begin(), there.end(), bytes.begin()), bytes.end(), 0);
        rest_ = rest_.subspan(there.size());
    }

    std::uint8_t byte() {
        std::array<std::uint8_t, 1> taken{};
        fill(taken);
        return taken[0];
    }

    std::uint16_t word() {
        std::array<std::uint8_t, 2> taken{};
        fill(taken);
        return static_cast<std::uint16_t>(taken[0] | (taken[1] << 8U));
    }

  private:
    std::span<const std::uint8_t> rest_;
};

class NoLog : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        require(!text.empty());
    }
};

class ScriptedKernel : public platform::KernelChannel, public platform::ServiceRegistry {
  public:
    explicit ScriptedKernel(Script& script) : script_(script) {}

    /// Contexts that KSTContextCreate made, each of which leaves one byte in the account.
    std::int64_t created = 0;
    /// Whether contexts are made by something else now.
    bool isOtherCreation = false;

    platform::ServiceHandle findByPath(std::string_view /*path*/) override { return 1; }
    platform::ServiceHandle findByClassName(std::string_view /*name*/) override { return 1; }
    std::optional<std::vector<std::uint8_t>> copyProperty(platform::ServiceHandle /*entry*/,
                                                          std::string_view /*name*/) override {
        return std::nullopt;
    }
    void release(platform::ServiceHandle /*entry*/) override {}

    platform::Status open(platform::ServiceHandle /*service*/, std::uint32_t /*connectionType*/,
                          platform::ConnectionHandle* connection) override {
        *connection = 1;
        return 0;
    }

    platform::Status structCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const void* input,
                                std::size_t inputSize, void* output,
                                std::size_t* outputSize) override {
        const auto* frame = static_cast<const std::uint8_t*>(input);
        require(inputSize >= 8 && std::memcmp(frame, "DRCS", 4) == 0);
        const std::uint8_t status = script_.byte();
        if (status >= 0xf0) {
            return status - 0x100;
        }
        // The usual size of the reply to the command, or any.
        const std::size_t reported = status < 0x80 ? usualSize(frame[4]) : script_.word();
        const std::size_t offered = *outputSize;
        script_.fill({static_cast<std::uint8_t*>(output), std::min(reported, offered)});
        *outputSize = reported;
        created += frame[4] == 1 && reported == 17 && !isOtherCreation ? 1 : 0;
        return 0;
    }

    platform::Status scalarCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const std::uint64_t* /*inputs*/,
                                std::uint32_t /*inputCount*/, std::uint64_t* outputs,
                                std::uint32_t* outputCount) override {
        const std::uint8_t level = script_.byte();
        *outputs = level;
        *outputCount = level == 0 ? 0 : 1;
        return level == 1 ? -1 : 0;
    }

  private:
    static std::size_t usualSize(std::uint8_t code) {
        switch (code) {
        case 1:
            return 17;
        case 3:
        case 11:
            return 128;
        case 4:
        case 13:
            return 4;
        case 18:
            return 5;
        case 20:
        case 25:
        case 26:
            return 20;
        default:
            return 0;
        }
    }

    Script& script_;
};

/// Refuses one allocation of the call.
class RefusingGate : public fuzz::SizeLimit {
  public:
    void refuse(std::uint8_t number) { left_ = number; }

    bool admits(std::size_t size) override {
        return (left_ == 0 || --left_ != 0) && SizeLimit::admits(size);
    }

  private:
    /// 0: none.
    std::uint8_t left_ = 0;
};

/// Looks at every byte of a tree.
void walk(const KSTRequirement* requirement) {
    const auto property = [](std::uint32_t, const void* data, std::size_t length) {
        const auto* bytes = static_cast<const std::uint8_t*>(data);
        volatile std::uint8_t sum = 0;
        for (std::size_t i = 0; i < length; ++i) {
            sum = static_cast<std::uint8_t>(sum + bytes[i]);
        }
    };
    require(KSTRequirementGetProperties(requirement, property) == 0);
    KSTRequirementGetSubrequirements(requirement, walk);
}

class Client : private base::NotCopied {
  public:
    Client(Script& script, ScriptedKernel& kernel) : script_(script), kernel_(kernel) {}
    ~Client() { dropContext(); }

    void dropContext() {
        if (context_ != nullptr) {
            require(KSTContextDelete(context_, false) == 0);
            context_ = nullptr;
        }
    }

    /// One call, which the input names.
    void act() {
        using Action = void (Client::*)();
        constexpr std::array<Action, 8> kActions = {&Client::create,         &Client::open,
                                                    &Client::sendCredential, &Client::sendNumbers,
                                                    &Client::verifyPolicy,   &Client::verifyAcl,
                                                    &Client::parseAcl,       &Client::callByNumber};
        (this->*kActions[script_.byte() % kActions.size()])();
    }

  private:
    void create() {
        dropContext();
        if (script_.byte() % 2 == 0) {
            require((KSTContextCreate(&context_) == 0) == (context_ != nullptr));
        } else {
            std::uint8_t level = 0;
            kernel_.isOtherCreation = true;
            require((LibCall_KSTContextCreate(kst::channelTransport, &context_, &level) == 0) ==
                    (context_ != nullptr));
            kernel_.isOtherCreation = false;
        }
        if (script_.byte() % 4 == 0 && context_ != nullptr &&
            KSTContextDelete(context_, true) == 0) {
            context_ = nullptr;
        }
    }

    void open() {
        dropContext();
        const auto form = script_.bytes(16);
        context_ = KSTContextCreateWithExternalForm(form.data(), form.size());
        int calls = 0;
        KSTContextGetExternalForm(context_, [&](const void* data, std::size_t length) {
            require(length == 16 && std::memcmp(data, form.data(), 16) == 0);
            ++calls;
        });
        require(calls <= (context_ != nullptr ? 1 : 0));
    }

    void sendCredential() {
        KSTCredential* credential = nullptr;
        if (KSTCredentialCreate(script_.byte(), &credential) != 0) {
            return;
        }
        const auto data = script_.bytes(credential->dataLength);
        std::copy(data.begin(), data.end(), reinterpret_cast<std::uint8_t*>(credential + 1));
        const KSTScope scope = script_.byte() % 4;
        static_cast<void>(KSTContextAddCredentialWithScope(context_, credential, scope));
        static_cast<void>(KSTContextRemoveCredentialsByValueAndScope(context_, credential, scope));
        static_cast<void>(
            KSTContextReplacePassphraseCredentialsWithScope(context_, credential, scope));
        static_cast<void>(LibCall_KSTContexAddCredentialWithScope(kst::channelTransport, context_,
                                                                  credential, scope));
        static_cast<void>(KSTGlobalContextAddCredential(credential));
        KSTCredentialDelete(credential);
    }

    void sendNumbers() {
        const std::uint32_t number = script_.byte();
        const KSTScope scope = script_.byte() % 4;
        static_cast<void>(KSTContextRemoveCredentialsByTypeAndScope(context_, number, scope));
        static_cast<void>(
            KSTContextRemovePassphraseCredentialsByPurposeAndScope(context_, number, scope));
        static_cast<void>(LibCall_KSTContexRemoveCredentialsByTypeAndScope(
            kst::channelTransport, context_, number, scope));
        static_cast<void>(KSTGlobalContextRemoveCredentialsByType(number));
        static_cast<void>(KSTContextContainsCredentialTypeEx(context_, number, scope));
        static_cast<void>(
            KSTContextContainsPassphraseCredentialWithPurpose(context_, number, scope));
    }

    /// Parameters whose values have the lengths that they say.
    void chooseParameters() {
        values_.clear();
        parameters_.clear();
        for (std::uint8_t count = script_.byte() % 12; count > 0; --count) {
            const std::uint32_t type = script_.byte() % 9;
            values_.push_back(script_.bytes(script_.byte() % 20));
            parameters_.push_back(
                {type, values_.back().data(), static_cast<std::uint32_t>(values_.back().size())});
        }
    }

    [[nodiscard]] const KSTParameter* parameters() const {
        return parameters_.empty() ? nullptr : parameters_.data();
    }
    [[nodiscard]] std::uint32_t parameterCount() const {
        return static_cast<std::uint32_t>(parameters_.size());
    }

    void verifyPolicy() {
        chooseParameters();
        const std::string policy(script_.byte(), 'p');
        int calls = 0;
        const auto check = [&](KSTStatus status, bool satisfied,
                               const KSTRequirement* requirement) {
            ++calls;
            require(status == 0 || (!satisfied && requirement == nullptr));
            require(status != 0 || satisfied || requirement != nullptr);
            if (requirement != nullptr) {
                walk(requirement);
            }
        };
        KSTContextVerifyPolicyEx(context_, policy.c_str(), true, parameters(), parameterCount(), 1,
                                 check);
        KSTGlobalContextVerifyPolicy(policy.c_str(), false, parameters(), parameterCount(), check);
        require(calls == 2);
        const KSTStatus err =
            KSTContextVerifyPolicy(context_, policy.c_str(), [&](bool satisfied, const auto* tree) {
                check(0, satisfied, tree);
            });
        require(calls == (err == 0 ? 3 : 2));
        copyRequirement(policy);
    }

    void copyRequirement(const std::string& policy) {
        bool satisfied = false;
        KSTRequirement* requirement = nullptr;
        if (LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
                kst::channelTransport, context_, policy.c_str(), false, parameters(),
                parameterCount(), 0, &satisfied, &requirement) == 0) {
            require(satisfied || requirement != nullptr);
        } else {
            require(!satisfied && requirement == nullptr);
        }
        if (requirement != nullptr) {
            walk(requirement);
            DeallocRequirement(requirement);
        }
    }

    void verifyAcl() {
        chooseParameters();
        const auto constraint = script_.bytes(script_.byte());
        int calls = 0;
        KSTContextVerifyAclConstraint(
            context_, constraint.data(), constraint.size(), false, parameters(), parameterCount(),
            2, [&](KSTStatus status, bool satisfied, const KSTRequirement* requirement) {
                ++calls;
                require(status == 0 || (!satisfied && requirement == nullptr));
                if (requirement != nullptr) {
                    walk(requirement);
                }
            });
        require(calls == 1);
    }

    void parseAcl() {
        const auto acl = script_.bytes(script_.byte());
        int calls = 0;
        const KSTStatus err = KSTParseAclAndCopyConstraintCharacteristics(
            acl.data(), acl.size(), [&](KSTStatus status, const void* data, std::size_t length) {
                ++calls;
                require(length <= 4096 && (status == 0 || data == nullptr));
                const std::vector<std::uint8_t> copy(static_cast<const std::uint8_t*>(data),
                                                     static_cast<const std::uint8_t*>(data) +
                                                         (data != nullptr ? length : 0));
            });
        require(calls == 1 && err <= 0);
    }

    void callByNumber() {
        const auto data = script_.bytes(script_.byte());
        int calls = 0;
        const auto count = [&](const void* /*data*/, std::size_t length) {
            ++calls;
            require(length <= 256);
        };
        static_cast<void>(KSTSetEnvironmentVariable(1, data.data(), data.size()));
        static_cast<void>(KSTGetEnvironmentVariable(2, count));
        static_cast<void>(KSTKernelControl(3, data.data(), data.size(), count));
        require(calls <= 2);
    }

    Script& script_;
    ScriptedKernel& kernel_;
    KSTContextRef context_ = nullptr;
    std::vector<std::vector<std::uint8_t>> values_;
    std::vector<KSTParameter> parameters_;
};

/// Calls know of each other by a context, the channel and the log level alone. A longer input would
/// take the time of several and show nothing else.
constexpr int kMaxActions = 32;

} // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
    // The LibCall functions print their failures.
    return std::freopen("/dev/null", "w", stdout) != nullptr ? 0 : 1;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::int64_t allocatedBefore = gAllocatedBytes;
    Script script({data, size});
    NoLog log;
    ScriptedKernel kernel(script);
    kst::installPlatform({log, kernel, kernel});
    {
        RefusingGate gate;
        Client client(script, kernel);
        for (int actions = 0; actions < kMaxActions && !script.isOver(); ++actions) {
            gate.refuse(script.byte() % 32);
            client.act();
        }
        gate.refuse(0);
    }
    kst::removePlatform();
    require(gAllocatedBytes == allocatedBefore + kernel.created);
    gAllocatedBytes = allocatedBefore;
    return 0;
}
