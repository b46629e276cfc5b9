#include "kstd/Analytics/OSVersion.h"

#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "platform/SystemVersion.h"

#include <mutex>

namespace kstd {

namespace {

struct Cache {
    std::mutex mutex;
    std::optional<OSVersion> version;
};

Cache& cache() {
    static Cache cache;
    return cache;
}

} // namespace

OSVersion OSVersion::cached(platform::SystemVersion& version) {
    const std::lock_guard lock(cache().mutex);
    if (!cache().version) {
        cache().version = OSVersion{version.build(), version.product()};
    }
    return *cache().version;
}

void OSVersion::release() {
    const std::lock_guard lock(cache().mutex);
    cache().version.reset();
}

void KSTDAnalyticsLogger::addOSVersion(platform::ValueMap& map, platform::SystemVersion& version) {
    const OSVersion known = OSVersion::cached(version);
    if (known.build) {
        map.insert_or_assign("build", *known.build);
    }
    if (known.product) {
        map.insert_or_assign("product", *known.product);
    }
}

} // namespace kstd
