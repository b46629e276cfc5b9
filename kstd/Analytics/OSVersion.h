#pragma once

#include <optional>
#include <string>

namespace platform {
class SystemVersion;
}

namespace kstd {

/// What analytics says about the system it runs on. From any thread.
struct OSVersion {
    std::optional<std::string> build;
    std::optional<std::string> product;

    /// What the first call has read. It holds until `release`.
    [[nodiscard]] static OSVersion cached(platform::SystemVersion& version);
    static void release();
};

} // namespace kstd
