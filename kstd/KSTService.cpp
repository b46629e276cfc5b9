#include "kstd/KSTService.h"

#include "kstd/LogLines.h"
#include "platform/ServiceRegistry.h"
#include "wire/RestrictedMode.h"

namespace kstd {

std::optional<std::vector<std::uint8_t>>
KSTService::KSTPropertyWithName(std::string_view propertyName) {
    const kst::AssertionContext assertions{&host_.log, kTag, "kstd/KSTService"};
    const platform::ServiceHandle entry = host_.registry.findByPath(wire::rm::kKernelServicePath);
    if (entry == platform::kNoService) {
        kst::fail(assertions, "entry", 0, kKSTErrorUnexpected);
        return std::nullopt;
    }
    auto result = host_.registry.copyProperty(entry, propertyName);
    if (!result) {
        kst::fail(assertions, "result", 0, kKSTErrorUnexpected);
    }
    host_.registry.release(entry);
    return result;
}

} // namespace kstd
