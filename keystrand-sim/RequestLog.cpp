#include "keystrand-sim/RequestLog.h"

#include "KSTLib/Command.h"
#include "KSTLib/Contexts.h"
#include "base/ByteReader.h"
#include "wire/CredentialFields.h"

#include <algorithm>
#include <utility>

namespace keystrand::sim {

void RequestLog::setObserver(Observer observer) {
    observer_ = std::move(observer);
}

void RequestLog::record(LoggedRequest request) {
    request.index = ++count_;
    countIn(request);
    payloadBytes_ += request.payload.size();
    entries_.push_back(std::move(request));
    while (entries_.size() > kMaxEntries || payloadBytes_ > kMaxPayloadBytes) {
        dropOldest();
    }
    observer_();
}

void RequestLog::clear() {
    entries_.clear();
    payloadBytes_ = 0;
    count_ = 0;
    acknowledgements_ = 0;
    controlCounts_.clear();
}

std::uint64_t RequestLog::controlCount(std::uint32_t control) const {
    const auto found = controlCounts_.find(control);
    return found == controlCounts_.end() ? 0 : found->second;
}

void RequestLog::countIn(const LoggedRequest& request) {
    if (request.acknowledged) {
        ++acknowledgements_;
    }
    if (request.control && (controlCounts_.size() < kMaxCountedControls ||
                            controlCounts_.contains(*request.control))) {
        ++controlCounts_[*request.control];
    }
}

void RequestLog::dropOldest() {
    payloadBytes_ -= entries_.front().payload.size();
    entries_.pop_front();
}

namespace {

bool carriesCredential(std::uint8_t command) {
    return command == kKSTCommandAddCredential || command == kKSTCommandRemoveCredentialsByValue ||
           command == kKSTCommandReplacePassphraseCredentials;
}

} // namespace

std::optional<Withholding> withholdingFrom(std::uint8_t command,
                                           std::span<const std::uint8_t> payload) {
    if (!carriesCredential(command)) {
        return std::nullopt;
    }
    Withholding withholding;
    withholding.kept = std::min<std::size_t>(payload.size(), kKSTHandleSize);
    base::ByteReader reader(payload);
    std::uint32_t type = 0;
    // Any other number may be a piece of a secret that is out of its place.
    if (reader.skip(kKSTHandleSize) && reader.readU32(type) && wire::isCredentialType(type)) {
        withholding.credentialType = static_cast<std::uint8_t>(type);
    }
    return withholding;
}

} // namespace keystrand::sim
