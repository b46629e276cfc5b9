#pragma once

#include "base/NotCopied.h"
#include "platform/JSON.h"
#include "tests/platform/contract/ContractTest.h"

#include <string>
#include <string_view>

namespace contract {

struct JSONFixture : private base::NotCopied {
    virtual ~JSONFixture() = default;

    virtual platform::JSON& json() = 0;
};

class JSONContract : public ContractTest<JSONFixture> {
  protected:
    [[nodiscard]] std::unique_ptr<platform::JSONText> makeText() {
        return fixture().json().makeText();
    }

    /// The finished text, or "none".
    [[nodiscard]] static std::string finish(platform::JSONText& text) {
        const auto finished = text.finish();
        return finished ? std::string(finished.value().view()) : "none";
    }

    [[nodiscard]] std::string write(const platform::Value& value) {
        const auto text = makeText();
        platform::describe(value, *text);
        return finish(*text);
    }

    [[nodiscard]] platform::Result<platform::Value> read(std::string_view text) {
        return fixture().json().read(text);
    }
};

} // namespace contract
