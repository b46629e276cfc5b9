#include "base/Concat.h"
#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "kstd/Analytics/UploadDocument.h"
#include "kstd/Analytics/WaitForReply.h"
#include "platform/Clock.h"
#include "platform/SystemLog.h"

#include <utility>

namespace kstd {

using platform::LogLevel;

namespace {

constexpr char kUserAgent[] = "kstd/1.0";
constexpr char kErrorDomain[] = "TQAnalyticsLogger";
constexpr std::int64_t kDatabaseNotOpenable = -1;

/// How much of a document goes into the log. The log shows a part of so long a line only, and a
/// document may have hundreds of megabytes.
constexpr std::size_t kLoggedDocumentSize = 8192;

} // namespace

bool KSTDAnalyticsLogger::forceUploadWithError(std::optional<platform::Error>* error) {
    const auto document = getLoggingJSON();
    if (!document) {
        if (error != nullptr) {
            *error = document.error();
        }
        return false;
    }
    bool isUploaded = false;
    fields.queue->sync([&] { isUploaded = uploadDocument(document.value().view()); });
    return isUploaded;
}

bool KSTDAnalyticsLogger::uploadDocument(std::string_view document) {
    if (!onQueuePostJSON(document)) {
        return false;
    }
    host_.log.write(
        LogLevel::debug,
        base::concat("uploading oracle statistics: ", document.substr(0, kLoggedDocumentSize)), {});
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
    if (!fields.database->tryToOpenDatabase()) {
        host_.log.write(LogLevel::error, "can't get logging JSON because database is not openable",
                        {});
        return platform::Error{kErrorDomain, kDatabaseNotOpenable,
                               "could not open db to read and process metrics (device in class "
                               "D?)"};
    }
    const double postTime = platform::millisecondsSince1970(host_.clock.now());
    return makeUploadDocument(
        host_.json, host_.propertyLists,
        [this](const auto& visitor) { fields.database->visitEvents(visitor); },
        uploadSummary(extraValues, fields.splunkTopicName, host_.version, postTime), postTime,
        options);
}

bool KSTDAnalyticsLogger::onQueuePostJSON(std::string_view JSON) {
    auto link = splunkUploadURL();
    if (!link) {
        host_.log.write(LogLevel::error,
                        "failed to get a splunk upload endpoint - using bag URL instead", {});
        link = fields.splunkBagURL;
    }
    if (!link) {
        host_.log.write(LogLevel::error, "failed to get a splunk upload endpoint - not uploading",
                        {});
        return false;
    }
    host_.log.write(LogLevel::info, "Splunk upload start", {});
    return isAccepted(replyTo({.method = "POST", .link = link, .body = JSON}), *link);
}

bool KSTDAnalyticsLogger::isAccepted(const platform::HTTPReply& reply, const platform::Link& link) {
    if (reply.error) {
        host_.log.write(
            LogLevel::error,
            base::concat("Error in uploading the events to splunk: ", reply.error->description),
            {});
        return false;
    }
    if (!reply.response || !reply.response->status) {
        host_.log.write(LogLevel::error,
                        base::concat("Received the wrong kind of response: ",
                                     reply.response ? reply.response->className : "(null)"),
                        {});
        return false;
    }
    const int status = *reply.response->status;
    if (status < 200 || status > 299) {
        host_.log.write(LogLevel::error,
                        base::concat("Splunk upload unexpected status to URL: ", link.text,
                                     " -- status: ", status),
                        {});
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

} // namespace kstd
