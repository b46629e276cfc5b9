// The document of an upload made from the stored events, against a bare scan of their table, and
// against the same document made through libraries that hold it as a tree.

#include "base/Concat.h"
#include "bench/support/AnalyticsProduct.h"
#include "bench/support/BareDatabase.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/PeakMemory.h"
#include "bench/support/PolicyEvent.h"
#include "bench/support/Quiet.h"
#include "bench/support/TreeDocument.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "kstd/Analytics/UploadDocument.h"
#include "platform/Files.h"
#include "platform/PropertyLists.h"

#include <algorithm>
#include <cstdio>
#include <stdexcept>
#include <string>
#include <utility>

namespace {

constexpr int kDefaultRounds = 15;
constexpr int kDefaultEvents = 100000;
constexpr double kTarget = 3.5;
constexpr std::size_t kMemoryBesidesDocument = 8UL * 1024 * 1024;
constexpr std::size_t kMemoryOfUpload = 1024UL * 1024;

constexpr char kSelect[] = "select data from all_events";

/// Stores the events in the form in which the product stores them, in one go.
void storeEvents(const std::filesystem::path& root, int count) {
    bench::AnalyticsProduct product(root);
    bench::BareDatabase database(bench::AnalyticsProduct::databaseUnder(root));
    bench::BareStatement insert(database, "insert into all_events (timestamp, data) values (?, ?)");
    database.execute("begin");
    product.logger().splunkLoggingQueue().sync([&] {
        for (int number = 0; number < count; ++number) {
            const auto attributes = bench::policyAttributes(static_cast<std::uint32_t>(number));
            const auto event = product.host().propertyLists.binary(
                product.logger().eventDictForEventName("policy", &attributes));
            insert.insert(number, event.value());
        }
    });
    database.execute("end");
}

base::TextBuffer productDocument(bench::AnalyticsProduct& product) {
    auto document = product.logger().getLoggingJSON();
    if (!document) {
        throw std::runtime_error(document.error().description);
    }
    return std::move(document).value();
}

/// The table as a plain program would read it.
class Table {
  public:
    explicit Table(const std::filesystem::path& root)
        : database_(bench::AnalyticsProduct::databaseUnder(root)), select_(database_, kSelect) {}

    /// The size of all events together; their bytes are not looked at.
    std::size_t scan() {
        std::size_t size = 0;
        select_.scan([&size](auto bytes) { size += bytes.size(); });
        return size;
    }

    bench::TreeDocument tree() {
        bench::TreeDocument document;
        select_.scan([&document](auto bytes) { document.addEvent(bytes); });
        return document;
    }

  private:
    bench::BareDatabase database_;
    bench::BareStatement select_;
};

/// Which of the two documents came out wrong cannot be told, only that they are not the same.
void requireTheSameEvents(bench::AnalyticsProduct& product, Table& table) {
    constexpr std::string_view kEndOfTree = "]}";
    bench::TreeDocument tree = table.tree();
    std::string_view events = tree.finish();
    events.remove_suffix(kEndOfTree.size());
    if (!productDocument(product).view().starts_with(events)) {
        throw std::runtime_error("the two documents do not hold the same events");
    }
}

double mebibytes(std::size_t size) {
    return static_cast<double>(size) / (1024 * 1024);
}

/// Goes through a document as it is sent.
void pull(bench::AnalyticsProduct& product) {
    const platform::Host host = product.host();
    const auto store = kstd::TQAnalyticsLoggerSQLiteStore::storeWithPath(
        host.files.locate(*kstd::Analytics::databasePath()), kstd::kEventSchema,
        {.log = host.log, .clock = host.clock, .propertyLists = host.propertyLists});
    kstd::UploadDocument document(host.json, host.propertyLists, *store, {}, 0);
    if (const auto error = document.measure()) {
        throw std::runtime_error(error->description);
    }
    std::uint64_t left = document.size();
    while (left > 0) {
        const auto piece = document.next(left);
        if (piece.empty()) {
            throw std::runtime_error("the document ends too early");
        }
        left -= piece.size();
    }
}

/// The peak memory of a process that sends the document of a store.
std::size_t memoryOfUpload(const std::filesystem::path& root) {
    return bench::peakMemoryOf([&root] {
        bench::AnalyticsProduct product(root);
        pull(product);
    });
}

void reportMemory(const std::filesystem::path& root, const std::filesystem::path& empty,
                  std::size_t documentSize) {
    const std::size_t ofProduct = bench::peakMemoryOf([&root] {
        bench::AnalyticsProduct product(root);
        static_cast<void>(productDocument(product));
    });
    const std::size_t ofScan = bench::peakMemoryOf([&root] { Table(root).scan(); });
    const std::size_t ofTree =
        bench::peakMemoryOf([&root] { static_cast<void>(Table(root).tree().finish()); });
    std::printf("document %.2f MiB; peak memory: product %.2f MiB, scan %.2f MiB, tree %.2f MiB\n",
                mebibytes(documentSize), mebibytes(ofProduct), mebibytes(ofScan),
                mebibytes(ofTree));
    const std::size_t besides = ofProduct - std::min(ofProduct, documentSize);
    std::printf("peak memory of the product besides the document: %.2f MiB, budget %.2f %s\n",
                mebibytes(besides), mebibytes(kMemoryBesidesDocument),
                besides <= kMemoryBesidesDocument ? "met" : "missed");
    // One without events brings in as much code and as many pages of the store. The first one makes
    // it.
    static_cast<void>(memoryOfUpload(empty));
    const std::size_t least = memoryOfUpload(empty);
    const std::size_t upload = memoryOfUpload(root);
    std::printf("peak memory of an upload: %.2f MiB, without events %.2f MiB, budget for the "
                "difference %.2f %s\n",
                mebibytes(upload), mebibytes(least), mebibytes(kMemoryOfUpload),
                upload <= least + kMemoryOfUpload ? "met" : "missed");
}

std::size_t sizeOfDocument(const std::filesystem::path& root) {
    bench::AnalyticsProduct product(root);
    return productDocument(product).size();
}

void compareTimes(int rounds, const std::filesystem::path& root, int events) {
    bench::AnalyticsProduct product(root);
    Table table(root);
    requireTheSameEvents(product, table);
    const auto measured = bench::interleave(rounds, 1,
                                            {[&] { table.scan(); },
                                             [&] { static_cast<void>(productDocument(product)); },
                                             [&] {
                                                 static_cast<void>(table.tree().finish());
                                             }});
    const std::string name = base::concat(events, " events");
    bench::printRow(name, bench::compare(measured, 0, 1), kTarget);
    bench::printRow(name + ", against a tree", bench::compare(measured, 2, 1));
    bench::printRow("tree", bench::compare(measured, 0, 2));
}

void measure(const bench::Options& options, const std::filesystem::path& directory) {
    const bench::QuietStandardError quiet;
    bench::printHead(base::concat("The document of an upload against a bare table scan, ",
                                  options.rounds, " rounds, ",
                                  options.pinned ? "one CPU" : "any CPU"));
    storeEvents(directory, options.events);
    compareTimes(options.rounds, directory, options.events);
    reportMemory(directory, directory / "empty", sizeOfDocument(directory));
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(
        argc, argv, "The cost of an upload's document over that of a scan of its events.",
        {.rounds = kDefaultRounds, .directory = "/dev/shm", .events = kDefaultEvents}, measure);
}
