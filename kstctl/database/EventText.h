#pragma once

#include "kstctl/Report.h"
#include "kstctl/database/EventDatabase.h"
#include "platform/PropertyLists.h"
#include "platform/Value.h"

#include <optional>
#include <string>

namespace kstctl {

/// A stored event as people and programs are shown it.
struct ReadableEvent {
    std::int64_t id = 0;
    std::optional<double> added;
    /// None when the row holds no event.
    std::optional<platform::ValueMap> attributes;

    [[nodiscard]] static ReadableEvent of(const StoredEvent& stored,
                                          platform::PropertyLists& propertyLists);

    /// The event's type, if it is a text.
    [[nodiscard]] std::optional<std::string> type() const;
    /// When it was added, as text; empty when that is not known.
    [[nodiscard]] std::string addedText() const;
    [[nodiscard]] Report report() const;
};

/// What a value of a property list looks like in a report: bytes as hexadecimal digits, a date as
/// text.
[[nodiscard]] Report::Datum datumOf(const platform::Value& value);

/// The value in one line: a text as it is, everything else as JSON.
[[nodiscard]] std::string lineOf(const platform::Value& value);

} // namespace kstctl
