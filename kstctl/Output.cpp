#include "kstctl/Output.h"

#include "base/Concat.h"
#include "kstctl/TerminalText.h"
#include "kstctl/WholeWrite.h"

#include <cerrno>
#include <cstdlib>
#include <string_view>
#include <system_error>
#include <unistd.h>

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

} // namespace

Output::Output(bool isJSON)
    : isJSON_(isJSON),
      isTerminal_(::isatty(STDOUT_FILENO) == 1),
      colours_(isTerminal_ && !isJSON && !isSet("NO_COLOR") && !isDumbTerminal() ? Colours::yes
                                                                                 : Colours::no) {}

void Output::show(const Report& report) {
    put(isJSON_ ? JSONForm(report) : textForm(report, colours_));
}

void Output::show(const Table& table) {
    put(textForm(table, colours_));
}

void Output::complain(std::string_view message) {
    // There is nowhere left to say that this could not be said.
    static_cast<void>(
        writeWhole(STDERR_FILENO, base::concat("kstctl: ", printable(message), '\n')));
}

ExitStatus Output::finish(ExitStatus status) {
    if (writeWhole(STDOUT_FILENO, results_.view())) {
        return status;
    }
    complain(base::concat("cannot write: ", std::generic_category().message(errno)));
    return ExitStatus::failed;
}

ExitStatus Output::finish(const platform::Error& error) {
    complain(error.description);
    return finish(statusOf(error));
}

} // namespace kstctl
