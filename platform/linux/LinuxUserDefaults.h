#pragma once

#include "platform/UserDefaults.h"
#include "platform/linux/Paths.h"
#include "platform/linux/PropertyListFile.h"

namespace platform {

/// User defaults in the files /etc/kstd/<domain>.plist; PropertyListFile.h says which files count.
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

} // namespace platform
