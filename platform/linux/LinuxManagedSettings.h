#pragma once

#include "platform/ManagedSettings.h"
#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

/// What a managed-settings file says.
///
/// The file is lines of `key = value`; blanks and tabs around either do not matter. A key consists
/// of lower-case letters, digits and hyphens. Empty lines and lines that begin with `#` say
/// nothing. The one key known here is `restricted-mode-allowed`, with the value `yes` or `no`,
/// given at most once; it is `yes` when it is not given.
struct ManagedSettingsText {
    bool restrictedModeAllowed = true;
    /// The first thing that is wrong with the file, empty when nothing is. The file then counts for
    /// nothing: `restrictedModeAllowed` is true.
    std::string problem;
    /// What is odd but harms nothing: the first key that is not known and how many there are.
    /// Empty when there is none.
    std::string remark;
};

[[nodiscard]] ManagedSettingsText parseManagedSettings(std::string_view text);

/// ManagedSettings in the file /etc/kstd/managed-settings.conf (see ManagedSettingsText for what
/// stands in it), which is read at every question.
///
/// The file is trusted when root or the user of this process owns it and nobody else may write it.
/// A missing file, or one without the setting, says that restricted mode is allowed. So does a file
/// that cannot be read, understood or trusted, with one warning in the log that says why.
class LinuxManagedSettings final : public ManagedSettings {
  public:
    LinuxManagedSettings(const Paths& paths, SystemLog& log);

    [[nodiscard]] bool isRestrictedModeAllowed() override;

    /// The largest file that is read.
    static constexpr std::size_t kMaxSize = 64UL * 1024;

  private:
    bool allowedInDoubt(std::string_view reason);

    std::string path_;
    SystemLog& log_;
};

} // namespace platform
