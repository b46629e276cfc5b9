#ifndef KST_KSTLIB_COMMAND_H
#define KST_KSTLIB_COMMAND_H

/** The command frame that every call to the kernel service carries as its input:
 *
 *  | offset | width | field                                          |
 *  |      0 |     4 | magic, the ASCII bytes "DRCS"                  |
 *  |      4 |     1 | command code                                   |
 *  |      5 |     1 | second byte                                    |
 *  |      6 |     1 | third byte                                     |
 *  |      7 |     1 | not written by the builders, not to be relied on |
 *  |      8 |     n | payload                                        |
 */

#define KST_COMMAND_MAGIC "DRCS"

enum {
    kKSTCommandMagicSize = 4,
    kKSTCommandCodeOffset = kKSTCommandMagicSize,
    kKSTCommandSecondByteOffset = kKSTCommandCodeOffset + 1,
    kKSTCommandThirdByteOffset = kKSTCommandSecondByteOffset + 1,
    kKSTCommandHeaderSize = kKSTCommandThirdByteOffset + 1 + 1
};

/** Command codes. The numbers that are missing are not used. */
enum {
    kKSTCommandContextCreate = 1,
    kKSTCommandContextDelete = 2,
    kKSTCommandVerifyPolicy = 3,
    kKSTCommandContainsCredentialType = 4,
    kKSTCommandAddCredential = 5,
    kKSTCommandRemoveCredentialsByValue = 6,
    kKSTCommandRemoveCredentialsByType = 9,
    kKSTCommandVerifyAclConstraint = 11,
    kKSTCommandContainsPassphraseCredential = 13,
    kKSTCommandReplacePassphraseCredentials = 15,
    kKSTCommandRemovePassphraseCredentials = 16,
    kKSTCommandContextCreateWithExternalForm = 18,
    kKSTCommandContextGetExternalForm = 19,
    kKSTCommandParseAcl = 20,
    kKSTCommandSetEnvironmentVariable = 24,
    kKSTCommandGetEnvironmentVariable = 25,
    kKSTCommandKernelControl = 26
};

/** Selectors of the kernel channel. */
enum { kKSTSelectorCommand = 0, kKSTSelectorLogLevel = 2 };

/** The largest value of an environment variable and the largest input or output of a kernel
 *  control, in bytes. */
enum { kKSTEnvironmentVariableMaxSize = 64, kKSTKernelControlMaxSize = 256 };

#endif
