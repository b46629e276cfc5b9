#include "keystrand-sim/ControlArguments.h"

#include "base/Concat.h"
#include "base/Digits.h"

#include <algorithm>

namespace keystrand::sim {

namespace {

constexpr std::string_view kBlanks = " \t\r";

} // namespace

ControlArguments::ControlArguments(std::string_view line) {
    for (std::size_t start = line.find_first_not_of(kBlanks); start != std::string_view::npos;
         start = line.find_first_not_of(kBlanks)) {
        line.remove_prefix(start);
        const std::string_view word = line.substr(0, line.find_first_of(kBlanks));
        line.remove_prefix(word.size());
        const std::size_t equals = word.find('=');
        if (equals == std::string_view::npos) {
            words_.push_back(word);
        } else if (!named_.emplace(word.substr(0, equals), word.substr(equals + 1)).second) {
            fail(word.substr(0, equals), "given twice");
        }
    }
}

std::string_view ControlArguments::word(std::string_view what) {
    if (words_.empty()) {
        fail(what, "missing");
        return {};
    }
    const std::string_view word = words_.front();
    words_.erase(words_.begin());
    return word;
}

bool ControlArguments::flag(std::string_view name) {
    const auto found = std::find(words_.begin(), words_.end(), name);
    if (found == words_.end()) {
        return false;
    }
    words_.erase(found);
    return true;
}

bool ControlArguments::onOrOff() {
    const std::string_view value = word("on or off");
    if (value != "on" && value != "off") {
        fail(value, "neither on nor off");
    }
    return value == "on";
}

std::vector<std::uint8_t> ControlArguments::bytes(std::string_view what) {
    auto value = fromHexWord(word(what));
    if (!value) {
        fail(what, "not hexadecimal");
        return {};
    }
    return std::move(*value);
}

std::optional<std::string_view> ControlArguments::named(std::string_view name) {
    const auto found = named_.find(name);
    if (found == named_.end()) {
        return std::nullopt;
    }
    const std::string_view value = found->second;
    named_.erase(found);
    return value;
}

void ControlArguments::fail(std::string_view what, std::string_view problem) {
    if (problem_.empty()) {
        problem_ = base::concat(what, ": ", problem);
    }
}

std::optional<std::string> ControlArguments::problem() const {
    if (!problem_.empty()) {
        return problem_;
    }
    if (!words_.empty()) {
        return base::concat(words_.front(), ": not understood");
    }
    if (!named_.empty()) {
        return base::concat(named_.begin()->first, ": not understood");
    }
    return std::nullopt;
}

namespace {

constexpr std::string_view kEmptyWord = "empty";

} // namespace

std::string toHexWord(std::span<const std::uint8_t> bytes) {
    return bytes.empty() ? std::string(kEmptyWord) : base::hexDigits(bytes);
}

std::optional<std::vector<std::uint8_t>> fromHexWord(std::string_view word) {
    if (word == kEmptyWord) {
        return std::vector<std::uint8_t>();
    }
    if (word.empty() || word.size() % 2 != 0) {
        return std::nullopt;
    }
    std::vector<std::uint8_t> bytes;
    bytes.reserve(word.size() / 2);
    for (std::size_t i = 0; i < word.size(); i += 2) {
        const auto high = base::hexDigitValue(word[i]);
        const auto low = base::hexDigitValue(word[i + 1]);
        if (!high || !low) {
            return std::nullopt;
        }
        bytes.push_back(static_cast<std::uint8_t>(*high << 4U | *low));
    }
    return bytes;
}

} // namespace keystrand::sim
