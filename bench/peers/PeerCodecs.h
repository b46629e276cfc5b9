#pragma once

#include "bench/codec/Codec.h"
#include "bench/codec/Samples.h"

/// Other libraries' codecs of the payloads. Each takes the values from the sample, so from a
/// program's own records, and checks on reading what the library checks of bytes that are not
/// trusted.

/// Fills a message, and reads into one. The codecs "at hand" have the message filled already, as
/// the product has its record or tree, and only write.
namespace bench::protobuf {
[[nodiscard]] Codec credential(const SampleCredential& sample);
[[nodiscard]] Codec credentialAtHand(const SampleCredential& sample);
[[nodiscard]] Codec requirement(const SampleRequirement& sample);
[[nodiscard]] Codec requirementAtHand(const SampleRequirement& sample);
[[nodiscard]] Codec question(const SampleQuestion& sample);
} // namespace bench::protobuf

/// Writes what its builder makes, verifies and reads in place.
namespace bench::flatbuffer {
[[nodiscard]] Codec credential(const SampleCredential& sample);
[[nodiscard]] Codec requirement(const SampleRequirement& sample);
[[nodiscard]] Codec question(const SampleQuestion& sample);
} // namespace bench::flatbuffer

/// Fills a message and writes it as one run of bytes, reads in place.
namespace bench::capnproto {
[[nodiscard]] Codec credential(const SampleCredential& sample);
[[nodiscard]] Codec requirement(const SampleRequirement& sample);
[[nodiscard]] Codec question(const SampleQuestion& sample);
} // namespace bench::capnproto
