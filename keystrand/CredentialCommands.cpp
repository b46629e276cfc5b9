#include "KSTLib/Command.h"
#include "KSTLib/CredentialSerialization.h"
#include "keystrand/Commands.h"
#include "wire/CredentialFields.h"

#include <optional>
#include <utility>

namespace keystrand {

namespace {

using Payload = std::span<const std::uint8_t>;

constexpr std::size_t kMinCredentialPayload =
    kKSTHandleSize + sizeof(KSTCredential) + sizeof(KSTScope);
constexpr std::size_t kMaxCredentialPayload =
    kMinCredentialPayload + sizeof(KSTCredentialDataPassphraseEntered);
constexpr std::size_t kNumbersPayload = kKSTHandleSize + 2 * sizeof(std::uint32_t);
constexpr std::size_t kContainedSize = sizeof(std::uint32_t);

/// The third number of a contains query when it names no scope.
constexpr KSTScope kNoScope = 0;

/// Where the credentials of a request are, or why they are nowhere.
struct Place {
    CredentialSet* credentials = nullptr;
    KernelStatus status = kKernelSuccess;
};

/// A handle that is not zero must be a context's, whatever the scope; without one only the global
/// scope is left.
Place findPlace(KernelState& kernel, const KSTHandle& handle, KSTScope scope) {
    if (scope != kKSTScopeContext && scope != kKSTScopeGlobal) {
        return {.credentials = nullptr, .status = kKernelBadPayload};
    }
    Context* context = kernel.contexts.find(handle);
    if (context == nullptr && (scope == kKSTScopeContext || !isNoHandle(handle))) {
        return {.credentials = nullptr, .status = kKernelNoSuchContext};
    }
    return {.credentials =
                scope == kKSTScopeGlobal ? &kernel.globalCredentials : &context->credentials,
            .status = kKernelSuccess};
}

using Deserializer = KSTStatus (*)(const void*, std::size_t, KSTHandle*, KSTCredential**,
                                   KSTScope*) noexcept;

/// Handle, credential, scope.
struct CredentialRequest {
    KSTHandle handle{};
    CredentialPointer credential;
    KSTScope scope = 0;
};

/// None for a payload that is not exactly such a request.
std::optional<CredentialRequest> read(Payload payload, Deserializer deserialize) {
    CredentialRequest request;
    KSTCredential* sent = nullptr;
    if (deserialize(payload.data(), payload.size(), &request.handle, &sent, &request.scope) !=
        kKSTErrorSuccess) {
        return std::nullopt;
    }
    request.credential.reset(sent);
    if (payload.size() != kMinCredentialPayload + sent->dataLength) {
        return std::nullopt;
    }
    return request;
}

CommandResult added(bool hadRoom) {
    return endedWith(hadRoom ? kKernelSuccess : kKernelTooManyCredentials);
}

CommandResult add(KernelState& kernel, Payload payload, CredentialSet::Seconds now) {
    auto request = read(payload, DeserializeAddCredential);
    if (!request) {
        return endedWith(kKernelBadPayload);
    }
    const Place place = findPlace(kernel, request->handle, request->scope);
    return place.credentials != nullptr
               ? added(place.credentials->add(std::move(request->credential), now))
               : endedWith(place.status);
}

CommandResult removeByValue(KernelState& kernel, Payload payload) {
    const auto request = read(payload, DeserializeRemoveCredential);
    if (!request) {
        return endedWith(kKernelBadPayload);
    }
    const Place place = findPlace(kernel, request->handle, request->scope);
    if (place.credentials != nullptr) {
        place.credentials->removeEqual(*request->credential);
    }
    return endedWith(place.status);
}

CommandResult replacePassphrases(KernelState& kernel, Payload payload, CredentialSet::Seconds now) {
    auto request = read(payload, DeserializeReplacePassphraseCredential);
    if (!request || !purposeOf(*request->credential)) {
        return endedWith(kKernelBadPayload);
    }
    const Place place = findPlace(kernel, request->handle, request->scope);
    return place.credentials != nullptr
               ? added(place.credentials->replacePassphrases(std::move(request->credential), now))
               : endedWith(place.status);
}

/// Handle, a type or a purpose, scope.
struct NumbersPayload {
    explicit NumbersPayload(Payload payload) {
        HandlePayload fields(payload);
        handle = fields.handle;
        number = fields.number();
        scope = fields.number();
    }

    KSTHandle handle{};
    std::uint32_t number = 0;
    KSTScope scope = 0;
};

CommandResult removeByType(KernelState& kernel, Payload payload) {
    const NumbersPayload request(payload);
    if (!wire::isCredentialType(request.number)) {
        return endedWith(kKernelBadPayload);
    }
    const Place place = findPlace(kernel, request.handle, request.scope);
    if (place.credentials != nullptr) {
        place.credentials->removeType(request.number);
    }
    return endedWith(place.status);
}

CommandResult removePassphrases(KernelState& kernel, Payload payload) {
    const NumbersPayload request(payload);
    const Place place = findPlace(kernel, request.handle, request.scope);
    if (place.credentials != nullptr) {
        place.credentials->removePassphrases(request.number);
    }
    return endedWith(place.status);
}

Place findAskedPlace(KernelState& kernel, const NumbersPayload& request) {
    return findPlace(kernel, request.handle,
                     request.scope == kNoScope ? KSTScope{kKSTScopeContext} : request.scope);
}

CommandResult containsType(KernelState& kernel, Payload payload) {
    const NumbersPayload request(payload);
    if (!wire::isCredentialType(request.number)) {
        return endedWith(kKernelBadPayload);
    }
    const Place place = findAskedPlace(kernel, request);
    return place.credentials != nullptr
               ? answeredWith(place.credentials->containsType(request.number))
               : endedWith(place.status);
}

CommandResult containsPassphrase(KernelState& kernel, Payload payload) {
    const NumbersPayload request(payload);
    const Place place = findAskedPlace(kernel, request);
    return place.credentials != nullptr
               ? answeredWith(place.credentials->containsPassphrase(request.number))
               : endedWith(place.status);
}

} // namespace

void addCredentialCommands(DispatchTable& table, KernelState& kernel, const Now& now) {
    constexpr DispatchTable::Lengths kCredential{.min = kMinCredentialPayload,
                                                 .max = kMaxCredentialPayload};
    constexpr DispatchTable::Lengths kNumbers{.min = kNumbersPayload, .max = kNumbersPayload};
    constexpr DispatchTable::Lengths kQuery{
        .min = kNumbersPayload, .max = kNumbersPayload, .output = kContainedSize};
    table.add(kKSTCommandAddCredential, kCredential,
              [&kernel, now](Payload payload) { return add(kernel, payload, now()); });
    table.add(kKSTCommandRemoveCredentialsByValue, kCredential,
              [&](Payload payload) { return removeByValue(kernel, payload); });
    table.add(
        kKSTCommandReplacePassphraseCredentials, kCredential,
        [&kernel, now](Payload payload) { return replacePassphrases(kernel, payload, now()); });
    table.add(kKSTCommandRemoveCredentialsByType, kNumbers,
              [&](Payload payload) { return removeByType(kernel, payload); });
    table.add(kKSTCommandRemovePassphraseCredentials, kNumbers,
              [&](Payload payload) { return removePassphrases(kernel, payload); });
    table.add(kKSTCommandContainsCredentialType, kQuery,
              [&](Payload payload) { return containsType(kernel, payload); });
    table.add(kKSTCommandContainsPassphraseCredential, kQuery,
              [&](Payload payload) { return containsPassphrase(kernel, payload); });
}

} // namespace keystrand
