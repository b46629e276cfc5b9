#include "platform/linux/FileTrust.h"

#include "base/Concat.h"

#include <system_error>
#include <unistd.h>

namespace platform {

std::string distrust(const RegularFile& file, std::size_t limit) {
    switch (file.failure) {
    case ReadFailure::none:
        break;
    case ReadFailure::notRegular:
        return "not a regular file";
    case ReadFailure::tooLarge:
        return base::concat("larger than ", limit, " bytes");
    case ReadFailure::missing:
    case ReadFailure::unreadable:
        return base::concat("cannot be read: ", std::generic_category().message(file.error));
    }
    if (file.status.st_uid != 0 && file.status.st_uid != ::geteuid()) {
        return base::concat("owned by user ", file.status.st_uid,
                            ", neither root nor the daemon's own");
    }
    if ((file.status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
        return "writable by group or others";
    }
    return {};
}

} // namespace platform
