// One event logged, against a bare insert of the same bytes into the same tables, and against the
// same insert through another library.

#include "base/Concat.h"
#include "bench/support/AnalyticsProduct.h"
#include "bench/support/BareDatabase.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/PolicyEvent.h"
#include "bench/support/PreparedStatements.h"
#include "bench/support/Quiet.h"
#include "bench/support/SystemCallCount.h"

#include <SQLiteCpp/SQLiteCpp.h>
#include <cstdio>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>

namespace {

constexpr int kDefaultRounds = 500;
constexpr int kCallsPerRound = 20;
constexpr int kCountedCalls = 100;
constexpr double kTarget = 1.20;

constexpr char kInsert[] = "insert into all_events (timestamp, data) values (?, ?)";
constexpr double kSomeTime = 800000000;

class Product {
  public:
    explicit Product(const std::filesystem::path& root) : analytics_(root) {}

    void log() { analytics_.logger().logEventNamed("policy", &attributes_); }

  private:
    bench::AnalyticsProduct analytics_;
    const platform::ValueMap attributes_ = bench::policyAttributes(3600);
};

class Bare {
  public:
    Bare(const std::string& path, platform::Bytes event)
        : database_(path), event_(std::move(event)) {
        bench::configureAsEventStore(database_);
        bench::makeEventTables(database_);
        database_.execute("insert into Properties (key, value) "
                          "values ('upload_date', '2100-01-01T00:00:00Z')");
        insert_.emplace(database_, kInsert);
        readDate_.emplace(database_, "select value from Properties where key = 'upload_date'");
    }

    void log() { insert_->insert(kSomeTime, event_); }

    void logAndReadDate() {
        log();
        readDate_->scan([](auto /*bytes*/) {});
    }

  private:
    bench::BareDatabase database_;
    std::optional<bench::BareStatement> insert_;
    std::optional<bench::BareStatement> readDate_;
    platform::Bytes event_;
};

class Peer {
  public:
    Peer(const std::string& path, platform::Bytes event)
        : database_(withTables(path), SQLite::OPEN_READWRITE),
          insert_(database_, kInsert),
          event_(std::move(event)) {
        database_.exec("pragma journal_mode = WAL; pragma synchronous = normal");
    }

    void log() {
        insert_.bind(1, kSomeTime);
        insert_.bindNoCopy(2, event_.data(), static_cast<int>(event_.size()));
        insert_.exec();
        insert_.reset();
    }

  private:
    static const std::string& withTables(const std::string& path) {
        bench::BareDatabase database(path);
        bench::configureAsEventStore(database);
        bench::makeEventTables(database);
        return path;
    }

    SQLite::Database database_;
    SQLite::Statement insert_;
    platform::Bytes event_;
};

/// What the store keeps of one event.
platform::Bytes storedEvent(const std::string& path) {
    platform::Bytes event;
    bench::BareDatabase database(path);
    bench::BareStatement(database, "select data from all_events limit 1").scan([&](auto bytes) {
        event.assign(bytes.begin(), bytes.end());
    });
    if (event.empty()) {
        throw std::runtime_error("the event was not stored");
    }
    return event;
}

std::size_t eventCount(const std::string& path) {
    std::size_t count = 0;
    bench::BareDatabase database(path);
    bench::BareStatement(database, "select data from all_events").scan([&count](auto /*bytes*/) {
        ++count;
    });
    return count;
}

/// One call that is not counted, then those that are.
bench::Work counted(bench::Work log) {
    log();
    return [log = std::move(log)] {
        for (int call = 0; call < kCountedCalls; ++call) {
            log();
        }
    };
}

double perCall(const bench::SystemCalls& calls) {
    std::uint64_t total = 0;
    for (const auto& [number, count] : calls) {
        total += count;
    }
    return static_cast<double>(total) / kCountedCalls;
}

void reportSystemCalls(const std::filesystem::path& directory) {
    const std::filesystem::path root = directory / "counted";
    const double product = perCall(bench::countSystemCalls([&] {
        const auto logger = std::make_shared<Product>(root);
        return counted([logger] { logger->log(); });
    }));
    const double bare = perCall(bench::countSystemCalls([&] {
        const auto insert = std::make_shared<Bare>(
            directory / "counted.db", storedEvent(bench::AnalyticsProduct::databaseUnder(root)));
        return counted([insert] { insert->log(); });
    }));
    std::printf("system calls per event: product %.2f, bare %.2f\n", product, bare);
}

void reportPreparedStatements(const std::filesystem::path& root) {
    const auto prepared = bench::countPreparedStatements([&root] {
        Product product(root);
        counted([&product] { product.log(); })();
    });
    if (prepared.calls == 0) {
        throw std::runtime_error("prepared statements are not counted");
    }
    std::printf("statements prepared by the product: %zu, prepared again: %zu\n", prepared.calls,
                prepared.repeated);
}

void compareTimes(int rounds, const std::filesystem::path& directory) {
    const std::filesystem::path root = directory / "root";
    const std::string stored = bench::AnalyticsProduct::databaseUnder(root);
    const std::string barePath = directory / "bare.db";
    const std::string peerPath = directory / "peer.db";
    Product product(root);
    product.log();
    const platform::Bytes event = storedEvent(stored);
    Bare bare(barePath, event);
    Bare reading(directory / "reading.db", event);
    Peer peer(peerPath, event);
    const auto measured = bench::interleave(rounds, kCallsPerRound,
                                            {[&] { bare.log(); }, [&] { reading.logAndReadDate(); },
                                             [&] { peer.log(); },
                                             [&] {
                                                 product.log();
                                             }});
    const std::string name = base::concat("event of ", event.size(), " bytes");
    bench::printRow(name, bench::compare(measured, 0, 3), kTarget);
    bench::printRow(name + ", floor reads the date", bench::compare(measured, 1, 3), kTarget);
    bench::printRow(name + ", against SQLiteCpp", bench::compare(measured, 2, 3));
    bench::printRow("SQLiteCpp", bench::compare(measured, 0, 2));
    if (eventCount(stored) != eventCount(barePath) + 1 ||
        eventCount(stored) != eventCount(peerPath) + 1) {
        throw std::runtime_error("not every event was stored");
    }
}

void measure(const bench::Options& options, const std::filesystem::path& directory) {
    const bench::QuietStandardError quiet;
    bench::printHead(base::concat("logEventNamed of a policy event against a bare insert, ",
                                  options.rounds, " rounds of ", kCallsPerRound, " events, ",
                                  options.pinned ? "one CPU" : "any CPU"));
    compareTimes(options.rounds, directory);
    reportSystemCalls(directory);
    reportPreparedStatements(directory / "prepared");
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(argc, argv,
                               "The cost of logging an event over that of its bare insert.",
                               {.rounds = kDefaultRounds, .directory = "/dev/shm"}, measure);
}
