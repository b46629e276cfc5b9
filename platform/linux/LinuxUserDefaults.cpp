#include "platform/linux/LinuxUserDefaults.h"

#include "base/Concat.h"

#include <utility>

namespace platform {

LinuxUserDefaults::LinuxUserDefaults(Paths paths, PropertyLists& propertyLists, SystemLog& log)
    : paths_(std::move(paths)), file_("UserDefaults", propertyLists, log) {}

std::optional<Value> LinuxUserDefaults::value(std::string_view domain, std::string_view key) {
    if (!isPlainFileName(domain)) {
        return std::nullopt;
    }
    const std::optional<ValueMap> map = file_.load(paths_.userDefaults(domain));
    if (!map) {
        return std::nullopt;
    }
    const auto entry = map->find(key);
    return entry == map->end() ? std::nullopt : std::optional(entry->second);
}

} // namespace platform
