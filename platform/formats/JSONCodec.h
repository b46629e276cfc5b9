#pragma once

#include "platform/JSON.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string_view>

namespace platform {

/// What JSON::read does.
[[nodiscard]] Result<Value> readJSON(std::string_view text);

/// Writes into one growing block and allocates nothing else.
class JSONWriter : public JSONText {
  public:
    explicit JSONWriter(const JSONWritingOptions& options = {}) : isPretty_(options.isPretty) {}

    void beginMap() override { begin('{'); }
    void key(std::string_view key) override;
    void repeatedKey(std::string_view key, std::string& form) override;
    void endMap() override { end('}'); }
    void beginList() override { begin('['); }
    void endList() override { end(']'); }

    void null() override { constant("null"); }
    void boolean(bool value) override { constant(value ? "true" : "false"); }
    void integer(std::int64_t value) override;
    void largeInteger(std::uint64_t value) override;
    void real(double value) override;
    void text(std::string_view utf8) override;
    void bytes(std::span<const std::uint8_t> /*value*/) override { leaveOut(); }
    void date(Timestamp /*value*/) override { leaveOut(); }
    void other(std::string_view /*kind*/) override { leaveOut(); }

    [[nodiscard]] Mark mark() const override;
    void rewind(const Mark& mark) override;
    void moveTo(base::TextBuffer& taken) override;
    [[nodiscard]] Result<base::TextBuffer> finish() override;

  private:
    void begin(char bracket);
    void end(char bracket);
    void constant(std::string_view text);
    void leaveOut();

    /// Whether the value that comes is to be written; the comma is there then.
    [[nodiscard]] bool openValue();
    /// Keeps the value that was written, or takes it away again together with its key.
    void closeValue(bool isExpressed);
    void beginEntry();
    /// Where a pretty text goes on in a line of its own.
    void breakLine(std::size_t depth);

    const bool isPretty_;
    base::TextBuffer text_;
    /// Where the entry began that is being written: before its comma.
    std::size_t entryStart_ = 0;
    /// The maps and lists that are open in the text.
    std::size_t depth_ = 0;
    /// The open ones inside of those that are left out, because their key could not be written.
    std::size_t depthLeftOut_ = 0;
    bool isFirst_ = true;
    bool hasKey_ = false;
    bool isKeyLeftOut_ = false;
};

class JSONCodec final : public JSON {
  public:
    [[nodiscard]] std::unique_ptr<JSONText>
    makeText(const JSONWritingOptions& options = {}) override {
        return std::make_unique<JSONWriter>(options);
    }

    [[nodiscard]] Result<Value> read(std::string_view text) override { return readJSON(text); }
};

} // namespace platform
