#include "KSTLib/CredentialSerialization.h"
#include "base/Concat.h"
#include "common/CredentialTypes.h"
#include "kstctl/decode/Decoded.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/Payloads.h"

#include <cstring>
#include <iterator>
#include <vector>

namespace kstctl::decode {

namespace {

using Passcode = KSTCredentialDataPasscodeValidated;
using Biometry = KSTCredentialDataBiometryMatched;
using Output = KSTCredentialDataUserOutputDisplayed;
using Unlock = KSTCredentialDataContinuityUnlock;
using Passcode2 = KSTCredentialDataPasscodeValidated2;
using DenyList = KSTCredentialDataKextDenyList;

enum class Form { number, signedNumber, bytes };

/// A field of a data area.
struct DataField {
    const char* name;
    std::size_t offset;
    std::size_t length;
    std::uint32_t type;
    Form form;
};

constexpr DataField kDataFields[] = {
    {"property101", offsetof(Passcode, property101), 4, kKSTCredentialTypePasscodeValidated,
     Form::number},
    {"property102", offsetof(Passcode, property102), 4, kKSTCredentialTypePasscodeValidated,
     Form::signedNumber},
    {"dataWord8", offsetof(Passcode, word8), 4, kKSTCredentialTypePasscodeValidated, Form::bytes},
    {"property100", offsetof(Passcode, property100), 16, kKSTCredentialTypePasscodeValidated,
     Form::bytes},
    {"property101", offsetof(Biometry, property101), 4, kKSTCredentialTypeBiometryMatched,
     Form::number},
    {"property300", offsetof(Biometry, property300), 16, kKSTCredentialTypeBiometryMatched,
     Form::bytes},
    {"property302", offsetof(Biometry, property302), 16, kKSTCredentialTypeBiometryMatched,
     Form::bytes},
    {"property301", offsetof(Biometry, property301), 32, kKSTCredentialTypeBiometryMatched,
     Form::bytes},
    {"dataWord68", offsetof(Biometry, word68), 4, kKSTCredentialTypeBiometryMatched, Form::bytes},
    {"property100", offsetof(Biometry, property100), 16, kKSTCredentialTypeBiometryMatched,
     Form::bytes},
    {"property400", offsetof(Output, property400), 32, kKSTCredentialTypeUserOutputDisplayed,
     Form::bytes},
    {"property401", offsetof(Output, property401), 24, kKSTCredentialTypeUserOutputDisplayed,
     Form::bytes},
    {"property101", offsetof(Unlock, property101), 4, kKSTCredentialTypeContinuityUnlock,
     Form::number},
    {"dataWord4", offsetof(Unlock, word4), 4, kKSTCredentialTypeContinuityUnlock, Form::bytes},
    {"property100", offsetof(Unlock, property100), 16, kKSTCredentialTypeContinuityUnlock,
     Form::bytes},
    {"property101", offsetof(Passcode2, property101), 4, kKSTCredentialTypePasscodeValidated2,
     Form::number},
    {"property501", offsetof(Passcode2, property501), 16, kKSTCredentialTypePasscodeValidated2,
     Form::bytes},
    {"property502", offsetof(Passcode2, property502), 16, kKSTCredentialTypePasscodeValidated2,
     Form::bytes},
    {"format", offsetof(DenyList, format), 4, kKSTCredentialTypeKextDenyList, Form::number},
    {"revision", offsetof(DenyList, revision), 4, kKSTCredentialTypeKextDenyList, Form::number},
};

constexpr const char* kTypeTexts[] = {
    "",
    "passcode validated",
    "passphrase entered",
    "biometry matched",
    "marker",
    "marker",
    "marker",
    "user output displayed",
    "marker",
    "continuity unlock",
    "passcode validated",
    "marker",
    "kext deny list",
};

Report::Datum datumOf(Bytes bytes, Form form) {
    if (form == Form::bytes) {
        return hexText(bytes);
    }
    std::uint32_t number = 0;
    std::memcpy(&number, bytes.data(), sizeof number);
    return form == Form::number ? Report::Datum(number)
                                : Report::Datum(static_cast<std::int32_t>(number));
}

void addPassphrase(Report& report, const KSTCredential& credential, Bytes data, Secrets secrets) {
    using Data = KSTCredentialDataPassphraseEntered;
    const auto numberAt = [data](std::size_t offset) {
        return datumOf(data.subspan(offset, sizeof(std::uint32_t)), Form::number);
    };
    report.add("purpose", numberAt(offsetof(Data, purpose)))
        .add("passphraseLength", numberAt(offsetof(Data, passphraseLength)));
    if (secrets == Secrets::hidden) {
        report.add("passphrase", Report::Unknown{"hidden; --show-secrets shows it"});
        return;
    }
    const Bytes passphrase =
        data.subspan(offsetof(Data, passphrase), kst::passphraseLength(&credential));
    report.add("passphrase", hexText(passphrase));
}

/// Gives a list back to the library at the end of the scope.
struct CredentialList {
    CredentialList() = default;
    CredentialList(const CredentialList&) = delete;
    CredentialList& operator=(const CredentialList&) = delete;
    ~CredentialList() {
        if (credentials != nullptr) {
            DeallocCredentialList(credentials, count);
        }
    }

    KSTCredential** credentials = nullptr;
    std::uint32_t count = 0;
};

} // namespace

const char* credentialTypeText(std::uint32_t type) {
    return type < std::size(kTypeTexts) ? kTypeTexts[type] : "";
}

const char* userText(std::uint32_t userId) {
    return userId == kKSTCredentialNoUser ? "no user" : "";
}

Report credentialFields(const KSTCredential& credential, Secrets secrets) {
    Report report;
    report.add("type", credential.type, credentialTypeText(credential.type))
        .add("word4", credential.word4)
        .add("word8", credential.word8)
        .add("userId", credential.userId, userText(credential.userId))
        .add("word16", credential.word16)
        .add("word24", credential.word24)
        .add("dataLength", credential.dataLength);
    const Bytes data = kst::credentialData(&credential);
    if (credential.type == kKSTCredentialTypePassphraseEntered) {
        addPassphrase(report, credential, data, secrets);
    }
    for (const DataField& field : kDataFields) {
        if (field.type == credential.type) {
            report.add(field.name, datumOf(data.subspan(field.offset, field.length), field.form));
        }
    }
    return report;
}

Result decodeCredential(Bytes bytes, Secrets secrets) {
    KSTCredential* made = nullptr;
    std::size_t size = 0;
    if (auto refusal = refusalOf("a credential", [&] {
            return DeserializeCredential(bytes.data(), bytes.size(), &made, &size);
        })) {
        return *std::move(refusal);
    }
    const Received<KSTCredential> credential(made, DeallocCredential);
    return Decoded{credentialFields(*credential, secrets), size};
}

Result decodeCredentialList(Bytes bytes, Secrets secrets) {
    CredentialList list;
    if (auto refusal = refusalOf("a list of credentials", [&] {
            return DeserializeCredentialList(bytes.data(), bytes.size(), &list.credentials,
                                             &list.count);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {}, .size = sizeof list.count};
    Data credentials;
    for (std::uint32_t i = 0; i < list.count; ++i) {
        const KSTCredential& credential = *list.credentials[i];
        decoded.size += kst::credentialSize(credential.dataLength);
        credentials.emplace_back(credentialFields(credential, secrets));
    }
    decoded.fields.add("count", list.count).add("credentials", std::move(credentials));
    return decoded;
}

Result decodeCredentialCommand(Bytes bytes, Secrets secrets) {
    KSTHandle handle{};
    KSTCredential* made = nullptr;
    KSTScope scope = 0;
    if (auto refusal = refusalOf("a credential command's payload", [&] {
            return DeserializeAddCredential(bytes.data(), bytes.size(), &handle, &made, &scope);
        })) {
        return *std::move(refusal);
    }
    const Received<KSTCredential> credential(made, DeallocCredential);
    Decoded decoded{.fields = {},
                    .size =
                        sizeof handle + kst::credentialSize(credential->dataLength) + sizeof scope};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("credential", credentialFields(*credential, secrets))
        .add("scope", scope, scopeText(scope));
    return decoded;
}

} // namespace kstctl::decode
