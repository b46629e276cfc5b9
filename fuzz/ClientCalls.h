#pragma once

#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Serialization.h"
#include "base/NotCopied.h"
#include "fuzz/Payloads.h"

#include <array>
#include <string>

/// Calls of a client as a script says, for whatever kernel side stands behind the library. Of each
/// it is required what holds whatever that answers.
namespace fuzz {

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

/// Looks at every byte of a tree.
inline void walk(const KSTRequirement* requirement) {
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
    /// `isOtherCreation` says meanwhile whether a context is made by something else than
    /// KSTContextCreate, whose contexts each leave one byte in the account.
    Client(Script& script, bool& isOtherCreation)
        : script_(script), isOtherCreation_(isOtherCreation) {}
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
            isOtherCreation_ = true;
            require((LibCall_KSTContextCreate(kst::channelTransport, &context_, &level) == 0) ==
                    (context_ != nullptr));
            isOtherCreation_ = false;
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
        KSTStatus told = 0;
        const KSTStatus err = KSTParseAclAndCopyConstraintCharacteristics(
            acl.data(), acl.size(), [&](KSTStatus status, const void* data, std::size_t length) {
                ++calls;
                told = status;
                require(length <= 4096 && (status == 0 || data == nullptr));
                const std::vector<std::uint8_t> copy(static_cast<const std::uint8_t*>(data),
                                                     static_cast<const std::uint8_t*>(data) +
                                                         (data != nullptr ? length : 0));
            });
        require(calls == 1 && err == told);
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
    bool& isOtherCreation_;
    KSTContextRef context_ = nullptr;
    std::vector<std::vector<std::uint8_t>> values_;
    std::vector<KSTParameter> parameters_;
};

} // namespace fuzz
