#include "kstctl/status/Section.h"

namespace kstctl {

namespace {

int badness(ExitStatus status) {
    switch (status) {
    case ExitStatus::missing:
        return 5;
    case ExitStatus::unreadable:
        return 4;
    case ExitStatus::malformed:
        return 3;
    case ExitStatus::misconfigured:
        return 2;
    case ExitStatus::failed:
    case ExitStatus::usage:
        return 1;
    case ExitStatus::success:
        return 0;
    }
    return 0;
}

} // namespace

void Section::note(const platform::Error& fault) {
    if (!worst || badness(statusOf(fault)) > badness(statusOf(*worst))) {
        worst = fault;
    }
}

std::string octalMode(unsigned mode) {
    std::string digits;
    for (int shift = 9; shift >= 0; shift -= 3) {
        digits += static_cast<char>('0' + ((mode >> static_cast<unsigned>(shift)) & 7U));
    }
    return digits;
}

} // namespace kstctl
