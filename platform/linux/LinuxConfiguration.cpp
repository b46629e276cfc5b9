#include "platform/linux/LinuxConfiguration.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"
#include "platform/linux/RegularFile.h"

#include <algorithm>
#include <string>
#include <sys/stat.h>
#include <utility>

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

namespace {

/// Not by the locale: a name is the same everywhere.
std::string lowerCase(std::string_view text) {
    std::string lower(text);
    std::transform(lower.begin(), lower.end(), lower.begin(), [](char c) {
        return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
    });
    return lower;
}

} // namespace

LinuxConfigurationResource::LinuxConfigurationResource(Paths paths, PropertyLists& propertyLists,
                                                       SystemLog& log)
    : paths_(std::move(paths)), file_("ConfigurationResource", propertyLists, log) {}

std::optional<ValueMap> LinuxConfigurationResource::load(std::string_view component,
                                                         std::string_view name) {
    if (!isPlainFileName(component) || !isPlainFileName(name)) {
        return std::nullopt;
    }
    return file_.load(paths_.configurationResource(lowerCase(component), name));
}

LinuxUserDefaults::LinuxUserDefaults(Paths paths, PropertyLists& propertyLists, SystemLog& log)
    : paths_(std::move(paths)), file_("UserDefaults", propertyLists, log) {}

ValueMap LinuxUserDefaults::load(std::string_view domain) {
    if (!isPlainFileName(domain)) {
        return {};
    }
    return file_.load(paths_.userDefaults(domain)).value_or(ValueMap());
}

LinuxInternalDiagnostics::LinuxInternalDiagnostics(Paths paths) : paths_(std::move(paths)) {}

bool LinuxInternalDiagnostics::isEnabled(std::string_view subsystem) {
    if (!isPlainFileName(subsystem)) {
        return false;
    }
    struct stat status {};
    return ::stat(paths_.internalDiagnostics(subsystem).c_str(), &status) == 0 &&
           S_ISREG(status.st_mode);
}

} // namespace platform
