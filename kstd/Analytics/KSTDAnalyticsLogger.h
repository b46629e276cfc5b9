#pragma once

#include "base/TextBuffer.h"
#include "platform/Date.h"
#include "platform/HTTPSession.h"
#include "platform/Host.h"
#include "platform/JSON.h"
#include "platform/Link.h"
#include "platform/Result.h"
#include "platform/SerialQueue.h"
#include "platform/Value.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <typeindex>
#include <typeinfo>
#include <vector>

namespace platform {
class Clock;
class SystemVersion;
} // namespace platform

namespace kstd {

struct EndpointBag;
class KSTDAnalyticsLogger;
class TQAnalyticsLoggerSQLiteStore;

/// What analytics says about the system it runs on. From any thread.
struct OSVersion {
    std::optional<std::string> build;
    std::optional<std::string> product;

    /// What the first call has read. It holds until `release`.
    [[nodiscard]] static OSVersion cached(platform::SystemVersion& version);
    static void release();
};

/// The one logger of each class. From any thread.
class LoggerInstances {
  public:
    using Make = std::function<std::shared_ptr<KSTDAnalyticsLogger>()>;

    /// The instance of that class, made by the first call for it. Making one must not ask for
    /// another.
    [[nodiscard]] static std::shared_ptr<KSTDAnalyticsLogger> instance(std::type_index loggerClass,
                                                                       const Make& make);

    /// Forgets all instances.
    static void release();
};

/// Base of the analytics loggers: keeps each event in a database and, whenever an event finds the
/// upload date passed, sends all of them as one JSON document and starts anew.
///
/// A subclass names its database file and offers `logger`; there is one instance of each subclass.
/// All work on the database and on what the server has said runs on the logger's own queue, which
/// also waits there for the network, without a limit. Operations may be called from any thread, but
/// not from work of that queue; those that are called on the queue alone say so.
class KSTDAnalyticsLogger : public platform::HTTPSessionDelegate,
                            public std::enable_shared_from_this<KSTDAnalyticsLogger> {
  public:
    /// The instance of the class on which it is called: none for this class, with a line. The host
    /// of the first call is the one that counts, until the AnalyticsLifetime ends.
    static std::shared_ptr<KSTDAnalyticsLogger> logger(const platform::Host& host);

    /// Where the class keeps its events; every subclass has a path.
    static std::optional<std::string> databasePath() { return std::nullopt; }

    /// How long ago the date is, as the days at which its bucket begins: 0, 1, 7, 30 or 365. A date
    /// to come is in the first.
    [[nodiscard]] static int fuzzyDaysSinceDate(platform::Timestamp date, platform::Clock& clock);

    /// Puts the system's "build" and "product" into the map, as far as they are known. Asks the
    /// system once in an AnalyticsLifetime, whatever `version` says later.
    static void addOSVersion(platform::ValueMap& map, platform::SystemVersion& version);

    /// Keeps the event, unless the server wants none of that name or none at all, and uploads when
    /// that is due. Returns when all of it is done; failures are in the log only. No name: nothing
    /// happens. No attributes are as an empty map.
    ///
    /// An event that is not kept moves the upload date as the very first one does.
    void logEventNamed(std::optional<std::string_view> name,
                       const platform::ValueMap* withAttributes);

    /// What is kept of an event: the attributes; "topic", "eventType" and "eventTime" over them;
    /// and beneath them what the server adds to every event. Called on the queue.
    [[nodiscard]] platform::ValueMap
    eventDictForEventName(std::string_view name, const platform::ValueMap* withAttributes) const;

    /// A copy without the fields that the server does not want. Called on the queue.
    [[nodiscard]] platform::ValueMap
    eventDictWithBlacklistedFieldsStrippedFrom(platform::ValueMap map) const;

    /// Makes the next upload due one interval from now. `clear` deletes all events before that.
    void resetUploadDate(bool clear);

    /// Dates that a subclass keeps in the database. While that is closed, they are lost or none.
    void setDateProperty(const std::optional<platform::Timestamp>& date, const std::string& forKey);
    [[nodiscard]] std::optional<platform::Timestamp> datePropertyForKey(const std::string& key);

    /// What a subclass adds to the summary that ends each upload. Called on the thread that
    /// uploads.
    [[nodiscard]] virtual platform::ValueMap extraValuesToUploadToServer() { return {}; }

    /// Uploads now. True when the server has accepted the document: the events are deleted and the
    /// next upload is due one interval from now. Otherwise everything stays, and `error`, if given,
    /// says why the document could not be made; it stays unchanged when the server is the reason.
    bool forceUploadWithError(std::optional<platform::Error>* error = nullptr);

    /// All events and the summary as one JSON text: the bytes that an upload sends, when no options
    /// are given.
    [[nodiscard]] platform::Result<base::TextBuffer>
    getLoggingJSON(const platform::JSONWritingOptions& options = {});

    /// Sends the text to where uploads go and waits for the answer. Called on the queue.
    [[nodiscard]] bool onQueuePostJSON(platform::HTTPBody& JSON);

    /// Where uploads go: the configured link, or what the server's bag says, which is fetched anew
    /// every time; or none. The bag's other settings are taken over. Called on the queue.
    [[nodiscard]] std::optional<platform::Link> splunkUploadURL();

    /// Decides whether a server is trusted. Needs a completion: without one the process stops.
    void didReceiveChallenge(const platform::AuthenticationChallenge& challenge,
                             const platform::ChallengeCompletion& completion) override;

    [[nodiscard]] platform::SerialQueue& splunkLoggingQueue() const { return *fields.queue; }
    [[nodiscard]] const std::optional<std::string>& splunkTopicName() const {
        return fields.splunkTopicName;
    }
    [[nodiscard]] const std::optional<platform::Link>& splunkBagURL() const {
        return fields.splunkBagURL;
    }

    [[nodiscard]] bool allowsInsecureSplunkCert() const { return fields.allowInsecureSplunkCert; }
    void setAllowsInsecureSplunkCert(bool allows) { fields.allowInsecureSplunkCert = allows; }

    /// While it is set, the server can neither switch anything off nor change the interval.
    [[nodiscard]] bool ignoreServerDisablingMessages() const {
        return fields.ignoreServersMessagesTellingUsToGoAway;
    }
    void setIgnoreServerDisablingMessages(bool ignore) {
        fields.ignoreServersMessagesTellingUsToGoAway = ignore;
    }

  protected:
    /// Who has one may make a logger: `instanceOf` alone, because a logger is usable only once it
    /// has been initialised, which its constructor cannot do.
    class Creation {
        friend class KSTDAnalyticsLogger;
        explicit Creation() = default;
    };

    KSTDAnalyticsLogger(Creation /*creation*/, const platform::Host& host) : host_(host) {}

    /// The one instance of the subclass, made by the first call.
    template <typename Logger>
    [[nodiscard]] static std::shared_ptr<Logger> instanceOf(const platform::Host& host) {
        return std::static_pointer_cast<Logger>(LoggerInstances::instance(typeid(Logger), [&host] {
            auto logger = std::make_shared<Logger>(Creation(), host);
            logger->init(*Logger::databasePath());
            return logger;
        }));
    }

    struct Fields {
        std::shared_ptr<TQAnalyticsLoggerSQLiteStore> database;
        std::optional<platform::Link> splunkUploadURL;
        std::optional<std::string> splunkTopicName;
        std::optional<platform::Link> splunkBagURL;
        std::unique_ptr<platform::SerialQueue> queue;
        std::int64_t secondsBetweenUploads = 0;
        std::optional<platform::ValueMap> metricsBase;
        std::optional<std::vector<std::string>> blacklistedFields;
        std::optional<std::vector<std::string>> blacklistedEvents;
        /// Read on threads of the sessions.
        std::atomic<bool> allowInsecureSplunkCert = false;
        bool disableLogging = false;
        bool disableUploads = false;
        std::atomic<bool> ignoreServersMessagesTellingUsToGoAway = false;
    };

    /// The links, the topic and the queue never change once the logger is made. The atomic flags
    /// are anybody's; all else belongs to the queue.
    Fields fields;

  private:
    void init(const std::string& databasePath);
    void readConfiguration();

    [[nodiscard]] bool isWanted(std::string_view eventName) const;
    [[nodiscard]] std::optional<platform::Timestamp>
    keepEvent(std::string_view name, const platform::ValueMap* attributes);
    void upload();
    void setNextUploadDate();

    [[nodiscard]] std::optional<platform::Error> whyNoDocument();
    [[nodiscard]] platform::Result<base::TextBuffer>
    makeDocument(const platform::ValueMap& extraValues,
                 const platform::JSONWritingOptions& options);
    [[nodiscard]] platform::Result<bool> uploadEvents(const platform::ValueMap& extraValues);
    [[nodiscard]] bool isAccepted(const platform::HTTPReply& reply, const platform::Link& link);

    [[nodiscard]] std::optional<platform::Link> fetchUploadURL();
    [[nodiscard]] bool takeOverSwitches(const EndpointBag& bag);
    [[nodiscard]] std::optional<platform::Link> takeOverMetrics(const EndpointBag& bag);

    [[nodiscard]] platform::HTTPReply replyTo(const platform::HTTPRequest& request);

    const platform::Host host_;
};

} // namespace kstd
