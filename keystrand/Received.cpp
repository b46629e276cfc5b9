#include "keystrand/Received.h"

#include "base/ByteReader.h"

#include <algorithm>
#include <span>

namespace keystrand {

namespace {

std::uint32_t numberOf(const KSTParameter& parameter) {
    std::uint32_t number = 0;
    base::ByteReader reader(parameter.parameterData, parameter.parameterDataLength);
    return reader.readU32(number) ? number : 0;
}

} // namespace

std::size_t ReceivedParameters::wireSize() const {
    std::size_t size = 0;
    for (const KSTParameter& parameter : std::span(items, count)) {
        size += kHeaderSize + parameter.parameterDataLength;
    }
    return size;
}

std::optional<std::uint32_t> ReceivedParameters::user() const {
    for (const KSTParameter& parameter : std::span(items, count)) {
        if (parameter.type == kUser) {
            return numberOf(parameter);
        }
    }
    return std::nullopt;
}

bool ReceivedParameters::disagreeAboutUser() const {
    const auto first = user();
    const std::span all(items, count);
    return std::any_of(all.begin(), all.end(), [&](const KSTParameter& parameter) {
        return parameter.type == kUser && numberOf(parameter) != first;
    });
}

} // namespace keystrand
