#include "KSTLib/CredentialSerialization.h"
#include "base/Concat.h"
#include "base/NotCopied.h"
#include "kstctl/decode/Decoded.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/Payloads.h"
#include "wire/CredentialFields.h"

#include <cstring>
#include <iterator>
#include <vector>

namespace kstctl::decode {

namespace {

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

Report::Datum datumOf(Bytes bytes, wire::CredentialForm form) {
    if (form == wire::CredentialForm::bytes) {
        return hexText(bytes);
    }
    std::uint32_t number = 0;
    std::memcpy(&number, bytes.data(), sizeof number);
    return form == wire::CredentialForm::number ? Report::Datum(number)
                                                : Report::Datum(static_cast<std::int32_t>(number));
}

Report::Datum passphraseOf(const KSTCredential& credential, Bytes area, Secrets secrets) {
    return secrets == Secrets::hidden
               ? Report::Datum(Report::Unknown{"hidden; --show-secrets shows it"})
               : hexText(area.first(wire::passphraseLength(&credential)));
}

/// Gives a list back to the library at the end of the scope.
struct CredentialList : private base::NotCopied {
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
    const Bytes data = wire::credentialData(&credential);
    for (const wire::CredentialField& field : wire::kCredentialFields) {
        if (field.type != credential.type) {
            continue;
        }
        const Bytes bytes = data.subspan(field.offset, field.length);
        report.add(field.name, field.form == wire::CredentialForm::passphrase
                                   ? passphraseOf(credential, bytes, secrets)
                                   : datumOf(bytes, field.form));
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
        decoded.size += wire::credentialSize(credential.dataLength);
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
                    .size = sizeof handle + wire::credentialSize(credential->dataLength) +
                            sizeof scope};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("credential", credentialFields(*credential, secrets))
        .add("scope", scope, scopeText(scope));
    return decoded;
}

} // namespace kstctl::decode
