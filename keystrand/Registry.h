#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand {

/// The properties of the one registry entry.
///
/// Every value that a property is given has a generation of its own. The registry remembers which
/// generation a client last copied and how many events announced the property, so that an
/// acknowledgement drops the record that the client saw, never one that was published since, and
/// not while an event that announced it is on its way.
class Registry {
  public:
    static constexpr std::size_t kMaxProperties = 64;
    static constexpr std::size_t kMaxValueSize = 4096;

    struct Property {
        std::vector<std::uint8_t> value;
        std::uint64_t generation = 0;
        /// The generation that was copied last, 0 for none.
        std::uint64_t handedOut = 0;
        /// Grows with every copy of any property, 0 for none of this one.
        std::uint64_t lastCopy = 0;
        /// How many events were posted for it that no copy has answered yet.
        std::uint64_t announcements = 0;
    };

    /// One value of a property.
    struct Record {
        std::string name;
        std::uint64_t generation = 0;
    };

    /// Gives the property a value and a new generation. False, with nothing changed, when the name
    /// is empty or too long, the value is too long, or it would be one property too many.
    [[nodiscard]] bool set(std::string_view name, std::span<const std::uint8_t> value);

    /// An event for the property was posted. Nothing when there is no such property.
    void announce(std::string_view name);

    /// What the properties hold, in the order in which they were set.
    [[nodiscard]] std::vector<Record> records() const;

    /// No event for the property counts as being on its way any more: the next copy and its
    /// acknowledgement drop the record. False, with nothing changed, when the property does not
    /// hold that record.
    [[nodiscard]] bool forgetAnnouncements(const Record& record);

    /// False when there is no such property.
    [[nodiscard]] bool remove(std::string_view name);

    /// The property without handing it out; null when there is none. Valid until the next change.
    [[nodiscard]] const Property* find(std::string_view name) const;

    /// The value for a client; from now on its generation is the one handed out. It answers one
    /// announcement.
    [[nodiscard]] std::optional<std::vector<std::uint8_t>> copy(std::string_view name);

    /// Drops the property when its present generation is the one last handed out and no
    /// announcement is left to answer: an event that is still on its way finds its record.
    /// An acknowledged name is cut at 64 bytes: such a name also stands for a longer property, the
    /// one copied most recently among several. None when nothing was dropped.
    std::optional<Record> acknowledge(std::string_view name);

    [[nodiscard]] std::size_t count() const { return properties_.size(); }

  private:
    using Properties = std::map<std::string, Property, std::less<>>;
    [[nodiscard]] Properties::iterator acknowledgedProperty(std::string_view name);

    Properties properties_;
    std::uint64_t lastGeneration_ = 0;
    std::uint64_t lastCopy_ = 0;
};

} // namespace keystrand
