#include "platform/host/MessageClasses.h"

#include <algorithm>

namespace platform {

bool isOfPattern(std::string_view line, std::string_view pattern) {
    constexpr char kAnyText = '*';
    std::size_t star = pattern.find(kAnyText);
    if (!line.starts_with(pattern.substr(0, star))) {
        return false;
    }
    while (star != std::string_view::npos) {
        line.remove_prefix(star);
        pattern.remove_prefix(star + 1);
        star = pattern.find(kAnyText);
        const std::size_t found = line.find(pattern.substr(0, star));
        if (found == std::string_view::npos) {
            return false;
        }
        line.remove_prefix(found);
    }
    return true;
}

std::string_view messageIdOf(std::string_view line, std::span<const MessageClass> classes) {
    const auto found =
        std::find_if(classes.begin(), classes.end(), [line](const MessageClass& candidate) {
            return isOfPattern(line, candidate.pattern);
        });
    return found == classes.end() ? std::string_view() : found->id;
}

} // namespace platform
