#include "common/Failure.h"
#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "kstd/LogLines.h"
#include "platform/SystemLog.h"

namespace kstd {

namespace {

bool isTrusted(platform::TrustResult result) {
    return result == platform::TrustResult::proceed || result == platform::TrustResult::unspecified;
}

} // namespace

void KSTDAnalyticsLogger::didReceiveChallenge(const platform::AuthenticationChallenge& challenge,
                                              const platform::ChallengeCompletion& completion) {
    using enum platform::ChallengeDisposition;
    if (!completion) {
        kst::stop({&host_.log, kTag, "kstd/Analytics/KSTDAnalyticsLogger"}, "completion");
    }
    host_.log.write(platform::LogLevel::info, "Splunk upload challenge", {});
    if (challenge.previousFailureCount > 0) {
        completion(cancel, std::nullopt);
        return;
    }
    if (challenge.method != platform::kServerTrustMethod) {
        completion(performDefaultHandling, std::nullopt);
        return;
    }
    const platform::TrustResult result = challenge.trust->evaluate();
    if (fields.allowInsecureSplunkCert) {
        host_.log.write(platform::LogLevel::info, "Force Accepting Splunk Credential", {});
    } else if (!isTrusted(result)) {
        completion(cancel, std::nullopt);
        return;
    }
    completion(useCredential, platform::ServerTrustCredential{challenge.trust});
}

} // namespace kstd
