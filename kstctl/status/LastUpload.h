#pragma once

#include "kstctl/status/Section.h"
#include "platform/Date.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kstctl {

/// What became of an upload.
enum class UploadOutcome {
    /// The server has the events.
    accepted,
    failed,
    /// There was no address for it.
    noAddress,
    /// There is nothing behind its start: it is under way, or the daemon was ended in it.
    begun,
};

/// What a line of the daemon's says about the upload that it ends, or begins; none when it says
/// nothing of that kind.
[[nodiscard]] std::optional<UploadOutcome> uploadOutcomeOf(std::string_view line);

/// Adds to the section, as "last", what became of the daemon's last upload: the daemon keeps it
/// nowhere but in the journal.
void addLastUpload(Section& section, const Environment& environment);

} // namespace kstctl
