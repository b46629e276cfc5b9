#pragma once

#include "base/NotCopied.h"
#include "base/TextBuffer.h"
#include "platform/JSON.h"
#include "platform/PropertyLists.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
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
    std::function<void(const std::function<void(std::span<const std::uint8_t> data)>& visitor)>;

/// What ends each upload: `extraValues`, and over them what every summary says. `postTime` is in
/// milliseconds since 1970.
[[nodiscard]] platform::ValueMap uploadSummary(platform::ValueMap extraValues,
                                               const std::optional<std::string>& topic,
                                               platform::SystemVersion& version, double postTime);

/// The JSON text of an upload in the making: every event in its order, then the summary, under
/// "events"; and when it was made.
///
/// An event goes from its stored form straight into the text. What holds no event leaves no trace.
class UploadText : private base::NotCopied {
  public:
    UploadText(platform::JSON& json, platform::PropertyLists& propertyLists,
               const platform::JSONWritingOptions& options = {});

    void addEvent(std::span<const std::uint8_t> data);
    /// Moves what is there of the text behind what is in `taken`.
    void moveTo(base::TextBuffer& taken) { text_->moveTo(taken); }
    /// The text, or what is left of it. `postTime` is in milliseconds since 1970. Once.
    [[nodiscard]] platform::Result<base::TextBuffer> finish(const platform::ValueMap& summary,
                                                            double postTime);

  private:
    platform::PropertyLists& propertyLists_;
    platform::KnownKeys knownKeys_;
    const std::unique_ptr<platform::JSONText> text_;
};

/// The whole text. Events of a store are visited on the queue of the store.
[[nodiscard]] platform::Result<base::TextBuffer>
makeUploadDocument(platform::JSON& json, platform::PropertyLists& propertyLists,
                   const StoredEvents& events, const platform::ValueMap& summary, double postTime,
                   const platform::JSONWritingOptions& options = {});

} // namespace kstd
