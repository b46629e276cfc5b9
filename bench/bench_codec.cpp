// The payloads that carry credentials, requirements and questions, written and read by the library,
// against a copy of the same bytes and against other libraries with the same values.

#include "base/Concat.h"
#include "bench/codec/CodecTable.h"
#include "bench/codec/ProductCodecs.h"
#include "bench/peers/PeerCodecs.h"
#include "bench/support/Benchmark.h"

namespace {

constexpr int kDefaultRounds = 300;
constexpr double kTargetAgainstMemcpy = 2;
/// Ahead of them.
constexpr double kTargetAgainstPeers = 1;

std::string titleOf(const char* payload, std::size_t size, const bench::Options& options) {
    return base::concat(payload, ", ", size, " bytes, ", options.rounds, " rounds of ",
                        bench::kCallsPerWork, " calls, ", options.pinned ? "one CPU" : "any CPU");
}

void measureCredential(const bench::Options& options) {
    const auto sample = bench::sampleCredential();
    const bench::Codec product = bench::product::credential(sample);
    bench::compareCodecs(
        titleOf("A credential", product.encodedSize, options), options.rounds,
        {product, bench::copying::bytes(product.encodedSize), bench::protobuf::credential(sample),
         bench::protobuf::credentialAtHand(sample), bench::flatbuffer::credential(sample),
         bench::capnproto::credential(sample)},
        {.encodeAgainstMemcpy = kTargetAgainstMemcpy, .encodeAgainstPeers = {}});
}

void measureRequirement(const bench::Options& options) {
    const auto sample = bench::sampleRequirement();
    const bench::Codec product = bench::product::requirement(sample);
    bench::compareCodecs(
        titleOf("\nA requirement of 20 nodes", product.encodedSize, options), options.rounds,
        {product, bench::copying::bytes(product.encodedSize), bench::protobuf::requirement(sample),
         bench::protobuf::requirementAtHand(sample), bench::flatbuffer::requirement(sample),
         bench::capnproto::requirement(sample)},
        {.encodeAgainstMemcpy = {},
         .encodeAgainstPeers = kTargetAgainstPeers,
         .decodeAgainstProtobuf = kTargetAgainstPeers});
}

void measureQuestion(const bench::Options& options) {
    const auto sample = bench::sampleQuestion();
    const bench::Codec product = bench::product::question(sample);
    bench::compareCodecs(
        titleOf("\nA policy with 10 parameters", product.encodedSize, options), options.rounds,
        {product, bench::copying::bytes(product.encodedSize), bench::protobuf::question(sample),
         bench::flatbuffer::question(sample), bench::capnproto::question(sample)},
        {});
}

void measure(const bench::Options& options, const std::filesystem::path& /*directory*/) {
    measureCredential(options);
    measureRequirement(options);
    measureQuestion(options);
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(argc, argv,
                               "The cost of writing and reading payloads over that of copying "
                               "them, and against other libraries.",
                               {.rounds = kDefaultRounds}, measure);
}
