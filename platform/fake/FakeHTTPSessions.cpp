#include "platform/fake/FakeHTTPSessions.h"

#include "base/Concat.h"
#include "platform/fake/FakeHTTPSession.h"
#include "platform/shared/HTTPRequestCheck.h"

namespace platform {

FakeHTTPAnswer FakeHTTPAnswer::status(int status, std::string body) {
    return {{std::nullopt, HTTPResponse{status, "HTTPResponse"}, std::move(body)}};
}

FakeHTTPAnswer FakeHTTPAnswer::failure(std::int64_t code, std::string description) {
    return {failedReply(code, std::move(description)), std::nullopt};
}

FakeHTTPAnswer FakeHTTPAnswer::notHTTP(std::string className) {
    return {{std::nullopt, HTTPResponse{std::nullopt, std::move(className)}, {}}};
}

FakeHTTPAnswer FakeHTTPAnswer::with(FakeHTTPChallenge other) && {
    challenge = std::move(other);
    return std::move(*this);
}

std::unique_ptr<HTTPSession>
FakeHTTPSessions::makeEphemeral(const std::map<std::string, std::string>& headers,
                                std::weak_ptr<HTTPSessionDelegate> delegate) {
    {
        const std::lock_guard lock(mutex_);
        ++sessionCount_;
    }
    return std::make_unique<FakeHTTPSession>(*this, headers, std::move(delegate));
}

void FakeHTTPSessions::setAnswer(const std::string& method, const std::string& link,
                                 FakeHTTPAnswer answer) {
    const std::lock_guard lock(mutex_);
    answers_[{method, link}] = std::move(answer);
}

void FakeHTTPSessions::pushAnswer(FakeHTTPAnswer answer) {
    const std::lock_guard lock(mutex_);
    pushed_.push_back(std::move(answer));
}

std::vector<FakeHTTPRequest> FakeHTTPSessions::requests() const {
    const std::lock_guard lock(mutex_);
    return requests_;
}

std::size_t FakeHTTPSessions::sessionCount() const {
    const std::lock_guard lock(mutex_);
    return sessionCount_;
}

void FakeHTTPSessions::awaitRequests(std::size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return requests_.size() >= count; });
}

void FakeHTTPSessions::release() {
    {
        const std::lock_guard lock(mutex_);
        released_ = true;
    }
    changed_.notify_all();
}

void FakeHTTPSessions::completeLate() {
    std::vector<std::pair<HTTPCompletion, HTTPReply>> kept;
    {
        const std::lock_guard lock(mutex_);
        kept.swap(kept_);
    }
    for (const auto& [completion, reply] : kept) {
        completion(reply);
    }
}

FakeHTTPSessions::Taken FakeHTTPSessions::take(FakeHTTPRequest request) {
    const std::lock_guard lock(mutex_);
    requests_.push_back(std::move(request));
    changed_.notify_all();
    return {requests_.size() - 1, answerTo(requests_.back())};
}

FakeHTTPAnswer FakeHTTPSessions::answerTo(const FakeHTTPRequest& request) {
    if (const auto refusal = refusalOf({request.method, request.link, {}})) {
        return {*refusal, std::nullopt};
    }
    if (!pushed_.empty()) {
        FakeHTTPAnswer answer = std::move(pushed_.front());
        pushed_.pop_front();
        return answer;
    }
    const auto set = answers_.find({request.method, request.link->text});
    return set != answers_.end()
               ? set->second
               : FakeHTTPAnswer::failure(
                     kCannotConnect,
                     base::concat("cannot connect: nobody listens at ", request.link->text));
}

void FakeHTTPSessions::noteArrival(std::size_t number) {
    const std::lock_guard lock(mutex_);
    requests_[number].arrived = true;
}

void FakeHTTPSessions::waitForRelease() {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [this] { return released_; });
}

void FakeHTTPSessions::keep(HTTPCompletion completion, HTTPReply reply) {
    const std::lock_guard lock(mutex_);
    kept_.emplace_back(std::move(completion), std::move(reply));
}

} // namespace platform
