#pragma once

#include "platform/Result.h"
#include "platform/Timestamp.h"

#include <chrono>
#include <string>

namespace kstctl {

/// Stores `date` as the one from which on the next event uploads, in one short transaction, and
/// nothing else; returns the stored text. The daemon may be at work on the database meanwhile: it
/// looks at the date anew with every event. A lock is waited for up to `patience`.
///
/// Fails as readEventDatabase does, and makes no database.
[[nodiscard]] platform::Result<std::string> storeUploadDate(const std::string& path,
                                                            platform::Timestamp date,
                                                            std::chrono::milliseconds patience);

} // namespace kstctl
