// Asks whether a context satisfies a policy, adds the passphrases that are missing, asks again.
//
//     verify_policy POLICY

#include <KSTLib/KSTLib.h>
#include <cstdint>
#include <cstring>
#include <iostream>
#include <memory>
#include <string>
#include <string_view>
#include <unistd.h>
#include <vector>

namespace {

// Properties of credentials; 200 of a requirement is the purpose that it asks for.
enum Property : std::uint32_t { kUser = 5, kPassphrase = 200, kPurpose = 201 };

struct Release {
    void operator()(KSTCredential* credential) const { KSTCredentialDelete(credential); }
    void operator()(KSTContextRef context) const {
        if (KSTContextDelete(context, true) != kKSTErrorSuccess) {
            static_cast<void>(KSTContextDelete(context, false));
        }
    }
};
using Credential = std::unique_ptr<KSTCredential, Release>;
using Context = std::unique_ptr<KSTContext, Release>;

struct Answer {
    bool satisfied = false;
    std::vector<KSTPassphrasePurpose> purposes;
};

void takeMissing(const KSTRequirement* requirement, Answer& answer, std::size_t depth = 1) {
    const auto type = KSTRequirementGetType(requirement);
    const void* data = nullptr;
    std::size_t length = 0;
    std::cout << std::string(2 * depth, ' ');
    if (type == kKSTRequirementTypePassphraseEntered &&
        KSTRequirementGetPropertyData(requirement, kPassphrase, &data, &length) == 0) {
        KSTPassphrasePurpose purpose = 0;
        std::memcpy(&purpose, data, sizeof purpose);
        std::cout << "a passphrase for purpose " << purpose << '\n';
        answer.purposes.push_back(purpose);
    } else {
        std::cout << "a requirement of type " << type << '\n';
        KSTRequirementGetSubrequirements(requirement, [&](const KSTRequirement* child) {
            takeMissing(child, answer, depth + 1);
        });
    }
}

KSTStatus ask(KSTContextRef context, const char* policy, Answer& answer) {
    std::cout << "asking about the policy " << policy << '\n';
    answer = {};
    return KSTContextVerifyPolicy(
        context, policy, [&](bool policySatisfied, const KSTRequirement* requirement) {
            answer.satisfied = policySatisfied;
            std::cout << (policySatisfied ? "satisfied\n" : "not satisfied, missing:\n");
            if (!policySatisfied) {
                takeMissing(requirement, answer);
            }
        });
}

KSTStatus addPassphrase(KSTContextRef context, KSTPassphrasePurpose purpose) {
    constexpr std::string_view passphrase = "open sesame"; // a real client asks its user
    const uid_t user = ::getuid();
    std::cout << "adding a passphrase for purpose " << purpose << '\n';
    KSTCredential* created = nullptr;
    KSTStatus err = KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &created);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const Credential credential(created);
    const auto set = [&](Property property, const void* data, std::size_t length) {
        return err == kKSTErrorSuccess
                   ? KSTCredentialSetProperty(credential.get(), property, data, length)
                   : err;
    };
    err = set(kUser, &user, sizeof user);
    err = set(kPurpose, &purpose, sizeof purpose);
    err = set(kPassphrase, passphrase.data(), passphrase.size());
    return err == kKSTErrorSuccess ? KSTContextAddCredential(context, credential.get()) : err;
}

KSTStatus tellStory(const char* policy, Answer& answer) {
    KSTContextRef created = nullptr;
    KSTStatus err = KSTContextCreate(&created);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const Context context(created);
    err = ask(context.get(), policy, answer);
    const auto missing = answer.purposes;
    for (std::size_t i = 0; err == kKSTErrorSuccess && i < missing.size(); ++i) {
        err = addPassphrase(context.get(), missing[i]);
    }
    return err == kKSTErrorSuccess && !missing.empty() ? ask(context.get(), policy, answer) : err;
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::cerr << "usage: verify_policy POLICY\n";
        return 2;
    }
    Answer answer;
    const KSTStatus err = tellStory(argv[1], answer);
    if (err != kKSTErrorSuccess) {
        std::cerr << "verify_policy: status " << err << '\n';
        return 1;
    }
    return answer.satisfied ? 0 : 1;
}
