#include "platform/linux/LinuxSystemVersion.h"

#include "platform/linux/RegularFile.h"

#include <algorithm>
#include <utility>

namespace platform {

namespace {

constexpr std::string_view kBlanksOrReturn = " \t\r";
constexpr std::string_view kEscapedInDoubleQuotes = "$`\"\\";

bool startsWithBlank(std::string_view text) {
    return kBlanksOrReturn.find(text.front()) != std::string_view::npos;
}

std::string_view withoutLeadingBlanks(std::string_view text) {
    text.remove_prefix(std::min(text.find_first_not_of(kBlanksOrReturn), text.size()));
    return text;
}

/// Takes what stands behind an equals sign apart.
class ValueParser {
  public:
    explicit ValueParser(std::string_view text) : rest_(text) {}

    /// None when a quote is not closed or something follows the value.
    std::optional<std::string> parse() {
        while (!rest_.empty() && !startsWithBlank(rest_)) {
            if (!takePart()) {
                return std::nullopt;
            }
        }
        rest_ = withoutLeadingBlanks(rest_);
        if (!rest_.empty() && rest_.front() != '#') {
            return std::nullopt;
        }
        return value_;
    }

  private:
    char take() {
        const char character = rest_.front();
        rest_.remove_prefix(1);
        return character;
    }

    bool takePart() {
        switch (const char character = take()) {
        case '\'':
            return takeSingleQuoted();
        case '"':
            return takeDoubleQuoted();
        case '\\':
            return takeEscaped();
        default:
            value_.push_back(character);
            return true;
        }
    }

    bool takeEscaped() {
        if (rest_.empty()) {
            return false;
        }
        value_.push_back(take());
        return true;
    }

    bool takeSingleQuoted() {
        const std::size_t end = rest_.find('\'');
        if (end == std::string_view::npos) {
            return false;
        }
        value_.append(rest_.substr(0, end));
        rest_.remove_prefix(end + 1);
        return true;
    }

    bool takeDoubleQuoted() {
        while (!rest_.empty()) {
            const char character = take();
            if (character == '"') {
                return true;
            }
            const bool isEscape =
                character == '\\' && !rest_.empty() &&
                kEscapedInDoubleQuotes.find(rest_.front()) != std::string_view::npos;
            value_.push_back(isEscape ? take() : character);
        }
        return false;
    }

    std::string_view rest_;
    std::string value_;
};

} // namespace

std::optional<std::string> valueInOsRelease(std::string_view text, std::string_view name) {
    std::optional<std::string> value;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        const std::string_view line = withoutLeadingBlanks(text.substr(0, end));
        text.remove_prefix(std::min(end + 1, text.size()));
        if (line.starts_with(name) && line.substr(name.size()).starts_with('=')) {
            std::optional<std::string> found = ValueParser(line.substr(name.size() + 1)).parse();
            // The last one counts, as in a shell.
            if (found) {
                value = std::move(found);
            }
        }
    }
    return value;
}

namespace {

std::string osRelease(const Paths& paths) {
    RegularFile file = readRegularFile(paths.osRelease(), LinuxSystemVersion::kMaxSize);
    if (file.failure != ReadFailure::none) {
        file = readRegularFile(paths.vendorOsRelease(), LinuxSystemVersion::kMaxSize);
    }
    return {file.bytes.begin(), file.bytes.end()};
}

/// The value, unless there is none or it is empty.
std::optional<std::string> known(std::string_view text, std::string_view name) {
    std::optional<std::string> value = valueInOsRelease(text, name);
    return value && !value->empty() ? value : std::nullopt;
}

} // namespace

LinuxSystemVersion::LinuxSystemVersion(Paths paths) : paths_(std::move(paths)) {}

std::optional<std::string> LinuxSystemVersion::build() {
    const std::string text = osRelease(paths_);
    std::optional<std::string> build = known(text, "BUILD_ID");
    return build ? build : known(text, "VERSION_ID");
}

std::optional<std::string> LinuxSystemVersion::product() {
    return known(osRelease(paths_), "NAME");
}

} // namespace platform
