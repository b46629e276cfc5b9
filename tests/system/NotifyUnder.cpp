// kstd-notify under a root directory: NotifyUnder ROOT SUBJECT.

#include "kstd-notify/Notify.h"
#include "platform/linux/LinuxClock.h"

#include <array>
#include <iostream>
#include <string_view>
#include <unistd.h>

int main(int count, char** words) {
    if (count != 3) {
        std::cerr << "usage: NotifyUnder ROOT SUBJECT\n";
        return 2;
    }
    // By this call who watches knows that the program's own begin.
    static_cast<void>(::getppid());
    platform::LinuxClock clock;
    const std::array<std::string_view, 1> subject = {words[2]};
    return notify::run(subject, platform::Paths(words[1]), clock, std::chrono::seconds(2),
                       std::cerr);
}
