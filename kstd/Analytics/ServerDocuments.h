#pragma once

#include "base/TextBuffer.h"
#include "platform/JSON.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace platform {
class PropertyLists;
class SystemVersion;
} // namespace platform

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

/// Hands the stored form of each event to `visitor`, in the order in which they came.
using StoredEvents =
    std::function<void(const std::function<void(const platform::Bytes& data)>& visitor)>;

/// What ends each upload: `extraValues`, and over them what every summary says. `postTime` is in
/// milliseconds since 1970.
[[nodiscard]] platform::ValueMap uploadSummary(platform::ValueMap extraValues,
                                               const std::optional<std::string>& topic,
                                               platform::SystemVersion& version, double postTime);

/// The JSON text of an upload: every event in its order, then `summary`, under "events"; and
/// `postTime`, in milliseconds since 1970.
///
/// An event goes from its stored form straight into the text, so that nothing but the text grows
/// with their number. What holds no event leaves no trace. Events of a store are visited on the
/// queue of the store.
[[nodiscard]] platform::Result<base::TextBuffer>
makeUploadDocument(platform::JSON& json, platform::PropertyLists& propertyLists,
                   const StoredEvents& events, const platform::ValueMap& summary, double postTime,
                   const platform::JSONWritingOptions& options = {});

} // namespace kstd
