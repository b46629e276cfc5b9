#pragma once

#include "platform/JSON.h"

#include <memory>
#include <mutex>
#include <optional>
#include <string_view>

namespace platform {

/// Reads and writes JSON, and fails when it is told to. Outlives its texts.
class FakeJSON final : public JSON {
  public:
    [[nodiscard]] std::unique_ptr<JSONText> makeText() override;
    [[nodiscard]] Result<Value> read(std::string_view text) override;

    /// The next text to be read, whatever it is, fails with this error.
    void failNextRead(Error error);
    /// The next text to be finished, whatever is in it, fails with this error.
    void failNextFinish(Error error);

  private:
    class Text;

    /// Takes the error out of its place.
    [[nodiscard]] std::optional<Error> take(std::optional<Error>& error);

    std::mutex mutex_;
    std::optional<Error> readError_;
    std::optional<Error> finishError_;
};

} // namespace platform
