// Asks whether a context satisfies a policy, adds the passphrases that are missing, asks again.
//
//     verify_policy POLICY

#include <KSTLib/KSTLib.h>
#include <inttypes.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

// Properties of credentials; 200 of a requirement is the purpose that it asks for.
enum { kUserProperty = 5, kPassphraseProperty = 200, kPurposeProperty = 201, kMaxPurposes = 8 };

// What the blocks take out of the answer: the requirement is gone when the call has returned.
typedef struct Answer {
    bool satisfied;
    int depth;
    KSTPassphrasePurpose purposes[kMaxPurposes];
    size_t purposesCount;
} Answer;

static void takeMissing(void* captured, const KSTRequirement* requirement) {
    Answer* answer = captured;
    const uint32_t type = KSTRequirementGetType(requirement);
    const void* data = NULL;
    size_t length = 0;
    printf("%*s", 2 * ++answer->depth, "");
    if (type == kKSTRequirementTypePassphraseEntered &&
        KSTRequirementGetPropertyData(requirement, kPassphraseProperty, &data, &length) == 0) {
        KSTPassphrasePurpose purpose = 0;
        memcpy(&purpose, data, sizeof purpose);
        printf("a passphrase for purpose %" PRIu32 "\n", purpose);
        if (answer->purposesCount < kMaxPurposes) {
            answer->purposes[answer->purposesCount++] = purpose;
        }
    } else {
        printf("a requirement of type %" PRIu32 "\n", type);
        KSTRequirementGetSubrequirements(requirement, (KSTRequirementBlock){takeMissing, answer});
    }
    --answer->depth;
}

static void takeAnswer(void* captured, bool policySatisfied, const KSTRequirement* requirement) {
    Answer* answer = captured;
    answer->satisfied = policySatisfied;
    answer->purposesCount = 0;
    puts(policySatisfied ? "satisfied" : "not satisfied, missing:");
    if (!policySatisfied) {
        takeMissing(answer, requirement);
    }
}

static KSTStatus ask(KSTContextRef context, const char* policy, Answer* answer) {
    printf("asking about the policy %s\n", policy);
    return KSTContextVerifyPolicy(context, policy, (KSTPolicyBlock){takeAnswer, answer});
}

static KSTStatus addPassphrase(KSTContextRef context, KSTPassphrasePurpose purpose) {
    static const char passphrase[] = "open sesame"; // a real client asks its user
    const uint32_t user = getuid();
    KSTCredential* credential = NULL;
    printf("adding a passphrase for purpose %" PRIu32 "\n", purpose);
    KSTStatus err = KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &credential);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = KSTCredentialSetProperty(credential, kUserProperty, &user, sizeof user);
    if (err == kKSTErrorSuccess) {
        err = KSTCredentialSetProperty(credential, kPurposeProperty, &purpose, sizeof purpose);
    }
    if (err == kKSTErrorSuccess) {
        err = KSTCredentialSetProperty(credential, kPassphraseProperty, passphrase,
                                       strlen(passphrase));
    }
    if (err == kKSTErrorSuccess) {
        err = KSTContextAddCredential(context, credential);
    }
    KSTCredentialDelete(credential);
    return err;
}

int main(int argc, char** argv) {
    KSTContextRef context = NULL;
    Answer answer = {0};
    if (argc != 2) {
        fprintf(stderr, "usage: verify_policy POLICY\n");
        return 2;
    }
    KSTStatus err = KSTContextCreate(&context);
    if (err == kKSTErrorSuccess) {
        err = ask(context, argv[1], &answer);
    }
    const size_t missing = answer.purposesCount;
    for (size_t i = 0; err == kKSTErrorSuccess && i < missing; ++i) {
        err = addPassphrase(context, answer.purposes[i]);
    }
    if (err == kKSTErrorSuccess && missing > 0) {
        err = ask(context, argv[1], &answer);
    }
    if (context != NULL && KSTContextDelete(context, true) != kKSTErrorSuccess) {
        (void)KSTContextDelete(context, false);
    }
    if (err != kKSTErrorSuccess) {
        fprintf(stderr, "verify_policy: status %" PRId32 "\n", err);
        return 1;
    }
    return answer.satisfied ? 0 : 1;
}
