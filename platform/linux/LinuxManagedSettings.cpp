#include "platform/linux/LinuxManagedSettings.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"
#include "platform/linux/RegularFile.h"

#include <algorithm>
#include <optional>

namespace platform {

namespace {

constexpr std::string_view kRestrictedModeAllowed = "restricted-mode-allowed";
constexpr std::string_view kYes = "yes";
constexpr std::string_view kNo = "no";
constexpr std::string_view kBlanks = " \t";

std::string_view trimmed(std::string_view text) {
    const std::size_t first = text.find_first_not_of(kBlanks);
    if (first == std::string_view::npos) {
        return {};
    }
    return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

bool isKey(std::string_view text) {
    constexpr auto isKeyCharacter = [](char character) {
        return (character >= 'a' && character <= 'z') || (character >= '0' && character <= '9') ||
               character == '-';
    };
    return !text.empty() && std::all_of(text.begin(), text.end(), isKeyCharacter);
}

/// Takes the lines of a file in turn.
class Parser {
  public:
    /// False when the line has a problem.
    bool take(std::string_view line) {
        ++number_;
        line = trimmed(line);
        if (line.empty() || line.front() == '#') {
            return true;
        }
        const std::size_t equals = line.find('=');
        const std::string_view key = trimmed(line.substr(0, equals));
        if (equals == std::string_view::npos || !isKey(key)) {
            return problem("is not of the form \"key = value\"");
        }
        return takeSetting(key, trimmed(line.substr(equals + 1)));
    }

    [[nodiscard]] ManagedSettingsText result() const {
        if (!problem_.empty()) {
            return {true, problem_, {}};
        }
        return {allowed_.value_or(true), {}, remark()};
    }

  private:
    bool takeSetting(std::string_view key, std::string_view value) {
        if (key != kRestrictedModeAllowed) {
            if (unknownKeys_++ == 0) {
                firstUnknownKey_ = base::concat("line ", number_, ": unknown key ", key);
            }
            return true;
        }
        if (allowed_) {
            return problem(base::concat("gives ", key, " a second time"));
        }
        if (value != kYes && value != kNo) {
            return problem(base::concat("the value of ", key, " is neither yes nor no"));
        }
        allowed_ = value == kYes;
        return true;
    }

    bool problem(std::string_view what) {
        problem_ = base::concat("line ", number_, ": ", what);
        return false;
    }

    [[nodiscard]] std::string remark() const {
        if (unknownKeys_ <= 1) {
            return firstUnknownKey_;
        }
        return base::concat(firstUnknownKey_, " and ", unknownKeys_ - 1, " more");
    }

    int number_ = 0;
    std::optional<bool> allowed_;
    std::string problem_;
    int unknownKeys_ = 0;
    std::string firstUnknownKey_;
};

} // namespace

ManagedSettingsText parseManagedSettings(std::string_view text) {
    Parser parser;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        if (!parser.take(text.substr(0, end))) {
            break;
        }
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return parser.result();
}

namespace {

std::string_view textOf(const RegularFile& file) {
    return {reinterpret_cast<const char*>(file.bytes.data()), file.bytes.size()};
}

} // namespace

LinuxManagedSettings::LinuxManagedSettings(const Paths& paths, SystemLog& log)
    : path_(paths.managedSettings()), log_(log) {}

bool LinuxManagedSettings::isRestrictedModeAllowed() {
    const RegularFile file = readRegularFile(path_, kMaxSize);
    if (file.failure == ReadFailure::missing) {
        return true;
    }
    if (const std::string reason = distrust(file, kMaxSize); !reason.empty()) {
        return allowedInDoubt(reason);
    }
    const ManagedSettingsText settings = parseManagedSettings(textOf(file));
    if (!settings.problem.empty()) {
        return allowedInDoubt(settings.problem);
    }
    if (!settings.remark.empty()) {
        log_.write(
            LogLevel::warning,
            base::concat("kstd: ManagedSettings: ", path_, ": ", settings.remark, "; ignored.\n"),
            {.messageId = message::kSettingsNotUsed});
    }
    return settings.restrictedModeAllowed;
}

bool LinuxManagedSettings::allowedInDoubt(std::string_view reason) {
    log_.write(LogLevel::warning,
               base::concat("kstd: ManagedSettings: ", path_, ": ", reason,
                            "; restricted mode stays allowed.\n"),
               {.messageId = message::kSettingsNotUsed});
    return true;
}

} // namespace platform
