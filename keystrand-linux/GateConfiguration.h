#pragma once

#include "keystrand-linux/Keystrand.h"

#include <string>
#include <string_view>
#include <vector>

namespace keystrand::usb {

/// What the administrator has set.
///
/// Lines of the form "key = value"; blank lines, and those that begin with "#", say nothing. Blanks
/// around key and value do not matter. Each key may stand once, in any order, or be left out; what
/// it is then stands in parentheses:
///
///     period         seconds from locking to restricted mode, 0 to 4294967295 (3600)
///     internal       "yes": devices on ports inside the machine come in all the same; "no" (yes)
///     keyboards      "when-none": a keyboard comes in while there is no other; "never"; "always"
///                    (when-none)
///     not-keyboards  IDs like 046d:c31c of what only looks like a keyboard, with blanks or commas
///                    between them; may stand more than once, and all count (none)
///     on-unlock      "accept": what was refused comes in when the machine is unlocked; "replug":
///                    it has to be plugged in once more (accept)
///
/// A key whose value is not understood, or that is given again, is as if it were left out: that
/// protects, and locks nobody out. The other keys hold. A line names file, line and word.
struct GateConfiguration {
    /// Of a larger file nothing counts.
    static constexpr std::size_t kMaxSize = 65536;
    /// Then one line says how many more there are.
    static constexpr std::size_t kMostRemarks = 16;

    /// `rules.keyboardBuiltIn` is left alone.
    Keystrand::Settings settings = {};
    /// Complete lines for the log.
    std::vector<std::string> remarks = {};
};

/// `path` is what the lines call the file.
[[nodiscard]] GateConfiguration parseGateConfiguration(std::string_view text,
                                                       std::string_view path);

/// Reads `root`/etc/keystrand/keystrand.conf, and whether a keyboard is built in. No file is no
/// remark. A file counts when root or the user of this process owns it and nobody else may write
/// it; else nothing of it does, with one line.
[[nodiscard]] GateConfiguration readGateConfiguration(const std::string& root);

/// Whether the firmware calls the machine something with a keyboard of its own: a laptop, a
/// notebook, and the like (`root`/sys/class/dmi/id/chassis_type).
[[nodiscard]] bool hasKeyboardBuiltIn(const std::string& root);

} // namespace keystrand::usb
