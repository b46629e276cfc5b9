#pragma once

#include <cstdint>
#include <rapidjson/document.h>
#include <rapidjson/stringbuffer.h>
#include <span>
#include <string_view>

namespace bench {

/// A document of events as a plain program makes it with the libraries at hand: each event read
/// into libplist's tree, that copied into one RapidJSON tree, and that written when it is complete.
class TreeDocument {
  public:
    TreeDocument();

    /// Throws when it is no map of plain values in the binary form.
    void addEvent(std::span<const std::uint8_t> propertyList);

    /// The whole text, as long as this lives. Called once, when all events are in.
    [[nodiscard]] std::string_view finish();

  private:
    rapidjson::Document document_;
    rapidjson::Value events_;
    rapidjson::StringBuffer text_;
};

} // namespace bench
