#pragma once

#include "keystrand-sim/Simulator.h"

#include <optional>
#include <string>
#include <vector>

namespace keystrand::sim {

/// What the command line asks for.
struct Options {
    Simulator::Settings settings;
    /// The words of a control command to send; none to be the simulator.
    std::optional<std::vector<std::string>> controlWords;
};

/// None when there is nothing to run; `exitStatus` is then the program's status, and what is to be
/// said has been said.
[[nodiscard]] std::optional<Options> parseOptions(int argc, const char* const* argv,
                                                  int& exitStatus);

} // namespace keystrand::sim
