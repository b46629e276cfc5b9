#pragma once

#include "platform/JSON.h"
#include "platform/shared/JSONReader.h"
#include "platform/shared/JSONWriter.h"

#include <memory>

namespace platform {

class JSONCodec final : public JSON {
  public:
    [[nodiscard]] std::unique_ptr<JSONText>
    makeText(const JSONWritingOptions& options = {}) override {
        return std::make_unique<JSONWriter>(options);
    }

    [[nodiscard]] Result<Value> read(std::string_view text) override { return readJSON(text); }
};

} // namespace platform
