#pragma once

#include "platform/ConfigurationResource.h"
#include "platform/linux/Paths.h"
#include "platform/linux/PropertyListFile.h"

namespace platform {

/// Configuration resources in the files /usr/share/<component>/<name>.plist, the component's name
/// in lower case; PropertyListFile.h says which files count. A component or name that is no plain
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

} // namespace platform
