#include "kstd/Analytics/LoggerInstances.h"

#include <map>
#include <mutex>

namespace kstd {

namespace {

using ByClass = std::map<std::type_index, std::shared_ptr<KSTDAnalyticsLogger>>;

struct Instances {
    std::mutex mutex;
    ByClass byClass;
};

/// Never destroyed: its loggers would outlive the host that they use.
Instances& instances() {
    static Instances& instances = *new Instances;
    return instances;
}

} // namespace

std::shared_ptr<KSTDAnalyticsLogger> LoggerInstances::instance(std::type_index loggerClass,
                                                               const Make& make) {
    const std::lock_guard lock(instances().mutex);
    std::shared_ptr<KSTDAnalyticsLogger>& instance = instances().byClass[loggerClass];
    if (instance == nullptr) {
        instance = make();
    }
    return instance;
}

void LoggerInstances::release() {
    ByClass released;
    const std::lock_guard lock(instances().mutex);
    released.swap(instances().byClass);
}

} // namespace kstd
