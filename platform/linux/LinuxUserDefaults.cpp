#include "platform/linux/LinuxUserDefaults.h"

#include "base/Concat.h"

#include <utility>

namespace platform {

LinuxUserDefaults::LinuxUserDefaults(Paths paths, PropertyLists& propertyLists, SystemLog& log)
    : paths_(std::move(paths)), file_("UserDefaults", propertyLists, log) {}

ValueMap LinuxUserDefaults::load(std::string_view domain) {
    if (!isPlainFileName(domain)) {
        return {};
    }
    return file_.load(paths_.userDefaults(domain)).value_or(ValueMap());
}

} // namespace platform
