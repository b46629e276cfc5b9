#include "keystrand-linux/GateConfiguration.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "keystrand-linux/SmallFile.h"
#include "wire/SystemPaths.h"

#include <algorithm>
#include <cerrno>
#include <optional>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

namespace keystrand::usb {

namespace {

constexpr char kPath[] = "/etc/keystrand/keystrand.conf";
constexpr char kChassis[] = "/sys/class/dmi/id/chassis_type";

/// Portable, laptop, notebook, hand-held, sub-notebook, tablet, convertible, detachable (System
/// Management BIOS Reference 3.0, chapter 7.4.1).
constexpr int kWithKeyboard[] = {8, 9, 10, 11, 14, 30, 31, 32};

template <typename Value>
struct Word {
    std::string_view word;
    Value value;
};

constexpr Word<bool> kYesOrNo[] = {{"yes", true}, {"no", false}};
constexpr Word<KeyboardRule> kKeyboardRules[] = {{"when-none", KeyboardRule::whenNone},
                                                 {"never", KeyboardRule::never},
                                                 {"always", KeyboardRule::always}};
constexpr Word<OnUnlock> kOnUnlock[] = {{"accept", OnUnlock::accept}, {"replug", OnUnlock::replug}};

/// A word of the file as a line of the log may show it.
std::string shown(std::string_view word) {
    constexpr std::size_t kLongest = 64;
    std::string text = base::concat('"', word.substr(0, kLongest));
    std::replace_if(
        text.begin() + 1, text.end(),
        [](char each) { return each < ' ' || each > '~' || each == '"' || each == '\\'; }, '?');
    return text + (word.size() > kLongest ? "...\"" : "\"");
}

/// "046d:c31c"
std::optional<GateRules::Product> productOf(std::string_view text) {
    constexpr std::size_t kSize = 9;
    constexpr std::size_t kColon = 4;
    if (text.size() != kSize || text[kColon] != ':') {
        return std::nullopt;
    }
    std::uint32_t ids = 0;
    for (std::size_t at = 0; at < kSize; ++at) {
        const auto digit = base::hexDigitValue(text[at]);
        if (at != kColon && !digit) {
            return std::nullopt;
        }
        ids = at == kColon ? ids : ids << 4U | *digit;
    }
    return GateRules::Product{.vendor = static_cast<std::uint16_t>(ids >> 16U),
                              .product = static_cast<std::uint16_t>(ids)};
}

/// Takes the lines of the file in turn.
class ConfigurationParser {
  public:
    explicit ConfigurationParser(std::string_view path) : path_(path) {}

    void take(std::string_view line) {
        ++number_;
        line = trimmed(line);
        if (line.empty() || line.front() == '#') {
            return;
        }
        const std::size_t equals = line.find('=');
        const std::string_view key = trimmed(line.substr(0, equals));
        if (equals == std::string_view::npos) {
            remark(base::concat(shown(line), " is not of the form \"key = value\"; ignored."));
        } else if (key == "not-keyboards") {
            takeProducts(trimmed(line.substr(equals + 1)));
        } else {
            takeOnce(key, trimmed(line.substr(equals + 1)));
        }
    }

    [[nodiscard]] GateConfiguration result() && {
        if (unsaid_ > 0) {
            result_.remarks.push_back(
                base::concat("keystrand: ", path_, ": ", unsaid_, " more that is not understood."));
        }
        return std::move(result_);
    }

  private:
    void takeOnce(std::string_view key, std::string_view value) {
        Keystrand::Settings& settings = result_.settings;
        if (key == "period") {
            const auto period = base::parseNumber<std::uint32_t>(value);
            settings.period = only(key, value, period).value_or(Keystrand::Settings().period);
        } else if (key == "internal") {
            settings.rules.internal = chosen(key, value, kYesOrNo, GateRules().internal);
        } else if (key == "keyboards") {
            settings.rules.keyboards = chosen(key, value, kKeyboardRules, GateRules().keyboards);
        } else if (key == "on-unlock") {
            settings.rules.onUnlock = chosen(key, value, kOnUnlock, GateRules().onUnlock);
        } else {
            remark(base::concat("unknown key ", shown(key), "; ignored."));
        }
    }

    template <typename Value, std::size_t count>
    Value chosen(std::string_view key, std::string_view value, const Word<Value> (&words)[count],
                 Value otherwise) {
        const auto* const found =
            std::find_if(std::begin(words), std::end(words),
                         [&](const Word<Value>& each) { return each.word == value; });
        const auto meant = found == std::end(words) ? std::nullopt : std::optional(found->value);
        return only(key, value, meant).value_or(otherwise);
    }

    /// What was meant, unless it is not understood or not the only one.
    template <typename Value>
    std::optional<Value> only(std::string_view key, std::string_view word,
                              std::optional<Value> meant) {
        const bool isFirst = seen_.emplace(key).second;
        if (!isFirst) {
            remark(base::concat(key, " is given again, as ", shown(word),
                                "; what it is without being set holds."));
            return std::nullopt;
        }
        if (!meant) {
            remark(base::concat(shown(word), " is no value of ", key,
                                "; what it is without being set holds."));
        }
        return meant;
    }

    void takeProducts(std::string_view list) {
        constexpr std::string_view kBetween = " \t,";
        while (!list.empty()) {
            const std::size_t end = std::min(list.find_first_of(kBetween), list.size());
            const std::string_view word = list.substr(0, end);
            if (const auto product = productOf(word)) {
                result_.settings.rules.notKeyboards.push_back(*product);
            } else if (!word.empty()) {
                remark(base::concat(shown(word),
                                    " in not-keyboards is no ID like 046d:c31c; ignored."));
            }
            list.remove_prefix(std::min(end + 1, list.size()));
        }
    }

    void remark(const std::string& what) {
        if (result_.remarks.size() < GateConfiguration::kMostRemarks) {
            result_.remarks.push_back(
                base::concat("keystrand: ", path_, ": line ", number_, ": ", what));
        } else {
            ++unsaid_;
        }
    }

    std::string_view path_;
    int number_ = 0;
    std::size_t unsaid_ = 0;
    std::set<std::string, std::less<>> seen_;
    GateConfiguration result_;
};

/// Why the file counts for nothing; empty when it counts.
std::string distrusted(const SmallFile& file) {
    if (file.error == EFBIG) {
        return base::concat("larger than ", GateConfiguration::kMaxSize, " bytes");
    }
    if (!file.isRead()) {
        return file.error == EINVAL || file.error == EISDIR
                   ? "not a regular file"
                   : base::concat("cannot be read: ", errorText(file.error));
    }
    if (file.status.st_uid != 0 && file.status.st_uid != ::geteuid()) {
        return base::concat("owned by user ", file.status.st_uid,
                            ", neither root nor the service's own");
    }
    return (file.status.st_mode & (S_IWGRP | S_IWOTH)) != 0 ? "writable by group or others"
                                                            : std::string();
}

} // namespace

GateConfiguration parseGateConfiguration(std::string_view text, std::string_view path) {
    ConfigurationParser parser(path);
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        parser.take(text.substr(0, end));
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return std::move(parser).result();
}

GateConfiguration readGateConfiguration(const std::string& root) {
    const std::string path = wire::underRoot(root, kPath);
    const SmallFile file = readSmallFile(path, GateConfiguration::kMaxSize);
    GateConfiguration configuration;
    if (const std::string reason = distrusted(file); reason.empty()) {
        configuration = parseGateConfiguration(file.bytes, path);
    } else if (file.error != ENOENT) {
        configuration.remarks.push_back(
            base::concat("keystrand: ", path, ": ", reason, "; nothing of it holds."));
    }
    configuration.settings.rules.keyboardBuiltIn = hasKeyboardBuiltIn(root);
    return configuration;
}

bool hasKeyboardBuiltIn(const std::string& root) {
    const SmallFile file = readSmallFile(wire::underRoot(root, kChassis), kAttributeLimit);
    const auto type = base::parseNumber<int>(trimmed(file.bytes));
    return type && std::find(std::begin(kWithKeyboard), std::end(kWithKeyboard), *type) !=
                       std::end(kWithKeyboard);
}

} // namespace keystrand::usb
