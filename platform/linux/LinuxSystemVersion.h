#pragma once

#include "platform/SystemVersion.h"
#include "platform/linux/Paths.h"

#include <cstddef>
#include <string_view>

namespace platform {

/// The system's version as /etc/os-release tells it, or /usr/lib/os-release when there is none to
/// read (see OsReleaseText.h). The build is BUILD_ID, or VERSION_ID on a system without builds; the
/// product is NAME. An empty value is not known. Read at every call; may be called from any thread.
class LinuxSystemVersion final : public SystemVersion {
  public:
    explicit LinuxSystemVersion(Paths paths);

    [[nodiscard]] std::optional<std::string> build() override;
    [[nodiscard]] std::optional<std::string> product() override;

    /// The largest file that is read.
    static constexpr std::size_t kMaxSize = 64UL * 1024;

  private:
    Paths paths_;
};

} // namespace platform
