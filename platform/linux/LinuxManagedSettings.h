#pragma once

#include "platform/ManagedSettings.h"
#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

/// ManagedSettings in the file /etc/kstd/managed-settings.conf (see ManagedSettingsText.h for what
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
