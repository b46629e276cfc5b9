#include "kstctl/Output.h"

#include "base/Concat.h"
#include "kstctl/TerminalText.h"
#include "kstctl/WholeWrite.h"

#include <cstdlib>
#include <string_view>
#include <sys/ioctl.h>
#include <system_error>

namespace kstctl {

namespace {

bool isSet(const char* variable) {
    const char* const value = std::getenv(variable);
    return value != nullptr && *value != '\0';
}

bool isDumbTerminal() {
    const char* const kind = std::getenv("TERM");
    return kind == nullptr || std::string_view(kind) == "dumb";
}

std::optional<std::size_t> widthOf(int terminal) {
    winsize size{};
    return ::ioctl(terminal, TIOCGWINSZ, &size) == 0 && size.ws_col > 0
               ? std::optional<std::size_t>(size.ws_col)
               : std::nullopt;
}

} // namespace

Output::Output(bool isJSON, int descriptor)
    : isJSON_(isJSON),
      isTerminal_(::isatty(descriptor) == 1),
      colours_(isTerminal_ && !isJSON && !isSet("NO_COLOR") && !isDumbTerminal() ? Colours::yes
                                                                                 : Colours::no),
      width_(isTerminal_ ? widthOf(descriptor) : std::nullopt),
      results_(descriptor) {}

void Output::show(const Report& report) {
    put(isJSON_ ? JSONForm(report) : textForm(report, colours_));
}

void Output::complain(std::string_view message) {
    // There is nowhere left to say that this could not be said.
    static_cast<void>(
        writeWhole(STDERR_FILENO, base::concat("kstctl: ", printable(message), '\n')));
}

ExitStatus Output::finish(ExitStatus status) {
    const int error = results_.finish();
    if (error == 0) {
        return status;
    }
    complain(base::concat("cannot write: ", std::generic_category().message(error)));
    return ExitStatus::failed;
}

ExitStatus Output::finish(const platform::Error& error) {
    complain(error.description);
    return finish(statusOf(error));
}

} // namespace kstctl
