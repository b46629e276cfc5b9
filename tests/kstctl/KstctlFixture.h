#pragma once

#include "platform/Value.h"
#include "tests/kstctl/RunProgram.h"
#include "tests/system/AnalyticsFixture.h"

#include <map>
#include <string>
#include <vector>

namespace kstctl {

using kstd::OtherConnection;

/// kstctl beside the real programs, in the same private root.
///
/// Of everything that it says the fixture expects: no escape sequence in what is no terminal; one
/// line on standard error for each status but 0, and none for 0.
class KstctlFixture : public system_tests::AnalyticsFixture {
  protected:
    using Arguments = std::vector<std::string>;

    Ran kstctl(const Arguments& arguments, const RunOptions& options = {});

    /// The result of `arguments` with --json. The status is expected.
    platform::Value json(const Arguments& arguments, int status = 0);

    /// Runs it and expects this status and this line, without "kstctl: " and the end of the line.
    void expectFailure(const Arguments& arguments, int status, const std::string& line,
                       const RunOptions& options = {});

    /// Every file under the root with what tells whether it was changed.
    [[nodiscard]] std::map<std::string, std::size_t> files() const;
};

/// The value that a path like "daemon.eventSocket.path" leads to; a number is an index of a list.
/// An error's text when there is none.
[[nodiscard]] platform::Value at(const platform::Value& value, const std::string& path);

/// Every path that leads to something, of maps and of the first element of lists.
[[nodiscard]] std::vector<std::string> pathsIn(const platform::Value& value,
                                               const std::string& prefix = {});

} // namespace kstctl
