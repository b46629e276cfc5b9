#pragma once

#include "platform/Date.h"

#include <concepts>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace kstctl {

struct Field;

/// What a command has found out: fields by name, in the order in which they are shown.
class Report {
  public:
    class Datum;

    /// There is nothing, which is known.
    struct None {};
    /// It could not be found out, and why.
    struct Unknown {
        std::string reason;
    };

    // Where a field is known.
    Report();
    Report(const Report& other);
    Report(Report&& other) noexcept;
    Report& operator=(const Report& other);
    Report& operator=(Report&& other) noexcept;
    ~Report();

    /// `meaning` says in words what the value stands for; empty when it speaks for itself.
    Report& add(std::string name, Datum value, std::string meaning = {});

    [[nodiscard]] const std::vector<Field>& fields() const { return fields_; }
    [[nodiscard]] bool isEmpty() const;

  private:
    std::vector<Field> fields_;
};

using Data = std::vector<Report::Datum>;

/// One value of a report.
class Report::Datum {
  public:
    using Content = std::variant<None, Unknown, bool, std::int64_t, std::uint64_t, double,
                                 std::string, Data, Report>;

    // NOLINTBEGIN(google-explicit-constructor): reports are written as they read.
    Datum(None none);
    Datum(Unknown unknown);
    template <std::same_as<bool> Boolean>
    Datum(Boolean value) : Datum(Exactly(), Content(std::in_place_type<bool>, value)) {}
    template <std::signed_integral Number>
    Datum(Number value) : Datum(Exactly(), Content(std::in_place_type<std::int64_t>, value)) {}
    template <std::unsigned_integral Number>
    requires(!std::same_as<Number, bool>) Datum(Number value)
        : Datum(Exactly(), Content(std::in_place_type<std::uint64_t>, value)) {}
    Datum(double value);
    Datum(std::string text);
    Datum(std::string_view text);
    Datum(const char* text);
    Datum(Data list);
    Datum(Report report);
    // NOLINTEND(google-explicit-constructor)
    Datum(const Datum& other);
    Datum(Datum&& other) noexcept;
    Datum& operator=(const Datum& other);
    Datum& operator=(Datum&& other) noexcept;
    ~Datum();

    [[nodiscard]] const Content& content() const { return content_; }

  private:
    struct Exactly {};
    Datum(Exactly /*exactly*/, Content content);

    Content content_;
};

struct Field {
    std::string name;
    Report::Datum value;
    std::string meaning;
};

/// Bytes as lower-case hexadecimal digits.
[[nodiscard]] std::string hexText(std::span<const std::uint8_t> bytes);

/// 2026-11-20T08:15:00Z, to the second, cut off towards the past.
[[nodiscard]] std::string timeText(platform::Timestamp time);
[[nodiscard]] std::string timeText(platform::Date time);
/// The same for seconds since 1970-01-01 UTC; empty for 0, which stands for no time, and for times
/// after the year 9999.
[[nodiscard]] std::string timeText(std::uint64_t secondsSince1970);

} // namespace kstctl
