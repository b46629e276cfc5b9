#include "kstd/Analytics/KSTDAnalyticsLogger.h"

#include "base/Concat.h"
#include "kstd/Analytics/AnalyticsConfiguration.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/Clock.h"
#include "platform/Files.h"
#include "platform/InternalDiagnostics.h"
#include "platform/MessageClasses.h"
#include "platform/SystemLog.h"
#include "platform/SystemVersion.h"

#include <algorithm>
#include <array>
#include <map>
#include <mutex>
#include <utility>

namespace kstd {

namespace {

struct Cache {
    std::mutex mutex;
    std::optional<OSVersion> version;
};

Cache& cache() {
    static Cache cache;
    return cache;
}

} // namespace

OSVersion OSVersion::cached(platform::SystemVersion& version) {
    const std::lock_guard lock(cache().mutex);
    if (!cache().version) {
        cache().version = OSVersion{version.build(), version.product()};
    }
    return *cache().version;
}

void OSVersion::release() {
    const std::lock_guard lock(cache().mutex);
    cache().version.reset();
}

void KSTDAnalyticsLogger::addOSVersion(platform::ValueMap& map, platform::SystemVersion& version) {
    const OSVersion known = OSVersion::cached(version);
    if (known.build) {
        map.insert_or_assign("build", *known.build);
    }
    if (known.product) {
        map.insert_or_assign("product", *known.product);
    }
}

namespace {

using ByClass = std::map<std::type_index, std::shared_ptr<KSTDAnalyticsLogger>>;

struct Instances {
    std::mutex mutex;
    ByClass byClass;
};

/// Never destroyed: its loggers would outlive the host that they use.
Instances& instances() {
    static Instances& instances = *new Instances;
    return instances;
}

} // namespace

std::shared_ptr<KSTDAnalyticsLogger> LoggerInstances::instance(std::type_index loggerClass,
                                                               const Make& make) {
    const std::lock_guard lock(instances().mutex);
    std::shared_ptr<KSTDAnalyticsLogger>& instance = instances().byClass[loggerClass];
    if (instance == nullptr) {
        instance = make();
    }
    return instance;
}

void LoggerInstances::release() {
    // Goes after the lock: the end of a subclass's logger may do anything, also ask for another.
    ByClass released;
    const std::lock_guard lock(instances().mutex);
    released.swap(instances().byClass);
}

namespace {

constexpr char kQueueName[] = "com.zerva.keystrand.analytics";
constexpr char kSubsystem[] = "Keystrand";

constexpr std::int64_t kSecondsBetweenUploads = 259200;
constexpr std::int64_t kSecondsBetweenUploadsOfDevelopers = 60;

constexpr double kSecondsPerDay = 86400;
/// The days at which the buckets behind the first begin.
constexpr std::array<int, 4> kBuckets = {1, 7, 30, 365};

} // namespace

std::shared_ptr<KSTDAnalyticsLogger> KSTDAnalyticsLogger::logger(const platform::Host& host) {
    host.log.write(platform::LogLevel::info,
                   "attempt to instatiate abstract class KSTDAnalyticsLogger", {});
    return nullptr;
}

void KSTDAnalyticsLogger::init(const std::string& databasePath) {
    fields.database =
        TQAnalyticsLoggerSQLiteStore::storeWithPath(host_.files.locate(databasePath), kEventSchema,
                                                    {.log = host_.log,
                                                     .clock = host_.clock,
                                                     .propertyLists = host_.propertyLists,
                                                     .warnsOfCauses = true});
    fields.queue = host_.queues.make(kQueueName);
    fields.secondsBetweenUploads = host_.diagnostics.isEnabled(kSubsystem)
                                       ? kSecondsBetweenUploadsOfDevelopers
                                       : kSecondsBetweenUploads;
    readConfiguration();
}

void KSTDAnalyticsLogger::readConfiguration() {
    auto configuration = AnalyticsConfiguration::read(host_.resources, host_.defaults);
    configuration.report(host_.log);
    fields.splunkTopicName = std::move(configuration.splunkTopicName);
    fields.splunkUploadURL = std::move(configuration.splunkUploadURL);
    fields.splunkBagURL = std::move(configuration.splunkBagURL);
    fields.allowInsecureSplunkCert = configuration.allowInsecureSplunkCert;
}

void KSTDAnalyticsLogger::logEventNamed(std::optional<std::string_view> name,
                                        const platform::ValueMap* withAttributes) {
    if (!name) {
        host_.log.write(platform::LogLevel::debug, "attempt to log an event with no name", {});
        return;
    }
    std::optional<platform::Timestamp> uploadDate;
    fields.queue->sync([&] { uploadDate = keepEvent(*name, withAttributes); });
    const platform::Timestamp now = platform::timestampOf(host_.clock.now());
    // Also after an event that is not wanted: it reads no date and so moves the next upload, just
    // as the very first event sets it.
    if (!uploadDate) {
        resetUploadDate(false);
    } else if (now.secondsSince2001 > uploadDate->secondsSince2001) {
        upload();
    }
}

/// Stores the event if it is wanted; the date at which uploading is due then, if there is one.
std::optional<platform::Timestamp>
KSTDAnalyticsLogger::keepEvent(std::string_view name, const platform::ValueMap* attributes) {
    if (!isWanted(name)) {
        return std::nullopt;
    }
    fields.database->addEventDict(
        eventDictWithBlacklistedFieldsStrippedFrom(eventDictForEventName(name, attributes)),
        kEventTable);
    return fields.database->uploadDateAfterAdding();
}

bool KSTDAnalyticsLogger::isWanted(std::string_view eventName) const {
    if (fields.disableLogging) {
        return false;
    }
    const auto& unwanted = fields.blacklistedEvents;
    return !unwanted || std::find(unwanted->begin(), unwanted->end(), eventName) == unwanted->end();
}

void KSTDAnalyticsLogger::upload() {
    std::optional<platform::Error> error;
    if (forceUploadWithError(&error)) {
        host_.log.write(platform::LogLevel::debug, "uploaded oracle statistics", {});
        // Clears and dates once more what forceUploadWithError has done already, which it must do
        // for those who call it alone. In the daemon nothing comes in between.
        resetUploadDate(true);
    } else if (error) {
        host_.log.write(platform::LogLevel::error,
                        base::concat("TQAnalytics: failed to upload json to analytics server with "
                                     "error: ",
                                     error->description),
                        {.messageId = platform::message::kUploadFailed});
    }
}

void KSTDAnalyticsLogger::resetUploadDate(bool clear) {
    fields.queue->sync([this, clear] {
        if (clear) {
            fields.database->clearAllData();
        }
        setNextUploadDate();
    });
}

void KSTDAnalyticsLogger::setNextUploadDate() {
    const platform::Timestamp now = platform::timestampOf(host_.clock.now());
    fields.database->setUploadDate(platform::Timestamp{
        now.secondsSince2001 + static_cast<double>(fields.secondsBetweenUploads)});
}

void KSTDAnalyticsLogger::setDateProperty(const std::optional<platform::Timestamp>& date,
                                          const std::string& forKey) {
    fields.queue->sync([&] { fields.database->setDateProperty(date, forKey); });
}

std::optional<platform::Timestamp> KSTDAnalyticsLogger::datePropertyForKey(const std::string& key) {
    std::optional<platform::Timestamp> date;
    fields.queue->sync([&] { date = fields.database->datePropertyForKey(key); });
    return date;
}

platform::ValueMap
KSTDAnalyticsLogger::eventDictForEventName(std::string_view name,
                                           const platform::ValueMap* withAttributes) const {
    platform::ValueMap event;
    if (withAttributes != nullptr) {
        event = *withAttributes;
    }
    if (fields.splunkTopicName) {
        event.insert_or_assign("topic", *fields.splunkTopicName);
    } else {
        // The topic is ours alone to give: without one an event has none, whatever its sender calls
        // so.
        event.erase("topic");
    }
    event.insert_or_assign("eventType", name);
    event.insert_or_assign("eventTime", platform::millisecondsSince1970(host_.clock.now()));
    if (fields.metricsBase) {
        // What the event says itself counts before what the server adds to all.
        event.insert(fields.metricsBase->begin(), fields.metricsBase->end());
    }
    return event;
}

platform::ValueMap
KSTDAnalyticsLogger::eventDictWithBlacklistedFieldsStrippedFrom(platform::ValueMap map) const {
    if (fields.blacklistedFields) {
        for (const std::string& field : *fields.blacklistedFields) {
            map.erase(field);
        }
    }
    return map;
}

int KSTDAnalyticsLogger::fuzzyDaysSinceDate(platform::Timestamp date, platform::Clock& clock) {
    const double seconds =
        platform::timestampOf(clock.now()).secondsSince2001 - date.secondsSince2001;
    int bucket = 0;
    for (const int days : kBuckets) {
        if (seconds < days * kSecondsPerDay) {
            break;
        }
        bucket = days;
    }
    return bucket;
}

} // namespace kstd
