#pragma once

#include "bench/codec/Codec.h"
#include "bench/codec/Samples.h"

/// The product's codecs of the payloads. What it reads is always memory of its own, wiped when it
/// is released; only what is written can be kept.
namespace bench::product {

[[nodiscard]] Codec credential(const SampleCredential& sample);
[[nodiscard]] Codec requirement(const SampleRequirement& sample);
[[nodiscard]] Codec question(const SampleQuestion& sample);

} // namespace bench::product

/// The floor: as many bytes as the product writes, copied as they are. "Reading" is a copy, too;
/// none of its values is looked at.
namespace bench::copying {

[[nodiscard]] Codec bytes(std::size_t size);

} // namespace bench::copying
