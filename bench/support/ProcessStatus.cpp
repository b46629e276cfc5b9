#include "bench/support/ProcessStatus.h"

#include "base/Concat.h"

#include <fstream>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <string_view>

namespace bench {

namespace {

constexpr std::size_t kKibibyte = 1024;

std::string pathOf(pid_t process, std::string_view file) {
    return base::concat("/proc/", process, '/', file);
}

/// The number behind `label` in a file of lines like "VmRSS:    1234 kB", in bytes.
std::optional<std::size_t> sizeIn(const std::string& path, const std::string& label) {
    std::ifstream file(path);
    std::string word;
    std::size_t kibibytes = 0;
    while (file >> word) {
        if (word == label && file >> kibibytes) {
            return kibibytes * kKibibyte;
        }
    }
    return std::nullopt;
}

std::size_t requiredSizeIn(const std::string& path, const std::string& label) {
    const auto size = sizeIn(path, label);
    if (!size) {
        throw std::runtime_error(base::concat(path, " does not say ", label));
    }
    return *size;
}

bool isSharedLibrary(std::string_view path) {
    const std::string_view name = path.substr(path.rfind('/') + 1);
    return path.starts_with('/') && name.find(".so") != std::string_view::npos &&
           !name.starts_with("ld-linux");
}

} // namespace

ProcessMemory memoryOf(pid_t process) {
    const std::string status = pathOf(process, "status");
    const std::string sums = pathOf(process, "smaps_rollup");
    return {requiredSizeIn(status, "VmRSS:"), requiredSizeIn(status, "VmHWM:"),
            sizeIn(sums, "Pss:").value_or(0),
            sizeIn(sums, "Private_Clean:").value_or(0) +
                sizeIn(sums, "Private_Dirty:").value_or(0)};
}

double cpuTimeOf(pid_t process) {
    std::ifstream file(pathOf(process, "schedstat"));
    double nanoseconds = 0;
    if (!(file >> nanoseconds)) {
        throw std::runtime_error("cannot see what CPU time a process has used");
    }
    return nanoseconds;
}

std::size_t sharedLibrariesOf(pid_t process) {
    std::ifstream maps(pathOf(process, "maps"));
    if (!maps) {
        throw std::runtime_error("cannot see what a process has mapped");
    }
    std::set<std::string> libraries;
    for (std::string line; std::getline(maps, line);) {
        const std::string path = line.substr(std::min(line.find('/'), line.size()));
        if (isSharedLibrary(path)) {
            libraries.insert(path);
        }
    }
    return libraries.size();
}

} // namespace bench
