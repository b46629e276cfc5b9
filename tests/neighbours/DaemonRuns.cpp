// A daemon among neighbours: hostile ones, one at a time, and friendly ones for a very long time.

#include "base/Concat.h"
#include "platform/ManagedSettings.h"
#include "tests/neighbours/Batches.h"
#include "tests/neighbours/Stage.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <optional>
#include <sys/stat.h>

namespace neighbours {

namespace {

using namespace wire::rm;
using Clock = std::chrono::steady_clock;

/// No event, whatever its neighbours do about it, may cost more lines.
constexpr std::uint64_t kMostLinesPerEvent = 40;

/// What a long-lived daemon may have more at the end than at first: SQLite's pages, up to 2000 KiB,
/// and what the heap loses in gaps.
constexpr std::size_t kMostGrowth = mostGrowth(3'000);

constexpr const char* kProperties[] = {kTimerRestartedProperty, kAnalyticsCollectedProperty,
                                       kSaveAnalyticsProperty,
                                       kTimerRestartedAnalyticsCollectedProperty};

void checkLines(const Stage& stage, std::uint64_t linesBefore, std::uint64_t events) {
    const std::uint64_t lines = stage.lines() - linesBefore;
    require(lines <= events * kMostLinesPerEvent,
            base::concat(lines, " lines for ", events, " events"));
}

/// An event as somebody sends it who has read the page on them and means no good.
class EventSender {
  public:
    EventSender(Stage& stage, Random& random) : stage_(stage), random_(random) {}

    void sendOne() {
        const std::size_t kind = random_.below(20);
        if (kind < 2) {
            notify();
            return;
        }
        Bytes datagram = kind < 4 ? random_.bytes(random_.length(4100)) : event();
        if (kind >= 12) {
            mutate(random_, datagram);
        }
        if (kind == 12) {
            datagram.resize(4090 + random_.below(1500));
        }
        stage_.send(datagram, random_.oneIn(40));
    }

  private:
    /// A record that the kernel side really has, and often its event.
    void notify() {
        const char* const property = random_.of(kProperties);
        Bytes record = anyRecord(random_);
        if (random_.oneIn(4)) {
            stage_.kernel->properties[property] = std::move(record);
        } else {
            stage_.publish(property, std::move(record));
        }
    }

    Bytes event() {
        static constexpr const char* kStreams[] = {wire::kNotifydMatchingStream,
                                                   wire::kCorvidMatchingStream, wire::kAlarmStream};
        const std::string stream =
            random_.oneIn(10) ? random_.text(1 + random_.length(254)) : random_.of(kStreams);
        const Bytes payload = stream == wire::kAlarmStream && !random_.oneIn(4)
                                  ? alarmDate()
                                  : random_.bytes(random_.oneIn(3) ? random_.length(2600) : 0);
        return wire::encodeEvent(stream, name(), payload).value_or(Bytes());
    }

    Bytes alarmDate() {
        Bytes date;
        append(date, random_.oneIn(2) ? random_.number()
                                      : (7'000'000'000 + random_.below(1000)) * 1'000'000'000);
        return date;
    }

    std::string name() {
        switch (random_.below(6)) {
        case 0:
            return platform::kSettingsChangedEvent;
        case 1:
            return wire::kAlarmName;
        case 2:
            return std::string(kNotificationNamePrefix) + random_.of(kProperties);
        case 3:
            return kNotificationNamePrefix + random_.text(random_.length(900));
        default:
            return random_.text(1 + random_.length(1023));
        }
    }

    Stage& stage_;
    Random& random_;
};

} // namespace

void runEvents(const RunOptions& options) {
    constexpr std::uint64_t kBatch = 2'000;
    Batches batches(options, "events");
    auto stage = std::make_unique<Stage>(options.daemon, std::vector<std::string>());
    Growth growth(kMostGrowth);
    std::uint64_t exchanges = 0;
    batches.setReport([&] { return stage ? stage->report() : std::string(); });
    batches.guard([&] {
        stage->launch();
        do {
            Random random = batches.ideas();
            EventSender sender(*stage, random);
            const std::uint64_t lines = stage->lines();
            for (std::uint64_t i = 0; i < std::min(kBatch, options.count); ++i) {
                sender.sendOne();
                ++exchanges;
            }
            stage->awaitEmptyQueue();
            stage->exchangeProperly(random);
            checkLines(*stage, lines, kBatch + 4);
            require(stage->storedEvents() == stage->figures(),
                    base::concat(stage->figures(), " figures acknowledged, ", stage->storedEvents(),
                                 " kept"));
            growth.look(Footprint::of(stage->daemon().process()));
        } while (batches.end(exchanges));
        stage->end();
    });
    batches.print(base::concat(stage->acknowledged(), " acknowledgements, ", stage->lines(),
                               " lines, ", growth.text()));
}

void runKernelSide(const RunOptions& options) {
    constexpr std::uint64_t kBatch = 500;
    /// Some daemons meet nobody but a hostile kernel side, from their start on.
    constexpr std::uint64_t kBatchesOfADaemon = 40;
    Batches batches(options, "kernel");
    auto stage = std::make_unique<Stage>(options.daemon, std::vector<std::string>());
    Growth growth(kMostGrowth);
    std::uint64_t events = 0;
    batches.setReport([&] { return stage ? stage->report() : std::string(); });
    batches.guard([&] {
        do {
            Random random = batches.ideas();
            stage->kernel->beHostile(&random, batches.silences());
            const std::uint64_t lines = stage->lines();
            if (!stage->hasDaemon()) {
                stage->launch();
            }
            for (std::uint64_t i = 0; i < kBatch; ++i) {
                if (random.oneIn(150)) {
                    stage->kernel->vanish();
                    stage->publish(random.of(kProperties), anyRecord(random));
                    stage->awaitEmptyQueue();
                    stage->kernel->appear();
                }
                if (random.oneIn(20)) {
                    stage->send(wire::encodeEvent(wire::kCorvidMatchingStream,
                                                  platform::kSettingsChangedEvent)
                                    .value());
                } else {
                    stage->publish(random.of(kProperties), anyRecord(random));
                }
            }
            stage->awaitEmptyQueue();
            stage->exchangeProperly(random);
            events += kBatch;
            checkLines(*stage, lines, 2 * kBatch);
            require(stage->storedEvents() >= stage->figures(),
                    base::concat(stage->figures(), " figures acknowledged, ", stage->storedEvents(),
                                 " kept"));
            growth.look(Footprint::of(stage->daemon().process()));
            if ((batches.number() + 1) % kBatchesOfADaemon == 0) {
                stage->end();
                growth = Growth(kMostGrowth);
            }
        } while (batches.end(stage->kernel->exchanges()));
        if (stage->hasDaemon()) {
            stage->end();
        }
    });
    batches.print(base::concat(events, " events, ", stage->acknowledged(), " acknowledgements, ",
                               stage->lines(), " lines, ", growth.text()));
}

namespace {

/// Where documents go to, or where it is asked for.
void configureUpload(const Stage& stage, const std::string& key) {
    const std::string path = stage.real("etc/kstd/com.zerva.keystrand.analytics.plist");
    std::ofstream(path) << R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)"
                        << "<key>splunk_topic</key><string>kst</string><key>" << key
                        << "</key><string>https://server.example/a</string></dict></plist>\n";
    ::chmod(path.c_str(), 0600);
}

std::unique_ptr<Stage> makeUploadingStage(const RunOptions& options, const std::string& key) {
    auto stage =
        std::make_unique<Stage>(options.daemon, std::vector<std::string>{"--https-socket"});
    stage->https = std::make_unique<HTTPSProcess>(stage->real("run/kstd/https.sock"));
    configureUpload(*stage, key);
    return stage;
}

/// How many events the daemon must have kept, as far as that can be told from outside.
struct Kept {
    std::uint64_t least = 0;
    std::uint64_t most = 0;
};

} // namespace

void runHTTPSProcess(const RunOptions& options) {
    constexpr std::uint64_t kBatch = 200;
    Batches batches(options, "https");
    // The heap of each thread may keep what a bag of 1 MiB took.
    constexpr std::size_t kMostGrowthWithBags = kMostGrowth + 12'000;
    constexpr std::uint64_t kBatchesOfADaemon = 200;
    constexpr std::uint64_t kPoisonedBatch = 9;
    auto stage = makeUploadingStage(options, "splunk_bagURL");
    Growth growth(kMostGrowthWithBags);
    std::uint64_t events = 0;
    batches.setReport([&] { return stage ? stage->report() : std::string(); });
    batches.guard([&] {
        stage->launch();
        Random first = batches.ideas();
        stage->exchangeProperly(first);
        Kept kept{2, 2};
        do {
            Random random = batches.ideas();
            const std::uint64_t lines = stage->lines();
            stage->https->beHostile(&random, batches.silences());
            stage->makeUploadDue();
            for (std::uint64_t i = 0; i < kBatch; ++i) {
                const std::uint64_t accepted = stage->https->accepted();
                const std::uint64_t unclear = stage->https->unclear();
                const std::uint64_t acknowledged = stage->acknowledged();
                stage->publish(random.oneIn(2) ? kAnalyticsCollectedProperty
                                               : kTimerRestartedAnalyticsCollectedProperty,
                               wellFormedRecord(random, random.oneIn(2) ? 2 : 4));
                stage->await("an acknowledgement of figures",
                             [&] { return stage->acknowledged() > acknowledged; });
                const bool isAccepted = stage->https->accepted() > accepted;
                const bool isUnclear = stage->https->unclear() > unclear;
                kept = {isAccepted || isUnclear ? 0 : kept.least + 1,
                        isAccepted ? 0 : kept.most + 1};
                if (isAccepted || isUnclear) {
                    stage->makeUploadDue();
                }
                ++events;
            }
            const std::uint64_t stored = stage->storedEvents();
            require(stored >= kept.least && stored <= kept.most,
                    base::concat(stored, " events kept, not ", kept.least, " to ", kept.most));
            if (batches.number() % kBatchesOfADaemon == kPoisonedBatch) {
                // After such a bag nothing is uploaded until the next daemon.
                stage->https->mayPoison(true);
                stage->publish(kAnalyticsCollectedProperty, wellFormedRecord(random, 2));
                stage->exchangeProperly(random);
                stage->https->mayPoison(false);
                stage->https->beHostile(nullptr);
                stage->end();
                stage->launch();
                growth = Growth(kMostGrowthWithBags);
            }
            // It accepts everything now.
            stage->https->beHostile(nullptr);
            stage->makeUploadDue();
            stage->exchangeProperly(random);
            require(stage->storedEvents() <= 1, "a server that accepts was not given everything");
            kept = {stage->storedEvents(), stage->storedEvents()};
            checkLines(*stage, lines, kBatch + 20);
            growth.look(Footprint::of(stage->daemon().process()));
        } while (batches.end(stage->https->exchanges()));
        stage->end();
    });
    batches.print(base::concat(events, " events, ", stage->https->accepted(),
                               " documents accepted, ", stage->lines(), " lines, ", growth.text()));
}

namespace {

/// Notifications that a daemon gets, one after the other, with an upload now and then.
class SoakLife {
  public:
    SoakLife(Stage& stage, std::uint64_t notifications, std::uint64_t uploads)
        : stage_(stage),
          notifications_(notifications),
          interval_(uploads > 0 ? std::max<std::uint64_t>(notifications / uploads, 2) : 0),
          uploads_(uploads) {}

    /// The daemon is asked to end while some of them are still queued.
    void live(Random& random, std::uint64_t& published) {
        constexpr std::uint64_t kWarmUp = 1'000;
        const std::uint64_t lines = stage_.lines();
        std::uint64_t uploads = 0;
        stage_.launch();
        for (std::uint64_t i = 0; i < notifications_; ++i) {
            if (i == std::min(kWarmUp, notifications_ / 2)) {
                stage_.await("an acknowledgement of everything",
                             [&] { return stage_.acknowledged() == published; });
                first = Footprint::of(stage_.daemon().process());
            }
            if (interval_ > 0 && i % interval_ == interval_ / 2 && uploads < uploads_) {
                uploadNow(published);
                ++uploads;
            }
            const std::uint32_t type = 1 + static_cast<std::uint32_t>(i % 4);
            Bytes record = wellFormedRecord(random, type);
            if (type == kKSTRMNotificationTimerRestarted) {
                put(record, kAlarmTimestampOffset, 7'000'000'000 + random.below(1000));
            }
            stage_.publish(findNotificationKind(type)->property, std::move(record));
            ++published;
        }
        last = Footprint::of(stage_.daemon().process());
        stage_.end();
        linesSaid = stage_.lines() - lines;
        bytesOnDisk = stage_.bytesOnDisk();
    }

    Footprint first;
    Footprint last;
    std::uint64_t linesSaid = 0;
    std::uint64_t bytesOnDisk = 0;

  private:
    void uploadNow(std::uint64_t published) {
        stage_.await("an acknowledgement of everything",
                     [&] { return stage_.acknowledged() == published; });
        stage_.makeUploadDue();
    }

    Stage& stage_;
    std::uint64_t notifications_;
    std::uint64_t interval_;
    std::uint64_t uploads_;
};

} // namespace

void runSoak(const RunOptions& options) {
    /// The heap finds its shape in the first thousands.
    constexpr std::size_t kMostGrowthInSoak = kMostGrowth / 3;
    /// SQLite's log of a thousand pages, which a short life does not fill.
    constexpr std::uint64_t kMostGrowthOnDisk = 5'000'000;
    Batches batches(options, "soak");
    auto stage = makeUploadingStage(options, "splunk_uploadURL");
    std::uint64_t published = 0;
    std::optional<SoakLife> firstLife;
    batches.setReport([&] { return stage ? stage->report() : std::string(); });
    batches.guard([&] {
        Random random = batches.ideas();
        // The first event sets the date of the first upload.
        stage->launch();
        stage->exchangeProperly(random);
        published = stage->acknowledged();
        stage->end();
        const std::uint64_t begin = published;
        do {
            SoakLife life(*stage, options.count / options.lives, options.uploads / options.lives);
            life.live(random, published);
            if (!firstLife) {
                firstLife.emplace(life);
            }
            std::printf("soak: life %llu: descriptors %zu -> %zu, memory %zu -> %zu KiB, "
                        "%llu lines, %llu bytes on disk\n",
                        static_cast<unsigned long long>(batches.number()), life.first.descriptors,
                        life.last.descriptors, life.first.kilobytes, life.last.kilobytes,
                        static_cast<unsigned long long>(life.linesSaid),
                        static_cast<unsigned long long>(life.bytesOnDisk));
            std::fflush(stdout);
            require(life.last.descriptors == life.first.descriptors &&
                        life.first.descriptors == firstLife->first.descriptors,
                    "descriptors grow");
            require(life.last.kilobytes <= life.first.kilobytes + kMostGrowthInSoak &&
                        life.first.kilobytes <= firstLife->first.kilobytes + kMostGrowthInSoak,
                    "memory grows");
            // One with events of the life before it has theirs, too.
            require(life.linesSaid <= firstLife->linesSaid + firstLife->linesSaid / 100 + 200,
                    "lines become more");
            require(life.bytesOnDisk <= firstLife->bytesOnDisk + kMostGrowthOnDisk,
                    "the files grow");
        } while (batches.end(published - begin));
        stage->launch();
        stage->await("an acknowledgement of everything",
                     [&] { return stage->acknowledged() == published; });
        const std::uint64_t stored = stage->storedEvents();
        require(stage->https->accepted() >= options.uploads / options.lives * options.lives,
                base::concat("only ", stage->https->accepted(), " uploads"));
        require(stage->figures() == stage->https->events() + stored,
                base::concat(stage->figures(), " figures acknowledged, ", stage->https->events(),
                             " uploaded, ", stored, " kept"));
        stage->end();
    });
    batches.print(base::concat(stage->https->accepted(), " uploads with ", stage->https->events(),
                               " events, ", stage->lines(), " lines"));
}

} // namespace neighbours
