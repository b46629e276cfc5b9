#pragma once

#include "KSTLib/PolicyVerification.h"
#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace keystrand {

/// Bytes that a deserialiser handed out.
struct ReceivedText {
    ReceivedText() = default;
    ReceivedText(const ReceivedText&) = delete;
    ReceivedText& operator=(const ReceivedText&) = delete;
    ~ReceivedText() { DeallocDataBlob(data, length); }

    [[nodiscard]] std::string_view view() const {
        return data == nullptr ? std::string_view()
                               : std::string_view(static_cast<const char*>(data), length);
    }

    void* data = nullptr;
    std::uint32_t length = 0;
};

/// Parameters that a deserialiser handed out.
struct ReceivedParameters {
    static constexpr KSTParameterType kUser = 4;
    static constexpr std::size_t kHeaderSize = sizeof(KSTParameterType) + sizeof(std::uint32_t);
    static constexpr std::size_t kMaxWireSize =
        kKSTMaxParameters * (kHeaderSize + kKSTParameterMaxDataLength);

    ReceivedParameters() = default;
    ReceivedParameters(const ReceivedParameters&) = delete;
    ReceivedParameters& operator=(const ReceivedParameters&) = delete;
    ~ReceivedParameters() { DeallocParameters(items, count); }

    [[nodiscard]] std::size_t wireSize() const;

    /// The user that the parameters name.
    [[nodiscard]] std::optional<std::uint32_t> user() const;
    /// Whether they name more than one.
    [[nodiscard]] bool disagreeAboutUser() const;

    KSTParameter* items = nullptr;
    std::uint32_t count = 0;
};

} // namespace keystrand
