#include "kstd-notify/Notify.h"
#include "platform/linux/LinuxClock.h"

#include <chrono>
#include <iostream>
#include <vector>

namespace {

/// Longer than the daemon takes for one event, unless it waits for a slow server.
constexpr std::chrono::seconds kPatience{30};

} // namespace

int main(int argc, char** argv) {
    const std::vector<std::string_view> arguments(argv + 1, argv + argc);
    platform::LinuxClock clock;
    return notify::run(arguments, platform::Paths("/"), clock, kPatience, std::cerr);
}
