#include "platform/linux/Paths.h"

#include "base/Concat.h"

namespace platform {

namespace {

std::string_view withoutTrailingSlashes(std::string_view path) {
    while (path.ends_with('/')) {
        path.remove_suffix(1);
    }
    return path;
}

std::string_view withoutLeadingSlashes(std::string_view path) {
    while (path.starts_with('/')) {
        path.remove_prefix(1);
    }
    return path;
}

} // namespace

Paths::Paths(std::string_view root) : prefix_(withoutTrailingSlashes(root)) {}

std::string Paths::under(std::string_view absolutePath) const {
    return base::concat(prefix_, '/', withoutLeadingSlashes(absolutePath));
}

std::string Paths::userDefaults(std::string_view domain) const {
    return under(base::concat("/etc/kstd/", domain, ".plist"));
}

std::string Paths::configurationResource(std::string_view component, std::string_view name) const {
    return under(base::concat("/usr/share/", component, '/', name, ".plist"));
}

std::string Paths::internalDiagnostics(std::string_view subsystem) const {
    return under(base::concat("/etc/kstd/internal-diagnostics/", subsystem));
}

bool isPlainFileName(std::string_view name) {
    constexpr std::string_view kNotInNames("/\0", 2);
    return !name.empty() && name != "." && name != ".." &&
           name.find_first_of(kNotInNames) == std::string_view::npos;
}

} // namespace platform
