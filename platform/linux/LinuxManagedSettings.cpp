#include "platform/linux/LinuxManagedSettings.h"

#include "base/Concat.h"
#include "platform/linux/ManagedSettingsText.h"

#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace platform {

namespace {

std::string reasonOf(const RegularFile& file) {
    switch (file.failure) {
    case ReadFailure::notRegular:
        return "not a regular file";
    case ReadFailure::tooLarge:
        return base::concat("larger than ", LinuxManagedSettings::kMaxSize, " bytes");
    default:
        return base::concat("cannot be read: ", std::generic_category().message(file.error));
    }
}

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
    if (file.failure != ReadFailure::none) {
        return allowedInDoubt(reasonOf(file));
    }
    if (const std::string reason = distrust(file); !reason.empty()) {
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
            {});
    }
    return settings.restrictedModeAllowed;
}

std::string LinuxManagedSettings::distrust(const RegularFile& file) {
    if (file.status.st_uid != 0 && file.status.st_uid != ::geteuid()) {
        return base::concat("owned by user ", file.status.st_uid,
                            ", neither root nor the daemon's own");
    }
    if ((file.status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return "writable by group or others";
    }
    return {};
}

bool LinuxManagedSettings::allowedInDoubt(std::string_view reason) {
    log_.write(LogLevel::warning,
               base::concat("kstd: ManagedSettings: ", path_, ": ", reason,
                            "; restricted mode stays allowed.\n"),
               {});
    return true;
}

} // namespace platform
