// Asks whether a context satisfies a policy, has its user enter the passphrases that are missing,
// and asks again, until the policy is satisfied or what is missing stays the same.
//
//     verify_policy POLICY

#include <KSTLib/KSTLib.hpp>
#include <iostream>

namespace {

/// What fails is thrown: value() does that.
bool satisfy(kst::Context& context, const char* policy) {
    std::optional<kst::Requirement> before;
    for (;;) {
        std::cout << "asking about the policy " << policy << '\n';
        const kst::Answer answer = context.verify(policy).value();
        std::cout << (answer.satisfied ? "satisfied\n" : "not satisfied, missing:\n");
        if (!answer.missing) {
            return answer.satisfied;
        }
        answer.missing->walk([](const kst::Requirement& node, std::size_t depth) {
            std::cout << std::string(2 * depth + 2, ' ') << node.words() << '\n';
        });
        if (answer.missing == before) {
            return false; // what was added changed nothing
        }
        before = answer.missing;
        answer.missing->walk([&](const kst::Requirement& node, std::size_t) {
            if (const auto purpose = node.purpose()) {
                std::cout << "adding " << node.words() << std::endl;
                const auto passphrase = kst::Passphrase::read("passphrase: ").value();
                context.add(kst::Credential::create(passphrase, *purpose).value()).value();
            } // here the passphrase and the credential are wiped
        });
    }
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::cerr << "usage: verify_policy POLICY\n";
        return 2;
    }
    try {
        auto context = kst::Context::create().value();
        return satisfy(context, argv[1]) ? 0 : 1;
    } catch (const std::system_error& failure) {
        std::cerr << "verify_policy: " << failure.code().message() << " (" << failure.code().value()
                  << ")\n";
        return 1;
    }
}
