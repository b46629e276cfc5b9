#pragma once

#include "platform/ServiceRegistry.h"
#include "platform/fake/FakeKernel.h"

#include <cstddef>
#include <map>
#include <string>
#include <string_view>

namespace platform {

/// The registry of a FakeKernel as one process sees it. Handles are counted.
class FakeServiceRegistry final : public ServiceRegistry {
  public:
    explicit FakeServiceRegistry(FakeKernel& kernel) : kernel_(kernel) {}

    [[nodiscard]] ServiceHandle findByPath(std::string_view path) override;
    [[nodiscard]] ServiceHandle findByClassName(std::string_view name) override;
    [[nodiscard]] std::optional<std::vector<std::uint8_t>>
    copyProperty(ServiceHandle entry, std::string_view name) override;
    void release(ServiceHandle entry) override;

    /// How many references the process holds.
    [[nodiscard]] std::size_t liveReferences() const;

    /// The registry path of an entry that is held, or an empty text.
    [[nodiscard]] std::string pathOf(ServiceHandle entry) const;

  private:
    struct Entry {
        std::string path;
        std::size_t references = 0;
    };

    [[nodiscard]] ServiceHandle hold();

    FakeKernel& kernel_;
    std::map<ServiceHandle, Entry> entries_;
    ServiceHandle lastHandle_ = kNoService;
};

} // namespace platform
