#include "platform/linux/LinuxConfigurationResource.h"

#include <algorithm>
#include <string>
#include <utility>

namespace platform {

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

} // namespace platform
