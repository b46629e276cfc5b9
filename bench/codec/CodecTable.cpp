#include "bench/codec/CodecTable.h"

#include "base/Concat.h"

#include <cstdio>
#include <stdexcept>

namespace bench {

namespace {

constexpr std::size_t kProduct = 0;
constexpr std::size_t kMemcpy = 1;

struct Operation {
    const char* name;
    Work Codec::*work;
    bool isEncode;
};

constexpr Operation kOperations[] = {{"encode", &Codec::encode, true},
                                     {"encode anew", &Codec::encodeAnew, true},
                                     {"decode", &Codec::decode, false},
                                     {"decode anew", &Codec::decodeAnew, false}};

void requireSameValues(const std::vector<Codec>& codecs) {
    for (std::size_t i = kMemcpy + 1; i < codecs.size(); ++i) {
        if (codecs[i].fields != codecs[kProduct].fields) {
            throw std::runtime_error(codecs[i].name + " has read other values than the product");
        }
    }
}

void printSizes(const std::vector<Codec>& codecs) {
    std::printf("bytes:");
    const char* separator = " ";
    for (const Codec& codec : codecs) {
        std::printf("%s%s %zu", separator, codec.name.c_str(), codec.encodedSize);
        separator = ", ";
    }
    std::printf("\n");
}

std::optional<double> targetOf(const CodecTargets& targets, const Operation& operation,
                               const std::vector<Codec>& codecs, std::size_t codec) {
    if (!operation.isEncode) {
        return operation.work == &Codec::decode && codecs[codec].name == "protobuf"
                   ? targets.decodeAgainstProtobuf
                   : std::nullopt;
    }
    return codec == kMemcpy ? targets.encodeAgainstMemcpy : targets.encodeAgainstPeers;
}

Measured measureOperation(int rounds, const std::vector<Codec>& codecs,
                          const Operation& operation) {
    std::vector<Work> works;
    for (const Codec& codec : codecs) {
        if (const Work& work = codec.*operation.work) {
            works.push_back(work);
        }
    }
    Measured measured = interleave(rounds, 1, works);
    for (Samples& samples : measured.samples) {
        for (double& nanoseconds : samples) {
            nanoseconds /= kCallsPerWork;
        }
    }
    return measured;
}

} // namespace

void compareCodecs(const std::string& title, int rounds, const std::vector<Codec>& codecs,
                   const CodecTargets& targets) {
    requireSameValues(codecs);
    printHead(title);
    for (const Operation& operation : kOperations) {
        const Measured measured = measureOperation(rounds, codecs, operation);
        std::size_t place = kMemcpy;
        for (std::size_t i = kMemcpy; i < codecs.size(); ++i) {
            if (codecs[i].*operation.work) {
                printRow(base::concat(operation.name, ", against ", codecs[i].name),
                         compare(measured, place++, kProduct),
                         targetOf(targets, operation, codecs, i));
            }
        }
    }
    printSizes(codecs);
}

} // namespace bench
