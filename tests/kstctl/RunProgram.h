#pragma once

#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace kstctl {

/// How a program has ended, and what it said.
struct Ran {
    /// 128 plus the signal's number when one ended it.
    int status = -1;
    std::string out;
    std::string err;
};

struct RunOptions {
    /// Its standard input.
    std::string input = {};
    /// Where its standard output goes instead of being kept.
    std::optional<std::string> outputFile = {};
    /// Its standard input and output are a terminal, on which nobody types.
    bool onTerminal = false;
    /// The terminal's width; it does not say it when this is 0.
    unsigned short columns = 0;
    /// Set for it alone.
    std::vector<std::string> environment = {};
    /// The user that it runs as, with no groups; needs root.
    std::optional<uid_t> user = {};
};

/// Runs kstctl to its end.
[[nodiscard]] Ran runKstctl(const std::vector<std::string>& arguments,
                            const RunOptions& options = {});

} // namespace kstctl
