#pragma once

#include <functional>
#include <memory>
#include <typeindex>

namespace kstd {

class KSTDAnalyticsLogger;

/// The one logger of each class. From any thread.
class LoggerInstances {
  public:
    using Make = std::function<std::shared_ptr<KSTDAnalyticsLogger>()>;

    /// The instance of that class, made by the first call for it. Making one must not ask for
    /// another.
    [[nodiscard]] static std::shared_ptr<KSTDAnalyticsLogger> instance(std::type_index loggerClass,
                                                                       const Make& make);

    /// Forgets all instances.
    static void release();
};

} // namespace kstd
