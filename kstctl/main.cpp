#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"

#include <exception>
#include <filesystem>
#include <system_error>
#include <variant>

namespace {

using kstctl::ExitStatus;

ExitStatus runIn(const kstctl::CommandLine& options) {
    kstctl::Output output(options.isJSON);
    kstctl::Progress progress;
    std::error_code error;
    const std::string root = std::filesystem::absolute(options.root, error).string();
    const bool isDirectory = std::filesystem::is_directory(root, error);
    if (kstctl::isRefusal(error.value())) {
        return output.finish(kstctl::fileError(root, error.value()));
    }
    if (!isDirectory) {
        return output.finish(
            kstctl::failure(ExitStatus::missing, base::concat("there is no directory ", root)));
    }
    const kstctl::Environment environment{platform::Paths(root), output, progress,
                                          options.patience};
    return std::visit([&environment](const auto& command) { return run(command, environment); },
                      options.command);
}

} // namespace

int main(int argc, char** argv) try {
    ExitStatus status = ExitStatus::success;
    const auto options = kstctl::parseCommandLine(argc, argv, status);
    return static_cast<int>(options ? runIn(*options) : status);
} catch (const std::exception& error) {
    kstctl::Output::complain(error.what());
    return static_cast<int>(ExitStatus::failed);
}
