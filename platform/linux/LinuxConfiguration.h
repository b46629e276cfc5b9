#pragma once

#include "platform/ConfigurationResource.h"
#include "platform/InternalDiagnostics.h"
#include "platform/PropertyLists.h"
#include "platform/SystemLog.h"
#include "platform/UserDefaults.h"
#include "platform/Value.h"
#include "platform/linux/Paths.h"

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
    /// understood or trusted (see RegularFile.h) gives one warning that says why:
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

/// Configuration resources in the files /usr/share/<component>/<name>.plist, the component's name
/// in lower case; PropertyListFile says which files count. A component or name that is no plain
/// file name has none. The file is read at every call. May be called from any thread.
class LinuxConfigurationResource final : public ConfigurationResource {
  public:
    /// `propertyLists` and `log` must outlive it.
    LinuxConfigurationResource(Paths paths, PropertyLists& propertyLists, SystemLog& log);

    [[nodiscard]] std::optional<ValueMap> load(std::string_view component,
                                               std::string_view name) override;

  private:
    Paths paths_;
    PropertyListFile file_;
};

/// User defaults in the files /etc/kstd/<domain>.plist; PropertyListFile says which files count.
/// A domain that is no plain file name has nothing set. May be called from any thread.
class LinuxUserDefaults final : public UserDefaults {
  public:
    /// `propertyLists` and `log` must outlive it.
    LinuxUserDefaults(Paths paths, PropertyLists& propertyLists, SystemLog& log);

    [[nodiscard]] ValueMap load(std::string_view domain) override;

  private:
    Paths paths_;
    PropertyListFile file_;
};

/// A subsystem's diagnostics are on as long as the file /etc/kstd/internal-diagnostics/<subsystem>
/// is there, whatever is in it: only root can put it there. Looked at on every call; may be called
/// from any thread.
class LinuxInternalDiagnostics final : public InternalDiagnostics {
  public:
    explicit LinuxInternalDiagnostics(Paths paths);

    [[nodiscard]] bool isEnabled(std::string_view subsystem) override;

  private:
    Paths paths_;
};

} // namespace platform
