#include "base/Concat.h"
#include "keystrand-sim/ControlClient.h"
#include "kstctl/CommandLine.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Forms.h"
#include "kstctl/Output.h"
#include "wire/SystemPaths.h"

#include <unistd.h>

namespace kstctl {

namespace {

std::string joined(const std::vector<std::string>& words) {
    std::string line;
    for (const std::string& word : words) {
        line += line.empty() ? word : base::concat(' ', word);
    }
    return line;
}

platform::Error unreachable(const std::string& path) {
    const bool isRefused = ::access(path.c_str(), R_OK | W_OK) != 0 && isRefusal(errno);
    return isRefused
               ? fileError(path, EACCES)
               : failure(ExitStatus::missing, base::concat("no keystrand-sim listens at ", path));
}

} // namespace

ExitStatus run(const SimCommand& command, const Environment& environment) {
    const std::string path = environment.paths.under(wire::kSimulatorControlSocket);
    auto client = keystrand::sim::ControlClient::connect(path);
    if (!client) {
        return environment.output.finish(unreachable(path));
    }
    const auto answer = client->command(joined(command.words));
    if (environment.output.isJSON()) {
        Report report;
        report.add("isOK", answer.ok)
            .add("error", answer.ok ? Report::None() : Report::Datum(answer.reason))
            .add("lines", Data(answer.lines.begin(), answer.lines.end()));
        environment.output.show(report);
    } else {
        for (const std::string& line : answer.lines) {
            environment.output.put(base::concat(printable(line), '\n'));
        }
    }
    return answer.ok ? environment.output.finish(ExitStatus::success)
                     : environment.output.finish(failure(
                           ExitStatus::failed, base::concat("keystrand-sim: ", answer.reason)));
}

} // namespace kstctl
