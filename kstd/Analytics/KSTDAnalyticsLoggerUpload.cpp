#include "base/Concat.h"
#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "kstd/Analytics/ServerDocuments.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "kstd/Analytics/UploadDocument.h"
#include "kstd/LogLines.h"
#include "platform/Clock.h"
#include "platform/FailedCheck.h"
#include "platform/HTTPSession.h"
#include "platform/JSON.h"
#include "platform/MessageClasses.h"
#include "platform/SystemLog.h"

#include <atomic>
#include <memory>
#include <semaphore>
#include <utility>

namespace kstd {

using platform::Link;
using platform::LogLevel;

namespace {

/// Lives as long as either side needs it. Only the first completion writes the reply, and it does
/// so before it releases the semaphore: afterwards the reply is the waiter's alone.
struct PendingReply {
    std::atomic_flag hasCome;
    platform::HTTPReply reply;
    std::binary_semaphore arrival{0};
};

/// Starts the request and waits for its end, however long that takes. A completion that comes
/// again, or after the session's end, does no harm.
platform::HTTPReply waitForReply(platform::HTTPSession& session,
                                 const platform::HTTPRequest& request) {
    const auto pending = std::make_shared<PendingReply>();
    session.start(request, [pending](const platform::HTTPReply& reply) {
        if (!pending->hasCome.test_and_set()) {
            pending->reply = reply;
            pending->arrival.release();
        }
    });
    // Without a limit of its own: the session ends every request within its limits.
    pending->arrival.acquire();
    return std::move(pending->reply);
}

constexpr char kUserAgent[] = "kstd/1.0";
constexpr char kErrorDomain[] = "TQAnalyticsLogger";
constexpr std::int64_t kDatabaseNotOpenable = -1;

constexpr std::uint64_t kMillisecondsPerSecond = 1000;

bool isTrusted(platform::TrustResult result) {
    return result == platform::TrustResult::proceed || result == platform::TrustResult::unspecified;
}

/// The class of a line about a request that failed: a certificate that is not trusted is another
/// matter than a server that cannot be reached.
std::string_view classOf(const platform::Error& error, std::string_view otherwise) {
    return error.code == platform::kTrustRefused ? platform::message::kServerNotTrusted : otherwise;
}

} // namespace

bool KSTDAnalyticsLogger::forceUploadWithError(std::optional<platform::Error>* error) {
    // Asked for on this thread, as making a document asks for them.
    const platform::ValueMap extraValues = extraValuesToUploadToServer();
    // One piece of work on the queue: what is stored while the document is under way comes after
    // it, and is not deleted with what was sent.
    std::optional<platform::Result<bool>> isUploaded;
    fields.queue->sync([&] { isUploaded = uploadEvents(extraValues); });
    if (!*isUploaded && error != nullptr) {
        *error = isUploaded->error();
    }
    return *isUploaded && isUploaded->value();
}

/// Whether the server has taken them; an error when there is no document to send.
platform::Result<bool> KSTDAnalyticsLogger::uploadEvents(const platform::ValueMap& extraValues) {
    if (auto error = whyNoDocument()) {
        return *std::move(error);
    }
    const double postTime = platform::millisecondsSince1970(host_.clock.now());
    std::optional<UploadDocument> document(
        std::in_place, host_.json, host_.propertyLists, *fields.database,
        uploadSummary(extraValues, fields.splunkTopicName, host_.version, postTime), postTime);
    if (auto error = document->measure()) {
        return *std::move(error);
    }
    if (!onQueuePostJSON(*document)) {
        return false;
    }
    host_.log.write(LogLevel::debug,
                    base::concat("uploading oracle statistics: ", document->beginning()), {});
    // As long as it is there nothing can be written.
    document.reset();
    fields.database->clearAllData();
    setNextUploadDate();
    return true;
}

platform::Result<base::TextBuffer>
KSTDAnalyticsLogger::getLoggingJSON(const platform::JSONWritingOptions& options) {
    const platform::ValueMap extraValues = extraValuesToUploadToServer();
    std::optional<platform::Result<base::TextBuffer>> document;
    fields.queue->sync([&] { document = makeDocument(extraValues, options); });
    return std::move(*document);
}

platform::Result<base::TextBuffer>
KSTDAnalyticsLogger::makeDocument(const platform::ValueMap& extraValues,
                                  const platform::JSONWritingOptions& options) {
    if (auto error = whyNoDocument()) {
        return *std::move(error);
    }
    const double postTime = platform::millisecondsSince1970(host_.clock.now());
    return makeUploadDocument(
        host_.json, host_.propertyLists,
        [this](const auto& visitor) { fields.database->visitEvents(visitor); },
        uploadSummary(extraValues, fields.splunkTopicName, host_.version, postTime), postTime,
        options);
}

std::optional<platform::Error> KSTDAnalyticsLogger::whyNoDocument() {
    if (fields.database->tryToOpenDatabase()) {
        return std::nullopt;
    }
    host_.log.write(LogLevel::error, "can't get logging JSON because database is not openable",
                    {.messageId = platform::message::kDatabaseNotOpened});
    return platform::Error{kErrorDomain, kDatabaseNotOpenable,
                           "could not open db to read and process metrics (device in class D?)"};
}

bool KSTDAnalyticsLogger::onQueuePostJSON(platform::HTTPBody& JSON) {
    auto link = splunkUploadURL();
    // Also after a bag that has switched uploads off. What it says of events counts from the next
    // one on; what is collected goes to the bag's own address.
    if (!link) {
        host_.log.write(LogLevel::error,
                        "failed to get a splunk upload endpoint - using bag URL instead", {});
        link = fields.splunkBagURL;
    }
    if (!link) {
        host_.log.write(LogLevel::error, "failed to get a splunk upload endpoint - not uploading",
                        {.messageId = platform::message::kNoUploadAddress});
        return false;
    }
    host_.log.write(LogLevel::info, "Splunk upload start", {});
    return isAccepted(replyTo({.method = "POST", .link = link, .pieces = &JSON}), *link);
}

bool KSTDAnalyticsLogger::isAccepted(const platform::HTTPReply& reply, const platform::Link& link) {
    if (reply.error) {
        host_.log.write(
            LogLevel::error,
            base::concat("Error in uploading the events to splunk: ", reply.error->description),
            {.messageId = classOf(*reply.error, platform::message::kUploadFailed)});
        return false;
    }
    if (!reply.response || !reply.response->status) {
        host_.log.write(LogLevel::error,
                        base::concat("Received the wrong kind of response: ",
                                     reply.response ? reply.response->className : "(null)"),
                        {.messageId = platform::message::kUploadFailed});
        return false;
    }
    const int status = *reply.response->status;
    if (status < 200 || status > 299) {
        host_.log.write(LogLevel::error,
                        base::concat("Splunk upload unexpected status to URL: ", link.text,
                                     " -- status: ", status),
                        {.messageId = platform::message::kUploadFailed});
        return false;
    }
    host_.log.write(LogLevel::info, "Splunk upload success", {});
    return true;
}

/// The reply is evaluated by the caller, on the queue, so that the session's threads touch nothing
/// of the logger.
platform::HTTPReply KSTDAnalyticsLogger::replyTo(const platform::HTTPRequest& request) {
    const auto session = host_.https.makeEphemeral({{"User-Agent", kUserAgent}}, weak_from_this());
    return waitForReply(*session, request);
}

std::optional<Link> KSTDAnalyticsLogger::splunkUploadURL() {
    // Fetched anew each time and never remembered: the bag is how a server changes its mind.
    return fields.splunkUploadURL ? fields.splunkUploadURL : fetchUploadURL();
}

std::optional<Link> KSTDAnalyticsLogger::fetchUploadURL() {
    // Also without a link: the session's answer to that is an error, with its line.
    const auto reply = replyTo({.method = "GET", .link = fields.splunkBagURL});
    if (reply.error) {
        host_.log.write(LogLevel::error,
                        base::concat("Unable to fetch splunk endpoint at URL: ",
                                     fields.splunkBagURL ? fields.splunkBagURL->text : "(null)",
                                     " -- error: ", reply.error->description),
                        {.messageId = classOf(*reply.error, platform::message::kNoUploadAddress)});
        return std::nullopt;
    }
    const auto JSON = host_.json.read(reply.body);
    const auto bag = JSON ? EndpointBag::fromValue(JSON.value()) : std::nullopt;
    if (bag && !ignoreServerDisablingMessages() && !takeOverSwitches(*bag)) {
        host_.log.write(LogLevel::info, "not returning a splunk URL because uploads are disabled",
                        {.messageId = platform::message::kUploadsDisabled});
        return std::nullopt;
    }
    auto link = bag ? takeOverMetrics(*bag) : std::nullopt;
    if (!link) {
        host_.log.write(LogLevel::error, "Malformed Ombrix config payload!",
                        {.messageId = platform::message::kNoUploadAddress});
    }
    return link;
}

/// Whether uploads are wanted. If not, all but `disableLogging` stays as it was.
bool KSTDAnalyticsLogger::takeOverSwitches(const EndpointBag& bag) {
    fields.disableLogging = bag.disabled;
    if (bag.disabled || bag.sendDisabled) {
        return false;
    }
    // Less than a second would become an interval of none.
    if (bag.postFrequency && *bag.postFrequency >= kMillisecondsPerSecond) {
        fields.secondsBetweenUploads =
            static_cast<std::int64_t>(*bag.postFrequency / kMillisecondsPerSecond);
    }
    // A list that the bag does not have is taken back.
    fields.blacklistedEvents = bag.blacklistedEvents;
    fields.blacklistedFields = bag.blacklistedFields;
    return true;
}

std::optional<Link> KSTDAnalyticsLogger::takeOverMetrics(const EndpointBag& bag) {
    // Whatever becomes of the link, and also when the server's switches are ignored.
    fields.metricsBase = bag.metricsBase;
    if (!bag.metricsUrl) {
        return std::nullopt;
    }
    // The line below would show a password to everyone who reads the log.
    if (platform::namesUser(*bag.metricsUrl)) {
        return std::nullopt;
    }
    const std::string text =
        base::concat(*bag.metricsUrl, "/2/", fields.splunkTopicName.value_or("(null)"));
    host_.log.write(LogLevel::info, base::concat("got metrics endpoint: ", text), {});
    const auto link = platform::linkFromText(text);
    // Only this spelling of the scheme is a link that was meant.
    return link && link->scheme() == "https" ? link : std::nullopt;
}

void KSTDAnalyticsLogger::didReceiveChallenge(const platform::AuthenticationChallenge& challenge,
                                              const platform::ChallengeCompletion& completion) {
    using enum platform::ChallengeDisposition;
    if (!completion) {
        platform::stop({&host_.log, kTag, "kstd/Analytics/KSTDAnalyticsLogger"}, "completion");
    }
    host_.log.write(platform::LogLevel::info, "Splunk upload challenge",
                    {.messageId = platform::message::kServerChallenge});
    // The certificate would be the same.
    if (challenge.previousFailureCount > 0) {
        completion(cancel, std::nullopt);
        return;
    }
    if (challenge.method != platform::kServerTrustMethod) {
        completion(performDefaultHandling, std::nullopt);
        return;
    }
    // Also when any certificate will do: what is forced is the verdict, not the evaluation.
    const platform::TrustResult result = challenge.trust->evaluate();
    if (fields.allowInsecureSplunkCert) {
        host_.log.write(platform::LogLevel::info, "Force Accepting Splunk Credential",
                        {.messageId = platform::message::kServerAccepted});
    } else if (!isTrusted(result)) {
        completion(cancel, std::nullopt);
        return;
    }
    completion(useCredential, platform::ServerTrustCredential{challenge.trust});
}

} // namespace kstd
