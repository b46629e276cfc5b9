#include "tests/neighbours/Batches.h"

#include <cstdio>

namespace neighbours {

std::string Batches::text(const std::string& rest) const {
    const auto tenths = std::chrono::duration_cast<std::chrono::milliseconds>(
                            std::chrono::steady_clock::now() - begin_)
                            .count() /
                        100;
    return base::concat(name_, ": ", exchanges_, " exchanges, batches ", options_.firstBatch,
                        " to ", batch_ - 1, ", ", tenths / 10, '.', tenths % 10, " s; ", rest,
                        '\n');
}

void Batches::print(const std::string& rest) const {
    std::fputs(text(rest).c_str(), stdout);
}

void Batches::guard(const std::function<void()>& work) const {
    try {
        work();
    } catch (const Fault& fault) {
        throw Fault(base::concat("batch ", batch_, ": ", fault.what(), '\n', report_()));
    }
}

} // namespace neighbours
