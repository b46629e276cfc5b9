#pragma once

#include "base/NotCopied.h"
#include "platform/PropertyLists.h"
#include "tests/platform/contract/ContractTest.h"

#include <string>

namespace contract {

struct PropertyListsFixture : private base::NotCopied {
    virtual ~PropertyListsFixture() = default;

    virtual platform::PropertyLists& propertyLists() = 0;
};

class PropertyListsContract : public ContractTest<PropertyListsFixture> {
  protected:
    [[nodiscard]] platform::Result<platform::Bytes> binary(const platform::Value& value) {
        return fixture().propertyLists().binary(value);
    }

    [[nodiscard]] std::optional<platform::Value> read(const platform::Bytes& bytes) {
        return fixture().propertyLists().value(bytes);
    }

    /// The value after a way through the binary form; none when either step fails.
    [[nodiscard]] std::optional<platform::Value> readBack(const platform::Value& value) {
        const platform::Result<platform::Bytes> bytes = binary(value);
        return bytes ? read(bytes.value()) : std::nullopt;
    }
};

} // namespace contract
