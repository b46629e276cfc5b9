#pragma once

#include "platform/SystemVersion.h"
#include "platform/linux/Paths.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// The value that a text in the form of os-release files gives to `name`, or none. The last
/// assignment counts.
///
/// A line is a comment when it begins with #, else an assignment as a shell has it: a value's parts
/// may stand in single or double quotes, a backslash takes the meaning from the character behind it
/// (in double quotes only from $, `, " and \), and after the value only a comment may follow.
/// Nothing is expanded and no value goes on in the next line. Every other line is skipped.
[[nodiscard]] std::optional<std::string> valueInOsRelease(std::string_view text,
                                                          std::string_view name);

/// The system's version as /etc/os-release tells it, or /usr/lib/os-release when there is none to
/// read (see valueInOsRelease). The build is BUILD_ID, or VERSION_ID on a system without builds;
/// the product is NAME. An empty value is not known. Read at every call; may be called from any
/// thread.
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
