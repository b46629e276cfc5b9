#pragma once

#include "bench/codec/Codec.h"

#include <optional>
#include <string>
#include <vector>

namespace bench {

/// The ratios that the product is to keep, where there are any.
struct CodecTargets {
    std::optional<double> encodeAgainstMemcpy;
    std::optional<double> encodeAgainstPeers;
    /// Of `decode`, in which the peer keeps its message.
    std::optional<double> decodeAgainstProtobuf = std::nullopt;
};

/// Measures all codecs of one payload in the same rounds and prints a row for the product against
/// each of the others. The product is the first, the bare copy the second, the rest are peers.
/// Throws when one of them has read other values than the product.
void compareCodecs(const std::string& title, int rounds, const std::vector<Codec>& codecs,
                   const CodecTargets& targets);

} // namespace bench
