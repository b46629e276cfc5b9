// Asks whether a context satisfies a policy, shows what is missing, adds the passphrases that are
// asked for, and asks again, until the policy is satisfied or nothing changes any more.
//
//     verify_policy POLICY

#define _DEFAULT_SOURCE // explicit_bzero, which -std=c11 alone hides

#include <KSTLib/KSTLib.h>
#include <KSTLib/Words.h>
#include <inttypes.h>
#include <stdio.h>
#include <string.h>
#include <termios.h>
#include <unistd.h>

// What the blocks take out of an answer: the requirement is gone when the call has returned.
typedef struct Answer {
    uint64_t missing; // differs when something else is missing; 0 when nothing is
    int depth;
    KSTPassphrasePurpose purposes[8];
    size_t count;
} Answer;

static void takeMissing(void* captured, const KSTRequirement* node) {
    Answer* answer = captured;
    const uint32_t type = KSTRequirementGetType(node);
    const uint32_t state = KSTRequirementGetState(node);
    const void* data = NULL;
    size_t length = 0;
    KSTPassphrasePurpose purpose = kKSTPassphrasePurposeAny;
    printf("%*s%s%s", 2 * ++answer->depth, "", KSTRequirementTypeText(type),
           state == kKSTRequirementStateTooOld ? " (too old)" : "");
    if (type == kKSTRequirementTypePassphraseEntered &&
        KSTRequirementGetPropertyData(node, kKSTRequirementPropertyPurpose, &data, &length) == 0) {
        memcpy(&purpose, data, sizeof purpose);
        printf(" for purpose %" PRIu32, purpose);
        if (answer->count < 8) {
            answer->purposes[answer->count++] = purpose;
        }
    }
    putchar('\n');
    answer->missing = answer->missing * 31 + type * 7 + state + purpose + 1;
    KSTRequirementGetSubrequirements(node, (KSTRequirementBlock){takeMissing, answer});
    --answer->depth;
}

static void takeAnswer(void* captured, bool policySatisfied, const KSTRequirement* requirement) {
    puts(policySatisfied ? "satisfied" : "not satisfied, missing:");
    if (!policySatisfied) {
        takeMissing(captured, requirement);
    }
}

// Who interrupts the program while it is off has it off in the terminal: stty sane.
static void setEcho(bool isOn) {
    struct termios terminal;
    if (tcgetattr(STDIN_FILENO, &terminal) == 0) {
        terminal.c_lflag = isOn ? terminal.c_lflag | ECHO : terminal.c_lflag & ~(tcflag_t)ECHO;
        tcsetattr(STDIN_FILENO, TCSAFLUSH, &terminal);
    }
}

static KSTStatus addPassphrase(KSTContextRef context, KSTPassphrasePurpose purpose) {
    const uint32_t user = getuid();
    char text[128 + 1]; // one more than there may be, so that more is refused
    size_t size = 0;
    KSTCredential* made = NULL;
    printf("adding a passphrase for purpose %" PRIu32 "\n", purpose);
    setEcho(false);
    fputs("passphrase: ", stderr);
    // Byte by byte: a buffer of the C library's would keep a copy that nobody wipes.
    while (size < sizeof text && read(0, text + size, 1) == 1 && text[size] != '\n') {
        ++size;
    }
    setEcho(true);
    fputc('\n', stderr);
    KSTStatus err = KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &made);
    if (err == 0 &&
        (err = KSTCredentialSetProperty(made, kKSTCredentialPropertyUserId, &user, 4)) == 0 &&
        (err = KSTCredentialSetProperty(made, kKSTCredentialPropertyPurpose, &purpose, 4)) == 0 &&
        (err = KSTCredentialSetProperty(made, kKSTCredentialPropertyPassphrase, text, size)) == 0) {
        err = KSTContextAddCredential(context, made);
    }
    explicit_bzero(text, sizeof text);
    KSTCredentialDelete(made); // which wipes it
    return err;
}

int main(int argc, char** argv) {
    if (argc != 2) {
        fputs("usage: verify_policy POLICY\n", stderr);
        return 2;
    }
    KSTContextRef context = NULL;
    Answer answer = {0};
    uint64_t before = 0;
    KSTStatus err = KSTContextCreate(&context);
    do {
        for (size_t i = 0; err == 0 && i < answer.count; ++i) {
            err = addPassphrase(context, answer.purposes[i]);
        }
        before = answer.missing;
        answer = (Answer){0};
        if (err == 0) {
            printf("asking about the policy %s\n", argv[1]);
            err = KSTContextVerifyPolicy(context, argv[1], (KSTPolicyBlock){takeAnswer, &answer});
        }
    } while (err == 0 && answer.count > 0 && answer.missing != before);
    if (context != NULL && KSTContextDelete(context, true) != kKSTErrorSuccess) {
        (void)KSTContextDelete(context, false);
    }
    if (err != 0) {
        fprintf(stderr, "verify_policy: %s (%" PRId32 ")\n", KSTStatusText(err), err);
    }
    return err == 0 && answer.missing == 0 ? 0 : 1;
}
