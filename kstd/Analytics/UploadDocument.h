#pragma once

#include "base/TextBuffer.h"
#include "platform/JSON.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <functional>
#include <optional>
#include <string>

namespace platform {
class PropertyLists;
class SystemVersion;
} // namespace platform

namespace kstd {

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
