#pragma once

#include "platform/PropertyLists.h"
#include "platform/SystemLog.h"
#include "platform/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// Configuration in files that are property lists: each is one map.
class PropertyListFile {
  public:
    /// `reader` is what a line in the log begins with. Property lists and log must outlive it.
    PropertyListFile(std::string_view reader, PropertyLists& propertyLists, SystemLog& log)
        : reader_(reader), propertyLists_(propertyLists), log_(log) {}

    /// The map in the file, or none. A missing file is silently none; a file that cannot be read,
    /// understood or trusted (see FileTrust.h) gives one warning that says why:
    ///
    ///     kstd: UserDefaults: /etc/kstd/x.plist: not a property list; ignored.
    [[nodiscard]] std::optional<ValueMap> load(const std::string& path);

    /// The largest file that is read.
    static constexpr std::size_t kMaxSize = 1024UL * 1024;

  private:
    std::optional<ValueMap> ignored(const std::string& path, std::string_view reason);

    std::string reader_;
    PropertyLists& propertyLists_;
    SystemLog& log_;
};

} // namespace platform
