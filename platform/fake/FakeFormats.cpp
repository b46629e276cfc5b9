#include "platform/fake/FakeFormats.h"

#include "platform/formats/JSONCodec.h"
#include "platform/formats/PropertyListCodec.h"

#include <cstdio>
#include <cstdlib>
#include <utility>

namespace platform {

void testError(std::string_view message) {
    std::fprintf(stderr, "error in the test: %.*s\n", static_cast<int>(message.size()),
                 message.data());
    std::abort();
}

Result<Bytes> FakePropertyLists::binary(const Value& value) {
    {
        const std::lock_guard lock(mutex_);
        if (nextBinaryError_) {
            return *std::exchange(nextBinaryError_, std::nullopt);
        }
    }
    return writeBinaryPropertyList(value);
}

bool FakePropertyLists::read(std::span<const std::uint8_t> data, ValueSink& sink) {
    return !takeReadFailure() && readBinaryPropertyList(data, sink);
}

bool FakePropertyLists::readKnowing(KnownKeys& known, std::span<const std::uint8_t> data,
                                    ValueSink& sink) {
    return !takeReadFailure() && readBinaryPropertyList(data, sink, &known);
}

bool FakePropertyLists::takeReadFailure() {
    const std::lock_guard lock(mutex_);
    return std::exchange(nextReadFails_, false);
}

void FakePropertyLists::failNextBinary(Error error) {
    const std::lock_guard lock(mutex_);
    nextBinaryError_ = std::move(error);
}

void FakePropertyLists::failNextRead() {
    const std::lock_guard lock(mutex_);
    nextReadFails_ = true;
}

class FakeJSON::Text final : public JSONWriter {
  public:
    Text(FakeJSON& json, const JSONWritingOptions& options) : JSONWriter(options), json_(json) {}

    [[nodiscard]] Result<base::TextBuffer> finish() override {
        if (auto error = json_.take(json_.finishError_)) {
            return *std::move(error);
        }
        return JSONWriter::finish();
    }

  private:
    FakeJSON& json_;
};

std::unique_ptr<JSONText> FakeJSON::makeText(const JSONWritingOptions& options) {
    return std::make_unique<Text>(*this, options);
}

Result<Value> FakeJSON::read(std::string_view text) {
    if (auto error = take(readError_)) {
        return *std::move(error);
    }
    return readJSON(text);
}

void FakeJSON::failNextRead(Error error) {
    const std::lock_guard lock(mutex_);
    readError_ = std::move(error);
}

void FakeJSON::failNextFinish(Error error) {
    const std::lock_guard lock(mutex_);
    finishError_ = std::move(error);
}

std::optional<Error> FakeJSON::take(std::optional<Error>& error) {
    const std::lock_guard lock(mutex_);
    return std::exchange(error, std::nullopt);
}

} // namespace platform
