#pragma once

#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Platform.h"
#include "KSTLib/Serialization.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "tests/keystrand-sim/SimulatorProcess.h"
#include "tests/support/RecordingLog.h"

#include <fstream>
#include <memory>
#include <optional>
#include <string>

namespace keystrand::sim::test {

using namespace keystrand::test;

/// The requirement as text: its type, its state where it is not 1, its children.
inline std::string textOf(const KSTRequirement* requirement) {
    if (requirement == nullptr) {
        return "none";
    }
    std::string text = std::to_string(KSTRequirementGetType(requirement));
    if (KSTRequirementGetState(requirement) != 1) {
        text += "!";
    }
    std::string children;
    KSTRequirementGetSubrequirements(requirement, [&](const KSTRequirement* child) {
        children += (children.empty() ? "" : " ") + textOf(child);
    });
    return children.empty() ? text : text + "(" + children + ")";
}

struct CredentialDeletion {
    void operator()(KSTCredential* credential) const { KSTCredentialDelete(credential); }
};
using OwnedCredential = std::unique_ptr<KSTCredential, CredentialDeletion>;

inline OwnedCredential make(std::uint32_t type) {
    KSTCredential* credential = nullptr;
    EXPECT_EQ(KSTCredentialCreate(type, &credential), 0);
    return OwnedCredential(credential);
}

inline OwnedCredential makePassphrase(const std::string& text, KSTPassphrasePurpose purpose) {
    OwnedCredential credential = make(kKSTCredentialTypePassphraseEntered);
    EXPECT_EQ(KSTCredentialSetProperty(credential.get(), 200, text.data(), text.size()), 0);
    EXPECT_EQ(KSTCredentialSetProperty(credential.get(), 201, &purpose, sizeof purpose), 0);
    return credential;
}

inline ByteVector bytesAt(const void* data, std::size_t length) {
    const auto* bytes = static_cast<const std::uint8_t*>(data);
    return {bytes, bytes + length};
}

/// The library in this process, connected with a running simulator.
class LibraryClient : public SimulatorProcess {
  protected:
    /// Starts the simulator with these policies.
    void startWith(const std::string& policies) {
        const std::string file = path("policies.conf");
        std::ofstream(file) << policies;
        start({"--clock", "1000000", "--policies", file});
        registry_.emplace(servicePath(), log_);
        channel_.emplace(servicePath(), *registry_, log_);
        connect();
    }

    void TearDown() override { kst::removePlatform(); }

    /// Lets the library connect anew; what it had open stays open.
    void connect() { kst::installPlatform({log_, *registry_, *channel_}); }

    /// Whether a policy is satisfied, or what is missing, or the status of the call.
    static std::string ask(KSTContextRef context, const char* policy) {
        std::string answer = "no answer";
        const KSTStatus status = KSTContextVerifyPolicy(
            context, policy, [&](bool satisfied, const KSTRequirement* requirement) {
                answer = satisfied ? "satisfied" : textOf(requirement);
            });
        return status == 0 ? answer : std::to_string(status);
    }

    /// Empty when the form was not handed out.
    static ByteVector externalForm(KSTContextRef context) {
        ByteVector form;
        KSTContextGetExternalForm(
            context, [&](const void* data, std::size_t length) { form = bytesAt(data, length); });
        return form;
    }

    std::size_t contexts() { return tell("contexts").lines.size(); }

    support::RecordingLog log_;
    std::optional<platform::LinuxServiceRegistry> registry_;
    std::optional<platform::LinuxKernelChannel> channel_;
};

} // namespace keystrand::sim::test
