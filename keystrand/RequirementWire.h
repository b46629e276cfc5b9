#pragma once

#include "keystrand/Evaluation.h"

#include <cstdint>
#include <vector>

namespace keystrand {

/// The requirement tree that a client is told, on the wire: what is missing, each node with its
/// state and its priority. The data of the leaves are described in docs/keystrand-sim.md.
[[nodiscard]] std::vector<std::uint8_t> encodeMissing(const Missing& missing);

} // namespace keystrand
