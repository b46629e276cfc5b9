#pragma once

#include "platform/JSON.h"
#include "platform/PropertyLists.h"

#include <memory>
#include <mutex>
#include <optional>
#include <string_view>

namespace platform {

/// Ends the process with a message: a test has asked a double for something that has no sensible
/// answer, such as to wait for ever.
[[noreturn]] void testError(std::string_view message);

/// Property lists in the binary form only; one that is not is refused like any other bytes.
class FakePropertyLists final : public PropertyLists {
  public:
    [[nodiscard]] Result<Bytes> binary(const Value& value) override;
    [[nodiscard]] bool read(std::span<const std::uint8_t> data, ValueSink& sink) override;
    [[nodiscard]] bool readKnowing(KnownKeys& known, std::span<const std::uint8_t> data,
                                   ValueSink& sink) override;

    /// The next `binary` fails with this error, whatever it is given.
    void failNextBinary(Error error);

    /// The next reading fails, whatever it is given; its sink takes nothing.
    void failNextRead();

  private:
    [[nodiscard]] bool takeReadFailure();

    std::mutex mutex_;
    std::optional<Error> nextBinaryError_;
    bool nextReadFails_ = false;
};

/// Reads and writes JSON, and fails when it is told to. Outlives its texts.
class FakeJSON final : public JSON {
  public:
    [[nodiscard]] std::unique_ptr<JSONText>
    makeText(const JSONWritingOptions& options = {}) override;
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
