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

} // namespace platform
