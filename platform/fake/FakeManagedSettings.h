#pragma once

#include "platform/ManagedSettings.h"

#include <cstddef>
#include <functional>
#include <optional>
#include <utility>

namespace platform {

/// Settings that a test puts. None put stands for a file that is missing or of no use.
class FakeManagedSettings final : public ManagedSettings {
  public:
    /// `announce` posts the event of a change.
    explicit FakeManagedSettings(std::function<void()> announce) : announce_(std::move(announce)) {}

    [[nodiscard]] bool isRestrictedModeAllowed() override {
        ++questions_;
        return allowed_.value_or(true);
    }

    /// Puts the setting and posts the event of a change.
    void change(std::optional<bool> allowed) {
        put(allowed);
        announce_();
    }

    /// Puts the setting as it stood before the process was started.
    void put(std::optional<bool> allowed) { allowed_ = allowed; }

    /// How often the setting was asked for.
    [[nodiscard]] std::size_t questions() const { return questions_; }

  private:
    std::function<void()> announce_;
    std::optional<bool> allowed_;
    std::size_t questions_ = 0;
};

} // namespace platform
