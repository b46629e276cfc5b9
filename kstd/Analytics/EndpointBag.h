#pragma once

#include "platform/Value.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace kstd {

/// What the server says about where and what to upload. A setting whose value is of another kind
/// than it must be counts as absent.
struct EndpointBag {
    /// No events are wanted any more.
    bool disabled = false;
    /// No uploads are wanted now.
    bool sendDisabled = false;
    /// Milliseconds between uploads.
    std::optional<std::uint64_t> postFrequency;
    std::optional<std::vector<std::string>> blacklistedEvents;
    std::optional<std::vector<std::string>> blacklistedFields;
    /// Added to every event.
    std::optional<platform::ValueMap> metricsBase;
    /// What the upload link begins with.
    std::optional<std::string> metricsUrl;

    /// The bag that a JSON value is, or none when it is not an object.
    [[nodiscard]] static std::optional<EndpointBag> fromValue(const platform::Value& value);
};

} // namespace kstd
