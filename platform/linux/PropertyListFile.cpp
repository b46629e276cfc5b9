#include "platform/linux/PropertyListFile.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"
#include "platform/linux/FileTrust.h"
#include "platform/linux/RegularFile.h"

namespace platform {

std::optional<ValueMap> PropertyListFile::load(const std::string& path) {
    const RegularFile file = readRegularFile(path, kMaxSize);
    if (file.failure == ReadFailure::missing) {
        return std::nullopt;
    }
    if (const std::string reason = distrust(file, kMaxSize); !reason.empty()) {
        return ignored(path, reason);
    }
    const std::optional<Value> value = propertyLists_.value(file.bytes);
    if (!value) {
        return ignored(path, "not a property list");
    }
    const auto* const map = value->as<ValueMap>();
    if (map == nullptr) {
        return ignored(path, "not a map");
    }
    return *map;
}

std::optional<ValueMap> PropertyListFile::ignored(const std::string& path,
                                                  std::string_view reason) {
    log_.write(LogLevel::warning,
               base::concat("kstd: ", reader_, ": ", path, ": ", reason, "; ignored.\n"),
               {.messageId = message::kConfigurationNotUsed});
    return std::nullopt;
}

} // namespace platform
