#include "kstd/KSTService.h"

#include "KSTLib/Status.h"
#include "kstd/LogLines.h"
#include "platform/MessageClasses.h"
#include "platform/ServiceRegistry.h"
#include "wire/RestrictedMode.h"

namespace kstd {

std::optional<std::vector<std::uint8_t>>
KSTService::KSTPropertyWithName(std::string_view propertyName) {
    constexpr char kSource[] = "kstd/KSTService";
    const platform::ServiceHandle entry = host_.registry.findByPath(wire::rm::kKernelServicePath);
    if (entry == platform::kNoService) {
        // The line of a failed check is written by code that knows no classes.
        ClassifyingLog log(host_.log, platform::message::kKernelServiceFailed);
        platform::fail({&log, kTag, kSource}, "entry", 0, kKSTErrorUnexpected);
        return std::nullopt;
    }
    auto result = host_.registry.copyProperty(entry, propertyName);
    if (!result) {
        platform::fail({&host_.log, kTag, kSource}, "result", 0, kKSTErrorUnexpected);
    }
    host_.registry.release(entry);
    return result;
}

} // namespace kstd
