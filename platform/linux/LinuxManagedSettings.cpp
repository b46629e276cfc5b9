#include "platform/linux/LinuxManagedSettings.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"
#include "platform/linux/FileTrust.h"
#include "platform/linux/ManagedSettingsText.h"
#include "platform/linux/RegularFile.h"

namespace platform {

namespace {

std::string_view textOf(const RegularFile& file) {
    return {reinterpret_cast<const char*>(file.bytes.data()), file.bytes.size()};
}

} // namespace

LinuxManagedSettings::LinuxManagedSettings(const Paths& paths, SystemLog& log)
    : path_(paths.managedSettings()), log_(log) {}

bool LinuxManagedSettings::isRestrictedModeAllowed() {
    const RegularFile file = readRegularFile(path_, kMaxSize);
    if (file.failure == ReadFailure::missing) {
        return true;
    }
    if (const std::string reason = distrust(file, kMaxSize); !reason.empty()) {
        return allowedInDoubt(reason);
    }
    const ManagedSettingsText settings = parseManagedSettings(textOf(file));
    if (!settings.problem.empty()) {
        return allowedInDoubt(settings.problem);
    }
    if (!settings.remark.empty()) {
        log_.write(
            LogLevel::warning,
            base::concat("kstd: ManagedSettings: ", path_, ": ", settings.remark, "; ignored.\n"),
            {.messageId = message::kSettingsNotUsed});
    }
    return settings.restrictedModeAllowed;
}

bool LinuxManagedSettings::allowedInDoubt(std::string_view reason) {
    log_.write(LogLevel::warning,
               base::concat("kstd: ManagedSettings: ", path_, ": ", reason,
                            "; restricted mode stays allowed.\n"),
               {.messageId = message::kSettingsNotUsed});
    return true;
}

} // namespace platform
