#include "kstctl/decode/Decoded.h"

#include "KSTLib/Platform.h"
#include "base/Concat.h"
#include "kstctl/RecordingLog.h"

namespace kstctl::decode {

namespace {

/// What stands between "AssertMacros: " and the value in an assertion line; nothing when that is a
/// check that always fails and so says nothing.
std::string_view conditionIn(std::string_view line) {
    constexpr std::string_view kBefore = "AssertMacros: ";
    const std::size_t start = line.find(kBefore);
    if (start == std::string_view::npos) {
        return {};
    }
    line.remove_prefix(start + kBefore.size());
    const std::string_view condition = line.substr(0, line.find(" (value: "));
    return condition == "0" ? std::string_view() : condition;
}

} // namespace

std::optional<platform::Error> refusalOf(std::string_view what,
                                         const std::function<KSTStatus()>& deserialise) {
    RecordingLog log;
    kst::installLog(&log);
    const KSTStatus status = deserialise();
    kst::installLog(nullptr);
    if (status == kKSTErrorSuccess) {
        return std::nullopt;
    }
    const std::string_view condition =
        log.lines().empty() ? std::string_view() : conditionIn(log.lines().front());
    return failure(status == kKSTErrorOutOfMemory ? ExitStatus::failed : ExitStatus::malformed,
                   condition.empty()
                       ? base::concat("not ", what)
                       : base::concat("not ", what, ": the check \"", condition, "\" failed"));
}

} // namespace kstctl::decode
