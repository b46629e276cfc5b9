#include "platform/fake/FakeJSON.h"

#include "platform/shared/JSONReader.h"
#include "platform/shared/JSONWriter.h"

#include <utility>

namespace platform {

class FakeJSON::Text final : public JSONWriter {
  public:
    explicit Text(FakeJSON& json) : json_(json) {}

    [[nodiscard]] Result<base::TextBuffer> finish() override {
        if (auto error = json_.take(json_.finishError_)) {
            return *std::move(error);
        }
        return JSONWriter::finish();
    }

  private:
    FakeJSON& json_;
};

std::unique_ptr<JSONText> FakeJSON::makeText() {
    return std::make_unique<Text>(*this);
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
